// The bridge in front of a module that records which of its functions runs:
// every one of the 68 entries reaches the module function of its own name and
// returns that function's result unchanged.

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <stdlib.h>

#include <cstring>
#include <string>
#include <vector>

#include "vok_pkcs11.h"

namespace {

// Calls `function` with every argument zero (null pointers, zero handles).
template <class... Args>
CK_RV callWithZeros(CK_RV (*function)(Args...)) {
    return function(Args{}...);
}

struct Entry {
    const char* name;
    CK_RV (*call)(CK_FUNCTION_LIST* list);
};

const std::vector<Entry>& entries() {
    static const std::vector<Entry> table = {
#define VOK_TEST_ENTRY(name, params) \
    {#name, [](CK_FUNCTION_LIST* list) { return callWithZeros(list->name); }},
        VOK_CK_FUNCTIONS(VOK_TEST_ENTRY)
#undef VOK_TEST_ENTRY
    };
    return table;
}

class BridgeOverRecorder : public ::testing::Test {
protected:
    void SetUp() override {
        setenv("VOK_BRIDGE_MODULE", VOK_TEST_STD_RECORDER, 1);
        bridge_ = dlopen(VOK_TEST_BRIDGE, RTLD_NOW | RTLD_LOCAL);
        recorder_ = dlopen(VOK_TEST_STD_RECORDER, RTLD_NOW | RTLD_LOCAL);
        ASSERT_NE(bridge_, nullptr) << dlerror();
        ASSERT_NE(recorder_, nullptr) << dlerror();
        auto getter = reinterpret_cast<CK_C_GetFunctionList>(dlsym(bridge_, "C_GetFunctionList"));
        last_ = reinterpret_cast<const char* (*)()>(dlsym(recorder_, "std_recorder_last"));
        code_ = reinterpret_cast<unsigned long (*)(int)>(dlsym(recorder_, "std_recorder_code"));
        ASSERT_TRUE(getter && last_ && code_);
        ASSERT_EQ(getter(&list_), CKR_OK);
    }
    void TearDown() override {
        if (bridge_) dlclose(bridge_);
        if (recorder_) dlclose(recorder_);
    }

    void* bridge_ = nullptr;
    void* recorder_ = nullptr;
    CK_FUNCTION_LIST* list_ = nullptr;
    const char* (*last_)() = nullptr;
    unsigned long (*code_)(int) = nullptr;
};

TEST_F(BridgeOverRecorder, EveryEntryReachesTheModuleFunctionOfItsName) {
    ASSERT_EQ(entries().size(), 68u);
    for (size_t i = 0; i < entries().size(); ++i) {
        const Entry& e = entries()[i];
        if (std::string(e.name) == "C_GetFunctionList") continue;
        EXPECT_EQ(e.call(list_), code_(static_cast<int>(i))) << e.name;
        EXPECT_STREQ(last_(), e.name);
    }
}

TEST_F(BridgeOverRecorder, GetFunctionListEntryHandsOutTheBridgesOwnList) {
    CK_FUNCTION_LIST* again = nullptr;
    EXPECT_EQ(list_->C_GetFunctionList(&again), CKR_OK);
    EXPECT_EQ(again, list_);
    EXPECT_STREQ(last_(), "");
    EXPECT_EQ(list_->version.major, 2);
    EXPECT_EQ(list_->version.minor, 40);
}

// The module failed, so what it left in its own structure is not the
// caller's: the caller's converted structure keeps its bytes.
TEST_F(BridgeOverRecorder, ConvertedStructuresAreUntouchedWhenTheModuleFails) {
    CK_INFO info;
    CK_SLOT_INFO slot;
    CK_TOKEN_INFO token;
    std::memset(&info, 0x5A, sizeof info);
    std::memset(&slot, 0x5A, sizeof slot);
    std::memset(&token, 0x5A, sizeof token);
    EXPECT_NE(list_->C_GetInfo(&info), CKR_OK);
    EXPECT_NE(list_->C_GetSlotInfo(1, &slot), CKR_OK);
    EXPECT_NE(list_->C_GetTokenInfo(1, &token), CKR_OK);
    const auto untouched = [](const void* p, size_t n) {
        for (size_t i = 0; i < n; ++i)
            if (static_cast<const unsigned char*>(p)[i] != 0x5A) return false;
        return true;
    };
    EXPECT_TRUE(untouched(&info, sizeof info));
    EXPECT_TRUE(untouched(&slot, sizeof slot));
    EXPECT_TRUE(untouched(&token, sizeof token));
}

}  // namespace
