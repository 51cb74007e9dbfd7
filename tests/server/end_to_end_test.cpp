// The exported C_ proxies through the real socket to this server, which calls
// the fake module registered under its server id, all in one process.
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <functional>
#include <sstream>
#include <string>
#include <vector>

#include "jvm_fixture.h"
#include "raw_peer.h"
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

// Through the function list, so C_GetFunctionList is on the road too. Results
// are compared with the module's own where it matters.
TEST_F(EndToEnd, EveryCryptographicKeyAndRandomFunction) {
    CK_FUNCTION_LIST_PTR f = nullptr, module = fake_vendor_function_list();
    ASSERT_EQ(CKR_OK, C_GetFunctionList(&f));
    ASSERT_EQ(CKR_OK, f->C_Initialize(nullptr));
    CK_SESSION_HANDLE s = 0;
    ASSERT_EQ(CKR_OK,
              f->C_OpenSession(1, CKF_SERIAL_SESSION | CKF_RW_SESSION, nullptr, nullptr, &s));
    CK_UTF8CHAR pin[] = FAKE_VENDOR_USER_PIN;
    ASSERT_EQ(CKR_OK, f->C_Login(s, CKU_USER, pin, 4));

    // AES for ciphers and wrapping, a generic secret for HMAC, digest-key and
    // derivation, an RSA pair for recovery.
    CK_ULONG sixteen = 16, bits = 512;
    CK_ATTRIBUTE valueLen[] = {{CKA_VALUE_LEN, &sixteen, sizeof sixteen}};
    CK_ATTRIBUTE modulusBits[] = {{CKA_MODULUS_BITS, &bits, sizeof bits}};
    CK_MECHANISM aesGen{CKM_AES_KEY_GEN, nullptr, 0},
        secretGen{CKM_GENERIC_SECRET_KEY_GEN, nullptr, 0},
        rsaGen{CKM_RSA_PKCS_KEY_PAIR_GEN, nullptr, 0};
    CK_OBJECT_HANDLE aes = 0, secret = 0, pub = 0, priv = 0;
    ASSERT_EQ(CKR_OK, f->C_GenerateKey(s, &aesGen, valueLen, 1, &aes));
    ASSERT_EQ(CKR_OK, f->C_GenerateKey(s, &secretGen, valueLen, 1, &secret));
    ASSERT_EQ(CKR_OK, f->C_GenerateKeyPair(s, &rsaGen, modulusBits, 1, nullptr, 0, &pub, &priv));
    EXPECT_TRUE(aes > 0xFFFFFFFFUL && secret > aes && priv > pub);

    // Round trip, the parameter passed through as bytes, and the two-call
    // length query.
    CK_BYTE iv[16] = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16};
    CK_MECHANISM cbc{CKM_AES_CBC, iv, sizeof iv};
    const std::string plain = "sixteen byte msg";
    CK_BYTE data[16], cipher[32] = {}, part[32] = {};
    memcpy(data, plain.data(), sizeof data);
    CK_ULONG length = sizeof cipher;
    ASSERT_EQ(CKR_OK, f->C_EncryptInit(s, &cbc, aes));
    EXPECT_EQ(fakevendor::hex(iv, 16),
              fakevendor::lastCall("C_EncryptInit").arg("pMechanism").items.at(0).hex);
    ASSERT_EQ(CKR_OK, f->C_Encrypt(s, data, 16, cipher, &length));
    ASSERT_EQ(16u, length);
    EXPECT_NE(0, memcmp(cipher, data, 16));
    ASSERT_EQ(CKR_OK, f->C_DecryptInit(s, &cbc, aes));
    length = 0;
    ASSERT_EQ(CKR_OK, f->C_Decrypt(s, cipher, 16, nullptr, &length));
    ASSERT_EQ(16u, length);
    std::vector<CK_BYTE> back(length);
    ASSERT_EQ(CKR_OK, f->C_Decrypt(s, cipher, 16, back.data(), &length));
    EXPECT_EQ(plain, std::string(back.begin(), back.end()));

    // Multi-part; a query on an update sends capacity 0 and still the whole input.
    // A length query with nothing left to give must leave the operation active.
    auto finish = [&](CK_C_EncryptFinal fn) {
        CK_BYTE last[32] = {};
        CK_ULONG lastLength = 99;
        EXPECT_EQ(CKR_OK, fn(s, nullptr, &lastLength));
        EXPECT_EQ(0u, lastLength);
        lastLength = sizeof last;
        EXPECT_EQ(CKR_OK, fn(s, last, &lastLength));
        EXPECT_EQ(0u, lastLength);
    };
    ASSERT_EQ(CKR_OK, f->C_EncryptInit(s, &cbc, aes));
    length = 0;
    ASSERT_EQ(CKR_OK, f->C_EncryptUpdate(s, data, 16, nullptr, &length));
    ASSERT_EQ(16u, length);
    ASSERT_EQ(CKR_OK, f->C_EncryptUpdate(s, data, 16, part, &length));
    EXPECT_EQ(0, memcmp(cipher, part, 16));
    finish(f->C_EncryptFinal);
    ASSERT_EQ(CKR_OK, f->C_DecryptInit(s, &cbc, aes));
    length = sizeof part;
    ASSERT_EQ(CKR_OK, f->C_DecryptUpdate(s, cipher, 16, part, &length));
    EXPECT_EQ(plain, std::string(reinterpret_cast<char*>(part), length));
    finish(f->C_DecryptFinal);

    CK_MECHANISM sha{CKM_SHA256, nullptr, 0};
    CK_BYTE digest[32] = {}, direct[32] = {}, keyed[32] = {};
    length = sizeof digest;
    ASSERT_EQ(CKR_OK, f->C_DigestInit(s, &sha));
    ASSERT_EQ(CKR_OK, f->C_Digest(s, data, 16, digest, &length));
    ASSERT_EQ(CKR_OK, module->C_DigestInit(s, &sha));
    ASSERT_EQ(CKR_OK, module->C_Digest(s, data, 16, direct, &length));
    EXPECT_EQ(0, memcmp(digest, direct, 32));
    ASSERT_EQ(CKR_OK, f->C_DigestInit(s, &sha));
    ASSERT_EQ(CKR_OK, f->C_DigestUpdate(s, data, 16));
    ASSERT_EQ(CKR_OK, f->C_DigestKey(s, secret));
    ASSERT_EQ(CKR_OK, f->C_DigestFinal(s, keyed, &length));
    EXPECT_EQ(32u, length);
    EXPECT_NE(0, memcmp(digest, keyed, 32));

    CK_MECHANISM hmac{CKM_MD5_HMAC, nullptr, 0};
    CK_BYTE signature[16] = {}, again[16] = {};
    length = sizeof signature;
    ASSERT_EQ(CKR_OK, f->C_SignInit(s, &hmac, secret));
    ASSERT_EQ(CKR_OK, f->C_Sign(s, data, 16, signature, &length));
    ASSERT_EQ(CKR_OK, f->C_SignInit(s, &hmac, secret));
    ASSERT_EQ(CKR_OK, f->C_SignUpdate(s, data, 16));
    ASSERT_EQ(CKR_OK, f->C_SignFinal(s, again, &length));
    EXPECT_EQ(0, memcmp(signature, again, 16));
    ASSERT_EQ(CKR_OK, f->C_VerifyInit(s, &hmac, secret));
    ASSERT_EQ(CKR_OK, f->C_VerifyUpdate(s, data, 16));
    EXPECT_EQ(CKR_OK, f->C_VerifyFinal(s, signature, 16));
    // Deliberately different: C_Verify's signature never reaches the module,
    // and the zero-filled one it checked comes back.
    ASSERT_EQ(CKR_OK, f->C_VerifyInit(s, &hmac, secret));
    EXPECT_EQ(CKR_SIGNATURE_INVALID, f->C_Verify(s, data, 16, again, 16));
    EXPECT_EQ(std::string(16, '\0'), std::string(reinterpret_cast<char*>(again), 16));

    CK_MECHANISM x509{CKM_RSA_X_509, nullptr, 0};
    CK_BYTE recoverable[64] = {}, recovered[64] = {};
    CK_ULONG recoverableLength = sizeof recoverable;
    length = sizeof recovered;
    ASSERT_EQ(CKR_OK, f->C_SignRecoverInit(s, &x509, priv));
    ASSERT_EQ(CKR_OK, f->C_SignRecover(s, data, 16, recoverable, &recoverableLength));
    EXPECT_EQ(17u, recoverableLength);
    ASSERT_EQ(CKR_OK, f->C_VerifyRecoverInit(s, &x509, pub));
    ASSERT_EQ(CKR_OK, f->C_VerifyRecover(s, recoverable, recoverableLength, recovered, &length));
    EXPECT_EQ(plain, std::string(reinterpret_cast<char*>(recovered), length));

    // Each dual function advances a cipher and a second operation together.
    ASSERT_EQ(CKR_OK, f->C_DigestInit(s, &sha));
    ASSERT_EQ(CKR_OK, f->C_EncryptInit(s, &cbc, aes));
    length = sizeof part;
    ASSERT_EQ(CKR_OK, f->C_DigestEncryptUpdate(s, data, 16, part, &length));
    EXPECT_EQ(0, memcmp(cipher, part, 16));
    finish(f->C_EncryptFinal);
    length = sizeof keyed;
    ASSERT_EQ(CKR_OK, f->C_DigestFinal(s, keyed, &length));
    EXPECT_EQ(0, memcmp(digest, keyed, 32));
    ASSERT_EQ(CKR_OK, f->C_DecryptInit(s, &cbc, aes));
    ASSERT_EQ(CKR_OK, f->C_DigestInit(s, &sha));
    length = sizeof part;
    ASSERT_EQ(CKR_OK, f->C_DecryptDigestUpdate(s, cipher, 16, part, &length));
    EXPECT_EQ(plain, std::string(reinterpret_cast<char*>(part), length));
    finish(f->C_DecryptFinal);
    length = sizeof keyed;
    ASSERT_EQ(CKR_OK, f->C_DigestFinal(s, keyed, &length));
    EXPECT_EQ(0, memcmp(digest, keyed, 32));
    ASSERT_EQ(CKR_OK, f->C_SignInit(s, &hmac, secret));
    ASSERT_EQ(CKR_OK, f->C_EncryptInit(s, &cbc, aes));
    length = sizeof part;
    ASSERT_EQ(CKR_OK, f->C_SignEncryptUpdate(s, data, 16, part, &length));
    EXPECT_EQ(0, memcmp(cipher, part, 16));
    finish(f->C_EncryptFinal);
    length = sizeof again;
    ASSERT_EQ(CKR_OK, f->C_SignFinal(s, again, &length));
    EXPECT_EQ(0, memcmp(signature, again, 16));
    ASSERT_EQ(CKR_OK, f->C_DecryptInit(s, &cbc, aes));
    ASSERT_EQ(CKR_OK, f->C_VerifyInit(s, &hmac, secret));
    length = sizeof part;
    ASSERT_EQ(CKR_OK, f->C_DecryptVerifyUpdate(s, cipher, 16, part, &length));
    EXPECT_EQ(plain, std::string(reinterpret_cast<char*>(part), length));
    finish(f->C_DecryptFinal);
    EXPECT_EQ(CKR_OK, f->C_VerifyFinal(s, signature, 16));

    // Wrapping round trip; the wrap's length asked for first.
    CK_MECHANISM ecb{CKM_AES_ECB, nullptr, 0}, derivation{CKM_SHA256_KEY_DERIVATION, nullptr, 0};
    length = 0;
    ASSERT_EQ(CKR_OK, f->C_WrapKey(s, &ecb, aes, secret, nullptr, &length));
    ASSERT_EQ(16u, length);
    std::vector<CK_BYTE> wrapped(length);
    ASSERT_EQ(CKR_OK, f->C_WrapKey(s, &ecb, aes, secret, wrapped.data(), &length));
    CK_OBJECT_CLASS secretClass = CKO_SECRET_KEY;
    CK_ATTRIBUTE unwrapTemplate[] = {{CKA_CLASS, &secretClass, sizeof secretClass}};
    CK_OBJECT_HANDLE unwrapped = 0, derived = 0;
    ASSERT_EQ(CKR_OK,
              f->C_UnwrapKey(s, &ecb, aes, wrapped.data(), length, unwrapTemplate, 1, &unwrapped));
    auto value = [&](CK_OBJECT_HANDLE key) {
        CK_BYTE bytes[16] = {};
        CK_ATTRIBUTE read[] = {{CKA_VALUE, bytes, sizeof bytes}};
        EXPECT_EQ(CKR_OK, f->C_GetAttributeValue(s, key, read, 1));
        return std::string(reinterpret_cast<char*>(bytes), read[0].ulValueLen);
    };
    EXPECT_EQ(value(secret), value(unwrapped));
    // Answered as "C_UnDeriveKey"; the proxy takes the handle all the same.
    ASSERT_EQ(CKR_OK, f->C_DeriveKey(s, &derivation, secret, valueLen, 1, &derived));
    EXPECT_EQ(unwrapped + 1, derived);

    CK_BYTE seed[] = "seed", random[16] = {};
    EXPECT_EQ(CKR_OK, f->C_SeedRandom(s, seed, 4));
    EXPECT_EQ("73656564", fakevendor::lastCall("C_SeedRandom").arg("pSeed").hex);
    ASSERT_EQ(CKR_OK, f->C_GenerateRandom(s, random, sizeof random));
    EXPECT_NE(std::string(16, '\0'), std::string(reinterpret_cast<char*>(random), 16));

    EXPECT_EQ(CKR_FUNCTION_NOT_PARALLEL, f->C_GetFunctionStatus(s));
    EXPECT_EQ(CKR_FUNCTION_NOT_PARALLEL, f->C_CancelFunction(s));
    CK_SLOT_ID slot = 0;
    int reserved = 0;
    EXPECT_EQ(CKR_OK, f->C_WaitForSlotEvent(0, &slot, &reserved));
    EXPECT_EQ(1u, slot);
    EXPECT_TRUE(fakevendor::lastCall("C_WaitForSlotEvent").arg("pReserved").null);
    EXPECT_EQ(CKR_NO_EVENT, f->C_WaitForSlotEvent(CKF_DONT_BLOCK, &slot, nullptr));
    EXPECT_EQ(CKR_OK, f->C_Finalize(nullptr));
}

