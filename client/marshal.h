#ifndef VOK_CLIENT_MARSHAL_H
#define VOK_CLIENT_MARSHAL_H

// The marshalling rules shared by the proxies. The service's answer is never
// trusted further than what arrived, and the caller's buffers are never
// written beyond the size the caller stated; the lengths and counts reported
// back are still the ones the service stated, so a caller learns the size it
// needs.

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

// Input (pointer, length) pair: exactly `length` bytes.
std::string bytesOf(const void* p, CK_ULONG length);

// Template rule, for input templates and the output template of
// C_GetAttributeValue alike. A value that is itself a template also travels
// by value (by_value.h).
void putTemplate(AttributeList* out, const CK_ATTRIBUTE* tmpl, CK_ULONG count);

// Template copy-back (C_GetAttributeValue, C_SetAttributeValue): types, value
// bytes into non-NULL buffers that the answer filled, and the needed length
// for NULL buffers. Templates inside values are copied back entry by entry,
// `depth` counting the levels.
void copyBackTemplate(const AttributeList& answer, CK_ULONG statedCount, CK_ATTRIBUTE* tmpl,
                      CK_ULONG callerCount, int depth = 0);

// C_FindObjectsInit's copy-back: every returned attribute rewrites type, value
// and length of the caller's entry, whether or not the answer carries a value;
// a caller's template value (by_value.h) is left alone.
void overwriteTemplate(const AttributeList& answer, CK_ATTRIBUTE* tmpl, CK_ULONG callerCount);

// List rule (C_GetSlotList, C_GetMechanismList).
void putList(NumberList* out, const CK_ULONG* list, CK_ULONG count);
// Writes the stated count to *pulCount and at most `capacity` entries.
void copyBackList(const NumberList& answer, CK_ULONG statedCount, CK_ULONG* list, CK_ULONG capacity,
                  CK_ULONG* pulCount);

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

// Output-buffer rule, answer side: at most the capacity and at most what
// arrived is copied; *length takes the stated length. Returns the CK_RV the
// caller sees: a length query that the module answered with
// CKR_BUFFER_TOO_SMALL is what the caller asked for, so it becomes CKR_OK.
// The service always hands the module a real buffer, so a query whose output
// would be empty is executed rather than only measured.
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
