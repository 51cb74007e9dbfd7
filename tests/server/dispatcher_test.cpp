// The dispatcher with the module looked up in the real registry (embedded
// Java VM), and what it makes of requests no proxy would send.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <malloc.h>

#include <atomic>
#include <cstddef>
#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>
#include <map>
#include <memory>
#include <ostream>
#include <random>
#include <string>
#include <thread>
#include <vector>

#if defined(__SANITIZE_ADDRESS__)
// The sanitizer runtime's count (its header does not come with every compiler).
extern "C" size_t __sanitizer_get_current_allocated_bytes();
#endif

#include "jvm_fixture.h"
#include "log_capture.h"
#include "server_test_support.h"

namespace {

using namespace servertest;
using ::testing::ElementsAre;

const char* const kModuleName = "vok-dispatch-test";

class Dispatcher : public voktest::JvmTest {
protected:
    void SetUp() override {
        JvmTest::SetUp();
        fake_vendor_reset();
        voktest::registerModule(kModuleName, fake_vendor_function_list());
        setModuleName_Server(kModuleName);
    }

    // Released with delete[], as the channel does.
    static std::string dispatch(const std::string& request) {
        void* response = nullptr;
        uint32_t length = 0;
        EXPECT_EQ(0, Generate_Operation_Result_Server(
                         request.data(), static_cast<int32_t>(request.size()), &response, &length));
        std::unique_ptr<uint8_t[]> owned(static_cast<uint8_t*>(response));
        return owned ? std::string(reinterpret_cast<const char*>(owned.get()), length)
                     : std::string();
    }
};

struct Route {
    std::string sent;
    const char* answeredAs;        // nullptr: the empty answer
    const char* logged = nullptr;  // the table name logged; nullptr: answeredAs
};

void PrintTo(const Route& r, std::ostream* os) { *os << '"' << r.sent << '"'; }

class Routing : public Dispatcher, public ::testing::WithParamInterface<Route> {};

TEST_P(Routing, ByExactName) {
    voktest::LogCapture log;
    const std::string answer = dispatch(requestBytes(GetParam().sent));
    const std::vector<std::string> lines = log.texts("Vokpkcs11f_Server");
    if (!GetParam().answeredAs) {
        EXPECT_EQ("", answer);
        EXPECT_EQ(0u, fake_vendor_call_count());
        EXPECT_THAT(lines, ::testing::Not(::testing::Contains(
                               ::testing::StartsWith("Generate_Operation_Result"))));
        return;
    }
    EXPECT_EQ(GetParam().answeredAs, parsed(answer).name());
    ASSERT_FALSE(lines.empty());
    const char* logged = GetParam().logged ? GetParam().logged : GetParam().answeredAs;
    EXPECT_EQ(std::string("Generate_Operation_Result ") + logged, lines.front());
}

// Names no handler has are not served; every handler's command is.
std::vector<Route> routes() {
    std::vector<Route> r = {
        {"C_InitPIN", nullptr},
        {"C_SetPIN", nullptr},
        {"C_GetFunctionList", nullptr},
        {"", nullptr},
        {"c_getinfo", nullptr},
        {"C_GetInfo ", nullptr},
        {std::string("C_GetInfo\0tail", 14), "C_GetInfo"},
        {"C_UnwrapKey", nullptr},
    };
    for (const FrameRow& row : kFrameRows)
        r.push_back({row.command, row.answeredAs ? row.answeredAs : row.command, row.command});
    return r;
}

INSTANTIATE_TEST_SUITE_P(Dispatcher, Routing, ::testing::ValuesIn(routes()), [](const auto& info) {
    std::string name = info.param.answeredAs ? "Served_" : "Empty_";
    for (char c : info.param.sent) name += isalnum(static_cast<unsigned char>(c)) ? c : '_';
    return name + std::to_string(info.index);
});

TEST_F(Dispatcher, AnEmptyRequestGetsAnEmptyAnswer) {
    void* response = nullptr;
    uint32_t length = 1;
    EXPECT_EQ(0, Generate_Operation_Result_Server(nullptr, 0, &response, &length));
    delete[] static_cast<uint8_t*>(response);
    EXPECT_EQ(0u, length);
}

// The lookup is repeated for every command, so a module registered after the
// server started serves from the next command on.
TEST_F(Dispatcher, WithoutARegisteredModuleTheAnswerIsEmpty) {
    setModuleName_Server("vok-not-yet-registered");
    EXPECT_EQ("", dispatch(requestBytes("C_GetInfo")));
    EXPECT_EQ(0u, fake_vendor_call_count());
    voktest::registerModule("vok-not-yet-registered", fake_vendor_function_list());
    EXPECT_EQ("C_GetInfo", parsed(dispatch(requestBytes("C_GetInfo"))).name());
}

TEST_F(Dispatcher, WithoutANameTheFirstModuleServes) {
    char* previous = mModuleName;  // dropped, not freed: the caller's to release
    EXPECT_EQ(0, setModuleName_Server(nullptr));
    EXPECT_EQ(nullptr, mModuleName);
    EXPECT_STREQ(kModuleName, previous);
    std::free(previous);
    EXPECT_EQ("C_GetInfo", parsed(dispatch(requestBytes("C_GetInfo"))).name());
    EXPECT_EQ("C_GetInfo", fakevendor::lastCall("C_GetInfo").function);
}

// Each parse replaces the whole request: a list sent with one command is not
// seen by the next, which is a pure length query.
TEST_F(Dispatcher, ACommandSeesNothingOfThePreviousOne) {
    dispatch(requestBytes("C_GetSlotList", [](auto& op) {
        op.mutable_slotlist()->add_slotidlist(0), op.mutable_slotlist()->set_pulcount(2);
    }));
    dispatch(requestBytes("C_GetSlotList"));
    std::vector<fakevendor::Call> calls = fakevendor::callsOf("C_GetSlotList");
    ASSERT_EQ(2u, calls.size());
    EXPECT_FALSE(calls[0].arg("pSlotList").null);
    EXPECT_TRUE(calls[1].arg("pSlotList").null);
    EXPECT_EQ(0u, calls[1].arg("pulCount").number);
    EXPECT_FALSE(operation.has_slotlist());
}

// ---- Requests no proxy would send --------------------------------------------------

// Its low word is a small, servable length: a 32-bit service that cut it to
// size_t would serve it.
constexpr uint64_t kHuge = (uint64_t{1} << 62) + 16;
constexpr uint64_t kAll = ~uint64_t{0};
constexpr uint64_t kOverHalfAFrame = (uint64_t{3} << 29);  // 1.5 GiB, each fits, both do not
constexpr uint64_t kBeyondAllowance = (uint64_t{16} << 20) + 4096;

struct Oversized {
    const char* label;
    const char* command;
    Fill fill;
};

void value(pkcs11::CK_ATTRIBUTE* a, uint64_t length) {
    a->set_pvalue("v"), a->set_ulvaluelen(length);
}

const Oversized kOversized[] = {
    {"SlotListCount", "C_GetSlotList",
     [](auto& op) {
         op.mutable_slotlist()->add_slotidlist(0), op.mutable_slotlist()->set_pulcount(kAll);
     }},
    {"MechanismListCount", "C_GetMechanismList",
     [](auto& op) {
         op.mutable_mechanismlist()->add_pmechanismlist(0),
             op.mutable_mechanismlist()->set_pulcount(kHuge);
     }},
    {"FindObjectsMaximum", "C_FindObjects",
     [](auto& op) { op.mutable_findobj()->set_ulmaxobjectcount(kHuge); }},
    {"TemplateCount", "C_CreateObject",
     [](auto& op) { op.mutable_createobject()->set_ulcount(kAll); }},
    // Allocatable, but its echo would cost the service gigabytes.
    {"SearchTemplateCount", "C_FindObjectsInit",
     [](auto& op) { op.mutable_findobjinit()->set_ulcount((uint64_t{1} << 20) + 1); }},
    {"ValueLength", "C_GetAttributeValue",
     [](auto& op) {
         value(op.mutable_attvalue()->add_attribute(), kHuge);
         op.mutable_attvalue()->set_ulcount(1);
     }},
    {"SearchValueLength", "C_FindObjectsInit",
     [](auto& op) {
         op.mutable_findobjinit()->add_attribute()->set_ulvaluelen(kAll);
         op.mutable_findobjinit()->set_ulcount(1);
     }},
    {"AllValuesTogether", "C_SetAttributeValue",
     [](auto& op) {
         value(op.mutable_setattributevalue()->add_ptemplate(), kOverHalfAFrame);
         value(op.mutable_setattributevalue()->add_ptemplate(), kOverHalfAFrame);
         op.mutable_setattributevalue()->set_ulcount(2);
     }},
    {"PinLength", "C_Login",
     [](auto& op) { op.mutable_login()->set_ppin("1"), op.mutable_login()->set_ulpinlen(kHuge); }},
    {"NewPinLength", "C_SetPin", [](auto& op) { op.mutable_setpin()->set_ulnewlen(kAll); }},
    {"OperationStateLength", "C_GetOperationState",
     [](auto& op) { op.mutable_getoperationstate()->set_puloperationstatelen(uint64_t{1} << 31); }},
    {"SavedStateLength", "C_SetOperationState",
     [](auto& op) { op.mutable_setoperationstate()->set_uloperationstatelen(kHuge); }},
    {"SinglePartCapacity", "C_Encrypt",
     [](auto& op) { op.mutable_enc()->set_pulencrypteddatalen(kAll); }},
    {"SinglePartInputLength", "C_Sign", [](auto& op) { op.mutable_sign()->set_uldatalen(kHuge); }},
    {"SinglePartBothBuffers", "C_Decrypt",
     [](auto& op) {
         op.mutable_dec()->set_ulencrypteddatalen(kOverHalfAFrame);
         op.mutable_dec()->set_puldatalen(kOverHalfAFrame);
     }},
    // Capacity 0, but the module would read the stated input length.
    {"MultiPartInputLength", "C_EncryptUpdate",
     [](auto& op) { op.mutable_encryptupdate()->set_ulpartlen(kHuge); }},
    {"MultiPartBothBuffers", "C_DecryptVerifyUpdate",
     [](auto& op) { op.mutable_decryptverifyupdate()->set_pulpartlen(kOverHalfAFrame); }},
    {"FinalCapacity", "C_SignFinal",
     [](auto& op) { op.mutable_signfinal()->set_pulsignaturelen(kAll); }},
    {"InputOnlyLength", "C_DigestUpdate",
     [](auto& op) { op.mutable_digestupdate()->set_ulpartlen(kHuge); }},
    {"VerifySignatureLength", "C_Verify",
     [](auto& op) { op.mutable_verify()->set_ulsignaturelen(kAll); }},
    {"MechanismParameterLength", "C_SignInit",
     [](auto& op) { op.mutable_signinit()->mutable_mechanism()->set_ulparameterlen(kHuge); }},
    {"KeyPairTemplateCount", "C_GenerateKeyPair",
     [](auto& op) { op.mutable_generatekeypair()->set_ulprivatekeyattributecount(kAll); }},
    {"WrappedKeyCapacity", "C_WrapKey",
     [](auto& op) { op.mutable_wrapkey()->set_pulwrappedkeylen(kHuge); }},
    {"UnwrappedKeyLength", "C_UnWrapKey",
     [](auto& op) { op.mutable_unwrapkey()->set_ulwrappedkeylen(kAll); }},
    {"RandomLength", "C_GenerateRandom",
     [](auto& op) { op.mutable_generaterandom()->set_ulrandomlen(kHuge); }},
    {"SeedLength", "C_SeedRandom", [](auto& op) { op.mutable_seedrandom()->set_ulseedlen(kAll); }},
    // Each within a frame, but beyond what a request this small may make the
    // service allocate.
    {"RandomWithinAFrame", "C_GenerateRandom",
     [](auto& op) {
         op.mutable_generaterandom()->set_randomdata("");
         op.mutable_generaterandom()->set_ulrandomlen(INT32_MAX);
     }},
    {"CapacityBeyondTheAllowance", "C_Decrypt",
     [](auto& op) {
         op.mutable_dec()->set_pdata("");
         op.mutable_dec()->set_puldatalen(kBeyondAllowance);
     }},
    {"HandlesBeyondTheAllowance", "C_FindObjects",
     [](auto& op) { op.mutable_findobj()->set_ulmaxobjectcount(kBeyondAllowance / 8); }},
    {"ValueBeyondTheAllowance", "C_GetAttributeValue",
     [](auto& op) {
         value(op.mutable_attvalue()->add_attribute(), kBeyondAllowance);
         op.mutable_attvalue()->set_ulcount(1);
     }},
};

void PrintTo(const Oversized& o, std::ostream* os) { *os << o.label; }

class OversizedRequest : public Dispatcher, public ::testing::WithParamInterface<Oversized> {};

TEST_P(OversizedRequest, GetsTheEmptyAnswerWithoutCallingTheModule) {
    EXPECT_EQ("", dispatch(requestBytes(GetParam().command, GetParam().fill)));
    EXPECT_EQ(0u, fake_vendor_call_count());
}

INSTANTIATE_TEST_SUITE_P(Dispatcher, OversizedRequest, ::testing::ValuesIn(kOversized),
                         [](const auto& info) { return std::string(info.param.label); });

// Every prefix of real requests, and random bytes behind real names and on
// their own: the service answers each (possibly with nothing) and goes on.
TEST_F(Dispatcher, TruncatedAndRandomRequestsAreSurvived) {
    std::vector<std::string> requests = {
        requestBytes("C_CreateObject",
                     [](auto& op) {
                         auto* m = op.mutable_createobject();
                         value(m->add_ptemplate(), 40), value(m->add_ptemplate(), 3),
                             m->set_ulcount(5);
                     }),
        requestBytes("C_GetSlotList",
                     [](auto& op) {
                         op.mutable_slotlist()->add_slotidlist(1),
                             op.mutable_slotlist()->set_pulcount(9);
                     }),
        requestBytes("C_InitToken",
                     [](auto& op) { op.mutable_inittoken()->set_plabel(std::string(50, 'x')); }),
        requestBytes("C_GenerateKeyPair",
                     [](auto& op) {
                         auto* m = op.mutable_generatekeypair();
                         m->mutable_pmechanism()->set_pparameter("param");
                         m->mutable_pmechanism()->set_ulparameterlen(9);
                         value(m->add_ppublickeytemplate(), 4),
                             value(m->add_pprivatekeytemplate(), 2);
                         m->set_ulpublickeyattributecount(2), m->set_ulprivatekeyattributecount(1);
                     }),
        requestBytes("C_DecryptUpdate",
                     [](auto& op) {
                         auto* m = op.mutable_decryptupdate();
                         m->set_pencryptedpart(std::string(24, 'c')), m->set_ulencryptedpartlen(40);
                         m->set_ppart("out"), m->set_pulpartlen(16);
                     }),
    };
    std::mt19937 random(20240101);
    for (const Route& r : routes()) {
        for (int i = 0; i < 20; ++i) {
            std::string tail(random() % 64, '\0');
            for (char& c : tail) c = static_cast<char>(random());
            requests.push_back(requestBytes(r.sent) + tail);
        }
    }
    for (int i = 0; i < 500; ++i) {
        std::string bytes(random() % 128, '\0');
        for (char& c : bytes) c = static_cast<char>(random());
        requests.push_back(bytes);
    }
    for (const std::string& request : requests) {
        for (size_t length = 0; length <= request.size(); ++length) {
            const std::string answer = dispatch(request.substr(0, length));
            pkcs11::OperationResult res;
            EXPECT_TRUE(answer.empty() || res.ParseFromString(answer));
        }
    }
}

}  // namespace

