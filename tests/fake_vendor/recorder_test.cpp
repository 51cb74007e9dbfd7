// The call record and programmed results: every server-side test reads what
// arrived from this record, so it must tell the truth. (That each entry
// records under its own name the handlers' Frame table shows, through the
// module function of every handler.)
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "fake_vendor.h"

namespace fakevendor {
namespace {

// A fresh, initialised token with one read-write session open.
class FakeVendorTest : public ::testing::Test {
protected:
    void SetUp() override {
        fake_vendor_reset();
        ASSERT_EQ(f->C_Initialize(nullptr), CKR_OK);
        ASSERT_EQ(f->C_OpenSession(FAKE_VENDOR_SLOT_ID, CKF_SERIAL_SESSION | CKF_RW_SESSION,
                                   nullptr, nullptr, &session),
                  CKR_OK);
    }
    CK_FUNCTION_LIST_PTR f = fake_vendor_function_list();
    CK_SESSION_HANDLE session = CK_INVALID_HANDLE;
};

// Scalars, NULL-ness, an output's capacity and bytes as received (not what
// was returned), templates and mechanisms item by item, in parameter order.
TEST_F(FakeVendorTest, RecordsWhatArrivedAsItArrived) {
    CK_OBJECT_CLASS cls = CKO_SECRET_KEY;
    CK_KEY_TYPE type = CKK_AES;
    CK_BYTE value[] = "0123456789abcdef", label[64];
    CK_ATTRIBUTE tmpl[] = {{CKA_CLASS, &cls, sizeof cls}, {CKA_KEY_TYPE, &type, sizeof type},
                           {CKA_VALUE, value, 16}, {CKA_ID, nullptr, 0}};
    CK_OBJECT_HANDLE key = 0;
    ASSERT_EQ(f->C_CreateObject(session, tmpl, 4, &key), CKR_OK);
    const Call created = lastCall("C_CreateObject");
    EXPECT_EQ(created.arg("phObject").number, 0u) << "the handle as it was on entry";
    const std::vector<Item>& items = created.arg("pTemplate").items;
    ASSERT_EQ(items.size(), 4u);
    EXPECT_TRUE(items[0].type == CKA_CLASS && items[0].len == 8 && !items[0].null);
    EXPECT_EQ(items[0].hex, "0400000000000000");
    EXPECT_EQ(items[2].hex, hex(value, 16));
    EXPECT_TRUE(items[3].type == CKA_ID && items[3].null && items[3].len == 0);
    // A stale CK_UNAVAILABLE_INFORMATION in a reused template: no contents.
    CK_ATTRIBUTE get{CKA_LABEL, label, CK_UNAVAILABLE_INFORMATION};
    EXPECT_EQ(f->C_GetAttributeValue(session, key, &get, 1), CKR_OK);
    EXPECT_EQ(lastCall("C_GetAttributeValue").arg("pTemplate").items.at(0).len,
              CK_UNAVAILABLE_INFORMATION);

    CK_BYTE iv[] = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16};
    CK_MECHANISM cbc{CKM_AES_CBC, iv, sizeof iv}, empty{CKM_AES_ECB, iv, 0};
    ASSERT_EQ(f->C_DecryptInit(session, &cbc, key), CKR_OK);
    const Item m = lastCall("C_DecryptInit").arg("pMechanism").items.at(0);
    EXPECT_TRUE(m.type == CKM_AES_CBC && !m.null && m.len == 16);
    EXPECT_EQ(m.hex, "0102030405060708090a0b0c0d0e0f10");
    ASSERT_EQ(f->C_EncryptInit(session, &empty, key), CKR_OK);
    const Item e = lastCall("C_EncryptInit").arg("pMechanism").items.at(0);
    EXPECT_TRUE(!e.null && e.len == 0) << "a non-NULL parameter of length 0 is not NULL";

    CK_BYTE data[] = {0x01, 0x02, 0xfe, 0xff, 0x00}, out[3] = {0xab, 0xcd, 0xef};
    CK_ULONG len = 7;
    ASSERT_EQ(f->C_Encrypt(session, data, sizeof data, nullptr, &len), CKR_OK);
    len = sizeof out;
    ASSERT_EQ(f->C_Encrypt(session, data, sizeof data, out, &len), CKR_BUFFER_TOO_SMALL);
    const std::vector<Call> encrypts = callsOf("C_Encrypt");
    ASSERT_EQ(encrypts.size(), 2u);
    EXPECT_EQ(encrypts[0].rv, CKR_OK);
    EXPECT_EQ(encrypts[0].arg("hSession").number, session);
    EXPECT_EQ(encrypts[0].arg("pData").hex, "0102feff00");
    EXPECT_EQ(encrypts[0].arg("ulDataLen").number, 5u);
    EXPECT_TRUE(encrypts[0].arg("pEncryptedData").null);
    EXPECT_FALSE(encrypts[0].arg("pulEncryptedDataLen").null);
    EXPECT_EQ(encrypts[0].arg("pulEncryptedDataLen").number, 7u);
    EXPECT_EQ(encrypts[1].rv, CKR_BUFFER_TOO_SMALL);
    EXPECT_FALSE(encrypts[1].arg("pEncryptedData").null);
    EXPECT_EQ(encrypts[1].arg("pEncryptedData").hex, "abcdef");
    std::vector<std::string> order;
    for (const Arg& a : encrypts[1].args) order.push_back(a.name);
    EXPECT_EQ(order, (std::vector<std::string>{"hSession", "pData", "ulDataLen", "pEncryptedData",
                                               "pulEncryptedDataLen"}));

    int app = 0;
    CK_NOTIFY notify = [](CK_SESSION_HANDLE, CK_NOTIFICATION, CK_VOID_PTR) -> CK_RV {
        return CKR_OK;
    };
    CK_SESSION_HANDLE h = 0;
    ASSERT_EQ(f->C_OpenSession(FAKE_VENDOR_SLOT_ID, CKF_SERIAL_SESSION, &app, notify, &h), CKR_OK);
    const Call plain = callsOf("C_OpenSession").at(0), withCallback = lastCall("C_OpenSession");
    EXPECT_TRUE(plain.arg("pApplication").null && plain.arg("Notify").null);
    EXPECT_FALSE(withCallback.arg("pApplication").null || withCallback.arg("Notify").null);
    EXPECT_EQ(withCallback.arg("flags").number, CKF_SERIAL_SESSION);
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
