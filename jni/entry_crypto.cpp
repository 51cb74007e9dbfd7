// Native methods of encryption, decryption, digests, signatures and their
// verification, and of the dual-function updates.

#define LOG_TAG "[native jni pkcs11wrapper]"
#include "entry_frame.h"
#include "vok_export.h"
#include "vok_log.h"

using namespace vokjni;

namespace {

// Fixed output sizes of the single-part calls, kept from the system's first
// release: C_Encrypt makes one call into 260 bytes, C_Digest into 65, C_Sign
// tries 512 bytes first and asks once more with the length the module names.
constexpr CK_ULONG kEncryptOutputSize = 260;
constexpr CK_ULONG kDigestOutputSize = 65;
constexpr CK_ULONG kSignFirstOutputSize = 512;

// Each helper below takes `entry`, a function that picks the module's entry
// point from the list (read straight from the packed list).

// The Init calls: a mechanism and a key.
template <typename Entry>
void initWithKey(JNIEnv* env, jobject thiz, const char* name, jlong jSession, jobject jMechanism,
                 jlong jKey, Entry entry) {
    nativeMethod<void>(env, thiz, name, [&](CK_FUNCTION_LIST_PTR f) {
        NativeMechanism mechanism;
        if (!mechanism.from(env, jMechanism)) return;
        resultOf(env, callModule(entry(f), static_cast<CK_SESSION_HANDLE>(jSession),
                                 mechanism.get(), static_cast<CK_OBJECT_HANDLE>(jKey)));
    });
}

// Updates, recovering calls and dual-function updates: input in, output of
// the length the module asks for out.
template <typename Entry>
jbyteArray transformed(JNIEnv* env, jobject thiz, const char* name, jlong jSession,
                       jbyteArray jInput, Entry entry) {
    return nativeMethod<jbyteArray>(env, thiz, name, [&](CK_FUNCTION_LIST_PTR f) {
        NativeBytes input;
        if (!input.from(env, jInput)) return jbyteArray(nullptr);
        OutputBuffer<CK_BYTE> output;
        CK_ULONG length = 0;
        CK_RV rv = queryThenFetch(env, output, length, [&](CK_BYTE_PTR out, CK_ULONG_PTR len) {
            return callModule(entry(f), static_cast<CK_SESSION_HANDLE>(jSession), input.data(),
                              input.length(), out, len);
        });
        return bytesOf(env, rv, output, length);
    });
}

// The finals: output of the length the module asks for.
template <typename Entry>
jbyteArray finalOutput(JNIEnv* env, jobject thiz, const char* name, jlong jSession, Entry entry) {
    return nativeMethod<jbyteArray>(env, thiz, name, [&](CK_FUNCTION_LIST_PTR f) {
        OutputBuffer<CK_BYTE> output;
        CK_ULONG length = 0;
        CK_RV rv = queryThenFetch(env, output, length, [&](CK_BYTE_PTR out, CK_ULONG_PTR len) {
            return callModule(entry(f), static_cast<CK_SESSION_HANDLE>(jSession), out, len);
        });
        return bytesOf(env, rv, output, length);
    });
}

// Input-only calls: the multi-part updates without output, C_VerifyFinal.
template <typename Entry>
void inputOnly(JNIEnv* env, jobject thiz, const char* name, jlong jSession, jbyteArray jInput,
               Entry entry) {
    nativeMethod<void>(env, thiz, name, [&](CK_FUNCTION_LIST_PTR f) {
        NativeBytes input;
        if (!input.from(env, jInput)) return;
        resultOf(env, callModule(entry(f), static_cast<CK_SESSION_HANDLE>(jSession), input.data(),
                                 input.length()));
    });
}

}  // namespace

