// C_Initialize, C_Finalize and C_GetInfo.

#include "handler_frame.h"
#include "marshal.h"

#define LOG_TAG "Vokpkcs11f_Server"
#include "vok_log.h"

using namespace vok::server;

// The service decides how its module is initialised: whatever the client
// sent, the module gets no arguments.
std::string C_Initialize_Server(const std::string& request) {
    return serve(request, "C_Initialize", [](pkcs11::OperationResult&) {
        rv = offered(ckpFunctions->C_Initialize)(nullptr);
    });
}

std::string C_Finalize_Server(const std::string& request) {
    return serve(request, "C_Finalize",
                 [](pkcs11::OperationResult&) { rv = offered(ckpFunctions->C_Finalize)(nullptr); });
}

std::string C_GetInfo_Server(const std::string& request) {
    return serve(request, "C_GetInfo", [](pkcs11::OperationResult& res) {
        CK_INFO info{};
        rv = offered(ckpFunctions->C_GetInfo)(&info);
        putInfo(res.mutable_infores()->mutable_ckinfo(), info);
    });
}
