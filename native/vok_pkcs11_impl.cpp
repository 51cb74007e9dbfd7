#include <cstdlib>
#include <cstring>
#include <new>

#include "IVokPkcs11.h"
#include "vok_registry.h"

#define LOG_TAG "[native:VokPkcs11]"
#include "vok_log.h"

namespace {
enum class ResultLog { Int, UnsignedLongLong, None };

// A module whose list leaves the entry NULL does not offer the function:
// answered so instead of calling through NULL (a departure from forwarding
// blindly).
template <class Function, class... Args>
CK_RV offered(Function function, Args... args) {
    return function != nullptr ? function(args...) : CKR_FUNCTION_NOT_SUPPORTED;
}
}  // namespace

// Hidden: callers reach it only through IVokPkcs11's virtual methods.
class VokPkcs11Impl final : public IVokPkcs11 {
public:
    explicit VokPkcs11Impl(const char* name) : moduleName(name ? strdup(name) : nullptr) {}
    ~VokPkcs11Impl() override { free(moduleName); }
    bool bound() const { return moduleName != nullptr; }
    VokPkcs11Impl(const VokPkcs11Impl&) = delete;
    VokPkcs11Impl& operator=(const VokPkcs11Impl&) = delete;

    CK_RV C_Initialize(CK_VOID_PTR pInitArgs) override;
    CK_RV C_Finalize(CK_VOID_PTR pReserved) override;
    CK_RV C_GetInfo(CK_INFO_PTR pInfo) override;
    CK_RV C_GetFunctionList(CK_FUNCTION_LIST_PTR_PTR ppFunctionList) override;
    CK_RV C_GetSlotList(CK_BBOOL tokenPresent, CK_SLOT_ID_PTR pSlotList,
                        CK_ULONG_PTR pulCount) override;
    CK_RV C_GetSlotInfo(CK_SLOT_ID slotID, CK_SLOT_INFO_PTR pInfo) override;
    CK_RV C_GetTokenInfo(CK_SLOT_ID slotID, CK_TOKEN_INFO_PTR pInfo) override;
    CK_RV C_GetMechanismList(CK_SLOT_ID slotID, CK_MECHANISM_TYPE_PTR pMechanismList,
                             CK_ULONG_PTR pulCount) override;
    CK_RV C_GetMechanismInfo(CK_SLOT_ID slotID, CK_MECHANISM_TYPE type,
                             CK_MECHANISM_INFO_PTR pInfo) override;
    CK_RV C_InitToken(CK_SLOT_ID slotID, CK_UTF8CHAR_PTR pPin, CK_ULONG ulPinLen,
                      CK_UTF8CHAR_PTR pLabel) override;
    CK_RV C_InitPIN(CK_SESSION_HANDLE hSession, CK_UTF8CHAR_PTR pPin, CK_ULONG ulPinLen) override;
    CK_RV C_SetPIN(CK_SESSION_HANDLE hSession, CK_UTF8CHAR_PTR pOldPin, CK_ULONG ulOldLen,
                   CK_UTF8CHAR_PTR pNewPin, CK_ULONG ulNewLen) override;
    CK_RV C_OpenSession(CK_SLOT_ID slotID, CK_FLAGS flags, CK_VOID_PTR pApplication,
                        CK_NOTIFY Notify, CK_SESSION_HANDLE_PTR phSession) override;
    CK_RV C_CloseSession(CK_SESSION_HANDLE hSession) override;
    CK_RV C_CloseAllSessions(CK_SLOT_ID slotID) override;
    CK_RV C_GetSessionInfo(CK_SESSION_HANDLE hSession, CK_SESSION_INFO_PTR pInfo) override;
    CK_RV C_GetOperationState(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pOperationState,
                              CK_ULONG_PTR pulOperationStateLen) override;
    CK_RV C_SetOperationState(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pOperationState,
                              CK_ULONG ulOperationStateLen, CK_OBJECT_HANDLE hEncryptionKey,
                              CK_OBJECT_HANDLE hAuthenticationKey) override;
    CK_RV C_Login(CK_SESSION_HANDLE hSession, CK_USER_TYPE userType, CK_UTF8CHAR_PTR pPin,
                  CK_ULONG ulPinLen) override;
    CK_RV C_Logout(CK_SESSION_HANDLE hSession) override;
    CK_RV C_CreateObject(CK_SESSION_HANDLE hSession, CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount,
                         CK_OBJECT_HANDLE_PTR phObject) override;
    CK_RV C_CopyObject(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                       CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount,
                       CK_OBJECT_HANDLE_PTR phNewObject) override;
    CK_RV C_DestroyObject(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject) override;
    CK_RV C_GetObjectSize(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                          CK_ULONG_PTR pulSize) override;
    CK_RV C_GetAttributeValue(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                              CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount) override;
    CK_RV C_SetAttributeValue(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                              CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount) override;
    CK_RV C_FindObjectsInit(CK_SESSION_HANDLE hSession, CK_ATTRIBUTE_PTR pTemplate,
                            CK_ULONG ulCount) override;
    CK_RV C_FindObjects(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE_PTR phObject,
                        CK_ULONG ulMaxObjectCount, CK_ULONG_PTR pulObjectCount) override;
    CK_RV C_FindObjectsFinal(CK_SESSION_HANDLE hSession) override;
    CK_RV C_EncryptInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                        CK_OBJECT_HANDLE hKey) override;
    CK_RV C_Encrypt(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                    CK_BYTE_PTR pEncryptedData, CK_ULONG_PTR pulEncryptedDataLen) override;
    CK_RV C_EncryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen,
                          CK_BYTE_PTR pEncryptedPart, CK_ULONG_PTR pulEncryptedPartLen) override;
    CK_RV C_EncryptFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pLastEncryptedPart,
                         CK_ULONG_PTR pulLastEncryptedPartLen) override;
    CK_RV C_DecryptInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                        CK_OBJECT_HANDLE hKey) override;
    CK_RV C_Decrypt(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedData,
                    CK_ULONG ulEncryptedDataLen, CK_BYTE_PTR pData,
                    CK_ULONG_PTR pulDataLen) override;
    CK_RV C_DecryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                          CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart,
                          CK_ULONG_PTR pulPartLen) override;
    CK_RV C_DecryptFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pLastPart,
                         CK_ULONG_PTR pulLastPartLen) override;
    CK_RV C_DigestInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism) override;
    CK_RV C_Digest(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                   CK_BYTE_PTR pDigest, CK_ULONG_PTR pulDigestLen) override;
    CK_RV C_DigestUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                         CK_ULONG ulPartLen) override;
    CK_RV C_DigestKey(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hKey) override;
    CK_RV C_DigestFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pDigest,
                        CK_ULONG_PTR pulDigestLen) override;
    CK_RV C_SignInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                     CK_OBJECT_HANDLE hKey) override;
    CK_RV C_Sign(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                 CK_BYTE_PTR pSignature, CK_ULONG_PTR pulSignatureLen) override;
    CK_RV C_SignUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen) override;
    CK_RV C_SignFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature,
                      CK_ULONG_PTR pulSignatureLen) override;
    CK_RV C_SignRecoverInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                            CK_OBJECT_HANDLE hKey) override;
    CK_RV C_SignRecover(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                        CK_BYTE_PTR pSignature, CK_ULONG_PTR pulSignatureLen) override;
    CK_RV C_VerifyInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                       CK_OBJECT_HANDLE hKey) override;
    CK_RV C_Verify(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                   CK_BYTE_PTR pSignature, CK_ULONG ulSignatureLen) override;
    CK_RV C_VerifyUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                         CK_ULONG ulPartLen) override;
    CK_RV C_VerifyFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature,
                        CK_ULONG ulSignatureLen) override;
    CK_RV C_VerifyRecoverInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                              CK_OBJECT_HANDLE hKey) override;
    CK_RV C_VerifyRecover(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature,
                          CK_ULONG ulSignatureLen, CK_BYTE_PTR pData,
                          CK_ULONG_PTR pulDataLen) override;
    CK_RV C_DigestEncryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen,
                                CK_BYTE_PTR pEncryptedPart,
                                CK_ULONG_PTR pulEncryptedPartLen) override;
    CK_RV C_DecryptDigestUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                                CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart,
                                CK_ULONG_PTR pulPartLen) override;
    CK_RV C_SignEncryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen,
                              CK_BYTE_PTR pEncryptedPart,
                              CK_ULONG_PTR pulEncryptedPartLen) override;
    CK_RV C_DecryptVerifyUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                                CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart,
                                CK_ULONG_PTR pulPartLen) override;
    CK_RV C_GenerateKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                        CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount,
                        CK_OBJECT_HANDLE_PTR phKey) override;
    CK_RV C_GenerateKeyPair(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                            CK_ATTRIBUTE_PTR pPublicKeyTemplate, CK_ULONG ulPublicKeyAttributeCount,
                            CK_ATTRIBUTE_PTR pPrivateKeyTemplate,
                            CK_ULONG ulPrivateKeyAttributeCount, CK_OBJECT_HANDLE_PTR phPublicKey,
                            CK_OBJECT_HANDLE_PTR phPrivateKey) override;
    CK_RV C_WrapKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                    CK_OBJECT_HANDLE hWrappingKey, CK_OBJECT_HANDLE hKey, CK_BYTE_PTR pWrappedKey,
                    CK_ULONG_PTR pulWrappedKeyLen) override;
    CK_RV C_UnwrapKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                      CK_OBJECT_HANDLE hUnwrappingKey, CK_BYTE_PTR pWrappedKey,
                      CK_ULONG ulWrappedKeyLen, CK_ATTRIBUTE_PTR pTemplate,
                      CK_ULONG ulAttributeCount, CK_OBJECT_HANDLE_PTR phKey) override;
    CK_RV C_DeriveKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                      CK_OBJECT_HANDLE hBaseKey, CK_ATTRIBUTE_PTR pTemplate,
                      CK_ULONG ulAttributeCount, CK_OBJECT_HANDLE_PTR phKey) override;
    CK_RV C_SeedRandom(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSeed, CK_ULONG ulSeedLen) override;
    CK_RV C_GenerateRandom(CK_SESSION_HANDLE hSession, CK_BYTE_PTR RandomData,
                           CK_ULONG ulRandomLen) override;
    CK_RV C_GetFunctionStatus(CK_SESSION_HANDLE hSession) override;
    CK_RV C_CancelFunction(CK_SESSION_HANDLE hSession) override;
    CK_RV C_WaitForSlotEvent(CK_FLAGS flags, CK_SLOT_ID_PTR pSlot, CK_VOID_PTR pReserved) override;

