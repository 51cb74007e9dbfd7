// The standard C_ names, for callers that call a module's functions by name
// rather than through its function list: each calls the front's list entry of
// its own name. This unit reads the standard header alone, so the compiler
// checks every definition against the standard prototype of its name.

#include <p11-kit/pkcs11.h>

#include "front.h"
#include "vok_export.h"

namespace {

CK_FUNCTION_LIST_PTR entries() { return static_cast<CK_FUNCTION_LIST_PTR>(vok_front_list()); }

}  // namespace

// name, parameters, arguments
#define VOK_FRONT_FORWARD(name, params, args) \
    VOK_EXPORT CK_RV name params { return entries()->name args; }

VOK_FRONT_FORWARD(C_Initialize, (CK_VOID_PTR pInitArgs), (pInitArgs))
VOK_FRONT_FORWARD(C_Finalize, (CK_VOID_PTR pReserved), (pReserved))
VOK_FRONT_FORWARD(C_GetInfo, (CK_INFO_PTR pInfo), (pInfo))
VOK_FRONT_FORWARD(C_GetFunctionList, (CK_FUNCTION_LIST_PTR_PTR ppFunctionList), (ppFunctionList))
VOK_FRONT_FORWARD(C_GetSlotList,
                  (CK_BBOOL tokenPresent, CK_SLOT_ID_PTR pSlotList, CK_ULONG_PTR pulCount),
                  (tokenPresent, pSlotList, pulCount))
VOK_FRONT_FORWARD(C_GetSlotInfo, (CK_SLOT_ID slotID, CK_SLOT_INFO_PTR pInfo), (slotID, pInfo))
VOK_FRONT_FORWARD(C_GetTokenInfo, (CK_SLOT_ID slotID, CK_TOKEN_INFO_PTR pInfo), (slotID, pInfo))
VOK_FRONT_FORWARD(C_GetMechanismList,
                  (CK_SLOT_ID slotID, CK_MECHANISM_TYPE_PTR pMechanismList, CK_ULONG_PTR pulCount),
                  (slotID, pMechanismList, pulCount))
VOK_FRONT_FORWARD(C_GetMechanismInfo,
                  (CK_SLOT_ID slotID, CK_MECHANISM_TYPE type, CK_MECHANISM_INFO_PTR pInfo),
                  (slotID, type, pInfo))
VOK_FRONT_FORWARD(C_InitToken,
                  (CK_SLOT_ID slotID, CK_UTF8CHAR_PTR pPin, CK_ULONG ulPinLen,
                   CK_UTF8CHAR_PTR pLabel),
                  (slotID, pPin, ulPinLen, pLabel))
VOK_FRONT_FORWARD(C_InitPIN, (CK_SESSION_HANDLE hSession, CK_UTF8CHAR_PTR pPin, CK_ULONG ulPinLen),
                  (hSession, pPin, ulPinLen))
VOK_FRONT_FORWARD(C_SetPIN,
                  (CK_SESSION_HANDLE hSession, CK_UTF8CHAR_PTR pOldPin, CK_ULONG ulOldLen,
                   CK_UTF8CHAR_PTR pNewPin, CK_ULONG ulNewLen),
                  (hSession, pOldPin, ulOldLen, pNewPin, ulNewLen))
VOK_FRONT_FORWARD(C_OpenSession,
                  (CK_SLOT_ID slotID, CK_FLAGS flags, CK_VOID_PTR pApplication, CK_NOTIFY Notify,
                   CK_SESSION_HANDLE_PTR phSession),
                  (slotID, flags, pApplication, Notify, phSession))
VOK_FRONT_FORWARD(C_CloseSession, (CK_SESSION_HANDLE hSession), (hSession))
VOK_FRONT_FORWARD(C_CloseAllSessions, (CK_SLOT_ID slotID), (slotID))
VOK_FRONT_FORWARD(C_GetSessionInfo, (CK_SESSION_HANDLE hSession, CK_SESSION_INFO_PTR pInfo),
                  (hSession, pInfo))
