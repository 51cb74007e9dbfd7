// Native methods of the general, slot and token functions.

#define LOG_TAG "[native jni pkcs11wrapper]"
#include <cstring>

#include "entry_frame.h"
#include "vok_export.h"
#include "vok_log.h"

using namespace vokjni;

namespace {

// C_InitToken's label is 32 blank-padded bytes that the module reads whole:
// a shorter Java label is padded, so that nothing is read past it.
constexpr CK_ULONG kLabelSize = 32;

bool padLabel(JNIEnv* env, NativeBytes& label) {
    if (label.data() == nullptr || label.length() >= kLabelSize) return true;
    auto* padded = static_cast<CK_BYTE_PTR>(gConverterAlloc(kLabelSize + 1));
    if (padded == nullptr) {
        throwOutOfMemoryError(env);
        return false;
    }
    std::memset(padded, ' ', kLabelSize);
    std::memcpy(padded, label.data(), label.length());
    padded[kLabelSize] = 0;  // and a reader of a C string stops behind it
    label.adopt(padded, kLabelSize);
    return true;
}

// Slot and mechanism lists: the count with a null list, then the list.
template <typename Call>
jlongArray listOf(JNIEnv* env, Call call) {
    OutputBuffer<CK_ULONG> list;
    CK_ULONG count = 0;
    CK_RV rv = queryThenFetch(env, list, count, call);
    return resultOf(env, rv, [&] { return ckULongArrayToJLongArray(env, list.data(), count); });
}

}  // namespace

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1Initialize(JNIEnv* env, jobject thiz,
                                                                          jobject jInitArgs) {
    MethodRules rules;
    rules.afterName = "DEBUG: initializing module... ";
    rules.missingEntryLines = 2;
    rules.listMayBeMissing = true;
    const char* const self = __func__;
    nativeMethod<void>(
        env, thiz, self,
        [&](CK_FUNCTION_LIST_PTR f) {
            CK_C_INITIALIZE_ARGS_PTR args = nullptr;
            if (jInitArgs != nullptr) {
                args = makeCKInitArgsAdapter(env, jInitArgs);
                if (args == nullptr) return;
            }
            CK_RV rv = CKR_OK;
            if (f == nullptr) {
                // Nothing to initialise counts as done.
                VOK_LOGD("ckpFunctions is null %s", self);
            } else {
                VOK_LOGD("C_Initilize from function ptr addr %p",
                         reinterpret_cast<void*>(f->C_Initialize));
                rv = callModule(f->C_Initialize, static_cast<CK_VOID_PTR>(args));
                VOK_LOGD("C_init Call completed");
            }
            freeCKInitArgsAdapter(args);
            resultOf(env, rv);
        },
        rules);
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1Finalize(JNIEnv* env, jobject thiz,
                                                                        jlong jReserved) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        // The Java value is the reserved pointer itself.
        resultOf(env, callModule(f->C_Finalize, reinterpret_cast<CK_VOID_PTR>(jReserved)));
    });
}

VOK_C_API jobject JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GetInfo(JNIEnv* env,
                                                                          jobject thiz) {
    return nativeMethod<jobject>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        CK_INFO info{};
        CK_RV rv = callModule(f->C_GetInfo, &info);
        return resultOf(env, rv, [&] { return ckInfoPtrToJInfo(env, &info); });
    });
}

VOK_C_API jlongArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GetSlotList(
    JNIEnv* env, jobject thiz, jboolean jTokenPresent) {
    return nativeMethod<jlongArray>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        const CK_BBOOL present = jTokenPresent == JNI_TRUE ? CK_TRUE : CK_FALSE;
        return listOf(env, [&](CK_SLOT_ID_PTR list, CK_ULONG_PTR count) {
            return callModule(f->C_GetSlotList, present, list, count);
        });
    });
}

