#ifndef VOK_HOST_PKCS11_H
#define VOK_HOST_PKCS11_H

/*
 * The host's standard PKCS#11 interface (Debian's p11-kit header) next to this
 * system's packed 64-bit one (vok_pkcs11.h), in one translation unit. Only the
 * companion libraries that meet the host's standard interface include this.
 *
 * The two headers define the same names, so three things keep them apart:
 * 1. The standard header is read in its GNU spelling (CRYPTOKI_GNU: struct
 *    ck_info, ck_rv_t, members such as manufacturer_id) and inside namespace
 *    host, so none of its types, nor its CK_C_ pointer types, meets ours.
 * 2. Its 68 prototypes would still collide with ours: functions with C
 *    linkage are one function whatever namespace declares them, and the two
 *    declarations take different structure types. While it is read, every C_
 *    name is a function-like macro. That renames the prototypes (the name is
 *    followed by a parenthesis there) but not the function-list members of the
 *    same name; the renamed prototypes are never defined nor called.
 * 3. Both define the same constants with the same values. vok_pkcs11.h is read
 *    first; the standard header, on a system include path, then redefines them
 *    silently with its own spelling of the same numbers.
 */

#include "vok_pkcs11.h"

#define C_Initialize(...) vok_std_unused_C_Initialize(__VA_ARGS__)
#define C_Finalize(...) vok_std_unused_C_Finalize(__VA_ARGS__)
#define C_GetInfo(...) vok_std_unused_C_GetInfo(__VA_ARGS__)
#define C_GetFunctionList(...) vok_std_unused_C_GetFunctionList(__VA_ARGS__)
#define C_GetSlotList(...) vok_std_unused_C_GetSlotList(__VA_ARGS__)
#define C_GetSlotInfo(...) vok_std_unused_C_GetSlotInfo(__VA_ARGS__)
#define C_GetTokenInfo(...) vok_std_unused_C_GetTokenInfo(__VA_ARGS__)
#define C_GetMechanismList(...) vok_std_unused_C_GetMechanismList(__VA_ARGS__)
#define C_GetMechanismInfo(...) vok_std_unused_C_GetMechanismInfo(__VA_ARGS__)
#define C_InitToken(...) vok_std_unused_C_InitToken(__VA_ARGS__)
#define C_InitPIN(...) vok_std_unused_C_InitPIN(__VA_ARGS__)
#define C_SetPIN(...) vok_std_unused_C_SetPIN(__VA_ARGS__)
#define C_OpenSession(...) vok_std_unused_C_OpenSession(__VA_ARGS__)
#define C_CloseSession(...) vok_std_unused_C_CloseSession(__VA_ARGS__)
#define C_CloseAllSessions(...) vok_std_unused_C_CloseAllSessions(__VA_ARGS__)
#define C_GetSessionInfo(...) vok_std_unused_C_GetSessionInfo(__VA_ARGS__)
#define C_GetOperationState(...) vok_std_unused_C_GetOperationState(__VA_ARGS__)
#define C_SetOperationState(...) vok_std_unused_C_SetOperationState(__VA_ARGS__)
#define C_Login(...) vok_std_unused_C_Login(__VA_ARGS__)
#define C_Logout(...) vok_std_unused_C_Logout(__VA_ARGS__)
#define C_CreateObject(...) vok_std_unused_C_CreateObject(__VA_ARGS__)
#define C_CopyObject(...) vok_std_unused_C_CopyObject(__VA_ARGS__)
#define C_DestroyObject(...) vok_std_unused_C_DestroyObject(__VA_ARGS__)
#define C_GetObjectSize(...) vok_std_unused_C_GetObjectSize(__VA_ARGS__)
#define C_GetAttributeValue(...) vok_std_unused_C_GetAttributeValue(__VA_ARGS__)
#define C_SetAttributeValue(...) vok_std_unused_C_SetAttributeValue(__VA_ARGS__)
#define C_FindObjectsInit(...) vok_std_unused_C_FindObjectsInit(__VA_ARGS__)
#define C_FindObjects(...) vok_std_unused_C_FindObjects(__VA_ARGS__)
#define C_FindObjectsFinal(...) vok_std_unused_C_FindObjectsFinal(__VA_ARGS__)
#define C_EncryptInit(...) vok_std_unused_C_EncryptInit(__VA_ARGS__)
#define C_Encrypt(...) vok_std_unused_C_Encrypt(__VA_ARGS__)
#define C_EncryptUpdate(...) vok_std_unused_C_EncryptUpdate(__VA_ARGS__)
#define C_EncryptFinal(...) vok_std_unused_C_EncryptFinal(__VA_ARGS__)
#define C_DecryptInit(...) vok_std_unused_C_DecryptInit(__VA_ARGS__)
#define C_Decrypt(...) vok_std_unused_C_Decrypt(__VA_ARGS__)
#define C_DecryptUpdate(...) vok_std_unused_C_DecryptUpdate(__VA_ARGS__)
#define C_DecryptFinal(...) vok_std_unused_C_DecryptFinal(__VA_ARGS__)
#define C_DigestInit(...) vok_std_unused_C_DigestInit(__VA_ARGS__)
#define C_Digest(...) vok_std_unused_C_Digest(__VA_ARGS__)
#define C_DigestUpdate(...) vok_std_unused_C_DigestUpdate(__VA_ARGS__)
#define C_DigestKey(...) vok_std_unused_C_DigestKey(__VA_ARGS__)
#define C_DigestFinal(...) vok_std_unused_C_DigestFinal(__VA_ARGS__)
#define C_SignInit(...) vok_std_unused_C_SignInit(__VA_ARGS__)
#define C_Sign(...) vok_std_unused_C_Sign(__VA_ARGS__)
#define C_SignUpdate(...) vok_std_unused_C_SignUpdate(__VA_ARGS__)
#define C_SignFinal(...) vok_std_unused_C_SignFinal(__VA_ARGS__)
#define C_SignRecoverInit(...) vok_std_unused_C_SignRecoverInit(__VA_ARGS__)
#define C_SignRecover(...) vok_std_unused_C_SignRecover(__VA_ARGS__)
#define C_VerifyInit(...) vok_std_unused_C_VerifyInit(__VA_ARGS__)
#define C_Verify(...) vok_std_unused_C_Verify(__VA_ARGS__)
#define C_VerifyUpdate(...) vok_std_unused_C_VerifyUpdate(__VA_ARGS__)
#define C_VerifyFinal(...) vok_std_unused_C_VerifyFinal(__VA_ARGS__)
#define C_VerifyRecoverInit(...) vok_std_unused_C_VerifyRecoverInit(__VA_ARGS__)
#define C_VerifyRecover(...) vok_std_unused_C_VerifyRecover(__VA_ARGS__)
#define C_DigestEncryptUpdate(...) vok_std_unused_C_DigestEncryptUpdate(__VA_ARGS__)
#define C_DecryptDigestUpdate(...) vok_std_unused_C_DecryptDigestUpdate(__VA_ARGS__)
#define C_SignEncryptUpdate(...) vok_std_unused_C_SignEncryptUpdate(__VA_ARGS__)
#define C_DecryptVerifyUpdate(...) vok_std_unused_C_DecryptVerifyUpdate(__VA_ARGS__)
#define C_GenerateKey(...) vok_std_unused_C_GenerateKey(__VA_ARGS__)
#define C_GenerateKeyPair(...) vok_std_unused_C_GenerateKeyPair(__VA_ARGS__)
#define C_WrapKey(...) vok_std_unused_C_WrapKey(__VA_ARGS__)
#define C_UnwrapKey(...) vok_std_unused_C_UnwrapKey(__VA_ARGS__)
#define C_DeriveKey(...) vok_std_unused_C_DeriveKey(__VA_ARGS__)
#define C_SeedRandom(...) vok_std_unused_C_SeedRandom(__VA_ARGS__)
#define C_GenerateRandom(...) vok_std_unused_C_GenerateRandom(__VA_ARGS__)
#define C_GetFunctionStatus(...) vok_std_unused_C_GetFunctionStatus(__VA_ARGS__)
#define C_CancelFunction(...) vok_std_unused_C_CancelFunction(__VA_ARGS__)
#define C_WaitForSlotEvent(...) vok_std_unused_C_WaitForSlotEvent(__VA_ARGS__)

