// Mechanism parameter conversion through a real Java VM under -Xcheck:jni:
// every parameter class against its packed layout and freed by its mechanism
// type, classes freed by another type's rule, and the four copy-backs.
#include <gtest/gtest.h>

#include <csignal>
#include <cstdio>
#include <cstring>
#include <stdexcept>
#include <functional>
#include <string>

#include "converter_support.h"
#include "converters.h"
#include "jvm_fixture.h"
#include "log_capture.h"

namespace {

using namespace convtest;
using voktest::takePendingException;

struct ParameterRow {
    const char* className;
    CK_MECHANISM_TYPE mechanism;  // whose rule frees it
    std::size_t size;
    std::vector<Member> members;
    std::vector<std::size_t> leftAllocated = {};  // pointers the rule leaves
};

#define ROW(S, mechanism, ...) ParameterRow{#S, mechanism, sizeof(S), __VA_ARGS__}

const std::vector<Member> kRandomData = {
    VOK_BYTES(CK_SSL3_RANDOM_DATA, pClientRandom, ulClientRandomLen),
    VOK_BYTES(CK_SSL3_RANDOM_DATA, pServerRandom, ulServerRandomLen)};

Member randomInfo(std::size_t offset) {
    return {Kind::Embedded, "RandomInfo", offset, kNoLength, 0, "CK_SSL3_RANDOM_DATA", kRandomData};
}

// Every parameter class but RC2-CBC, in the dispatcher's order.
const std::vector<ParameterRow>& parameterRows() {
    using OAEP = CK_RSA_PKCS_OAEP_PARAMS;
    using KEA = CK_KEA_DERIVE_PARAMS;
    using SPW = CK_SKIPJACK_PRIVATE_WRAP_PARAMS;
    using RELAYX = CK_SKIPJACK_RELAYX_PARAMS;
    using PBKD2 = CK_PKCS5_PBKD2_PARAMS;
    using MASTER = CK_SSL3_MASTER_KEY_DERIVE_PARAMS;
    using KEYMAT = CK_SSL3_KEY_MAT_PARAMS;
    using OUT = CK_SSL3_KEY_MAT_OUT;
    using ECDH2 = CK_ECDH2_DERIVE_PARAMS;
    using DH2 = CK_X9_42_DH2_DERIVE_PARAMS;
    static const std::vector<ParameterRow> rows = {
        ROW(CK_RSA_PKCS_OAEP_PARAMS, CKM_RSA_PKCS_OAEP,
            {VOK_LONG(OAEP, hashAlg), VOK_LONG(OAEP, mgf), VOK_LONG(OAEP, source),
             VOK_BYTES(OAEP, pSourceData, ulSourceDataLen)}),
        // ulRandomLen comes from pRandomB; pRandomA's length is dropped.
        ROW(CK_KEA_DERIVE_PARAMS, CKM_KEA_KEY_DERIVE,
            {VOK_BOOL(KEA, isSender), VOK_BYTES_ONLY(KEA, pRandomA),
             VOK_BYTES(KEA, pRandomB, ulRandomLen), VOK_BYTES(KEA, pPublicData, ulPublicDataLen)}),
        ROW(CK_RC2_MAC_GENERAL_PARAMS, CKM_RC2_MAC_GENERAL,
            {VOK_LONG(CK_RC2_MAC_GENERAL_PARAMS, ulEffectiveBits),
             VOK_LONG(CK_RC2_MAC_GENERAL_PARAMS, ulMacLength)}),
        ROW(CK_RC5_PARAMS, CKM_RC5_ECB,
            {VOK_LONG(CK_RC5_PARAMS, ulWordsize), VOK_LONG(CK_RC5_PARAMS, ulRounds)}),
        ROW(CK_RC5_CBC_PARAMS, CKM_RC5_CBC_PAD,
            {VOK_LONG(CK_RC5_CBC_PARAMS, ulWordsize), VOK_LONG(CK_RC5_CBC_PARAMS, ulRounds),
             VOK_BYTES(CK_RC5_CBC_PARAMS, pIv, ulIvLen)}),
        ROW(CK_RC5_MAC_GENERAL_PARAMS, CKM_RC5_MAC_GENERAL,
            {VOK_LONG(CK_RC5_MAC_GENERAL_PARAMS, ulWordsize),
             VOK_LONG(CK_RC5_MAC_GENERAL_PARAMS, ulRounds),
             VOK_LONG(CK_RC5_MAC_GENERAL_PARAMS, ulMacLength)}),
        ROW(CK_SKIPJACK_PRIVATE_WRAP_PARAMS, CKM_SKIPJACK_PRIVATE_WRAP,
            {VOK_BYTES(SPW, pPassword, ulPasswordLen), VOK_BYTES(SPW, pPublicData, ulPublicDataLen),
             VOK_BYTES(SPW, pRandomA, ulRandomLen), VOK_BYTES(SPW, pPrimeP, ulPAndGLen),
             VOK_BYTES_ONLY(SPW, pBaseG), VOK_BYTES(SPW, pSubprimeQ, ulQLen)}),
        ROW(CK_SKIPJACK_RELAYX_PARAMS, CKM_SKIPJACK_RELAYX,
            {VOK_BYTES(RELAYX, pOldWrappedX, ulOldWrappedXLen),
             VOK_BYTES(RELAYX, pOldPassword, ulOldPasswordLen),
             VOK_BYTES(RELAYX, pOldPublicData, ulOldPublicDataLen),
             VOK_BYTES(RELAYX, pOldRandomA, ulOldRandomLen),
             VOK_BYTES(RELAYX, pNewPassword, ulNewPasswordLen),
             VOK_BYTES(RELAYX, pNewPublicData, ulNewPublicDataLen),
             VOK_BYTES(RELAYX, pNewRandomA, ulNewRandomLen)}),
        ROW(CK_PBE_PARAMS, CKM_PBA_SHA1_WITH_SHA1_HMAC,
            {VOK_CHARS_ONLY(CK_PBE_PARAMS, pInitVector),
             VOK_CHARS(CK_PBE_PARAMS, pPassword, ulPasswordLen),
             VOK_CHARS(CK_PBE_PARAMS, pSalt, ulSaltLen), VOK_LONG(CK_PBE_PARAMS, ulIteration)}),
        // The password stays null: every byte no member names must be zero.
        ROW(CK_PKCS5_PBKD2_PARAMS, CKM_PKCS5_PBKD2,
            {VOK_LONG(PBKD2, saltSource), VOK_BYTES(PBKD2, pSaltSourceData, ulSaltSourceDataLen),
             VOK_LONG(PBKD2, iterations), VOK_LONG(PBKD2, prf),
             VOK_BYTES(PBKD2, pPrfData, ulPrfDataLen)}),
        ROW(CK_KEY_DERIVATION_STRING_DATA, CKM_XOR_BASE_AND_DATA,
            {VOK_BYTES(CK_KEY_DERIVATION_STRING_DATA, pData, ulLen)}),
        ROW(CK_KEY_WRAP_SET_OAEP_PARAMS, CKM_KEY_WRAP_SET_OAEP,
            {VOK_BYTE(CK_KEY_WRAP_SET_OAEP_PARAMS, bBC),
             VOK_BYTES(CK_KEY_WRAP_SET_OAEP_PARAMS, pX, ulXLen)}),
        ROW(CK_SSL3_MASTER_KEY_DERIVE_PARAMS, CKM_TLS_MASTER_KEY_DERIVE_DH,
            {randomInfo(offsetof(MASTER, RandomInfo)),
             {Kind::Pointed, "pVersion", offsetof(MASTER, pVersion), kNoLength, sizeof(CK_VERSION),
              "CK_VERSION", {VOK_BYTE(CK_VERSION, major), VOK_BYTE(CK_VERSION, minor)}}}),
        ROW(CK_SSL3_KEY_MAT_PARAMS, CKM_TLS_KEY_AND_MAC_DERIVE,
            {VOK_LONG(KEYMAT, ulMacSizeInBits), VOK_LONG(KEYMAT, ulKeySizeInBits),
             VOK_LONG(KEYMAT, ulIVSizeInBits), VOK_BOOL(KEYMAT, bIsExport),
             randomInfo(offsetof(KEYMAT, RandomInfo)),
             {Kind::Pointed, "pReturnedKeyMaterial", offsetof(KEYMAT, pReturnedKeyMaterial),
              kNoLength, sizeof(OUT), "CK_SSL3_KEY_MAT_OUT",
              {VOK_LONG(OUT, hClientMacSecret), VOK_LONG(OUT, hServerMacSecret),
               VOK_LONG(OUT, hClientKey), VOK_LONG(OUT, hServerKey),
               VOK_BYTES_ONLY(OUT, pIVClient), VOK_BYTES_ONLY(OUT, pIVServer)}}},
            {offsetof(KEYMAT, pReturnedKeyMaterial)}),
        ROW(CK_RSA_PKCS_PSS_PARAMS, CKM_RSA_PKCS_PSS,
            {VOK_LONG(CK_RSA_PKCS_PSS_PARAMS, hashAlg), VOK_LONG(CK_RSA_PKCS_PSS_PARAMS, mgf),
             VOK_LONG(CK_RSA_PKCS_PSS_PARAMS, sLen)}),
        ROW(CK_ECDH1_DERIVE_PARAMS, CKM_ECDH1_COFACTOR_DERIVE,
            {VOK_LONG(CK_ECDH1_DERIVE_PARAMS, kdf),
             VOK_BYTES(CK_ECDH1_DERIVE_PARAMS, pSharedData, ulSharedDataLen),
             VOK_BYTES(CK_ECDH1_DERIVE_PARAMS, pPublicData, ulPublicDataLen)}),
        ROW(CK_ECDH2_DERIVE_PARAMS, CKM_ECMQV_DERIVE,
            {VOK_LONG(ECDH2, kdf), VOK_BYTES(ECDH2, pSharedData, ulSharedDataLen),
             VOK_BYTES(ECDH2, pPublicData, ulPublicDataLen), VOK_LONG(ECDH2, ulPrivateDataLen),
             VOK_LONG(ECDH2, hPrivateData), VOK_BYTES(ECDH2, pPublicData2, ulPublicDataLen2)}),
        ROW(CK_X9_42_DH1_DERIVE_PARAMS, CKM_X9_42_DH_DERIVE,
            {VOK_LONG(CK_X9_42_DH1_DERIVE_PARAMS, kdf),
             VOK_BYTES(CK_X9_42_DH1_DERIVE_PARAMS, pOtherInfo, ulOtherInfoLen),
             VOK_BYTES(CK_X9_42_DH1_DERIVE_PARAMS, pPublicData, ulPublicDataLen)}),
        ROW(CK_X9_42_DH2_DERIVE_PARAMS, CKM_X9_42_MQV_DERIVE,
            {VOK_LONG(DH2, kdf), VOK_BYTES(DH2, pOtherInfo, ulOtherInfoLen),
             VOK_BYTES(DH2, pPublicData, ulPublicDataLen), VOK_LONG(DH2, ulPrivateDataLen),
             VOK_LONG(DH2, hPrivateData), VOK_BYTES(DH2, pPublicData2, ulPublicDataLen2)}),
        // The CBC encrypt-data rule frees nothing nested: pData stays allocated.
        ROW(CK_DES_CBC_ENCRYPT_DATA_PARAMS, CKM_DES_CBC_ENCRYPT_DATA,
            {VOK_BYTES(CK_DES_CBC_ENCRYPT_DATA_PARAMS, pData, length)},
            {offsetof(CK_DES_CBC_ENCRYPT_DATA_PARAMS, pData)}),
        ROW(CK_AES_CBC_ENCRYPT_DATA_PARAMS, CKM_AES_CBC_ENCRYPT_DATA,
            {VOK_BYTES(CK_AES_CBC_ENCRYPT_DATA_PARAMS, pData, length)},
            {offsetof(CK_AES_CBC_ENCRYPT_DATA_PARAMS, pData)}),
    };
    return rows;
}

const ParameterRow& rowOf(const std::string& className) {
    for (const auto& row : parameterRows())
        if (row.className == className) return row;
    throw std::logic_error("no row " + className);
}

void* pointerAt(const void* base, std::size_t offset) {
    void* pointer;
    std::memcpy(&pointer, static_cast<const uint8_t*>(base) + offset, sizeof pointer);
    return pointer;
}

jobject newMechanism(JNIEnv* env, CK_MECHANISM_TYPE type, jobject parameter) {
    jobject mechanism = newObject(env, "CK_MECHANISM");
    jvalue v;
    v.j = static_cast<jlong>(type);
    setField(env, mechanism, "mechanism", "J", v);
    v.l = parameter;
    setField(env, mechanism, "pParameter", "Ljava/lang/Object;", v);
    return mechanism;
}

class MechanismParams : public voktest::JvmTest {
protected:
    // Converts a row's class, checks it member by member and frees it by
    // mechanism; the buffers that rule leaves are checked and released.
    void convertCheckAndFree(const ParameterRow& row, CK_MECHANISM_TYPE mechanism,
                             const std::vector<std::size_t>& leftAllocated) {
        std::string where = std::string(row.className) + " freed as 0x" + hex(mechanism);
        TrackedAllocations tracked;
        int seed = 0;
        jobject jParam = buildJava(env_, row.className, row.members, seed);
        CK_MECHANISM ck = jMechanismToCKMechanism(env_, newMechanism(env_, mechanism, jParam));
        ASSERT_FALSE(env_->ExceptionCheck()) << where;
        EXPECT_EQ(ck.mechanism, mechanism);
        ASSERT_EQ(ck.ulParameterLen, row.size) << where;
        seed = 0;
        checkNative(ck.pParameter, row.size, row.members, seed, tracked, where);

        std::vector<void*> left;
        for (std::size_t offset : leftAllocated) left.push_back(pointerAt(ck.pParameter, offset));
        freeCKMechanismParameter(&ck);
        EXPECT_EQ(tracked.live(), left.size()) << where;
        for (void* buffer : left) {
            EXPECT_NE(tracked.sizeOf(buffer), 0u) << where << ": a buffer the rule keeps was freed";
            tracked.release(buffer);
        }
    }
    static std::string hex(CK_ULONG v) {
        char text[20];
        std::snprintf(text, sizeof text, "%llx", static_cast<unsigned long long>(v));
        return text;
    }
};

TEST_F(MechanismParams, EachClassMatchesItsPackedLayoutAndIsFreedByItsMechanism) {
    for (const auto& row : parameterRows()) convertCheckAndFree(row, row.mechanism, row.leftAllocated);
}

TEST_F(MechanismParams, AClassIsFreedByTheMechanismTypesRuleNotByItsOwn) {
    struct {
        const char* className;
        CK_MECHANISM_TYPE mechanism;
        std::vector<std::size_t> leftAllocated;
    } cases[] = {
        // No rule for plain RSA: the OAEP source data stays.
        {"CK_RSA_PKCS_OAEP_PARAMS", CKM_RSA_PKCS,
         {offsetof(CK_RSA_PKCS_OAEP_PARAMS, pSourceData)}},
        // The DH2 rule's third buffer lies past this smaller structure: not read.
        {"CK_ECDH1_DERIVE_PARAMS", CKM_ECMQV_DERIVE, {}},
        {"CK_X9_42_DH1_DERIVE_PARAMS", CKM_ECDH1_DERIVE, {}},
        // Same layout as the ECB string data, but the CBC rule keeps pData.
        {"CK_KEY_DERIVATION_STRING_DATA", CKM_AES_CBC_ENCRYPT_DATA,
         {offsetof(CK_KEY_DERIVATION_STRING_DATA, pData)}},
    };
    for (const auto& c : cases) convertCheckAndFree(rowOf(c.className), c.mechanism, c.leftAllocated);
}

TEST_F(MechanismParams, PlainParametersAndTheirLengths) {
    voktest::LogCapture log;
    auto boxed = [&](const char* cls, const char* sig, jlong v) {
        jvalue x;
        if (sig[1] == 'Z') x.z = static_cast<jboolean>(v); else x.j = v;
        return newBoxed(env_, cls, sig, x);
    };
    jobject version = newObject(env_, "CK_VERSION");
    jvalue major, minor;
    major.b = 2;
    minor.b = 40;
    setField(env_, version, "major", "B", major);
    setField(env_, version, "minor", "B", minor);
    uint64_t longValue = 0x1122334455667788;
    struct {
        const char* what;
        jobject parameter;
        Bytes expected;  // empty: null parameter
        const char* exception;
    } cases[] = {
        {"none", nullptr, {}, nullptr},
        {"byte[] as is", newBytes(env_, {9, 8, 7}), {9, 8, 7}, nullptr},
        {"Long", boxed("java/lang/Long", "(J)V", 0x1122334455667788), nativeBytes(&longValue, 8),
         nullptr},
        {"CK_VERSION", version, {2, 40}, nullptr},
        {"Boolean through the value converter", boxed("java/lang/Boolean", "(Z)V", 1), {1},
         nullptr},
        {"unknown class", newObject(env_, "java/lang/Object"), {},
         "com.vok.smartcard.pkcs11.PKCS11RuntimeException"},
    };
    for (const auto& c : cases) {
        TrackedAllocations tracked;
        CK_MECHANISM ck = jMechanismToCKMechanism(env_, newMechanism(env_, CKM_AES_CBC, c.parameter));
        EXPECT_EQ(takePendingException(env_).className, c.exception ? c.exception : "") << c.what;
        EXPECT_EQ(ck.mechanism, CKM_AES_CBC);
        EXPECT_EQ(ck.ulParameterLen, c.expected.size()) << c.what;
        EXPECT_EQ(nativeBytes(ck.pParameter, c.expected.size()), c.expected) << c.what;
        if (c.expected.empty()) {
            EXPECT_EQ(ck.pParameter, nullptr) << c.what;
        }
        freeCKMechanismParameter(&ck);
        EXPECT_EQ(tracked.live(), 0u) << c.what;
    }
    EXPECT_TRUE(log.contains("[native jni pkcs11wrapper]", "jMechanismToCKMechanism"));
    EXPECT_TRUE(log.contains("[native jni pkcs11wrapper]",
                             "\nDEBUG: jMechanismParameterToCKMechanismParameter"));
    jMechanismToCKMechanism(env_, nullptr);
    EXPECT_EQ(takePendingException(env_).className, "java.lang.NullPointerException");
}

TEST_F(MechanismParams, CbcEncryptDataIvIsCutToTheMember) {
    for (int ivLength : {8, 16, 40}) {
        TrackedAllocations tracked;
        Bytes iv(ivLength);
        for (int i = 0; i < ivLength; ++i) iv[i] = static_cast<uint8_t>(0xA0 + i);
        for (const char* cls : {"CK_DES_CBC_ENCRYPT_DATA_PARAMS", "CK_AES_CBC_ENCRYPT_DATA_PARAMS"}) {
            jobject jParam = newObject(env_, cls);
            jvalue v;
            v.l = newBytes(env_, iv);
            setField(env_, jParam, "iv", "[B", v);
            void* native = nullptr;
            CK_ULONG length = 0;
            jMechanismParameterToCKMechanismParameter(env_, jParam, &native, &length);
            std::size_t member = length == sizeof(CK_DES_CBC_ENCRYPT_DATA_PARAMS) ? 8 : 16;
            Bytes expected(iv.begin(), iv.begin() + std::min<std::size_t>(member, ivLength));
            expected.resize(member);
            EXPECT_EQ(nativeBytes(native, member), expected) << cls << " " << ivLength;
            // The member is followed by pData, null here: nothing spilled into it.
            EXPECT_EQ(pointerAt(native, member), nullptr) << cls << " " << ivLength;
            tracked.release(native);
        }
        EXPECT_EQ(tracked.live(), 0u) << "the temporary iv buffer is freed";
    }
}

TEST_F(MechanismParams, KeyMaterialThatCannotBeAllocatedLeavesTheRest) {
    TrackedAllocations tracked;
    jobject jParam = newObject(env_, "CK_SSL3_KEY_MAT_PARAMS");
    jvalue v;
    v.j = 128;
    setField(env_, jParam, "ulKeySizeInBits", "J", v);
    tracked.failAllocation(2);  // the structure, then the key material
    void* native = nullptr;
    CK_ULONG length = 0;
    jMechanismParameterToCKMechanismParameter(env_, jParam, &native, &length);
    EXPECT_EQ(takePendingException(env_).className, "java.lang.OutOfMemoryError");
    ASSERT_NE(native, nullptr);
    EXPECT_EQ(static_cast<CK_SSL3_KEY_MAT_PARAMS*>(native)->ulKeySizeInBits, 128u);
    EXPECT_EQ(pointerAt(native, offsetof(CK_SSL3_KEY_MAT_PARAMS, pReturnedKeyMaterial)), nullptr);
    CK_MECHANISM ck{CKM_SSL3_KEY_AND_MAC_DERIVE, native, length};
    freeCKMechanismParameter(&ck);

    // Through the mechanism, the half-made parameter is freed before return.
    tracked.failAllocation(2);
    ck = jMechanismToCKMechanism(env_, newMechanism(env_, CKM_SSL3_KEY_AND_MAC_DERIVE, jParam));
    EXPECT_EQ(takePendingException(env_).className, "java.lang.OutOfMemoryError");
    EXPECT_EQ(ck.pParameter, nullptr);
    EXPECT_EQ(tracked.live(), 0u);
}

// ---- Copy-backs ---------------------------------------------------------------

struct CopyBack {
    const char* what;
    void (*copyBack)(JNIEnv*, CK_MECHANISM_PTR, jobject);
    CK_MECHANISM_TYPE mechanism;
    const char* className;
    std::vector<Member> members;
    // Plays the module: writes results into the native parameter.
    std::function<void(void* native)> module;
    // Checks the Java parameter; copied says whether results must be there.
    std::function<void(JNIEnv*, jobject jParam, bool copied, const std::string& where)> check;
};

jobject fieldOf(JNIEnv* env, jobject object, const char* name, const char* signature) {
    return getField(env, object, name, signature).l;
}

const std::vector<CopyBack>& copyBacks() {
    static const std::vector<CopyBack> rows = {
        {"PBE initialization vector", copyBackPBEInitializationVector, CKM_PBE_SHA1_CAST5_CBC,
         "CK_PBE_PARAMS", {{Kind::Chars, "pInitVector", 0}, {Kind::Chars, "pInitVektor", 0}},
         [](void* native) {
             auto* p = static_cast<CK_PBE_PARAMS*>(native);
             for (int i = 0; i < 2; ++i) p->pInitVector[i] = static_cast<CK_BYTE>(0xF0 + i);
         },
         [](JNIEnv* env, jobject jParam, bool copied, const std::string& where) {
             // Both arrays were made from the same seeds' values; the IV
             // lands in pInitVektor only, widened without sign.
             std::u16string sent = charsOf(env, fieldOf(env, jParam, "pInitVector", "[C"));
             std::u16string back = charsOf(env, fieldOf(env, jParam, "pInitVektor", "[C"));
             EXPECT_EQ(sent.substr(0, 2), u"\u2a00\u2a01") << where;
             EXPECT_EQ(back.substr(0, 2), copied ? u"\u00f0\u00f1" : u"\u2a10\u2a11") << where;
         }},
        {"SET OAEP unwrapped key", copyBackSetUnwrappedKey, CKM_KEY_WRAP_SET_OAEP,
         "CK_KEY_WRAP_SET_OAEP_PARAMS",
         {VOK_BYTE(CK_KEY_WRAP_SET_OAEP_PARAMS, bBC),
          VOK_BYTES(CK_KEY_WRAP_SET_OAEP_PARAMS, pX, ulXLen)},
         [](void* native) {
             auto* p = static_cast<CK_KEY_WRAP_SET_OAEP_PARAMS*>(native);
             p->bBC = 0x7E;
             for (CK_ULONG i = 0; i < p->ulXLen; ++i) p->pX[i] = static_cast<CK_BYTE>(0x50 + i);
         },
         [](JNIEnv* env, jobject jParam, bool copied, const std::string& where) {
             EXPECT_EQ(getField(env, jParam, "bBC", "B").b, copied ? 0x7E : jbyte(0x80)) << where;
             Bytes x = bytesOf(env, fieldOf(env, jParam, "pX", "[B"));
             EXPECT_EQ(x, copied ? Bytes({0x50, 0x51, 0x52}) : Bytes({0x10, 0x11, 0x12})) << where;
         }},
        {"SSL3 client version", copyBackClientVersion, CKM_SSL3_MASTER_KEY_DERIVE,
         "CK_SSL3_MASTER_KEY_DERIVE_PARAMS",
         {{Kind::Pointed, "pVersion", 0, kNoLength, 0, "CK_VERSION",
           {VOK_BYTE(CK_VERSION, major), VOK_BYTE(CK_VERSION, minor)}}},
         [](void* native) {
             auto* p = static_cast<CK_SSL3_MASTER_KEY_DERIVE_PARAMS*>(native);
             p->pVersion->major = 3;
             p->pVersion->minor = 1;
         },
         [](JNIEnv* env, jobject jParam, bool copied, const std::string& where) {
             jobject version = fieldOf(env, jParam, "pVersion", "Lcom/vok/smartcard/pkcs11/CK_VERSION;");
             EXPECT_EQ(getField(env, version, "major", "B").b, copied ? 3 : jbyte(0x81)) << where;
             EXPECT_EQ(getField(env, version, "minor", "B").b, copied ? 1 : jbyte(0x82)) << where;
         }},
        {"SSL3 key material", copyBackSSLKeyMatParams, CKM_SSL3_KEY_AND_MAC_DERIVE,
         "CK_SSL3_KEY_MAT_PARAMS",
         {{Kind::Pointed, "pReturnedKeyMaterial", 0, kNoLength, 0, "CK_SSL3_KEY_MAT_OUT",
           {VOK_BYTES_ONLY(CK_SSL3_KEY_MAT_OUT, pIVClient),
            VOK_BYTES_ONLY(CK_SSL3_KEY_MAT_OUT, pIVServer)}}},
         [](void* native) {
             CK_SSL3_KEY_MAT_OUT* out = static_cast<CK_SSL3_KEY_MAT_PARAMS*>(native)->pReturnedKeyMaterial;
             out->hClientMacSecret = 11, out->hServerMacSecret = 12;
             out->hClientKey = 13, out->hServerKey = 14;
             out->pIVClient[0] = 0xC1, out->pIVServer[0] = 0x5E;
         },
         [](JNIEnv* env, jobject jParam, bool copied, const std::string& where) {
             jobject out = fieldOf(env, jParam, "pReturnedKeyMaterial",
                                   "Lcom/vok/smartcard/pkcs11/CK_SSL3_KEY_MAT_OUT;");
             const char* handles[] = {"hClientMacSecret", "hServerMacSecret", "hClientKey", "hServerKey"};
             for (int i = 0; i < 4; ++i) {
                 EXPECT_EQ(getField(env, out, handles[i], "J").j, copied ? 11 + i : 0) << where;
             }
             EXPECT_EQ(bytesOf(env, fieldOf(env, out, "pIVClient", "[B"))[0], copied ? 0xC1 : 0x10)
                 << where;
             EXPECT_EQ(bytesOf(env, fieldOf(env, out, "pIVServer", "[B"))[0], copied ? 0x5E : 0x20)
                 << where;
         }},
    };
    return rows;
}

TEST_F(MechanismParams, CopyBacksActOnlyWhenTheJavaMechanismMatches) {
    for (const auto& row : copyBacks()) {
        // The TLS variant of the key derivations gets nothing back, even matching.
        CK_MECHANISM_TYPE tls = row.mechanism == CKM_SSL3_MASTER_KEY_DERIVE     ? CKM_TLS_MASTER_KEY_DERIVE
                                : row.mechanism == CKM_SSL3_KEY_AND_MAC_DERIVE ? CKM_TLS_KEY_AND_MAC_DERIVE
                                                                               : row.mechanism;
        struct {
            const char* how;
            CK_MECHANISM_TYPE native, java;
            bool copied;
        } variants[] = {{"matching", row.mechanism, row.mechanism, true},
                        {"not matching", row.mechanism, row.mechanism + 1, false},
                        {"TLS", tls, tls, tls == row.mechanism}};
        for (const auto& v : variants) {
            std::string where = std::string(row.what) + ", " + v.how;
            TrackedAllocations tracked;
            int seed = 0;
            jobject jParam = buildJava(env_, row.className, row.members, seed);
            CK_MECHANISM ck = jMechanismToCKMechanism(env_, newMechanism(env_, v.native, jParam));
            ASSERT_FALSE(env_->ExceptionCheck()) << where;
            row.module(ck.pParameter);
            row.copyBack(env_, &ck, newMechanism(env_, v.java, jParam));
            EXPECT_FALSE(env_->ExceptionCheck()) << where;
            row.check(env_, jParam, v.copied, where);
            void* keyMaterial = row.mechanism == CKM_SSL3_KEY_AND_MAC_DERIVE
                                    ? static_cast<CK_SSL3_KEY_MAT_PARAMS*>(ck.pParameter)->pReturnedKeyMaterial
                                    : nullptr;
            freeCKMechanismParameter(&ck);
            tracked.release(keyMaterial);
        }
    }
}

TEST_F(MechanismParams, PbeCopyBackWithoutTargetArrayCopiesNothing) {
    int seed = 0;
    jobject jParam = buildJava(env_, "CK_PBE_PARAMS", {{Kind::Chars, "pInitVector", 0}}, seed);
    jobject jMechanism = newMechanism(env_, CKM_PBE_MD2_DES_CBC, jParam);
    CK_MECHANISM ck = jMechanismToCKMechanism(env_, jMechanism);
    copyBackPBEInitializationVector(env_, &ck, jMechanism);
    EXPECT_FALSE(env_->ExceptionCheck());
    EXPECT_EQ(getField(env_, jParam, "pInitVektor", "[C").l, nullptr);
    freeCKMechanismParameter(&ck);
}

TEST_F(MechanismParams, Rc2CbcParametersStopTheProcess) {
    // A child process of its own (gtest re-runs this test there) takes the trap.
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_EXIT(
        {
            // The VM's own handler would turn the trap into a crash report.
            std::signal(SIGILL, SIG_DFL);
            jMechanismToCKMechanism(
                env_, newMechanism(env_, CKM_RC2_CBC, newObject(env_, "CK_RC2_CBC_PARAMS")));
        },
        ::testing::KilledBySignal(SIGILL), "");
}

}  // namespace
