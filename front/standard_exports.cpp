// The standard C_ names, for callers that call a module's functions by name
// rather than through its function list: each calls the front's list entry of
// its own name with its own arguments. This unit reads the standard header
// alone; every definition takes its parameter types from the standard pointer
// type of its name (CK_C_xxx), and a wrong count conflicts with the standard
// prototype, so the compiler holds each one to the standard.

#include <p11-kit/pkcs11.h>

#include <cstddef>
#include <tuple>

#include "front.h"
#include "vok_export.h"

namespace {

CK_FUNCTION_LIST_PTR entries() { return static_cast<CK_FUNCTION_LIST_PTR>(vok_front_list()); }

// The type of parameter I of the function pointer type F.
template <class F, size_t I>
struct Parameter;
template <class... A, size_t I>
struct Parameter<CK_RV (*)(A...), I> {
    using type = std::tuple_element_t<I, std::tuple<A...>>;
};

}  // namespace

// clang-format off
#define VOK_FRONT_P(name, i) Parameter<CK_##name, i - 1>::type a##i
#define VOK_FRONT_PARAMETERS_1(n) VOK_FRONT_P(n, 1)
#define VOK_FRONT_PARAMETERS_2(n) VOK_FRONT_PARAMETERS_1(n), VOK_FRONT_P(n, 2)
#define VOK_FRONT_PARAMETERS_3(n) VOK_FRONT_PARAMETERS_2(n), VOK_FRONT_P(n, 3)
#define VOK_FRONT_PARAMETERS_4(n) VOK_FRONT_PARAMETERS_3(n), VOK_FRONT_P(n, 4)
#define VOK_FRONT_PARAMETERS_5(n) VOK_FRONT_PARAMETERS_4(n), VOK_FRONT_P(n, 5)
#define VOK_FRONT_PARAMETERS_6(n) VOK_FRONT_PARAMETERS_5(n), VOK_FRONT_P(n, 6)
#define VOK_FRONT_PARAMETERS_7(n) VOK_FRONT_PARAMETERS_6(n), VOK_FRONT_P(n, 7)
#define VOK_FRONT_PARAMETERS_8(n) VOK_FRONT_PARAMETERS_7(n), VOK_FRONT_P(n, 8)
#define VOK_FRONT_ARGUMENTS_1 a1
#define VOK_FRONT_ARGUMENTS_2 VOK_FRONT_ARGUMENTS_1, a2
#define VOK_FRONT_ARGUMENTS_3 VOK_FRONT_ARGUMENTS_2, a3
#define VOK_FRONT_ARGUMENTS_4 VOK_FRONT_ARGUMENTS_3, a4
#define VOK_FRONT_ARGUMENTS_5 VOK_FRONT_ARGUMENTS_4, a5
#define VOK_FRONT_ARGUMENTS_6 VOK_FRONT_ARGUMENTS_5, a6
#define VOK_FRONT_ARGUMENTS_7 VOK_FRONT_ARGUMENTS_6, a7
#define VOK_FRONT_ARGUMENTS_8 VOK_FRONT_ARGUMENTS_7, a8

