// Key generation, wrapping, unwrapping and derivation, random numbers, and the
// legacy parallel-function and slot-event calls.

#include "crypto_marshal.h"
#include "handler_frame.h"

using namespace vok::server;

// New handles are sent whatever rv is, as the module left them (0 unless it
// wrote one).
std::string C_GenerateKey_Server(const std::string& request) {
    return serve(request, "C_GenerateKey", [](pkcs11::OperationResult& res) {
        const pkcs11::C_GenerateKey& m = operation.generatekey();
        NativeMechanism mechanism(VOK_SENT(m, pmechanism));
        NativeTemplate tmpl(m.ptemplate(), m.ulcount(), kInputTemplate);
        CK_OBJECT_HANDLE key = 0;
        rv = offered(ckpFunctions->C_GenerateKey)(m.hsession(), mechanism.get(), tmpl.data(),
                                                  tmpl.count(), &key);
        res.mutable_generatekeyres()->set_phkey(key);
        mechanism.answerOutputs(res.mutable_generatekeyres());
    });
}

std::string C_GenerateKeyPair_Server(const std::string& request) {
    return serve(request, "C_GenerateKeyPair", [](pkcs11::OperationResult& res) {
        const pkcs11::C_GenerateKeyPair& m = operation.generatekeypair();
        NativeMechanism mechanism(VOK_SENT(m, pmechanism));
        NativeTemplate publicTmpl(m.ppublickeytemplate(), m.ulpublickeyattributecount(),
                                  kInputTemplate);
        NativeTemplate privateTmpl(m.pprivatekeytemplate(), m.ulprivatekeyattributecount(),
                                   kInputTemplate);
        CK_OBJECT_HANDLE publicKey = 0, privateKey = 0;
        rv = offered(ckpFunctions->C_GenerateKeyPair)(
            m.hsession(), mechanism.get(), publicTmpl.data(), publicTmpl.count(),
            privateTmpl.data(), privateTmpl.count(), &publicKey, &privateKey);
        res.mutable_generatekeypairres()->set_phpublickey(publicKey);
        res.mutable_generatekeypairres()->set_phprivatekey(privateKey);
    });
}

// The output buffer starts as a copy of what the client sent in it.
std::string C_WrapKey_Server(const std::string& request) {
    return serve(request, "C_WrapKey", [](pkcs11::OperationResult& res) {
        const pkcs11::C_WrapKey& m = operation.wrapkey();
        NativeMechanism mechanism(VOK_SENT(m, pmechanism));
        Output wrapped(VOK_SENT(m, pwrappedkey), m.pulwrappedkeylen());
        rv = offered(ckpFunctions->C_WrapKey)(m.hsession(), mechanism.get(), m.hwrappingkey(),
                                              m.hkey(), wrapped.data(), wrapped.length());
        res.mutable_wrapkeyres()->set_pwrappedkey(wrapped.written());
        res.mutable_wrapkeyres()->set_pulwrappedkeylen(wrapped.reported());
    });
}

// "C_UnWrapKey", capital W: the name both ends have always used.
std::string C_UnWrapKey_Server(const std::string& request) {
    return serve(request, "C_UnWrapKey", [](pkcs11::OperationResult& res) {
        const pkcs11::C_UnwrapKey& m = operation.unwrapkey();
        NativeMechanism mechanism(VOK_SENT(m, pmechanism));
        Input wrapped(VOK_SENT(m, pwrappedkey), m.ulwrappedkeylen());
        NativeTemplate tmpl(m.ptemplate(), m.ulattributecount(), kInputTemplate);
        CK_OBJECT_HANDLE key = 0;
        rv = offered(ckpFunctions->C_UnwrapKey)(m.hsession(), mechanism.get(), m.hunwrappingkey(),
                                                wrapped.data(), m.ulwrappedkeylen(), tmpl.data(),
                                                tmpl.count(), &key);
        res.mutable_unwrapkeyres()->set_phkey(key);
        mechanism.answerOutputs(res.mutable_unwrapkeyres());
    });
}

// Answered as "C_UnDeriveKey", as the service always has; clients do not match
// an answer's name against their command.
std::string C_DeriveKey_Server(const std::string& request) {
    return serve(request, "C_UnDeriveKey", [](pkcs11::OperationResult& res) {
        const pkcs11::C_DeriveKey& m = operation.derivekey();
        NativeMechanism mechanism(VOK_SENT(m, pmechanism));
        NativeTemplate tmpl(m.ptemplate(), m.ulattributecount(), kInputTemplate);
        CK_OBJECT_HANDLE key = 0;
        rv = offered(ckpFunctions->C_DeriveKey)(m.hsession(), mechanism.get(), m.hbasekey(),
                                                tmpl.data(), tmpl.count(), &key);
        res.mutable_derivekeyres()->set_phkey(key);
        mechanism.answerOutputs(res.mutable_derivekeyres());
    });
}

std::string C_GenerateRandom_Server(const std::string& request) {
    return serve(request, "C_GenerateRandom", [](pkcs11::OperationResult& res) {
        const pkcs11::C_GenerateRandom& m = operation.generaterandom();
        Input random(VOK_SENT(m, randomdata), m.ulrandomlen());
        rv = offered(ckpFunctions->C_GenerateRandom)(m.hsession(), random.data(), m.ulrandomlen());
        res.mutable_generaterandomres()->set_randomdata(random.leading(m.ulrandomlen()));
        res.mutable_generaterandomres()->set_ulrandomlen(m.ulrandomlen());
    });
}

// The seed goes back as it was passed.
std::string C_SeedRandom_Server(const std::string& request) {
    return serve(request, "C_SeedRandom", [](pkcs11::OperationResult& res) {
        const pkcs11::C_SeedRandom& m = operation.seedrandom();
        Input seed(VOK_SENT(m, pseed), m.ulseedlen());
        rv = offered(ckpFunctions->C_SeedRandom)(m.hsession(), seed.data(), m.ulseedlen());
        res.mutable_seedrandomres()->set_pseed(seed.leading(m.ulseedlen()));
        res.mutable_seedrandomres()->set_ulseedlen(m.ulseedlen());
    });
}

std::string C_GetFunctionStatus_Server(const std::string& request) {
    return serve(request, "C_GetFunctionStatus", [](pkcs11::OperationResult&) {
        rv = offered(ckpFunctions->C_GetFunctionStatus)(operation.getfunctionstatus().hsession());
    });
}

std::string C_CancelFunction_Server(const std::string& request) {
    return serve(request, "C_CancelFunction", [](pkcs11::OperationResult&) {
        rv = offered(ckpFunctions->C_CancelFunction)(operation.cancelfunction().hsession());
    });
}

// pReserved is NULL whatever the client sent: bytes from another process mean
// nothing as a pointer here. Holds the server thread as long as the module waits.
std::string C_WaitForSlotEvent_Server(const std::string& request) {
    return serve(request, "C_WaitForSlotEvent", [](pkcs11::OperationResult& res) {
        CK_SLOT_ID slot = 0;
        rv = offered(ckpFunctions->C_WaitForSlotEvent)(operation.waitforslotevent().flags(), &slot,
                                                       nullptr);
        res.mutable_waitforsloteventres()->set_pslot(slot);
    });
}
