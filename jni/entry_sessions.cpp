// Native methods of the session functions: sessions, login, operation state
// and the legacy parallel-function calls.

#define LOG_TAG "[native jni pkcs11wrapper]"
#include "entry_frame.h"
#include "vok_export.h"
#include "vok_log.h"

using namespace vokjni;

VOK_C_API jlong JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1OpenSession(
    JNIEnv* env, jobject thiz, jlong jSlotID, jlong jFlags, jobject /*jApplication*/) {
    return nativeMethod<jlong>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        VOK_LOGD("DEBUG: C_OpenSession");
        VOK_LOGD(", slotID=%llu", static_cast<unsigned long long>(jSlotID));
        VOK_LOGD(" ... ");
        // The module gets neither the Java application object nor a
        // notification callback: Java code cannot be called back from here.
        CK_SESSION_HANDLE session = CK_INVALID_HANDLE;
        CK_RV rv = callModule(f->C_OpenSession, static_cast<CK_SLOT_ID>(jSlotID),
                              static_cast<CK_FLAGS>(jFlags), static_cast<CK_VOID_PTR>(nullptr),
                              static_cast<CK_NOTIFY>(nullptr), &session);
        VOK_LOGD("got session");
        VOK_LOGD(", SessionHandle=%llu", static_cast<unsigned long long>(session));
        VOK_LOGD("FINISHED\n");
        return resultOf(env, rv, [&] { return static_cast<jlong>(session); });
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1CloseSession(JNIEnv* env,
                                                                            jobject thiz,
                                                                            jlong jSession) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        resultOf(env, callModule(f->C_CloseSession, static_cast<CK_SESSION_HANDLE>(jSession)));
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1CloseAllSessions(JNIEnv* env,
                                                                                jobject thiz,
                                                                                jlong jSlotID) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        resultOf(env, callModule(f->C_CloseAllSessions, static_cast<CK_SLOT_ID>(jSlotID)));
    });
}

VOK_C_API jobject JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GetSessionInfo(JNIEnv* env,
                                                                                 jobject thiz,
                                                                                 jlong jSession) {
    return nativeMethod<jobject>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        CK_SESSION_INFO info{};
        CK_RV rv = callModule(f->C_GetSessionInfo, static_cast<CK_SESSION_HANDLE>(jSession), &info);
        return resultOf(env, rv, [&] { return ckSessionInfoPtrToJSessionInfo(env, &info); });
    });
}

VOK_C_API jbyteArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GetOperationState(
    JNIEnv* env, jobject thiz, jlong jSession) {
    return nativeMethod<jbyteArray>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        OutputBuffer<CK_BYTE> state;
        CK_ULONG length = 0;
        CK_RV rv = queryThenFetch(env, state, length, [&](CK_BYTE_PTR out, CK_ULONG_PTR len) {
            return callModule(f->C_GetOperationState, static_cast<CK_SESSION_HANDLE>(jSession), out,
                              len);
        });
        return bytesOf(env, rv, state, length);
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1SetOperationState(
    JNIEnv* env, jobject thiz, jlong jSession, jbyteArray jState, jlong jEncryptionKey,
    jlong jAuthenticationKey) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeBytes state;
        if (!state.from(env, jState)) return;
        resultOf(env, callModule(f->C_SetOperationState, static_cast<CK_SESSION_HANDLE>(jSession),
                                 state.data(), state.length(),
                                 static_cast<CK_OBJECT_HANDLE>(jEncryptionKey),
                                 static_cast<CK_OBJECT_HANDLE>(jAuthenticationKey)));
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1Login(JNIEnv* env, jobject thiz,
                                                                     jlong jSession,
                                                                     jlong jUserType,
                                                                     jcharArray jPin) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeBytes pin;
        if (!pin.from(env, jPin)) return;
        resultOf(env, callModule(f->C_Login, static_cast<CK_SESSION_HANDLE>(jSession),
                                 static_cast<CK_USER_TYPE>(jUserType), pin.data(), pin.length()));
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1Logout(JNIEnv* env, jobject thiz,
                                                                      jlong jSession) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        resultOf(env, callModule(f->C_Logout, static_cast<CK_SESSION_HANDLE>(jSession)));
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GetFunctionStatus(JNIEnv* env,
                                                                                 jobject thiz,
                                                                                 jlong jSession) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        resultOf(env, callModule(f->C_GetFunctionStatus, static_cast<CK_SESSION_HANDLE>(jSession)));
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1CancelFunction(JNIEnv* env,
                                                                              jobject thiz,
                                                                              jlong jSession) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        resultOf(env, callModule(f->C_CancelFunction, static_cast<CK_SESSION_HANDLE>(jSession)));
    });
}
