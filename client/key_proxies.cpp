// Key generation, wrapping, derivation, random numbers and the remaining
// general functions.

#include <algorithm>

#include "by_value.h"
#include "call_frame.h"
#include "marshal.h"

#define LOG_TAG "Vokpkcs11f"
#include "vok_log.h"

using namespace vok::client;

namespace {

void copyHandle(google::protobuf::uint64 value, CK_OBJECT_HANDLE_PTR out) {
    if (out) *out = value;
}

// The new key's handle, and what the module wrote into the mechanism's
// parameter (a PBE IV, SSL3/TLS key material) where the answer carries it.
template <class Response>
void copyKeyAnswer(const Response& r, CK_MECHANISM_PTR pMechanism, CK_OBJECT_HANDLE_PTR phKey) {
    copyHandle(r.phkey(), phKey);
    if (r.has_pparametervalue()) copyBackParameter(pMechanism, r.pparametervalue());
}

}  // namespace

CK_RV C_GenerateKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                    CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount, CK_OBJECT_HANDLE_PTR phKey) {
    VOK_LOGD("C_GenerateKey");
    return callService(
        "C_GenerateKey",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_generatekey();
            m->set_hsession(hSession);
            if (pMechanism) putMechanism(m->mutable_pmechanism(), pMechanism);
            putTemplate(m->mutable_ptemplate(), pTemplate, ulCount);
            m->set_ulcount(ulCount);
        },
        [&](const pkcs11::OperationResult& res) {
            if (res.has_generatekeyres()) copyKeyAnswer(res.generatekeyres(), pMechanism, phKey);
        });
}

CK_RV C_GenerateKeyPair(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                        CK_ATTRIBUTE_PTR pPublicKeyTemplate, CK_ULONG ulPublicKeyAttributeCount,
                        CK_ATTRIBUTE_PTR pPrivateKeyTemplate, CK_ULONG ulPrivateKeyAttributeCount,
                        CK_OBJECT_HANDLE_PTR phPublicKey, CK_OBJECT_HANDLE_PTR phPrivateKey) {
    VOK_LOGD("C_GenerateKeyPair");
    return callService(
        "C_GenerateKeyPair",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_generatekeypair();
            m->set_hsession(hSession);
            if (pMechanism) putMechanism(m->mutable_pmechanism(), pMechanism);
            putTemplate(m->mutable_ppublickeytemplate(), pPublicKeyTemplate,
                        ulPublicKeyAttributeCount);
            m->set_ulpublickeyattributecount(ulPublicKeyAttributeCount);
            putTemplate(m->mutable_pprivatekeytemplate(), pPrivateKeyTemplate,
                        ulPrivateKeyAttributeCount);
            m->set_ulprivatekeyattributecount(ulPrivateKeyAttributeCount);
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_generatekeypairres()) return;
            copyHandle(res.generatekeypairres().phpublickey(), phPublicKey);
            copyHandle(res.generatekeypairres().phprivatekey(), phPrivateKey);
        });
}

CK_RV C_WrapKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                CK_OBJECT_HANDLE hWrappingKey, CK_OBJECT_HANDLE hKey, CK_BYTE_PTR pWrappedKey,
                CK_ULONG_PTR pulWrappedKeyLen) {
    VOK_LOGD("C_WrapKey");
    const OutputBuffer out{pWrappedKey, pulWrappedKeyLen};
    return callService(
        "C_WrapKey",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_wrapkey();
            m->set_hsession(hSession);
            if (pMechanism) putMechanism(m->mutable_pmechanism(), pMechanism);
            m->set_hwrappingkey(hWrappingKey);
            m->set_hkey(hKey);
            if (out.present()) m->set_pwrappedkey(out.contents());
            m->set_pulwrappedkeylen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_wrapkeyres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.wrapkeyres();
            return copyBackOutput(res.result(), r.pwrappedkey(), r.pulwrappedkeylen(), out);
        });
}

