// Server start-up and the command dispatcher: the callback the server channel
// runs for every received command.

#include <cstdlib>
#include <cstring>
#include <new>
#include <string>

#include "handler_frame.h"
#include "marshal.h"
#include "vok_comm.h"
#include "vok_registry.h"
#include "vok_server.h"

#define LOG_TAG "Vokpkcs11f_Server"
#include "vok_log.h"

char* mModuleName = nullptr;
pkcs11::Operation operation;
CK_FUNCTION_LIST_PTR ckpFunctions = nullptr;
CK_RV rv = 0;

namespace {

using Handler = std::string (*)(const std::string&);

struct Command {
    const char* name;
    Handler handler;
};

// Compared in this order, first match wins.
const Command kCommands[] = {
    {"C_Initialize", C_Initialize_Server},
    {"C_Finalize", C_Finalize_Server},
    {"C_OpenSession", C_OpenSession_Server},
    {"C_CloseSession", C_CloseSession_Server},
    {"C_Login", C_Login_Server},
    {"C_Logout", C_Logout_Server},
    {"C_GetInfo", C_GetInfo_Server},
    {"C_GetSlotList", C_GetSlotList_Server},
    {"C_GetSlotInfo", C_GetSlotInfo_Server},
    {"C_GetTokenInfo", C_GetTokenInfo_Server},
    {"C_GetMechanismInfo", C_GetMechanismInfo_Server},
    {"C_GetSessionInfo", C_GetSessionInfo_Server},
    {"C_DestroyObject", C_DestroyObject_Server},
    {"C_GetAttributeValue", C_GetAttributeValue_Server},
    {"C_FindObjectsInit", C_FindObjectsInit_Server},
    {"C_FindObjects", C_FindObjects_Server},
    {"C_FindObjectsFinal", C_FindObjectsFinal_Server},
    // TODO(crypto handlers): "C_EncryptInit" ... "C_SeedRandom" (entries 18-29) go here.
    {"C_GetMechanismList", C_GetMechanismList_Server},
    {"C_InitToken", C_InitToken_Server},
    // "Pin", not "PIN": the names the protocol has always used.
    {"C_InitPin", C_InitPin_Server},
    {"C_SetPin", C_SetPin_Server},
    {"C_CloseAllSessions", C_CloseAllSessions_Server},
    {"C_GetOperationState", C_GetOperationState_Server},
    {"C_SetOperationState", C_SetOperationState_Server},
    {"C_CreateObject", C_CreateObject_Server},
    {"C_CopyObject", C_CopyObject_Server},
    {"C_GetObjectSize", C_GetObjectSize_Server},
    {"C_SetAttributeValue", C_SetAttributeValue_Server},
    // TODO(crypto handlers): "C_EncryptUpdate" ... "C_WaitForSlotEvent" (entries 41-67) go here.
};

// No command name ever matches "C_GetFunctionList": the client serves it.
std::string dispatch(const std::string& request) {
    operation.ParseFromString(request);  // a malformed request simply matches nothing
    ckpFunctions = getFunctionsByModule(mModuleName);
    const char* name = operation.name().c_str();
    for (const Command& command : kCommands) {
        if (std::strcmp(name, command.name) != 0) continue;
        VOK_LOGD("Generate_Operation_Result %s", command.name);
        return command.handler(request);
    }
    return std::string();
}

}  // namespace

int32_t vokpkcs11_init_server(const char* serverId) {
    VOK_LOGD("server init");
    setModuleName_Server(serverId);
    return vokpkcs11_comm_server_init(serverId, Generate_Operation_Result_Server);
}

int32_t vokpkcs11_server_deinit(void) { return vokpkcs11_comm_server_deinit(); }

int32_t vokpkcs11_server_getLastUsageTime(void) {
    VOK_LOGD("server getLastUsageTime");
    return vokpkcs11_comm_server_getLastUsageTime();
}

int32_t setModuleName_Server(const char* name) {
    if (name == nullptr) {
        // The previous copy is dropped without being freed; long-standing
        // behaviour, kept.
        mModuleName = nullptr;
        return 0;
    }
    std::free(mModuleName);
    mModuleName = strdup(name);
    return 0;
}

int32_t Generate_Operation_Result_Server(const void* request, int32_t requestLength,
                                         void** response, uint32_t* responseLength) {
    if (response == nullptr || responseLength == nullptr) return 0;
    std::string result;
    try {
        std::string bytes;
        if (request != nullptr && requestLength > 0)
            bytes.assign(static_cast<const char*>(request), static_cast<size_t>(requestLength));
        result = dispatch(bytes);
    } catch (...) {
        // Out of memory before a handler ran: answered like an unknown command.
        result.clear();
    }
    if (result.size() > vok::server::kFrameLimit) result.clear();
    // A failed allocation also leaves the empty answer.
    uint8_t* buffer = new (std::nothrow) uint8_t[result.size()];
    if (buffer) std::memcpy(buffer, result.data(), result.size());
    *response = buffer;
    *responseLength = buffer ? static_cast<uint32_t>(result.size()) : 0;
    return 0;
}
