// Slot, token, mechanism, session, login and operation-state handlers.

#include "handler_frame.h"
#include "marshal.h"

#define LOG_TAG "Vokpkcs11f_Server"
#include "vok_log.h"

using namespace vok::server;

namespace {

const ListTexts kSlotListTexts{"slotidlist is 0", "slotlist res created", "Slot list ptr NULL"};
const ListTexts kMechanismListTexts{"mechanismlist is 0", "mechanismlist res created",
                                    "Mechanism list ptr NULL"};

}  // namespace

std::string C_GetSlotList_Server(const std::string& request) {
    return serve(request, "C_GetSlotList", [](pkcs11::OperationResult& res) {
        const pkcs11::C_GetSlotList& m = operation.slotlist();
        CountedList slots(operation.has_slotlist(), m.slotidlist(), m.pulcount(), kSlotListTexts);
        rv = offered(ckpFunctions->C_GetSlotList)(m.tokenpresent(), slots.list(), slots.count());
        pkcs11::C_GetSlotList_Response* out = res.mutable_slotlistres();
        out->set_pulcount(slots.answer(out->mutable_slotidlist()));
    });
}

std::string C_GetSlotInfo_Server(const std::string& request) {
    return serve(request, "C_GetSlotInfo", [](pkcs11::OperationResult& res) {
        CK_SLOT_INFO info{};
        rv = offered(ckpFunctions->C_GetSlotInfo)(operation.slotinfo().slotid(), &info);
        putSlotInfo(res.mutable_slotinfores()->mutable_pinfo(), info);
    });
}

std::string C_GetTokenInfo_Server(const std::string& request) {
    return serve(request, "C_GetTokenInfo", [](pkcs11::OperationResult& res) {
        CK_TOKEN_INFO info{};
        rv = offered(ckpFunctions->C_GetTokenInfo)(operation.tokeninfo().slotid(), &info);
        putTokenInfo(res.mutable_tokeninfores()->mutable_pinfo(), info);
    });
}

std::string C_GetMechanismList_Server(const std::string& request) {
    return serve(request, "C_GetMechanismList", [](pkcs11::OperationResult& res) {
        const pkcs11::C_GetMechanismList& m = operation.mechanismlist();
        CountedList types(operation.has_mechanismlist(), m.pmechanismlist(), m.pulcount(),
                          kMechanismListTexts);
        rv = offered(ckpFunctions->C_GetMechanismList)(m.slotid(), types.list(), types.count());
        pkcs11::C_GetMechanismList_Response* out = res.mutable_mechanismlistres();
        out->set_pulcount(types.answer(out->mutable_pmechanismlist()));
    });
}

std::string C_GetMechanismInfo_Server(const std::string& request) {
    return serve(request, "C_GetMechanismInfo", [](pkcs11::OperationResult& res) {
        const pkcs11::C_GetMechanismInfo& m = operation.mechanisminfo();
        CK_MECHANISM_INFO info{};
        rv = offered(ckpFunctions->C_GetMechanismInfo)(m.slotid(), m.type(), &info);
        putMechanismInfo(res.mutable_mechanisminfores()->mutable_pinfo(), info);
    });
}

std::string C_InitToken_Server(const std::string& request) {
    return serve(request, "C_InitToken", [](pkcs11::OperationResult&) {
        const pkcs11::C_InitToken& m = operation.inittoken();
        Input pin(VOK_SENT(m, ppin), m.ulpinlen());
        std::array<CK_UTF8CHAR, 32> label = paddedLabel(m.plabel());
        rv = offered(ckpFunctions->C_InitToken)(m.slotid(), pin.data(), m.ulpinlen(),
                                                m.has_plabel() ? label.data() : nullptr);
    });
}

std::string C_InitPin_Server(const std::string& request) {
    return serve(request, "C_InitPin", [](pkcs11::OperationResult&) {
        const pkcs11::C_InitPin& m = operation.initpin();
        Input pin(VOK_SENT(m, ppin), m.ulpinlen());
        rv = offered(ckpFunctions->C_InitPIN)(m.hsession(), pin.data(), m.ulpinlen());
    });
}

