// Native methods of key generation, wrapping, unwrapping and derivation, and
// of the random-number functions.

#define LOG_TAG "[native jni pkcs11wrapper]"
#include "entry_frame.h"
#include "vok_export.h"
#include "vok_log.h"

using namespace vokjni;

VOK_C_API jlong JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GenerateKey(
    JNIEnv* env, jobject thiz, jlong jSession, jobject jMechanism, jobjectArray jTemplate) {
    return nativeMethod<jlong>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeMechanism mechanism;
        NativeTemplate attributes;
        if (!mechanism.from(env, jMechanism) || !attributes.from(env, jTemplate)) return jlong(0);
        CK_OBJECT_HANDLE key = CK_INVALID_HANDLE;
        CK_RV rv = callModule(f->C_GenerateKey, static_cast<CK_SESSION_HANDLE>(jSession),
                              mechanism.get(), attributes.data(), attributes.count(), &key);
        // The PBE mechanisms hand back their IV, whatever the result.
        copyBackPBEInitializationVector(env, mechanism.get(), jMechanism);
        return resultOf(env, rv, [&] { return static_cast<jlong>(key); });
    });
}

VOK_C_API jlongArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GenerateKeyPair(
    JNIEnv* env, jobject thiz, jlong jSession, jobject jMechanism, jobjectArray jPublicKeyTemplate,
    jobjectArray jPrivateKeyTemplate) {
    return nativeMethod<jlongArray>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeMechanism mechanism;
        NativeTemplate publicTemplate, privateTemplate;
        if (!mechanism.from(env, jMechanism) || !publicTemplate.from(env, jPublicKeyTemplate) ||
            !privateTemplate.from(env, jPrivateKeyTemplate))
            return jlongArray(nullptr);
        CK_OBJECT_HANDLE keys[2] = {CK_INVALID_HANDLE, CK_INVALID_HANDLE};  // public, private
        CK_RV rv = callModule(f->C_GenerateKeyPair, static_cast<CK_SESSION_HANDLE>(jSession),
                              mechanism.get(), publicTemplate.data(), publicTemplate.count(),
                              privateTemplate.data(), privateTemplate.count(), &keys[0], &keys[1]);
        return resultOf(env, rv, [&] { return ckULongArrayToJLongArray(env, keys, 2); });
    });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1WrapKey(
    JNIEnv* env, jobject thiz, jlong jSession, jobject jMechanism, jlong jWrappingKey, jlong jKey) {
    return nativeMethod<jbyteArray>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeMechanism mechanism;
        if (!mechanism.from(env, jMechanism)) return jbyteArray(nullptr);
        OutputBuffer<CK_BYTE> wrapped;
        CK_ULONG length = 0;
        CK_RV rv = queryThenFetch(env, wrapped, length, [&](CK_BYTE_PTR out, CK_ULONG_PTR len) {
            return callModule(f->C_WrapKey, static_cast<CK_SESSION_HANDLE>(jSession),
                              mechanism.get(), static_cast<CK_OBJECT_HANDLE>(jWrappingKey),
                              static_cast<CK_OBJECT_HANDLE>(jKey), out, len);
        });
        return bytesOf(env, rv, wrapped, length);
    });
}

VOK_C_API jlong JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1UnwrapKey(
    JNIEnv* env, jobject thiz, jlong jSession, jobject jMechanism, jlong jUnwrappingKey,
    jbyteArray jWrappedKey, jobjectArray jTemplate) {
    return nativeMethod<jlong>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeMechanism mechanism;
        NativeBytes wrapped;
        NativeTemplate attributes;
        if (!mechanism.from(env, jMechanism) || !wrapped.from(env, jWrappedKey) ||
            !attributes.from(env, jTemplate))
            return jlong(0);
        CK_OBJECT_HANDLE key = CK_INVALID_HANDLE;
        CK_RV rv =
            callModule(f->C_UnwrapKey, static_cast<CK_SESSION_HANDLE>(jSession), mechanism.get(),
                       static_cast<CK_OBJECT_HANDLE>(jUnwrappingKey), wrapped.data(),
                       wrapped.length(), attributes.data(), attributes.count(), &key);
        copyBackSetUnwrappedKey(env, mechanism.get(), jMechanism);
        return resultOf(env, rv, [&] { return static_cast<jlong>(key); });
    });
}

VOK_C_API jlong JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1DeriveKey(JNIEnv* env, jobject thiz,
                                                                          jlong jSession,
                                                                          jobject jMechanism,
                                                                          jlong jBaseKey,
                                                                          jobjectArray jTemplate) {
    return nativeMethod<jlong>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeMechanism mechanism;
        NativeTemplate attributes;
        if (!mechanism.from(env, jMechanism) || !attributes.from(env, jTemplate)) return jlong(0);
        CK_OBJECT_HANDLE key = CK_INVALID_HANDLE;
        CK_RV rv = callModule(f->C_DeriveKey, static_cast<CK_SESSION_HANDLE>(jSession),
                              mechanism.get(), static_cast<CK_OBJECT_HANDLE>(jBaseKey),
                              attributes.data(), attributes.count(), &key);
        copyBackClientVersion(env, mechanism.get(), jMechanism);
        if (!env->ExceptionCheck()) copyBackSSLKeyMatParams(env, mechanism.get(), jMechanism);
        return resultOf(env, rv, [&] { return static_cast<jlong>(key); });
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1SeedRandom(JNIEnv* env, jobject thiz,
                                                                          jlong jSession,
                                                                          jbyteArray jSeed) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeBytes seed;
        if (!seed.from(env, jSeed)) return;
        resultOf(env, callModule(f->C_SeedRandom, static_cast<CK_SESSION_HANDLE>(jSession),
                                 seed.data(), seed.length()));
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GenerateRandom(
    JNIEnv* env, jobject thiz, jlong jSession, jbyteArray jRandomData) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        const jsize size = jRandomData != nullptr ? env->GetArrayLength(jRandomData) : 0;
        VOK_LOGD("jRandomDataSize: %ld ", static_cast<long>(size));
        OutputBuffer<CK_BYTE> random;
        if (jRandomData != nullptr && !random.allocate(env, static_cast<CK_ULONG>(size))) return;
        VOK_LOGD("jRandomBufferLength: %ld ", static_cast<long>(random.capacity()));
        CK_RV rv = callModule(f->C_GenerateRandom, static_cast<CK_SESSION_HANDLE>(jSession),
                              random.data(), random.capacity());
        VOK_LOGD("jRandomDataSize:%ld  ", static_cast<long>(size));
        for (CK_ULONG i = 0; i < random.capacity(); ++i)
            VOK_LOGD("%X", static_cast<unsigned>(random.data()[i]));
        if (rv == CKR_OK && jRandomData != nullptr)
            env->SetByteArrayRegion(jRandomData, 0, size,
                                    reinterpret_cast<const jbyte*>(random.data()));
        resultOf(env, rv);
    });
}
