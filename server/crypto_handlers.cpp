// Encryption, decryption, digest, signature and verification handlers, with
// their Init calls and the dual-function updates.

#include "crypto_marshal.h"
#include "handler_frame.h"

#define LOG_TAG "Vokpkcs11f_Server"
#include "vok_log.h"

using namespace vok::server;

namespace {

void logModulePresent() { VOK_LOGD("ckpFunctions not NULL"); }
void logOutputAllocated() { VOK_LOGD("sigdata memory allocated"); }

}  // namespace

// ---- Encryption ------------------------------------------------------------------

std::string C_EncryptInit_Server(const std::string& request) {
    return serve(request, "C_EncryptInit", [](pkcs11::OperationResult&) {
        const pkcs11::C_EncryptInit& m = operation.encinit();
        NativeMechanism mechanism(VOK_SENT(m, mechanism));
        rv = offered(ckpFunctions->C_EncryptInit)(m.hsession(), mechanism.get(), m.hkey());
    });
}

std::string C_Encrypt_Server(const std::string& request) {
    return serve(request, "C_Encrypt", [](pkcs11::OperationResult& res) {
        const pkcs11::C_Encrypt& m = operation.enc();
        DataBuffers io = singlePart(VOK_SENT(m, pdata), m.uldatalen(), m.has_pencrypteddata(),
                                    m.pulencrypteddatalen());
        rv = offered(ckpFunctions->C_Encrypt)(m.hsession(), io.input.data(), m.uldatalen(),
                                              io.output.data(), io.output.length());
        res.mutable_encres()->set_pencrypteddata(io.output.written());
        res.mutable_encres()->set_pulencrypteddatalen(io.output.reported());
    });
}

std::string C_EncryptUpdate_Server(const std::string& request) {
    return serve(request, "C_EncryptUpdate", [](pkcs11::OperationResult& res) {
        const pkcs11::C_EncryptUpdate& m = operation.encryptupdate();
        DataBuffers io = multiPart(VOK_SENT(m, ppart), m.ulpartlen(), m.has_pencryptedpart(),
                                   m.pulencryptedpartlen());
        rv = offered(ckpFunctions->C_EncryptUpdate)(m.hsession(), io.input.data(), m.ulpartlen(),
                                                    io.output.data(), io.output.length());
        res.mutable_encryptupdateres()->set_pencryptedpart(io.output.written());
        res.mutable_encryptupdateres()->set_pulencryptedpartlen(io.output.reported());
    });
}

std::string C_EncryptFinal_Server(const std::string& request) {
    return serve(request, "C_EncryptFinal", [](pkcs11::OperationResult& res) {
        const pkcs11::C_EncryptFinal& m = operation.encryptfinal();
        Output out(m.has_plastencryptedpart(), m.pullastencryptedpartlen());
        rv = offered(ckpFunctions->C_EncryptFinal)(m.hsession(), out.data(), out.length());
        res.mutable_encryptfinalres()->set_plastencryptedpart(out.written());
        res.mutable_encryptfinalres()->set_pullastencryptedpartlen(out.reported());
    });
}

// ---- Decryption ------------------------------------------------------------------

std::string C_DecryptInit_Server(const std::string& request) {
    return serve(request, "C_DecryptInit", [](pkcs11::OperationResult&) {
        const pkcs11::C_DecryptInit& m = operation.decint();
        NativeMechanism mechanism(VOK_SENT(m, mechanism));
        rv = offered(ckpFunctions->C_DecryptInit)(m.hsession(), mechanism.get(), m.hkey());
    });
}

std::string C_Decrypt_Server(const std::string& request) {
    return serve(request, "C_Decrypt", [](pkcs11::OperationResult& res) {
        const pkcs11::C_Decrypt& m = operation.dec();
        DataBuffers io = singlePart(VOK_SENT(m, pencrypteddata), m.ulencrypteddatalen(),
                                    m.has_pdata(), m.puldatalen());
        rv = offered(ckpFunctions->C_Decrypt)(m.hsession(), io.input.data(), m.ulencrypteddatalen(),
                                              io.output.data(), io.output.length());
        res.mutable_decres()->set_pdata(io.output.written());
        res.mutable_decres()->set_puldatalen(io.output.reported());
    });
}

