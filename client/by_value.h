#ifndef VOK_CLIENT_BY_VALUE_H
#define VOK_CLIENT_BY_VALUE_H

// Values that hold pointers (pointer-holding mechanism parameters, templates
// inside attribute values) also travel by value, and their raw bytes travel
// with every pointer zeroed: the service never receives an address of this
// process. Output members come back into the caller's own buffers, never
// beyond the sizes the caller's structure states.

#include "vok_pkcs11.h"
#include "vok_proto.h"

namespace vok {
namespace client {

// For a parameter whose mechanism takes a pointer-holding structure, and whose
// length is that structure's size here: its by-value form, and the raw bytes
// with the pointers zeroed. Any other parameter is left as the mechanism rule
// put it (the service then decides whether it may pass it on).
void putParameterValue(pkcs11::CK_MECHANISM* out, const CK_MECHANISM& mechanism);

// The output members of the caller's parameter from an answer's structure.
void copyBackParameter(const CK_MECHANISM* mechanism, const pkcs11::CK_STRUCTURE& answer);

// The entries of a template-valued attribute `depth` levels below the call's
// template, beside `out`'s raw value, whose pointers are zeroed.
void putTemplateValue(pkcs11::CK_ATTRIBUTE* out, const CK_ATTRIBUTE& attribute, int depth);

// Copy-back into a caller's attribute whose value is a template: the entries
// of the answer's by-value form into the caller's nested array, and its
// length in this process's units, under the template copy-back's rules
// (`result` is the caller's CK_RV so far). Raw bytes never land in such an
// array (they would replace the caller's pointers). False when the plain rule
// applies: the attribute is no template, or a length query answered without
// entries.
bool copyBackTemplateValue(const pkcs11::CK_ATTRIBUTE& answer, CK_ATTRIBUTE& mine, int depth,
                           CK_RV& result);

// A caller's value that is a template: only its by-value form writes into it.
bool holdsTemplate(const CK_ATTRIBUTE& mine);

}  // namespace client
}  // namespace vok

#endif