// ---- Init calls ----------------------------------------------------------------

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1EncryptInit(
    JNIEnv* env, jobject thiz, jlong jSession, jobject jMechanism, jlong jKey) {
    initWithKey(env, thiz, __func__, jSession, jMechanism, jKey,
                [](CK_FUNCTION_LIST_PTR f) { return f->C_EncryptInit; });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1DecryptInit(
    JNIEnv* env, jobject thiz, jlong jSession, jobject jMechanism, jlong jKey) {
    initWithKey(env, thiz, __func__, jSession, jMechanism, jKey,
                [](CK_FUNCTION_LIST_PTR f) { return f->C_DecryptInit; });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1SignInit(JNIEnv* env, jobject thiz,
                                                                        jlong jSession,
                                                                        jobject jMechanism,
                                                                        jlong jKey) {
    initWithKey(env, thiz, __func__, jSession, jMechanism, jKey,
                [](CK_FUNCTION_LIST_PTR f) { return f->C_SignInit; });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1SignRecoverInit(
    JNIEnv* env, jobject thiz, jlong jSession, jobject jMechanism, jlong jKey) {
    initWithKey(env, thiz, __func__, jSession, jMechanism, jKey,
                [](CK_FUNCTION_LIST_PTR f) { return f->C_SignRecoverInit; });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1VerifyInit(JNIEnv* env, jobject thiz,
                                                                          jlong jSession,
                                                                          jobject jMechanism,
                                                                          jlong jKey) {
    initWithKey(env, thiz, __func__, jSession, jMechanism, jKey,
                [](CK_FUNCTION_LIST_PTR f) { return f->C_VerifyInit; });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1VerifyRecoverInit(
    JNIEnv* env, jobject thiz, jlong jSession, jobject jMechanism, jlong jKey) {
    initWithKey(env, thiz, __func__, jSession, jMechanism, jKey,
                [](CK_FUNCTION_LIST_PTR f) { return f->C_VerifyRecoverInit; });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1DigestInit(JNIEnv* env, jobject thiz,
                                                                          jlong jSession,
                                                                          jobject jMechanism) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeMechanism mechanism;
        if (!mechanism.from(env, jMechanism)) return;
        const CK_MECHANISM& m = *mechanism.get();
        VOK_LOGD(" ckMechanism.mechanism :%llu", static_cast<unsigned long long>(m.mechanism));
        VOK_LOGD("ckMechanism.pParameter: %p", m.pParameter);
        VOK_LOGD("ckMechanism.ulParameterLen:%llu",
                 static_cast<unsigned long long>(m.ulParameterLen));
        resultOf(env, callModule(f->C_DigestInit, static_cast<CK_SESSION_HANDLE>(jSession),
                                 mechanism.get()));
    });
}

// ---- Single-part calls ---------------------------------------------------------

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1Encrypt(JNIEnv* env,
                                                                             jobject thiz,
                                                                             jlong jSession,
                                                                             jbyteArray jData) {
    return nativeMethod<jbyteArray>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeBytes data;
        OutputBuffer<CK_BYTE> encrypted;
        if (!data.from(env, jData) || !encrypted.allocate(env, kEncryptOutputSize))
            return jbyteArray(nullptr);
        CK_ULONG length = encrypted.capacity();
        CK_RV rv = callModule(f->C_Encrypt, static_cast<CK_SESSION_HANDLE>(jSession), data.data(),
                              data.length(), encrypted.data(), &length);
        return bytesOf(env, withinCapacity(rv, length, encrypted.capacity()), encrypted, length);
    });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1Decrypt(
    JNIEnv* env, jobject thiz, jlong jSession, jbyteArray jEncryptedData) {
    return nativeMethod<jbyteArray>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeBytes encrypted;
        if (!encrypted.from(env, jEncryptedData)) return jbyteArray(nullptr);
        VOK_LOGD("ckDataLength:%llu", static_cast<unsigned long long>(encrypted.length()));
        OutputBuffer<CK_BYTE> data;
        CK_ULONG length = 0;
        CK_RV rv = queryThenFetch(env, data, length, [&](CK_BYTE_PTR out, CK_ULONG_PTR len) {
            return callModule(f->C_Decrypt, static_cast<CK_SESSION_HANDLE>(jSession),
                              encrypted.data(), encrypted.length(), out, len);
        });
        return bytesOf(env, rv, data, length);
    });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1Digest(JNIEnv* env,
                                                                            jobject thiz,
                                                                            jlong jSession,
                                                                            jbyteArray jData) {
    MethodRules rules;
    rules.nameTag = "%s";  // the name line's tag has always been the format; kept
    return nativeMethod<jbyteArray>(
        env, thiz, __func__,
        [&](CK_FUNCTION_LIST_PTR f) {
            NativeBytes data;
            OutputBuffer<CK_BYTE> digest;
            if (!data.from(env, jData) || !digest.allocate(env, kDigestOutputSize))
                return jbyteArray(nullptr);
            VOK_LOGD("date to digest length:%llu", static_cast<unsigned long long>(data.length()));
            VOK_LOGD("date to digest:%s", boundedText(data.data(), data.length()).c_str());
            CK_ULONG length = digest.capacity();
            CK_RV rv = callModule(f->C_Digest, static_cast<CK_SESSION_HANDLE>(jSession),
                                  data.data(), data.length(), digest.data(), &length);
            rv = withinCapacity(rv, length, digest.capacity());
            VOK_LOGD("ckDigestLength:%llu", static_cast<unsigned long long>(length));
            VOK_LOGD("digest:%s", boundedText(digest.data(), digest.capacity()).c_str());
            jbyteArray result = bytesOf(env, rv, digest, length);
            if (result == nullptr) VOK_LOGD("jDigest is null");
            return result;
        },
        rules);
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1Sign(JNIEnv* env, jobject thiz,
                                                                          jlong jSession,
                                                                          jbyteArray jData) {
    return nativeMethod<jbyteArray>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeBytes data;
        OutputBuffer<CK_BYTE> signature;
        if (!data.from(env, jData) || !signature.allocate(env, kSignFirstOutputSize))
            return jbyteArray(nullptr);
        auto sign = [&](CK_ULONG_PTR length) {
            return callModule(f->C_Sign, static_cast<CK_SESSION_HANDLE>(jSession), data.data(),
                              data.length(), signature.data(), length);
        };
        CK_ULONG length = signature.capacity();
        CK_RV rv = sign(&length);
        if (rv == CKR_BUFFER_TOO_SMALL) {
            if (!signature.allocate(env, length)) return jbyteArray(nullptr);
            length = signature.capacity();
            rv = sign(&length);
        }
        return bytesOf(env, withinCapacity(rv, length, signature.capacity()), signature, length);
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1Verify(JNIEnv* env, jobject thiz,
                                                                      jlong jSession,
                                                                      jbyteArray jData,
                                                                      jbyteArray jSignature) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeBytes data, signature;
        if (!data.from(env, jData) || !signature.from(env, jSignature)) return;
        resultOf(env, callModule(f->C_Verify, static_cast<CK_SESSION_HANDLE>(jSession), data.data(),
                                 data.length(), signature.data(), signature.length()));
    });
}

