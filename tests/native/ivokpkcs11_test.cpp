// IVokPkcs11 against the fake vendor module registered through the real
// registry in an embedded Java VM.
#include "IVokPkcs11.h"

#include <gtest/gtest.h>

#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <iterator>
#include <memory>
#include <string>
#include <type_traits>
#include <utility>
#include <vector>

#include "fake_vendor.h"
#include "jvm_fixture.h"
#include "log_capture.h"
#include "registry.h"

namespace {

const char* const kTag = "[native:VokPkcs11]";

class NativeInterfaceTest : public voktest::JvmTest {
protected:
    void SetUp() override {
        JvmTest::SetUp();
        fake_vendor_reset();
    }

    voktest::Module connect(const char* name) {
        return voktest::registerModule(name, fake_vendor_function_list());
    }

    void disconnect(const voktest::Module& module) {
        ModuleEntry* entry = removeModuleEntry(env_, module.object);
        ASSERT_EQ(entry, module.entry);
        free(entry);
    }

    std::unique_ptr<IVokPkcs11> instance(const char* name) {
        return std::unique_ptr<IVokPkcs11>(IVokPkcs11::getInstance(name));
    }

    voktest::LogCapture log_;
};

TEST_F(NativeInterfaceTest, UnregisteredModuleAnswersFunctionFailedUntilRegistered) {
    auto token = instance("token-a");
    ASSERT_NE(token, nullptr);

    EXPECT_EQ(token->C_Initialize(nullptr), CKR_FUNCTION_FAILED);
    EXPECT_TRUE(log_.contains(kTag, "C_Initialize..."));
    EXPECT_TRUE(log_.contains(kTag, "getFunctions return NULL"));
    EXPECT_EQ(fake_vendor_call_count(), 0u);

    voktest::Module module = connect("token-a");
    EXPECT_EQ(token->C_Initialize(nullptr), CKR_OK);
    EXPECT_EQ(fake_vendor_call_count(), 1u);

    disconnect(module);
    EXPECT_EQ(token->C_Finalize(nullptr), CKR_FUNCTION_FAILED);
    EXPECT_EQ(fake_vendor_call_count(), 1u);
}

TEST_F(NativeInterfaceTest, InstancesAreDistinctAndOwnTheirName) {
    connect("token-b");
    char name[] = "token-b";
    auto first = instance(name);
    auto second = instance(name);
    ASSERT_NE(first.get(), second.get());

    // The caller's buffer is its own: changing it does not rebind an instance.
    std::strcpy(name, "other-x");
    first.reset();
    EXPECT_EQ(second->C_Initialize(nullptr), CKR_OK);
    EXPECT_EQ(fakevendor::lastCall("C_Initialize").rv, CKR_OK);
}

TEST_F(NativeInterfaceTest, NullNameReachesTheFirstModule) {
    connect("first");
    connect("second");
    auto any = instance(nullptr);
    EXPECT_EQ(any->C_Initialize(nullptr), CKR_OK);
    EXPECT_EQ(fake_vendor_call_count(), 1u);
}

TEST_F(NativeInterfaceTest, GetFunctionListIsNotOffered) {
    connect("token-c");
    auto token = instance("token-c");
    CK_FUNCTION_LIST_PTR list = nullptr;
    log_.clear();
    EXPECT_EQ(token->C_GetFunctionList(&list), CKR_FUNCTION_NOT_SUPPORTED);
    EXPECT_EQ(list, nullptr);
    EXPECT_TRUE(log_.texts(kTag).empty());
    EXPECT_EQ(fake_vendor_call_count(), 0u);
}

// The first group logs the result with %d, the rest with %llu, and C_Verify
// and C_CancelFunction not at all.
TEST_F(NativeInterfaceTest, ResultLogFormatsFollowTheMethodGroup) {
    connect("token-d");
    auto token = instance("token-d");
    const CK_RV big = 0x1234567890ULL;
    struct Case {
        const char* function;
        std::function<CK_RV()> call;
        const char* resultLine;  // nullptr: no result line
    };
    CK_BYTE data[4] = {1, 2, 3, 4};
    const Case cases[] = {
        {"C_GetOperationState", [&] { return token->C_GetOperationState(7, nullptr, nullptr); },
         "return 878082192"},
        {"C_SetOperationState", [&] { return token->C_SetOperationState(7, data, 4, 0, 0); },
         "return 78187493520"},
        {"C_Verify", [&] { return token->C_Verify(7, data, 4, data, 4); }, nullptr},
        {"C_CancelFunction", [&] { return token->C_CancelFunction(7); }, nullptr},
        {"C_WaitForSlotEvent", [&] { return token->C_WaitForSlotEvent(0, nullptr, nullptr); },
         "return 78187493520"},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(c.function);
        ASSERT_EQ(fake_vendor_set_next_rv(c.function, big), CKR_OK);
        log_.clear();
        EXPECT_EQ(c.call(), big);
        std::vector<std::string> expected = {std::string(c.function) + "..."};
        if (c.resultLine) expected.push_back(c.resultLine);
        EXPECT_EQ(log_.texts(kTag), expected);
    }
}

// Every forwarder hands its own module function each argument unchanged and
// returns what it returned: a list of recorders, one per function, each
// keeping its index and arguments; argument k of a call is a value no other
// argument of that call has.
struct Recorded {
    size_t index = 0;
    std::vector<uint64_t> args;
} gRecorded;

template <class T>
uint64_t asNumber(T value) {
    if constexpr (std::is_pointer_v<T>)
        return reinterpret_cast<uintptr_t>(value);
    else
        return static_cast<uint64_t>(value);
}
template <class T>
T distinct(size_t index, size_t k) {
    const uint64_t value = (index << 8) | (k + 1);
    if constexpr (std::is_pointer_v<T>)
        return reinterpret_cast<T>(static_cast<uintptr_t>(value));
    else
        return static_cast<T>(value);
}

template <size_t Index, class Entry>
struct Recorder;
template <size_t Index, class... Args>
struct Recorder<Index, CK_RV (*)(Args...)> {
    static CK_RV record(Args... args) {
        gRecorded = {Index, {asNumber(args)...}};
        return 0x80000000UL + Index;
    }
};

template <class... Args, size_t... K>
std::vector<uint64_t> callWithDistinct(IVokPkcs11* token, CK_RV (IVokPkcs11::*method)(Args...),
                                       size_t index, CK_RV* rv, std::index_sequence<K...>) {
    *rv = (token->*method)(distinct<Args>(index, K)...);
    return {asNumber(distinct<Args>(index, K))...};
}
template <class... Args>
std::vector<uint64_t> callWithDistinct(IVokPkcs11* token, CK_RV (IVokPkcs11::*method)(Args...),
                                       size_t index, CK_RV* rv) {
    return callWithDistinct(token, method, index, rv, std::index_sequence_for<Args...>());
}

TEST_F(NativeInterfaceTest, EveryForwarderHandsItsOwnFunctionTheArgumentsUnchanged) {
    struct Row {
        const char* name;
        size_t index;
        std::function<std::vector<uint64_t>(IVokPkcs11*, CK_RV*)> call;
    };
    static CK_FUNCTION_LIST list;  // registered: outlives the test
    std::vector<Row> rows;
#define VOK_INDEX(name) \
    ((offsetof(CK_FUNCTION_LIST, name) - offsetof(CK_FUNCTION_LIST, C_Initialize)) / sizeof(void*))
#define VOK_ROW(name, params)                                                             \
    list.name = &Recorder<VOK_INDEX(name), decltype(list.name)>::record;                  \
    rows.push_back({#name, VOK_INDEX(name), [](IVokPkcs11* token, CK_RV* rv) {            \
                        return callWithDistinct(token, &IVokPkcs11::name, VOK_INDEX(name), rv); \
                    }});
    VOK_CK_FUNCTIONS(VOK_ROW)
#undef VOK_ROW
#undef VOK_INDEX
    voktest::registerModule("recorders", &list);
    auto token = instance("recorders");
    for (const Row& row : rows) {
        if (std::string(row.name) == "C_GetFunctionList") continue;  // not offered
        SCOPED_TRACE(row.name);
        gRecorded = {};
        CK_RV rv = 0;
        const std::vector<uint64_t> sent = row.call(token.get(), &rv);
        EXPECT_EQ(gRecorded.index, row.index);
        EXPECT_EQ(gRecorded.args, sent);
        EXPECT_EQ(rv, 0x80000000UL + row.index);
    }
}

