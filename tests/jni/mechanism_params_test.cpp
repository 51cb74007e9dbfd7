// Mechanism parameter conversion through a real Java VM under -Xcheck:jni:
// every parameter class against its packed layout and freed by its mechanism
// type, classes freed by another type's rule, and the four copy-backs.
#include <gtest/gtest.h>

#include <csignal>
#include <cstring>
#include <functional>
#include <stdexcept>
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

#define ROW(S, mechanism, ...) \
    ParameterRow { #S, mechanism, sizeof(S), __VA_ARGS__ }

Member randomInfo(std::size_t offset) {
    return {Kind::Embedded,
            "RandomInfo",
            offset,
            kNoLength,
            0,
            "CK_SSL3_RANDOM_DATA",
            {VOK_BYTES(CK_SSL3_RANDOM_DATA, pClientRandom, ulClientRandomLen),
             VOK_BYTES(CK_SSL3_RANDOM_DATA, pServerRandom, ulServerRandomLen)}};
}

// The two structures that parameters point to; the module writes into them.
const Member kVersionPointer{Kind::Pointed,
                             "pVersion",
                             offsetof(CK_SSL3_MASTER_KEY_DERIVE_PARAMS, pVersion),
                             kNoLength,
                             sizeof(CK_VERSION),
                             "CK_VERSION",
                             {VOK_BYTE(CK_VERSION, major), VOK_BYTE(CK_VERSION, minor)}};
const Member kKeyMaterialPointer{
    Kind::Pointed,
    "pReturnedKeyMaterial",
    offsetof(CK_SSL3_KEY_MAT_PARAMS, pReturnedKeyMaterial),
    kNoLength,
    sizeof(CK_SSL3_KEY_MAT_OUT),
    "CK_SSL3_KEY_MAT_OUT",
    {VOK_LONG(CK_SSL3_KEY_MAT_OUT, hClientMacSecret),
     VOK_LONG(CK_SSL3_KEY_MAT_OUT, hServerMacSecret), VOK_LONG(CK_SSL3_KEY_MAT_OUT, hClientKey),
     VOK_LONG(CK_SSL3_KEY_MAT_OUT, hServerKey), VOK_BYTES_ONLY(CK_SSL3_KEY_MAT_OUT, pIVClient),
     VOK_BYTES_ONLY(CK_SSL3_KEY_MAT_OUT, pIVServer)}};

// Every parameter class but RC2-CBC, in the dispatcher's order.
const std::vector<ParameterRow>& parameterRows() {
    using OAEP = CK_RSA_PKCS_OAEP_PARAMS;
    using KEA = CK_KEA_DERIVE_PARAMS;
    using SPW = CK_SKIPJACK_PRIVATE_WRAP_PARAMS;
    using RELAYX = CK_SKIPJACK_RELAYX_PARAMS;
    using PBKD2 = CK_PKCS5_PBKD2_PARAMS;
    using MASTER = CK_SSL3_MASTER_KEY_DERIVE_PARAMS;
    using KEYMAT = CK_SSL3_KEY_MAT_PARAMS;
    using RC2MAC = CK_RC2_MAC_GENERAL_PARAMS;
    using RC5 = CK_RC5_PARAMS;
    using RC5CBC = CK_RC5_CBC_PARAMS;
    using RC5MAC = CK_RC5_MAC_GENERAL_PARAMS;
    using PBE = CK_PBE_PARAMS;
    using PSS = CK_RSA_PKCS_PSS_PARAMS;
    using ECDH1 = CK_ECDH1_DERIVE_PARAMS;
    using DH1 = CK_X9_42_DH1_DERIVE_PARAMS;
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
            {VOK_LONG(RC2MAC, ulEffectiveBits), VOK_LONG(RC2MAC, ulMacLength)}),
        ROW(CK_RC5_PARAMS, CKM_RC5_ECB, {VOK_LONG(RC5, ulWordsize), VOK_LONG(RC5, ulRounds)}),
        ROW(CK_RC5_CBC_PARAMS, CKM_RC5_CBC_PAD,
            {VOK_LONG(RC5CBC, ulWordsize), VOK_LONG(RC5CBC, ulRounds),
             VOK_BYTES(RC5CBC, pIv, ulIvLen)}),
        ROW(CK_RC5_MAC_GENERAL_PARAMS, CKM_RC5_MAC_GENERAL,
            {VOK_LONG(RC5MAC, ulWordsize), VOK_LONG(RC5MAC, ulRounds),
             VOK_LONG(RC5MAC, ulMacLength)}),
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
            {VOK_CHARS_ONLY(PBE, pInitVector), VOK_CHARS(PBE, pPassword, ulPasswordLen),
             VOK_CHARS(PBE, pSalt, ulSaltLen), VOK_LONG(PBE, ulIteration)}),
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
            {randomInfo(offsetof(MASTER, RandomInfo)), kVersionPointer}),
        // The rule leaves the key material structure allocated.
        ROW(CK_SSL3_KEY_MAT_PARAMS, CKM_TLS_KEY_AND_MAC_DERIVE,
            {VOK_LONG(KEYMAT, ulMacSizeInBits), VOK_LONG(KEYMAT, ulKeySizeInBits),
             VOK_LONG(KEYMAT, ulIVSizeInBits), VOK_BOOL(KEYMAT, bIsExport),
             randomInfo(offsetof(KEYMAT, RandomInfo)), kKeyMaterialPointer},
            {offsetof(KEYMAT, pReturnedKeyMaterial)}),
        ROW(CK_RSA_PKCS_PSS_PARAMS, CKM_RSA_PKCS_PSS,
            {VOK_LONG(PSS, hashAlg), VOK_LONG(PSS, mgf), VOK_LONG(PSS, sLen)}),
        ROW(CK_ECDH1_DERIVE_PARAMS, CKM_ECDH1_COFACTOR_DERIVE,
            {VOK_LONG(ECDH1, kdf), VOK_BYTES(ECDH1, pSharedData, ulSharedDataLen),
             VOK_BYTES(ECDH1, pPublicData, ulPublicDataLen)}),
        ROW(CK_ECDH2_DERIVE_PARAMS, CKM_ECMQV_DERIVE,
            {VOK_LONG(ECDH2, kdf), VOK_BYTES(ECDH2, pSharedData, ulSharedDataLen),
             VOK_BYTES(ECDH2, pPublicData, ulPublicDataLen), VOK_LONG(ECDH2, ulPrivateDataLen),
             VOK_LONG(ECDH2, hPrivateData), VOK_BYTES(ECDH2, pPublicData2, ulPublicDataLen2)}),
        ROW(CK_X9_42_DH1_DERIVE_PARAMS, CKM_X9_42_DH_DERIVE,
            {VOK_LONG(DH1, kdf), VOK_BYTES(DH1, pOtherInfo, ulOtherInfoLen),
             VOK_BYTES(DH1, pPublicData, ulPublicDataLen)}),
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
    setField(env, mechanism, "mechanism", "J", jv(static_cast<jlong>(type)));
    setField(env, mechanism, "pParameter", "Ljava/lang/Object;", jv(parameter));
    return mechanism;
}