// ---- Modules and requests that used to crash or bloat the service ----------------

#define VOK_ENTRY_OFFSET(name, params) {#name, offsetof(CK_FUNCTION_LIST, name)},
const std::map<std::string, size_t> kEntryOffsets = {VOK_CK_FUNCTIONS(VOK_ENTRY_OFFSET)};

TEST_F(Dispatcher, AFunctionTheListLeavesNullIsNotSupported) {
    // One list per module, alive as long as the registry may look at it.
    std::vector<CK_FUNCTION_LIST> lists(std::size(kFrameRows), *fake_vendor_function_list());
    for (size_t i = 0; i < lists.size(); ++i) {
        const FrameRow& r = kFrameRows[i];
        SCOPED_TRACE(r.command);
        std::memset(reinterpret_cast<char*>(&lists[i]) + kEntryOffsets.at(r.moduleFunction), 0,
                    sizeof(void*));
        voktest::registerModule(r.command, &lists[i]);
        setModuleName_Server(r.command);
        fake_vendor_clear_calls();
        const pkcs11::OperationResult res = parsed(dispatch(requestBytes(r.command)));
        EXPECT_EQ(r.answeredAs ? r.answeredAs : r.command, res.name());
        EXPECT_EQ(CKR_FUNCTION_NOT_SUPPORTED, res.result());
        EXPECT_EQ(0u, fake_vendor_call_count());
    }
}

