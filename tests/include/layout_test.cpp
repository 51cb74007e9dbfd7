// The literal sizes of both pointer widths, and the function list's slot
// order: a slot out of place calls the wrong vendor function, which no size
// check sees. The same test runs on the 64-bit host and the 32-bit targets.
#include <gtest/gtest.h>

#include <cstddef>

#include "vok_pkcs11.h"

namespace {

constexpr size_t slot(size_t index) { return 2 + index * sizeof(void*); }

TEST(layout, LiteralSizes) {
    ASSERT_TRUE(sizeof(void*) == 4 || sizeof(void*) == 8);
    struct Size {
        const char* name;
        size_t actual, at32, at64;
    };
    const Size sizes[] = {
        {"CK_INFO", sizeof(CK_INFO), 76, 76},
        {"CK_INFO.flags", offsetof(CK_INFO, flags), 34, 34},
        {"CK_ATTRIBUTE", sizeof(CK_ATTRIBUTE), 20, 24},
        {"CK_ATTRIBUTE.ulValueLen", offsetof(CK_ATTRIBUTE, ulValueLen), 12, 16},
        {"CK_MECHANISM", sizeof(CK_MECHANISM), 20, 24},
        {"CK_C_INITIALIZE_ARGS", sizeof(CK_C_INITIALIZE_ARGS), 28, 48},
        {"CK_FUNCTION_LIST", sizeof(CK_FUNCTION_LIST), 274, 546},
        {"CK_RSA_PKCS_OAEP_PARAMS", sizeof(CK_RSA_PKCS_OAEP_PARAMS), 36, 40},
        {"CK_KEA_DERIVE_PARAMS", sizeof(CK_KEA_DERIVE_PARAMS), 29, 41},
        {"CK_PKCS5_PBKD2_PARAMS", sizeof(CK_PKCS5_PBKD2_PARAMS), 56, 72},
        {"CK_SSL3_KEY_MAT_PARAMS", sizeof(CK_SSL3_KEY_MAT_PARAMS), 53, 65},
        {"CK_GCM_PARAMS", sizeof(CK_GCM_PARAMS), 40, 48},
    };
    for (const Size& s : sizes)
        EXPECT_EQ(s.actual, sizeof(void*) == 4 ? s.at32 : s.at64) << s.name;
}

TEST(layout, FunctionListSlotOrder) {
    struct Slot {
        const char* name;
        size_t offset;
        size_t index;
    };
    const Slot slots[] = {
        {"C_Initialize", offsetof(CK_FUNCTION_LIST, C_Initialize), 0},
        {"C_Finalize", offsetof(CK_FUNCTION_LIST, C_Finalize), 1},
        {"C_GetInfo", offsetof(CK_FUNCTION_LIST, C_GetInfo), 2},
        {"C_GetFunctionList", offsetof(CK_FUNCTION_LIST, C_GetFunctionList), 3},
        {"C_GetTokenInfo", offsetof(CK_FUNCTION_LIST, C_GetTokenInfo), 6},
        {"C_InitPIN", offsetof(CK_FUNCTION_LIST, C_InitPIN), 10},
        {"C_OpenSession", offsetof(CK_FUNCTION_LIST, C_OpenSession), 12},
        {"C_Login", offsetof(CK_FUNCTION_LIST, C_Login), 18},
        {"C_CreateObject", offsetof(CK_FUNCTION_LIST, C_CreateObject), 20},
        {"C_FindObjectsFinal", offsetof(CK_FUNCTION_LIST, C_FindObjectsFinal), 28},
        {"C_EncryptInit", offsetof(CK_FUNCTION_LIST, C_EncryptInit), 29},
        {"C_DecryptInit", offsetof(CK_FUNCTION_LIST, C_DecryptInit), 33},
        {"C_DigestInit", offsetof(CK_FUNCTION_LIST, C_DigestInit), 37},
        {"C_DigestKey", offsetof(CK_FUNCTION_LIST, C_DigestKey), 40},
        {"C_SignInit", offsetof(CK_FUNCTION_LIST, C_SignInit), 42},
        {"C_VerifyInit", offsetof(CK_FUNCTION_LIST, C_VerifyInit), 48},
        {"C_VerifyRecover", offsetof(CK_FUNCTION_LIST, C_VerifyRecover), 53},
        {"C_DigestEncryptUpdate", offsetof(CK_FUNCTION_LIST, C_DigestEncryptUpdate), 54},
        {"C_DecryptVerifyUpdate", offsetof(CK_FUNCTION_LIST, C_DecryptVerifyUpdate), 57},
        {"C_GenerateKey", offsetof(CK_FUNCTION_LIST, C_GenerateKey), 58},
        {"C_GenerateKeyPair", offsetof(CK_FUNCTION_LIST, C_GenerateKeyPair), 59},
        {"C_WrapKey", offsetof(CK_FUNCTION_LIST, C_WrapKey), 60},
        {"C_UnwrapKey", offsetof(CK_FUNCTION_LIST, C_UnwrapKey), 61},
        {"C_DeriveKey", offsetof(CK_FUNCTION_LIST, C_DeriveKey), 62},
        {"C_SeedRandom", offsetof(CK_FUNCTION_LIST, C_SeedRandom), 63},
        {"C_GenerateRandom", offsetof(CK_FUNCTION_LIST, C_GenerateRandom), 64},
        {"C_GetFunctionStatus", offsetof(CK_FUNCTION_LIST, C_GetFunctionStatus), 65},
        {"C_CancelFunction", offsetof(CK_FUNCTION_LIST, C_CancelFunction), 66},
        {"C_WaitForSlotEvent", offsetof(CK_FUNCTION_LIST, C_WaitForSlotEvent), 67},
    };
    for (const Slot& s : slots) EXPECT_EQ(s.offset, slot(s.index)) << s.name;
}

}  // namespace
