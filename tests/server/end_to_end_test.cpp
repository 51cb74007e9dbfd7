// The exported C_ proxies through the real socket to this server, which calls
// the fake module registered under its server id, all in one process.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstring>
#include <string>

#include "jvm_fixture.h"
#include "server_test_support.h"
#include "vok_client.h"

namespace {

using ::testing::ElementsAre;

constexpr CK_RV kNoAnswer = ~CK_RV{0};

CK_RV notify(CK_SESSION_HANDLE, CK_NOTIFICATION, CK_VOID_PTR) { return CKR_OK; }

class EndToEnd : public voktest::JvmTest {
protected:
    void SetUp() override {
        JvmTest::SetUp();
        fake_vendor_reset();
        fake_vendor_set_slot_count(2);
        const std::string id = "vok-server-e2e-" + std::to_string(getpid());
        voktest::registerModule(id.c_str(), fake_vendor_function_list());
        ASSERT_EQ(0, vokpkcs11_init_server(id.c_str()));
        // The server thread binds asynchronously.
        int32_t status = -1;
        for (int i = 0; i < 200 && status != 0; ++i)
            if ((status = vokpkcs11_client_init(id.c_str())) != 0) usleep(5000);
        ASSERT_EQ(0, status);
    }
};

TEST_F(EndToEnd, EveryGeneralSlotSessionAndObjectFunction) {
    CK_C_INITIALIZE_ARGS args{};
    args.flags = CKF_OS_LOCKING_OK;
    ASSERT_EQ(CKR_OK, C_Initialize(&args));
    EXPECT_TRUE(fakevendor::lastCall("C_Initialize").arg("pInitArgs").null);

    CK_INFO info{};
    ASSERT_EQ(CKR_OK, C_GetInfo(&info));
    EXPECT_EQ(2, info.cryptokiVersion.major);
    EXPECT_EQ(0, memcmp("Vok test vendor    ", info.manufacturerID, 19));

    CK_ULONG count = 0;
    ASSERT_EQ(CKR_OK, C_GetSlotList(CK_TRUE, nullptr, &count));
    EXPECT_EQ(2u, count);
    CK_SLOT_ID slots[4] = {};
    count = 4;
    ASSERT_EQ(CKR_OK, C_GetSlotList(CK_TRUE, slots, &count));
    EXPECT_THAT(slots, ElementsAre(1, 2, 0, 0));

    CK_SLOT_INFO slotInfo{};
    ASSERT_EQ(CKR_OK, C_GetSlotInfo(1, &slotInfo));
    EXPECT_EQ(CKF_TOKEN_PRESENT | CKF_HW_SLOT, slotInfo.flags);
    CK_TOKEN_INFO tokenInfo{};
    ASSERT_EQ(CKR_OK, C_GetTokenInfo(1, &tokenInfo));
    EXPECT_EQ(0, memcmp("FAKE-1          ", tokenInfo.serialNumber, 16));
    EXPECT_EQ(4u, tokenInfo.ulMinPinLen);

    CK_MECHANISM_TYPE mechanisms[16] = {};
    count = 16;
    ASSERT_EQ(CKR_OK, C_GetMechanismList(1, mechanisms, &count));
    EXPECT_THAT(std::vector<CK_MECHANISM_TYPE>(mechanisms, mechanisms + count),
                ::testing::Contains(CKM_AES_ECB));
    CK_MECHANISM_INFO mechanismInfo{};
    ASSERT_EQ(CKR_OK, C_GetMechanismInfo(1, CKM_AES_ECB, &mechanismInfo));
    EXPECT_EQ(32u, mechanismInfo.ulMaxKeySize);

    CK_UTF8CHAR soPin[] = FAKE_VENDOR_SO_PIN, userPin[] = FAKE_VENDOR_USER_PIN;
    CK_UTF8CHAR label[32];
    memset(label, ' ', sizeof label);
    ASSERT_EQ(CKR_OK, C_InitToken(2, soPin, 4, label));

    CK_SESSION_HANDLE session = 0;
    int application = 0;
    ASSERT_EQ(CKR_OK, C_OpenSession(1, CKF_SERIAL_SESSION | CKF_RW_SESSION, &application, notify,
                                    &session));
    EXPECT_EQ(1u, session);
    EXPECT_TRUE(fakevendor::lastCall("C_OpenSession").arg("Notify").null);

    // Sent as "C_InitPIN" and "C_SetPIN", which the service does not know.
    EXPECT_EQ(kNoAnswer, C_InitPIN(session, userPin, 4));
    EXPECT_EQ(kNoAnswer, C_SetPIN(session, userPin, 4, userPin, 4));
    EXPECT_TRUE(fakevendor::callsOf("C_InitPIN").empty() &&
                fakevendor::callsOf("C_SetPIN").empty());

    ASSERT_EQ(CKR_OK, C_Login(session, CKU_USER, userPin, 4));
    CK_SESSION_INFO sessionInfo{};
    ASSERT_EQ(CKR_OK, C_GetSessionInfo(session, &sessionInfo));
    EXPECT_EQ(CKS_RW_USER_FUNCTIONS, sessionInfo.state);

    CK_OBJECT_CLASS dataClass = CKO_DATA;
    char first[] = "e2e", second[] = "copy";
    CK_ATTRIBUTE data[] = {{CKA_CLASS, &dataClass, sizeof dataClass}, {CKA_LABEL, first, 3}};
    CK_OBJECT_HANDLE object = 0, copy = 0;
    ASSERT_EQ(CKR_OK, C_CreateObject(session, data, 2, &object));
    EXPECT_EQ(FAKE_VENDOR_FIRST_OBJECT_HANDLE, object);
    CK_ATTRIBUTE relabel[] = {{CKA_LABEL, second, 4}};
    ASSERT_EQ(CKR_OK, C_CopyObject(session, object, relabel, 1, &copy));
    EXPECT_EQ(object + 1, copy);
    CK_ULONG size = 0;
    EXPECT_EQ(CKR_OK, C_GetObjectSize(session, copy, &size));

    CK_ATTRIBUTE query[] = {{CKA_LABEL, nullptr, 0}};
    ASSERT_EQ(CKR_OK, C_GetAttributeValue(session, object, query, 1));
    EXPECT_EQ(3u, query[0].ulValueLen);
    char read[8] = {};
    query[0] = {CKA_LABEL, read, sizeof read};
    ASSERT_EQ(CKR_OK, C_GetAttributeValue(session, copy, query, 1));
    EXPECT_EQ("copy", std::string(read, query[0].ulValueLen));
    char renamed[] = "new";
    CK_ATTRIBUTE rename[] = {{CKA_LABEL, renamed, 3}};
    ASSERT_EQ(CKR_OK, C_SetAttributeValue(session, object, rename, 1));

    CK_ATTRIBUTE search[] = {{CKA_LABEL, renamed, 3}};
    ASSERT_EQ(CKR_OK, C_FindObjectsInit(session, search, 1));
    CK_OBJECT_HANDLE found[4] = {};
    ASSERT_EQ(CKR_OK, C_FindObjects(session, found, 4, &count));
    EXPECT_EQ(1u, count);
    EXPECT_EQ(object, found[0]);
    ASSERT_EQ(CKR_OK, C_FindObjectsFinal(session));

    // No operation is active, so there is no state to save or restore.
    CK_BYTE state[64] = {1};
    CK_ULONG stateLength = sizeof state;
    EXPECT_EQ(CKR_OPERATION_NOT_INITIALIZED, C_GetOperationState(session, state, &stateLength));
    EXPECT_EQ(CKR_SAVED_STATE_INVALID, C_SetOperationState(session, state, sizeof state, 0, 0));

    EXPECT_EQ(CKR_OK, C_DestroyObject(session, copy));
    EXPECT_EQ(CKR_OBJECT_HANDLE_INVALID, C_GetObjectSize(session, copy, &size));
    EXPECT_EQ(CKR_OK, C_Logout(session));
    EXPECT_EQ(CKR_OK, C_CloseSession(session));
    EXPECT_EQ(CKR_OK, C_CloseAllSessions(1));
    EXPECT_EQ(CKR_OK, C_Finalize(nullptr));
}

}  // namespace
