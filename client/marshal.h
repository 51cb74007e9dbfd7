#ifndef VOK_CLIENT_MARSHAL_H
#define VOK_CLIENT_MARSHAL_H

// The marshalling rules shared by the proxies. The service's answer is never
// trusted further than what arrived, and the caller's buffers are never
// written beyond the size the caller stated. A length or count reported with
// CKR_OK never exceeds what was written into the caller's buffer; one beyond
// the buffer is reported as PKCS#11 reports it, CKR_BUFFER_TOO_SMALL with the
// size needed.

#include <cstddef>
#include <string>

#include "vok_pkcs11.h"
#include "vok_proto.h"

namespace vok {
namespace client {

using AttributeList = google::protobuf::RepeatedPtrField<pkcs11::CK_ATTRIBUTE>;
using NumberList = google::protobuf::RepeatedField<google::protobuf::uint64>;

// A caller's count or capacity behind a pointer; a NULL pointer reads as 0.
inline CK_ULONG valueOr0(const CK_ULONG* p) { return p ? *p : 0; }

// C-string rule: the bytes up to the first zero byte, never more than
// `limit`. NULL gives an empty string (callers leave the field absent).
std::string cString(const void* p, CK_ULONG limit);

// Input (pointer, length) pair: exactly `length` bytes. A length no frame can
// carry throws std::length_error, which fails the call like a broken channel.
std::string bytesOf(const void* p, CK_ULONG length);

// Input-buffer rule: exactly `length` bytes. A NULL pointer with a length
// leaves the field absent, and the service hands the module NULL rather than
// zeros; a NULL without a length is sent empty, as it always was.
struct InputBuffer {
    const void* data;
    CK_ULONG length;
    bool present() const { return data != nullptr || length == 0; }
    std::string contents() const { return bytesOf(data, length); }
};

// What the caller learns of a length the service stated for its buffer.
struct Reported {
    CK_RV rv;
    CK_ULONG length;
    size_t copied;  // bytes (or entries) to copy into the buffer
};
// Under CKR_OK the length is what can be copied; a stated length beyond the
// capacity is CKR_BUFFER_TOO_SMALL with that length and nothing copied. Any
// other result keeps the stated length, with a bounded copy.
Reported reportLength(CK_RV rv, CK_ULONG stated, size_t arrived, CK_ULONG capacity);

// Template rule, for input templates and the output template of
// C_GetAttributeValue alike. A value that is itself a template also travels
// by value (by_value.h).
void putTemplate(AttributeList* out, const CK_ATTRIBUTE* tmpl, CK_ULONG count);

// Template copy-back (C_GetAttributeValue, C_SetAttributeValue): types, value
// bytes into non-NULL buffers that the answer filled, and the needed length
// for NULL buffers; a value's length is what was copied. A value larger than
// its buffer leaves nothing but CK_UNAVAILABLE_INFORMATION behind, and turns
// CKR_OK into CKR_BUFFER_TOO_SMALL, as a module reports it. Templates inside
// values are copied back entry by entry, `depth` counting the levels. Returns
// the caller's CK_RV.
CK_RV copyBackTemplate(CK_RV rv, const AttributeList& answer, CK_ULONG statedCount,
                       CK_ATTRIBUTE* tmpl, CK_ULONG callerCount, int depth = 0);

// C_FindObjectsInit's copy-back: every returned attribute rewrites type, value
// and length of the caller's entry, whether or not the answer carries a value;
// a caller's template value (by_value.h) is left alone.
void overwriteTemplate(const AttributeList& answer, CK_ATTRIBUTE* tmpl, CK_ULONG callerCount);

// List rule (C_GetSlotList, C_GetMechanismList).
void putList(NumberList* out, const CK_ULONG* list, CK_ULONG count);
// Writes at most `capacity` entries and the count as reportLength gives it
// (the stated count for a NULL list: the length query). Returns the caller's
// CK_RV.
CK_RV copyBackList(CK_RV rv, const NumberList& answer, CK_ULONG statedCount, CK_ULONG* list,
                   CK_ULONG capacity, CK_ULONG* pulCount);

// Mechanism rule: type and the parameter block as raw bytes; a parameter
// that holds pointers also travels by value (by_value.h).
void putMechanism(pkcs11::CK_MECHANISM* out, const CK_MECHANISM* mechanism);

// Output-buffer rule, request side: the caller's buffer read as a C string
// within its capacity. A NULL buffer is a PKCS#11 length query: no bytes and a
// capacity of 0, so the module produces nothing and its operation stays active.
struct OutputBuffer {
    CK_BYTE* buffer;
    CK_ULONG* length;
    CK_ULONG capacity() const { return buffer ? valueOr0(length) : 0; }
    bool present() const { return buffer != nullptr; }
    std::string contents() const { return cString(buffer, capacity()); }
};

// Output-buffer rule, answer side: reportLength decides what is copied and
// what *length takes. Returns the CK_RV the caller sees: a length query
// answered with CKR_BUFFER_TOO_SMALL (by a service that hands the module an
// empty buffer rather than NULL) is what the caller asked for, so it becomes
// CKR_OK with the needed length.
CK_RV copyBackOutput(CK_RV rv, const std::string& data, CK_ULONG statedLength,
                     const OutputBuffer& out);

// Bytes the service sends back into one of the caller's input buffers
// (C_Verify's signature, C_SeedRandom's seed): at most its length.
void copyIntoInput(const std::string& data, CK_BYTE* buffer, CK_ULONG length);

// Fixed-width text of C_GetTokenInfo: field zeroed, then at most its width and
// at most the string's length copied; no terminator.
void copyPaddedText(CK_UTF8CHAR* field, size_t width, const std::string& text);

// Text of C_GetInfo and C_GetSlotInfo: a string of at most `width` bytes is
// copied with its terminator, which for a full-width string lands on the
// byte after the field (inside the same structure, by layout); a longer string
// leaves the field as it was. Written through the structure's bytes.
void copyTerminatedText(void* structure, size_t offset, size_t width, const std::string& text);

inline CK_BYTE versionByte(google::protobuf::uint64 v) { return static_cast<CK_BYTE>(v); }

}  // namespace client
}  // namespace vok

#endif