private:
    // Looks the module up at call time and forwards the arguments unchanged.
    template <class Call>
    CK_RV forward(const char* function, ResultLog log, Call&& call) const {
        VOK_LOGD("%s...", function);
        // Held until the call returns: a disconnect meanwhile does not unload it.
        ModuleHold module(moduleName);
        CK_FUNCTION_LIST_PTR functions = module.functions();
        if (!functions) {
            VOK_LOGD("getFunctions return NULL");
            return CKR_FUNCTION_FAILED;
        }
        const CK_RV result = call(functions);
        // The first group's narrower format is what service logs have always shown.
        if (log == ResultLog::Int)
            VOK_LOGD("return %d", static_cast<int>(result));
        else if (log == ResultLog::UnsignedLongLong)
            VOK_LOGD("return %llu", static_cast<unsigned long long>(result));
        return result;
    }

    char* moduleName;  // owned copy, or NULL
};

IVokPkcs11::~IVokPkcs11() {}

IVokPkcs11* IVokPkcs11::getInstance(const char* moduleName) {
    VokPkcs11Impl* instance = new (std::nothrow) VokPkcs11Impl(moduleName);
    // A name that could not be copied must not turn into "the first module".
    if (instance != nullptr && moduleName != nullptr && !instance->bound()) {
        delete instance;
        return nullptr;
    }
    return instance;
}