std::string C_SetPin_Server(const std::string& request) {
    return serve(request, "C_SetPin", [](pkcs11::OperationResult&) {
        const pkcs11::C_SetPin& m = operation.setpin();
        Input oldPin(VOK_SENT(m, poldpin), m.uloldlen());
        Input newPin(VOK_SENT(m, pnewpin), m.ulnewlen());
        rv = offered(ckpFunctions->C_SetPIN)(m.hsession(), oldPin.data(), m.uloldlen(),
                                             newPin.data(), m.ulnewlen());
    });
}

// No application pointer and no callback: notifications cannot cross to the
// client's process.
std::string C_OpenSession_Server(const std::string& request) {
    return serve(request, "C_OpenSession", [](pkcs11::OperationResult& res) {
        VOK_LOGD("ckpFunctions not null");
        if (operation.has_openses()) VOK_LOGD("Opensession instance present");
        const pkcs11::C_OpenSession& m = operation.openses();
        CK_SESSION_HANDLE session = 0;
        rv =
            offered(ckpFunctions->C_OpenSession)(m.slotid(), m.flags(), nullptr, nullptr, &session);
        __android_log_print(ANDROID_LOG_DEBUG, "DDDD",
                            "session is %llx and CK_ULONG size is %d, CK_SESSION_HANDLE size is %d",
                            static_cast<unsigned long long>(session),
                            static_cast<int>(sizeof(CK_ULONG)),
                            static_cast<int>(sizeof(CK_SESSION_HANDLE)));
        if (session == 0) VOK_LOGD("session from open session null");
        res.mutable_opensesres()->set_phsession(session);
    });
}

std::string C_CloseSession_Server(const std::string& request) {
    return serve(request, "C_CloseSession", [](pkcs11::OperationResult&) {
        rv = offered(ckpFunctions->C_CloseSession)(operation.closeses().hsession());
    });
}

std::string C_CloseAllSessions_Server(const std::string& request) {
    return serve(request, "C_CloseAllSessions", [](pkcs11::OperationResult&) {
        rv = offered(ckpFunctions->C_CloseAllSessions)(operation.closeallsessions().slotid());
    });
}

std::string C_GetSessionInfo_Server(const std::string& request) {
    return serve(request, "C_GetSessionInfo", [](pkcs11::OperationResult& res) {
        CK_SESSION_INFO info{};
        rv = offered(ckpFunctions->C_GetSessionInfo)(operation.sessioninfo().hsession(), &info);
        putSessionInfo(res.mutable_sessioninfores()->mutable_pinfo(), info);
    });
}

std::string C_GetOperationState_Server(const std::string& request) {
    return serve(request, "C_GetOperationState", [](pkcs11::OperationResult& res) {
        const pkcs11::C_GetOperationState& m = operation.getoperationstate();
        Output state(m.has_poperationstate(), m.puloperationstatelen());
        rv = offered(ckpFunctions->C_GetOperationState)(m.hsession(), state.data(), state.length());
        pkcs11::C_GetOperationState_Response* out = res.mutable_getoperationstateres();
        out->set_poperationstate(state.written());
        out->set_puloperationstatelen(state.reported());
    });
}

std::string C_SetOperationState_Server(const std::string& request) {
    return serve(request, "C_SetOperationState", [](pkcs11::OperationResult&) {
        const pkcs11::C_SetOperationState& m = operation.setoperationstate();
        Input state(VOK_SENT(m, poperationstate), m.uloperationstatelen());
        rv = offered(ckpFunctions->C_SetOperationState)(m.hsession(), state.data(),
                                                        m.uloperationstatelen(), m.hencryptionkey(),
                                                        m.hauthenticationkey());
    });
}

std::string C_Login_Server(const std::string& request) {
    return serve(request, "C_Login", [](pkcs11::OperationResult&) {
        const pkcs11::C_Login& m = operation.login();
        Input pin(VOK_SENT(m, ppin), m.ulpinlen());
        rv = offered(ckpFunctions->C_Login)(m.hsession(), m.usertype(), pin.data(), m.ulpinlen());
    });
}

std::string C_Logout_Server(const std::string& request) {
    return serve(request, "C_Logout", [](pkcs11::OperationResult&) {
        rv = offered(ckpFunctions->C_Logout)(operation.logout().hsession());
    });
}
