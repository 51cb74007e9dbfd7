// Server start-up and the command dispatcher: the callback the server channel
// runs for every received command.

#include <cstdlib>
#include <cstring>
#include <mutex>
#include <new>
#include <optional>
#include <string>

#ifdef __GLIBC__
#include <malloc.h>
#endif

#include "comm_internal.h"
#include "handler_frame.h"
#include "marshal.h"
#include "request_memory.h"
#include "vok_comm.h"
#include "vok_registry.h"
#include "vok_server.h"

#define LOG_TAG "Vokpkcs11f_Server"
#include "vok_log.h"

char* mModuleName = nullptr;
pkcs11::Operation operation;
CK_FUNCTION_LIST_PTR ckpFunctions = nullptr;
CK_RV rv = 0;

char* (*gModuleNameCopy)(const char*) = strdup;

namespace {

// mModuleName is set from Java threads (connect) while the server thread
// reads it: every write, and the server thread's copy of it, hold this lock.
std::mutex moduleNameLock;
// The last name could not be copied: no module serves until the next one.
bool moduleNameLost = false;

// A request that made the service take this much is followed by giving the
// freed memory back to the system.
constexpr size_t kTrimAfter = size_t{4} << 20;

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
    {"C_EncryptInit", C_EncryptInit_Server},
    {"C_Encrypt", C_Encrypt_Server},
    {"C_DecryptInit", C_DecryptInit_Server},
    {"C_Decrypt", C_Decrypt_Server},
    {"C_DigestInit", C_DigestInit_Server},
    {"C_Digest", C_Digest_Server},
    {"C_SignInit", C_SignInit_Server},
    {"C_Sign", C_Sign_Server},
    {"C_VerifyInit", C_VerifyInit_Server},
    {"C_Verify", C_Verify_Server},
    {"C_GenerateRandom", C_GenerateRandom_Server},
    {"C_SeedRandom", C_SeedRandom_Server},
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
    {"C_EncryptUpdate", C_EncryptUpdate_Server},
    {"C_EncryptFinal", C_EncryptFinal_Server},
    {"C_DecryptUpdate", C_DecryptUpdate_Server},
    {"C_DecryptFinal", C_DecryptFinal_Server},
    {"C_DigestUpdate", C_DigestUpdate_Server},
    {"C_DigestKey", C_DigestKey_Server},
    {"C_DigestFinal", C_DigestFinal_Server},
    {"C_SignUpdate", C_SignUpdate_Server},
    {"C_SignFinal", C_SignFinal_Server},
    {"C_SignRecoverInit", C_SignRecoverInit_Server},
    {"C_SignRecover", C_SignRecover_Server},
    {"C_VerifyUpdate", C_VerifyUpdate_Server},
    {"C_VerifyFinal", C_VerifyFinal_Server},
    {"C_VerifyRecoverInit", C_VerifyRecoverInit_Server},
    {"C_VerifyRecover", C_VerifyRecover_Server},
    {"C_DigestEncryptUpdate", C_DigestEncryptUpdate_Server},
    {"C_DecryptDigestUpdate", C_DecryptDigestUpdate_Server},
    {"C_SignEncryptUpdate", C_SignEncryptUpdate_Server},
    {"C_DecryptVerifyUpdate", C_DecryptVerifyUpdate_Server},
    {"C_GenerateKey", C_GenerateKey_Server},
    {"C_GenerateKeyPair", C_GenerateKeyPair_Server},
    {"C_WrapKey", C_WrapKey_Server},
    {"C_UnWrapKey", C_UnWrapKey_Server},
    {"C_DeriveKey", C_DeriveKey_Server},
    {"C_GetFunctionStatus", C_GetFunctionStatus_Server},
    {"C_CancelFunction", C_CancelFunction_Server},
    {"C_WaitForSlotEvent", C_WaitForSlotEvent_Server},
};

// The registry name to serve from: set (the current name or NULL) or lost.
struct ServedName {
    bool lost;
    bool set;
    std::string name;
};

ServedName servedName() {
    std::lock_guard<std::mutex> lock(moduleNameLock);
    if (moduleNameLost) return {true, false, std::string()};
    if (mModuleName == nullptr) return {false, false, std::string()};
    return {false, true, std::string(mModuleName)};
}