CK_RV VokPkcs11Impl::C_Initialize(CK_VOID_PTR pInitArgs) {
    return forward("C_Initialize", ResultLog::Int,
                   [&](CK_FUNCTION_LIST_PTR f) { return offered(f->C_Initialize, pInitArgs); });
}

CK_RV VokPkcs11Impl::C_Finalize(CK_VOID_PTR pReserved) {
    return forward("C_Finalize", ResultLog::Int,
                   [&](CK_FUNCTION_LIST_PTR f) { return offered(f->C_Finalize, pReserved); });
}

CK_RV VokPkcs11Impl::C_GetInfo(CK_INFO_PTR pInfo) {
    return forward("C_GetInfo", ResultLog::Int,
                   [&](CK_FUNCTION_LIST_PTR f) { return offered(f->C_GetInfo, pInfo); });
}

// Not offered through this interface: callers already have the module.
CK_RV VokPkcs11Impl::C_GetFunctionList(CK_FUNCTION_LIST_PTR_PTR) {
    return CKR_FUNCTION_NOT_SUPPORTED;
}

CK_RV VokPkcs11Impl::C_GetSlotList(CK_BBOOL tokenPresent, CK_SLOT_ID_PTR pSlotList,
                                   CK_ULONG_PTR pulCount) {
    return forward("C_GetSlotList", ResultLog::Int, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GetSlotList, tokenPresent, pSlotList, pulCount);
    });
}

