#include "by_value.h"

#include <algorithm>
#include <iterator>

#define LOG_TAG "Vokpkcs11f_Server"
#include "vok_log.h"

namespace vok {
namespace server {

namespace {

using layout::Flow;
using layout::Kind;
using layout::Layout;
using layout::Member;

struct TypeRange {
    CK_MECHANISM_TYPE first, last;
};

// The mechanism types PKCS#11 v2.40 defines (those of vok_pkcs11.h).
constexpr TypeRange kStandardTypes[] = {
    {0x0, 0xE},       {0x10, 0x16},     {0x20, 0x21},     {0x30, 0x33},     {0x40, 0x53},
    {0x100, 0x105},   {0x110, 0x111},   {0x120, 0x125},   {0x130, 0x138},   {0x140, 0x145},
    {0x150, 0x153},   {0x200, 0x202},   {0x210, 0x212},   {0x220, 0x222},   {0x230, 0x232},
    {0x240, 0x242},   {0x250, 0x252},   {0x255, 0x257},   {0x260, 0x262},   {0x270, 0x272},
    {0x280, 0x280},   {0x282, 0x282},   {0x290, 0x291},   {0x2A0, 0x2A1},   {0x300, 0x305},
    {0x310, 0x315},   {0x320, 0x325},   {0x330, 0x335},   {0x340, 0x345},   {0x350, 0x350},
    {0x360, 0x360},   {0x362, 0x365},   {0x370, 0x378},   {0x380, 0x381},   {0x390, 0x396},
    {0x3A0, 0x3AB},   {0x3B0, 0x3B0},   {0x3C0, 0x3C0},   {0x3D0, 0x3D9},   {0x3E0, 0x3E5},
    {0x400, 0x401},   {0x500, 0x500},   {0x510, 0x512},   {0x550, 0x558},   {0x560, 0x567},
    {0x650, 0x657},   {0x1000, 0x100A}, {0x1010, 0x1012}, {0x1020, 0x1020}, {0x1030, 0x1036},
    {0x1040, 0x1046}, {0x1050, 0x1054}, {0x1060, 0x1065}, {0x1070, 0x1070}, {0x1080, 0x108E},
    {0x1090, 0x1095}, {0x1100, 0x1105}, {0x1200, 0x1204}, {0x1210, 0x1211}, {0x1220, 0x1224},
    {0x2000, 0x2004}, {0x2104, 0x210A}, {0x4001, 0x4002}};

// Standard mechanisms whose parameter holds pointers but has no by-value
// form here: the one-time-password, WTLS, TLS 1.2, CMS, KIP, ECDH/RSA AES key
// wrap, GOST wrap and derive, and DSA parameter generation parameters.
constexpr TypeRange kPointersWithoutForm[] = {
    {CKM_SECURID, CKM_SECURID},
    {CKM_HOTP, CKM_HOTP},
    {CKM_ACTI, CKM_ACTI},
    {CKM_TLS_PRF, CKM_TLS_PRF},
    {CKM_WTLS_MASTER_KEY_DERIVE, CKM_WTLS_CLIENT_KEY_AND_MAC_DERIVE},
    {CKM_TLS12_KDF, CKM_TLS12_KEY_SAFE_DERIVE},
    {CKM_TLS_KDF, CKM_TLS_KDF},
    {CKM_CMS_SIG, CKM_CMS_SIG},
    {CKM_KIP_DERIVE, CKM_KIP_MAC},
    {CKM_ECDH_AES_KEY_WRAP, CKM_RSA_AES_KEY_WRAP},
    {CKM_GOSTR3410_KEY_WRAP, CKM_GOSTR3410_DERIVE},
    {CKM_DSA_PROBABLISTIC_PARAMETER_GEN, CKM_DSA_SHAWE_TAYLOR_PARAMETER_GEN}};

template <size_t N>
bool within(const TypeRange (&ranges)[N], CK_MECHANISM_TYPE type) {
    return std::any_of(std::begin(ranges), std::end(ranges),
                       [type](const TypeRange& r) { return type >= r.first && type <= r.last; });
}

// Whether the mechanism's parameter, by the standard's layout, is plain bytes
// (an IV, a CK_ULONG, the PSS or RC5 parameters...), safe to pass as it
// arrived. A vendor's or an unknown mechanism may take anything, so not.
bool holdsNoPointer(CK_MECHANISM_TYPE type) {
    return within(kStandardTypes, type) && !within(kPointersWithoutForm, type) &&
           !layout::forMechanism(type);
}

bool isNumber(const Member& m) { return m.kind == Kind::kNumber || m.kind == Kind::kByte; }

}  // namespace

std::unique_ptr<ParameterCopy> ParameterCopy::of(const pkcs11::CK_MECHANISM& sent) {
    const Layout* l = layout::forMechanism(sent.mechanism());
    if (l && sent.has_pparametervalue()) {
        uint64_t budget = kFrameLimit;
        return std::make_unique<ParameterCopy>(*l, sent.pparametervalue(), nullptr, nullptr,
                                               budget);
    }
    if (!l && holdsNoPointer(sent.mechanism())) return nullptr;
    // Nothing of the client's reaches the module: no pointer can be in it.
    if (sent.ulparameterlen() == 0 || sent.pparameter().empty()) return nullptr;
    VOK_LOGE("Mechanism %llx: parameter may hold pointers, not passed",
             static_cast<unsigned long long>(sent.mechanism()));
    throw Refusal{CKR_MECHANISM_PARAM_INVALID};
}

ParameterCopy::ParameterCopy(const Layout& l, const pkcs11::CK_STRUCTURE& sent,
                             const Layout* parentLayout, const void* parent, uint64_t& budget)
    : layout_(l), block_(l.size), buffers_(l.buffers), structures_(l.buffers) {
    if (static_cast<size_t>(sent.number_size()) != l.numbers ||
        static_cast<size_t>(sent.buffer_size()) != l.buffers)
        throw Refusal{CKR_MECHANISM_PARAM_INVALID};
    // Numbers and arrays first, then the structures pointed to, then the
    // buffers, whose lengths those give.
    for (int pass = 0; pass < 3; ++pass) {
        int number = 0, buffer = 0;
        for (size_t i = 0; i < l.count; ++i) {
            const Member& m = l.members[i];
            if (isNumber(m)) {
                if (pass == 0) layout::writeNumber(m, block_.data(), sent.number(number));
                ++number;
                continue;
            }
            const int at = buffer++;
            const pkcs11::CK_MEMBER& entry = sent.buffer(at);
            if (pass == 0 && m.kind == Kind::kArray) {
                memcpy(block_.data() + m.offset, entry.data().data(),
                       std::min<size_t>(m.length, entry.data().size()));
            } else if (pass == 1 && m.kind == Kind::kStructure && entry.has_structure()) {
                structures_[at] = std::make_unique<ParameterCopy>(*m.pointee, entry.structure(), &l,
                                                                  block_.data(), budget);
                layout::writePointer(m, block_.data(), structures_[at]->data());
            } else if (pass == 2 && m.kind == Kind::kBuffer && entry.has_data()) {
                const CK_ULONG length =
                    layout::bufferLength(l, m, block_.data(), parentLayout, parent);
                if (length > budget) throw std::bad_alloc();
                budget -= length;
                const Bytes& copy = buffers_[at].emplace(
                    m.flow == Flow::kOut ? Bytes(length) : fromRequest(entry.data(), length));
                layout::writePointer(m, block_.data(), copy.data());
            }
        }
    }
}

void ParameterCopy::answer(pkcs11::CK_STRUCTURE* out) const {
    int buffer = 0;
    for (size_t i = 0; i < layout_.count; ++i) {
        const Member& m = layout_.members[i];
        if (isNumber(m)) {
            out->add_number(layout::readNumber(m, block_.data()));
            continue;
        }
        const int at = buffer++;
        pkcs11::CK_MEMBER* entry = out->add_buffer();
        if (m.flow == Flow::kIn) continue;
        if (structures_[at])
            structures_[at]->answer(entry->mutable_structure());
        else if (buffers_[at])
            entry->set_data(leading(*buffers_[at], buffers_[at]->count()));
    }
}

}  // namespace server
}  // namespace vok
