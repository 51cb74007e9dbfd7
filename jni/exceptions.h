#ifndef VOK_JNI_EXCEPTIONS_H
#define VOK_JNI_EXCEPTIONS_H

#include <jni.h>

#include "vok_pkcs11.h"

// Each helper leaves a Java exception pending and returns; the caller must
// return to Java without further JNI calls. When the exception cannot even be
// built, the failure's own exception (for example NoClassDefFoundError) is
// the one left pending.

// Throws PKCS11Exception carrying returnValue unless it is CKR_OK; returns it either way.
CK_RV ckAssertReturnValueOK(JNIEnv* env, CK_RV returnValue);
void throwDisconnectedRuntimeException(JNIEnv* env);
void throwOutOfMemoryError(JNIEnv* env);
void throwIOException(JNIEnv* env, const char* message);
// message is zero-terminated UTF-16; NULL gives an empty message.
void throwIOExceptionUnicodeMessage(JNIEnv* env, const jchar* message);
void throwFileNotFoundException(JNIEnv* env, jstring message);
// A NULL message uses the exception's no-argument constructor.
void throwPKCS11RuntimeException(JNIEnv* env, jstring message);

#endif