CK_RV VokPkcs11Impl::C_GetSlotInfo(CK_SLOT_ID slotID, CK_SLOT_INFO_PTR pInfo) {
    return forward("C_GetSlotInfo", ResultLog::Int, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GetSlotInfo, slotID, pInfo);
    });
}

CK_RV VokPkcs11Impl::C_GetTokenInfo(CK_SLOT_ID slotID, CK_TOKEN_INFO_PTR pInfo) {
    return forward("C_GetTokenInfo", ResultLog::Int, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GetTokenInfo, slotID, pInfo);
    });
}

CK_RV VokPkcs11Impl::C_GetMechanismList(CK_SLOT_ID slotID, CK_MECHANISM_TYPE_PTR pMechanismList,
                                        CK_ULONG_PTR pulCount) {
    return forward("C_GetMechanismList", ResultLog::Int, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GetMechanismList, slotID, pMechanismList, pulCount);
    });
}

CK_RV VokPkcs11Impl::C_GetMechanismInfo(CK_SLOT_ID slotID, CK_MECHANISM_TYPE type,
                                        CK_MECHANISM_INFO_PTR pInfo) {
    return forward("C_GetMechanismInfo", ResultLog::Int, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GetMechanismInfo, slotID, type, pInfo);
    });
}

CK_RV VokPkcs11Impl::C_InitToken(CK_SLOT_ID slotID, CK_UTF8CHAR_PTR pPin, CK_ULONG ulPinLen,
                                 CK_UTF8CHAR_PTR pLabel) {
    return forward("C_InitToken", ResultLog::Int, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_InitToken, slotID, pPin, ulPinLen, pLabel);
    });
}

CK_RV VokPkcs11Impl::C_InitPIN(CK_SESSION_HANDLE hSession, CK_UTF8CHAR_PTR pPin,
                               CK_ULONG ulPinLen) {
    return forward("C_InitPIN", ResultLog::Int, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_InitPIN, hSession, pPin, ulPinLen);
    });
}

CK_RV VokPkcs11Impl::C_SetPIN(CK_SESSION_HANDLE hSession, CK_UTF8CHAR_PTR pOldPin,
                              CK_ULONG ulOldLen, CK_UTF8CHAR_PTR pNewPin, CK_ULONG ulNewLen) {
    return forward("C_SetPIN", ResultLog::Int, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_SetPIN, hSession, pOldPin, ulOldLen, pNewPin, ulNewLen);
    });
}

CK_RV VokPkcs11Impl::C_OpenSession(CK_SLOT_ID slotID, CK_FLAGS flags, CK_VOID_PTR pApplication,
                                   CK_NOTIFY Notify, CK_SESSION_HANDLE_PTR phSession) {
    return forward("C_OpenSession", ResultLog::Int, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_OpenSession, slotID, flags, pApplication, Notify, phSession);
    });
}

CK_RV VokPkcs11Impl::C_CloseSession(CK_SESSION_HANDLE hSession) {
    return forward("C_CloseSession", ResultLog::Int,
                   [&](CK_FUNCTION_LIST_PTR f) { return offered(f->C_CloseSession, hSession); });
}

CK_RV VokPkcs11Impl::C_CloseAllSessions(CK_SLOT_ID slotID) {
    return forward("C_CloseAllSessions", ResultLog::Int,
                   [&](CK_FUNCTION_LIST_PTR f) { return offered(f->C_CloseAllSessions, slotID); });
}

