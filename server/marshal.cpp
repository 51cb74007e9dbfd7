#include "marshal.h"

#include <algorithm>
#include <cstddef>

#include "by_value_layouts.h"

#define LOG_TAG "Vokpkcs11f_Server"
#include "vok_log.h"

namespace vok {
namespace server {

namespace {

// PKCS#11 labels are blank-padded, never zero-terminated.
constexpr CK_UTF8CHAR kBlank = ' ';

// Text that starts at `member` and runs on up to the first zero byte, but not
// past the end of the structure.
template <class S>
std::string runOnText(const S& structure, const void* member) {
    const char* begin = reinterpret_cast<const char*>(&structure);
    const char* at = static_cast<const char*>(member);
    const size_t room = sizeof(S) - static_cast<size_t>(at - begin);
    return std::string(at, strnlen(at, room));
}

void putVersion(pkcs11::CK_VERSION* out, const CK_VERSION& in) {
    out->set_vermajor(in.major);
    out->set_verminor(in.minor);
}

}  // namespace

Bytes fromRequest(const std::string& sent, uint64_t length) {
    Bytes buffer(length);
    memcpy(buffer.data(), sent.data(),
           static_cast<size_t>(std::min<uint64_t>(length, sent.size())));
    return buffer;
}

std::string leading(const Bytes& buffer, CK_ULONG length) {
    const uint64_t n = std::min<uint64_t>(length, buffer.count());
    return std::string(reinterpret_cast<const char*>(buffer.data()), static_cast<size_t>(n));
}

Input::Input(Sent<std::string> sent, uint64_t length) {
    Bytes::checkCount(length);
    if (!sent.present) return;
    if (sent.value.size() >= length) {
        borrowed_ = reinterpret_cast<CK_BYTE_PTR>(const_cast<char*>(sent.value.data()));
        borrowedLength_ = length;
    } else {
        bytes_.emplace(fromRequest(sent.value, length));
    }
}

std::string Input::leading(CK_ULONG length) const {
    if (bytes_) return server::leading(*bytes_, length);
    if (borrowed_ == nullptr) return std::string();
    return std::string(reinterpret_cast<const char*>(borrowed_),
                       static_cast<size_t>(std::min<uint64_t>(length, borrowedLength_)));
}

Output::Output(bool present, uint64_t capacity) : length_(capacity) {
    Bytes::checkCount(capacity);
    if (present) buffer_.emplace(capacity);
}

Output::Output(Sent<std::string> initial, uint64_t capacity) : length_(capacity) {
    Bytes::checkCount(capacity);
    if (initial.present) buffer_.emplace(fromRequest(initial.value, capacity));
}

std::array<CK_UTF8CHAR, 32> paddedLabel(const std::string& sent) {
    std::array<CK_UTF8CHAR, 32> label;
    label.fill(kBlank);
    memcpy(label.data(), sent.data(), std::min(label.size(), sent.size()));
    return label;
}

CountedList::CountedList(bool requestPresent, const NumberList& sent, CK_ULONG count,
                         const ListTexts& texts)
    : texts_(texts), count_(count) {
    VOK_LOGD("ckpFunctions not null");
    if (requestPresent) VOK_LOGD("Already present");
    if (sent.empty())
        VOK_LOGD("%s", texts_.lengthQuery);
    else
        entries_.emplace(count);
}

CK_ULONG CountedList::answer(NumberList* out) const {
    VOK_LOGD("reached here");
    VOK_LOGD("%s", texts_.created);
    if (!entries_) {
        VOK_LOGD("%s", texts_.noList);
        return count_;
    }
    const uint64_t n = std::min<uint64_t>(count_, entries_->count());
    for (uint64_t i = 0; i < n; ++i) {
        VOK_LOGD("inside for");
        out->Add(entries_->data()[i]);
    }
    return count_;
}

void appendNumbers(NumberList* out, const CK_ULONG* values, uint64_t n) {
    out->Reserve(static_cast<int>(n));
    for (uint64_t i = 0; i < n; ++i) out->Add(values[i]);
}

NativeTemplate::NativeTemplate(const AttributeList& sent, CK_ULONG count, TemplateRule rule,
                               int depth, uint64_t* budget)
    : attributes_((Buffer<CK_ATTRIBUTE>::checkCount(count), sent.empty() ? 0 : count)),
      count_(count),
      depth_(depth) {
    const int n = static_cast<int>(std::min<uint64_t>(count, sent.size()));
    auto hasValue = [&](const pkcs11::CK_ATTRIBUTE& a) {
        return a.has_pvalue() || rule.alwaysCopyValue;
    };
    auto holdsTemplate = [&](const pkcs11::CK_ATTRIBUTE& a) {
        return layout::isTemplateAttribute(a.type()) && a.has_pvaluetemplate();
    };
    // All values together must fit a frame as well, those of templates
    // inside values included; checked before any is allocated.
    uint64_t frame = kFrameLimit;
    uint64_t& left = budget ? *budget : frame;
    for (int i = 0; i < n; ++i) {
        const pkcs11::CK_ATTRIBUTE& a = sent.Get(i);
        if (!hasValue(a) || holdsTemplate(a)) continue;
        if (a.ulvaluelen() > left) throw std::bad_alloc();
        left -= a.ulvaluelen();
    }
    const bool log = depth == 0;  // templates inside values are not logged
    values_.resize(static_cast<size_t>(n));
    templates_.resize(static_cast<size_t>(n));
    for (int i = 0; i < n; ++i) {
        const pkcs11::CK_ATTRIBUTE& a = sent.Get(i);
        CK_ATTRIBUTE& native = attributes_.data()[i];
        if (log) VOK_LOGD("Inside for");
        native.type = a.type();
        if (log) VOK_LOGD("attr_type set");
        native.ulValueLen = a.ulvaluelen();
        if (hasValue(a)) {
            if (a.has_pvalue() && log) VOK_LOGD("Inside if not NULL pdata");
            if (!nestTemplate(a, static_cast<size_t>(i), rule, left))
                native.pValue = values_[i].emplace(fromRequest(a.pvalue(), a.ulvaluelen())).data();
        }
        if (rule.logValueLength && log) VOK_LOGD("attr_ulvaluelen set");
    }
}

bool NativeTemplate::nestTemplate(const pkcs11::CK_ATTRIBUTE& sent, size_t index,
                                  TemplateRule rule, uint64_t& budget) {
    if (!layout::isTemplateAttribute(sent.type())) return false;
    CK_ATTRIBUTE& native = attributes_.data()[index];
    if (sent.has_pvaluetemplate() && depth_ < layout::kMaxTemplateDepth) {
        const AttributeList& entries = sent.pvaluetemplate().attribute();
        templates_[index] = std::make_unique<NativeTemplate>(
            entries, static_cast<CK_ULONG>(entries.size()), rule, depth_ + 1, &budget);
        templates_[index]->sentLength_ = sent.ulvaluelen();
        native.pValue = templates_[index]->data();
        native.ulValueLen = templates_[index]->count() * sizeof(CK_ATTRIBUTE);
        return true;
    }
    // The entries' bytes as they arrived may hold the client's pointers.
    if (sent.ulvaluelen() != 0 && !sent.pvalue().empty()) {
        VOK_LOGE("Attribute %llx: template without its entries, not passed",
                 static_cast<unsigned long long>(sent.type()));
        throw Refusal{CKR_ATTRIBUTE_VALUE_INVALID};
    }
    return false;
}

void NativeTemplate::echo(AttributeList* out, Echo rule) const {
    const bool log = depth_ == 0;
    for (uint64_t i = 0; i < attributes_.count(); ++i) {
        const CK_ATTRIBUTE& native = attributes_.data()[i];
        // The service's own record of the value buffer, not the pointer in the
        // template, which the module could have changed.
        const Bytes* value = i < values_.size() && values_[i] ? &*values_[i] : nullptr;
        const NativeTemplate* nested = i < templates_.size() ? templates_[i].get() : nullptr;
        pkcs11::CK_ATTRIBUTE* a = out->Add();
        a->set_type(native.type);
        if (!value && !nested) {
            a->set_ulvaluelen(native.ulValueLen);  // a length query's answer
            if (rule == Echo::kDropUnavailable && layout::isTemplateAttribute(native.type) &&
                native.ulValueLen != CK_UNAVAILABLE_INFORMATION)
                a->mutable_pvaluetemplate()->set_ulcount(native.ulValueLen / sizeof(CK_ATTRIBUTE));
            continue;
        }
        if (log) VOK_LOGD("Inside response of if not null");
        if (native.ulValueLen == CK_UNAVAILABLE_INFORMATION && rule != Echo::kVerbatim) {
            if (rule == Echo::kDropUnavailableLogged && log) VOK_LOGD("Inside ulvaluelen is -1");
            continue;
        }
        if (nested) {
            a->set_ulvaluelen(nested->sentLength_);
            if (rule != Echo::kDropUnavailable) continue;
            pkcs11::CK_TEMPLATE* entries = a->mutable_pvaluetemplate();
            entries->set_ulcount(
                std::min<uint64_t>(native.ulValueLen / sizeof(CK_ATTRIBUTE), nested->count()));
            nested->echo(entries->mutable_attribute(), rule);
            continue;
        }
        a->set_pvalue(leading(*value, native.ulValueLen));
        a->set_ulvaluelen(native.ulValueLen);
    }
}

void putInfo(pkcs11::CK_INFO* out, const CK_INFO& in) {
    VOK_LOGD("C_GetInfo reached here");
    pkcs11::CK_VERSION* cryptoki = out->mutable_cryptokiversion();
    cryptoki->set_vermajor(in.cryptokiVersion.major);
    VOK_LOGD("C_GetInfo set major");
    cryptoki->set_verminor(in.cryptokiVersion.minor);
    VOK_LOGD("C_GetInfo set minor");
    out->set_manufacturerid(runOnText(in, in.manufacturerID));
    out->set_flags(in.flags);
    out->set_librarydescription(runOnText(in, in.libraryDescription));
    putVersion(out->mutable_libraryversion(), in.libraryVersion);
}

void putSlotInfo(pkcs11::CK_SLOT_INFO* out, const CK_SLOT_INFO& in) {
    out->set_slotdescription(runOnText(in, in.slotDescription));
    out->set_manufacturerid(runOnText(in, in.manufacturerID));
    out->set_flags(in.flags);
    putVersion(out->mutable_hardwareversion(), in.hardwareVersion);
    putVersion(out->mutable_firmwareversion(), in.firmwareVersion);
}

void putTokenInfo(pkcs11::CK_TOKEN_INFO* out, const CK_TOKEN_INFO& in) {
    out->set_label(runOnText(in, in.label));
    out->set_manufacturerid(runOnText(in, in.manufacturerID));
    out->set_model(runOnText(in, in.model));
    out->set_serialnumber(runOnText(in, in.serialNumber));
    out->set_flags(in.flags);
    out->set_ulmaxsessioncount(in.ulMaxSessionCount);
    out->set_ulsessioncount(in.ulSessionCount);
    out->set_ulmaxrwsessioncount(in.ulMaxRwSessionCount);
    out->set_ulrwsessioncount(in.ulRwSessionCount);
    out->set_ulmaxpinlen(in.ulMaxPinLen);
    out->set_ulminpinlen(in.ulMinPinLen);
    out->set_ultotalpublicmemory(in.ulTotalPublicMemory);
    out->set_ulfreepublicmemory(in.ulFreePublicMemory);
    out->set_ultotalprivatememory(in.ulTotalPrivateMemory);
    out->set_ulfreeprivatememory(in.ulFreePrivateMemory);
    putVersion(out->mutable_hardwareversion(), in.hardwareVersion);
    putVersion(out->mutable_firmwareversion(), in.firmwareVersion);
    out->set_utctime(runOnText(in, in.utcTime));
}

void putSessionInfo(pkcs11::CK_SESSION_INFO* out, const CK_SESSION_INFO& in) {
    out->set_slotid(in.slotID);
    out->set_state(in.state);
    out->set_flags(in.flags);
    out->set_uldeviceerror(in.ulDeviceError);
}

void putMechanismInfo(pkcs11::CK_MECHANISM_INFO* out, const CK_MECHANISM_INFO& in) {
    out->set_ulminkeysize(in.ulMinKeySize);
    out->set_ulmaxkeysize(in.ulMaxKeySize);
    out->set_flags(in.flags);
}

}  // namespace server
}  // namespace vok
