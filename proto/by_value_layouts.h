#ifndef VOK_BY_VALUE_LAYOUTS_H
#define VOK_BY_VALUE_LAYOUTS_H

// The structures that travel by value (the schema's CK_STRUCTURE and
// CK_TEMPLATE): which mechanism takes which parameter structure, and each
// structure's members in wire order. Client and service walk the same table,
// each over its own memory layout, so the order of a layout's members is part
// of the wire contract and must not change.

#include <cstddef>
#include <cstdint>

#include "vok_pkcs11.h"

namespace vok {
namespace layout {

enum class Kind : uint8_t {
    kNumber,     // a CK_ULONG-based member: one entry of `number`
    kByte,       // a CK_BYTE or CK_BBOOL member: one entry of `number`
    kArray,      // a byte array inside the structure: one entry of `buffer`
    kBuffer,     // a pointer to bytes: one entry of `buffer`, no data for NULL
    kStructure,  // a pointer to a structure: one entry of `buffer` holding its form
};

// Where the length of a kBuffer member comes from.
enum class Length : uint8_t {
    kFixed,       // `length` bytes
    kMember,      // member `length` of the same structure, in bytes
    kParentBits,  // member `length` of the enclosing structure, in bits
    kBehind,      // the number that member `length` (a kStructure) points to
};

// Which way a member's contents go. The client copies kOut and kInOut
// members back into the caller's structure; kOut buffers travel only as
// their presence.
enum class Flow : uint8_t { kIn, kOut, kInOut };

struct Layout;

struct Member {
    Kind kind;
    size_t offset;
    Length lengthFrom;
    size_t length;  // see Length; the size of a kArray
    Flow flow;
    const Layout* pointee;  // kStructure
};

struct Layout {
    const char* name;
    size_t size;  // sizeof the structure in this process
    const Member* members;
    size_t count;
    size_t numbers;  // members that travel in `number`
    size_t buffers;  // members that travel in `buffer`
    bool outputs;    // some member, at any depth, goes back to the caller
};

// Attribute values that are templates themselves, and how deep templates may
// nest inside one another; a deeper one is refused like one without its
// by-value form.
bool isTemplateAttribute(CK_ATTRIBUTE_TYPE type);
constexpr int kMaxTemplateDepth = 4;

// The parameter structure the mechanism takes when that structure holds
// pointers; nullptr for every other mechanism.
const Layout* forMechanism(CK_MECHANISM_TYPE type);

// Every layout, for checks over all of them.
const Layout* const* allLayouts(size_t* count);

// Member access through bytes, as packed structures need.
uint64_t readNumber(const Member& m, const void* structure);
void writeNumber(const Member& m, void* structure, uint64_t value);
void* readPointer(const Member& m, const void* structure);
void writePointer(const Member& m, void* structure, const void* value);

// The byte length of buffer member `m` of `structure`, whose enclosing
// structure (or nullptr) is `parent`. Reads through a pointer for kBehind, so
// only for memory the caller vouches for.
CK_ULONG bufferLength(const Layout& l, const Member& m, const void* structure,
                      const Layout* parentLayout, const void* parent);

}  // namespace layout
}  // namespace vok

#endif