// A caller's NULL buffer, template or mechanism reaches the module as NULL:
// never as zeros of the stated length, and a NULL output stays a length query.
TEST_F(EndToEnd, NullBuffersTemplatesAndMechanismsReachTheModuleAsNull) {
    ASSERT_EQ(CKR_OK, C_Initialize(nullptr));
    CK_SESSION_HANDLE s = 0;
    ASSERT_EQ(CKR_OK, C_OpenSession(1, CKF_SERIAL_SESSION, nullptr, nullptr, &s));
    CK_ULONG n = 8;
    CK_OBJECT_HANDLE h = 0, h2 = 0;
    struct Row {
        const char* function;
        const char* nullArgs;  // the module's names, space-separated
        std::function<CK_RV()> call;
    };
    // clang-format off
#define NULL_ROW(function, args, ...) Row{#function, args, [&] { return function(__VA_ARGS__); }}
    const Row rows[] = {
        NULL_ROW(C_Encrypt, "pData pEncryptedData", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_Decrypt, "pEncryptedData pData", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_Digest, "pData pDigest", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_Sign, "pData pSignature", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_Verify, "pData pSignature", s, nullptr, 8, nullptr, 8),
        NULL_ROW(C_EncryptUpdate, "pPart pEncryptedPart", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_DecryptUpdate, "pEncryptedPart pPart", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_SignRecover, "pData pSignature", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_VerifyRecover, "pSignature pData", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_DigestEncryptUpdate, "pPart pEncryptedPart", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_DecryptDigestUpdate, "pEncryptedPart pPart", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_SignEncryptUpdate, "pPart pEncryptedPart", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_DecryptVerifyUpdate, "pEncryptedPart pPart", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_EncryptFinal, "pLastEncryptedPart", s, nullptr, &n),
        NULL_ROW(C_DecryptFinal, "pLastPart", s, nullptr, &n),
        NULL_ROW(C_DigestFinal, "pDigest", s, nullptr, &n),
        NULL_ROW(C_SignFinal, "pSignature", s, nullptr, &n),
        NULL_ROW(C_DigestUpdate, "pPart", s, nullptr, 8),
        NULL_ROW(C_SignUpdate, "pPart", s, nullptr, 8),
        NULL_ROW(C_VerifyUpdate, "pPart", s, nullptr, 8),
        NULL_ROW(C_VerifyFinal, "pSignature", s, nullptr, 8),
        NULL_ROW(C_GetOperationState, "pOperationState", s, nullptr, &n),
        NULL_ROW(C_SetOperationState, "pOperationState", s, nullptr, 8, 0, 0),
        NULL_ROW(C_Login, "pPin", s, CKU_USER, nullptr, 4),
        NULL_ROW(C_InitToken, "pPin pLabel", 2, nullptr, 4, nullptr),
        NULL_ROW(C_SeedRandom, "pSeed", s, nullptr, 8),
        NULL_ROW(C_GenerateRandom, "RandomData", s, nullptr, 8),
        NULL_ROW(C_CreateObject, "pTemplate", s, nullptr, 2, &h),
        NULL_ROW(C_CopyObject, "pTemplate", s, 1, nullptr, 2, &h),
        NULL_ROW(C_SetAttributeValue, "pTemplate", s, 1, nullptr, 2),
        NULL_ROW(C_GetAttributeValue, "pTemplate", s, 1, nullptr, 2),
        NULL_ROW(C_FindObjectsInit, "pTemplate", s, nullptr, 2),
        NULL_ROW(C_EncryptInit, "pMechanism", s, nullptr, 1),
        NULL_ROW(C_DecryptInit, "pMechanism", s, nullptr, 1),
        NULL_ROW(C_DigestInit, "pMechanism", s, nullptr),
        NULL_ROW(C_SignInit, "pMechanism", s, nullptr, 1),
        NULL_ROW(C_VerifyInit, "pMechanism", s, nullptr, 1),
        NULL_ROW(C_SignRecoverInit, "pMechanism", s, nullptr, 1),
        NULL_ROW(C_VerifyRecoverInit, "pMechanism", s, nullptr, 1),
        NULL_ROW(C_GenerateKey, "pMechanism pTemplate", s, nullptr, nullptr, 2, &h),
        NULL_ROW(C_GenerateKeyPair, "pMechanism pPublicKeyTemplate pPrivateKeyTemplate",
                 s, nullptr, nullptr, 2, nullptr, 2, &h, &h2),
        NULL_ROW(C_WrapKey, "pMechanism pWrappedKey", s, nullptr, 1, 2, nullptr, &n),
        NULL_ROW(C_UnwrapKey, "pMechanism pWrappedKey pTemplate",
                 s, nullptr, 1, nullptr, 8, nullptr, 2, &h),
        NULL_ROW(C_DeriveKey, "pMechanism pTemplate", s, nullptr, 1, nullptr, 2, &h),
    };
#undef NULL_ROW
    // clang-format on
    for (const Row& row : rows) {
        SCOPED_TRACE(row.function);
        EXPECT_NE(kNoAnswer, row.call());
        std::istringstream args(row.nullArgs);
        for (std::string arg; args >> arg;)
            EXPECT_TRUE(fakevendor::lastCall(row.function).arg(arg).null) << arg;
    }
    CK_MECHANISM noParameter{CKM_AES_CBC, nullptr, 16};
    EXPECT_NE(kNoAnswer, C_EncryptInit(s, &noParameter, 1));
    EXPECT_TRUE(fakevendor::lastCall("C_EncryptInit").arg("pMechanism").items.at(0).null);
}

