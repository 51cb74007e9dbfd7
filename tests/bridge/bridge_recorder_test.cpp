// The bridge in front of a module that records which of its functions runs:
// every one of the 68 entries reaches the module function of its own name and
// returns that function's result unchanged.

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <stdlib.h>

#include <string>
#include <type_traits>
#include <vector>

#include "vok_pkcs11.h"

namespace {

using Bytes = std::vector<unsigned char>;

// Calls `function` with every pointer argument pointing into `buffer` and every
// number 1.
template <class... Args>
CK_RV callWith(Bytes& buffer, CK_RV (*function)(Args...)) {
    const auto argument = [&buffer](auto type) {
        using T = decltype(type);
        if constexpr (std::is_pointer_v<T>)
            return reinterpret_cast<T>(buffer.data());
        else
            return T(1);
    };
    return function(argument(Args{})...);
}

class BridgeOverRecorder : public ::testing::Test {
protected:
    void SetUp() override {
        setenv("VOK_BRIDGE_MODULE", VOK_TEST_STD_RECORDER, 1);
        bridge_ = dlopen(VOK_TEST_BRIDGE, RTLD_NOW | RTLD_LOCAL);
        recorder_ = dlopen(VOK_TEST_STD_RECORDER, RTLD_NOW | RTLD_LOCAL);
        ASSERT_TRUE(bridge_ && recorder_) << dlerror();
        auto getter = reinterpret_cast<CK_C_GetFunctionList>(dlsym(bridge_, "C_GetFunctionList"));
        last_ = reinterpret_cast<const char* (*)()>(dlsym(recorder_, "std_recorder_last"));
        ASSERT_TRUE(getter && last_ && getter(&list_) == CKR_OK);
    }
    void TearDown() override {
        if (bridge_) dlclose(bridge_);
        if (recorder_) dlclose(recorder_);
    }

    void* bridge_ = nullptr;
    void* recorder_ = nullptr;
    CK_FUNCTION_LIST* list_ = nullptr;
    const char* (*last_)() = nullptr;
};

TEST_F(BridgeOverRecorder, EveryEntryReachesTheModuleFunctionOfItsName) {
    const struct {
        const char* name;
        CK_RV (*call)(CK_FUNCTION_LIST*, Bytes&);
    } entries[] = {
#define VOK_TEST_ENTRY(name, params) \
    {#name, [](CK_FUNCTION_LIST* list, Bytes& buffer) { return callWith(buffer, list->name); }},
        VOK_CK_FUNCTIONS(VOK_TEST_ENTRY)
#undef VOK_TEST_ENTRY
    };
    CK_RV code = 0x80000000UL;  // the recorder's function i returns this plus i
    // Every call fails, so no output may reach the caller's memory (converted
    // structures included).
    Bytes buffer(4096, 0x5A);
    for (const auto& entry : entries) {
        if (std::string(entry.name) != "C_GetFunctionList") {
            EXPECT_EQ(entry.call(list_, buffer), code) << entry.name;
            EXPECT_STREQ(last_(), entry.name);
        }
        ++code;
    }
    EXPECT_EQ(buffer, Bytes(4096, 0x5A));
    // The getter is the bridge's own: it hands out the bridge's list.
    CK_FUNCTION_LIST* again = nullptr;
    EXPECT_EQ(list_->C_GetFunctionList(&again), CKR_OK);
    EXPECT_EQ(again, list_);
    EXPECT_STREQ(last_(), "C_WaitForSlotEvent");
    EXPECT_EQ(list_->version.major, 2);
    EXPECT_EQ(list_->version.minor, 40);
}

// Parameters whose standard layout differs and that the standard header does
// not describe are refused before the module sees them; the others reach it.
TEST_F(BridgeOverRecorder, RefusesOnlyParametersThatWouldBeMisread) {
    // clang-format off
    const CK_MECHANISM_TYPE refused[] = {
        CKM_KEA_KEY_DERIVE, CKM_KEA_DERIVE, CKM_KEY_WRAP_SET_OAEP, CKM_SSL3_KEY_AND_MAC_DERIVE,
        CKM_TLS_KEY_AND_MAC_DERIVE, CKM_TLS12_KEY_AND_MAC_DERIVE, CKM_TLS12_KEY_SAFE_DERIVE,
        CKM_WTLS_SERVER_KEY_AND_MAC_DERIVE, CKM_WTLS_CLIENT_KEY_AND_MAC_DERIVE};
    // clang-format on
    unsigned char parameter[64] = {0};
    for (CK_MECHANISM_TYPE type : refused) {
        CK_MECHANISM mechanism = {type, parameter, sizeof parameter};
        EXPECT_EQ(list_->C_DeriveKey(1, &mechanism, 2, nullptr, 0, nullptr),
                  CKR_MECHANISM_PARAM_INVALID)
            << std::hex << type;
        EXPECT_STREQ(last_(), "");
    }
    CK_MECHANISM ecdh = {CKM_ECDH1_DERIVE, parameter, sizeof parameter};
    EXPECT_NE(list_->C_DeriveKey(1, &ecdh, 2, nullptr, 0, nullptr), CKR_MECHANISM_PARAM_INVALID);
    EXPECT_STREQ(last_(), "C_DeriveKey");
}

}  // namespace
