// Situations every proxy goes through alike: the exact request, the result
// passed through, a failed or closed channel; and the function list itself.
#include <gtest/gtest.h>

#include <cstring>
#include <functional>

#include "log_capture.h"
#include "proxy_calls.h"
#include "test_service.h"
#include "vok_client.h"
#include "vok_comm.h"

namespace voktest {
namespace {

// Runs each proxy of the table on freshly patterned caller memory.
class Proxies : public ::testing::Test {
protected:
    CK_FUNCTION_LIST_PTR list = functionList();
    CallerMemory before;

    CK_RV run(const ProxyCall& proxy) {
        gCaller.reset();
        memcpy(&before, &gCaller, sizeof(before));
        return proxy.call(list);
    }
    bool untouched() const { return memcmp(&before, &gCaller, sizeof(before)) == 0; }
};

// The channel never opened, then an answer without a response message, an
// empty answer or one without its result, then the channel closed (each case
// runs in its own process).
TEST_F(Proxies, LeaveTheCallerAloneWithoutAResponseMessage) {
    const auto everyProxyReturns = [&](CK_RV rv, const std::function<void(const char*)>& script) {
        for (const ProxyCall& proxy : everyProxyCall()) {
            SCOPED_TRACE(proxy.name);
            script(proxy.name);
            EXPECT_EQ(rv, run(proxy));
            EXPECT_TRUE(untouched());
        }
    };
    ASSERT_NE(nullptr, list);
    everyProxyReturns(kAllOnes, [](const char*) {});
    TestService& service = TestService::start();
    const CK_RV vendorCode = 0x80000000000000a5;  // needs all 64 bits
    everyProxyReturns(vendorCode,
                      [&](const char* name) { service.script(answer(name, vendorCode)); });
    everyProxyReturns(kAllOnes, [&](const char*) { service.scriptRaw(""); });
    everyProxyReturns(kAllOnes, [&](const char* name) {
        pkcs11::OperationResult nameOnly;
        nameOnly.set_name(name);
        service.scriptRaw(nameOnly.SerializePartialAsString());
    });
    ASSERT_EQ(CKR_OK, C_Finalize(nullptr));  // the channel worked
    ASSERT_EQ(0, vokpkcs11_client_deinit());
    const size_t sent = service.requestCount();
    everyProxyReturns(kAllOnes, [](const char*) {});
    EXPECT_EQ(sent, service.requestCount());
}

class EveryProxy : public Proxies {
protected:
    TestService& service = TestService::start();
};

TEST_F(EveryProxy, SendsExactlyTheRequestForItsArguments) {
    for (const ProxyCall& proxy : everyProxyCall()) {
        SCOPED_TRACE(proxy.name);
        const size_t sent = service.requestCount();
        EXPECT_EQ(CKR_OK, run(proxy));
        EXPECT_EQ(sent + 1, service.requestCount());
        EXPECT_EQ(hex(encodeRequest(proxy.name, proxy.field, proxy.request)),
                  hex(service.lastRequestBytes()));
    }
}

Field version(int major, int minor) { return Field::message({major, minor}); }

// A canned answer for each proxy with outputs of its own besides the
// output-buffer, template and echoed-bytes families (their tables are in the
// other files), and what it writes into the caller's memory: every other byte
// stays as it was, the guards around each output included. Outputs are
// written even though the call failed.
struct CopyBack {
    const char* name;
    int field;
    std::vector<Field> answer;
    void (*expect)(CallerMemory&);
};

TEST_F(EveryProxy, CopiesItsAnswerIntoItsOwnOutputsOnly) {
    // clang-format off
    const CopyBack rows[] = {
        // Full-width texts are copied with their terminator, which the later
        // fields absorb: flags rewrites the manufacturer's, the description's
        // clears libraryVersion.major. Versions are cut to one byte.
        {"C_GetInfo", 3, {Field::message({version(0x102, 40), std::string(32, 'M'), kFlags,
                                          std::string(32, 'D'), version(0x107, 9)})},
         [](CallerMemory& m) {
             m.info.cryptokiVersion = {2, 40}, m.info.libraryVersion = {0, 9};
             memset(m.info.manufacturerID, 'M', 32), memset(m.info.libraryDescription, 'D', 32);
             m.info.flags = kFlags;
         }},
        // A text longer than its field leaves the field alone.
        {"C_GetInfo", 3, {Field::message({version(2, 40), std::string(33, 'M'), kFlags, "Library",
                                          version(7, 9)})},
         [](CallerMemory& m) {
             m.info.cryptokiVersion = {2, 40}, m.info.libraryVersion = {7, 9};
             memcpy(m.info.libraryDescription, "Library", 8), m.info.flags = kFlags;
         }},
        // The full-width description clears the manufacturer's first byte.
        {"C_GetSlotInfo", 5, {Field::message({std::string(64, 'S'), "Maker", kFlags, version(1, 2),
                                              version(3, 4)})},
         [](CallerMemory& m) {
             CK_SLOT_INFO& s = m.slotInfo;
             memset(s.slotDescription, 'S', 64), memcpy(s.manufacturerID, "\0aker", 6);
             s.flags = kFlags, s.hardwareVersion = {1, 2}, s.firmwareVersion = {3, 4};
         }},
        // Token texts are cut or padded with zeros to their width.
        {"C_GetTokenInfo", 16, {Field::message({std::string(40, 'L'), std::string(32, 'M'), "abc",
                                                std::string(16, '7'), kFlags, 1, 2, 3, 4, 5, 6, 7,
                                                8, 9, kKey, version(1, 2), version(3, 4), "2024"})},
         [](CallerMemory& m) {
             CK_TOKEN_INFO& t = m.tokenInfo;
             memset(t.label, 'L', 32), memset(t.manufacturerID, 'M', 32);
             memset(t.serialNumber, '7', 16);
             memset(t.model, 0, 16), memcpy(t.model, "abc", 3);
             memset(t.utcTime, 0, 16), memcpy(t.utcTime, "2024", 4);
             const CK_ULONG numbers[] = {kFlags, 1, 2, 3, 4, 5, 6, 7, 8, 9, kKey};
             memcpy(&t.flags, numbers, sizeof numbers);
             t.hardwareVersion = {1, 2}, t.firmwareVersion = {3, 4};
         }},
        {"C_GetSessionInfo", 15, {Field::message({kSlot, 3, kFlags, kKey})},
         [](CallerMemory& m) { m.sessionInfo = {kSlot, 3, kFlags, kKey}; }},
        {"C_GetMechanismInfo", 17, {Field::message({128, kKey, kFlags})},
         [](CallerMemory& m) { m.mechanismInfo = {128, kKey, kFlags}; }},
        {"C_GetSlotList", 4, {Field::repeated({21, 22, 23}), 3},
         [](CallerMemory& m) { m.list[0] = 21, m.list[1] = 22, m.list[2] = 23, m.count = 3; }},
        {"C_GetMechanismList", 21, {Field::repeated({31, 32, 33}), 3},
         [](CallerMemory& m) { m.list[0] = 31, m.list[1] = 32, m.list[2] = 33, m.count = 3; }},
        {"C_OpenSession", 6, {kSession}, [](CallerMemory& m) { m.handle = kSession; }},
        {"C_CreateObject", 23, {Field::repeated({kObject, kKey})},
         [](CallerMemory& m) { m.handle = kObject; }},
        {"C_CopyObject", 24, {Field::repeated({kOtherKey})},
         [](CallerMemory& m) { m.handle = kOtherKey; }},
        {"C_CopyObject", 24, {}, [](CallerMemory&) {}},  // present without a handle
        {"C_GetObjectSize", 25, {kKey}, [](CallerMemory& m) { m.count = kKey; }},
        // Rewritten whether or not a value came, within the caller's buffers and count.
        {"C_FindObjectsInit", 8, {Field::attributes({{CKA_VALUE, "0123456789", 10},
                                                     {CKA_ID, Field(), 1},
                                                     {CKA_KEY_TYPE, "k", 1}})},
         [](CallerMemory& m) {
             memcpy(m.value, "01234", 5), m.tmpl[0].type = CKA_VALUE;
             m.tmpl[1].type = CKA_ID, m.tmpl[1].ulValueLen = 1;
         }},
        {"C_GenerateKey", 39, {kObject}, [](CallerMemory& m) { m.handle = kObject; }},
        {"C_GenerateKeyPair", 40, {kKey, kOtherKey},
         [](CallerMemory& m) { m.handle = kKey, m.otherHandle = kOtherKey; }},
        {"C_UnWrapKey", 42, {kSlot}, [](CallerMemory& m) { m.handle = kSlot; }},
        {"C_DeriveKey", 43, {kOtherKey}, [](CallerMemory& m) { m.handle = kOtherKey; }},
        {"C_WaitForSlotEvent", 44, {kSlot}, [](CallerMemory& m) { m.handle = kSlot; }},
    };
    // clang-format on
    for (const CopyBack& row : rows) {
        SCOPED_TRACE(row.name);
        const ProxyCall* proxy = nullptr;
        for (const ProxyCall& p : everyProxyCall())
            if (std::string(p.name) == row.name) proxy = &p;
        ASSERT_NE(nullptr, proxy);
        // Deployed services answer C_DeriveKey under another name; no answer's name is checked.
        service.scriptRaw(
            encodeAnswer("C_UnDeriveKey", CKR_KEY_SIZE_RANGE, row.field, row.answer));
        EXPECT_EQ(CKR_KEY_SIZE_RANGE, run(*proxy));
        CallerMemory expected;
        memcpy(&expected, &before, sizeof expected);
        row.expect(expected);
        const auto bytes = [](const CallerMemory& m) {
            return hex(std::string(reinterpret_cast<const char*>(&m), sizeof m));
        };
        EXPECT_EQ(bytes(expected), bytes(gCaller));
    }
}

TEST_F(EveryProxy, InitializeArgumentsNeverReachTheService) {
    ASSERT_EQ(CKR_OK, C_Initialize(nullptr));
    const std::string withNull = service.lastRequestBytes();
    CK_C_INITIALIZE_ARGS args{};
    args.flags = CKF_OS_LOCKING_OK;
    args.pReserved = &args;
    ASSERT_EQ(CKR_OK, C_Initialize(&args));
    EXPECT_EQ(hex(encodeRequest("C_Initialize", 0, {})), hex(withNull));
    EXPECT_EQ(hex(withNull), hex(service.lastRequestBytes()));
}

// Lines whose spelling differs from the function's own name.
TEST_F(EveryProxy, LogsUnderTheSpellingsItsCallersKnow) {
    struct Case {
        CK_RV (*call)();
        std::vector<std::string> lines;
    };
    const Case cases[] = {
        {[] { return C_InitPIN(kSession, nullptr, 0); },
         {"Inside InitPin", "C_InitPin Success", "C_InitPin response length = %"}},
        {[] { return C_SetPIN(kSession, nullptr, 0, nullptr, 0); },
         {"Inside SetPin", "C_SetPin Success", "C_SetPin response length = %"}},
        {[] { return C_UnwrapKey(kSession, nullptr, kKey, nullptr, 0, nullptr, 0, nullptr); },
         {"C_UnWrapKey", "C_UnWrapKey Success", "C_UnWrapKey response length = %"}},
        {[] { return C_Initialize(nullptr); },
         {"C_Initialize", "C_Initialize serialized buffer size = 14",
          "C_Initialize serialized before server call ", "C_initialize Success",
          "C_Initialize response length = %", "C_Initialize after server call ",
          "C_Initialize return result "}},
    };
    for (const Case& c : cases) {
        const pkcs11::OperationResult res = answer("any name", CKR_OK);
        service.script(res);
        LogCapture log;
        ASSERT_EQ(CKR_OK, c.call());
        const std::string length = std::to_string(res.ByteSizeLong());
        std::vector<std::string> expected = c.lines;
        for (std::string& line : expected)
            if (line.back() == '%') line.replace(line.size() - 1, 1, length);
        EXPECT_EQ(expected, log.texts("Vokpkcs11f"));
    }
}

// Each case runs in its own process, so the list does not exist yet.
TEST(FunctionList, PointsAtTheLibrarysOwnProxiesInStandardOrder) {
    ASSERT_EQ(nullptr, mFunctionList);
    LogCapture log;
    CK_FUNCTION_LIST_PTR first = nullptr;
    ASSERT_EQ(CKR_OK, C_GetFunctionList(&first));
    EXPECT_EQ(std::vector<std::string>{"C_FunctionList"}, log.texts("Vokpkcs11f"));
    ASSERT_NE(nullptr, first);
    EXPECT_EQ(first, mFunctionList);

    std::vector<void*> expected;
#define VOK_ADDRESS_OF(name, params) expected.push_back(reinterpret_cast<void*>(&name));
    VOK_CK_FUNCTIONS(VOK_ADDRESS_OF)
#undef VOK_ADDRESS_OF
    ASSERT_EQ(68u, expected.size());
    std::vector<void*> slots(68);
    memcpy(slots.data(), reinterpret_cast<const char*>(first) + sizeof(CK_VERSION),
           68 * sizeof(void*));
    EXPECT_EQ(expected, slots);

    log.clear();
    CK_FUNCTION_LIST_PTR second = nullptr;
    ASSERT_EQ(CKR_OK, C_GetFunctionList(&second));
    EXPECT_EQ(first, second);
    EXPECT_TRUE(log.texts("Vokpkcs11f").empty());
}

}  // namespace
}  // namespace voktest
