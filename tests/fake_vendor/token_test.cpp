// The token's general, slot, session and object rules.

#include <dlfcn.h>

#include <cstring>
#include <thread>

#include "fake_vendor_fixture.h"

// Stands in for the proxy, which puts this name in the global scope of test
// processes that also load the module.
extern "C" CK_RV C_GetFunctionList(CK_FUNCTION_LIST_PTR_PTR) { return CKR_GENERAL_ERROR; }

namespace fakevendor {
namespace {

TEST(FakeVendorModule, LoadedByPathItIsTheLinkedInstance) {
    void* handle = dlopen(VOK_FAKE_VENDOR_PATH, RTLD_NOW | RTLD_LOCAL);
    ASSERT_NE(handle, nullptr) << dlerror();
    auto getList = reinterpret_cast<CK_C_GetFunctionList>(dlsym(handle, "C_GetFunctionList"));
    ASSERT_NE(getList, nullptr);
    CK_FUNCTION_LIST_PTR list = nullptr;
    ASSERT_EQ(getList(&list), CKR_OK);
    EXPECT_EQ(list, fake_vendor_function_list());
    dlclose(handle);
}

TEST(FakeVendorModule, FunctionListIsComplete) {
    fake_vendor_reset();
    CK_FUNCTION_LIST_PTR list = nullptr;
    ASSERT_EQ(fake_vendor_function_list()->C_GetFunctionList(&list), CKR_OK);
    EXPECT_EQ(list, fake_vendor_function_list());
    EXPECT_EQ(list->version.major, 2);
    EXPECT_EQ(list->version.minor, 40);
#define FAKE_EXPECT_ENTRY(name, params) \
    EXPECT_NE(reinterpret_cast<void*>(list->name), nullptr) << #name;
    VOK_CK_FUNCTIONS(FAKE_EXPECT_ENTRY)
#undef FAKE_EXPECT_ENTRY
    EXPECT_EQ(list->C_GetFunctionList(nullptr), CKR_ARGUMENTS_BAD);
}

TEST(FakeVendorModule, InitializeAndFinalizeRules) {
    fake_vendor_reset();
    CK_FUNCTION_LIST_PTR f = fake_vendor_function_list();
    CK_INFO info;
    EXPECT_EQ(f->C_GetInfo(&info), CKR_CRYPTOKI_NOT_INITIALIZED);
    EXPECT_EQ(f->C_Finalize(nullptr), CKR_CRYPTOKI_NOT_INITIALIZED);
    ASSERT_EQ(f->C_Initialize(nullptr), CKR_OK);
    EXPECT_EQ(f->C_Initialize(nullptr), CKR_CRYPTOKI_ALREADY_INITIALIZED);
    int reserved = 0;
    EXPECT_EQ(f->C_Finalize(&reserved), CKR_ARGUMENTS_BAD);
    EXPECT_EQ(f->C_Finalize(nullptr), CKR_OK);
    EXPECT_EQ(f->C_GetInfo(&info), CKR_CRYPTOKI_NOT_INITIALIZED);
}

CK_RV fakeCreateMutex(CK_VOID_PTR_PTR) { return CKR_OK; }
CK_RV fakeMutexOp(CK_VOID_PTR) { return CKR_OK; }

TEST(FakeVendorModule, InitializeArguments) {
    int reserved = 0;
    struct Case {
        CK_C_INITIALIZE_ARGS args;
        CK_RV rv;
    } cases[] = {
        {{nullptr, nullptr, nullptr, nullptr, 0, nullptr}, CKR_OK},
        {{nullptr, nullptr, nullptr, nullptr, CKF_OS_LOCKING_OK, nullptr}, CKR_OK},
        {{fakeCreateMutex, fakeMutexOp, fakeMutexOp, fakeMutexOp, CKF_OS_LOCKING_OK, nullptr},
         CKR_OK},
        {{fakeCreateMutex, fakeMutexOp, fakeMutexOp, fakeMutexOp, 0, nullptr}, CKR_CANT_LOCK},
        {{fakeCreateMutex, nullptr, fakeMutexOp, fakeMutexOp, CKF_OS_LOCKING_OK, nullptr},
         CKR_ARGUMENTS_BAD},
        {{nullptr, nullptr, nullptr, nullptr, 0, &reserved}, CKR_ARGUMENTS_BAD},
    };
    for (Case& c : cases) {
        fake_vendor_reset();
        EXPECT_EQ(fake_vendor_function_list()->C_Initialize(&c.args), c.rv)
            << "case " << (&c - cases);
    }
}

// Blank padding, no terminator, a non-empty text shorter than the field.
void expectPadded(const CK_UTF8CHAR* field, size_t size, const char* what) {
    const std::string text(reinterpret_cast<const char*>(field), size);
    EXPECT_EQ(text.find('\0'), std::string::npos) << what;
    EXPECT_NE(text[0], ' ') << what;
    EXPECT_EQ(text.back(), ' ') << what;
}

TEST_F(FakeVendorTest, InfoTextsAreBlankPadded) {
    CK_INFO info;
    CK_SLOT_INFO slot;
    CK_TOKEN_INFO token;
    ASSERT_EQ(f->C_GetInfo(&info), CKR_OK);
    ASSERT_EQ(f->C_GetSlotInfo(FAKE_VENDOR_SLOT_ID, &slot), CKR_OK);
    ASSERT_EQ(f->C_GetTokenInfo(FAKE_VENDOR_SLOT_ID, &token), CKR_OK);
    EXPECT_EQ(info.cryptokiVersion.major, 2);
    EXPECT_EQ(info.cryptokiVersion.minor, 40);
    EXPECT_EQ(CK_FLAGS(info.flags), 0u);
    expectPadded(info.manufacturerID, sizeof info.manufacturerID, "manufacturerID");
    expectPadded(info.libraryDescription, sizeof info.libraryDescription, "libraryDescription");
    expectPadded(slot.slotDescription, sizeof slot.slotDescription, "slotDescription");
    expectPadded(slot.manufacturerID, sizeof slot.manufacturerID, "slot manufacturerID");
    expectPadded(token.label, sizeof token.label, "label");
    expectPadded(token.manufacturerID, sizeof token.manufacturerID, "token manufacturerID");
    expectPadded(token.model, sizeof token.model, "model");
    expectPadded(token.serialNumber, sizeof token.serialNumber, "serialNumber");
    EXPECT_TRUE(slot.flags & CKF_TOKEN_PRESENT);
    EXPECT_EQ(CK_ULONG(token.ulSessionCount), 1u);
    EXPECT_EQ(CK_ULONG(token.ulRwSessionCount), 1u);
    EXPECT_EQ(f->C_GetSlotInfo(2, &slot), CKR_SLOT_ID_INVALID);
}

TEST_F(FakeVendorTest, InitTokenTakesTheLabelAsReceivedAndResetsTheUser) {
    CK_UTF8CHAR label[32];
    std::memset(label, ' ', sizeof label);
    std::memcpy(label, "new label", 9);
    const std::string so = FAKE_VENDOR_SO_PIN;
    auto soPin = reinterpret_cast<CK_UTF8CHAR_PTR>(const_cast<char*>(so.data()));
    EXPECT_EQ(f->C_InitToken(FAKE_VENDOR_SLOT_ID, soPin, so.size(), label), CKR_SESSION_EXISTS);
    ASSERT_EQ(f->C_CloseAllSessions(FAKE_VENDOR_SLOT_ID), CKR_OK);
    EXPECT_EQ(f->C_InitToken(FAKE_VENDOR_SLOT_ID, soPin, 3, label), CKR_PIN_INCORRECT);
    ASSERT_EQ(f->C_InitToken(FAKE_VENDOR_SLOT_ID, soPin, so.size(), label), CKR_OK);
    CK_TOKEN_INFO token;
    ASSERT_EQ(f->C_GetTokenInfo(FAKE_VENDOR_SLOT_ID, &token), CKR_OK);
    EXPECT_EQ(std::memcmp(token.label, label, sizeof label), 0);
    EXPECT_FALSE(token.flags & CKF_USER_PIN_INITIALIZED);
    session = open(CKF_SERIAL_SESSION | CKF_RW_SESSION);
    CK_UTF8CHAR pin[] = FAKE_VENDOR_USER_PIN;
    EXPECT_EQ(f->C_Login(session, CKU_USER, pin, 4), CKR_USER_PIN_NOT_INITIALIZED);
    ASSERT_EQ(f->C_Login(session, CKU_SO, soPin, so.size()), CKR_OK);
    ASSERT_EQ(f->C_InitPIN(session, pin, 4), CKR_OK);
    ASSERT_EQ(f->C_Logout(session), CKR_OK);
    EXPECT_EQ(f->C_Login(session, CKU_USER, pin, 4), CKR_OK);
}

CK_STATE stateOf(CK_FUNCTION_LIST_PTR f, CK_SESSION_HANDLE h) {
    CK_SESSION_INFO info{};
    EXPECT_EQ(f->C_GetSessionInfo(h, &info), CKR_OK);
    return info.state;
}

TEST_F(FakeVendorTest, SessionStateFollowsLogin) {
    const CK_SESSION_HANDLE ro = open(CKF_SERIAL_SESSION);
    EXPECT_NE(ro, session);
    CK_UTF8CHAR pin[] = FAKE_VENDOR_USER_PIN, wrong[] = "9999", so[] = FAKE_VENDOR_SO_PIN;
    EXPECT_EQ(stateOf(f, ro), CKS_RO_PUBLIC_SESSION);
    EXPECT_EQ(stateOf(f, session), CKS_RW_PUBLIC_SESSION);
    EXPECT_EQ(f->C_Login(session, CKU_USER, wrong, 4), CKR_PIN_INCORRECT);
    EXPECT_EQ(f->C_Login(session, CKU_SO, so, 4), CKR_SESSION_READ_ONLY_EXISTS);
    ASSERT_EQ(f->C_Login(session, CKU_USER, pin, 4), CKR_OK);
    EXPECT_EQ(stateOf(f, ro), CKS_RO_USER_FUNCTIONS);
    EXPECT_EQ(stateOf(f, session), CKS_RW_USER_FUNCTIONS);
    EXPECT_EQ(f->C_Login(ro, CKU_USER, pin, 4), CKR_USER_ALREADY_LOGGED_IN);
    EXPECT_EQ(f->C_Login(ro, CKU_SO, so, 4), CKR_USER_ANOTHER_ALREADY_LOGGED_IN);
    EXPECT_EQ(f->C_Login(ro, 7, pin, 4), CKR_USER_TYPE_INVALID);
    ASSERT_EQ(f->C_Logout(ro), CKR_OK);
    EXPECT_EQ(stateOf(f, session), CKS_RW_PUBLIC_SESSION);
    EXPECT_EQ(f->C_Logout(ro), CKR_USER_NOT_LOGGED_IN);
    CK_SESSION_HANDLE h = 0;
    EXPECT_EQ(f->C_OpenSession(FAKE_VENDOR_SLOT_ID, CKF_RW_SESSION, nullptr, nullptr, &h),
              CKR_SESSION_PARALLEL_NOT_SUPPORTED);
    ASSERT_EQ(f->C_CloseSession(ro), CKR_OK);
    EXPECT_EQ(f->C_CloseSession(ro), CKR_SESSION_HANDLE_INVALID);
    ASSERT_EQ(f->C_Login(session, CKU_SO, so, 4), CKR_OK);
    EXPECT_EQ(stateOf(f, session), CKS_RW_SO_FUNCTIONS);
    EXPECT_EQ(f->C_OpenSession(FAKE_VENDOR_SLOT_ID, CKF_SERIAL_SESSION, nullptr, nullptr, &h),
              CKR_SESSION_READ_WRITE_SO_EXISTS);
}

TEST_F(FakeVendorTest, PrivateObjectsNeedTheUser) {
    Template t;
    t.ulong(CKA_CLASS, CKO_DATA).flag(CKA_PRIVATE, true);
    CK_OBJECT_HANDLE h = 0;
    EXPECT_EQ(f->C_CreateObject(session, t.data(), t.count(), &h), CKR_USER_NOT_LOGGED_IN);
    CK_UTF8CHAR pin[] = FAKE_VENDOR_USER_PIN;
    ASSERT_EQ(f->C_Login(session, CKU_USER, pin, 4), CKR_OK);
    ASSERT_EQ(f->C_CreateObject(session, t.data(), t.count(), &h), CKR_OK);
    ASSERT_EQ(f->C_Logout(session), CKR_OK);
    CK_ULONG size = 0;
    EXPECT_EQ(f->C_GetObjectSize(session, h, &size), CKR_OBJECT_HANDLE_INVALID);
}

TEST_F(FakeVendorTest, TemplatesAreChecked) {
    CK_ULONG shortClass = CKO_DATA;
    struct Case {
        std::vector<CK_ATTRIBUTE> attrs;
        CK_RV rv;
    } cases[] = {
        {{{CKA_LABEL, nullptr, 0}}, CKR_TEMPLATE_INCOMPLETE},
        {{{CKA_CLASS, &shortClass, 4}}, CKR_ATTRIBUTE_VALUE_INVALID},
        {{{CKA_CLASS, nullptr, 8}}, CKR_ATTRIBUTE_VALUE_INVALID},
        {{{CKA_CLASS, &shortClass, 8}, {CKA_CLASS, &shortClass, 8}}, CKR_TEMPLATE_INCONSISTENT},
    };
    for (Case& c : cases) {
        CK_OBJECT_HANDLE h = 0;
        EXPECT_EQ(f->C_CreateObject(session, c.attrs.data(), c.attrs.size(), &h), c.rv)
            << "case " << (&c - cases);
    }
    const CK_SESSION_HANDLE ro = open(CKF_SERIAL_SESSION);
    Template token;
    token.ulong(CKA_CLASS, CKO_DATA).flag(CKA_TOKEN, true);
    CK_OBJECT_HANDLE h = 0;
    EXPECT_EQ(f->C_CreateObject(ro, token.data(), token.count(), &h), CKR_SESSION_READ_ONLY);
}

TEST_F(FakeVendorTest, CopySetAndDestroy) {
    const CK_OBJECT_HANDLE key = aesKey();
    EXPECT_EQ(key, FAKE_VENDOR_FIRST_OBJECT_HANDLE);
    Template copyChanges;
    copyChanges.text(CKA_LABEL, "copy").flag(CKA_TOKEN, true).flag(CKA_MODIFIABLE, false);
    CK_OBJECT_HANDLE copy = 0;
    ASSERT_EQ(f->C_CopyObject(session, key, copyChanges.data(), copyChanges.count(), &copy),
              CKR_OK);
    EXPECT_EQ(attribute(copy, CKA_LABEL), bytes("copy"));
    EXPECT_EQ(attribute(copy, CKA_VALUE), aesValue);
    Template relabel;
    relabel.text(CKA_LABEL, "again");
    EXPECT_EQ(f->C_SetAttributeValue(session, copy, relabel.data(), 1), CKR_ACTION_PROHIBITED);
    ASSERT_EQ(f->C_SetAttributeValue(session, key, relabel.data(), 1), CKR_OK);
    EXPECT_EQ(attribute(key, CKA_LABEL), bytes("again"));
    Template toToken;
    toToken.flag(CKA_TOKEN, true);
    EXPECT_EQ(f->C_SetAttributeValue(session, key, toToken.data(), 1), CKR_ATTRIBUTE_READ_ONLY);
    ASSERT_EQ(f->C_DestroyObject(session, key), CKR_OK);
    EXPECT_EQ(f->C_DestroyObject(session, key), CKR_OBJECT_HANDLE_INVALID);
    // The copy is a token object; the session's own objects leave with it.
    const CK_OBJECT_HANDLE sessionObject = aesKey();
    ASSERT_EQ(f->C_CloseSession(session), CKR_OK);
    session = open(CKF_SERIAL_SESSION);
    CK_ULONG size = 0;
    EXPECT_EQ(f->C_GetObjectSize(session, copy, &size), CKR_OK);
    EXPECT_GT(size, aesValue.size());
    EXPECT_EQ(f->C_GetObjectSize(session, sessionObject, &size), CKR_OBJECT_HANDLE_INVALID);
}

TEST_F(FakeVendorTest, FindObjectsHonoursTheMaximumAndTheOperationRules) {
    Template data;
    data.ulong(CKA_CLASS, CKO_DATA).text(CKA_LABEL, "find me");
    const CK_OBJECT_HANDLE wanted[] = {create(data), create(data), create(data)};
    aesKey();
    CK_OBJECT_HANDLE found[4] = {};
    CK_ULONG count = 99;
    EXPECT_EQ(f->C_FindObjects(session, found, 4, &count), CKR_OPERATION_NOT_INITIALIZED);
    EXPECT_EQ(f->C_FindObjectsFinal(session), CKR_OPERATION_NOT_INITIALIZED);
    Template match;
    match.text(CKA_LABEL, "find me");
    ASSERT_EQ(f->C_FindObjectsInit(session, match.data(), match.count()), CKR_OK);
    EXPECT_EQ(f->C_FindObjectsInit(session, match.data(), match.count()), CKR_OPERATION_ACTIVE);
    ASSERT_EQ(f->C_FindObjects(session, found, 2, &count), CKR_OK);
    EXPECT_EQ(count, 2u);
    ASSERT_EQ(f->C_FindObjects(session, found + 2, 2, &count), CKR_OK);
    EXPECT_EQ(count, 1u);
    EXPECT_EQ(std::vector<CK_OBJECT_HANDLE>(found, found + 3),
              std::vector<CK_OBJECT_HANDLE>(wanted, wanted + 3));
    ASSERT_EQ(f->C_FindObjects(session, found, 4, &count), CKR_OK);
    EXPECT_EQ(count, 0u);
    EXPECT_EQ(f->C_FindObjectsFinal(session), CKR_OK);
    ASSERT_EQ(f->C_FindObjectsInit(session, nullptr, 0), CKR_OK);  // everything
    ASSERT_EQ(f->C_FindObjects(session, found, 4, &count), CKR_OK);
    EXPECT_EQ(count, 4u);
}

TEST_F(FakeVendorTest, WaitForSlotEvent) {
    CK_SLOT_ID slot = 0;
    EXPECT_EQ(f->C_WaitForSlotEvent(CKF_DONT_BLOCK, &slot, nullptr), CKR_NO_EVENT);
    int reserved = 0;
    EXPECT_EQ(f->C_WaitForSlotEvent(0, &slot, &reserved), CKR_ARGUMENTS_BAD);
    fake_vendor_set_slot_event(CKR_OK, 2);
    EXPECT_EQ(f->C_WaitForSlotEvent(0, &slot, nullptr), CKR_OK);
    EXPECT_EQ(slot, 2u);

    fake_vendor_set_blocking_wait(CK_TRUE);
    CK_RV waited = CKR_GENERAL_ERROR;
    std::thread waiter([&] { waited = f->C_WaitForSlotEvent(0, &slot, nullptr); });
    while (fake_vendor_waiting_count() == 0) std::this_thread::yield();
    CK_INFO info;
    EXPECT_EQ(f->C_GetInfo(&info), CKR_OK) << "the waiter holds the module";
    fake_vendor_set_slot_event(CKR_OK, 1);
    fake_vendor_signal_slot_event();
    waiter.join();
    EXPECT_EQ(waited, CKR_OK);
    EXPECT_EQ(slot, 1u);

    std::thread finalized([&] { waited = f->C_WaitForSlotEvent(0, &slot, nullptr); });
    while (fake_vendor_waiting_count() == 0) std::this_thread::yield();
    ASSERT_EQ(f->C_Finalize(nullptr), CKR_OK);
    finalized.join();
    EXPECT_EQ(waited, CKR_CRYPTOKI_NOT_INITIALIZED);
}

}  // namespace
}  // namespace fakevendor