CK_RV VokPkcs11Impl::C_GetSessionInfo(CK_SESSION_HANDLE hSession, CK_SESSION_INFO_PTR pInfo) {
    return forward("C_GetSessionInfo", ResultLog::Int, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GetSessionInfo, hSession, pInfo);
    });
}

CK_RV VokPkcs11Impl::C_GetOperationState(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pOperationState,
                                         CK_ULONG_PTR pulOperationStateLen) {
    return forward("C_GetOperationState", ResultLog::Int, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GetOperationState, hSession, pOperationState, pulOperationStateLen);
    });
}

CK_RV VokPkcs11Impl::C_SetOperationState(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pOperationState,
                                         CK_ULONG ulOperationStateLen,
                                         CK_OBJECT_HANDLE hEncryptionKey,
                                         CK_OBJECT_HANDLE hAuthenticationKey) {
    return forward("C_SetOperationState", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_SetOperationState, hSession, pOperationState, ulOperationStateLen,
                       hEncryptionKey, hAuthenticationKey);
    });
}

CK_RV VokPkcs11Impl::C_Login(CK_SESSION_HANDLE hSession, CK_USER_TYPE userType,
                             CK_UTF8CHAR_PTR pPin, CK_ULONG ulPinLen) {
    return forward("C_Login", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_Login, hSession, userType, pPin, ulPinLen);
    });
}

CK_RV VokPkcs11Impl::C_Logout(CK_SESSION_HANDLE hSession) {
    return forward("C_Logout", ResultLog::UnsignedLongLong,
                   [&](CK_FUNCTION_LIST_PTR f) { return offered(f->C_Logout, hSession); });
}

CK_RV VokPkcs11Impl::C_CreateObject(CK_SESSION_HANDLE hSession, CK_ATTRIBUTE_PTR pTemplate,
                                    CK_ULONG ulCount, CK_OBJECT_HANDLE_PTR phObject) {
    return forward("C_CreateObject", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_CreateObject, hSession, pTemplate, ulCount, phObject);
    });
}

CK_RV VokPkcs11Impl::C_CopyObject(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                                  CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount,
                                  CK_OBJECT_HANDLE_PTR phNewObject) {
    return forward("C_CopyObject", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_CopyObject, hSession, hObject, pTemplate, ulCount, phNewObject);
    });
}

CK_RV VokPkcs11Impl::C_DestroyObject(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject) {
    return forward("C_DestroyObject", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_DestroyObject, hSession, hObject);
    });
}

CK_RV VokPkcs11Impl::C_GetObjectSize(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                                     CK_ULONG_PTR pulSize) {
    return forward("C_GetObjectSize", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GetObjectSize, hSession, hObject, pulSize);
    });
}

CK_RV VokPkcs11Impl::C_GetAttributeValue(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                                         CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount) {
    return forward("C_GetAttributeValue", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GetAttributeValue, hSession, hObject, pTemplate, ulCount);
    });
}

CK_RV VokPkcs11Impl::C_SetAttributeValue(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                                         CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount) {
    return forward("C_SetAttributeValue", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_SetAttributeValue, hSession, hObject, pTemplate, ulCount);
    });
}

CK_RV VokPkcs11Impl::C_FindObjectsInit(CK_SESSION_HANDLE hSession, CK_ATTRIBUTE_PTR pTemplate,
                                       CK_ULONG ulCount) {
    return forward("C_FindObjectsInit", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_FindObjectsInit, hSession, pTemplate, ulCount);
    });
}

CK_RV VokPkcs11Impl::C_FindObjects(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE_PTR phObject,
                                   CK_ULONG ulMaxObjectCount, CK_ULONG_PTR pulObjectCount) {
    return forward("C_FindObjects", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_FindObjects, hSession, phObject, ulMaxObjectCount, pulObjectCount);
    });
}

CK_RV VokPkcs11Impl::C_FindObjectsFinal(CK_SESSION_HANDLE hSession) {
    return forward("C_FindObjectsFinal", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_FindObjectsFinal, hSession);
    });
}

CK_RV VokPkcs11Impl::C_EncryptInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                   CK_OBJECT_HANDLE hKey) {
    return forward("C_EncryptInit", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_EncryptInit, hSession, pMechanism, hKey);
    });
}