std::string C_DecryptUpdate_Server(const std::string& request) {
    return serve(request, "C_DecryptUpdate", [](pkcs11::OperationResult& res) {
        const pkcs11::C_DecryptUpdate& m = operation.decryptupdate();
        DataBuffers io = multiPart(VOK_SENT(m, pencryptedpart), m.ulencryptedpartlen(),
                                   m.has_ppart(), m.pulpartlen());
        logOutputAllocated();
        rv = offered(ckpFunctions->C_DecryptUpdate)(m.hsession(), io.input.data(),
                                                    m.ulencryptedpartlen(), io.output.data(),
                                                    io.output.length());
        res.mutable_decryptupdateres()->set_ppart(io.output.written());
        res.mutable_decryptupdateres()->set_pulpartlen(io.output.reported());
    });
}

std::string C_DecryptFinal_Server(const std::string& request) {
    return serve(request, "C_DecryptFinal", [](pkcs11::OperationResult& res) {
        const pkcs11::C_DecryptFinal& m = operation.decryptfinal();
        Output out(m.has_plastpart(), m.pullastpartlen());
        rv = offered(ckpFunctions->C_DecryptFinal)(m.hsession(), out.data(), out.length());
        res.mutable_decryptfinalres()->set_plastpart(out.written());
        res.mutable_decryptfinalres()->set_pullastpartlen(out.reported());
    });
}

// ---- Digest ----------------------------------------------------------------------

std::string C_DigestInit_Server(const std::string& request) {
    return serve(request, "C_DigestInit", [](pkcs11::OperationResult&) {
        const pkcs11::C_DigestInit& m = operation.digestint();
        NativeMechanism mechanism(VOK_SENT(m, mechanism));
        rv = offered(ckpFunctions->C_DigestInit)(m.hsession(), mechanism.get());
    });
}

std::string C_Digest_Server(const std::string& request) {
    return serve(request, "C_Digest", [](pkcs11::OperationResult& res) {
        const pkcs11::C_Digest& m = operation.digest();
        DataBuffers io =
            singlePart(VOK_SENT(m, pdata), m.uldatalen(), m.has_pdigest(), m.puldigestlen());
        rv = offered(ckpFunctions->C_Digest)(m.hsession(), io.input.data(), m.uldatalen(),
                                             io.output.data(), io.output.length());
        res.mutable_digestres()->set_pdigest(io.output.written());
        res.mutable_digestres()->set_puldigestlen(io.output.reported());
    });
}

std::string C_DigestUpdate_Server(const std::string& request) {
    return serve(request, "C_DigestUpdate", [](pkcs11::OperationResult&) {
        const pkcs11::C_DigestUpdate& m = operation.digestupdate();
        Input part(VOK_SENT(m, ppart), m.ulpartlen());
        rv = offered(ckpFunctions->C_DigestUpdate)(m.hsession(), part.data(), m.ulpartlen());
    });
}

std::string C_DigestKey_Server(const std::string& request) {
    return serve(request, "C_DigestKey", [](pkcs11::OperationResult&) {
        const pkcs11::C_DigestKey& m = operation.digestkey();
        rv = offered(ckpFunctions->C_DigestKey)(m.hsession(), m.hkey());
    });
}

std::string C_DigestFinal_Server(const std::string& request) {
    return serve(request, "C_DigestFinal", [](pkcs11::OperationResult& res) {
        const pkcs11::C_DigestFinal& m = operation.digestfinal();
        Output out(m.has_pdigest(), m.puldigestlen());
        rv = offered(ckpFunctions->C_DigestFinal)(m.hsession(), out.data(), out.length());
        res.mutable_digestfinalres()->set_pdigest(out.written());
        res.mutable_digestfinalres()->set_puldigestlen(out.reported());
    });
}

// ---- Signature -------------------------------------------------------------------

std::string C_SignInit_Server(const std::string& request) {
    return serve(request, "C_SignInit", [](pkcs11::OperationResult&) {
        const pkcs11::C_SignInit& m = operation.signinit();
        NativeMechanism mechanism(VOK_SENT(m, mechanism));
        rv = offered(ckpFunctions->C_SignInit)(m.hsession(), mechanism.get(), m.hkey());
    });
}

std::string C_Sign_Server(const std::string& request) {
    return serve(request, "C_Sign", [](pkcs11::OperationResult& res) {
        logModulePresent();
        const pkcs11::C_Sign& m = operation.sign();
        DataBuffers io =
            singlePart(VOK_SENT(m, pdata), m.uldatalen(), m.has_psignature(), m.pulsignaturelen());
        logOutputAllocated();
        rv = offered(ckpFunctions->C_Sign)(m.hsession(), io.input.data(), m.uldatalen(),
                                           io.output.data(), io.output.length());
        res.mutable_signres()->set_psignature(io.output.written());
        res.mutable_signres()->set_pulsignaturelen(io.output.reported());
    });
}

