#ifndef VOK_SERVER_MARSHAL_H
#define VOK_SERVER_MARSHAL_H

// The marshalling rules shared by the handlers. Every size the module sees
// comes from the request, but nothing is read beyond what arrived: a value or
// list shorter than its stated size is filled as far as it goes and the rest
// stays zero. Nothing is read from a module's buffer beyond what was
// allocated for it.

#include <array>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <new>
#include <optional>
#include <string>
#include <vector>

#include "request_memory.h"
#include "vok_pkcs11.h"
#include "vok_proto.h"

namespace vok {
namespace server {

// The largest payload a frame can carry. No single buffer, list or template
// built for one request may exceed it, so a peer's count cannot make the
// service allocate more than one frame's worth for it.
constexpr uint64_t kFrameLimit = INT32_MAX;

// Lists and templates of real PKCS#11 calls hold a handful of entries. A count
// beyond this bound can only be a peer making the service allocate, and echo,
// gigabytes from a few request bytes; it gets the empty answer.
constexpr uint64_t kMaxElements = 1u << 20;

using AttributeList = google::protobuf::RepeatedPtrField<pkcs11::CK_ATTRIBUTE>;

// Thrown while a handler builds the module's arguments from a request the
// module must not see (bytes that may hold a client's pointer): the answer
// then carries the command's name and this code only, and the module is not
// called.
struct Refusal {
    CK_RV rv;
};
using NumberList = google::protobuf::RepeatedField<google::protobuf::uint64>;

// Wipes what the buffer held before releasing it: some hold PINs or
// plaintext.
struct WipingFree {
    size_t bytes;
    void operator()(void* p) const noexcept {
        wipe(p, bytes);
        std::free(p);
    }
};

// Every size below fits size_t on the 32-bit targets too, so no cast to it
// cuts a length.
static_assert(kFrameLimit <= SIZE_MAX && kMaxElements <= SIZE_MAX, "sizes fit size_t");

// `count` zero-filled elements from malloc. Never NULL, even for 0: the module
// always receives a real pointer. A count beyond a frame's worth of bytes,
// beyond what is left of the request's buffer allowance, or memory that is not
// there, throws std::bad_alloc, which the handler frame turns into the empty
// answer.
template <class T>
class Buffer {
public:
    // Throws std::bad_alloc for a count no request may ask for.
    static void checkCount(uint64_t count) {
        if (count > (sizeof(T) == 1 ? kFrameLimit : kMaxElements)) throw std::bad_alloc();
    }
    explicit Buffer(uint64_t count)
        : data_(nullptr, WipingFree{static_cast<size_t>(count ? count : 1) * sizeof(T)}),
          count_(count) {
        checkCount(count);
        BufferBudget::charge(data_.get_deleter().bytes);
        data_.reset(
            static_cast<T*>(std::calloc(count ? static_cast<size_t>(count) : 1, sizeof(T))));
        if (!data_) throw std::bad_alloc();
    }
    T* data() const { return data_.get(); }
    uint64_t count() const { return count_; }

private:
    std::unique_ptr<T, WipingFree> data_;
    uint64_t count_;
};

using Bytes = Buffer<CK_BYTE>;

// Bounded copy from the request: `length` bytes, the first of them taken from
// `sent` (never more than arrived), the rest zero. PINs take this rule too, so
// the module may read the full stated length from memory the service owns.
Bytes fromRequest(const std::string& sent, uint64_t length);

// The first `length` bytes of a buffer the module filled, never more than
// were allocated.
std::string leading(const Bytes& buffer, CK_ULONG length);

// A field of the request with whether it was sent at all: a client's NULL
// pointer leaves its field absent.
template <class T>
struct Sent {
    bool present;
    const T& value;
};
template <class T>
Sent<T> sent(bool present, const T& value) {
    return {present, value};
}
#define VOK_SENT(message, field) ::vok::server::sent((message).has_##field(), (message).field())

// A buffer the module reads: `length` bytes by fromRequest, or NULL when the
// field was absent, so that the module answers the client's NULL as it would
// its own caller's instead of reading zeros. A length no buffer may have gets
// the empty answer either way.
class Input {
public:
    Input(Sent<std::string> sent, uint64_t length);
    CK_BYTE_PTR data() const { return bytes_ ? bytes_->data() : borrowed_; }
    // The first `length` bytes as they stand now; empty for NULL.
    std::string leading(CK_ULONG length) const;

private:
    // The request's own bytes, when they cover the stated length: the module
    // reads (C_GenerateRandom writes) no further than that length, and a large
    // input is not copied once more on its way to the module.
    CK_BYTE_PTR borrowed_ = nullptr;
    uint64_t borrowedLength_ = 0;
    std::optional<Bytes> bytes_;
};

// A buffer the module writes, with its in/out length, which starts at the
// client's capacity. NULL when the request left the buffer absent: a true
// PKCS#11 length query, which leaves the module's operation active. Present,
// even at capacity 0, it is a real buffer.
class Output {
public:
    Output(bool present, uint64_t capacity);
    // Starts as a copy of what the client sent in it (C_WrapKey).
    Output(Sent<std::string> initial, uint64_t capacity);
    CK_BYTE_PTR data() const { return buffer_ ? buffer_->data() : nullptr; }
    CK_ULONG_PTR length() { return &length_; }
    // The length as the module left it, sent back whatever rv is.
    CK_ULONG reported() const { return length_; }
    // The first reported() bytes, never more than were allocated.
    std::string written() const { return buffer_ ? leading(*buffer_, length_) : std::string(); }

private:
    std::optional<Bytes> buffer_;
    CK_ULONG length_;
};

// The 32-byte token label: what arrived, blank-padded as PKCS#11 pads labels.
std::array<CK_UTF8CHAR, 32> paddedLabel(const std::string& sent);

// Counted output list (C_GetSlotList, C_GetMechanismList). An empty list in
// the request is a pure length query (the module gets NULL); otherwise the
// module gets `count` entries to fill, whatever the request's entries hold.
struct ListTexts {
    const char* lengthQuery;  // "slotidlist is 0"
    const char* created;      // "slotlist res created"
    const char* noList;       // "Slot list ptr NULL"
};

class CountedList {
public:
    CountedList(bool requestPresent, const NumberList& sent, CK_ULONG count,
                const ListTexts& texts);
    CK_ULONG_PTR list() { return entries_ ? entries_->data() : nullptr; }
    CK_ULONG_PTR count() { return &count_; }
    // Appends the entries the module reported (never more than were
    // allocated) and returns the count as the module left it.
    CK_ULONG answer(NumberList* out) const;

private:
    const ListTexts& texts_;
    std::optional<Buffer<CK_ULONG>> entries_;
    CK_ULONG count_;
};

// The handles a module wrote, in order.
void appendNumbers(NumberList* out, const CK_ULONG* values, uint64_t n);

// Template rebuild. `count` native attributes, zero-filled; the sent entries
// give type, length and (where the rule says so) a value buffer of exactly
// ulValueLen bytes. Entries beyond the sent list stay zero.
struct TemplateRule {
    bool alwaysCopyValue;  // C_FindObjectsInit: a value buffer even without pValue
    bool logValueLength;   // "attr_ulvaluelen set"; C_GetAttributeValue does not log it
};
constexpr TemplateRule kInputTemplate{false, true};
constexpr TemplateRule kQueryTemplate{false, false};
constexpr TemplateRule kSearchTemplate{true, true};

// Template echo: how a value the module reported unavailable (-1) travels.
enum class Echo {
    kDropUnavailable,        // neither value nor length: the client reads 0
    kDropUnavailableLogged,  // the same, logged ("Inside ulvaluelen is -1")
    kVerbatim,               // value and length as they stand, no -1 test
};

// A value that is itself a template (CKA_WRAP_TEMPLATE and its kin) is
// rebuilt the same way, from its by-value form, `depth` levels down; its raw
// bytes, which may hold client pointers, are refused with
// CKR_ATTRIBUTE_VALUE_INVALID. `budget` bounds the value bytes of a template
// and all templates inside it together (nullptr: a frame's worth).
class NativeTemplate {
public:
    NativeTemplate(const AttributeList& sent, CK_ULONG count, TemplateRule rule, int depth = 0,
                   uint64_t* budget = nullptr);
    // NULL for a count without a single entry: the client's template was NULL.
    CK_ATTRIBUTE_PTR data() const {
        return count_ != 0 && attributes_.count() == 0 ? nullptr : attributes_.data();
    }
    CK_ULONG count() const { return count_; }
    // One message per native attribute, in order; values from the service's
    // own buffers, never more than were allocated. A template inside a value
    // goes back by value (only for a query: the others echo its length as
    // sent), never as the bytes of the service's entries.
    void echo(AttributeList* out, Echo rule) const;

private:
    // Builds one native attribute's value; false when it holds no template.
    bool nestTemplate(const pkcs11::CK_ATTRIBUTE& sent, size_t index, TemplateRule rule,
                      uint64_t& budget);

    Buffer<CK_ATTRIBUTE> attributes_;
    CK_ULONG count_;
    std::vector<std::optional<Bytes>> values_;                // one per sent entry
    std::vector<std::unique_ptr<NativeTemplate>> templates_;  // one per sent entry
    int depth_;
    CK_ULONG sentLength_ = 0;  // of the value this template is, in the client's units
};

// Info structures, member by member. Each text member is read as a C string
// that may run on into the following members up to the first zero byte; it
// stops at the end of the structure.
void putInfo(pkcs11::CK_INFO* out, const CK_INFO& in);
void putSlotInfo(pkcs11::CK_SLOT_INFO* out, const CK_SLOT_INFO& in);
void putTokenInfo(pkcs11::CK_TOKEN_INFO* out, const CK_TOKEN_INFO& in);
void putSessionInfo(pkcs11::CK_SESSION_INFO* out, const CK_SESSION_INFO& in);
void putMechanismInfo(pkcs11::CK_MECHANISM_INFO* out, const CK_MECHANISM_INFO& in);

}  // namespace server
}  // namespace vok

#endif