CK_RV VokPkcs11Impl::C_Encrypt(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                               CK_BYTE_PTR pEncryptedData, CK_ULONG_PTR pulEncryptedDataLen) {
    return forward("C_Encrypt", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_Encrypt, hSession, pData, ulDataLen, pEncryptedData,
                       pulEncryptedDataLen);
    });
}

CK_RV VokPkcs11Impl::C_EncryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                                     CK_ULONG ulPartLen, CK_BYTE_PTR pEncryptedPart,
                                     CK_ULONG_PTR pulEncryptedPartLen) {
    return forward("C_EncryptUpdate", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_EncryptUpdate, hSession, pPart, ulPartLen, pEncryptedPart,
                       pulEncryptedPartLen);
    });
}

CK_RV VokPkcs11Impl::C_EncryptFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pLastEncryptedPart,
                                    CK_ULONG_PTR pulLastEncryptedPartLen) {
    return forward("C_EncryptFinal", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_EncryptFinal, hSession, pLastEncryptedPart, pulLastEncryptedPartLen);
    });
}

CK_RV VokPkcs11Impl::C_DecryptInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                   CK_OBJECT_HANDLE hKey) {
    return forward("C_DecryptInit", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_DecryptInit, hSession, pMechanism, hKey);
    });
}

CK_RV VokPkcs11Impl::C_Decrypt(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedData,
                               CK_ULONG ulEncryptedDataLen, CK_BYTE_PTR pData,
                               CK_ULONG_PTR pulDataLen) {
    return forward("C_Decrypt", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_Decrypt, hSession, pEncryptedData, ulEncryptedDataLen, pData,
                       pulDataLen);
    });
}

CK_RV VokPkcs11Impl::C_DecryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                                     CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart,
                                     CK_ULONG_PTR pulPartLen) {
    return forward("C_DecryptUpdate", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_DecryptUpdate, hSession, pEncryptedPart, ulEncryptedPartLen, pPart,
                       pulPartLen);
    });
}

CK_RV VokPkcs11Impl::C_DecryptFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pLastPart,
                                    CK_ULONG_PTR pulLastPartLen) {
    return forward("C_DecryptFinal", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_DecryptFinal, hSession, pLastPart, pulLastPartLen);
    });
}

CK_RV VokPkcs11Impl::C_DigestInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism) {
    return forward("C_DigestInit", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_DigestInit, hSession, pMechanism);
    });
}

CK_RV VokPkcs11Impl::C_Digest(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                              CK_BYTE_PTR pDigest, CK_ULONG_PTR pulDigestLen) {
    return forward("C_Digest", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_Digest, hSession, pData, ulDataLen, pDigest, pulDigestLen);
    });
}

CK_RV VokPkcs11Impl::C_DigestUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                                    CK_ULONG ulPartLen) {
    return forward("C_DigestUpdate", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_DigestUpdate, hSession, pPart, ulPartLen);
    });
}

CK_RV VokPkcs11Impl::C_DigestKey(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hKey) {
    return forward("C_DigestKey", ResultLog::UnsignedLongLong,
                   [&](CK_FUNCTION_LIST_PTR f) { return offered(f->C_DigestKey, hSession, hKey); });
}

CK_RV VokPkcs11Impl::C_DigestFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pDigest,
                                   CK_ULONG_PTR pulDigestLen) {
    return forward("C_DigestFinal", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_DigestFinal, hSession, pDigest, pulDigestLen);
    });
}

CK_RV VokPkcs11Impl::C_SignInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                CK_OBJECT_HANDLE hKey) {
    return forward("C_SignInit", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_SignInit, hSession, pMechanism, hKey);
    });
}

CK_RV VokPkcs11Impl::C_Sign(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                            CK_BYTE_PTR pSignature, CK_ULONG_PTR pulSignatureLen) {
    return forward("C_Sign", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_Sign, hSession, pData, ulDataLen, pSignature, pulSignatureLen);
    });
}

CK_RV VokPkcs11Impl::C_SignUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                                  CK_ULONG ulPartLen) {
    return forward("C_SignUpdate", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_SignUpdate, hSession, pPart, ulPartLen);
    });
}

