#ifndef VOK_CLIENT_H
#define VOK_CLIENT_H

#include <stdint.h>

#include "vok_export.h"
#include "vok_pkcs11.h"

// Opens the channel to the service named by serverId; every C_ proxy of this
// library answers all ones until this has returned 0.
VOK_C_API int32_t vokpkcs11_client_init(const char* serverId);
VOK_C_API int32_t vokpkcs11_client_deinit(void);

// The process's one function list, built by the first C_GetFunctionList.
#ifdef __cplusplus
extern "C" {
#endif
VOK_EXPORT extern CK_FUNCTION_LIST_PTR mFunctionList;
#ifdef __cplusplus
}
#endif

#endif
