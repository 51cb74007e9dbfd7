// vokpkcs11_client_init/deinit, C_Initialize, C_Finalize, C_GetInfo and the
// function list.

#include <cstddef>
#include <cstdlib>
#include <mutex>

#include "call_frame.h"
#include "marshal.h"
#include "vok_client.h"
#include "vok_comm.h"

#define LOG_TAG "Vokpkcs11f"
#include "vok_log.h"

using namespace vok::client;

CK_FUNCTION_LIST_PTR mFunctionList = nullptr;

int32_t vokpkcs11_client_init(const char* serverId) {
    VOK_LOGD("client init");
    return vokpkcs11_comm_client_init(serverId);
}

int32_t vokpkcs11_client_deinit(void) { return vokpkcs11_comm_client_deinit(); }

// The service decides how the real module is initialised, so the caller's
// CK_C_INITIALIZE_ARGS is never read and the request carries the name alone.
CK_RV C_Initialize(CK_VOID_PTR /*pInitArgs*/) {
    VOK_LOGD("C_Initialize");
    return callService(
        "C_Initialize",
        [](pkcs11::Operation& op) {
            VOK_LOGD("C_Initialize serialized buffer size = %d",
                     static_cast<int>(op.ByteSizeLong()));
            VOK_LOGD("C_Initialize serialized before server call ");
        },
        [](uint32_t length) {
            VOK_LOGD("C_initialize Success");
            VOK_LOGD("C_Initialize response length = %d", static_cast<int>(length));
            VOK_LOGD("C_Initialize after server call ");
            VOK_LOGD("C_Initialize return result ");
        },
        noCopyBack);
}

CK_RV C_Finalize(CK_VOID_PTR /*pReserved*/) {
    return callService(
        "C_Finalize", [](pkcs11::Operation&) {},
        [](uint32_t length) {
            VOK_LOGD("C_Finalize success");
            VOK_LOGD("C_Finalize response length = %d", static_cast<int>(length));
        },
        noCopyBack);
}

// Versions first, then the texts: a full-width manufacturerID's terminator is
// overwritten by flags, a full-width libraryDescription's clears
// libraryVersion.major. Callers have always seen this order.
CK_RV C_GetInfo(CK_INFO_PTR pInfo) {
    return callService(
        "C_GetInfo", [](pkcs11::Operation&) {}, [](uint32_t) { VOK_LOGD("C_GetInfo Success"); },
        [pInfo](const pkcs11::OperationResult& res) {
            if (!res.has_infores() || !pInfo) return;
            const pkcs11::CK_INFO& info = res.infores().ckinfo();
            pInfo->cryptokiVersion.major = versionByte(info.cryptokiversion().vermajor());
            pInfo->cryptokiVersion.minor = versionByte(info.cryptokiversion().verminor());
            pInfo->libraryVersion.major = versionByte(info.libraryversion().vermajor());
            pInfo->libraryVersion.minor = versionByte(info.libraryversion().verminor());
            copyTerminatedText(pInfo, offsetof(CK_INFO, manufacturerID),
                               sizeof(pInfo->manufacturerID), info.manufacturerid());
            pInfo->flags = info.flags();
            copyTerminatedText(pInfo, offsetof(CK_INFO, libraryDescription),
                               sizeof(pInfo->libraryDescription), info.librarydescription());
        });
}

