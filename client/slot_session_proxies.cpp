// Slot, token, session and login proxies.

#include <cstddef>
#include <cstdint>
#include <cstring>

#include "call_frame.h"
#include "marshal.h"

#define LOG_TAG "Vokpkcs11f"
#include "vok_log.h"

using namespace vok::client;

namespace {

// PKCS#11 fixes the token label at 32 bytes.
constexpr CK_ULONG kLabelSize = 32;

}  // namespace

CK_RV C_GetSlotList(CK_BBOOL tokenPresent, CK_SLOT_ID_PTR pSlotList, CK_ULONG_PTR pulCount) {
    VOK_LOGD("inside get slot list");
    const CK_ULONG capacity = valueOr0(pulCount);
    return callService(
        "C_GetSlotList",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_slotlist();
            VOK_LOGD("Instance created");
            m->set_tokenpresent(tokenPresent != 0);
            m->set_pulcount(capacity);
            if (!pSlotList) VOK_LOGD("inside pSlotList null");
            putList(m->mutable_slotidlist(), pSlotList, capacity);
            VOK_LOGD("serialize done and server called");
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_slotlistres()) return static_cast<CK_RV>(res.result());
            VOK_LOGD("Slot list res present");
            const auto& r = res.slotlistres();
            return copyBackList(res.result(), r.slotidlist(), r.pulcount(), pSlotList, capacity,
                                pulCount);
        });
}

CK_RV C_GetMechanismList(CK_SLOT_ID slotID, CK_MECHANISM_TYPE_PTR pMechanismList,
                         CK_ULONG_PTR pulCount) {
    VOK_LOGD("inside get mechanism list");
    const CK_ULONG capacity = valueOr0(pulCount);
    return callService(
        "C_GetMechanismList",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_mechanismlist();
            VOK_LOGD("Instance created");
            m->set_slotid(slotID);
            m->set_pulcount(capacity);
            if (!pMechanismList) VOK_LOGD("inside pMechanismList null");
            putList(m->mutable_pmechanismlist(), pMechanismList, capacity);
            VOK_LOGD("serialize done and server called");
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_mechanismlistres()) return static_cast<CK_RV>(res.result());
            VOK_LOGD("Mechanism list res present");
            const auto& r = res.mechanismlistres();
            return copyBackList(res.result(), r.pmechanismlist(), r.pulcount(), pMechanismList,
                                capacity, pulCount);
        });
}

// Same text rule as C_GetInfo: versions, manufacturerID, flags, then the
// description, whose full-width terminator clears manufacturerID[0].
CK_RV C_GetSlotInfo(CK_SLOT_ID slotID, CK_SLOT_INFO_PTR pInfo) {
    return callService(
        "C_GetSlotInfo", [&](pkcs11::Operation& op) { op.mutable_slotinfo()->set_slotid(slotID); },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_slotinfores() || !pInfo) return;
            const pkcs11::CK_SLOT_INFO& info = res.slotinfores().pinfo();
            pInfo->hardwareVersion.major = versionByte(info.hardwareversion().vermajor());
            pInfo->hardwareVersion.minor = versionByte(info.hardwareversion().verminor());
            pInfo->firmwareVersion.major = versionByte(info.firmwareversion().vermajor());
            pInfo->firmwareVersion.minor = versionByte(info.firmwareversion().verminor());
            copyTerminatedText(pInfo, offsetof(CK_SLOT_INFO, manufacturerID),
                               sizeof(pInfo->manufacturerID), info.manufacturerid());
            pInfo->flags = info.flags();
            copyTerminatedText(pInfo, offsetof(CK_SLOT_INFO, slotDescription),
                               sizeof(pInfo->slotDescription), info.slotdescription());
        });
}