VOK_FRONT_FORWARD(C_GetOperationState,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pOperationState,
                   CK_ULONG_PTR pulOperationStateLen),
                  (hSession, pOperationState, pulOperationStateLen))
VOK_FRONT_FORWARD(C_SetOperationState,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pOperationState,
                   CK_ULONG ulOperationStateLen, CK_OBJECT_HANDLE hEncryptionKey,
                   CK_OBJECT_HANDLE hAuthenticationKey),
                  (hSession, pOperationState, ulOperationStateLen, hEncryptionKey,
                   hAuthenticationKey))
VOK_FRONT_FORWARD(C_Login,
                  (CK_SESSION_HANDLE hSession, CK_USER_TYPE userType, CK_UTF8CHAR_PTR pPin,
                   CK_ULONG ulPinLen),
                  (hSession, userType, pPin, ulPinLen))
VOK_FRONT_FORWARD(C_Logout, (CK_SESSION_HANDLE hSession), (hSession))
VOK_FRONT_FORWARD(C_CreateObject,
                  (CK_SESSION_HANDLE hSession, CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount,
                   CK_OBJECT_HANDLE_PTR phObject),
                  (hSession, pTemplate, ulCount, phObject))
VOK_FRONT_FORWARD(C_CopyObject,
                  (CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject, CK_ATTRIBUTE_PTR pTemplate,
                   CK_ULONG ulCount, CK_OBJECT_HANDLE_PTR phNewObject),
                  (hSession, hObject, pTemplate, ulCount, phNewObject))
VOK_FRONT_FORWARD(C_DestroyObject, (CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject),
                  (hSession, hObject))
VOK_FRONT_FORWARD(C_GetObjectSize,
                  (CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject, CK_ULONG_PTR pulSize),
                  (hSession, hObject, pulSize))
VOK_FRONT_FORWARD(C_GetAttributeValue,
                  (CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject, CK_ATTRIBUTE_PTR pTemplate,
                   CK_ULONG ulCount),
                  (hSession, hObject, pTemplate, ulCount))
VOK_FRONT_FORWARD(C_SetAttributeValue,
                  (CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject, CK_ATTRIBUTE_PTR pTemplate,
                   CK_ULONG ulCount),
                  (hSession, hObject, pTemplate, ulCount))
VOK_FRONT_FORWARD(C_FindObjectsInit,
                  (CK_SESSION_HANDLE hSession, CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount),
                  (hSession, pTemplate, ulCount))
VOK_FRONT_FORWARD(C_FindObjects,
                  (CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE_PTR phObject,
                   CK_ULONG ulMaxObjectCount, CK_ULONG_PTR pulObjectCount),
                  (hSession, phObject, ulMaxObjectCount, pulObjectCount))
VOK_FRONT_FORWARD(C_FindObjectsFinal, (CK_SESSION_HANDLE hSession), (hSession))
VOK_FRONT_FORWARD(C_EncryptInit,
                  (CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism, CK_OBJECT_HANDLE hKey),
                  (hSession, pMechanism, hKey))
VOK_FRONT_FORWARD(C_Encrypt,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                   CK_BYTE_PTR pEncryptedData, CK_ULONG_PTR pulEncryptedDataLen),
                  (hSession, pData, ulDataLen, pEncryptedData, pulEncryptedDataLen))
VOK_FRONT_FORWARD(C_EncryptUpdate,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen,
                   CK_BYTE_PTR pEncryptedPart, CK_ULONG_PTR pulEncryptedPartLen),
                  (hSession, pPart, ulPartLen, pEncryptedPart, pulEncryptedPartLen))
VOK_FRONT_FORWARD(C_EncryptFinal,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pLastEncryptedPart,
                   CK_ULONG_PTR pulLastEncryptedPartLen),
                  (hSession, pLastEncryptedPart, pulLastEncryptedPartLen))
VOK_FRONT_FORWARD(C_DecryptInit,
                  (CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism, CK_OBJECT_HANDLE hKey),
                  (hSession, pMechanism, hKey))
