#ifndef VOK_TEST_CLIENT_PROXY_CALLS_H
#define VOK_TEST_CLIENT_PROXY_CALLS_H

// One call of every proxy in the function list, with fixed, recognisable
// arguments, and the request bytes each call must produce. Tests that put
// every proxy through the same situation iterate over this table.

#include <string>
#include <type_traits>
#include <vector>

#include "vok_pkcs11.h"
#include "vok_proto.h"

namespace voktest {

// High and low bits set, so a swapped, truncated or sign-mangled field shows.
constexpr CK_SLOT_ID kSlot = 0x5100000000000003;
constexpr CK_SESSION_HANDLE kSession = 0x5e00000000000005;
constexpr CK_OBJECT_HANDLE kObject = 0x0b00000000000007;
constexpr CK_OBJECT_HANDLE kKey = 0x6e00000000000009;
constexpr CK_OBJECT_HANDLE kOtherKey = 0x6f0000000000000b;
constexpr CK_FLAGS kFlags = 0xf100000000000006;
constexpr CK_RV kAllOnes = ~static_cast<CK_RV>(0);

// One field of a message written by hand; a message is its fields numbered 1,
// 2, 3... in order. Expected bytes built this way do not come from the
// generated code under test.
struct Field {
    enum Kind { kAbsent, kNumber, kBytes, kMessage, kNumbers, kMessages } kind = kAbsent;
    uint64_t number = 0;
    std::string bytes;  // also an encoded message
    std::vector<uint64_t> repeatedNumbers;
    std::vector<std::string> repeatedMessages;

    Field() = default;
    // Any integer: the constants' types differ between pointer widths.
    template <class N, std::enable_if_t<std::is_integral<N>::value, int> = 0>
    Field(N n) : kind(kNumber), number(static_cast<uint64_t>(n)) {}
    Field(std::string b) : kind(kBytes), bytes(std::move(b)) {}
    Field(const char* b) : kind(kBytes), bytes(b) {}
    static Field message(const std::vector<Field>& fields);
    static Field repeated(const std::vector<uint64_t>& numbers);
    // A template: one CK_ATTRIBUTE message per entry.
    static Field attributes(const std::vector<std::vector<Field>>& messages);
};

std::string encode(const std::vector<Field>& fields);
// An Operation: `name`, then `fields` as the sub-message in envelope field
// `field` (none when 0).
std::string encodeRequest(const std::string& name, int field, const std::vector<Field>& fields);
// An OperationResult likewise.
std::string encodeAnswer(const std::string& name, CK_RV result, int field,
                         const std::vector<Field>& fields);

// Everything a proxy reads or writes, in one block, so a test can tell
// whether a call touched the caller's memory.
struct CallerMemory {
    CK_INFO info;
    CK_SLOT_INFO slotInfo;
    CK_TOKEN_INFO tokenInfo;
    CK_SESSION_INFO sessionInfo;
    CK_MECHANISM_INFO mechanismInfo;
    CK_ULONG list[4];  // 11, 12, 13, 14
    CK_ULONG count;    // 4
    CK_ULONG handle;
    CK_ULONG otherHandle;
    CK_BYTE output[16];  // "old", then pattern
    CK_ULONG outputLen;  // 16
    CK_BYTE input[8];    // "da\0ta!?#"
    CK_BYTE pin[8];      // "1234\0xyz"
    CK_BYTE label[32];   // 32 'L', no terminator
    CK_BYTE value[5];    // "lab\0l"
    CK_BYTE parameter[3];
    CK_ATTRIBUTE tmpl[2];  // {CKA_LABEL, value, 5}, {CKA_TOKEN, NULL, 7}
    CK_MECHANISM mechanism;
    CK_BYTE* out;      // output, passed by the output-buffer proxies
    CK_ULONG* outLen;  // &outputLen, likewise

    // Fills every byte with a pattern, then sets the inputs above.
    void reset();
};

// The one block the table's calls use.
extern CallerMemory gCaller;

struct ProxyCall {
    const char* name;  // the command name the request carries
    CK_RV (*call)(CK_FUNCTION_LIST_PTR);
    int field;  // the request's field in Operation, 0 for none
    std::vector<Field> request;
    // The output-buffer proxies: their answer's field in OperationResult (data,
    // then length); their request ends with the buffer's contents and capacity.
    int outputAnswer = 0;
};

// The 67 proxies of the function list other than C_GetFunctionList, in order.
const std::vector<ProxyCall>& everyProxyCall();

CK_FUNCTION_LIST_PTR functionList();
std::string hex(const std::string& bytes);
pkcs11::OperationResult answer(const std::string& name, CK_RV result);

}  // namespace voktest

#endif
