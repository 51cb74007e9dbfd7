// IVokPkcs11 against modules registered through the real registry in an
// embedded Java VM.
#include "IVokPkcs11.h"

#include <gtest/gtest.h>

#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <functional>
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

    std::unique_ptr<IVokPkcs11> instance(const char* name) {
        return std::unique_ptr<IVokPkcs11>(IVokPkcs11::getInstance(name));
    }

    voktest::LogCapture log_;
};

// An instance keeps its own copy of the name and looks the module up at each
// call; a null name reaches the first module.
TEST_F(NativeInterfaceTest, AnInstanceFindsItsModuleByNameAtEachCall) {
    char name[] = "token-a";
    auto token = instance(name);
    auto other = instance(name);
    ASSERT_NE(token.get(), other.get());
    std::strcpy(name, "other-x");
    other.reset();

    EXPECT_EQ(token->C_Initialize(nullptr), CKR_FUNCTION_FAILED);
    EXPECT_EQ(log_.texts(kTag), (std::vector<std::string>{"C_Initialize...", "getFunctions return NULL"}));
    voktest::Module module = voktest::registerModule("token-a", fake_vendor_function_list());
    EXPECT_EQ(token->C_Initialize(nullptr), CKR_OK);
    EXPECT_EQ(fake_vendor_call_count(), 1u);
    std::free(removeModuleEntry(env_, module.object));
    EXPECT_EQ(token->C_Finalize(nullptr), CKR_FUNCTION_FAILED);
    EXPECT_EQ(fake_vendor_call_count(), 1u);

    static CK_FUNCTION_LIST empty{};  // registered: outlives the test
    voktest::registerModule("first", fake_vendor_function_list());
    voktest::registerModule("second", &empty);
    EXPECT_EQ(instance(nullptr)->C_Finalize(nullptr), CKR_OK);
    EXPECT_EQ(fake_vendor_call_count(), 2u);
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

// Each forwarder logs its name, and its result with %d (the first group, up
// to C_GetOperationState), not at all (C_Verify, C_CancelFunction) or with
// %llu (the rest). A list that leaves the entry NULL does not offer the
// function; C_GetFunctionList is never offered.
TEST_F(NativeInterfaceTest, EveryForwarderReachesItsOwnFunctionAndLogsByItsGroup) {
    struct Row {
        std::string name;
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
    const size_t lastNarrow = VOK_INDEX(C_GetOperationState);
#undef VOK_INDEX
    ASSERT_EQ(rows.size(), 68u);
    voktest::registerModule("recorders", &list);
    auto token = instance("recorders");
    static std::vector<CK_FUNCTION_LIST> gaps(rows.size(), list);
    const Recorded none{~size_t(0), {}};
    for (const Row& row : rows) {
        SCOPED_TRACE(row.name);
        const bool offered = row.name != "C_GetFunctionList";
        gRecorded = none;
        log_.clear();
        CK_RV rv = 0;
        const std::vector<uint64_t> sent = row.call(token.get(), &rv);
        EXPECT_EQ(gRecorded.index, offered ? row.index : none.index);
        EXPECT_EQ(gRecorded.args, offered ? sent : none.args);
        EXPECT_EQ(rv, offered ? 0x80000000UL + row.index : CKR_FUNCTION_NOT_SUPPORTED);
        std::vector<std::string> lines;
        if (offered) lines.push_back(row.name + "...");
        if (offered && row.name != "C_Verify" && row.name != "C_CancelFunction")
            lines.push_back("return " + (row.index <= lastNarrow
                                             ? std::to_string(static_cast<int32_t>(rv))
                                             : std::to_string(rv)));
        EXPECT_EQ(log_.texts(kTag), lines);
        if (!offered) continue;

        CK_FUNCTION_LIST& gap = gaps[row.index];
        std::memset(reinterpret_cast<char*>(&gap.C_Initialize) + row.index * sizeof(void*), 0,
                    sizeof(void*));
        voktest::registerModule(("gap-" + row.name).c_str(), &gap);
        gRecorded = none;
        row.call(instance(("gap-" + row.name).c_str()).get(), &rv);
        EXPECT_EQ(rv, CKR_FUNCTION_NOT_SUPPORTED);
        EXPECT_EQ(gRecorded.index, none.index);
    }
}

}  // namespace