VOK_FRONT_FORWARD(C_Decrypt,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedData,
                   CK_ULONG ulEncryptedDataLen, CK_BYTE_PTR pData, CK_ULONG_PTR pulDataLen),
                  (hSession, pEncryptedData, ulEncryptedDataLen, pData, pulDataLen))
VOK_FRONT_FORWARD(C_DecryptUpdate,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                   CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart, CK_ULONG_PTR pulPartLen),
                  (hSession, pEncryptedPart, ulEncryptedPartLen, pPart, pulPartLen))
VOK_FRONT_FORWARD(C_DecryptFinal,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pLastPart, CK_ULONG_PTR pulLastPartLen),
                  (hSession, pLastPart, pulLastPartLen))
VOK_FRONT_FORWARD(C_DigestInit, (CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism),
                  (hSession, pMechanism))
VOK_FRONT_FORWARD(C_Digest,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                   CK_BYTE_PTR pDigest, CK_ULONG_PTR pulDigestLen),
                  (hSession, pData, ulDataLen, pDigest, pulDigestLen))
VOK_FRONT_FORWARD(C_DigestUpdate,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen),
                  (hSession, pPart, ulPartLen))
VOK_FRONT_FORWARD(C_DigestKey, (CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hKey),
                  (hSession, hKey))
VOK_FRONT_FORWARD(C_DigestFinal,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pDigest, CK_ULONG_PTR pulDigestLen),
                  (hSession, pDigest, pulDigestLen))
VOK_FRONT_FORWARD(C_SignInit,
                  (CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism, CK_OBJECT_HANDLE hKey),
                  (hSession, pMechanism, hKey))
VOK_FRONT_FORWARD(C_Sign,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                   CK_BYTE_PTR pSignature, CK_ULONG_PTR pulSignatureLen),
                  (hSession, pData, ulDataLen, pSignature, pulSignatureLen))
VOK_FRONT_FORWARD(C_SignUpdate, (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen),
                  (hSession, pPart, ulPartLen))
VOK_FRONT_FORWARD(C_SignFinal,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature,
                   CK_ULONG_PTR pulSignatureLen),
                  (hSession, pSignature, pulSignatureLen))
VOK_FRONT_FORWARD(C_SignRecoverInit,
                  (CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism, CK_OBJECT_HANDLE hKey),
                  (hSession, pMechanism, hKey))
VOK_FRONT_FORWARD(C_SignRecover,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                   CK_BYTE_PTR pSignature, CK_ULONG_PTR pulSignatureLen),
                  (hSession, pData, ulDataLen, pSignature, pulSignatureLen))
VOK_FRONT_FORWARD(C_VerifyInit,
                  (CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism, CK_OBJECT_HANDLE hKey),
                  (hSession, pMechanism, hKey))
VOK_FRONT_FORWARD(C_Verify,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                   CK_BYTE_PTR pSignature, CK_ULONG ulSignatureLen),
                  (hSession, pData, ulDataLen, pSignature, ulSignatureLen))
VOK_FRONT_FORWARD(C_VerifyUpdate,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen),
                  (hSession, pPart, ulPartLen))
VOK_FRONT_FORWARD(C_VerifyFinal,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature, CK_ULONG ulSignatureLen),
                  (hSession, pSignature, ulSignatureLen))
VOK_FRONT_FORWARD(C_VerifyRecoverInit,
                  (CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism, CK_OBJECT_HANDLE hKey),
                  (hSession, pMechanism, hKey))
VOK_FRONT_FORWARD(C_VerifyRecover,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature, CK_ULONG ulSignatureLen,
                   CK_BYTE_PTR pData, CK_ULONG_PTR pulDataLen),
                  (hSession, pSignature, ulSignatureLen, pData, pulDataLen))
VOK_FRONT_FORWARD(C_DigestEncryptUpdate,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen,
                   CK_BYTE_PTR pEncryptedPart, CK_ULONG_PTR pulEncryptedPartLen),
                  (hSession, pPart, ulPartLen, pEncryptedPart, pulEncryptedPartLen))
