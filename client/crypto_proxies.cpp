// Encryption, decryption, digest, signature and verification proxies.

#include "call_frame.h"
#include "marshal.h"

#define LOG_TAG "Vokpkcs11f"
#include "vok_log.h"

using namespace vok::client;

CK_RV C_EncryptInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                    CK_OBJECT_HANDLE hKey) {
    return callService(
        "C_EncryptInit",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_encinit();
            m->set_hsession(hSession);
            if (pMechanism) putMechanism(m->mutable_mechanism(), pMechanism);
            m->set_hkey(hKey);
        },
        noCopyBack);
}

CK_RV C_DecryptInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                    CK_OBJECT_HANDLE hKey) {
    return callService(
        "C_DecryptInit",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_decint();
            m->set_hsession(hSession);
            if (pMechanism) putMechanism(m->mutable_mechanism(), pMechanism);
            m->set_hkey(hKey);
        },
        noCopyBack);
}

CK_RV C_DigestInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism) {
    return callService(
        "C_DigestInit",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_digestint();
            m->set_hsession(hSession);
            if (pMechanism) putMechanism(m->mutable_mechanism(), pMechanism);
        },
        noCopyBack);
}

CK_RV C_SignInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism, CK_OBJECT_HANDLE hKey) {
    VOK_LOGD("C_SignInit");
    return callService(
        "C_SignInit",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_signinit();
            m->set_hsession(hSession);
            if (pMechanism) putMechanism(m->mutable_mechanism(), pMechanism);
            m->set_hkey(hKey);
            VOK_LOGD("C_SignInit before serialize");
        },
        noCopyBack);
}

CK_RV C_VerifyInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism, CK_OBJECT_HANDLE hKey) {
    return callService(
        "C_VerifyInit",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_verifyinit();
            m->set_hsession(hSession);
            if (pMechanism) putMechanism(m->mutable_mechanism(), pMechanism);
            m->set_hkey(hKey);
        },
        noCopyBack);
}

CK_RV C_SignRecoverInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                        CK_OBJECT_HANDLE hKey) {
    VOK_LOGD("C_SignRecoverInit");
    return callService(
        "C_SignRecoverInit",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_signrecoverinit();
            m->set_hsession(hSession);
            if (pMechanism) putMechanism(m->mutable_pmechanism(), pMechanism);
            m->set_hkey(hKey);
        },
        noCopyBack);
}

CK_RV C_VerifyRecoverInit(CK_SESSION_HANDLE hSession, CK_MECHANISM_PTR pMechanism,
                          CK_OBJECT_HANDLE hKey) {
    return callService(
        "C_VerifyRecoverInit",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_verifyrecoverinit();
            m->set_hsession(hSession);
            if (pMechanism) putMechanism(m->mutable_pmechanism(), pMechanism);
            m->set_hkey(hKey);
        },
        noCopyBack);
}

CK_RV C_Encrypt(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                CK_BYTE_PTR pEncryptedData, CK_ULONG_PTR pulEncryptedDataLen) {
    const OutputBuffer out{pEncryptedData, pulEncryptedDataLen};
    return callService(
        "C_Encrypt",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_enc();
            m->set_hsession(hSession);
            if (const InputBuffer in{pData, ulDataLen}; in.present()) m->set_pdata(in.contents());
            m->set_uldatalen(ulDataLen);
            if (out.present()) m->set_pencrypteddata(out.contents());
            m->set_pulencrypteddatalen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_encres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.encres();
            return copyBackOutput(res.result(), r.pencrypteddata(), r.pulencrypteddatalen(), out);
        });
}

CK_RV C_EncryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen,
                      CK_BYTE_PTR pEncryptedPart, CK_ULONG_PTR pulEncryptedPartLen) {
    VOK_LOGD("C_EncryptUpdate");
    const OutputBuffer out{pEncryptedPart, pulEncryptedPartLen};
    return callService(
        "C_EncryptUpdate",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_encryptupdate();
            m->set_hsession(hSession);
            if (const InputBuffer in{pPart, ulPartLen}; in.present()) m->set_ppart(in.contents());
            m->set_ulpartlen(ulPartLen);
            if (out.present()) m->set_pencryptedpart(out.contents());
            m->set_pulencryptedpartlen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_encryptupdateres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.encryptupdateres();
            return copyBackOutput(res.result(), r.pencryptedpart(), r.pulencryptedpartlen(), out);
        });
}