// ---- PINs ----------------------------------------------------------------------

// A PIN made at run time, so that no constant in the program holds it.
class Secret {
public:
    static constexpr size_t kSize = 24;
    uint8_t at(size_t i) const { return static_cast<uint8_t>(seed_ ^ (i * 29 + 11)); }
    // Writes it over every run of kSize 'P' bytes.
    void writeOver(std::string& bytes) const {
        for (size_t p = bytes.find(std::string(kSize, 'P')); p != std::string::npos;
             p = bytes.find(std::string(kSize, 'P'), p))
            for (size_t i = 0; i < kSize; ++i) bytes[p + i] = static_cast<char>(at(i));
    }
    // Copies of it anywhere in the writable memory of this process.
    size_t copiesInMemory() const {
        const int mem = open("/proc/self/mem", O_RDONLY);
        std::vector<uint8_t> chunk(1 << 20);
        std::ifstream maps("/proc/self/maps");
        size_t found = 0;
        for (std::string line; std::getline(maps, line);) {
            unsigned long long start = 0, end = 0;
            char perms[5] = {};
            if (sscanf(line.c_str(), "%llx-%llx %4s", &start, &end, perms) != 3) continue;
            // Not the sanitizer's shadow: huge and never holding data.
            if (perms[0] != 'r' || perms[1] != 'w' || end - start > (1ull << 30)) continue;
            for (unsigned long long at = start; at < end; at += chunk.size() - kSize) {
                const ssize_t n =
                    pread(mem, chunk.data(), std::min<unsigned long long>(chunk.size(), end - at),
                          static_cast<off_t>(at));
                for (ssize_t i = 0; i + static_cast<ssize_t>(kSize) <= n; ++i) {
                    size_t k = 0;
                    while (k < kSize && chunk[i + k] == this->at(k)) ++k;
                    found += k == kSize;
                }
                if (n <= 0 || at + n >= end) break;
            }
        }
        close(mem);
        return found;
    }

private:
    const uint8_t seed_ = static_cast<uint8_t>(getpid() | 0x80);
};