CK_RV VokPkcs11Impl::C_SignFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature,
                                 CK_ULONG_PTR pulSignatureLen) {
    return forward("C_SignFinal", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_SignFinal, hSession, pSignature, pulSignatureLen);
    });
}

CK_RV VokPkcs11Impl::C_SignRecoverInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                       CK_OBJECT_HANDLE hKey) {
    return forward("C_SignRecoverInit", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_SignRecoverInit, hSession, pMechanism, hKey);
    });
}

CK_RV VokPkcs11Impl::C_SignRecover(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData,
                                   CK_ULONG ulDataLen, CK_BYTE_PTR pSignature,
                                   CK_ULONG_PTR pulSignatureLen) {
    return forward("C_SignRecover", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_SignRecover, hSession, pData, ulDataLen, pSignature, pulSignatureLen);
    });
}

CK_RV VokPkcs11Impl::C_VerifyInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                  CK_OBJECT_HANDLE hKey) {
    return forward("C_VerifyInit", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_VerifyInit, hSession, pMechanism, hKey);
    });
}

CK_RV VokPkcs11Impl::C_Verify(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                              CK_BYTE_PTR pSignature, CK_ULONG ulSignatureLen) {
    return forward("C_Verify", ResultLog::None, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_Verify, hSession, pData, ulDataLen, pSignature, ulSignatureLen);
    });
}

CK_RV VokPkcs11Impl::C_VerifyUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                                    CK_ULONG ulPartLen) {
    return forward("C_VerifyUpdate", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_VerifyUpdate, hSession, pPart, ulPartLen);
    });
}

CK_RV VokPkcs11Impl::C_VerifyFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature,
                                   CK_ULONG ulSignatureLen) {
    return forward("C_VerifyFinal", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_VerifyFinal, hSession, pSignature, ulSignatureLen);
    });
}

CK_RV VokPkcs11Impl::C_VerifyRecoverInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                         CK_OBJECT_HANDLE hKey) {
    return forward("C_VerifyRecoverInit", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_VerifyRecoverInit, hSession, pMechanism, hKey);
    });
}

CK_RV VokPkcs11Impl::C_VerifyRecover(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature,
                                     CK_ULONG ulSignatureLen, CK_BYTE_PTR pData,
                                     CK_ULONG_PTR pulDataLen) {
    return forward("C_VerifyRecover", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_VerifyRecover, hSession, pSignature, ulSignatureLen, pData, pulDataLen);
    });
}

CK_RV VokPkcs11Impl::C_DigestEncryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                                           CK_ULONG ulPartLen, CK_BYTE_PTR pEncryptedPart,
                                           CK_ULONG_PTR pulEncryptedPartLen) {
    return forward("C_DigestEncryptUpdate", ResultLog::UnsignedLongLong,
                   [&](CK_FUNCTION_LIST_PTR f) {
                       return offered(f->C_DigestEncryptUpdate, hSession, pPart, ulPartLen,
                                      pEncryptedPart, pulEncryptedPartLen);
                   });
}

CK_RV VokPkcs11Impl::C_DecryptDigestUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                                           CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart,
                                           CK_ULONG_PTR pulPartLen) {
    return forward("C_DecryptDigestUpdate", ResultLog::UnsignedLongLong,
                   [&](CK_FUNCTION_LIST_PTR f) {
                       return offered(f->C_DecryptDigestUpdate, hSession, pEncryptedPart,
                                      ulEncryptedPartLen, pPart, pulPartLen);
                   });
}

CK_RV VokPkcs11Impl::C_SignEncryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart,
                                         CK_ULONG ulPartLen, CK_BYTE_PTR pEncryptedPart,
                                         CK_ULONG_PTR pulEncryptedPartLen) {
    return forward("C_SignEncryptUpdate", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_SignEncryptUpdate, hSession, pPart, ulPartLen, pEncryptedPart,
                       pulEncryptedPartLen);
    });
}

CK_RV VokPkcs11Impl::C_DecryptVerifyUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                                           CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart,
                                           CK_ULONG_PTR pulPartLen) {
    return forward("C_DecryptVerifyUpdate", ResultLog::UnsignedLongLong,
                   [&](CK_FUNCTION_LIST_PTR f) {
                       return offered(f->C_DecryptVerifyUpdate, hSession, pEncryptedPart,
                                      ulEncryptedPartLen, pPart, pulPartLen);
                   });
}

