#ifndef VOK_SERVER_BY_VALUE_H
#define VOK_SERVER_BY_VALUE_H

// Client values that hold pointers, rebuilt in service memory from their
// by-value form (the schema's CK_STRUCTURE). Every pointer the module receives
// leads to a copy the service owns, sized by the length the structure states
// and filled with no more than arrived; a pointer the client sent is never
// passed on.

#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

#include "by_value_layouts.h"
#include "marshal.h"

namespace vok {
namespace server {

class ParameterCopy {
public:
    // The service's copy of a mechanism parameter that holds pointers;
    // nullptr when the parameter may pass as the bytes that arrived (its
    // structure holds no pointer, or nothing arrived). Throws a Refusal with
    // CKR_MECHANISM_PARAM_INVALID for bytes that may hold a pointer: a
    // structure without its by-value form, or one the service does not know.
    static std::unique_ptr<ParameterCopy> of(const pkcs11::CK_MECHANISM& sent);

    // `budget` bounds the bytes of all buffers of one parameter together.
    ParameterCopy(const layout::Layout& l, const pkcs11::CK_STRUCTURE& sent,
                  const layout::Layout* parentLayout, const void* parent, uint64_t& budget);
    ParameterCopy(const ParameterCopy&) = delete;
    ParameterCopy& operator=(const ParameterCopy&) = delete;

    void* data() const { return block_.data(); }
    CK_ULONG size() const { return layout_.size; }
    bool returnsOutputs() const { return layout_.outputs; }
    // The structure after the call: its numbers and the contents of its
    // output buffers, taken from the service's own buffers, whatever the
    // module did to the pointers.
    void answer(pkcs11::CK_STRUCTURE* out) const;

private:
    const layout::Layout& layout_;
    Bytes block_;
    std::vector<std::optional<Bytes>> buffers_;               // per `buffer` entry
    std::vector<std::unique_ptr<ParameterCopy>> structures_;  // per `buffer` entry
};

}  // namespace server
}  // namespace vok

#endif
