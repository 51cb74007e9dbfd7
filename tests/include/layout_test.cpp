// The literal sizes of both pointer widths, and the function list's slot
// order: a slot out of place calls the wrong vendor function, which no size
// check sees. The same test runs on the 64-bit host and the 32-bit targets.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstddef>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

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
    for (const Size& s : sizes) EXPECT_EQ(s.actual, sizeof(void*) == 4 ? s.at32 : s.at64) << s.name;
}

// The standard order, written out: the header builds the list from its own
// function table, so a slot out of place there shows only against this.
const std::string kStandardOrder =
    "C_Initialize C_Finalize C_GetInfo C_GetFunctionList C_GetSlotList C_GetSlotInfo "
    "C_GetTokenInfo C_GetMechanismList C_GetMechanismInfo C_InitToken C_InitPIN C_SetPIN "
    "C_OpenSession C_CloseSession C_CloseAllSessions C_GetSessionInfo C_GetOperationState "
    "C_SetOperationState C_Login C_Logout C_CreateObject C_CopyObject C_DestroyObject "
    "C_GetObjectSize C_GetAttributeValue C_SetAttributeValue C_FindObjectsInit C_FindObjects "
    "C_FindObjectsFinal C_EncryptInit C_Encrypt C_EncryptUpdate C_EncryptFinal C_DecryptInit "
    "C_Decrypt C_DecryptUpdate C_DecryptFinal C_DigestInit C_Digest C_DigestUpdate C_DigestKey "
    "C_DigestFinal C_SignInit C_Sign C_SignUpdate C_SignFinal C_SignRecoverInit C_SignRecover "
    "C_VerifyInit C_Verify C_VerifyUpdate C_VerifyFinal C_VerifyRecoverInit C_VerifyRecover "
    "C_DigestEncryptUpdate C_DecryptDigestUpdate C_SignEncryptUpdate C_DecryptVerifyUpdate "
    "C_GenerateKey C_GenerateKeyPair C_WrapKey C_UnwrapKey C_DeriveKey C_SeedRandom "
    "C_GenerateRandom C_GetFunctionStatus C_CancelFunction C_WaitForSlotEvent";

TEST(layout, FunctionListSlotOrder) {
    std::vector<std::pair<size_t, std::string>> slots;
#define VOK_SLOT(name, params) slots.emplace_back(offsetof(CK_FUNCTION_LIST, name), #name);
    VOK_CK_FUNCTIONS(VOK_SLOT)
#undef VOK_SLOT
    std::sort(slots.begin(), slots.end());
    std::istringstream order(kStandardOrder);
    std::string name;
    size_t index = 0;
    for (; order >> name; ++index) {
        ASSERT_LT(index, slots.size());
        EXPECT_EQ(name, slots[index].second) << index;
        EXPECT_EQ(slot(index), slots[index].first) << name;
    }
    EXPECT_EQ(68u, index);
    EXPECT_EQ(68u, slots.size());
}

}  // namespace