namespace host {
#define CRYPTOKI_GNU 1
#include <p11-kit/pkcs11.h>
#undef CRYPTOKI_GNU
}  // namespace host

#undef C_Initialize
#undef C_Finalize
#undef C_GetInfo
#undef C_GetFunctionList
#undef C_GetSlotList
#undef C_GetSlotInfo
#undef C_GetTokenInfo
#undef C_GetMechanismList
#undef C_GetMechanismInfo
#undef C_InitToken
#undef C_InitPIN
#undef C_SetPIN
#undef C_OpenSession
#undef C_CloseSession
#undef C_CloseAllSessions
#undef C_GetSessionInfo
#undef C_GetOperationState
#undef C_SetOperationState
#undef C_Login
#undef C_Logout
#undef C_CreateObject
#undef C_CopyObject
#undef C_DestroyObject
#undef C_GetObjectSize
#undef C_GetAttributeValue
#undef C_SetAttributeValue
#undef C_FindObjectsInit
#undef C_FindObjects
#undef C_FindObjectsFinal
#undef C_EncryptInit
#undef C_Encrypt
#undef C_EncryptUpdate
#undef C_EncryptFinal
#undef C_DecryptInit
#undef C_Decrypt
#undef C_DecryptUpdate
#undef C_DecryptFinal
#undef C_DigestInit
#undef C_Digest
#undef C_DigestUpdate
#undef C_DigestKey
#undef C_DigestFinal
#undef C_SignInit
#undef C_Sign
#undef C_SignUpdate
#undef C_SignFinal
#undef C_SignRecoverInit
#undef C_SignRecover
#undef C_VerifyInit
#undef C_Verify
#undef C_VerifyUpdate
#undef C_VerifyFinal
#undef C_VerifyRecoverInit
#undef C_VerifyRecover
#undef C_DigestEncryptUpdate
#undef C_DecryptDigestUpdate
#undef C_SignEncryptUpdate
#undef C_DecryptVerifyUpdate
#undef C_GenerateKey
#undef C_GenerateKeyPair
#undef C_WrapKey
#undef C_UnwrapKey
#undef C_DeriveKey
#undef C_SeedRandom
#undef C_GenerateRandom
#undef C_GetFunctionStatus
#undef C_CancelFunction
#undef C_WaitForSlotEvent

#endif
