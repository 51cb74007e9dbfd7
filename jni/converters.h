#ifndef VOK_JNI_CONVERTERS_H
#define VOK_JNI_CONVERTERS_H

// Conversions between the Java binding's objects and PKCS#11 structures, in
// both directions, and of mechanism parameters.
//
// Rules every converter keeps, so that a native method can call them in a row:
// - Failure leaves a Java exception pending; the caller then returns to Java
//   without further JNI calls (env->ExceptionCheck() tells). Outputs are then
//   null / 0 and there is nothing to free, unless a function says otherwise.
// - Native buffers made from Java data come from gConverterAlloc and belong to
//   the caller, who releases them with gConverterFree or the free functions
//   below, after the PKCS#11 call.
// - Java objects made from native data are local references of the caller.
// - Nothing is cached: classes, fields and methods are looked up on each call,
//   so a converter works whatever class loader the calling method has.

#include <jni.h>

#include <cstddef>

#include "vok_export.h"
#include "vok_pkcs11.h"

// Results of the array and string converters. On a failed allocation a
// java.lang.OutOfMemoryError is pending and the outputs are null / 0.
enum : int {
    CK_CONVERSION_OK = 0,
    CK_CONVERSION_FIRST_ALLOCATION_FAILED = 1,
    CK_CONVERSION_SECOND_ALLOCATION_FAILED = 2,
};

// The allocator behind every native buffer the converters make (std::malloc
// and std::free); tests swap them to count buffers and to fail allocations.
extern void* (*gConverterAlloc)(std::size_t size);
extern void (*gConverterFree)(void* pointer);

// ---- Java to native: arrays and strings (status results) -----------------

// A null Java array or string gives CK_CONVERSION_OK with null / 0. An empty
// one gives a valid pointer with length 0.
int jByteArrayToCKByteArray(JNIEnv* env, jbyteArray jArray, CK_BYTE_PTR* ckpArray,
                            CK_ULONG_PTR ckpLength);
// Each char is cut to its low byte; no terminator is added.
VOK_C_API int jCharArrayToCKCharArray(JNIEnv* env, jcharArray jArray, CK_CHAR_PTR* ckpArray,
                                      CK_ULONG_PTR ckpLength);
// The same function under its second exported name.
VOK_C_API int jCharArrayToCKUTF8CharArray(JNIEnv* env, jcharArray jArray, CK_UTF8CHAR_PTR* ckpArray,
                                          CK_ULONG_PTR ckpLength);
// An element becomes CK_TRUE only when it is exactly 1.
int jBooleanArrayToCKBBoolArray(JNIEnv* env, jbooleanArray jArray, CK_BBOOL_PTR* ckpArray,
                                CK_ULONG_PTR ckpLength);
// Output length: element count. An int[] handed in here (the generic value
// converter does so) is read as its memory would read as 64-bit elements.
int jLongArrayToCKULongArray(JNIEnv* env, jlongArray jArray, CK_ULONG_PTR* ckpArray,
                             CK_ULONG_PTR ckpLength);
// Zero-terminated copy of the VM's modified UTF-8; length without terminator.
int jStringToCKUTF8CharArray(JNIEnv* env, jstring jString, CK_UTF8CHAR_PTR* ckpString,
                             CK_ULONG_PTR ckpLength);

// ---- Java to native: single values (new buffer, or null) -----------------

CK_BBOOL_PTR jBooleanObjectToCKBBoolPtr(JNIEnv* env, jobject jBoolean);
CK_BYTE_PTR jByteObjectToCKBytePtr(JNIEnv* env, jobject jByte);
// Looks its class up as "java/lang/Char", which no VM knows: it always fails
// with NoClassDefFoundError pending. Kept so.
CK_CHAR_PTR jCharObjectToCKCharPtr(JNIEnv* env, jobject jCharacter);
CK_ULONG_PTR jIntegerObjectToCKULongPtr(JNIEnv* env, jobject jInteger);  // sign-extended
CK_ULONG_PTR jLongObjectToCKULongPtr(JNIEnv* env, jobject jLong);
CK_VERSION_PTR jVersionToCKVersionPtr(JNIEnv* env, jobject jVersion);
CK_DATE* jDateObjectPtrToCKDatePtr(JNIEnv* env, jobject jDate);

// Any Java value to a native buffer, by its class (see attributes.cpp for the
// order). Unknown classes raise PKCS11RuntimeException.
void jObjectToPrimitiveCKObjectPtrPtr(JNIEnv* env, jobject jObject, CK_VOID_PTR* ckpObjectPtr,
                                      CK_ULONG_PTR ckpLength);

// ---- Java to native: attributes, templates, initialisation arguments -----