class MechanismParams : public voktest::JvmTest {
protected:
    // Converts a row's class, checks it member by member and frees it by
    // mechanism; the buffers that rule leaves are checked and released.
    void convertCheckAndFree(const ParameterRow& row, CK_MECHANISM_TYPE mechanism,
                             const std::vector<std::size_t>& leftAllocated) {
        std::string where = std::string(row.className) + " freed as " + std::to_string(mechanism);
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
};

TEST_F(MechanismParams, EachClassMatchesItsPackedLayoutAndIsFreedByItsMechanism) {
    for (const auto& row : parameterRows())
        convertCheckAndFree(row, row.mechanism, row.leftAllocated);
}

TEST_F(MechanismParams, AClassIsFreedByTheMechanismTypesRuleNotByItsOwn) {
    struct {
        const char* className;
        CK_MECHANISM_TYPE mechanism;
        std::vector<std::size_t> leftAllocated;
    } cases[] = {
        // No rule for plain RSA: the OAEP source data stays.
        {"CK_RSA_PKCS_OAEP_PARAMS", CKM_RSA_PKCS, {offsetof(CK_RSA_PKCS_OAEP_PARAMS, pSourceData)}},
        // The DH2 rule's third buffer lies past this smaller structure: not read.
        {"CK_ECDH1_DERIVE_PARAMS", CKM_ECMQV_DERIVE, {}},
        {"CK_X9_42_DH1_DERIVE_PARAMS", CKM_ECDH1_DERIVE, {}},
        // Same layout as the ECB string data, but the CBC rule keeps pData.
        {"CK_KEY_DERIVATION_STRING_DATA",
         CKM_AES_CBC_ENCRYPT_DATA,
         {offsetof(CK_KEY_DERIVATION_STRING_DATA, pData)}},
    };
    for (const auto& c : cases)
        convertCheckAndFree(rowOf(c.className), c.mechanism, c.leftAllocated);
}

TEST_F(MechanismParams, PlainParametersAndTheirLengths) {
    voktest::LogCapture log;
    int seed = 0;  // major 0x80, minor 0x81
    jobject version = buildJava(env_, "CK_VERSION",
                                {VOK_BYTE(CK_VERSION, major), VOK_BYTE(CK_VERSION, minor)}, seed);
    uint64_t longValue = 0x1122334455667788;
    struct {
        const char* what;
        jobject parameter;
        Bytes expected;  // empty: null parameter
        const char* exception = nullptr;
    } cases[] = {
        // clang-format off
        {"none", nullptr, {}},
        {"byte[] as is", newBytes(env_, {9, 8, 7}), {9, 8, 7}},
        {"Long", newBoxed(env_, "java/lang/Long", "(J)V", jv(jlong(longValue))),
         nativeBytes(&longValue, 8)},
        {"CK_VERSION", version, {0x80, 0x81}},
        {"Boolean, as any value", newBoxed(env_, "java/lang/Boolean", "(Z)V", jv(jboolean(1))),
         {1}},
        {"unknown class", newObject(env_, "java/lang/Object"), {},
         "com.vok.smartcard.pkcs11.PKCS11RuntimeException"},
        // clang-format on
    };
    for (const auto& c : cases) {
        TrackedAllocations tracked;
        CK_MECHANISM ck =
            jMechanismToCKMechanism(env_, newMechanism(env_, CKM_AES_CBC, c.parameter));
        EXPECT_EQ(takePendingException(env_).className, c.exception ? c.exception : "") << c.what;
        EXPECT_EQ(ck.mechanism, CKM_AES_CBC);
        EXPECT_EQ(ck.ulParameterLen, c.expected.size()) << c.what;
        EXPECT_EQ(nativeBytes(ck.pParameter, c.expected.size()), c.expected) << c.what;
        EXPECT_TRUE(!c.expected.empty() || ck.pParameter == nullptr) << c.what;
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
        for (const char* cls :
             {"CK_DES_CBC_ENCRYPT_DATA_PARAMS", "CK_AES_CBC_ENCRYPT_DATA_PARAMS"}) {
            jobject jParam = newObject(env_, cls);
            setField(env_, jParam, "iv", "[B", jv(newBytes(env_, iv)));
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
    setField(env_, jParam, "ulKeySizeInBits", "J", jv(jlong(128)));
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

TEST_F(MechanismParams, CopyBacksActOnlyWhenTheJavaMechanismMatches) {
    using PBE = CK_PBE_PARAMS;
    using SET = CK_KEY_WRAP_SET_OAEP_PARAMS;
    // The module's results are the Java values inverted; each copy-back
    // brings back every member listed (PBE: see below).
    struct {
        void (*copyBack)(JNIEnv*, CK_MECHANISM_PTR, jobject);
        CK_MECHANISM_TYPE mechanism, tls;  // tls: its variant that gets nothing back
        const char* className;
        std::vector<Member> members;
    } rows[] = {
        // clang-format off
        {copyBackPBEInitializationVector, CKM_PBE_SHA1_CAST5_CBC, CKM_PBE_SHA1_CAST5_CBC,
         "CK_PBE_PARAMS", {VOK_CHARS_ONLY(PBE, pInitVector), {Kind::Chars, "pInitVektor", 0}}},
        {copyBackSetUnwrappedKey, CKM_KEY_WRAP_SET_OAEP, CKM_KEY_WRAP_SET_OAEP,
         "CK_KEY_WRAP_SET_OAEP_PARAMS", {VOK_BYTE(SET, bBC), VOK_BYTES(SET, pX, ulXLen)}},
        {copyBackClientVersion, CKM_SSL3_MASTER_KEY_DERIVE, CKM_TLS_MASTER_KEY_DERIVE,
         "CK_SSL3_MASTER_KEY_DERIVE_PARAMS", {kVersionPointer}},
        {copyBackSSLKeyMatParams, CKM_SSL3_KEY_AND_MAC_DERIVE, CKM_TLS_KEY_AND_MAC_DERIVE,
         "CK_SSL3_KEY_MAT_PARAMS", {kKeyMaterialPointer}},
        // clang-format on
    };
    for (const auto& row : rows) {
        struct {
            const char* how;
            CK_MECHANISM_TYPE native, java;
            bool copied;
        } variants[] = {{"matching", row.mechanism, row.mechanism, true},
                        {"not matching", row.mechanism, row.mechanism + 1, false},
                        {"TLS", row.tls, row.tls, row.tls == row.mechanism}};
        for (const auto& v : variants) {
            std::string where = std::string(row.className) + ", " + v.how;
            TrackedAllocations tracked;
            int seed = 0;
            jobject jParam = buildJava(env_, row.className, row.members, seed);
            CK_MECHANISM ck = jMechanismToCKMechanism(env_, newMechanism(env_, v.native, jParam));
            ASSERT_FALSE(env_->ExceptionCheck()) << where;
            bool pbe = row.copyBack == copyBackPBEInitializationVector;
            seed = 0;
            invertNative(ck.pParameter, pbe ? std::vector<Member>{row.members[0]} : row.members,
                         seed);
            row.copyBack(env_, &ck, newMechanism(env_, v.java, jParam));
            EXPECT_FALSE(env_->ExceptionCheck()) << where;
            seed = 0;
            if (!pbe) {
                checkJavaValues(env_, jParam, row.members, seed, v.copied, where);
            } else {
                // The IV goes out in pInitVector and comes back in pInitVektor,
                // as far as the shorter of the two reaches, widened without sign.
                jobject back = getField(env_, jParam, "pInitVektor", "[C").l;
                EXPECT_EQ(charsOf(env_, back),
                          v.copied ? u"\u00ff\u00fe\u2a12" : u"\u2a10\u2a11\u2a12")
                    << where;
                checkJavaValues(env_, jParam, {row.members[0]}, seed, false, where);
            }
            void* keyMaterialLeft = row.mechanism == CKM_SSL3_KEY_AND_MAC_DERIVE
                                        ? pointerAt(ck.pParameter, kKeyMaterialPointer.offset)
                                        : nullptr;
            freeCKMechanismParameter(&ck);
            tracked.release(keyMaterialLeft);
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