// Every argument zero or NULL: the calls below never reach a module.
template <class... Args>
CK_RV callWithZeros(IVokPkcs11* token, CK_RV (IVokPkcs11::*method)(Args...)) {
    return (token->*method)(Args{}...);
}

struct Forwarder {
    const char* name;
    size_t entry;  // offset of the function's entry in the list
    CK_RV (*call)(IVokPkcs11*);
};
#define VOK_FORWARDER(name, params)           \
    {#name, offsetof(CK_FUNCTION_LIST, name), \
     [](IVokPkcs11* t) { return callWithZeros(t, &IVokPkcs11::name); }},
const Forwarder kForwarders[] = {VOK_CK_FUNCTIONS(VOK_FORWARDER)};

TEST_F(NativeInterfaceTest, AFunctionTheListLeavesNullIsNotSupported) {
    std::vector<CK_FUNCTION_LIST> lists(std::size(kForwarders), *fake_vendor_function_list());
    for (size_t i = 0; i < lists.size(); ++i) {
        const Forwarder& f = kForwarders[i];
        SCOPED_TRACE(f.name);
        std::memset(reinterpret_cast<char*>(&lists[i]) + f.entry, 0, sizeof(void*));
        const std::string name = std::string("gap-") + f.name;
        voktest::registerModule(name.c_str(), &lists[i]);
        EXPECT_EQ(f.call(instance(name.c_str()).get()), CKR_FUNCTION_NOT_SUPPORTED);
        EXPECT_EQ(fake_vendor_call_count(), 0u);
    }
}

}  // namespace