// CKA_WRAP_TEMPLATE / CKA_UNWRAP_TEMPLATE values are nested templates whose
// length is their element count times sizeof(CK_ATTRIBUTE).
CK_ATTRIBUTE jAttributeToCKAttribute(JNIEnv* env, jobject jAttribute);
// CK_CONVERSION_OK, or CK_CONVERSION_FIRST_ALLOCATION_FAILED with an exception
// pending (nothing to free) when the array or any element could not be made.
int jAttributeArrayToCKAttributeArray(JNIEnv* env, jobjectArray jArray, CK_ATTRIBUTE_PTR* ckpArray,
                                      CK_ULONG_PTR ckpCount);
// Frees the values jAttributeToCKAttribute made (nested templates included)
// and sets them null; the second one also frees the array.
void freeCKAttributeValue(CK_ATTRIBUTE_PTR attribute);
void freeCKAttributeArray(CK_ATTRIBUTE_PTR array, CK_ULONG count);

// Null for a null argument or on failure. The mutex callbacks are always
// null; release with freeCKInitArgsAdapter.
CK_C_INITIALIZE_ARGS_PTR makeCKInitArgsAdapter(JNIEnv* env, jobject jInitArgs);
void freeCKInitArgsAdapter(CK_C_INITIALIZE_ARGS_PTR initArgs);

// ---- Native to Java -------------------------------------------------------

// A length or count that a Java array cannot hold (over 2^31-1) raises
// OutOfMemoryError. A null structure pointer gives null without exception.
jbyteArray ckByteArrayToJByteArray(JNIEnv* env, const CK_BYTE* ckpArray, CK_ULONG ckLength);
// Each byte widened without sign.
VOK_C_API jcharArray ckCharArrayToJCharArray(JNIEnv* env, const CK_CHAR* ckpArray,
                                             CK_ULONG ckLength);
// The same function under its second exported name.
VOK_C_API jcharArray ckUTF8CharArrayToJCharArray(JNIEnv* env, const CK_UTF8CHAR* ckpArray,
                                                 CK_ULONG ckLength);
jlongArray ckULongArrayToJLongArray(JNIEnv* env, const CK_ULONG* ckpArray, CK_ULONG ckCount);
jobject ckBBoolPtrToJBooleanObject(JNIEnv* env, const CK_BBOOL* ckpValue);  // true only for 1
jobject ckULongPtrToJLongObject(JNIEnv* env, const CK_ULONG* ckpValue);
jobject ckVersionPtrToJVersion(JNIEnv* env, const CK_VERSION* ckpVersion);
jobject ckDatePtrToJDateObject(JNIEnv* env, const CK_DATE* ckpDate);
jobject ckInfoPtrToJInfo(JNIEnv* env, const CK_INFO* ckpInfo);
jobject ckSlotInfoPtrToJSlotInfo(JNIEnv* env, const CK_SLOT_INFO* ckpSlotInfo);
jobject ckTokenInfoPtrToJTokenInfo(JNIEnv* env, const CK_TOKEN_INFO* ckpTokenInfo);
jobject ckSessionInfoPtrToJSessionInfo(JNIEnv* env, const CK_SESSION_INFO* ckpSessionInfo);
jobject ckMechanismInfoPtrToJMechanismInfo(JNIEnv* env, const CK_MECHANISM_INFO* ckpInfo);
jobject ckAttributePtrToJAttribute(JNIEnv* env, const CK_ATTRIBUTE* ckpAttribute);
// byteLength / sizeof(CK_ATTRIBUTE) elements.
jobjectArray ckAttributeArrayToJAttributeArray(JNIEnv* env, const CK_ATTRIBUTE* ckpArray,
                                               CK_ULONG byteLength);
// The value as the Java type its attribute type calls for; null when the
// value is absent, unavailable (length -1) or empty.
jobject ckAttributeValueToJObject(JNIEnv* env, const CK_ATTRIBUTE* ckpAttribute);

// ---- Mechanisms and their parameters --------------------------------------

// A non-null pParameter belongs to the caller, who calls
// freeCKMechanismParameter after the PKCS#11 call and any copy-back. When an
// exception is pending the parameter is already freed (pParameter null).
// A null Java mechanism raises NullPointerException.
CK_MECHANISM jMechanismToCKMechanism(JNIEnv* env, jobject jMechanism);
// Any parameter object to a native parameter. With an exception pending the
// output may still hold what was converted so far (a CK_SSL3_KEY_MAT_PARAMS
// without its key material); jMechanismToCKMechanism frees it then.
void jMechanismParameterToCKMechanismParameter(JNIEnv* env, jobject jParam,
                                               CK_VOID_PTR* ckpParamPtr, CK_ULONG_PTR ckpLength);
// Frees pParameter and the nested buffers that the mechanism type's structure
// holds, whatever Java class the parameter came from. Null pParameter: nothing.
void freeCKMechanismParameter(CK_MECHANISM_PTR ckMechanism);