CK_RV C_EncryptFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pLastEncryptedPart,
                     CK_ULONG_PTR pulLastEncryptedPartLen) {
    VOK_LOGD("C_EncryptFinal");
    const OutputBuffer out{pLastEncryptedPart, pulLastEncryptedPartLen};
    return callService(
        "C_EncryptFinal",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_encryptfinal();
            m->set_hsession(hSession);
            if (out.present()) m->set_plastencryptedpart(out.contents());
            m->set_pullastencryptedpartlen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_encryptfinalres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.encryptfinalres();
            return copyBackOutput(res.result(), r.plastencryptedpart(), r.pullastencryptedpartlen(),
                                  out);
        });
}

CK_RV C_Decrypt(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedData, CK_ULONG ulEncryptedDataLen,
                CK_BYTE_PTR pData, CK_ULONG_PTR pulDataLen) {
    const OutputBuffer out{pData, pulDataLen};
    return callService(
        "C_Decrypt",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_dec();
            m->set_hsession(hSession);
            if (const InputBuffer in{pEncryptedData, ulEncryptedDataLen}; in.present())
                m->set_pencrypteddata(in.contents());
            m->set_ulencrypteddatalen(ulEncryptedDataLen);
            if (out.present()) m->set_pdata(out.contents());
            m->set_puldatalen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_decres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.decres();
            return copyBackOutput(res.result(), r.pdata(), r.puldatalen(), out);
        });
}

CK_RV C_DecryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                      CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart, CK_ULONG_PTR pulPartLen) {
    VOK_LOGD("C_DecryptUpdate");
    const OutputBuffer out{pPart, pulPartLen};
    return callService(
        "C_DecryptUpdate",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_decryptupdate();
            m->set_hsession(hSession);
            if (const InputBuffer in{pEncryptedPart, ulEncryptedPartLen}; in.present())
                m->set_pencryptedpart(in.contents());
            m->set_ulencryptedpartlen(ulEncryptedPartLen);
            if (out.present()) m->set_ppart(out.contents());
            m->set_pulpartlen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_decryptupdateres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.decryptupdateres();
            return copyBackOutput(res.result(), r.ppart(), r.pulpartlen(), out);
        });
}

CK_RV C_DecryptFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pLastPart,
                     CK_ULONG_PTR pulLastPartLen) {
    VOK_LOGD("C_DecryptFinal");
    const OutputBuffer out{pLastPart, pulLastPartLen};
    return callService(
        "C_DecryptFinal",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_decryptfinal();
            m->set_hsession(hSession);
            if (out.present()) m->set_plastpart(out.contents());
            m->set_pullastpartlen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_decryptfinalres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.decryptfinalres();
            return copyBackOutput(res.result(), r.plastpart(), r.pullastpartlen(), out);
        });
}

CK_RV C_Digest(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
               CK_BYTE_PTR pDigest, CK_ULONG_PTR pulDigestLen) {
    const OutputBuffer out{pDigest, pulDigestLen};
    return callService(
        "C_Digest",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_digest();
            m->set_hsession(hSession);
            if (const InputBuffer in{pData, ulDataLen}; in.present()) m->set_pdata(in.contents());
            m->set_uldatalen(ulDataLen);
            if (out.present()) m->set_pdigest(out.contents());
            m->set_puldigestlen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_digestres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.digestres();
            return copyBackOutput(res.result(), r.pdigest(), r.puldigestlen(), out);
        });
}

CK_RV C_DigestFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pDigest, CK_ULONG_PTR pulDigestLen) {
    const OutputBuffer out{pDigest, pulDigestLen};
    return callService(
        "C_DigestFinal",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_digestfinal();
            m->set_hsession(hSession);
            if (out.present()) m->set_pdigest(out.contents());
            m->set_puldigestlen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_digestfinalres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.digestfinalres();
            return copyBackOutput(res.result(), r.pdigest(), r.puldigestlen(), out);
        });
}

CK_RV C_Sign(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
             CK_BYTE_PTR pSignature, CK_ULONG_PTR pulSignatureLen) {
    VOK_LOGD("C_Sign");
    const OutputBuffer out{pSignature, pulSignatureLen};
    return callService(
        "C_Sign",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_sign();
            m->set_hsession(hSession);
            if (const InputBuffer in{pData, ulDataLen}; in.present()) m->set_pdata(in.contents());
            m->set_uldatalen(ulDataLen);
            if (out.present()) m->set_psignature(out.contents());
            m->set_pulsignaturelen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_signres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.signres();
            return copyBackOutput(res.result(), r.psignature(), r.pulsignaturelen(), out);
        });
}

