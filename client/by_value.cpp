#include "by_value.h"

#include <algorithm>
#include <cstddef>
#include <cstring>

#include "by_value_layouts.h"
#include "marshal.h"

namespace vok {
namespace client {

namespace {

using layout::Flow;
using layout::Kind;
using layout::Layout;
using layout::Member;

bool isNumber(const Member& m) { return m.kind == Kind::kNumber || m.kind == Kind::kByte; }

void putStructure(pkcs11::CK_STRUCTURE* out, const Layout& l, const void* s,
                  const Layout* parentLayout, const void* parent) {
    for (size_t i = 0; i < l.count; ++i) {
        const Member& m = l.members[i];
        if (isNumber(m)) {
            out->add_number(layout::readNumber(m, s));
            continue;
        }
        pkcs11::CK_MEMBER* entry = out->add_buffer();
        if (m.kind == Kind::kArray) {
            entry->set_data(static_cast<const char*>(s) + m.offset, m.length);
            continue;
        }
        const void* p = layout::readPointer(m, s);
        if (!p) continue;
        if (m.kind == Kind::kStructure)
            putStructure(entry->mutable_structure(), *m.pointee, p, &l, s);
        else if (m.flow == Flow::kOut)
            entry->set_data(std::string());  // only its presence: the service sizes it
        else
            entry->set_data(bytesOf(p, layout::bufferLength(l, m, s, parentLayout, parent)));
    }
}

void copyBackStructure(const Layout& l, void* s, const pkcs11::CK_STRUCTURE& answer,
                       const Layout* parentLayout, const void* parent) {
    int number = 0, buffer = 0;
    for (size_t i = 0; i < l.count; ++i) {
        const Member& m = l.members[i];
        const bool back = m.flow != Flow::kIn;
        if (isNumber(m)) {
            if (back && number < answer.number_size())
                layout::writeNumber(m, s, answer.number(number));
            ++number;
            continue;
        }
        const int at = buffer++;
        void* p = back && at < answer.buffer_size() ? layout::readPointer(m, s) : nullptr;
        if (!p) continue;
        const pkcs11::CK_MEMBER& entry = answer.buffer(at);
        if (m.kind == Kind::kStructure && entry.has_structure())
            copyBackStructure(*m.pointee, p, entry.structure(), &l, s);
        else if (m.kind == Kind::kBuffer && entry.has_data())
            memcpy(p, entry.data().data(),
                   static_cast<size_t>(
                       std::min<CK_ULONG>(layout::bufferLength(l, m, s, parentLayout, parent),
                                          entry.data().size())));
    }
}

}  // namespace

void putParameterValue(pkcs11::CK_MECHANISM* out, const CK_MECHANISM& mechanism) {
    const Layout* l = layout::forMechanism(mechanism.mechanism);
    if (!l || !mechanism.pParameter || mechanism.ulParameterLen != l->size) return;
    putStructure(out->mutable_pparametervalue(), *l, mechanism.pParameter, nullptr, nullptr);
    std::string raw(static_cast<const char*>(mechanism.pParameter), l->size);
    for (size_t i = 0; i < l->count; ++i)
        if (l->members[i].kind == Kind::kBuffer || l->members[i].kind == Kind::kStructure)
            layout::writePointer(l->members[i], &raw[0], nullptr);
    out->set_pparameter(raw);
}

void copyBackParameter(const CK_MECHANISM* mechanism, const pkcs11::CK_STRUCTURE& answer) {
    if (!mechanism || !mechanism->pParameter) return;
    const Layout* l = layout::forMechanism(mechanism->mechanism);
    if (l && l->outputs && mechanism->ulParameterLen == l->size)
        copyBackStructure(*l, mechanism->pParameter, answer, nullptr, nullptr);
}

void putTemplateValue(pkcs11::CK_ATTRIBUTE* out, const CK_ATTRIBUTE& attribute, int depth) {
    if (!layout::isTemplateAttribute(attribute.type) || !attribute.pValue ||
        attribute.ulValueLen % sizeof(CK_ATTRIBUTE) != 0 || depth >= layout::kMaxTemplateDepth)
        return;
    const auto* entries = static_cast<const CK_ATTRIBUTE*>(attribute.pValue);
    pkcs11::CK_TEMPLATE* value = out->mutable_pvaluetemplate();
    std::string& raw = *out->mutable_pvalue();
    for (CK_ULONG i = 0; i < attribute.ulValueLen / sizeof(CK_ATTRIBUTE); ++i) {
        const CK_ATTRIBUTE& entry = entries[i];
        pkcs11::CK_ATTRIBUTE* a = value->add_attribute();
        a->set_type(entry.type);
        a->set_ulvaluelen(entry.pValue ? entry.ulValueLen : 0);
        if (entry.pValue) a->set_pvalue(bytesOf(entry.pValue, entry.ulValueLen));
        putTemplateValue(a, entry, depth + 1);
        memset(&raw[i * sizeof(CK_ATTRIBUTE) + offsetof(CK_ATTRIBUTE, pValue)], 0, sizeof(void*));
    }
}

bool holdsTemplate(const CK_ATTRIBUTE& mine) {
    return mine.pValue && layout::isTemplateAttribute(mine.type);
}

bool copyBackTemplateValue(const pkcs11::CK_ATTRIBUTE& answer, CK_ATTRIBUTE& mine, int depth,
                           CK_RV& result) {
    if (!layout::isTemplateAttribute(mine.type) || answer.type() != mine.type) return false;
    if (!answer.has_pvaluetemplate()) return mine.pValue != nullptr;
    const pkcs11::CK_TEMPLATE& value = answer.pvaluetemplate();
    if (!mine.pValue) {
        mine.ulValueLen = value.ulcount() * sizeof(CK_ATTRIBUTE);  // a length query
        return true;
    }
    // More entries than the caller's array holds: nothing is copied, as for a
    // value larger than its buffer.
    const CK_ULONG room = mine.ulValueLen / sizeof(CK_ATTRIBUTE);
    if (value.ulcount() > room || depth >= layout::kMaxTemplateDepth) {
        mine.ulValueLen = CK_UNAVAILABLE_INFORMATION;
        if (result == CKR_OK) result = CKR_BUFFER_TOO_SMALL;
        return true;
    }
    result = copyBackTemplate(result, value.attribute(), value.ulcount(),
                              static_cast<CK_ATTRIBUTE*>(mine.pValue), room, depth + 1);
    mine.ulValueLen = value.ulcount() * sizeof(CK_ATTRIBUTE);
    return true;
}

}  // namespace client
}  // namespace vok