// Under the address sanitizer a reader of a freed name is reported.
TEST_F(Dispatcher, ANameReplacedWhileCommandsAreServedIsNeverReadFreed) {
    voktest::registerModule("vok-other-name", fake_vendor_function_list());
    std::atomic<bool> done{false};
    std::thread renamer([&] {
        for (int i = 0; !done; ++i) setModuleName_Server(i % 2 ? kModuleName : "vok-other-name");
    });
    for (int i = 0; i < 2000; ++i)
        EXPECT_EQ("C_GetInfo", parsed(dispatch(requestBytes("C_GetInfo"))).name());
    done = true;
    renamer.join();
}

TEST_F(Dispatcher, ANameThatCouldNotBeCopiedServesNoModule) {
    gModuleNameCopy = [](const char*) -> char* { return nullptr; };
    setModuleName_Server("vok-next-name");
    gModuleNameCopy = strdup;
    EXPECT_EQ("", dispatch(requestBytes("C_GetInfo")));
    EXPECT_EQ(0u, fake_vendor_call_count());
    setModuleName_Server(kModuleName);
    EXPECT_EQ("C_GetInfo", parsed(dispatch(requestBytes("C_GetInfo"))).name());
}

size_t allocatedBytes() {
#if defined(__SANITIZE_ADDRESS__)
    return __sanitizer_get_current_allocated_bytes();
#else
    return mallinfo2().uordblks + mallinfo2().hblkhd;
#endif
}

