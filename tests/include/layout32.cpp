// Compiled with -m32 -fsyntax-only by the layout32 test: the literal sizes
// the 32-bit target must produce, independent of the pointer-size formulas in
// the header itself.
#include <cstddef>

#include "vok_pkcs11.h"

static_assert(sizeof(void*) == 4, "compile this file for the 32-bit target");

static_assert(sizeof(CK_ULONG) == 8, "CK_ULONG");
static_assert(sizeof(CK_VERSION) == 2, "CK_VERSION");
static_assert(sizeof(CK_INFO) == 76, "CK_INFO");
static_assert(offsetof(CK_INFO, flags) == 34, "CK_INFO.flags");
static_assert(offsetof(CK_INFO, libraryVersion) == 74, "CK_INFO.libraryVersion");
static_assert(sizeof(CK_SLOT_INFO) == 108, "CK_SLOT_INFO");
static_assert(sizeof(CK_TOKEN_INFO) == 204, "CK_TOKEN_INFO");
static_assert(sizeof(CK_SESSION_INFO) == 32, "CK_SESSION_INFO");
static_assert(sizeof(CK_ATTRIBUTE) == 20, "CK_ATTRIBUTE");
static_assert(offsetof(CK_ATTRIBUTE, ulValueLen) == 12, "CK_ATTRIBUTE.ulValueLen");
static_assert(sizeof(CK_DATE) == 8, "CK_DATE");
static_assert(sizeof(CK_MECHANISM) == 20, "CK_MECHANISM");
static_assert(sizeof(CK_MECHANISM_INFO) == 24, "CK_MECHANISM_INFO");
static_assert(sizeof(CK_C_INITIALIZE_ARGS) == 28, "CK_C_INITIALIZE_ARGS");
static_assert(sizeof(CK_FUNCTION_LIST) == 274, "CK_FUNCTION_LIST");
static_assert(offsetof(CK_FUNCTION_LIST, C_Initialize) == 2, "C_Initialize slot");
static_assert(offsetof(CK_FUNCTION_LIST, C_WaitForSlotEvent) == 270, "C_WaitForSlotEvent slot");

// Mechanism parameter structures: the sizes the Java bridge allocates.
static_assert(sizeof(CK_RSA_PKCS_OAEP_PARAMS) == 36, "OAEP");
static_assert(sizeof(CK_KEA_DERIVE_PARAMS) == 29, "KEA");
static_assert(sizeof(CK_RC2_CBC_PARAMS) == 16, "RC2-CBC");
static_assert(sizeof(CK_RC2_MAC_GENERAL_PARAMS) == 16, "RC2-MAC-general");
static_assert(sizeof(CK_RC5_PARAMS) == 16, "RC5");
static_assert(sizeof(CK_RC5_CBC_PARAMS) == 28, "RC5-CBC");
static_assert(sizeof(CK_RC5_MAC_GENERAL_PARAMS) == 24, "RC5-MAC-general");
static_assert(sizeof(CK_SKIPJACK_PRIVATE_WRAP_PARAMS) == 64, "Skipjack private wrap");
static_assert(sizeof(CK_SKIPJACK_RELAYX_PARAMS) == 84, "Skipjack relayX");
static_assert(sizeof(CK_PBE_PARAMS) == 36, "PBE");
static_assert(sizeof(CK_PKCS5_PBKD2_PARAMS) == 56, "PBKD2");
static_assert(sizeof(CK_KEY_DERIVATION_STRING_DATA) == 12, "key derivation string");
static_assert(sizeof(CK_KEY_WRAP_SET_OAEP_PARAMS) == 13, "SET OAEP");
static_assert(sizeof(CK_SSL3_RANDOM_DATA) == 24, "SSL3 random data");
static_assert(sizeof(CK_SSL3_MASTER_KEY_DERIVE_PARAMS) == 28, "SSL3 master key derive");
static_assert(sizeof(CK_SSL3_KEY_MAT_OUT) == 40, "SSL3 key material out");
static_assert(sizeof(CK_SSL3_KEY_MAT_PARAMS) == 53, "SSL3 key material");
static_assert(sizeof(CK_RSA_PKCS_PSS_PARAMS) == 24, "PSS");
static_assert(sizeof(CK_ECDH1_DERIVE_PARAMS) == 32, "ECDH1");
static_assert(sizeof(CK_ECDH2_DERIVE_PARAMS) == 60, "ECDH2");
static_assert(sizeof(CK_X9_42_DH1_DERIVE_PARAMS) == 32, "X9.42 DH1");
static_assert(sizeof(CK_X9_42_DH2_DERIVE_PARAMS) == 60, "X9.42 DH2");
static_assert(sizeof(CK_DES_CBC_ENCRYPT_DATA_PARAMS) == 20, "DES-CBC encrypt data");
static_assert(sizeof(CK_AES_CBC_ENCRYPT_DATA_PARAMS) == 28, "AES-CBC encrypt data");
static_assert(sizeof(CK_GCM_PARAMS) == 40 && sizeof(CK_CCM_PARAMS) == 40, "GCM, CCM");

int main() { return 0; }