VOK_C_API jobject JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GetSlotInfo(JNIEnv* env,
                                                                              jobject thiz,
                                                                              jlong jSlotID) {
    return nativeMethod<jobject>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        CK_SLOT_INFO info{};
        CK_RV rv = callModule(f->C_GetSlotInfo, static_cast<CK_SLOT_ID>(jSlotID), &info);
        return resultOf(env, rv, [&] { return ckSlotInfoPtrToJSlotInfo(env, &info); });
    });
}

VOK_C_API jobject JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GetTokenInfo(JNIEnv* env,
                                                                               jobject thiz,
                                                                               jlong jSlotID) {
    return nativeMethod<jobject>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        CK_TOKEN_INFO info{};
        CK_RV rv = callModule(f->C_GetTokenInfo, static_cast<CK_SLOT_ID>(jSlotID), &info);
        return resultOf(env, rv, [&] { return ckTokenInfoPtrToJTokenInfo(env, &info); });
    });
}

VOK_C_API jlongArray JNICALL
Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GetMechanismList(JNIEnv* env, jobject thiz, jlong jSlotID) {
    return nativeMethod<jlongArray>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        return listOf(env, [&](CK_MECHANISM_TYPE_PTR list, CK_ULONG_PTR count) {
            return callModule(f->C_GetMechanismList, static_cast<CK_SLOT_ID>(jSlotID), list, count);
        });
    });
}

VOK_C_API jobject JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GetMechanismInfo(JNIEnv* env,
                                                                                   jobject thiz,
                                                                                   jlong jSlotID,
                                                                                   jlong jType) {
    return nativeMethod<jobject>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        CK_MECHANISM_INFO info{};
        CK_RV rv = callModule(f->C_GetMechanismInfo, static_cast<CK_SLOT_ID>(jSlotID),
                              static_cast<CK_MECHANISM_TYPE>(jType), &info);
        return resultOf(env, rv, [&] { return ckMechanismInfoPtrToJMechanismInfo(env, &info); });
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1InitToken(JNIEnv* env, jobject thiz,
                                                                         jlong jSlotID,
                                                                         jcharArray jPin,
                                                                         jcharArray jLabel) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeBytes pin, label;
        if (!pin.from(env, jPin) || !label.from(env, jLabel) || !padLabel(env, label)) return;
        CK_RV rv = callModule(f->C_InitToken, static_cast<CK_SLOT_ID>(jSlotID), pin.data(),
                              pin.length(), label.data());
        VOK_LOGD("InitToken return code: %llu", static_cast<unsigned long long>(rv));
        resultOf(env, rv);
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1InitPIN(JNIEnv* env, jobject thiz,
                                                                       jlong jSession,
                                                                       jcharArray jPin) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeBytes pin;
        if (!pin.from(env, jPin)) return;
        resultOf(env, callModule(f->C_InitPIN, static_cast<CK_SESSION_HANDLE>(jSession), pin.data(),
                                 pin.length()));
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1SetPIN(JNIEnv* env, jobject thiz,
                                                                      jlong jSession,
                                                                      jcharArray jOldPin,
                                                                      jcharArray jNewPin) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeBytes oldPin, newPin;
        if (!oldPin.from(env, jOldPin) || !newPin.from(env, jNewPin)) return;
        resultOf(env, callModule(f->C_SetPIN, static_cast<CK_SESSION_HANDLE>(jSession),
                                 oldPin.data(), oldPin.length(), newPin.data(), newPin.length()));
    });
}

VOK_C_API jlong JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1WaitForSlotEvent(JNIEnv* env,
                                                                                 jobject thiz,
                                                                                 jlong jFlags,
                                                                                 jlong jReserved) {
    return nativeMethod<jlong>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        CK_SLOT_ID slot = 0;
        CK_RV rv = callModule(f->C_WaitForSlotEvent, static_cast<CK_FLAGS>(jFlags), &slot,
                              reinterpret_cast<CK_VOID_PTR>(jReserved));
        return resultOf(env, rv, [&] { return static_cast<jlong>(slot); });
    });
}