// The process's peak resident memory since the last reset, in bytes.
size_t peakResident(bool reset = false) {
    if (reset) std::ofstream("/proc/self/clear_refs") << "5";
    std::ifstream status("/proc/self/status");
    for (std::string line; std::getline(status, line);)
        if (line.rfind("VmHWM:", 0) == 0) return std::stoul(line.substr(6)) * 1024;
    return 0;
}

// A C_CreateObject request with `count` empty template entries, written by
// hand: building it as messages would take the memory the test watches.
std::string emptyAttributes(size_t count) {
    const std::string entries = [&] {
        std::string bytes;
        for (size_t i = 0; i < count; ++i) bytes.append("\x12\x00", 2);  // pTemplate, empty
        return bytes;
    }();
    std::string request = requestBytes(
        "C_CreateObject", [&](auto& op) { op.mutable_createobject()->set_ulcount(count); });
    // A second occurrence of the sub-message (field 36) is merged into the first.
    request += "\xa2\x02";
    uint64_t length = entries.size();
    for (; length >= 0x80; length >>= 7) request += static_cast<char>(length | 0x80);
    request += static_cast<char>(length);
    return request + entries;
}

TEST_F(Dispatcher, NothingOfARequestStaysAllocatedAfterItsAnswer) {
    const std::string request = emptyAttributes(10000);
    dispatch(requestBytes("C_GetInfo"));
    fake_vendor_reset();  // what the module keeps (records, objects) is not the service's
    // The Java VM's threads allocate beside the test: the least growth over a
    // few rounds is the requests'; a leak grows with every round.
    const size_t before = allocatedBytes();
    size_t least = SIZE_MAX;
    for (int round = 0; round < 5; ++round) {
        EXPECT_EQ("C_CreateObject", parsed(dispatch(request)).name());
        fake_vendor_reset();
        const size_t now = allocatedBytes();
        least = std::min(least, now > before ? now - before : 0);
    }
    EXPECT_LT(least, 16u * 1024);
}

// The documented bound: about 16 times the request's size plus 70 MiB.
TEST_F(Dispatcher, ARequestBuiltToBloatItsParseIsRefusedWithinTheBound) {
    const std::string request = emptyAttributes(4 << 20);
    const size_t start = peakResident(true);
    EXPECT_EQ("", dispatch(request));
    EXPECT_EQ(0u, fake_vendor_call_count());
    EXPECT_LT(peakResident() - start, 16 * request.size() + (70u << 20));
}
