// The call record and programmed results.

#include "fake_vendor_fixture.h"

namespace fakevendor {
namespace {

template <class... Args>
CK_RV callWithZeros(CK_RV (*function)(Args...)) {
    return function(Args{}...);
}

// Server tests read what arrived by function name: every entry must record
// under its own.
TEST_F(FakeVendorTest, EveryEntryRecordsUnderItsOwnName) {
#define FAKE_RECORDS_ITS_NAME(name, params)                            \
    if (std::string(#name) != "C_GetFunctionList") {                   \
        callWithZeros(f->name);                                        \
        EXPECT_EQ(#name, call(fake_vendor_call_count() - 1).function); \
    }
    VOK_CK_FUNCTIONS(FAKE_RECORDS_ITS_NAME)
#undef FAKE_RECORDS_ITS_NAME
}

TEST_F(FakeVendorTest, RecordsScalarsNullnessCapacitiesAndContents) {
    const CK_OBJECT_HANDLE key = aesKey();
    CK_MECHANISM m = mechanism(CKM_AES_ECB);
    ASSERT_EQ(f->C_EncryptInit(session, &m, key), CKR_OK);
    CK_BYTE data[] = {0x01, 0x02, 0xfe, 0xff, 0x00};
    CK_ULONG len = 7;
    ASSERT_EQ(f->C_Encrypt(session, data, sizeof data, nullptr, &len), CKR_OK);
    CK_BYTE out[3] = {0xab, 0xcd, 0xef};
    len = sizeof out;
    ASSERT_EQ(f->C_Encrypt(session, data, sizeof data, out, &len), CKR_BUFFER_TOO_SMALL);

    const std::vector<Call> encrypts = callsOf("C_Encrypt");
    ASSERT_EQ(encrypts.size(), 2u);
    const Call& query = encrypts[0];
    EXPECT_EQ(query.rv, CKR_OK);
    EXPECT_EQ(query.arg("hSession").number, session);
    EXPECT_EQ(query.arg("pData").hex, "0102feff00");
    EXPECT_EQ(query.arg("ulDataLen").number, 5u);
    EXPECT_TRUE(query.arg("pEncryptedData").null);
    EXPECT_FALSE(query.arg("pulEncryptedDataLen").null);
    EXPECT_EQ(query.arg("pulEncryptedDataLen").number, 7u)
        << "the capacity as received, not the length returned";
    const Call& shortCall = encrypts[1];
    EXPECT_EQ(shortCall.rv, CKR_BUFFER_TOO_SMALL);
    EXPECT_FALSE(shortCall.arg("pEncryptedData").null);
    EXPECT_EQ(shortCall.arg("pEncryptedData").hex, "abcdef") << "the output buffer as received";
    std::vector<std::string> order;
    for (const Arg& a : shortCall.args) order.push_back(a.name);
    EXPECT_EQ(order, (std::vector<std::string>{"hSession", "pData", "ulDataLen", "pEncryptedData",
                                               "pulEncryptedDataLen"}));
}

TEST_F(FakeVendorTest, RecordsTemplatesAndMechanisms) {
    Template t;
    t.ulong(CKA_CLASS, CKO_DATA).text(CKA_LABEL, "abc").add(CKA_ID, nullptr, 0);
    const CK_OBJECT_HANDLE h = create(t);
    const Call created = lastCall("C_CreateObject");
    EXPECT_EQ(created.arg("ulCount").number, 3u);
    EXPECT_EQ(created.arg("phObject").number, 0u) << "the handle as it was on entry";
    const std::vector<Item>& items = created.arg("pTemplate").items;
    ASSERT_EQ(items.size(), 3u);
    EXPECT_EQ(items[0].type, CKA_CLASS);
    EXPECT_EQ(items[0].len, sizeof(CK_ULONG));
    EXPECT_EQ(items[0].hex, "0000000000000000");
    EXPECT_EQ(items[1].type, CKA_LABEL);
    EXPECT_EQ(items[1].hex, hex(std::string("abc")));
    EXPECT_FALSE(items[1].null);
    EXPECT_TRUE(items[2].null);
    EXPECT_EQ(items[2].len, 0u);

    // A stale CK_UNAVAILABLE_INFORMATION in a reused template is recorded
    // without its contents.
    CK_BYTE value[64];
    CK_ATTRIBUTE get{CKA_LABEL, value, CK_UNAVAILABLE_INFORMATION};
    EXPECT_EQ(f->C_GetAttributeValue(session, h, &get, 1), CKR_OK);
    EXPECT_EQ(lastCall("C_GetAttributeValue").arg("pTemplate").items.at(0).len,
              CK_UNAVAILABLE_INFORMATION);

    const CK_OBJECT_HANDLE key = aesKey();
    CK_BYTE iv[] = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16};
    CK_MECHANISM cbc{CKM_AES_CBC, iv, sizeof iv};
    ASSERT_EQ(f->C_EncryptInit(session, &cbc, key), CKR_OK);
    const Item m = lastCall("C_EncryptInit").arg("pMechanism").items.at(0);
    EXPECT_EQ(m.type, CKM_AES_CBC);
    EXPECT_FALSE(m.null);
    EXPECT_EQ(m.len, sizeof iv);
    EXPECT_EQ(m.hex, "0102030405060708090a0b0c0d0e0f10");
    // A non-NULL parameter of length 0 stays distinguishable from NULL.
    CK_MECHANISM empty{CKM_AES_ECB, iv, 0};
    ASSERT_EQ(f->C_DecryptInit(session, &empty, key), CKR_OK);
    const Item e = lastCall("C_DecryptInit").arg("pMechanism").items.at(0);
    EXPECT_FALSE(e.null);
    EXPECT_EQ(e.len, 0u);
}

TEST_F(FakeVendorTest, RecordsWhichPointersWereNull) {
    CK_SESSION_HANDLE h = 0;
    int app = 0;
    CK_NOTIFY notify = [](CK_SESSION_HANDLE, CK_NOTIFICATION, CK_VOID_PTR) -> CK_RV {
        return CKR_OK;
    };
    ASSERT_EQ(f->C_OpenSession(FAKE_VENDOR_SLOT_ID, CKF_SERIAL_SESSION, &app, notify, &h), CKR_OK);
    const Call withCallback = lastCall("C_OpenSession");
    EXPECT_FALSE(withCallback.arg("pApplication").null);
    EXPECT_FALSE(withCallback.arg("Notify").null);
    EXPECT_EQ(withCallback.arg("flags").number, CKF_SERIAL_SESSION);
    const Call plain = callsOf("C_OpenSession").at(0);  // the fixture's
    EXPECT_TRUE(plain.arg("pApplication").null);
    EXPECT_TRUE(plain.arg("Notify").null);
    EXPECT_TRUE(call(0).arg("pInitArgs").null);
    EXPECT_EQ(call(0).function, "C_Initialize");
}

TEST_F(FakeVendorTest, NextRvReplacesTheCallAndIsRecorded) {
    ASSERT_EQ(fake_vendor_set_next_rv("C_OpenSession", CKR_SESSION_COUNT), CKR_OK);
    ASSERT_EQ(fake_vendor_set_next_rv("C_OpenSession", CKR_DEVICE_ERROR), CKR_OK);
    CK_SESSION_HANDLE h = 0x5555;
    EXPECT_EQ(f->C_OpenSession(FAKE_VENDOR_SLOT_ID, CKF_SERIAL_SESSION, nullptr, nullptr, &h),
              CKR_SESSION_COUNT);
    EXPECT_EQ(f->C_OpenSession(FAKE_VENDOR_SLOT_ID, CKF_SERIAL_SESSION, nullptr, nullptr, &h),
              CKR_DEVICE_ERROR);
    EXPECT_EQ(h, 0x5555u) << "a programmed result touches no output";
    EXPECT_EQ(lastCall("C_OpenSession").rv, CKR_DEVICE_ERROR);
    CK_TOKEN_INFO token;
    ASSERT_EQ(f->C_GetTokenInfo(FAKE_VENDOR_SLOT_ID, &token), CKR_OK);
    EXPECT_EQ(CK_ULONG(token.ulSessionCount), 1u) << "no session was opened";
    EXPECT_EQ(f->C_OpenSession(FAKE_VENDOR_SLOT_ID, CKF_SERIAL_SESSION, nullptr, nullptr, &h),
              CKR_OK);
    EXPECT_NE(h, 0x5555u);

    EXPECT_EQ(fake_vendor_set_next_rv("C_NoSuchFunction", CKR_OK), CKR_ARGUMENTS_BAD);
    EXPECT_EQ(fake_vendor_set_next_rv(nullptr, CKR_OK), CKR_ARGUMENTS_BAD);

    // Even C_Initialize does nothing else: the module stays uninitialised.
    fake_vendor_reset();
    ASSERT_EQ(fake_vendor_set_next_rv("C_Initialize", CKR_OK), CKR_OK);
    EXPECT_EQ(f->C_Initialize(nullptr), CKR_OK);
    CK_INFO info;
    EXPECT_EQ(f->C_GetInfo(&info), CKR_CRYPTOKI_NOT_INITIALIZED);
}

TEST_F(FakeVendorTest, CallTextFollowsTheLengthConventionAndClears) {
    const CK_ULONG n = fake_vendor_call_count();
    ASSERT_EQ(n, 2u);  // C_Initialize, C_OpenSession
    CK_ULONG len = 0;
    ASSERT_EQ(fake_vendor_call_text(1, nullptr, &len), CKR_OK);
    std::string text(len, '\0');
    CK_ULONG shortLen = len - 1;
    EXPECT_EQ(fake_vendor_call_text(1, &text[0], &shortLen), CKR_BUFFER_TOO_SMALL);
    EXPECT_EQ(shortLen, len);
    ASSERT_EQ(fake_vendor_call_text(1, &text[0], &len), CKR_OK);
    EXPECT_EQ(text.substr(0, text.find('\n')), "C_OpenSession 0");
    EXPECT_EQ(fake_vendor_call_text(n, nullptr, &len), CKR_ARGUMENTS_BAD);
    fake_vendor_clear_calls();
    EXPECT_EQ(fake_vendor_call_count(), 0u);
    EXPECT_THROW(lastCall("C_OpenSession"), std::out_of_range);
}

}  // namespace
}  // namespace fakevendor