// Results that a module writes into a parameter structure, copied back into
// the Java parameter objects. Each acts only for its own mechanism types, when
// the Java mechanism is the native one, so a native method may call all four
// after its module call, whatever the result.
void copyBackPBEInitializationVector(JNIEnv* env, CK_MECHANISM_PTR ckMechanism,
                                     jobject jMechanism);  // CKM_PBE_MD2_DES_CBC..SHA1_CAST5_CBC
void copyBackSetUnwrappedKey(JNIEnv* env, CK_MECHANISM_PTR ckMechanism,
                             jobject jMechanism);  // CKM_KEY_WRAP_SET_OAEP
void copyBackClientVersion(JNIEnv* env, CK_MECHANISM_PTR ckMechanism,
                           jobject jMechanism);  // CKM_SSL3_MASTER_KEY_DERIVE
void copyBackSSLKeyMatParams(JNIEnv* env, CK_MECHANISM_PTR ckMechanism,
                             jobject jMechanism);  // CKM_SSL3_KEY_AND_MAC_DERIVE

// One converter per parameter class. Each reads the Java object's fields and
// returns the structure by value; its nested buffers are the caller's.
CK_RSA_PKCS_OAEP_PARAMS jRsaPkcsOaepParamToCKRsaPkcsOaepParam(JNIEnv* env, jobject jParam);
CK_KEA_DERIVE_PARAMS jKeaDeriveParamToCKKeaDeriveParam(JNIEnv* env, jobject jParam);
// Stops the process: no RC2-CBC parameter ever reaches a module.
[[noreturn]] CK_RC2_CBC_PARAMS jRc2CbcParamToCKRc2CbcParam(JNIEnv* env, jobject jParam);
CK_RC2_MAC_GENERAL_PARAMS jRc2MacGeneralParamToCKRc2MacGeneralParam(JNIEnv* env, jobject jParam);
CK_RC5_PARAMS jRc5ParamToCKRc5Param(JNIEnv* env, jobject jParam);
CK_RC5_CBC_PARAMS jRc5CbcParamToCKRc5CbcParam(JNIEnv* env, jobject jParam);
CK_RC5_MAC_GENERAL_PARAMS jRc5MacGeneralParamToCKRc5MacGeneralParam(JNIEnv* env, jobject jParam);
CK_SKIPJACK_PRIVATE_WRAP_PARAMS jSkipjackPrivateWrapParamToCKSkipjackPrivateWrapParam(
    JNIEnv* env, jobject jParam);
CK_SKIPJACK_RELAYX_PARAMS jSkipjackRelayxParamToCKSkipjackRelayxParam(JNIEnv* env, jobject jParam);
CK_PBE_PARAMS jPbeParamToCKPbeParam(JNIEnv* env, jobject jParam);
CK_PKCS5_PBKD2_PARAMS jPkcs5Pbkd2ParamToCKPkcs5Pbkd2Param(JNIEnv* env, jobject jParam);
CK_KEY_DERIVATION_STRING_DATA jKeyDerivationStringDataToCKKeyDerivationStringData(JNIEnv* env,
                                                                                  jobject jParam);
CK_KEY_WRAP_SET_OAEP_PARAMS jKeyWrapSetOaepParamToCKKeyWrapSetOaepParam(JNIEnv* env,
                                                                        jobject jParam);
CK_SSL3_MASTER_KEY_DERIVE_PARAMS jSsl3MasterKeyDeriveParamToCKSsl3MasterKeyDeriveParam(
    JNIEnv* env, jobject jParam);
// Also allocates the CK_SSL3_KEY_MAT_OUT the module fills; when that fails,
// OutOfMemoryError is pending and the rest is returned all the same.
CK_SSL3_KEY_MAT_PARAMS jSsl3KeyMatParamToCKSsl3KeyMatParam(JNIEnv* env, jobject jParam);
CK_RSA_PKCS_PSS_PARAMS jRsaPkcsPssParamToCKRsaPkcsPssParam(JNIEnv* env, jobject jParam);
CK_ECDH1_DERIVE_PARAMS jEcdh1DeriveParamToCKEcdh1DeriveParam(JNIEnv* env, jobject jParam);
CK_ECDH2_DERIVE_PARAMS jEcdh2DeriveParamToCKEcdh2DeriveParam(JNIEnv* env, jobject jParam);
CK_X9_42_DH1_DERIVE_PARAMS jX942Dh1DeriveParamToCKX942Dh1DeriveParam(JNIEnv* env, jobject jParam);
CK_X9_42_DH2_DERIVE_PARAMS jX942Dh2DeriveParamToCKX942Dh2DeriveParam(JNIEnv* env, jobject jParam);
CK_DES_CBC_ENCRYPT_DATA_PARAMS jDesCbcEncryptDataParamToCKDesCbcEncryptData(JNIEnv* env,
                                                                            jobject jParam);
CK_AES_CBC_ENCRYPT_DATA_PARAMS jAesCbcEncryptDataParamToCKAesCbcEncryptData(JNIEnv* env,
                                                                            jobject jParam);

#endif