// Logged as "C_UnWrapKey" and sent under that name, which is what the
// service's dispatch table knows.
CK_RV C_UnwrapKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                  CK_OBJECT_HANDLE hUnwrappingKey, CK_BYTE_PTR pWrappedKey,
                  CK_ULONG ulWrappedKeyLen, CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulAttributeCount,
                  CK_OBJECT_HANDLE_PTR phKey) {
    VOK_LOGD("C_UnWrapKey");
    return callService(
        "C_UnWrapKey",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_unwrapkey();
            m->set_hsession(hSession);
            if (pMechanism) putMechanism(m->mutable_pmechanism(), pMechanism);
            m->set_hunwrappingkey(hUnwrappingKey);
            if (const InputBuffer in{pWrappedKey, ulWrappedKeyLen}; in.present())
                m->set_pwrappedkey(in.contents());
            m->set_ulwrappedkeylen(ulWrappedKeyLen);
            putTemplate(m->mutable_ptemplate(), pTemplate, ulAttributeCount);
            m->set_ulattributecount(ulAttributeCount);
        },
        [&](const pkcs11::OperationResult& res) {
            if (res.has_unwrapkeyres()) copyKeyAnswer(res.unwrapkeyres(), pMechanism, phKey);
        });
}

CK_RV C_DeriveKey(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                  CK_OBJECT_HANDLE hBaseKey, CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulAttributeCount,
                  CK_OBJECT_HANDLE_PTR phKey) {
    VOK_LOGD("C_DeriveKey");
    return callService(
        "C_DeriveKey",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_derivekey();
            m->set_hsession(hSession);
            if (pMechanism) putMechanism(m->mutable_pmechanism(), pMechanism);
            m->set_hbasekey(hBaseKey);
            putTemplate(m->mutable_ptemplate(), pTemplate, ulAttributeCount);
            m->set_ulattributecount(ulAttributeCount);
        },
        [&](const pkcs11::OperationResult& res) {
            if (res.has_derivekeyres()) copyKeyAnswer(res.derivekeyres(), pMechanism, phKey);
        });
}

// The seed travels as a C string within its length, as deployed services
// expect; the length field still carries the caller's length.
CK_RV C_SeedRandom(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSeed, CK_ULONG ulSeedLen) {
    return callService(
        "C_SeedRandom",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_seedrandom();
            m->set_hsession(hSession);
            if (pSeed) m->set_pseed(cString(pSeed, ulSeedLen));
            m->set_ulseedlen(ulSeedLen);
        },
        [&](const pkcs11::OperationResult& res) {
            if (res.has_seedrandomres())
                copyIntoInput(res.seedrandomres().pseed(), pSeed, ulSeedLen);
        });
}

CK_RV C_GenerateRandom(CK_SESSION_HANDLE hSession, CK_BYTE_PTR RandomData, CK_ULONG ulRandomLen) {
    return callService(
        "C_GenerateRandom",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_generaterandom();
            m->set_hsession(hSession);
            if (RandomData) m->set_randomdata(cString(RandomData, ulRandomLen));
            m->set_ulrandomlen(ulRandomLen);
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_generaterandomres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.generaterandomres();
            const size_t arrived =
                static_cast<size_t>(std::min<CK_ULONG>(r.ulrandomlen(), r.randomdata().size()));
            copyIntoInput(r.randomdata().substr(0, arrived), RandomData, ulRandomLen);
            // Bytes the answer left unfilled are not random: no answer at all.
            if (res.result() == CKR_OK && RandomData && arrived < ulRandomLen)
                return kChannelFailure;
            return static_cast<CK_RV>(res.result());
        });
}

CK_RV C_GetFunctionStatus(CK_SESSION_HANDLE hSession) {
    VOK_LOGD("C_GetFunctionStatus");
    return callService(
        "C_GetFunctionStatus",
        [&](pkcs11::Operation& op) { op.mutable_getfunctionstatus()->set_hsession(hSession); },
        noCopyBack);
}

CK_RV C_CancelFunction(CK_SESSION_HANDLE hSession) {
    VOK_LOGD("C_CancelFunction");
    return callService(
        "C_CancelFunction",
        [&](pkcs11::Operation& op) { op.mutable_cancelfunction()->set_hsession(hSession); },
        noCopyBack);
}

// Holds the channel for as long as the module blocks; the channel's receive
// timeout ends a longer wait with all ones.
CK_RV C_WaitForSlotEvent(CK_FLAGS flags, CK_SLOT_ID_PTR pSlot, CK_VOID_PTR /*pReserved*/) {
    VOK_LOGD("C_WaitForSlotEvent");
    return callService(
        "C_WaitForSlotEvent",
        [&](pkcs11::Operation& op) { op.mutable_waitforslotevent()->set_flags(flags); },
        [&](const pkcs11::OperationResult& res) {
            if (res.has_waitforsloteventres() && pSlot) *pSlot = res.waitforsloteventres().pslot();
        });
}
