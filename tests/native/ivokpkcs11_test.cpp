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

// Arguments and pointers reach the module as the caller gave them.
TEST_F(NativeInterfaceTest, ArgumentsReachTheModuleUnchanged) {
    connect("token-e");
    auto token = instance("token-e");
    ASSERT_EQ(token->C_Initialize(nullptr), CKR_OK);

    CK_ULONG count = 0;
    EXPECT_EQ(token->C_GetSlotList(CK_TRUE, nullptr, &count), CKR_OK);
    EXPECT_EQ(count, 1u);

    CK_SESSION_HANDLE session = 0;
    ASSERT_EQ(token->C_OpenSession(FAKE_VENDOR_SLOT_ID, CKF_SERIAL_SESSION | CKF_RW_SESSION,
                                   nullptr, nullptr, &session),
              CKR_OK);
    CK_UTF8CHAR pin[] = FAKE_VENDOR_USER_PIN;
    ASSERT_EQ(token->C_Login(session, CKU_USER, pin, 4), CKR_OK);
    fakevendor::Call login = fakevendor::lastCall("C_Login");
    EXPECT_EQ(login.arg("hSession").number, session);
    EXPECT_EQ(login.arg("userType").number, CKU_USER);
    EXPECT_EQ(login.arg("pPin").hex, fakevendor::hex(pin, 4));
    EXPECT_EQ(login.arg("ulPinLen").number, 4u);

    CK_OBJECT_CLASS cls = CKO_SECRET_KEY;
    CK_KEY_TYPE type = CKK_AES;
    CK_BYTE value[16] = {0x11, 0x22};
    CK_ATTRIBUTE tmpl[] = {{CKA_CLASS, &cls, sizeof(cls)},
                           {CKA_KEY_TYPE, &type, sizeof(type)},
                           {CKA_VALUE, value, sizeof(value)}};
    CK_OBJECT_HANDLE key = 0;
    ASSERT_EQ(token->C_CreateObject(session, tmpl, 3, &key), CKR_OK);
    fakevendor::Call create = fakevendor::lastCall("C_CreateObject");
    ASSERT_EQ(create.arg("pTemplate").items.size(), 3u);
    EXPECT_EQ(create.arg("pTemplate").items[2].hex, fakevendor::hex(value, sizeof(value)));
    EXPECT_EQ(create.arg("ulCount").number, 3u);

    CK_MECHANISM mechanism = {CKM_AES_ECB, nullptr, 0};
    ASSERT_EQ(token->C_EncryptInit(session, &mechanism, key), CKR_OK);
    CK_BYTE plain[16] = {'a', 'b', 'c'};
    CK_BYTE cipher[16];
    CK_ULONG cipherLen = sizeof(cipher);
    ASSERT_EQ(token->C_Encrypt(session, plain, sizeof(plain), cipher, &cipherLen), CKR_OK);
    fakevendor::Call encrypt = fakevendor::lastCall("C_Encrypt");
    EXPECT_EQ(encrypt.arg("pData").hex, fakevendor::hex(plain, sizeof(plain)));
    EXPECT_EQ(encrypt.arg("pulEncryptedDataLen").number, sizeof(cipher));
    EXPECT_EQ(cipherLen, sizeof(plain));
    EXPECT_EQ(cipher[0], plain[0] ^ value[0]);  // written straight into the caller's buffer

    CK_BYTE random[8] = {};
    ASSERT_EQ(token->C_GenerateRandom(session, random, sizeof(random)), CKR_OK);
    EXPECT_EQ(fakevendor::lastCall("C_GenerateRandom").arg("ulRandomLen").number, 8u);
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
