#include "exceptions.h"

namespace {

constexpr const char* kPkcs11Exception = "com/vok/smartcard/pkcs11/PKCS11Exception";
constexpr const char* kPkcs11RuntimeException = "com/vok/smartcard/pkcs11/PKCS11RuntimeException";
constexpr const char* kStringConstructor = "(Ljava/lang/String;)V";
constexpr const char* kDisconnectedMessage = "This object is not connected to a module.";

// Builds className through the constructor of the given signature and raises
// it with Throw. Any failed step leaves its own exception pending instead.
template <typename... Args>
void constructAndThrow(JNIEnv* env, const char* className, const char* signature, Args... args) {
    jclass exceptionClass = env->FindClass(className);
    if (exceptionClass == nullptr) return;
    jmethodID constructor = env->GetMethodID(exceptionClass, "<init>", signature);
    if (constructor != nullptr) {
        auto exception =
            static_cast<jthrowable>(env->NewObject(exceptionClass, constructor, args...));
        if (!env->ExceptionCheck() && exception != nullptr) env->Throw(exception);
        if (exception != nullptr) env->DeleteLocalRef(exception);
    }
    env->DeleteLocalRef(exceptionClass);
}

jsize utf16Length(const jchar* text) {
    jsize length = 0;
    if (text != nullptr)
        while (text[length] != 0) ++length;
    return length;
}

}  // namespace

CK_RV ckAssertReturnValueOK(JNIEnv* env, CK_RV returnValue) {
    if (returnValue != CKR_OK)
        constructAndThrow(env, kPkcs11Exception, "(J)V", static_cast<jlong>(returnValue));
    return returnValue;
}

void throwDisconnectedRuntimeException(JNIEnv* env) {
    jstring message = env->NewStringUTF(kDisconnectedMessage);
    if (message == nullptr) return;
    throwPKCS11RuntimeException(env, message);
    env->DeleteLocalRef(message);
}

void throwOutOfMemoryError(JNIEnv* env) {
    constructAndThrow(env, "java/lang/OutOfMemoryError", "()V");
}

void throwIOException(JNIEnv* env, const char* message) {
    jclass exceptionClass = env->FindClass("java/io/IOException");
    if (exceptionClass == nullptr) return;
    env->ThrowNew(exceptionClass, message);
    env->DeleteLocalRef(exceptionClass);
}

void throwIOExceptionUnicodeMessage(JNIEnv* env, const jchar* message) {
    static const jchar kEmpty[] = {0};
    jstring text = env->NewString(message != nullptr ? message : kEmpty, utf16Length(message));
    if (text == nullptr) return;
    constructAndThrow(env, "java/io/IOException", kStringConstructor, text);
    env->DeleteLocalRef(text);
}

void throwFileNotFoundException(JNIEnv* env, jstring message) {
    constructAndThrow(env, "java/io/FileNotFoundException", kStringConstructor, message);
}

void throwPKCS11RuntimeException(JNIEnv* env, jstring message) {
    if (message == nullptr)
        constructAndThrow(env, kPkcs11RuntimeException, "()V");
    else
        constructAndThrow(env, kPkcs11RuntimeException, kStringConstructor, message);
}