namespace {

CK_FUNCTION_LIST_PTR buildFunctionList() {
    VOK_LOGD("C_FunctionList");
    auto* list = static_cast<CK_FUNCTION_LIST_PTR>(std::calloc(1, sizeof(CK_FUNCTION_LIST)));
    if (!list) return nullptr;
    list->version.major = 2;
    list->version.minor = 40;
#define VOK_SLOT(name) list->name = name
    VOK_SLOT(C_Initialize);
    VOK_SLOT(C_Finalize);
    VOK_SLOT(C_GetInfo);
    VOK_SLOT(C_GetFunctionList);
    VOK_SLOT(C_GetSlotList);
    VOK_SLOT(C_GetSlotInfo);
    VOK_SLOT(C_GetTokenInfo);
    VOK_SLOT(C_GetMechanismList);
    VOK_SLOT(C_GetMechanismInfo);
    VOK_SLOT(C_InitToken);
    VOK_SLOT(C_InitPIN);
    VOK_SLOT(C_SetPIN);
    VOK_SLOT(C_OpenSession);
    VOK_SLOT(C_CloseSession);
    VOK_SLOT(C_CloseAllSessions);
    VOK_SLOT(C_GetSessionInfo);
    VOK_SLOT(C_GetOperationState);
    VOK_SLOT(C_SetOperationState);
    VOK_SLOT(C_Login);
    VOK_SLOT(C_Logout);
    VOK_SLOT(C_CreateObject);
    VOK_SLOT(C_CopyObject);
    VOK_SLOT(C_DestroyObject);
    VOK_SLOT(C_GetObjectSize);
    VOK_SLOT(C_GetAttributeValue);
    VOK_SLOT(C_SetAttributeValue);
    VOK_SLOT(C_FindObjectsInit);
    VOK_SLOT(C_FindObjects);
    VOK_SLOT(C_FindObjectsFinal);
    VOK_SLOT(C_EncryptInit);
    VOK_SLOT(C_Encrypt);
    VOK_SLOT(C_EncryptUpdate);
    VOK_SLOT(C_EncryptFinal);
    VOK_SLOT(C_DecryptInit);
    VOK_SLOT(C_Decrypt);
    VOK_SLOT(C_DecryptUpdate);
    VOK_SLOT(C_DecryptFinal);
    VOK_SLOT(C_DigestInit);
    VOK_SLOT(C_Digest);
    VOK_SLOT(C_DigestUpdate);
    VOK_SLOT(C_DigestKey);
    VOK_SLOT(C_DigestFinal);
    VOK_SLOT(C_SignInit);
    VOK_SLOT(C_Sign);
    VOK_SLOT(C_SignUpdate);
    VOK_SLOT(C_SignFinal);
    VOK_SLOT(C_SignRecoverInit);
    VOK_SLOT(C_SignRecover);
    VOK_SLOT(C_VerifyInit);
    VOK_SLOT(C_Verify);
    VOK_SLOT(C_VerifyUpdate);
    VOK_SLOT(C_VerifyFinal);
    VOK_SLOT(C_VerifyRecoverInit);
    VOK_SLOT(C_VerifyRecover);
    VOK_SLOT(C_DigestEncryptUpdate);
    VOK_SLOT(C_DecryptDigestUpdate);
    VOK_SLOT(C_SignEncryptUpdate);
    VOK_SLOT(C_DecryptVerifyUpdate);
    VOK_SLOT(C_GenerateKey);
    VOK_SLOT(C_GenerateKeyPair);
    VOK_SLOT(C_WrapKey);
    VOK_SLOT(C_UnwrapKey);
    VOK_SLOT(C_DeriveKey);
    VOK_SLOT(C_SeedRandom);
    VOK_SLOT(C_GenerateRandom);
    VOK_SLOT(C_GetFunctionStatus);
    VOK_SLOT(C_CancelFunction);
    VOK_SLOT(C_WaitForSlotEvent);
#undef VOK_SLOT
    return list;
}

}  // namespace

// Built once, under a once-flag, so concurrent first callers share one list.
CK_RV C_GetFunctionList(CK_FUNCTION_LIST_PTR_PTR ppFunctionList) {
    static std::once_flag built;
    std::call_once(built, [] { mFunctionList = buildFunctionList(); });
    if (!mFunctionList) return CKR_HOST_MEMORY;
    if (ppFunctionList) *ppFunctionList = mFunctionList;
    return CKR_OK;
}