// No command name ever matches "C_GetFunctionList": the client serves it.
std::string dispatch(const void* request, size_t size) {
    // A request whose parse alone would cost the service more than its
    // allowance is answered like one nobody serves (a departure: the parse
    // used to take whatever the request's structure asked for).
    if (!vok::server::parseAffordable(request, size)) {
        VOK_LOGE("Request of %d bytes not served: beyond its memory allowance",
                 static_cast<int>(size));
        return std::string();
    }
    // A malformed request simply matches nothing.
    operation.ParseFromArray(request, static_cast<int>(size));
    const std::string name = operation.name().c_str();

    // Departs from a bare lookup: the module stays loaded until the handler
    // returns, even if disconnect takes it out of the registry meanwhile.
    const ServedName served = servedName();
    std::optional<ModuleHold> module;
    if (!served.lost) module.emplace(served.set ? served.name.c_str() : nullptr);
    ckpFunctions = module ? module->functions() : nullptr;
    std::string answer;
    for (const Command& command : kCommands) {
        if (name != command.name) continue;
        VOK_LOGD("Generate_Operation_Result %s", command.name);
        // The handler finds the request parsed already: a large one is not
        // copied and parsed a second time.
        vok::server::ParsedRequest parsed(size);
        answer = command.handler(std::string());
        break;
    }
    ckpFunctions = nullptr;  // not to be used once the module is released
    return answer;
}

// The server thread looks its module up for every command. It attaches itself
// to the Java VM on its first command and stays attached, where the registry
// would attach and detach it around each lookup (as it still does for any other
// native thread): see keepThreadAttachedToJavaVm.
void keepServerThreadAttached() {
    static thread_local bool attached = false;
    if (!attached && pthread_equal(pthread_self(), vokcomm::serverThread()))
        attached = keepThreadAttachedToJavaVm() == 1;
}

}  // namespace

int32_t vokpkcs11_init_server(const char* serverId) {
    VOK_LOGD("server init");
#ifdef __GLIBC__
    // The service process only: a request's buffers up to a few MiB are taken
    // from memory the process keeps, instead of fresh pages that the server
    // thread's arena would give back and fault in again for every request (a
    // 1 MiB C_Digest cost ten times more that way). Larger ones are mapped and
    // unmapped on their own, and malloc_trim after a large request gives the
    // rest back.
    mallopt(M_MMAP_THRESHOLD, static_cast<int>(kTrimAfter));
    mallopt(M_TRIM_THRESHOLD, static_cast<int>(2 * kTrimAfter));
#endif
    setModuleName_Server(serverId);
    return vokpkcs11_comm_server_init(serverId, Generate_Operation_Result_Server);
}

int32_t vokpkcs11_server_deinit(void) { return vokpkcs11_comm_server_deinit(); }

int32_t vokpkcs11_server_getLastUsageTime(void) {
    VOK_LOGD("server getLastUsageTime");
    return vokpkcs11_comm_server_getLastUsageTime();
}

int32_t setModuleName_Server(const char* name) {
    std::lock_guard<std::mutex> lock(moduleNameLock);
    if (name == nullptr) {
        // The previous copy is dropped without being freed; long-standing
        // behaviour, kept.
        mModuleName = nullptr;
        moduleNameLost = false;
        return 0;
    }
    std::free(mModuleName);
    mModuleName = gModuleNameCopy(name);
    // A copy that failed leaves no module to serve, where it used to leave
    // NULL, which serves the first module registered.
    moduleNameLost = mModuleName == nullptr;
    return 0;
}

int32_t Generate_Operation_Result_Server(const void* request, int32_t requestLength,
                                         void** response, uint32_t* responseLength) {
    if (response == nullptr || responseLength == nullptr) return 0;
    keepServerThreadAttached();
    std::string result;
    const size_t size = request != nullptr && requestLength > 0 ? static_cast<size_t>(requestLength) : 0;
    try {
        result = dispatch(request, size);
    } catch (...) {
        // Out of memory before a handler ran: answered like an unknown command.
        result.clear();
    }
    // Nothing of the request outlives its answer, and its PINs are wiped first.
    vok::server::releaseRequest();
#ifdef __GLIBC__
    if (size + result.size() >= kTrimAfter) malloc_trim(0);
#endif
    if (result.size() > vok::server::kFrameLimit) result.clear();
    // A failed allocation also leaves the empty answer.
    uint8_t* buffer = new (std::nothrow) uint8_t[result.size()];
    if (buffer) std::memcpy(buffer, result.data(), result.size());
    *response = buffer;
    *responseLength = buffer ? static_cast<uint32_t>(result.size()) : 0;
    return 0;
}
