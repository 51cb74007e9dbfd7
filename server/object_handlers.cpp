// Object handlers: create, copy, destroy, size, attributes and search.

#include "handler_frame.h"
#include "marshal.h"

#define LOG_TAG "Vokpkcs11f_Server"
#include "vok_log.h"

using namespace vok::server;

std::string C_CreateObject_Server(const std::string& request) {
    return serve(request, "C_CreateObject", [](pkcs11::OperationResult& res) {
        const pkcs11::C_CreateObject& m = operation.createobject();
        NativeTemplate tmpl(m.ptemplate(), m.ulcount(), kInputTemplate);
        CK_OBJECT_HANDLE object = 0;
        rv =
            offered(ckpFunctions->C_CreateObject)(m.hsession(), tmpl.data(), tmpl.count(), &object);
        res.mutable_createobjectres()->add_phobject(object);
    });
}

std::string C_CopyObject_Server(const std::string& request) {
    return serve(request, "C_CopyObject", [](pkcs11::OperationResult& res) {
        const pkcs11::C_CopyObject& m = operation.copyobject();
        NativeTemplate tmpl(m.ptemplate(), m.ulcount(), kInputTemplate);
        CK_OBJECT_HANDLE object = 0;
        rv = offered(ckpFunctions->C_CopyObject)(m.hsession(), m.hobject(), tmpl.data(),
                                                 tmpl.count(), &object);
        res.mutable_copyobjectres()->add_phnewobject(object);
    });
}

std::string C_DestroyObject_Server(const std::string& request) {
    VOK_LOGD("C_DestroyObject server");
    return serve(request, "C_DestroyObject", [](pkcs11::OperationResult&) {
        VOK_LOGD("C_DestroyObject ckpfunctions not null");
        const pkcs11::C_DestroyObject& m = operation.destoryobj();
        rv = offered(ckpFunctions->C_DestroyObject)(m.hsession(), m.hobject());
    });
}

std::string C_GetObjectSize_Server(const std::string& request) {
    return serve(request, "C_GetObjectSize", [](pkcs11::OperationResult& res) {
        const pkcs11::C_GetObjectSize& m = operation.getobjectsize();
        CK_ULONG size = 0;
        rv = offered(ckpFunctions->C_GetObjectSize)(m.hsession(), m.hobject(), &size);
        res.mutable_getobjectsizeres()->set_pulsize(size);
    });
}

std::string C_GetAttributeValue_Server(const std::string& request) {
    return serve(request, "C_GetAttributeValue", [](pkcs11::OperationResult& res) {
        const pkcs11::C_GetAttributeValue& m = operation.attvalue();
        NativeTemplate tmpl(m.attribute(), m.ulcount(), kQueryTemplate);
        rv = offered(ckpFunctions->C_GetAttributeValue)(m.hsession(), m.hobject(), tmpl.data(),
                                                        tmpl.count());
        pkcs11::C_GetAttributeValue_Response* out = res.mutable_attvalueres();
        out->set_ulcount(m.ulcount());
        tmpl.echo(out->mutable_attribute(), Echo::kDropUnavailable);
    });
}

std::string C_SetAttributeValue_Server(const std::string& request) {
    return serve(request, "C_SetAttributeValue", [](pkcs11::OperationResult& res) {
        const pkcs11::C_SetAttributeValue& m = operation.setattributevalue();
        NativeTemplate tmpl(m.ptemplate(), m.ulcount(), kInputTemplate);
        rv = offered(ckpFunctions->C_SetAttributeValue)(m.hsession(), m.hobject(), tmpl.data(),
                                                        tmpl.count());
        pkcs11::C_SetAttributeValue_Response* out = res.mutable_setattributevalueres();
        out->set_ulcount(m.ulcount());
        tmpl.echo(out->mutable_ptemplate(), Echo::kDropUnavailableLogged);
    });
}

std::string C_FindObjectsInit_Server(const std::string& request) {
    return serve(request, "C_FindObjectsInit", [](pkcs11::OperationResult& res) {
        const pkcs11::C_FindObjectsInit& m = operation.findobjinit();
        NativeTemplate tmpl(m.attribute(), m.ulcount(), kSearchTemplate);
        rv = offered(ckpFunctions->C_FindObjectsInit)(m.hsession(), tmpl.data(), tmpl.count());
        pkcs11::C_FindObjectsInit_Response* out = res.mutable_findobjintres();
        out->set_ulcount(m.ulcount());
        tmpl.echo(out->mutable_attribute(), Echo::kVerbatim);
    });
}

// A module that reports more handles than it was allowed to write sends back
// none of them, only its count.
std::string C_FindObjects_Server(const std::string& request) {
    return serve(request, "C_FindObjects", [](pkcs11::OperationResult& res) {
        const pkcs11::C_FindObjects& m = operation.findobj();
        Buffer<CK_OBJECT_HANDLE> handles(m.ulmaxobjectcount());
        CK_ULONG found = 0;
        rv = offered(ckpFunctions->C_FindObjects)(m.hsession(), handles.data(),
                                                  m.ulmaxobjectcount(), &found);
        pkcs11::C_FindObjects_Response* out = res.mutable_findobjres();
        if (found != 0 && found <= m.ulmaxobjectcount())
            appendNumbers(out->mutable_phobject(), handles.data(), found);
        out->set_pulobjectcount(found);
    });
}

std::string C_FindObjectsFinal_Server(const std::string& request) {
    return serve(request, "C_FindObjectsFinal", [](pkcs11::OperationResult&) {
        rv = offered(ckpFunctions->C_FindObjectsFinal)(operation.findobjfinal().hsession());
    });
}