CK_RV C_SignFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature,
                  CK_ULONG_PTR pulSignatureLen) {
    VOK_LOGD("C_SignFinal");
    const OutputBuffer out{pSignature, pulSignatureLen};
    return callService(
        "C_SignFinal",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_signfinal();
            m->set_hsession(hSession);
            if (out.present()) m->set_psignature(out.contents());
            m->set_pulsignaturelen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_signfinalres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.signfinalres();
            return copyBackOutput(res.result(), r.psignature(), r.pulsignaturelen(), out);
        });
}

CK_RV C_SignRecover(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
                    CK_BYTE_PTR pSignature, CK_ULONG_PTR pulSignatureLen) {
    VOK_LOGD("C_SignRecover");
    const OutputBuffer out{pSignature, pulSignatureLen};
    return callService(
        "C_SignRecover",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_signrecover();
            m->set_hsession(hSession);
            if (const InputBuffer in{pData, ulDataLen}; in.present()) m->set_pdata(in.contents());
            m->set_uldatalen(ulDataLen);
            if (out.present()) m->set_psignature(out.contents());
            m->set_pulsignaturelen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_signrecoverres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.signrecoverres();
            return copyBackOutput(res.result(), r.psignature(), r.pulsignaturelen(), out);
        });
}

CK_RV C_VerifyRecover(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature, CK_ULONG ulSignatureLen,
                      CK_BYTE_PTR pData, CK_ULONG_PTR pulDataLen) {
    VOK_LOGD("C_VerifyRecover");
    const OutputBuffer out{pData, pulDataLen};
    return callService(
        "C_VerifyRecover",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_verifyrecover();
            m->set_hsession(hSession);
            if (const InputBuffer in{pSignature, ulSignatureLen}; in.present())
                m->set_psignature(in.contents());
            m->set_ulsignaturelen(ulSignatureLen);
            if (out.present()) m->set_pdata(out.contents());
            m->set_puldatalen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_verifyrecoverres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.verifyrecoverres();
            return copyBackOutput(res.result(), r.pdata(), r.puldatalen(), out);
        });
}

CK_RV C_DigestEncryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen,
                            CK_BYTE_PTR pEncryptedPart, CK_ULONG_PTR pulEncryptedPartLen) {
    VOK_LOGD("C_DigestEncryptUpdate");
    const OutputBuffer out{pEncryptedPart, pulEncryptedPartLen};
    return callService(
        "C_DigestEncryptUpdate",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_digestencryptupdate();
            m->set_hsession(hSession);
            if (const InputBuffer in{pPart, ulPartLen}; in.present()) m->set_ppart(in.contents());
            m->set_ulpartlen(ulPartLen);
            if (out.present()) m->set_pencryptedpart(out.contents());
            m->set_pulencryptedpartlen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_digestencryptupdateres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.digestencryptupdateres();
            return copyBackOutput(res.result(), r.pencryptedpart(), r.pulencryptedpartlen(), out);
        });
}

CK_RV C_DecryptDigestUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                            CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart,
                            CK_ULONG_PTR pulPartLen) {
    VOK_LOGD("C_DecryptDigestUpdate");
    const OutputBuffer out{pPart, pulPartLen};
    return callService(
        "C_DecryptDigestUpdate",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_decryptdigestupdate();
            m->set_hsession(hSession);
            if (const InputBuffer in{pEncryptedPart, ulEncryptedPartLen}; in.present())
                m->set_pencryptedpart(in.contents());
            m->set_ulencryptedpartlen(ulEncryptedPartLen);
            if (out.present()) m->set_ppart(out.contents());
            m->set_pulpartlen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_decryptdigestupdateres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.decryptdigestupdateres();
            return copyBackOutput(res.result(), r.ppart(), r.pulpartlen(), out);
        });
}

