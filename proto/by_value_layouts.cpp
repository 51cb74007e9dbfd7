#include "by_value_layouts.h"

#include <cstring>

namespace vok {
namespace layout {

namespace {

template <size_t N>
constexpr Layout makeLayout(const char* name, size_t size, const Member (&members)[N]) {
    size_t numbers = 0;
    bool outputs = false;
    for (const Member& m : members) {
        if (m.kind == Kind::kNumber || m.kind == Kind::kByte) ++numbers;
        if (m.flow != Flow::kIn || (m.pointee && m.pointee->outputs)) outputs = true;
    }
    return Layout{name, size, members, N, numbers, N - numbers, outputs};
}

// One line per member, in declaration order. `i` names the member that holds
// a buffer's length by its index in the same list.
#define NUMBER(S, m, flow) Member{Kind::kNumber, offsetof(S, m), Length::kFixed, 0, flow, nullptr}
#define BYTE(S, m, flow) Member{Kind::kByte, offsetof(S, m), Length::kFixed, 0, flow, nullptr}
#define ARRAY(S, m) \
    Member { Kind::kArray, offsetof(S, m), Length::kFixed, sizeof(S::m), Flow::kIn, nullptr }
#define BUFFER(S, m, from, i, flow) Member{Kind::kBuffer, offsetof(S, m), from, i, flow, nullptr}
#define IN(S, m, i) BUFFER(S, m, Length::kMember, i, Flow::kIn)
#define STRUCTURE(S, m, l, flow) \
    Member { Kind::kStructure, offsetof(S, m), Length::kFixed, 0, flow, &l }
#define N(S, m) NUMBER(S, m, Flow::kIn)
// CK_SSL3_RANDOM_DATA, embedded at `RandomInfo`; its lengths at i + 1, i + 3.
#define RANDOM_INFO(S, i)                                                       \
    IN(S, RandomInfo.pClientRandom, i + 1), N(S, RandomInfo.ulClientRandomLen), \
        IN(S, RandomInfo.pServerRandom, i + 3), N(S, RandomInfo.ulServerRandomLen)

constexpr Member kUlongMembers[] = {Member{Kind::kNumber, 0, Length::kFixed, 0, Flow::kIn, nullptr}};
constexpr Layout kUlong = makeLayout("CK_ULONG", sizeof(CK_ULONG), kUlongMembers);

constexpr Member kVersionMembers[] = {BYTE(CK_VERSION, major, Flow::kOut),
                                      BYTE(CK_VERSION, minor, Flow::kOut)};
constexpr Layout kVersion = makeLayout("CK_VERSION", sizeof(CK_VERSION), kVersionMembers);

#define S CK_RSA_PKCS_OAEP_PARAMS
constexpr Member kOaepMembers[] = {N(S, hashAlg), N(S, mgf), N(S, source), IN(S, pSourceData, 4),
                                   N(S, ulSourceDataLen)};
constexpr Layout kOaep = makeLayout("CK_RSA_PKCS_OAEP_PARAMS", sizeof(S), kOaepMembers);
#undef S

#define S CK_KEA_DERIVE_PARAMS
constexpr Member kKeaMembers[] = {BYTE(S, isSender, Flow::kIn), N(S, ulRandomLen),
                                  IN(S, pRandomA, 1),           IN(S, pRandomB, 1),
                                  N(S, ulPublicDataLen),        IN(S, pPublicData, 4)};
constexpr Layout kKea = makeLayout("CK_KEA_DERIVE_PARAMS", sizeof(S), kKeaMembers);
#undef S

#define S CK_RC5_CBC_PARAMS
constexpr Member kRc5CbcMembers[] = {N(S, ulWordsize), N(S, ulRounds), IN(S, pIv, 3), N(S, ulIvLen)};
constexpr Layout kRc5Cbc = makeLayout("CK_RC5_CBC_PARAMS", sizeof(S), kRc5CbcMembers);
#undef S

#define S CK_SKIPJACK_PRIVATE_WRAP_PARAMS
constexpr Member kSkipjackWrapMembers[] = {
    N(S, ulPasswordLen), IN(S, pPassword, 0), N(S, ulPublicDataLen), IN(S, pPublicData, 2),
    N(S, ulPAndGLen),    N(S, ulQLen),        N(S, ulRandomLen),     IN(S, pRandomA, 6),
    IN(S, pPrimeP, 4),   IN(S, pBaseG, 4),    IN(S, pSubprimeQ, 5)};
constexpr Layout kSkipjackWrap =
    makeLayout("CK_SKIPJACK_PRIVATE_WRAP_PARAMS", sizeof(S), kSkipjackWrapMembers);
#undef S

#define S CK_SKIPJACK_RELAYX_PARAMS
constexpr Member kRelayxMembers[] = {
    N(S, ulOldWrappedXLen),   IN(S, pOldWrappedX, 0),   N(S, ulOldPasswordLen),
    IN(S, pOldPassword, 2),   N(S, ulOldPublicDataLen), IN(S, pOldPublicData, 4),
    N(S, ulOldRandomLen),     IN(S, pOldRandomA, 6),    N(S, ulNewPasswordLen),
    IN(S, pNewPassword, 8),   N(S, ulNewPublicDataLen), IN(S, pNewPublicData, 10),
    N(S, ulNewRandomLen),     IN(S, pNewRandomA, 12)};
constexpr Layout kRelayx = makeLayout("CK_SKIPJACK_RELAYX_PARAMS", sizeof(S), kRelayxMembers);
#undef S

// The module writes the 8-byte IV of the PBE ciphers (all 64-bit blocks).
#define S CK_PBE_PARAMS
constexpr Member kPbeMembers[] = {
    BUFFER(S, pInitVector, Length::kFixed, 8, Flow::kOut), IN(S, pPassword, 2),
    N(S, ulPasswordLen), IN(S, pSalt, 4), N(S, ulSaltLen), N(S, ulIteration)};
constexpr Layout kPbe = makeLayout("CK_PBE_PARAMS", sizeof(S), kPbeMembers);
#undef S

// ulPasswordLen points to the password's length.
#define S CK_PKCS5_PBKD2_PARAMS
constexpr Member kPbkd2Members[] = {N(S, saltSource),
                                    IN(S, pSaltSourceData, 2),
                                    N(S, ulSaltSourceDataLen),
                                    N(S, iterations),
                                    N(S, prf),
                                    IN(S, pPrfData, 6),
                                    N(S, ulPrfDataLen),
                                    BUFFER(S, pPassword, Length::kBehind, 8, Flow::kIn),
                                    STRUCTURE(S, ulPasswordLen, kUlong, Flow::kIn)};
constexpr Layout kPbkd2 = makeLayout("CK_PKCS5_PBKD2_PARAMS", sizeof(S), kPbkd2Members);
#undef S

#define S CK_KEY_DERIVATION_STRING_DATA
constexpr Member kStringDataMembers[] = {IN(S, pData, 1), N(S, ulLen)};
constexpr Layout kStringData =
    makeLayout("CK_KEY_DERIVATION_STRING_DATA", sizeof(S), kStringDataMembers);
#undef S

// On unwrap the module writes bBC and X.
#define S CK_KEY_WRAP_SET_OAEP_PARAMS
constexpr Member kSetOaepMembers[] = {BYTE(S, bBC, Flow::kInOut),
                                      BUFFER(S, pX, Length::kMember, 2, Flow::kInOut), N(S, ulXLen)};
constexpr Layout kSetOaep = makeLayout("CK_KEY_WRAP_SET_OAEP_PARAMS", sizeof(S), kSetOaepMembers);
#undef S

#define S CK_SSL3_MASTER_KEY_DERIVE_PARAMS
constexpr Member kSsl3MasterMembers[] = {RANDOM_INFO(S, 0),
                                         STRUCTURE(S, pVersion, kVersion, Flow::kOut)};
constexpr Layout kSsl3Master =
    makeLayout("CK_SSL3_MASTER_KEY_DERIVE_PARAMS", sizeof(S), kSsl3MasterMembers);
#undef S

// The IVs are ulIVSizeInBits of the enclosing parameters long.
#define S CK_SSL3_KEY_MAT_OUT
#define OUT(m) NUMBER(S, m, Flow::kOut)
constexpr Member kKeyMatOutMembers[] = {
    OUT(hClientMacSecret), OUT(hServerMacSecret), OUT(hClientKey), OUT(hServerKey),
    BUFFER(S, pIVClient, Length::kParentBits, 2, Flow::kOut),
    BUFFER(S, pIVServer, Length::kParentBits, 2, Flow::kOut)};
constexpr Layout kKeyMatOut = makeLayout("CK_SSL3_KEY_MAT_OUT", sizeof(S), kKeyMatOutMembers);
#undef OUT
#undef S

#define S CK_SSL3_KEY_MAT_PARAMS
constexpr Member kKeyMatMembers[] = {
    N(S, ulMacSizeInBits), N(S, ulKeySizeInBits), N(S, ulIVSizeInBits), BYTE(S, bIsExport, Flow::kIn),
    RANDOM_INFO(S, 4),     STRUCTURE(S, pReturnedKeyMaterial, kKeyMatOut, Flow::kOut)};
constexpr Layout kKeyMat = makeLayout("CK_SSL3_KEY_MAT_PARAMS", sizeof(S), kKeyMatMembers);
#undef S

#define S CK_ECDH1_DERIVE_PARAMS
constexpr Member kEcdh1Members[] = {N(S, kdf), N(S, ulSharedDataLen), IN(S, pSharedData, 1),
                                    N(S, ulPublicDataLen), IN(S, pPublicData, 3)};
constexpr Layout kEcdh1 = makeLayout("CK_ECDH1_DERIVE_PARAMS", sizeof(S), kEcdh1Members);
#undef S

#define S CK_ECDH2_DERIVE_PARAMS
constexpr Member kEcdh2Members[] = {
    N(S, kdf),          N(S, ulSharedDataLen),  IN(S, pSharedData, 1),
    N(S, ulPublicDataLen), IN(S, pPublicData, 3), N(S, ulPrivateDataLen),
    N(S, hPrivateData), N(S, ulPublicDataLen2), IN(S, pPublicData2, 7)};
constexpr Layout kEcdh2 = makeLayout("CK_ECDH2_DERIVE_PARAMS", sizeof(S), kEcdh2Members);
#undef S

#define S CK_X9_42_DH1_DERIVE_PARAMS
constexpr Member kDh1Members[] = {N(S, kdf), N(S, ulOtherInfoLen), IN(S, pOtherInfo, 1),
                                  N(S, ulPublicDataLen), IN(S, pPublicData, 3)};
constexpr Layout kDh1 = makeLayout("CK_X9_42_DH1_DERIVE_PARAMS", sizeof(S), kDh1Members);
#undef S

#define S CK_X9_42_DH2_DERIVE_PARAMS
constexpr Member kDh2Members[] = {
    N(S, kdf),          N(S, ulOtherInfoLen),   IN(S, pOtherInfo, 1),
    N(S, ulPublicDataLen), IN(S, pPublicData, 3), N(S, ulPrivateDataLen),
    N(S, hPrivateData), N(S, ulPublicDataLen2), IN(S, pPublicData2, 7)};
constexpr Layout kDh2 = makeLayout("CK_X9_42_DH2_DERIVE_PARAMS", sizeof(S), kDh2Members);
#undef S

#define S CK_DES_CBC_ENCRYPT_DATA_PARAMS
constexpr Member kDesCbcDataMembers[] = {ARRAY(S, iv), IN(S, pData, 2), N(S, length)};
constexpr Layout kDesCbcData =
    makeLayout("CK_DES_CBC_ENCRYPT_DATA_PARAMS", sizeof(S), kDesCbcDataMembers);
#undef S

// Also the layout of the Camellia, ARIA and SEED CBC encrypt-data parameters.
#define S CK_AES_CBC_ENCRYPT_DATA_PARAMS
constexpr Member kAesCbcDataMembers[] = {ARRAY(S, iv), IN(S, pData, 2), N(S, length)};
constexpr Layout kAesCbcData =
    makeLayout("CK_AES_CBC_ENCRYPT_DATA_PARAMS", sizeof(S), kAesCbcDataMembers);
#undef S

#define S CK_GCM_PARAMS
constexpr Member kGcmMembers[] = {IN(S, pIv, 1),     N(S, ulIvLen),  N(S, ulIvBits),
                                  IN(S, pAAD, 4),    N(S, ulAADLen), N(S, ulTagBits)};
constexpr Layout kGcm = makeLayout("CK_GCM_PARAMS", sizeof(S), kGcmMembers);
#undef S

#define S CK_CCM_PARAMS
constexpr Member kCcmMembers[] = {N(S, ulDataLen), IN(S, pNonce, 2), N(S, ulNonceLen),
                                  IN(S, pAAD, 4),   N(S, ulAADLen),   N(S, ulMACLen)};
constexpr Layout kCcm = makeLayout("CK_CCM_PARAMS", sizeof(S), kCcmMembers);
#undef S

#undef RANDOM_INFO
#undef N
#undef STRUCTURE
#undef IN
#undef BUFFER
#undef ARRAY
#undef BYTE
#undef NUMBER

struct MechanismLayout {
    CK_MECHANISM_TYPE first, last;  // a range of mechanism types
    const Layout* layout;
};

// The parameter structure each mechanism takes, where it holds pointers.
constexpr MechanismLayout kMechanisms[] = {
    {CKM_RSA_PKCS_OAEP, CKM_RSA_PKCS_OAEP, &kOaep},
    {CKM_X9_42_DH_DERIVE, CKM_X9_42_DH_DERIVE, &kDh1},
    {CKM_X9_42_DH_HYBRID_DERIVE, CKM_X9_42_MQV_DERIVE, &kDh2},
    {CKM_RC5_CBC, CKM_RC5_CBC, &kRc5Cbc},
    {CKM_RC5_CBC_PAD, CKM_RC5_CBC_PAD, &kRc5Cbc},
    {CKM_CONCATENATE_BASE_AND_DATA, CKM_XOR_BASE_AND_DATA, &kStringData},
    {CKM_SSL3_MASTER_KEY_DERIVE, CKM_SSL3_MASTER_KEY_DERIVE, &kSsl3Master},
    {CKM_SSL3_KEY_AND_MAC_DERIVE, CKM_SSL3_KEY_AND_MAC_DERIVE, &kKeyMat},
    {CKM_SSL3_MASTER_KEY_DERIVE_DH, CKM_SSL3_MASTER_KEY_DERIVE_DH, &kSsl3Master},
    {CKM_TLS_MASTER_KEY_DERIVE, CKM_TLS_MASTER_KEY_DERIVE, &kSsl3Master},
    {CKM_TLS_KEY_AND_MAC_DERIVE, CKM_TLS_KEY_AND_MAC_DERIVE, &kKeyMat},
    {CKM_TLS_MASTER_KEY_DERIVE_DH, CKM_TLS_MASTER_KEY_DERIVE_DH, &kSsl3Master},
    {CKM_PBE_MD2_DES_CBC, CKM_PBE_SHA1_RC2_40_CBC, &kPbe},
    {CKM_PKCS5_PBKD2, CKM_PKCS5_PBKD2, &kPbkd2},
    {CKM_PBA_SHA1_WITH_SHA1_HMAC, CKM_PBA_SHA1_WITH_SHA1_HMAC, &kPbe},
    {CKM_KEY_WRAP_SET_OAEP, CKM_KEY_WRAP_SET_OAEP, &kSetOaep},
    {CKM_CAMELLIA_ECB_ENCRYPT_DATA, CKM_CAMELLIA_ECB_ENCRYPT_DATA, &kStringData},
    {CKM_CAMELLIA_CBC_ENCRYPT_DATA, CKM_CAMELLIA_CBC_ENCRYPT_DATA, &kAesCbcData},
    {CKM_ARIA_ECB_ENCRYPT_DATA, CKM_ARIA_ECB_ENCRYPT_DATA, &kStringData},
    {CKM_ARIA_CBC_ENCRYPT_DATA, CKM_ARIA_CBC_ENCRYPT_DATA, &kAesCbcData},
    {CKM_SEED_ECB_ENCRYPT_DATA, CKM_SEED_ECB_ENCRYPT_DATA, &kStringData},
    {CKM_SEED_CBC_ENCRYPT_DATA, CKM_SEED_CBC_ENCRYPT_DATA, &kAesCbcData},
    {CKM_SKIPJACK_PRIVATE_WRAP, CKM_SKIPJACK_PRIVATE_WRAP, &kSkipjackWrap},
    {CKM_SKIPJACK_RELAYX, CKM_SKIPJACK_RELAYX, &kRelayx},
    {CKM_KEA_KEY_DERIVE, CKM_KEA_DERIVE, &kKea},
    {CKM_ECDH1_DERIVE, CKM_ECDH1_COFACTOR_DERIVE, &kEcdh1},
    {CKM_ECMQV_DERIVE, CKM_ECMQV_DERIVE, &kEcdh2},
    {CKM_AES_GCM, CKM_AES_GCM, &kGcm},
    {CKM_AES_CCM, CKM_AES_CCM, &kCcm},
    {CKM_DES_ECB_ENCRYPT_DATA, CKM_DES_ECB_ENCRYPT_DATA, &kStringData},
    {CKM_DES_CBC_ENCRYPT_DATA, CKM_DES_CBC_ENCRYPT_DATA, &kDesCbcData},
    {CKM_DES3_ECB_ENCRYPT_DATA, CKM_DES3_ECB_ENCRYPT_DATA, &kStringData},
    {CKM_DES3_CBC_ENCRYPT_DATA, CKM_DES3_CBC_ENCRYPT_DATA, &kDesCbcData},
    {CKM_AES_ECB_ENCRYPT_DATA, CKM_AES_ECB_ENCRYPT_DATA, &kStringData},
    {CKM_AES_CBC_ENCRYPT_DATA, CKM_AES_CBC_ENCRYPT_DATA, &kAesCbcData},
};

constexpr const Layout* kAll[] = {&kOaep,      &kKea,     &kRc5Cbc,   &kSkipjackWrap, &kRelayx,
                                  &kPbe,       &kPbkd2,   &kStringData, &kSetOaep,    &kSsl3Master,
                                  &kKeyMat,    &kEcdh1,   &kEcdh2,    &kDh1,          &kDh2,
                                  &kDesCbcData, &kAesCbcData, &kGcm,  &kCcm};

}  // namespace

bool isTemplateAttribute(CK_ATTRIBUTE_TYPE type) {
    return type == CKA_WRAP_TEMPLATE || type == CKA_UNWRAP_TEMPLATE || type == CKA_DERIVE_TEMPLATE;
}

const Layout* forMechanism(CK_MECHANISM_TYPE type) {
    for (const MechanismLayout& m : kMechanisms)
        if (type >= m.first && type <= m.last) return m.layout;
    return nullptr;
}

const Layout* const* allLayouts(size_t* count) {
    *count = sizeof kAll / sizeof kAll[0];
    return kAll;
}

uint64_t readNumber(const Member& m, const void* structure) {
    const auto* at = static_cast<const unsigned char*>(structure) + m.offset;
    if (m.kind == Kind::kByte) return *at;
    CK_ULONG value;
    memcpy(&value, at, sizeof value);
    return value;
}

void writeNumber(const Member& m, void* structure, uint64_t value) {
    auto* at = static_cast<unsigned char*>(structure) + m.offset;
    if (m.kind == Kind::kByte) {
        *at = static_cast<CK_BYTE>(value);
        return;
    }
    const CK_ULONG number = value;
    memcpy(at, &number, sizeof number);
}

void* readPointer(const Member& m, const void* structure) {
    void* p;
    memcpy(&p, static_cast<const unsigned char*>(structure) + m.offset, sizeof p);
    return p;
}

void writePointer(const Member& m, void* structure, const void* value) {
    memcpy(static_cast<unsigned char*>(structure) + m.offset, &value, sizeof value);
}

CK_ULONG bufferLength(const Layout& l, const Member& m, const void* structure,
                      const Layout* parentLayout, const void* parent) {
    switch (m.lengthFrom) {
        case Length::kFixed:
            return m.length;
        case Length::kMember:
            return readNumber(l.members[m.length], structure);
        case Length::kParentBits:
        {
            if (!parentLayout) return 0;
            const uint64_t bits = readNumber(parentLayout->members[m.length], parent);
            return bits / 8 + (bits % 8 != 0);
        }
        case Length::kBehind: {
            const Member& holder = l.members[m.length];
            const void* number = readPointer(holder, structure);
            return number ? readNumber(holder.pointee->members[0], number) : 0;
        }
    }
    return 0;
}

}  // namespace layout
}  // namespace vok
