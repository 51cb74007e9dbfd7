#include "proxy_calls.h"

#include <cstdint>
#include <cstring>

namespace voktest {

CallerMemory gCaller;

namespace {

using F = CK_FUNCTION_LIST_PTR;
CallerMemory& c = gCaller;

void putVarint(std::string& out, uint64_t v) {
    for (; v >= 0x80; v >>= 7) out += static_cast<char>(v | 0x80);
    out += static_cast<char>(v);
}

void putBytes(std::string& out, int number, const std::string& bytes) {
    putVarint(out, static_cast<uint64_t>(number) << 3 | 2);
    putVarint(out, bytes.size());
    out += bytes;
}

void putNumber(std::string& out, int number, uint64_t value) {
    putVarint(out, static_cast<uint64_t>(number) << 3);
    putVarint(out, value);
}

uint64_t address(const void* p) { return reinterpret_cast<uintptr_t>(p); }
CK_RV ignoreNotification(CK_SESSION_HANDLE, CK_NOTIFICATION, CK_VOID_PTR) { return CKR_OK; }

const Field kAbsent;
const std::string kInput("da\0ta!?#", 8);
const char* kOutput = "old";  // the output buffer up to its first zero byte
const char* kPin = "1234";    // the PIN up to its first zero byte
// {CKA_LABEL, "lab\0l", 5}; a NULL pValue travels without bytes and with length 0.
const std::vector<Field> kLabelAttribute = {CKA_LABEL, std::string("lab\0l", 5), 5};
const std::vector<Field> kTokenAttribute = {CKA_TOKEN, kAbsent, 0};
const Field kTemplate = Field::attributes({kLabelAttribute, kTokenAttribute});
// C_GenerateKeyPair's public and private key templates.
const Field kPublic = Field::attributes({kLabelAttribute});
const Field kPrivate = Field::attributes({kTokenAttribute});
const Field kMechanism = Field::message({CKM_AES_CBC, std::string("\x01\x00\x02", 3), 3});

}  // namespace

Field Field::message(const std::vector<Field>& fields) {
    Field f;
    f.kind = kMessage;
    f.bytes = encode(fields);
    return f;
}

Field Field::repeated(const std::vector<uint64_t>& numbers) {
    Field f;
    f.kind = kNumbers;
    f.repeatedNumbers = numbers;
    return f;
}

Field Field::attributes(const std::vector<std::vector<Field>>& messages) {
    Field f;
    f.kind = kMessages;
    for (const auto& m : messages) f.repeatedMessages.push_back(encode(m));
    return f;
}

std::string encode(const std::vector<Field>& fields) {
    std::string out;
    for (size_t i = 0; i < fields.size(); ++i) {
        const int number = static_cast<int>(i + 1);
        const Field& f = fields[i];
        if (f.kind == Field::kNumber) putNumber(out, number, f.number);
        if (f.kind == Field::kBytes || f.kind == Field::kMessage) putBytes(out, number, f.bytes);
        for (uint64_t n : f.repeatedNumbers) putNumber(out, number, n);  // unpacked, one tag each
        for (const std::string& m : f.repeatedMessages) putBytes(out, number, m);
    }
    return out;
}

std::string encodeRequest(const std::string& name, int field, const std::vector<Field>& fields) {
    std::string out;
    putBytes(out, 1, name);
    if (field) putBytes(out, field, encode(fields));
    return out;
}

std::string encodeAnswer(const std::string& name, CK_RV result, int field,
                         const std::vector<Field>& fields) {
    std::string out;
    putBytes(out, 1, name);
    putNumber(out, 2, result);
    if (field) putBytes(out, field, encode(fields));
    return out;
}

void CallerMemory::reset() {
    memset(this, 0xa5, sizeof(*this));
    for (CK_ULONG i = 0; i < 4; ++i) list[i] = 11 + i;
    count = 4;
    memcpy(output, "old", 4);
    outputLen = sizeof(output);
    memcpy(input, kInput.data(), sizeof(input));
    memcpy(pin, "1234\0xyz", sizeof(pin));
    memset(label, 'L', sizeof(label));
    memcpy(value, "lab\0l", sizeof(value));
    memcpy(parameter, "\x01\x00\x02", sizeof(parameter));
    tmpl[0] = CK_ATTRIBUTE{CKA_LABEL, value, sizeof(value)};
    tmpl[1] = CK_ATTRIBUTE{CKA_TOKEN, nullptr, 7};
    mechanism = CK_MECHANISM{CKM_AES_CBC, parameter, sizeof(parameter)};
    out = output;
    outLen = &outputLen;
}

CK_FUNCTION_LIST_PTR functionList() {
    CK_FUNCTION_LIST_PTR list = nullptr;
    C_GetFunctionList(&list);
    return list;
}

std::string hex(const std::string& bytes) {
    static const char* digits = "0123456789abcdef";
    std::string out;
    for (unsigned char ch : bytes) {
        out += digits[ch >> 4];
        out += digits[ch & 15];
    }
    return out;
}

pkcs11::OperationResult answer(const std::string& name, CK_RV result) {
    pkcs11::OperationResult res;
    res.set_name(name);
    res.set_result(result);
    return res;
}

// One entry: the proxy, its request's envelope field, the request's fields in
// schema order, then the call's arguments.
// clang-format off
#define UNPARENTHESIZE(...) __VA_ARGS__
// The common argument shapes, as sent and as passed: input then output,
// output only, a mechanism and a key.
#define IN_OUT_SENT (kSession, kInput, 8, kOutput, 16)
#define IN_OUT kSession, c.input, 8, c.out, c.outLen
#define OUT_SENT (kSession, kOutput, 16)
#define OUT kSession, c.out, c.outLen
#define MECHANISM_KEY_SENT (kSession, kMechanism, kKey)
#define MECHANISM_KEY kSession, &c.mechanism, kKey
#define PROXY(function, field, fields, ...)                                   \
    ProxyCall{#function, [](F f) { return f->function(__VA_ARGS__); }, field, \
              {UNPARENTHESIZE fields}}
#define OUTPUT(function, field, answer, fields, ...)                          \
    ProxyCall{#function, [](F f) { return f->function(__VA_ARGS__); }, field, \
              {UNPARENTHESIZE fields}, answer}

const std::vector<ProxyCall>& everyProxyCall() {
    static const std::vector<ProxyCall> calls = {
        PROXY(C_Initialize, 0, (), nullptr),
        PROXY(C_Finalize, 0, (), nullptr),
        PROXY(C_GetInfo, 0, (), &c.info),
        PROXY(C_GetSlotList, 3, (1, Field::repeated({11, 12, 13, 14}), 4),
              CK_TRUE, c.list, &c.count),
        PROXY(C_GetSlotInfo, 4, (kSlot), kSlot, &c.slotInfo),
        PROXY(C_GetTokenInfo, 25, (kSlot), kSlot, &c.tokenInfo),
        PROXY(C_GetMechanismList, 29, (kSlot, Field::repeated({11, 12, 13, 14}), 4),
              kSlot, c.list, &c.count),
        PROXY(C_GetMechanismInfo, 26, (kSlot, CKM_SHA256), kSlot, CKM_SHA256, &c.mechanismInfo),
        PROXY(C_InitToken, 30, (kSlot, kPin, 8, std::string(32, 'L')), kSlot, c.pin, 8, c.label),
        PROXY(C_InitPIN, 31, (kSession, kPin, 8), kSession, c.pin, 8),
        PROXY(C_SetPIN, 32, (kSession, kPin, 8, "LLLLL", 5), kSession, c.pin, 8, c.label, 5),
        // pApplication and Notify stay behind.
        PROXY(C_OpenSession, 5, (kSlot, kFlags),
              kSlot, kFlags, &c.info, ignoreNotification, &c.handle),
        PROXY(C_CloseSession, 6, (kSession), kSession),
        PROXY(C_CloseAllSessions, 33, (kSlot), kSlot),
        PROXY(C_GetSessionInfo, 24, (kSession), kSession, &c.sessionInfo),
        OUTPUT(C_GetOperationState, 34, 22, OUT_SENT, OUT),
        PROXY(C_SetOperationState, 35, (kSession, kInput, 8, kKey, kOtherKey),
              kSession, c.input, 8, kKey, kOtherKey),
        PROXY(C_Login, 7, (kSession, CKU_USER, kPin, 8), kSession, CKU_USER, c.pin, 8),
        PROXY(C_Logout, 8, (kSession), kSession),
        // Output handles travel as the caller's pointer values.
        PROXY(C_CreateObject, 36, (kSession, kTemplate, 2, address(&c.handle)),
              kSession, c.tmpl, 2, &c.handle),
        PROXY(C_CopyObject, 37, (kSession, kTemplate, kObject, 2, address(&c.handle)),
              kSession, kObject, c.tmpl, 2, &c.handle),
        PROXY(C_DestroyObject, 9, (kSession, kObject), kSession, kObject),
        PROXY(C_GetObjectSize, 38, (kSession, kObject), kSession, kObject, &c.count),
        PROXY(C_GetAttributeValue, 10, (kSession, kObject, 2, kTemplate),
              kSession, kObject, c.tmpl, 2),
        PROXY(C_SetAttributeValue, 39, (kSession, kObject, kTemplate, 2),
              kSession, kObject, c.tmpl, 2),
        PROXY(C_FindObjectsInit, 11, (kSession, kTemplate, 2), kSession, c.tmpl, 2),
        PROXY(C_FindObjects, 12, (kSession, 4, address(c.list), address(&c.count)),
              kSession, c.list, 4, &c.count),
        PROXY(C_FindObjectsFinal, 13, (kSession), kSession),
        PROXY(C_EncryptInit, 14, MECHANISM_KEY_SENT, MECHANISM_KEY),
        OUTPUT(C_Encrypt, 15, 11, IN_OUT_SENT, IN_OUT),
        OUTPUT(C_EncryptUpdate, 40, 27, IN_OUT_SENT, IN_OUT),
        OUTPUT(C_EncryptFinal, 41, 28, OUT_SENT, OUT),
        PROXY(C_DecryptInit, 16, MECHANISM_KEY_SENT, MECHANISM_KEY),
        OUTPUT(C_Decrypt, 17, 12, IN_OUT_SENT, IN_OUT),
        OUTPUT(C_DecryptUpdate, 42, 29, IN_OUT_SENT, IN_OUT),
        OUTPUT(C_DecryptFinal, 43, 30, OUT_SENT, OUT),
        PROXY(C_DigestInit, 18, (kSession, kMechanism), kSession, &c.mechanism),
        OUTPUT(C_Digest, 19, 18, IN_OUT_SENT, IN_OUT),
        PROXY(C_DigestUpdate, 44, (kSession, kInput, 8), kSession, c.input, 8),
        PROXY(C_DigestKey, 45, (kSession, kKey), kSession, kKey),
        OUTPUT(C_DigestFinal, 46, 31, OUT_SENT, OUT),
        PROXY(C_SignInit, 20, MECHANISM_KEY_SENT, MECHANISM_KEY),
        OUTPUT(C_Sign, 21, 13, IN_OUT_SENT, IN_OUT),
        PROXY(C_SignUpdate, 47, (kSession, kInput, 8), kSession, c.input, 8),
        OUTPUT(C_SignFinal, 48, 32, OUT_SENT, OUT),
        PROXY(C_SignRecoverInit, 49, MECHANISM_KEY_SENT, MECHANISM_KEY),
        OUTPUT(C_SignRecover, 50, 33, IN_OUT_SENT, IN_OUT),
        PROXY(C_VerifyInit, 22, MECHANISM_KEY_SENT, MECHANISM_KEY),
        // The signature is cut at its zero byte; its length is the caller's.
        PROXY(C_Verify, 23, (kSession, kInput, 8, kPin, 8), kSession, c.input, 8, c.pin, 8),
        PROXY(C_VerifyUpdate, 51, (kSession, kInput, 8), kSession, c.input, 8),
        PROXY(C_VerifyFinal, 52, (kSession, kInput, 8), kSession, c.input, 8),
        PROXY(C_VerifyRecoverInit, 53, MECHANISM_KEY_SENT, MECHANISM_KEY),
        OUTPUT(C_VerifyRecover, 54, 34, IN_OUT_SENT, IN_OUT),
        OUTPUT(C_DigestEncryptUpdate, 55, 35, IN_OUT_SENT, IN_OUT),
        OUTPUT(C_DecryptDigestUpdate, 56, 36, IN_OUT_SENT, IN_OUT),
        OUTPUT(C_SignEncryptUpdate, 57, 37, IN_OUT_SENT, IN_OUT),
        OUTPUT(C_DecryptVerifyUpdate, 58, 38, IN_OUT_SENT, IN_OUT),
        PROXY(C_GenerateKey, 59, (kSession, kMechanism, kTemplate, 2),
              kSession, &c.mechanism, c.tmpl, 2, &c.handle),
        PROXY(C_GenerateKeyPair, 60, (kSession, kMechanism, kPublic, 1, kPrivate, 1),
              kSession, &c.mechanism, &c.tmpl[0], 1, &c.tmpl[1], 1, &c.handle, &c.otherHandle),
        OUTPUT(C_WrapKey, 61, 41, (kSession, kMechanism, kKey, kOtherKey, kOutput, 16),
              kSession, &c.mechanism, kKey, kOtherKey, c.out, c.outLen),
        {"C_UnWrapKey",  // sent under this spelling
         [](F f) {
             return f->C_UnwrapKey(kSession, &c.mechanism, kKey, c.input, 8, c.tmpl, 2, &c.handle);
         },
         62, {kSession, kMechanism, kKey, kInput, 8, kTemplate, 2}},
        PROXY(C_DeriveKey, 63, (kSession, kMechanism, kKey, kTemplate, 2),
              kSession, &c.mechanism, kKey, c.tmpl, 2, &c.handle),
        // The seed is cut at its zero byte; its length is the caller's.
        PROXY(C_SeedRandom, 28, (kSession, "da", 8), kSession, c.input, 8),
        PROXY(C_GenerateRandom, 27, (kSession, kOutput, 16), kSession, c.output, 16),
        PROXY(C_GetFunctionStatus, 64, (kSession), kSession),
        PROXY(C_CancelFunction, 65, (kSession), kSession),
        // pReserved stays behind: presearved is absent.
        PROXY(C_WaitForSlotEvent, 66, (kFlags), kFlags, &c.handle, c.input),
    };
    return calls;
}
// clang-format on

}  // namespace voktest