CK_RV VokPkcs11Impl::C_GenerateKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                   CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount,
                                   CK_OBJECT_HANDLE_PTR phKey) {
    return forward("C_GenerateKey", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GenerateKey, hSession, pMechanism, pTemplate, ulCount, phKey);
    });
}

CK_RV VokPkcs11Impl::C_GenerateKeyPair(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                       CK_ATTRIBUTE_PTR pPublicKeyTemplate,
                                       CK_ULONG ulPublicKeyAttributeCount,
                                       CK_ATTRIBUTE_PTR pPrivateKeyTemplate,
                                       CK_ULONG ulPrivateKeyAttributeCount,
                                       CK_OBJECT_HANDLE_PTR phPublicKey,
                                       CK_OBJECT_HANDLE_PTR phPrivateKey) {
    return forward("C_GenerateKeyPair", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GenerateKeyPair, hSession, pMechanism, pPublicKeyTemplate,
                       ulPublicKeyAttributeCount, pPrivateKeyTemplate, ulPrivateKeyAttributeCount,
                       phPublicKey, phPrivateKey);
    });
}

CK_RV VokPkcs11Impl::C_WrapKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                               CK_OBJECT_HANDLE hWrappingKey, CK_OBJECT_HANDLE hKey,
                               CK_BYTE_PTR pWrappedKey, CK_ULONG_PTR pulWrappedKeyLen) {
    return forward("C_WrapKey", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_WrapKey, hSession, pMechanism, hWrappingKey, hKey, pWrappedKey,
                       pulWrappedKeyLen);
    });
}

CK_RV VokPkcs11Impl::C_UnwrapKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                 CK_OBJECT_HANDLE hUnwrappingKey, CK_BYTE_PTR pWrappedKey,
                                 CK_ULONG ulWrappedKeyLen, CK_ATTRIBUTE_PTR pTemplate,
                                 CK_ULONG ulAttributeCount, CK_OBJECT_HANDLE_PTR phKey) {
    return forward("C_UnwrapKey", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_UnwrapKey, hSession, pMechanism, hUnwrappingKey, pWrappedKey,
                       ulWrappedKeyLen, pTemplate, ulAttributeCount, phKey);
    });
}

CK_RV VokPkcs11Impl::C_DeriveKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                                 CK_OBJECT_HANDLE hBaseKey, CK_ATTRIBUTE_PTR pTemplate,
                                 CK_ULONG ulAttributeCount, CK_OBJECT_HANDLE_PTR phKey) {
    return forward("C_DeriveKey", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_DeriveKey, hSession, pMechanism, hBaseKey, pTemplate, ulAttributeCount,
                       phKey);
    });
}

CK_RV VokPkcs11Impl::C_SeedRandom(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSeed,
                                  CK_ULONG ulSeedLen) {
    return forward("C_SeedRandom", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_SeedRandom, hSession, pSeed, ulSeedLen);
    });
}

CK_RV VokPkcs11Impl::C_GenerateRandom(CK_SESSION_HANDLE hSession, CK_BYTE_PTR RandomData,
                                      CK_ULONG ulRandomLen) {
    return forward("C_GenerateRandom", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GenerateRandom, hSession, RandomData, ulRandomLen);
    });
}

CK_RV VokPkcs11Impl::C_GetFunctionStatus(CK_SESSION_HANDLE hSession) {
    return forward("C_GetFunctionStatus", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_GetFunctionStatus, hSession);
    });
}

CK_RV VokPkcs11Impl::C_CancelFunction(CK_SESSION_HANDLE hSession) {
    return forward("C_CancelFunction", ResultLog::None,
                   [&](CK_FUNCTION_LIST_PTR f) { return offered(f->C_CancelFunction, hSession); });
}

CK_RV VokPkcs11Impl::C_WaitForSlotEvent(CK_FLAGS flags, CK_SLOT_ID_PTR pSlot,
                                        CK_VOID_PTR pReserved) {
    return forward("C_WaitForSlotEvent", ResultLog::UnsignedLongLong, [&](CK_FUNCTION_LIST_PTR f) {
        return offered(f->C_WaitForSlotEvent, flags, pSlot, pReserved);
    });
}