CK_RV C_GetTokenInfo(CK_SLOT_ID slotID, CK_TOKEN_INFO_PTR pInfo) {
    return callService(
        "C_GetTokenInfo",
        [&](pkcs11::Operation& op) { op.mutable_tokeninfo()->set_slotid(slotID); },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_tokeninfores() || !pInfo) return;
            const pkcs11::CK_TOKEN_INFO& info = res.tokeninfores().pinfo();
            pInfo->hardwareVersion.major = versionByte(info.hardwareversion().vermajor());
            pInfo->hardwareVersion.minor = versionByte(info.hardwareversion().verminor());
            pInfo->firmwareVersion.major = versionByte(info.firmwareversion().vermajor());
            pInfo->firmwareVersion.minor = versionByte(info.firmwareversion().verminor());
            copyPaddedText(pInfo->label, sizeof(pInfo->label), info.label());
            copyPaddedText(pInfo->manufacturerID, sizeof(pInfo->manufacturerID),
                           info.manufacturerid());
            copyPaddedText(pInfo->model, sizeof(pInfo->model), info.model());
            copyPaddedText(pInfo->serialNumber, sizeof(pInfo->serialNumber), info.serialnumber());
            copyPaddedText(pInfo->utcTime, sizeof(pInfo->utcTime), info.utctime());
            pInfo->flags = info.flags();
            pInfo->ulMaxSessionCount = info.ulmaxsessioncount();
            pInfo->ulSessionCount = info.ulsessioncount();
            pInfo->ulMaxRwSessionCount = info.ulmaxrwsessioncount();
            pInfo->ulRwSessionCount = info.ulrwsessioncount();
            pInfo->ulMaxPinLen = info.ulmaxpinlen();
            pInfo->ulMinPinLen = info.ulminpinlen();
            pInfo->ulTotalPublicMemory = info.ultotalpublicmemory();
            pInfo->ulFreePublicMemory = info.ulfreepublicmemory();
            pInfo->ulTotalPrivateMemory = info.ultotalprivatememory();
            pInfo->ulFreePrivateMemory = info.ulfreeprivatememory();
        });
}

CK_RV C_GetMechanismInfo(CK_SLOT_ID slotID, CK_MECHANISM_TYPE type, CK_MECHANISM_INFO_PTR pInfo) {
    return callService(
        "C_GetMechanismInfo",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_mechanisminfo();
            m->set_slotid(slotID);
            m->set_type(type);
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_mechanisminfores() || !pInfo) return;
            const pkcs11::CK_MECHANISM_INFO& info = res.mechanisminfores().pinfo();
            pInfo->ulMinKeySize = info.ulminkeysize();
            pInfo->ulMaxKeySize = info.ulmaxkeysize();
            pInfo->flags = info.flags();
        });
}

CK_RV C_InitToken(CK_SLOT_ID slotID, CK_UTF8CHAR_PTR pPin, CK_ULONG ulPinLen,
                  CK_UTF8CHAR_PTR pLabel) {
    VOK_LOGD("Inside InitToken");
    return callService(
        "C_InitToken",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_inittoken();
            m->set_slotid(slotID);
            if (pPin) m->set_ppin(cString(pPin, ulPinLen));
            m->set_ulpinlen(ulPinLen);
            if (pLabel) m->set_plabel(cString(pLabel, kLabelSize));
        },
        noCopyBack);
}

// Sent as "C_InitPIN" although the service knows the command as "C_InitPin":
// deployed services answer it with nothing, so the caller sees all ones.
CK_RV C_InitPIN(CK_SESSION_HANDLE hSession, CK_UTF8CHAR_PTR pPin, CK_ULONG ulPinLen) {
    VOK_LOGD("Inside InitPin");
    return callService(
        "C_InitPIN",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_initpin();
            m->set_hsession(hSession);
            if (pPin) m->set_ppin(cString(pPin, ulPinLen));
            m->set_ulpinlen(ulPinLen);
        },
        SuccessLines{"C_InitPin"}, noCopyBack);
}

// Same deliberate name mismatch as C_InitPIN ("C_SetPIN" against "C_SetPin").
CK_RV C_SetPIN(CK_SESSION_HANDLE hSession, CK_UTF8CHAR_PTR pOldPin, CK_ULONG ulOldLen,
               CK_UTF8CHAR_PTR pNewPin, CK_ULONG ulNewLen) {
    VOK_LOGD("Inside SetPin");
    return callService(
        "C_SetPIN",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_setpin();
            m->set_hsession(hSession);
            if (pOldPin) m->set_poldpin(cString(pOldPin, ulOldLen));
            m->set_uloldlen(ulOldLen);
            if (pNewPin) m->set_pnewpin(cString(pNewPin, ulNewLen));
            m->set_ulnewlen(ulNewLen);
        },
        SuccessLines{"C_SetPin"}, noCopyBack);
}

