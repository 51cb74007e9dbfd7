// Mechanisms and their parameter structures: Java parameter objects to native
// structures, freeing by mechanism type, and the results a module writes into
// a parameter copied back into Java.

#define LOG_TAG "[native jni pkcs11wrapper]"
#include <algorithm>
#include <cstddef>
#include <cstring>
#include <string>

#include "converters.h"
#include "exceptions.h"
#include "java_objects.h"
#include "vok_log.h"

using vokjni::allocZeroed;
using vokjni::findBindingClass;
using vokjni::kPackage;
using vokjni::LocalFrame;
using vokjni::LocalRef;
using vokjni::NativeBuffer;
using vokjni::ObjectFields;

namespace {

std::string objectSignature(const char* simpleName) {
    return std::string("L") + kPackage + simpleName + ";";
}

// A byte-array field into a pointer / length pair of a packed structure
// (whose members cannot be bound to references).
#define READ_BYTES(fields, params, pointerMember, lengthMember)  \
    do {                                                         \
        NativeBuffer bytes_ = (fields).getBytes(#pointerMember); \
        (params).pointerMember = bytes_.data;                    \
        (params).lengthMember = bytes_.length;                   \
    } while (0)

CK_SSL3_RANDOM_DATA readRandomData(JNIEnv* env, ObjectFields& fields) {
    CK_SSL3_RANDOM_DATA random{};
    LocalRef<jobject> jRandom(
        env, fields.getObject("RandomInfo", objectSignature("CK_SSL3_RANDOM_DATA").c_str()));
    if (jRandom.get() == nullptr) return random;
    ObjectFields randomFields(env, jRandom.get());
    READ_BYTES(randomFields, random, pClientRandom, ulClientRandomLen);
    READ_BYTES(randomFields, random, pServerRandom, ulServerRandomLen);
    return random;
}

template <typename Params>
Params readCbcEncryptData(JNIEnv* env, jobject jParam) {
    Params params{};
    ObjectFields fields(env, jParam);
    NativeBuffer iv = fields.getBytes("iv");
    // The iv member has a fixed size (8 or 16 bytes): a longer Java array is
    // cut to it, never copied past the member into the pointer behind it.
    if (iv.data != nullptr)
        std::memcpy(params.iv, iv.data, std::min<CK_ULONG>(iv.length, sizeof params.iv));
    gConverterFree(iv.data);
    READ_BYTES(fields, params, pData, length);
    return params;
}

// ---- The dispatcher's table --------------------------------------------------

struct ParameterClass {
    const char* name;
    std::size_t size;  // of the native structure allocated for it
    void (*convert)(JNIEnv* env, jobject jParam, void* native);
};

template <typename Params, Params (*Convert)(JNIEnv*, jobject)>
void convertInto(JNIEnv* env, jobject jParam, void* native) {
    Params params = Convert(env, jParam);
    std::memcpy(native, &params, sizeof params);
}

#define PARAMETER_CLASS(Params, convert) \
    { #Params, sizeof(Params), &convertInto < Params, convert> }

// Tested in this order; the first class the object is an instance of wins.
const ParameterClass kParameterClasses[] = {
    PARAMETER_CLASS(CK_RSA_PKCS_OAEP_PARAMS, jRsaPkcsOaepParamToCKRsaPkcsOaepParam),
    PARAMETER_CLASS(CK_KEA_DERIVE_PARAMS, jKeaDeriveParamToCKKeaDeriveParam),
    PARAMETER_CLASS(CK_RC2_CBC_PARAMS, jRc2CbcParamToCKRc2CbcParam),
    PARAMETER_CLASS(CK_RC2_MAC_GENERAL_PARAMS, jRc2MacGeneralParamToCKRc2MacGeneralParam),
    PARAMETER_CLASS(CK_RC5_PARAMS, jRc5ParamToCKRc5Param),
    PARAMETER_CLASS(CK_RC5_CBC_PARAMS, jRc5CbcParamToCKRc5CbcParam),
    PARAMETER_CLASS(CK_RC5_MAC_GENERAL_PARAMS, jRc5MacGeneralParamToCKRc5MacGeneralParam),
    PARAMETER_CLASS(CK_SKIPJACK_PRIVATE_WRAP_PARAMS,
                    jSkipjackPrivateWrapParamToCKSkipjackPrivateWrapParam),
    PARAMETER_CLASS(CK_SKIPJACK_RELAYX_PARAMS, jSkipjackRelayxParamToCKSkipjackRelayxParam),
    PARAMETER_CLASS(CK_PBE_PARAMS, jPbeParamToCKPbeParam),
    PARAMETER_CLASS(CK_PKCS5_PBKD2_PARAMS, jPkcs5Pbkd2ParamToCKPkcs5Pbkd2Param),
    PARAMETER_CLASS(CK_KEY_DERIVATION_STRING_DATA,
                    jKeyDerivationStringDataToCKKeyDerivationStringData),
    PARAMETER_CLASS(CK_KEY_WRAP_SET_OAEP_PARAMS, jKeyWrapSetOaepParamToCKKeyWrapSetOaepParam),
    PARAMETER_CLASS(CK_SSL3_MASTER_KEY_DERIVE_PARAMS,
                    jSsl3MasterKeyDeriveParamToCKSsl3MasterKeyDeriveParam),
    PARAMETER_CLASS(CK_SSL3_KEY_MAT_PARAMS, jSsl3KeyMatParamToCKSsl3KeyMatParam),
    PARAMETER_CLASS(CK_RSA_PKCS_PSS_PARAMS, jRsaPkcsPssParamToCKRsaPkcsPssParam),
    PARAMETER_CLASS(CK_ECDH1_DERIVE_PARAMS, jEcdh1DeriveParamToCKEcdh1DeriveParam),
    PARAMETER_CLASS(CK_ECDH2_DERIVE_PARAMS, jEcdh2DeriveParamToCKEcdh2DeriveParam),
    PARAMETER_CLASS(CK_X9_42_DH1_DERIVE_PARAMS, jX942Dh1DeriveParamToCKX942Dh1DeriveParam),
    PARAMETER_CLASS(CK_X9_42_DH2_DERIVE_PARAMS, jX942Dh2DeriveParamToCKX942Dh2DeriveParam),
    PARAMETER_CLASS(CK_DES_CBC_ENCRYPT_DATA_PARAMS, jDesCbcEncryptDataParamToCKDesCbcEncryptData),
    PARAMETER_CLASS(CK_AES_CBC_ENCRYPT_DATA_PARAMS, jAesCbcEncryptDataParamToCKAesCbcEncryptData),
};
constexpr int kParameterClassCount = sizeof kParameterClasses / sizeof kParameterClasses[0];

// ---- Freeing by mechanism type ---------------------------------------------

// The structures that share a freeing rule share their layout.
static_assert(offsetof(CK_ECDH1_DERIVE_PARAMS, pSharedData) ==
                      offsetof(CK_X9_42_DH1_DERIVE_PARAMS, pOtherInfo) &&
                  offsetof(CK_ECDH1_DERIVE_PARAMS, pPublicData) ==
                      offsetof(CK_X9_42_DH1_DERIVE_PARAMS, pPublicData),
              "ECDH1 and X9.42 DH1 parameters are freed alike");
static_assert(offsetof(CK_ECDH2_DERIVE_PARAMS, pSharedData) ==
                      offsetof(CK_X9_42_DH2_DERIVE_PARAMS, pOtherInfo) &&
                  offsetof(CK_ECDH2_DERIVE_PARAMS, pPublicData) ==
                      offsetof(CK_X9_42_DH2_DERIVE_PARAMS, pPublicData) &&
                  offsetof(CK_ECDH2_DERIVE_PARAMS, pPublicData2) ==
                      offsetof(CK_X9_42_DH2_DERIVE_PARAMS, pPublicData2),
              "ECDH2 and X9.42 DH2 parameters are freed alike");

// A native parameter seen as bytes: members are read only where the
// parameter is long enough to hold them, so a structure of another class
// (smaller than the mechanism's own) is never read past its end.
class ParameterBytes {
public:
    ParameterBytes(const void* base, CK_ULONG length)
        : base_(static_cast<const CK_BYTE*>(base)), length_(length) {}
    void* pointerAt(std::size_t offset) const {
        void* pointer = nullptr;
        if (base_ != nullptr && offset + sizeof pointer <= length_)
            std::memcpy(&pointer, base_ + offset, sizeof pointer);
        return pointer;
    }
    template <typename... Offsets>
    void freeAt(Offsets... offsets) const {
        (gConverterFree(pointerAt(offsets)), ...);
    }

private:
    const CK_BYTE* base_;
    CK_ULONG length_;
};

void freeNestedBuffers(CK_MECHANISM_TYPE type, const ParameterBytes& p) {
    switch (type) {
        case CKM_RSA_PKCS_OAEP:
            p.freeAt(offsetof(CK_RSA_PKCS_OAEP_PARAMS, pSourceData));
            break;
        case CKM_X9_42_DH_DERIVE:
        case CKM_ECDH1_DERIVE:
        case CKM_ECDH1_COFACTOR_DERIVE:
            p.freeAt(offsetof(CK_X9_42_DH1_DERIVE_PARAMS, pOtherInfo),
                     offsetof(CK_X9_42_DH1_DERIVE_PARAMS, pPublicData));
            break;
        case CKM_X9_42_DH_HYBRID_DERIVE:
        case CKM_X9_42_MQV_DERIVE:
        case CKM_ECMQV_DERIVE:
            p.freeAt(offsetof(CK_X9_42_DH2_DERIVE_PARAMS, pOtherInfo),
                     offsetof(CK_X9_42_DH2_DERIVE_PARAMS, pPublicData),
                     offsetof(CK_X9_42_DH2_DERIVE_PARAMS, pPublicData2));
            break;
        case CKM_RC5_CBC:
        case CKM_RC5_CBC_PAD:
            p.freeAt(offsetof(CK_RC5_CBC_PARAMS, pIv));
            break;
        case CKM_CONCATENATE_BASE_AND_DATA:
        case CKM_XOR_BASE_AND_DATA:
        case CKM_DES_ECB_ENCRYPT_DATA:
        case CKM_DES3_ECB_ENCRYPT_DATA:
        case CKM_AES_ECB_ENCRYPT_DATA:
            p.freeAt(offsetof(CK_KEY_DERIVATION_STRING_DATA, pData));
            break;
        case CKM_SSL3_MASTER_KEY_DERIVE:
        case CKM_SSL3_MASTER_KEY_DERIVE_DH:
        case CKM_TLS_MASTER_KEY_DERIVE:
        case CKM_TLS_MASTER_KEY_DERIVE_DH:
            p.freeAt(offsetof(CK_SSL3_MASTER_KEY_DERIVE_PARAMS, RandomInfo.pClientRandom),
                     offsetof(CK_SSL3_MASTER_KEY_DERIVE_PARAMS, RandomInfo.pServerRandom),
                     offsetof(CK_SSL3_MASTER_KEY_DERIVE_PARAMS, pVersion));
            break;
        case CKM_SSL3_KEY_AND_MAC_DERIVE:
        case CKM_TLS_KEY_AND_MAC_DERIVE: {
            p.freeAt(offsetof(CK_SSL3_KEY_MAT_PARAMS, RandomInfo.pClientRandom),
                     offsetof(CK_SSL3_KEY_MAT_PARAMS, RandomInfo.pServerRandom));
            // The key material's IV buffers go; the key material structure
            // itself has always been left allocated, and still is.
            ParameterBytes keyMaterial(
                p.pointerAt(offsetof(CK_SSL3_KEY_MAT_PARAMS, pReturnedKeyMaterial)),
                sizeof(CK_SSL3_KEY_MAT_OUT));
            keyMaterial.freeAt(offsetof(CK_SSL3_KEY_MAT_OUT, pIVClient),
                               offsetof(CK_SSL3_KEY_MAT_OUT, pIVServer));
            break;
        }
        case CKM_PBE_MD2_DES_CBC:
        case CKM_PBE_MD5_DES_CBC:
        case CKM_PBE_MD5_CAST_CBC:
        case CKM_PBE_MD5_CAST3_CBC:
        case CKM_PBE_MD5_CAST5_CBC:
        case CKM_PBE_SHA1_CAST5_CBC:
        case CKM_PBE_SHA1_RC4_128:
        case CKM_PBE_SHA1_RC4_40:
        case CKM_PBE_SHA1_DES3_EDE_CBC:
        case CKM_PBE_SHA1_DES2_EDE_CBC:
        case CKM_PBE_SHA1_RC2_128_CBC:
        case CKM_PBE_SHA1_RC2_40_CBC:
        case CKM_PBA_SHA1_WITH_SHA1_HMAC:
            p.freeAt(offsetof(CK_PBE_PARAMS, pInitVector), offsetof(CK_PBE_PARAMS, pPassword),
                     offsetof(CK_PBE_PARAMS, pSalt));
            break;
        case CKM_PKCS5_PBKD2:
            p.freeAt(offsetof(CK_PKCS5_PBKD2_PARAMS, pSaltSourceData),
                     offsetof(CK_PKCS5_PBKD2_PARAMS, pPrfData));
            break;
        case CKM_KEY_WRAP_SET_OAEP:
            p.freeAt(offsetof(CK_KEY_WRAP_SET_OAEP_PARAMS, pX));
            break;
        case CKM_SKIPJACK_PRIVATE_WRAP:
            p.freeAt(offsetof(CK_SKIPJACK_PRIVATE_WRAP_PARAMS, pPassword),
                     offsetof(CK_SKIPJACK_PRIVATE_WRAP_PARAMS, pPublicData),
                     offsetof(CK_SKIPJACK_PRIVATE_WRAP_PARAMS, pRandomA),
                     offsetof(CK_SKIPJACK_PRIVATE_WRAP_PARAMS, pPrimeP),
                     offsetof(CK_SKIPJACK_PRIVATE_WRAP_PARAMS, pBaseG),
                     offsetof(CK_SKIPJACK_PRIVATE_WRAP_PARAMS, pSubprimeQ));
            break;
        case CKM_SKIPJACK_RELAYX:
            p.freeAt(offsetof(CK_SKIPJACK_RELAYX_PARAMS, pOldWrappedX),
                     offsetof(CK_SKIPJACK_RELAYX_PARAMS, pOldPassword),
                     offsetof(CK_SKIPJACK_RELAYX_PARAMS, pOldPublicData),
                     offsetof(CK_SKIPJACK_RELAYX_PARAMS, pOldRandomA),
                     offsetof(CK_SKIPJACK_RELAYX_PARAMS, pNewPassword),
                     offsetof(CK_SKIPJACK_RELAYX_PARAMS, pNewPublicData),
                     offsetof(CK_SKIPJACK_RELAYX_PARAMS, pNewRandomA));
            break;
        case CKM_KEA_KEY_DERIVE:
            p.freeAt(offsetof(CK_KEA_DERIVE_PARAMS, pRandomA),
                     offsetof(CK_KEA_DERIVE_PARAMS, pRandomB),
                     offsetof(CK_KEA_DERIVE_PARAMS, pPublicData));
            break;
        default:
            // Including the CBC encrypt-data mechanisms: their pData has
            // always been left allocated, and still is.
            break;
    }
}

// ---- Copy-back -------------------------------------------------------------

bool isPbeWithInitVector(CK_MECHANISM_TYPE type) {
    return type >= CKM_PBE_MD2_DES_CBC && type <= CKM_PBE_SHA1_CAST5_CBC;
}
bool isSetOaep(CK_MECHANISM_TYPE type) { return type == CKM_KEY_WRAP_SET_OAEP; }
bool isSsl3MasterKeyDerive(CK_MECHANISM_TYPE type) { return type == CKM_SSL3_MASTER_KEY_DERIVE; }
bool isSsl3KeyAndMacDerive(CK_MECHANISM_TYPE type) { return type == CKM_SSL3_KEY_AND_MAC_DERIVE; }

// The native structure a copy-back reads and the Java parameter object it
// writes (a local reference in *jParam), or null when the copy-back must
// not act: a mechanism type it does not serve, a Java mechanism naming
// another type, no native parameter or one too small for Params, or a Java
// parameter that is null or of another class.
template <typename Params>
const Params* copyBackSource(JNIEnv* env, const CK_MECHANISM* ckMechanism, jobject jMechanism,
                             bool (*serves)(CK_MECHANISM_TYPE), const char* className,
                             jobject* jParam) {
    *jParam = nullptr;
    if (ckMechanism == nullptr || jMechanism == nullptr || !serves(ckMechanism->mechanism))
        return nullptr;
    ObjectFields mechanism(env, jMechanism);
    CK_MECHANISM_TYPE type = mechanism.getULong("mechanism");
    if (mechanism.failed() || type != ckMechanism->mechanism) return nullptr;
    if (ckMechanism->pParameter == nullptr || ckMechanism->ulParameterLen < sizeof(Params))
        return nullptr;
    LocalRef<jobject> parameter(env, mechanism.getObject("pParameter", "Ljava/lang/Object;"));
    if (parameter.get() == nullptr) return nullptr;
    LocalRef<jclass> cls(env, findBindingClass(env, className));
    if (cls.get() == nullptr || !env->IsInstanceOf(parameter.get(), cls.get())) return nullptr;
    *jParam = parameter.release();
    return static_cast<const Params*>(ckMechanism->pParameter);
}

// Copies bytes into a Java byte array: as many as it holds, at most limit.
void copyIntoByteArray(JNIEnv* env, jbyteArray array, const CK_BYTE* bytes, CK_ULONG limit) {
    if (array == nullptr || bytes == nullptr) return;
    jsize length = static_cast<jsize>(
        std::min<CK_ULONG>(static_cast<CK_ULONG>(env->GetArrayLength(array)), limit));
    env->SetByteArrayRegion(array, 0, length, reinterpret_cast<const jbyte*>(bytes));
}

}  // namespace

// ---- Mechanism and dispatcher ----------------------------------------------

CK_MECHANISM jMechanismToCKMechanism(JNIEnv* env, jobject jMechanism) {
    CK_MECHANISM ckMechanism{};
    VOK_LOGD("%s", "jMechanismToCKMechanism");
    if (jMechanism == nullptr) {
        vokjni::throwNullPointerException(env, "the CK_MECHANISM is null");
        return ckMechanism;
    }
    ObjectFields fields(env, jMechanism);
    ckMechanism.mechanism = fields.getULong("mechanism");
    LocalRef<jobject> jParam(env, fields.getObject("pParameter", "Ljava/lang/Object;"));
    if (fields.failed()) return ckMechanism;
    CK_VOID_PTR parameter = nullptr;
    CK_ULONG length = 0;
    jMechanismParameterToCKMechanismParameter(env, jParam.get(), &parameter, &length);
    ckMechanism.pParameter = parameter;
    ckMechanism.ulParameterLen = length;
    // Whatever was converted before the failure goes at once: the caller
    // returns to Java without a module call.
    if (env->ExceptionCheck()) freeCKMechanismParameter(&ckMechanism);
    return ckMechanism;
}

void jMechanismParameterToCKMechanismParameter(JNIEnv* env, jobject jParam,
                                               CK_VOID_PTR* ckpParamPtr, CK_ULONG_PTR ckpLength) {
    *ckpParamPtr = nullptr;
    *ckpLength = 0;
    LocalFrame frame(env, kParameterClassCount + 16);
    if (!frame.pushed()) return;
    // Every class is looked up before the first test.
    jclass byteArrayClass = env->FindClass("[B");
    jclass longClass = byteArrayClass != nullptr ? env->FindClass("java/lang/Long") : nullptr;
    jclass versionClass = longClass != nullptr ? findBindingClass(env, "CK_VERSION") : nullptr;
    if (versionClass == nullptr) return;
    jclass parameterClasses[kParameterClassCount];
    for (int i = 0; i < kParameterClassCount; ++i) {
        parameterClasses[i] = findBindingClass(env, kParameterClasses[i].name);
        if (parameterClasses[i] == nullptr) return;
    }
    VOK_LOGD("\nDEBUG: jMechanismParameterToCKMechanismParameter");
    if (jParam == nullptr) return;

    if (env->IsInstanceOf(jParam, byteArrayClass)) {
        CK_BYTE_PTR bytes = nullptr;
        jByteArrayToCKByteArray(env, static_cast<jbyteArray>(jParam), &bytes, ckpLength);
        *ckpParamPtr = bytes;
        return;
    }
    if (env->IsInstanceOf(jParam, longClass)) {
        *ckpParamPtr = jLongObjectToCKULongPtr(env, jParam);
        *ckpLength = *ckpParamPtr != nullptr ? sizeof(CK_ULONG) : 0;
        return;
    }
    if (env->IsInstanceOf(jParam, versionClass)) {
        *ckpParamPtr = jVersionToCKVersionPtr(env, jParam);
        *ckpLength = *ckpParamPtr != nullptr ? sizeof(CK_VERSION) : 0;
        return;
    }
    for (int i = 0; i < kParameterClassCount; ++i) {
        if (!env->IsInstanceOf(jParam, parameterClasses[i])) continue;
        const ParameterClass& parameterClass = kParameterClasses[i];
        void* native = allocZeroed(parameterClass.size);
        if (native == nullptr) {
            throwOutOfMemoryError(env);
            return;
        }
        parameterClass.convert(env, jParam, native);
        *ckpParamPtr = native;
        *ckpLength = parameterClass.size;
        return;
    }
    jObjectToPrimitiveCKObjectPtrPtr(env, jParam, ckpParamPtr, ckpLength);
}

void freeCKMechanismParameter(CK_MECHANISM_PTR ckMechanism) {
    if (ckMechanism == nullptr || ckMechanism->pParameter == nullptr) return;
    freeNestedBuffers(ckMechanism->mechanism,
                      ParameterBytes(ckMechanism->pParameter, ckMechanism->ulParameterLen));
    gConverterFree(ckMechanism->pParameter);
    ckMechanism->pParameter = nullptr;
    ckMechanism->ulParameterLen = 0;
}

// ---- One converter per parameter class ---------------------------------------

CK_RSA_PKCS_OAEP_PARAMS jRsaPkcsOaepParamToCKRsaPkcsOaepParam(JNIEnv* env, jobject jParam) {
    CK_RSA_PKCS_OAEP_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.hashAlg = fields.getULong("hashAlg");
    params.mgf = fields.getULong("mgf");
    params.source = fields.getULong("source");
    READ_BYTES(fields, params, pSourceData, ulSourceDataLen);
    return params;
}

CK_KEA_DERIVE_PARAMS jKeaDeriveParamToCKKeaDeriveParam(JNIEnv* env, jobject jParam) {
    CK_KEA_DERIVE_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.isSender = fields.getBBool("isSender");
    // One length serves both randoms: pRandomB's.
    params.pRandomA = fields.getBytes("pRandomA").data;
    READ_BYTES(fields, params, pRandomB, ulRandomLen);
    READ_BYTES(fields, params, pPublicData, ulPublicDataLen);
    return params;
}

CK_RC2_CBC_PARAMS jRc2CbcParamToCKRc2CbcParam(JNIEnv* env, jobject /*jParam*/) {
    LocalRef<jclass> cls(env, findBindingClass(env, "CK_RC2_CBC_PARAMS"));
    // RC2-CBC parameters have never been converted by this library: rather
    // than hand a module a structure it did not fill, it stops the process
    // here, as it always has.
    __builtin_trap();
}

CK_RC2_MAC_GENERAL_PARAMS jRc2MacGeneralParamToCKRc2MacGeneralParam(JNIEnv* env, jobject jParam) {
    CK_RC2_MAC_GENERAL_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.ulEffectiveBits = fields.getULong("ulEffectiveBits");
    params.ulMacLength = fields.getULong("ulMacLength");
    return params;
}

CK_RC5_PARAMS jRc5ParamToCKRc5Param(JNIEnv* env, jobject jParam) {
    CK_RC5_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.ulWordsize = fields.getULong("ulWordsize");
    params.ulRounds = fields.getULong("ulRounds");
    return params;
}

CK_RC5_CBC_PARAMS jRc5CbcParamToCKRc5CbcParam(JNIEnv* env, jobject jParam) {
    CK_RC5_CBC_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.ulWordsize = fields.getULong("ulWordsize");
    params.ulRounds = fields.getULong("ulRounds");
    READ_BYTES(fields, params, pIv, ulIvLen);
    return params;
}

CK_RC5_MAC_GENERAL_PARAMS jRc5MacGeneralParamToCKRc5MacGeneralParam(JNIEnv* env, jobject jParam) {
    CK_RC5_MAC_GENERAL_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.ulWordsize = fields.getULong("ulWordsize");
    params.ulRounds = fields.getULong("ulRounds");
    params.ulMacLength = fields.getULong("ulMacLength");
    return params;
}

CK_SKIPJACK_PRIVATE_WRAP_PARAMS jSkipjackPrivateWrapParamToCKSkipjackPrivateWrapParam(
    JNIEnv* env, jobject jParam) {
    CK_SKIPJACK_PRIVATE_WRAP_PARAMS params{};
    ObjectFields fields(env, jParam);
    READ_BYTES(fields, params, pPassword, ulPasswordLen);
    READ_BYTES(fields, params, pPublicData, ulPublicDataLen);
    READ_BYTES(fields, params, pRandomA, ulRandomLen);
    // P and G share one length, by definition of the mechanism: P's.
    READ_BYTES(fields, params, pPrimeP, ulPAndGLen);
    params.pBaseG = fields.getBytes("pBaseG").data;
    READ_BYTES(fields, params, pSubprimeQ, ulQLen);
    return params;
}

CK_SKIPJACK_RELAYX_PARAMS jSkipjackRelayxParamToCKSkipjackRelayxParam(JNIEnv* env, jobject jParam) {
    CK_SKIPJACK_RELAYX_PARAMS params{};
    ObjectFields fields(env, jParam);
    READ_BYTES(fields, params, pOldWrappedX, ulOldWrappedXLen);
    READ_BYTES(fields, params, pOldPassword, ulOldPasswordLen);
    READ_BYTES(fields, params, pOldPublicData, ulOldPublicDataLen);
    READ_BYTES(fields, params, pOldRandomA, ulOldRandomLen);
    READ_BYTES(fields, params, pNewPassword, ulNewPasswordLen);
    READ_BYTES(fields, params, pNewPublicData, ulNewPublicDataLen);
    READ_BYTES(fields, params, pNewRandomA, ulNewRandomLen);
    return params;
}

CK_PBE_PARAMS jPbeParamToCKPbeParam(JNIEnv* env, jobject jParam) {
    CK_PBE_PARAMS params{};
    ObjectFields fields(env, jParam);
    // The structure has no IV length: the module writes the mechanism's IV
    // size into a buffer as long as the Java pInitVector array.
    params.pInitVector = fields.getChars("pInitVector").data;
    NativeBuffer password = fields.getChars("pPassword");
    params.pPassword = password.data;
    params.ulPasswordLen = password.length;
    NativeBuffer salt = fields.getChars("pSalt");
    params.pSalt = salt.data;
    params.ulSaltLen = salt.length;
    params.ulIteration = fields.getULong("ulIteration");
    return params;
}

CK_PKCS5_PBKD2_PARAMS jPkcs5Pbkd2ParamToCKPkcs5Pbkd2Param(JNIEnv* env, jobject jParam) {
    // pPassword and ulPasswordLen stay null: the Java class carries no password.
    CK_PKCS5_PBKD2_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.saltSource = fields.getULong("saltSource");
    READ_BYTES(fields, params, pSaltSourceData, ulSaltSourceDataLen);
    params.iterations = fields.getULong("iterations");
    params.prf = fields.getULong("prf");
    READ_BYTES(fields, params, pPrfData, ulPrfDataLen);
    return params;
}

CK_KEY_DERIVATION_STRING_DATA jKeyDerivationStringDataToCKKeyDerivationStringData(JNIEnv* env,
                                                                                  jobject jParam) {
    CK_KEY_DERIVATION_STRING_DATA params{};
    ObjectFields fields(env, jParam);
    READ_BYTES(fields, params, pData, ulLen);
    return params;
}

CK_KEY_WRAP_SET_OAEP_PARAMS jKeyWrapSetOaepParamToCKKeyWrapSetOaepParam(JNIEnv* env,
                                                                        jobject jParam) {
    CK_KEY_WRAP_SET_OAEP_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.bBC = static_cast<CK_BYTE>(fields.getByte("bBC"));
    READ_BYTES(fields, params, pX, ulXLen);
    return params;
}

CK_SSL3_MASTER_KEY_DERIVE_PARAMS jSsl3MasterKeyDeriveParamToCKSsl3MasterKeyDeriveParam(
    JNIEnv* env, jobject jParam) {
    CK_SSL3_MASTER_KEY_DERIVE_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.RandomInfo = readRandomData(env, fields);
    LocalRef<jobject> jVersion(env,
                               fields.getObject("pVersion", objectSignature("CK_VERSION").c_str()));
    if (!fields.failed()) params.pVersion = jVersionToCKVersionPtr(env, jVersion.get());
    return params;
}

CK_SSL3_KEY_MAT_PARAMS jSsl3KeyMatParamToCKSsl3KeyMatParam(JNIEnv* env, jobject jParam) {
    CK_SSL3_KEY_MAT_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.ulMacSizeInBits = fields.getULong("ulMacSizeInBits");
    params.ulKeySizeInBits = fields.getULong("ulKeySizeInBits");
    params.ulIVSizeInBits = fields.getULong("ulIVSizeInBits");
    params.bIsExport = fields.getBBool("bIsExport");
    params.RandomInfo = readRandomData(env, fields);
    LocalRef<jobject> jOut(env, fields.getObject("pReturnedKeyMaterial",
                                                 objectSignature("CK_SSL3_KEY_MAT_OUT").c_str()));
    if (fields.failed()) return params;
    // The module writes the derived handles and IVs here; the IV buffers are
    // as long as the Java arrays, which tells the module how much room it has.
    auto* out = static_cast<CK_SSL3_KEY_MAT_OUT_PTR>(allocZeroed(sizeof(CK_SSL3_KEY_MAT_OUT)));
    if (out == nullptr) {
        throwOutOfMemoryError(env);
        return params;
    }
    params.pReturnedKeyMaterial = out;
    if (jOut.get() == nullptr) return params;
    ObjectFields outFields(env, jOut.get());
    out->hClientMacSecret = outFields.getULong("hClientMacSecret");
    out->hServerMacSecret = outFields.getULong("hServerMacSecret");
    out->hClientKey = outFields.getULong("hClientKey");
    out->hServerKey = outFields.getULong("hServerKey");
    out->pIVClient = outFields.getBytes("pIVClient").data;
    out->pIVServer = outFields.getBytes("pIVServer").data;
    return params;
}

CK_RSA_PKCS_PSS_PARAMS jRsaPkcsPssParamToCKRsaPkcsPssParam(JNIEnv* env, jobject jParam) {
    CK_RSA_PKCS_PSS_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.hashAlg = fields.getULong("hashAlg");
    params.mgf = fields.getULong("mgf");
    params.sLen = fields.getULong("sLen");
    return params;
}

CK_ECDH1_DERIVE_PARAMS jEcdh1DeriveParamToCKEcdh1DeriveParam(JNIEnv* env, jobject jParam) {
    CK_ECDH1_DERIVE_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.kdf = fields.getULong("kdf");
    READ_BYTES(fields, params, pSharedData, ulSharedDataLen);
    READ_BYTES(fields, params, pPublicData, ulPublicDataLen);
    return params;
}

CK_ECDH2_DERIVE_PARAMS jEcdh2DeriveParamToCKEcdh2DeriveParam(JNIEnv* env, jobject jParam) {
    CK_ECDH2_DERIVE_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.kdf = fields.getULong("kdf");
    READ_BYTES(fields, params, pSharedData, ulSharedDataLen);
    READ_BYTES(fields, params, pPublicData, ulPublicDataLen);
    params.ulPrivateDataLen = fields.getULong("ulPrivateDataLen");
    params.hPrivateData = fields.getULong("hPrivateData");
    READ_BYTES(fields, params, pPublicData2, ulPublicDataLen2);
    return params;
}

CK_X9_42_DH1_DERIVE_PARAMS jX942Dh1DeriveParamToCKX942Dh1DeriveParam(JNIEnv* env, jobject jParam) {
    CK_X9_42_DH1_DERIVE_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.kdf = fields.getULong("kdf");
    READ_BYTES(fields, params, pOtherInfo, ulOtherInfoLen);
    READ_BYTES(fields, params, pPublicData, ulPublicDataLen);
    return params;
}

CK_X9_42_DH2_DERIVE_PARAMS jX942Dh2DeriveParamToCKX942Dh2DeriveParam(JNIEnv* env, jobject jParam) {
    CK_X9_42_DH2_DERIVE_PARAMS params{};
    ObjectFields fields(env, jParam);
    params.kdf = fields.getULong("kdf");
    READ_BYTES(fields, params, pOtherInfo, ulOtherInfoLen);
    READ_BYTES(fields, params, pPublicData, ulPublicDataLen);
    params.ulPrivateDataLen = fields.getULong("ulPrivateDataLen");
    params.hPrivateData = fields.getULong("hPrivateData");
    READ_BYTES(fields, params, pPublicData2, ulPublicDataLen2);
    return params;
}

CK_DES_CBC_ENCRYPT_DATA_PARAMS jDesCbcEncryptDataParamToCKDesCbcEncryptData(JNIEnv* env,
                                                                            jobject jParam) {
    return readCbcEncryptData<CK_DES_CBC_ENCRYPT_DATA_PARAMS>(env, jParam);
}

CK_AES_CBC_ENCRYPT_DATA_PARAMS jAesCbcEncryptDataParamToCKAesCbcEncryptData(JNIEnv* env,
                                                                            jobject jParam) {
    return readCbcEncryptData<CK_AES_CBC_ENCRYPT_DATA_PARAMS>(env, jParam);
}

// ---- Copy-backs --------------------------------------------------------------

void copyBackPBEInitializationVector(JNIEnv* env, CK_MECHANISM_PTR ckMechanism,
                                     jobject jMechanism) {
    jobject jParamRef = nullptr;
    const auto* native = copyBackSource<CK_PBE_PARAMS>(
        env, ckMechanism, jMechanism, isPbeWithInitVector, "CK_PBE_PARAMS", &jParamRef);
    LocalRef<jobject> jParam(env, jParamRef);
    if (native == nullptr || native->pInitVector == nullptr) return;
    ObjectFields fields(env, jParam.get());
    // The IV comes back in "pInitVektor", not in the pInitVector it went out in.
    LocalRef<jcharArray> target(env,
                                static_cast<jcharArray>(fields.getObject("pInitVektor", "[C")));
    LocalRef<jcharArray> source(env,
                                static_cast<jcharArray>(fields.getObject("pInitVector", "[C")));
    if (fields.failed() || target.get() == nullptr) return;
    // The native buffer is as long as pInitVector: no more than that is read.
    jsize count = std::min(env->GetArrayLength(target.get()),
                           source.get() != nullptr ? env->GetArrayLength(source.get()) : 0);
    jchar* chars = env->GetCharArrayElements(target.get(), nullptr);
    if (chars == nullptr) return;
    for (jsize i = 0; i < count; ++i) chars[i] = static_cast<jchar>(native->pInitVector[i]);
    env->ReleaseCharArrayElements(target.get(), chars, 0);
}

void copyBackSetUnwrappedKey(JNIEnv* env, CK_MECHANISM_PTR ckMechanism, jobject jMechanism) {
    jobject jParamRef = nullptr;
    const auto* native = copyBackSource<CK_KEY_WRAP_SET_OAEP_PARAMS>(
        env, ckMechanism, jMechanism, isSetOaep, "CK_KEY_WRAP_SET_OAEP_PARAMS", &jParamRef);
    LocalRef<jobject> jParam(env, jParamRef);
    if (native == nullptr) return;
    ObjectFields fields(env, jParam.get());
    fields.setByte("bBC", native->bBC);
    LocalRef<jbyteArray> x(env, static_cast<jbyteArray>(fields.getObject("pX", "[B")));
    if (!fields.failed()) copyIntoByteArray(env, x.get(), native->pX, native->ulXLen);
}

void copyBackClientVersion(JNIEnv* env, CK_MECHANISM_PTR ckMechanism, jobject jMechanism) {
    jobject jParamRef = nullptr;
    const auto* native = copyBackSource<CK_SSL3_MASTER_KEY_DERIVE_PARAMS>(
        env, ckMechanism, jMechanism, isSsl3MasterKeyDerive, "CK_SSL3_MASTER_KEY_DERIVE_PARAMS",
        &jParamRef);
    LocalRef<jobject> jParam(env, jParamRef);
    if (native == nullptr || native->pVersion == nullptr) return;
    ObjectFields fields(env, jParam.get());
    LocalRef<jobject> jVersion(env,
                               fields.getObject("pVersion", objectSignature("CK_VERSION").c_str()));
    if (jVersion.get() == nullptr) return;
    ObjectFields version(env, jVersion.get());
    version.setByte("major", native->pVersion->major);
    version.setByte("minor", native->pVersion->minor);
}

void copyBackSSLKeyMatParams(JNIEnv* env, CK_MECHANISM_PTR ckMechanism, jobject jMechanism) {
    jobject jParamRef = nullptr;
    const auto* native = copyBackSource<CK_SSL3_KEY_MAT_PARAMS>(
        env, ckMechanism, jMechanism, isSsl3KeyAndMacDerive, "CK_SSL3_KEY_MAT_PARAMS", &jParamRef);
    LocalRef<jobject> jParam(env, jParamRef);
    if (native == nullptr || native->pReturnedKeyMaterial == nullptr) return;
    const CK_SSL3_KEY_MAT_OUT& out = *native->pReturnedKeyMaterial;
    ObjectFields fields(env, jParam.get());
    LocalRef<jobject> jOut(env, fields.getObject("pReturnedKeyMaterial",
                                                 objectSignature("CK_SSL3_KEY_MAT_OUT").c_str()));
    if (jOut.get() == nullptr) return;
    ObjectFields outFields(env, jOut.get());
    outFields.setLong("hClientMacSecret", out.hClientMacSecret);
    outFields.setLong("hServerMacSecret", out.hServerMacSecret);
    outFields.setLong("hClientKey", out.hClientKey);
    outFields.setLong("hServerKey", out.hServerKey);
    // The IV buffers were made as long as these very arrays.
    LocalRef<jbyteArray> ivClient(env,
                                  static_cast<jbyteArray>(outFields.getObject("pIVClient", "[B")));
    if (!outFields.failed()) copyIntoByteArray(env, ivClient.get(), out.pIVClient, CK_ULONG(-1));
    LocalRef<jbyteArray> ivServer(env,
                                  static_cast<jbyteArray>(outFields.getObject("pIVServer", "[B")));
    if (!outFields.failed()) copyIntoByteArray(env, ivServer.get(), out.pIVServer, CK_ULONG(-1));
}