// Functions that take a PIN and look at nothing: the fake module records what
// it receives, copies that are not the service's.
CK_FUNCTION_LIST pinRefusingModule() {
    CK_FUNCTION_LIST list = *fake_vendor_function_list();
    list.C_Login = [](CK_SESSION_HANDLE, CK_USER_TYPE, CK_UTF8CHAR_PTR, CK_ULONG) -> CK_RV {
        return CKR_PIN_INCORRECT;
    };
    list.C_InitToken = [](CK_SLOT_ID, CK_UTF8CHAR_PTR, CK_ULONG, CK_UTF8CHAR_PTR) -> CK_RV {
        return CKR_PIN_INCORRECT;
    };
    list.C_InitPIN = [](CK_SESSION_HANDLE, CK_UTF8CHAR_PTR, CK_ULONG) -> CK_RV {
        return CKR_PIN_INCORRECT;
    };
    list.C_SetPIN = [](CK_SESSION_HANDLE, CK_UTF8CHAR_PTR, CK_ULONG, CK_UTF8CHAR_PTR,
                       CK_ULONG) -> CK_RV { return CKR_PIN_INCORRECT; };
    return list;
}

using servertest::parsed;
using servertest::requestBytes;

class PinWipe : public voktest::JvmTest {};

// The channel's payload, the dispatcher's copy, both parses and the
// module's buffer: each is wiped before it is released.
TEST_F(PinWipe, NoCopyOfAPinOutlivesItsRequest) {
    static CK_FUNCTION_LIST module = pinRefusingModule();
    const std::string id = voktest::uniqueServerId();
    voktest::registerModule(id.c_str(), &module);
    ASSERT_EQ(0, vokpkcs11_init_server(id.c_str()));
    voktest::RawSocket client = voktest::rawConnect(id);
    voktest::WireHeader header;
    voktest::Bytes answer;
    ASSERT_TRUE(client.sendFrame({100, 103, 0, 4}, voktest::int32Bytes(1)));
    ASSERT_TRUE(client.recvFrame(&header, &answer));

    const Secret secret;
    const std::string pin(Secret::kSize, 'P');
    const std::vector<std::string> requests = {
        requestBytes("C_Login", [&](auto& op) { op.mutable_login()->set_ppin(pin); }),
        requestBytes("C_InitToken", [&](auto& op) { op.mutable_inittoken()->set_ppin(pin); }),
        requestBytes("C_InitPin", [&](auto& op) { op.mutable_initpin()->set_ppin(pin); }),
        requestBytes("C_SetPin",
                     [&](auto& op) {
                         op.mutable_setpin()->set_poldpin(pin),
                             op.mutable_setpin()->set_pnewpin(pin);
                     }),
    };
    for (std::string request : requests) {
        voktest::Bytes frame =
            voktest::encodeHeader({101, 103, 0, static_cast<int32_t>(request.size())});
        secret.writeOver(request);
        frame.insert(frame.end(), request.begin(), request.end());
        std::fill(request.begin(), request.end(), 0);
        ASSERT_TRUE(client.sendBytes(frame));
        std::fill(frame.begin(), frame.end(), 0);
        ASSERT_TRUE(client.recvFrame(&header, &answer));
        EXPECT_EQ(CKR_PIN_INCORRECT, parsed(std::string(answer.begin(), answer.end())).result());
    }
    EXPECT_EQ(0u, secret.copiesInMemory());
}

}  // namespace