// pApplication and Notify stay on this side: no callback ever crosses the
// process boundary.
CK_RV C_OpenSession(CK_SLOT_ID slotID, CK_FLAGS flags, CK_VOID_PTR /*pApplication*/,
                    CK_NOTIFY /*Notify*/, CK_SESSION_HANDLE_PTR phSession) {
    VOK_LOGD("Inside Open Session");
    return callService(
        "C_OpenSession",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_openses();
            VOK_LOGD("Instance created");
            m->set_slotid(slotID);
            m->set_flags(flags);
            VOK_LOGD("Open Session - before call to server");
            VOK_LOGD("Open Session - after call to server");
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_opensesres()) return;
            const CK_SESSION_HANDLE session = res.opensesres().phsession();
            if (session == 0) VOK_LOGD("response session NULL");
            if (phSession)
                *phSession = session;
            else
                VOK_LOGD("phSession NULL");
        });
}

CK_RV C_CloseSession(CK_SESSION_HANDLE hSession) {
    return callService(
        "C_CloseSession",
        [&](pkcs11::Operation& op) { op.mutable_closeses()->set_hsession(hSession); }, noCopyBack);
}

CK_RV C_CloseAllSessions(CK_SLOT_ID slotID) {
    VOK_LOGD("C_CloseAllSessions");
    return callService(
        "C_CloseAllSessions",
        [&](pkcs11::Operation& op) { op.mutable_closeallsessions()->set_slotid(slotID); },
        noCopyBack);
}

CK_RV C_GetSessionInfo(CK_SESSION_HANDLE hSession, CK_SESSION_INFO_PTR pInfo) {
    return callService(
        "C_GetSessionInfo",
        [&](pkcs11::Operation& op) { op.mutable_sessioninfo()->set_hsession(hSession); },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_sessioninfores() || !pInfo) return;
            const pkcs11::CK_SESSION_INFO& info = res.sessioninfores().pinfo();
            pInfo->slotID = info.slotid();
            pInfo->state = info.state();
            pInfo->flags = info.flags();
            pInfo->ulDeviceError = info.uldeviceerror();
        });
}

// The state buffer travels by the output-buffer rule: its current contents as
// a C string within the caller's stated length.
CK_RV C_GetOperationState(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pOperationState,
                          CK_ULONG_PTR pulOperationStateLen) {
    VOK_LOGD("C_GetOperationState");
    const OutputBuffer out{pOperationState, pulOperationStateLen};
    return callService(
        "C_GetOperationState",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_getoperationstate();
            m->set_hsession(hSession);
            if (out.present()) m->set_poperationstate(out.contents());
            m->set_puloperationstatelen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_getoperationstateres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.getoperationstateres();
            return copyBackOutput(res.result(), r.poperationstate(), r.puloperationstatelen(), out);
        });
}

CK_RV C_SetOperationState(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pOperationState,
                          CK_ULONG ulOperationStateLen, CK_OBJECT_HANDLE hEncryptionKey,
                          CK_OBJECT_HANDLE hAuthenticationKey) {
    VOK_LOGD("C_SetOperationState");
    return callService(
        "C_SetOperationState",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_setoperationstate();
            m->set_hsession(hSession);
            if (const InputBuffer in{pOperationState, ulOperationStateLen}; in.present())
                m->set_poperationstate(in.contents());
            m->set_uloperationstatelen(ulOperationStateLen);
            m->set_hencryptionkey(hEncryptionKey);
            m->set_hauthenticationkey(hAuthenticationKey);
        },
        noCopyBack);
}

CK_RV C_Login(CK_SESSION_HANDLE hSession, CK_USER_TYPE userType, CK_UTF8CHAR_PTR pPin,
              CK_ULONG ulPinLen) {
    return callService(
        "C_Login",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_login();
            m->set_hsession(hSession);
            m->set_usertype(userType);
            if (pPin) m->set_ppin(cString(pPin, ulPinLen));
            m->set_ulpinlen(ulPinLen);
        },
        noCopyBack);
}

CK_RV C_Logout(CK_SESSION_HANDLE hSession) {
    return callService(
        "C_Logout", [&](pkcs11::Operation& op) { op.mutable_logout()->set_hsession(hSession); },
        noCopyBack);
}