// name, number of parameters
#define VOK_FRONT_FORWARD(name, count)                        \
    VOK_EXPORT CK_RV name(VOK_FRONT_PARAMETERS_##count(name)) { \
        return entries()->name(VOK_FRONT_ARGUMENTS_##count);    \
    }

VOK_FRONT_FORWARD(C_Initialize, 1)
VOK_FRONT_FORWARD(C_Finalize, 1)
VOK_FRONT_FORWARD(C_GetInfo, 1)
VOK_FRONT_FORWARD(C_GetFunctionList, 1)
VOK_FRONT_FORWARD(C_GetSlotList, 3)
VOK_FRONT_FORWARD(C_GetSlotInfo, 2)
VOK_FRONT_FORWARD(C_GetTokenInfo, 2)
VOK_FRONT_FORWARD(C_GetMechanismList, 3)
VOK_FRONT_FORWARD(C_GetMechanismInfo, 3)
VOK_FRONT_FORWARD(C_InitToken, 4)
VOK_FRONT_FORWARD(C_InitPIN, 3)
VOK_FRONT_FORWARD(C_SetPIN, 5)
VOK_FRONT_FORWARD(C_OpenSession, 5)
VOK_FRONT_FORWARD(C_CloseSession, 1)
VOK_FRONT_FORWARD(C_CloseAllSessions, 1)
VOK_FRONT_FORWARD(C_GetSessionInfo, 2)
VOK_FRONT_FORWARD(C_GetOperationState, 3)
VOK_FRONT_FORWARD(C_SetOperationState, 5)
VOK_FRONT_FORWARD(C_Login, 4)
VOK_FRONT_FORWARD(C_Logout, 1)
VOK_FRONT_FORWARD(C_CreateObject, 4)
VOK_FRONT_FORWARD(C_CopyObject, 5)
VOK_FRONT_FORWARD(C_DestroyObject, 2)
VOK_FRONT_FORWARD(C_GetObjectSize, 3)
VOK_FRONT_FORWARD(C_GetAttributeValue, 4)
VOK_FRONT_FORWARD(C_SetAttributeValue, 4)
VOK_FRONT_FORWARD(C_FindObjectsInit, 3)
VOK_FRONT_FORWARD(C_FindObjects, 4)
VOK_FRONT_FORWARD(C_FindObjectsFinal, 1)
VOK_FRONT_FORWARD(C_EncryptInit, 3)
VOK_FRONT_FORWARD(C_Encrypt, 5)
VOK_FRONT_FORWARD(C_EncryptUpdate, 5)
VOK_FRONT_FORWARD(C_EncryptFinal, 3)
VOK_FRONT_FORWARD(C_DecryptInit, 3)
VOK_FRONT_FORWARD(C_Decrypt, 5)
VOK_FRONT_FORWARD(C_DecryptUpdate, 5)
VOK_FRONT_FORWARD(C_DecryptFinal, 3)
VOK_FRONT_FORWARD(C_DigestInit, 2)
VOK_FRONT_FORWARD(C_Digest, 5)
VOK_FRONT_FORWARD(C_DigestUpdate, 3)
VOK_FRONT_FORWARD(C_DigestKey, 2)
VOK_FRONT_FORWARD(C_DigestFinal, 3)
VOK_FRONT_FORWARD(C_SignInit, 3)
VOK_FRONT_FORWARD(C_Sign, 5)
VOK_FRONT_FORWARD(C_SignUpdate, 3)
VOK_FRONT_FORWARD(C_SignFinal, 3)
VOK_FRONT_FORWARD(C_SignRecoverInit, 3)
VOK_FRONT_FORWARD(C_SignRecover, 5)
VOK_FRONT_FORWARD(C_VerifyInit, 3)
VOK_FRONT_FORWARD(C_Verify, 5)
VOK_FRONT_FORWARD(C_VerifyUpdate, 3)
VOK_FRONT_FORWARD(C_VerifyFinal, 3)
VOK_FRONT_FORWARD(C_VerifyRecoverInit, 3)
VOK_FRONT_FORWARD(C_VerifyRecover, 5)
VOK_FRONT_FORWARD(C_DigestEncryptUpdate, 5)
VOK_FRONT_FORWARD(C_DecryptDigestUpdate, 5)
VOK_FRONT_FORWARD(C_SignEncryptUpdate, 5)
VOK_FRONT_FORWARD(C_DecryptVerifyUpdate, 5)
VOK_FRONT_FORWARD(C_GenerateKey, 5)
VOK_FRONT_FORWARD(C_GenerateKeyPair, 8)
VOK_FRONT_FORWARD(C_WrapKey, 6)
VOK_FRONT_FORWARD(C_UnwrapKey, 8)
VOK_FRONT_FORWARD(C_DeriveKey, 6)
VOK_FRONT_FORWARD(C_SeedRandom, 3)
VOK_FRONT_FORWARD(C_GenerateRandom, 3)
VOK_FRONT_FORWARD(C_GetFunctionStatus, 1)
VOK_FRONT_FORWARD(C_CancelFunction, 1)
VOK_FRONT_FORWARD(C_WaitForSlotEvent, 3)
// clang-format on