std::string C_SignUpdate_Server(const std::string& request) {
    return serve(request, "C_SignUpdate", [](pkcs11::OperationResult&) {
        logModulePresent();
        const pkcs11::C_SignUpdate& m = operation.signupdate();
        Input part(VOK_SENT(m, ppart), m.ulpartlen());
        rv = offered(ckpFunctions->C_SignUpdate)(m.hsession(), part.data(), m.ulpartlen());
    });
}

std::string C_SignFinal_Server(const std::string& request) {
    return serve(request, "C_SignFinal", [](pkcs11::OperationResult& res) {
        logModulePresent();
        const pkcs11::C_SignFinal& m = operation.signfinal();
        Output out(m.has_psignature(), m.pulsignaturelen());
        logOutputAllocated();
        rv = offered(ckpFunctions->C_SignFinal)(m.hsession(), out.data(), out.length());
        res.mutable_signfinalres()->set_psignature(out.written());
        res.mutable_signfinalres()->set_pulsignaturelen(out.reported());
    });
}

std::string C_SignRecoverInit_Server(const std::string& request) {
    return serve(request, "C_SignRecoverInit", [](pkcs11::OperationResult&) {
        const pkcs11::C_SignRecoverInit& m = operation.signrecoverinit();
        NativeMechanism mechanism(VOK_SENT(m, pmechanism));
        rv = offered(ckpFunctions->C_SignRecoverInit)(m.hsession(), mechanism.get(), m.hkey());
    });
}

std::string C_SignRecover_Server(const std::string& request) {
    return serve(request, "C_SignRecover", [](pkcs11::OperationResult& res) {
        logModulePresent();
        const pkcs11::C_SignRecover& m = operation.signrecover();
        DataBuffers io =
            multiPart(VOK_SENT(m, pdata), m.uldatalen(), m.has_psignature(), m.pulsignaturelen());
        logOutputAllocated();
        rv = offered(ckpFunctions->C_SignRecover)(m.hsession(), io.input.data(), m.uldatalen(),
                                                  io.output.data(), io.output.length());
        res.mutable_signrecoverres()->set_psignature(io.output.written());
        res.mutable_signrecoverres()->set_pulsignaturelen(io.output.reported());
    });
}

// ---- Verification ----------------------------------------------------------------

std::string C_VerifyInit_Server(const std::string& request) {
    return serve(request, "C_VerifyInit", [](pkcs11::OperationResult&) {
        const pkcs11::C_VerifyInit& m = operation.verifyinit();
        NativeMechanism mechanism(VOK_SENT(m, mechanism));
        rv = offered(ckpFunctions->C_VerifyInit)(m.hsession(), mechanism.get(), m.hkey());
    });
}

// The signature buffer is sized from the request but never filled from it: the
// module checks a zero-filled signature, and the answer echoes that buffer.
// Long-standing behaviour, kept.
std::string C_Verify_Server(const std::string& request) {
    return serve(request, "C_Verify", [](pkcs11::OperationResult& res) {
        const pkcs11::C_Verify& m = operation.verify();
        DataBuffers io =
            singlePart(VOK_SENT(m, pdata), m.uldatalen(), m.has_psignature(), m.ulsignaturelen());
        rv = offered(ckpFunctions->C_Verify)(m.hsession(), io.input.data(), m.uldatalen(),
                                             io.output.data(), m.ulsignaturelen());
        res.mutable_verifyres()->set_psignature(io.output.written());
        res.mutable_verifyres()->set_ulsignaturelen(m.ulsignaturelen());
    });
}

std::string C_VerifyUpdate_Server(const std::string& request) {
    return serve(request, "C_VerifyUpdate", [](pkcs11::OperationResult&) {
        logModulePresent();
        const pkcs11::C_VerifyUpdate& m = operation.verifyupdate();
        Input part(VOK_SENT(m, ppart), m.ulpartlen());
        rv = offered(ckpFunctions->C_VerifyUpdate)(m.hsession(), part.data(), m.ulpartlen());
    });
}

std::string C_VerifyFinal_Server(const std::string& request) {
    return serve(request, "C_VerifyFinal", [](pkcs11::OperationResult&) {
        logModulePresent();
        const pkcs11::C_VerifyFinal& m = operation.verifyfinal();
        Input signature(VOK_SENT(m, psignature), m.ulsignaturelen());
        rv = offered(ckpFunctions->C_VerifyFinal)(m.hsession(), signature.data(),
                                                  m.ulsignaturelen());
    });
}

