#ifndef IVOKPKCS11_H
#define IVOKPKCS11_H

// Direct calls into a module registered in this process, by module name,
// without the socket channel. Every call looks the module up again, so a
// module registered, replaced or removed after getInstance is seen by the
// next call. Needs only the PKCS#11 types.

#include "vok_export.h"
#include "vok_pkcs11.h"

class VOK_EXPORT IVokPkcs11 {
public:
    // A new instance bound to a copy of moduleName (NULL: the first module
    // registered); the caller deletes it. The module need not exist yet.
    static IVokPkcs11* getInstance(const char* moduleName);

    virtual ~IVokPkcs11();
    virtual CK_RV C_Initialize(CK_VOID_PTR pInitArgs) = 0;
    virtual CK_RV C_Finalize(CK_VOID_PTR pReserved) = 0;
    virtual CK_RV C_GetInfo(CK_INFO_PTR pInfo) = 0;
    virtual CK_RV C_GetFunctionList(CK_FUNCTION_LIST_PTR_PTR ppFunctionList) = 0;
    virtual CK_RV C_GetSlotList(CK_BBOOL tokenPresent, CK_SLOT_ID_PTR pSlotList,
                                CK_ULONG_PTR pulCount) = 0;
    virtual CK_RV C_GetSlotInfo(CK_SLOT_ID slotID, CK_SLOT_INFO_PTR pInfo) = 0;
    virtual CK_RV C_GetTokenInfo(CK_SLOT_ID slotID, CK_TOKEN_INFO_PTR pInfo) = 0;
    virtual CK_RV C_GetMechanismList(CK_SLOT_ID slotID, CK_MECHANISM_TYPE_PTR pMechanismList,
                                     CK_ULONG_PTR pulCount) = 0;
    virtual CK_RV C_GetMechanismInfo(CK_SLOT_ID slotID, CK_MECHANISM_TYPE type,
                                     CK_MECHANISM_INFO_PTR pInfo) = 0;
    virtual CK_RV C_InitToken(CK_SLOT_ID slotID, CK_UTF8CHAR_PTR pPin, CK_ULONG ulPinLen,
                              CK_UTF8CHAR_PTR pLabel) = 0;
    virtual CK_RV C_InitPIN(CK_SESSION_HANDLE hSession, CK_UTF8CHAR_PTR pPin,
                            CK_ULONG ulPinLen) = 0;
    virtual CK_RV C_SetPIN(CK_SESSION_HANDLE hSession, CK_UTF8CHAR_PTR pOldPin, CK_ULONG ulOldLen,
                           CK_UTF8CHAR_PTR pNewPin, CK_ULONG ulNewLen) = 0;
    virtual CK_RV C_OpenSession(CK_SLOT_ID slotID, CK_FLAGS flags, CK_VOID_PTR pApplication,
                                CK_NOTIFY Notify, CK_SESSION_HANDLE_PTR phSession) = 0;
    virtual CK_RV C_CloseSession(CK_SESSION_HANDLE hSession) = 0;
    virtual CK_RV C_CloseAllSessions(CK_SLOT_ID slotID) = 0;
    virtual CK_RV C_GetSessionInfo(CK_SESSION_HANDLE hSession, CK_SESSION_INFO_PTR pInfo) = 0;
    virtual CK_RV C_GetOperationState(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pOperationState,
                                      CK_ULONG_PTR pulOperationStateLen) = 0;
    virtual CK_RV C_SetOperationState(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pOperationState,
                                      CK_ULONG ulOperationStateLen, CK_OBJECT_HANDLE hEncryptionKey,
                                      CK_OBJECT_HANDLE hAuthenticationKey) = 0;
    virtual CK_RV C_Login(CK_SESSION_HANDLE hSession, CK_USER_TYPE userType, CK_UTF8CHAR_PTR pPin,
                          CK_ULONG ulPinLen) = 0;
    virtual CK_RV C_Logout(CK_SESSION_HANDLE hSession) = 0;
    virtual CK_RV C_CreateObject(CK_SESSION_HANDLE hSession, CK_ATTRIBUTE_PTR pTemplate,
                                 CK_ULONG ulCount, CK_OBJECT_HANDLE_PTR phObject) = 0;
    virtual CK_RV C_CopyObject(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                               CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount,
                               CK_OBJECT_HANDLE_PTR phNewObject) = 0;
    virtual CK_RV C_DestroyObject(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject) = 0;
    virtual CK_RV C_GetObjectSize(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                                  CK_ULONG_PTR pulSize) = 0;
    virtual CK_RV C_GetAttributeValue(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                                      CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount) = 0;
    virtual CK_RV C_SetAttributeValue(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                                      CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount) = 0;
    virtual CK_RV C_FindObjectsInit(CK_SESSION_HANDLE hSession, CK_ATTRIBUTE_PTR pTemplate,
                                    CK_ULONG ulCount) = 0;
    virtual CK_RV C_FindObjects(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE_PTR phObject,
                                CK_ULONG ulMaxObjectCount, CK_ULONG_PTR pulObjectCount) = 0;
    virtual CK_RV C_FindObjectsFinal(CK_SESSION_HANDLE hSession) = 0;
    virtual CK_RV C_EncryptInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                CK_OBJECT_HANDLE hKey) = 0;
    virtual CK_RV C_Encrypt(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                            CK_BYTE_PTR pEncryptedData, CK_ULONG_PTR pulEncryptedDataLen) = 0;
    virtual CK_RV C_EncryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen,
                                  CK_BYTE_PTR pEncryptedPart, CK_ULONG_PTR pulEncryptedPartLen) = 0;
    virtual CK_RV C_EncryptFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pLastEncryptedPart,
                                 CK_ULONG_PTR pulLastEncryptedPartLen) = 0;
    virtual CK_RV C_DecryptInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                CK_OBJECT_HANDLE hKey) = 0;
    virtual CK_RV C_Decrypt(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedData,
                            CK_ULONG ulEncryptedDataLen, CK_BYTE_PTR pData,
                            CK_ULONG_PTR pulDataLen) = 0;
    virtual CK_RV C_DecryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                                  CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart,
                                  CK_ULONG_PTR pulPartLen) = 0;
    virtual CK_RV C_DecryptFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pLastPart,
                                 CK_ULONG_PTR pulLastPartLen) = 0;
    virtual CK_RV C_DigestInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism) = 0;
    virtual CK_RV C_Digest(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                           CK_BYTE_PTR pDigest, CK_ULONG_PTR pulDigestLen) = 0;
    virtual CK_RV C_DigestUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                                 CK_ULONG ulPartLen) = 0;
    virtual CK_RV C_DigestKey(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hKey) = 0;
    virtual CK_RV C_DigestFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pDigest,
                                CK_ULONG_PTR pulDigestLen) = 0;
    virtual CK_RV C_SignInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                             CK_OBJECT_HANDLE hKey) = 0;
    virtual CK_RV C_Sign(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                         CK_BYTE_PTR pSignature, CK_ULONG_PTR pulSignatureLen) = 0;
    virtual CK_RV C_SignUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                               CK_ULONG ulPartLen) = 0;
    virtual CK_RV C_SignFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature,
                              CK_ULONG_PTR pulSignatureLen) = 0;
    virtual CK_RV C_SignRecoverInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                    CK_OBJECT_HANDLE hKey) = 0;
    virtual CK_RV C_SignRecover(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                                CK_BYTE_PTR pSignature, CK_ULONG_PTR pulSignatureLen) = 0;
    virtual CK_RV C_VerifyInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                               CK_OBJECT_HANDLE hKey) = 0;
    virtual CK_RV C_Verify(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                           CK_BYTE_PTR pSignature, CK_ULONG ulSignatureLen) = 0;
    virtual CK_RV C_VerifyUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                                 CK_ULONG ulPartLen) = 0;
    virtual CK_RV C_VerifyFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature,
                                CK_ULONG ulSignatureLen) = 0;
    virtual CK_RV C_VerifyRecoverInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                      CK_OBJECT_HANDLE hKey) = 0;
    virtual CK_RV C_VerifyRecover(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature,
                                  CK_ULONG ulSignatureLen, CK_BYTE_PTR pData,
                                  CK_ULONG_PTR pulDataLen) = 0;
    virtual CK_RV C_DigestEncryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                                        CK_ULONG ulPartLen, CK_BYTE_PTR pEncryptedPart,
                                        CK_ULONG_PTR pulEncryptedPartLen) = 0;
    virtual CK_RV C_DecryptDigestUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                                        CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart,
                                        CK_ULONG_PTR pulPartLen) = 0;
    virtual CK_RV C_SignEncryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                                      CK_ULONG ulPartLen, CK_BYTE_PTR pEncryptedPart,
                                      CK_ULONG_PTR pulEncryptedPartLen) = 0;
    virtual CK_RV C_DecryptVerifyUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                                        CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart,
                                        CK_ULONG_PTR pulPartLen) = 0;
    virtual CK_RV C_GenerateKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount,
                                CK_OBJECT_HANDLE_PTR phKey) = 0;
    virtual CK_RV C_GenerateKeyPair(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                    CK_ATTRIBUTE_PTR pPublicKeyTemplate,
                                    CK_ULONG ulPublicKeyAttributeCount,
                                    CK_ATTRIBUTE_PTR pPrivateKeyTemplate,
                                    CK_ULONG ulPrivateKeyAttributeCount,
                                    CK_OBJECT_HANDLE_PTR phPublicKey,
                                    CK_OBJECT_HANDLE_PTR phPrivateKey) = 0;
    virtual CK_RV C_WrapKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                            CK_OBJECT_HANDLE hWrappingKey, CK_OBJECT_HANDLE hKey,
                            CK_BYTE_PTR pWrappedKey, CK_ULONG_PTR pulWrappedKeyLen) = 0;
    virtual CK_RV C_UnwrapKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                              CK_OBJECT_HANDLE hUnwrappingKey, CK_BYTE_PTR pWrappedKey,
                              CK_ULONG ulWrappedKeyLen, CK_ATTRIBUTE_PTR pTemplate,
                              CK_ULONG ulAttributeCount, CK_OBJECT_HANDLE_PTR phKey) = 0;
    virtual CK_RV C_DeriveKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                              CK_OBJECT_HANDLE hBaseKey, CK_ATTRIBUTE_PTR pTemplate,
                              CK_ULONG ulAttributeCount, CK_OBJECT_HANDLE_PTR phKey) = 0;
    virtual CK_RV C_SeedRandom(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSeed,
                               CK_ULONG ulSeedLen) = 0;
    virtual CK_RV C_GenerateRandom(CK_SESSION_HANDLE hSession, CK_BYTE_PTR RandomData,
                                   CK_ULONG ulRandomLen) = 0;
    virtual CK_RV C_GetFunctionStatus(CK_SESSION_HANDLE hSession) = 0;
    virtual CK_RV C_CancelFunction(CK_SESSION_HANDLE hSession) = 0;
    virtual CK_RV C_WaitForSlotEvent(CK_FLAGS flags, CK_SLOT_ID_PTR pSlot,
                                     CK_VOID_PTR pReserved) = 0;
};

#endif
