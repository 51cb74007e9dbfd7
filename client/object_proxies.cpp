// Object proxies: create, copy, destroy, size, attributes and find.

#include <algorithm>
#include <cstdint>

#include "call_frame.h"
#include "marshal.h"

#define LOG_TAG "Vokpkcs11f"
#include "vok_log.h"

using namespace vok::client;

namespace {

// Deployed services expect these output-handle fields to hold the caller's
// pointer value, sign-extended, rather than what it points to.
google::protobuf::uint64 pointerAsNumber(const void* p) {
    return static_cast<google::protobuf::uint64>(
        static_cast<int64_t>(reinterpret_cast<intptr_t>(p)));
}

void copyFirstHandle(const NumberList& handles, CK_OBJECT_HANDLE_PTR out) {
    if (out && !handles.empty()) *out = handles.Get(0);
}

}  // namespace

CK_RV C_CreateObject(CK_SESSION_HANDLE hSession, CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount,
                     CK_OBJECT_HANDLE_PTR phObject) {
    VOK_LOGD("C_CreateObject");
    return callService(
        "C_CreateObject",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_createobject();
            m->set_hsession(hSession);
            putTemplate(m->mutable_ptemplate(), pTemplate, ulCount);
            m->set_ulcount(ulCount);
            m->set_phobject(pointerAsNumber(phObject));
        },
        [&](const pkcs11::OperationResult& res) {
            if (res.has_createobjectres())
                copyFirstHandle(res.createobjectres().phobject(), phObject);
        });
}

CK_RV C_CopyObject(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject, CK_ATTRIBUTE_PTR pTemplate,
                   CK_ULONG ulCount, CK_OBJECT_HANDLE_PTR phNewObject) {
    VOK_LOGD("C_CopyObject");
    return callService(
        "C_CopyObject",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_copyobject();
            m->set_hsession(hSession);
            putTemplate(m->mutable_ptemplate(), pTemplate, ulCount);
            m->set_hobject(hObject);
            m->set_ulcount(ulCount);
            m->set_phnewobject(pointerAsNumber(phNewObject));
        },
        [&](const pkcs11::OperationResult& res) {
            if (res.has_copyobjectres())
                copyFirstHandle(res.copyobjectres().phnewobject(), phNewObject);
        });
}

CK_RV C_DestroyObject(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject) {
    VOK_LOGD("C_DestroyObject client");
    return callService(
        "C_DestroyObject",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_destoryobj();
            m->set_hsession(hSession);
            m->set_hobject(hObject);
            VOK_LOGD("C_DestroyObject client before server call");
            VOK_LOGD("C_DestroyObject client after server call");
        },
        noCopyBack);
}

CK_RV C_GetObjectSize(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject, CK_ULONG_PTR pulSize) {
    return callService(
        "C_GetObjectSize",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_getobjectsize();
            m->set_hsession(hSession);
            m->set_hobject(hObject);
        },
        [&](const pkcs11::OperationResult& res) {
            if (res.has_getobjectsizeres() && pulSize) *pulSize = res.getobjectsizeres().pulsize();
        });
}

CK_RV C_GetAttributeValue(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                          CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount) {
    return callService(
        "C_GetAttributeValue",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_attvalue();
            m->set_hsession(hSession);
            m->set_hobject(hObject);
            m->set_ulcount(ulCount);
            putTemplate(m->mutable_attribute(), pTemplate, ulCount);
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_attvalueres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.attvalueres();
            return copyBackTemplate(res.result(), r.attribute(), r.ulcount(), pTemplate, ulCount);
        });
}

CK_RV C_SetAttributeValue(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE hObject,
                          CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount) {
    return callService(
        "C_SetAttributeValue",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_setattributevalue();
            m->set_hsession(hSession);
            m->set_hobject(hObject);
            putTemplate(m->mutable_ptemplate(), pTemplate, ulCount);
            m->set_ulcount(ulCount);
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_setattributevalueres()) return static_cast<CK_RV>(res.result());
            const auto& r = res.setattributevalueres();
            return copyBackTemplate(res.result(), r.ptemplate(), r.ulcount(), pTemplate, ulCount);
        });
}

CK_RV C_FindObjectsInit(CK_SESSION_HANDLE hSession, CK_ATTRIBUTE_PTR pTemplate, CK_ULONG ulCount) {
    return callService(
        "C_FindObjectsInit",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_findobjinit();
            m->set_hsession(hSession);
            putTemplate(m->mutable_attribute(), pTemplate, ulCount);
            m->set_ulcount(ulCount);
        },
        [&](const pkcs11::OperationResult& res) {
            if (res.has_findobjintres())
                overwriteTemplate(res.findobjintres().attribute(), pTemplate, ulCount);
        });
}

// The two output pointers travel as numbers, as deployed services expect.
CK_RV C_FindObjects(CK_SESSION_HANDLE hSession, CK_OBJECT_HANDLE_PTR phObject,
                    CK_ULONG ulMaxObjectCount, CK_ULONG_PTR pulObjectCount) {
    return callService(
        "C_FindObjects",
        [&](pkcs11::Operation& op) {
            auto* m = op.mutable_findobj();
            m->set_hsession(hSession);
            m->set_ulmaxobjectcount(ulMaxObjectCount);
            m->set_phobject(pointerAsNumber(phObject));
            m->set_pulobjectcount(pointerAsNumber(pulObjectCount));
        },
        [&](const pkcs11::OperationResult& res) {
            if (!res.has_findobjres()) return;
            const auto& r = res.findobjres();
            // The count is the handles written, whatever the service stated.
            CK_ULONG n = 0;
            if (phObject)
                n = std::min<CK_ULONG>({r.pulobjectcount(),
                                        static_cast<CK_ULONG>(r.phobject_size()),
                                        ulMaxObjectCount});
            for (CK_ULONG i = 0; i < n; ++i) phObject[i] = r.phobject(static_cast<int>(i));
            if (pulObjectCount) *pulObjectCount = n;
        });
}

CK_RV C_FindObjectsFinal(CK_SESSION_HANDLE hSession) {
    return callService(
        "C_FindObjectsFinal",
        [&](pkcs11::Operation& op) { op.mutable_findobjfinal()->set_hsession(hSession); },
        noCopyBack);
}