std::string C_VerifyRecoverInit_Server(const std::string& request) {
    return serve(request, "C_VerifyRecoverInit", [](pkcs11::OperationResult&) {
        const pkcs11::C_VerifyRecoverInit& m = operation.verifyrecoverinit();
        NativeMechanism mechanism(VOK_SENT(m, pmechanism));
        rv = offered(ckpFunctions->C_VerifyRecoverInit)(m.hsession(), mechanism.get(), m.hkey());
    });
}

std::string C_VerifyRecover_Server(const std::string& request) {
    return serve(request, "C_VerifyRecover", [](pkcs11::OperationResult& res) {
        logModulePresent();
        const pkcs11::C_VerifyRecover& m = operation.verifyrecover();
        DataBuffers io =
            multiPart(VOK_SENT(m, psignature), m.ulsignaturelen(), m.has_pdata(), m.puldatalen());
        logOutputAllocated();
        rv = offered(ckpFunctions->C_VerifyRecover)(m.hsession(), io.input.data(),
                                                    m.ulsignaturelen(), io.output.data(),
                                                    io.output.length());
        res.mutable_verifyrecoverres()->set_pdata(io.output.written());
        res.mutable_verifyrecoverres()->set_puldatalen(io.output.reported());
    });
}

// ---- Dual-function updates -------------------------------------------------------

std::string C_DigestEncryptUpdate_Server(const std::string& request) {
    return serve(request, "C_DigestEncryptUpdate", [](pkcs11::OperationResult& res) {
        const pkcs11::C_DigestEncryptUpdate& m = operation.digestencryptupdate();
        DataBuffers io = multiPart(VOK_SENT(m, ppart), m.ulpartlen(), m.has_pencryptedpart(),
                                   m.pulencryptedpartlen());
        rv = offered(ckpFunctions->C_DigestEncryptUpdate)(
            m.hsession(), io.input.data(), m.ulpartlen(), io.output.data(), io.output.length());
        res.mutable_digestencryptupdateres()->set_pencryptedpart(io.output.written());
        res.mutable_digestencryptupdateres()->set_pulencryptedpartlen(io.output.reported());
    });
}

std::string C_DecryptDigestUpdate_Server(const std::string& request) {
    return serve(request, "C_DecryptDigestUpdate", [](pkcs11::OperationResult& res) {
        const pkcs11::C_DecryptDigestUpdate& m = operation.decryptdigestupdate();
        DataBuffers io = multiPart(VOK_SENT(m, pencryptedpart), m.ulencryptedpartlen(),
                                   m.has_ppart(), m.pulpartlen());
        rv = offered(ckpFunctions->C_DecryptDigestUpdate)(m.hsession(), io.input.data(),
                                                          m.ulencryptedpartlen(), io.output.data(),
                                                          io.output.length());
        res.mutable_decryptdigestupdateres()->set_ppart(io.output.written());
        res.mutable_decryptdigestupdateres()->set_pulpartlen(io.output.reported());
    });
}

std::string C_SignEncryptUpdate_Server(const std::string& request) {
    return serve(request, "C_SignEncryptUpdate", [](pkcs11::OperationResult& res) {
        const pkcs11::C_SignEncryptUpdate& m = operation.signencryptupdate();
        DataBuffers io = multiPart(VOK_SENT(m, ppart), m.ulpartlen(), m.has_pencryptedpart(),
                                   m.pulencryptedpartlen());
        rv = offered(ckpFunctions->C_SignEncryptUpdate)(
            m.hsession(), io.input.data(), m.ulpartlen(), io.output.data(), io.output.length());
        res.mutable_signencryptupdateres()->set_pencryptedpart(io.output.written());
        res.mutable_signencryptupdateres()->set_pulencryptedpartlen(io.output.reported());
    });
}

std::string C_DecryptVerifyUpdate_Server(const std::string& request) {
    return serve(request, "C_DecryptVerifyUpdate", [](pkcs11::OperationResult& res) {
        const pkcs11::C_DecryptVerifyUpdate& m = operation.decryptverifyupdate();
        DataBuffers io = multiPart(VOK_SENT(m, pencryptedpart), m.ulencryptedpartlen(),
                                   m.has_ppart(), m.pulpartlen());
        rv = offered(ckpFunctions->C_DecryptVerifyUpdate)(m.hsession(), io.input.data(),
                                                          m.ulencryptedpartlen(), io.output.data(),
                                                          io.output.length());
        res.mutable_decryptverifyupdateres()->set_ppart(io.output.written());
        res.mutable_decryptverifyupdateres()->set_pulpartlen(io.output.reported());
    });
}