// ---- Multi-part calls ----------------------------------------------------------

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1EncryptUpdate(
    JNIEnv* env, jobject thiz, jlong jSession, jbyteArray jPart) {
    return transformed(env, thiz, __func__, jSession, jPart,
                       [](CK_FUNCTION_LIST_PTR f) { return f->C_EncryptUpdate; });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1DecryptUpdate(
    JNIEnv* env, jobject thiz, jlong jSession, jbyteArray jEncryptedPart) {
    return transformed(env, thiz, __func__, jSession, jEncryptedPart,
                       [](CK_FUNCTION_LIST_PTR f) { return f->C_DecryptUpdate; });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1SignRecover(JNIEnv* env,
                                                                                 jobject thiz,
                                                                                 jlong jSession,
                                                                                 jbyteArray jData) {
    return transformed(env, thiz, __func__, jSession, jData,
                       [](CK_FUNCTION_LIST_PTR f) { return f->C_SignRecover; });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1VerifyRecover(
    JNIEnv* env, jobject thiz, jlong jSession, jbyteArray jSignature) {
    return transformed(env, thiz, __func__, jSession, jSignature,
                       [](CK_FUNCTION_LIST_PTR f) { return f->C_VerifyRecover; });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1DigestEncryptUpdate(
    JNIEnv* env, jobject thiz, jlong jSession, jbyteArray jPart) {
    return transformed(env, thiz, __func__, jSession, jPart,
                       [](CK_FUNCTION_LIST_PTR f) { return f->C_DigestEncryptUpdate; });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1DecryptDigestUpdate(
    JNIEnv* env, jobject thiz, jlong jSession, jbyteArray jEncryptedPart) {
    return transformed(env, thiz, __func__, jSession, jEncryptedPart,
                       [](CK_FUNCTION_LIST_PTR f) { return f->C_DecryptDigestUpdate; });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1SignEncryptUpdate(
    JNIEnv* env, jobject thiz, jlong jSession, jbyteArray jPart) {
    return transformed(env, thiz, __func__, jSession, jPart,
                       [](CK_FUNCTION_LIST_PTR f) { return f->C_SignEncryptUpdate; });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1DecryptVerifyUpdate(
    JNIEnv* env, jobject thiz, jlong jSession, jbyteArray jEncryptedPart) {
    return transformed(env, thiz, __func__, jSession, jEncryptedPart,
                       [](CK_FUNCTION_LIST_PTR f) { return f->C_DecryptVerifyUpdate; });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1EncryptFinal(JNIEnv* env,
                                                                                  jobject thiz,
                                                                                  jlong jSession) {
    return finalOutput(env, thiz, __func__, jSession,
                       [](CK_FUNCTION_LIST_PTR f) { return f->C_EncryptFinal; });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1DecryptFinal(JNIEnv* env,
                                                                                  jobject thiz,
                                                                                  jlong jSession) {
    return finalOutput(env, thiz, __func__, jSession,
                       [](CK_FUNCTION_LIST_PTR f) { return f->C_DecryptFinal; });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1DigestFinal(JNIEnv* env,
                                                                                 jobject thiz,
                                                                                 jlong jSession) {
    return finalOutput(env, thiz, __func__, jSession,
                       [](CK_FUNCTION_LIST_PTR f) { return f->C_DigestFinal; });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1SignFinal(JNIEnv* env,
                                                                               jobject thiz,
                                                                               jlong jSession) {
    return finalOutput(env, thiz, __func__, jSession,
                       [](CK_FUNCTION_LIST_PTR f) { return f->C_SignFinal; });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1DigestUpdate(JNIEnv* env,
                                                                            jobject thiz,
                                                                            jlong jSession,
                                                                            jbyteArray jPart) {
    inputOnly(env, thiz, __func__, jSession, jPart,
              [](CK_FUNCTION_LIST_PTR f) { return f->C_DigestUpdate; });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1SignUpdate(JNIEnv* env, jobject thiz,
                                                                          jlong jSession,
                                                                          jbyteArray jPart) {
    inputOnly(env, thiz, __func__, jSession, jPart,
              [](CK_FUNCTION_LIST_PTR f) { return f->C_SignUpdate; });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1VerifyUpdate(JNIEnv* env,
                                                                            jobject thiz,
                                                                            jlong jSession,
                                                                            jbyteArray jPart) {
    inputOnly(env, thiz, __func__, jSession, jPart,
              [](CK_FUNCTION_LIST_PTR f) { return f->C_VerifyUpdate; });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1VerifyFinal(JNIEnv* env,
                                                                           jobject thiz,
                                                                           jlong jSession,
                                                                           jbyteArray jSignature) {
    inputOnly(env, thiz, __func__, jSession, jSignature,
              [](CK_FUNCTION_LIST_PTR f) { return f->C_VerifyFinal; });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1DigestKey(JNIEnv* env, jobject thiz,
                                                                         jlong jSession,
                                                                         jlong jKey) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        resultOf(env, callModule(f->C_DigestKey, static_cast<CK_SESSION_HANDLE>(jSession),
                                 static_cast<CK_OBJECT_HANDLE>(jKey)));
    });
}