CK_RV C_SignEncryptUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen,
                          CK_BYTE_PTR pEncryptedPart, CK_ULONG_PTR pulEncryptedPartLen) {
    VOK_LOGD("C_SignEncryptUpdate");
    const OutputBuffer out{pEncryptedPart, pulEncryptedPartLen};
    return callService(
        "C_SignEncryptUpdate",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_signencryptupdate();
            m->set_hsession(hSession);
            if (const InputBuffer in{pPart, ulPartLen}; in.present()) m->set_ppart(in.contents());
            m->set_ulpartlen(ulPartLen);
            if (out.present()) m->set_pencryptedpart(out.contents());
            m->set_pulencryptedpartlen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_signencryptupdateres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.signencryptupdateres();
            return copyBackOutput(res.result(), r.pencryptedpart(), r.pulencryptedpartlen(), out);
        });
}

CK_RV C_DecryptVerifyUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pEncryptedPart,
                            CK_ULONG ulEncryptedPartLen, CK_BYTE_PTR pPart,
                            CK_ULONG_PTR pulPartLen) {
    VOK_LOGD("C_DecryptVerifyUpdate");
    const OutputBuffer out{pPart, pulPartLen};
    return callService(
        "C_DecryptVerifyUpdate",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_decryptverifyupdate();
            m->set_hsession(hSession);
            if (const InputBuffer in{pEncryptedPart, ulEncryptedPartLen}; in.present())
                m->set_pencryptedpart(in.contents());
            m->set_ulencryptedpartlen(ulEncryptedPartLen);
            if (out.present()) m->set_ppart(out.contents());
            m->set_pulpartlen(out.capacity());
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_decryptverifyupdateres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.decryptverifyupdateres();
            return copyBackOutput(res.result(), r.ppart(), r.pulpartlen(), out);
        });
}

CK_RV C_DigestUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen) {
    VOK_LOGD("C_DigestUpdate");
    return callService(
        "C_DigestUpdate",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_digestupdate();
            m->set_hsession(hSession);
            if (const InputBuffer in{pPart, ulPartLen}; in.present()) m->set_ppart(in.contents());
            m->set_ulpartlen(ulPartLen);
        },
        noCopyBack);
}

CK_RV C_SignUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen) {
    VOK_LOGD("C_SignUpdate");
    return callService(
        "C_SignUpdate",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_signupdate();
            m->set_hsession(hSession);
            if (const InputBuffer in{pPart, ulPartLen}; in.present()) m->set_ppart(in.contents());
            m->set_ulpartlen(ulPartLen);
        },
        noCopyBack);
}

CK_RV C_VerifyUpdate(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pPart, CK_ULONG ulPartLen) {
    VOK_LOGD("C_VerifyUpdate");
    return callService(
        "C_VerifyUpdate",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_verifyupdate();
            m->set_hsession(hSession);
            if (const InputBuffer in{pPart, ulPartLen}; in.present()) m->set_ppart(in.contents());
            m->set_ulpartlen(ulPartLen);
        },
        noCopyBack);
}

CK_RV C_VerifyFinal(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pSignature, CK_ULONG ulSignatureLen) {
    VOK_LOGD("C_VerifyFinal");
    return callService(
        "C_VerifyFinal",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_verifyfinal();
            m->set_hsession(hSession);
            if (const InputBuffer in{pSignature, ulSignatureLen}; in.present())
                m->set_psignature(in.contents());
            m->set_ulsignaturelen(ulSignatureLen);
        },
        noCopyBack);
}

CK_RV C_DigestKey(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hKey) {
    VOK_LOGD("C_DigestKey");
    return callService(
        "C_DigestKey",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_digestkey();
            m->set_hsession(hSession);
            m->set_hkey(hKey);
        },
        noCopyBack);
}

// The signature travels as a C string within its length, as deployed services
// expect; the length field still carries the caller's length.
CK_RV C_Verify(CK_SESSION_HANDLE hSession, CK_BYTE_PTR pData, CK_ULONG ulDataLen,
               CK_BYTE_PTR pSignature, CK_ULONG ulSignatureLen) {
    return callService(
        "C_Verify",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_verify();
            m->set_hsession(hSession);
            if (const InputBuffer in{pData, ulDataLen}; in.present()) m->set_pdata(in.contents());
            m->set_uldatalen(ulDataLen);
            if (pSignature) m->set_psignature(cString(pSignature, ulSignatureLen));
            m->set_ulsignaturelen(ulSignatureLen);
        },
        [&](const pkcs11::OperationResult& res) {
            if (res.has_verifyres())
                copyIntoInput(res.verifyres().psignature(), pSignature, ulSignatureLen);
        });
}