VOK_FRONT_FORWARD(C_DecryptDigestUpdate,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                   CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart, CK_ULONG_PTR pulPartLen),
                  (hSession, pEncryptedPart, ulEncryptedPartLen, pPart, pulPartLen))
VOK_FRONT_FORWARD(C_SignEncryptUpdate,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen,
                   CK_BYTE_PTR pEncryptedPart, CK_ULONG_PTR pulEncryptedPartLen),
                  (hSession, pPart, ulPartLen, pEncryptedPart, pulEncryptedPartLen))
VOK_FRONT_FORWARD(C_DecryptVerifyUpdate,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                   CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart, CK_ULONG_PTR pulPartLen),
                  (hSession, pEncryptedPart, ulEncryptedPartLen, pPart, pulPartLen))
VOK_FRONT_FORWARD(C_GenerateKey,
                  (CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                   CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount, CK_OBJECT_HANDLE_PTR phKey),
                  (hSession, pMechanism, pTemplate, ulCount, phKey))
VOK_FRONT_FORWARD(C_GenerateKeyPair,
                  (CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                   CK_ATTRIBUTE_PTR pPublicKeyTemplate, CK_ULONG ulPublicKeyAttributeCount,
                   CK_ATTRIBUTE_PTR pPrivateKeyTemplate, CK_ULONG ulPrivateKeyAttributeCount,
                   CK_OBJECT_HANDLE_PTR phPublicKey, CK_OBJECT_HANDLE_PTR phPrivateKey),
                  (hSession, pMechanism, pPublicKeyTemplate, ulPublicKeyAttributeCount,
                   pPrivateKeyTemplate, ulPrivateKeyAttributeCount, phPublicKey, phPrivateKey))
VOK_FRONT_FORWARD(C_WrapKey,
                  (CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                   CK_OBJECT_HANDLE hWrappingKey, CK_OBJECT_HANDLE hKey, CK_BYTE_PTR pWrappedKey,
                   CK_ULONG_PTR pulWrappedKeyLen),
                  (hSession, pMechanism, hWrappingKey, hKey, pWrappedKey, pulWrappedKeyLen))
VOK_FRONT_FORWARD(C_UnwrapKey,
                  (CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                   CK_OBJECT_HANDLE hUnwrappingKey, CK_BYTE_PTR pWrappedKey,
                   CK_ULONG ulWrappedKeyLen, CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulAttributeCount,
                   CK_OBJECT_HANDLE_PTR phKey),
                  (hSession, pMechanism, hUnwrappingKey, pWrappedKey, ulWrappedKeyLen, pTemplate,
                   ulAttributeCount, phKey))
VOK_FRONT_FORWARD(C_DeriveKey,
                  (CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                   CK_OBJECT_HANDLE hBaseKey, CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulAttributeCount,
                   CK_OBJECT_HANDLE_PTR phKey),
                  (hSession, pMechanism, hBaseKey, pTemplate, ulAttributeCount, phKey))
VOK_FRONT_FORWARD(C_SeedRandom, (CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSeed, CK_ULONG ulSeedLen),
                  (hSession, pSeed, ulSeedLen))
VOK_FRONT_FORWARD(C_GenerateRandom,
                  (CK_SESSION_HANDLE hSession, CK_BYTE_PTR RandomData, CK_ULONG ulRandomLen),
                  (hSession, RandomData, ulRandomLen))
VOK_FRONT_FORWARD(C_GetFunctionStatus, (CK_SESSION_HANDLE hSession), (hSession))
VOK_FRONT_FORWARD(C_CancelFunction, (CK_SESSION_HANDLE hSession), (hSession))
VOK_FRONT_FORWARD(C_WaitForSlotEvent, (CK_FLAGS flags, CK_SLOT_ID_PTR pSlot, CK_VOID_PTR pReserved),
                  (flags, pSlot, pReserved))
