#ifndef VOK_SERVER_H
#define VOK_SERVER_H

// Server role: the service process's end of every PKCS#11 call. The server
// channel hands each received command to Generate_Operation_Result_Server,
// which runs one handler against the vendor module registered under the
// server id.

#include <stdint.h>

#include <string>

#include "vok_export.h"
#include "vok_pkcs11.h"
#include "vok_proto.h"

// Process-wide state shared by the dispatcher and every handler. Only the
// server thread touches it, one command at a time, so none of it is locked.
extern "C" {
// Registry name of the module that serves the commands (the server id).
VOK_EXPORT extern char* mModuleName;
// The command being executed; every parse replaces its whole content.
VOK_EXPORT extern pkcs11::Operation operation;
// The vendor's function list, looked up again for every command; may be NULL.
VOK_EXPORT extern CK_FUNCTION_LIST_PTR ckpFunctions;
// What the last vendor call returned.
VOK_EXPORT extern CK_RV rv;
}

// How setModuleName_Server copies the name (strdup); tests swap it to reach
// the failure path. Not exported.
extern char* (*gModuleNameCopy)(const char*);

// Names the module and starts the server thread; returns the channel's status.
VOK_C_API int32_t vokpkcs11_init_server(const char* serverId);
// Stops nothing: the server thread serves until the process ends.
VOK_C_API int32_t vokpkcs11_server_deinit(void);
VOK_C_API int32_t vokpkcs11_server_getLastUsageTime(void);
// Always 0. NULL forgets the current name without freeing it.
VOK_C_API int32_t setModuleName_Server(const char* name);
// The channel's CommandCallback. Always 0; *response is allocated with new[]
// and is empty for a command nobody serves.
VOK_C_API int32_t Generate_Operation_Result_Server(const void* request, int32_t requestLength,
                                                   void** response, uint32_t* responseLength);

// One handler per command: the serialised Operation in, the serialised
// OperationResult out, or an empty string when no module is available or the
// request cannot be served.
VOK_EXPORT std::string C_Initialize_Server(const std::string& request);
VOK_EXPORT std::string C_Finalize_Server(const std::string& request);
VOK_EXPORT std::string C_GetInfo_Server(const std::string& request);
VOK_EXPORT std::string C_GetSlotList_Server(const std::string& request);
VOK_EXPORT std::string C_GetSlotInfo_Server(const std::string& request);
VOK_EXPORT std::string C_GetTokenInfo_Server(const std::string& request);
VOK_EXPORT std::string C_GetMechanismList_Server(const std::string& request);
VOK_EXPORT std::string C_GetMechanismInfo_Server(const std::string& request);
VOK_EXPORT std::string C_InitToken_Server(const std::string& request);
VOK_EXPORT std::string C_InitPin_Server(const std::string& request);
VOK_EXPORT std::string C_SetPin_Server(const std::string& request);
VOK_EXPORT std::string C_OpenSession_Server(const std::string& request);
VOK_EXPORT std::string C_CloseSession_Server(const std::string& request);
VOK_EXPORT std::string C_CloseAllSessions_Server(const std::string& request);
VOK_EXPORT std::string C_GetSessionInfo_Server(const std::string& request);
VOK_EXPORT std::string C_GetOperationState_Server(const std::string& request);
VOK_EXPORT std::string C_SetOperationState_Server(const std::string& request);
VOK_EXPORT std::string C_Login_Server(const std::string& request);
VOK_EXPORT std::string C_Logout_Server(const std::string& request);
VOK_EXPORT std::string C_CreateObject_Server(const std::string& request);
VOK_EXPORT std::string C_CopyObject_Server(const std::string& request);
VOK_EXPORT std::string C_DestroyObject_Server(const std::string& request);
VOK_EXPORT std::string C_GetObjectSize_Server(const std::string& request);
VOK_EXPORT std::string C_GetAttributeValue_Server(const std::string& request);
VOK_EXPORT std::string C_SetAttributeValue_Server(const std::string& request);
VOK_EXPORT std::string C_FindObjectsInit_Server(const std::string& request);
VOK_EXPORT std::string C_FindObjects_Server(const std::string& request);
VOK_EXPORT std::string C_FindObjectsFinal_Server(const std::string& request);

VOK_EXPORT std::string C_EncryptInit_Server(const std::string& request);
VOK_EXPORT std::string C_Encrypt_Server(const std::string& request);
VOK_EXPORT std::string C_EncryptUpdate_Server(const std::string& request);
VOK_EXPORT std::string C_EncryptFinal_Server(const std::string& request);
VOK_EXPORT std::string C_DecryptInit_Server(const std::string& request);
VOK_EXPORT std::string C_Decrypt_Server(const std::string& request);
VOK_EXPORT std::string C_DecryptUpdate_Server(const std::string& request);
VOK_EXPORT std::string C_DecryptFinal_Server(const std::string& request);
VOK_EXPORT std::string C_DigestInit_Server(const std::string& request);
VOK_EXPORT std::string C_Digest_Server(const std::string& request);
VOK_EXPORT std::string C_DigestUpdate_Server(const std::string& request);
VOK_EXPORT std::string C_DigestKey_Server(const std::string& request);
VOK_EXPORT std::string C_DigestFinal_Server(const std::string& request);
VOK_EXPORT std::string C_SignInit_Server(const std::string& request);
VOK_EXPORT std::string C_Sign_Server(const std::string& request);
VOK_EXPORT std::string C_SignUpdate_Server(const std::string& request);
VOK_EXPORT std::string C_SignFinal_Server(const std::string& request);
VOK_EXPORT std::string C_SignRecoverInit_Server(const std::string& request);
VOK_EXPORT std::string C_SignRecover_Server(const std::string& request);
VOK_EXPORT std::string C_VerifyInit_Server(const std::string& request);
VOK_EXPORT std::string C_Verify_Server(const std::string& request);
VOK_EXPORT std::string C_VerifyUpdate_Server(const std::string& request);
VOK_EXPORT std::string C_VerifyFinal_Server(const std::string& request);
VOK_EXPORT std::string C_VerifyRecoverInit_Server(const std::string& request);
VOK_EXPORT std::string C_VerifyRecover_Server(const std::string& request);
VOK_EXPORT std::string C_DigestEncryptUpdate_Server(const std::string& request);
VOK_EXPORT std::string C_DecryptDigestUpdate_Server(const std::string& request);
VOK_EXPORT std::string C_SignEncryptUpdate_Server(const std::string& request);
VOK_EXPORT std::string C_DecryptVerifyUpdate_Server(const std::string& request);
VOK_EXPORT std::string C_GenerateKey_Server(const std::string& request);
VOK_EXPORT std::string C_GenerateKeyPair_Server(const std::string& request);
VOK_EXPORT std::string C_WrapKey_Server(const std::string& request);
VOK_EXPORT std::string C_UnWrapKey_Server(const std::string& request);
VOK_EXPORT std::string C_DeriveKey_Server(const std::string& request);
VOK_EXPORT std::string C_GenerateRandom_Server(const std::string& request);
VOK_EXPORT std::string C_SeedRandom_Server(const std::string& request);
VOK_EXPORT std::string C_GetFunctionStatus_Server(const std::string& request);
VOK_EXPORT std::string C_CancelFunction_Server(const std::string& request);
VOK_EXPORT std::string C_WaitForSlotEvent_Server(const std::string& request);

#endif
