#include "marshal.h"

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <stdexcept>

#include "by_value.h"

#define LOG_TAG "Vokpkcs11f"
#include "vok_log.h"

namespace vok {
namespace client {

namespace {

// How many bytes may move from an answer into a caller's buffer.
size_t boundedCopy(CK_ULONG stated, size_t arrived, CK_ULONG capacity) {
    return static_cast<size_t>(std::min<CK_ULONG>({stated, arrived, capacity}));
}

}  // namespace

std::string cString(const void* p, CK_ULONG limit) {
    if (!p) return std::string();
    const char* s = static_cast<const char*>(p);
    // A limit beyond this process's address space limits nothing: cut to the
    // width of size_t it would read less than the caller gave.
    return std::string(s, strnlen(s, static_cast<size_t>(std::min<CK_ULONG>(limit, SIZE_MAX))));
}

std::string bytesOf(const void* p, CK_ULONG length) {
    if (!p || length == 0) return std::string();
    // No frame carries more (its length is a signed 32-bit number): the call
    // fails as an unsendable one, before a byte is read, and no width of
    // size_t cuts the length into a short copy.
    if (length > static_cast<CK_ULONG>(INT32_MAX)) throw std::length_error("beyond a frame");
    return std::string(static_cast<const char*>(p), static_cast<size_t>(length));
}

void putTemplate(AttributeList* out, const CK_ATTRIBUTE* tmpl, CK_ULONG count) {
    if (!tmpl) return;
    for (CK_ULONG i = 0; i < count; ++i) {
        pkcs11::CK_ATTRIBUTE* a = out->Add();
        a->set_type(tmpl[i].type);
        if (tmpl[i].pValue) {
            a->set_pvalue(bytesOf(tmpl[i].pValue, tmpl[i].ulValueLen));
            a->set_ulvaluelen(tmpl[i].ulValueLen);
            VOK_LOGD("pvalue not NULL");
        } else {
            a->clear_pvalue();
            a->set_ulvaluelen(0);
            VOK_LOGD("passed pvalue is NULL");
        }
        if (a->has_pvalue()) VOK_LOGD("has pvalue");
        putTemplateValue(a, tmpl[i], 0);
    }
}

Reported reportLength(CK_RV rv, CK_ULONG stated, size_t arrived, CK_ULONG capacity) {
    const size_t copied = boundedCopy(stated, arrived, capacity);
    if (rv != CKR_OK) return {rv, stated, copied};
    if (stated > capacity) return {CKR_BUFFER_TOO_SMALL, stated, 0};
    return {CKR_OK, copied, copied};
}

CK_RV copyBackTemplate(CK_RV rv, const AttributeList& answer, CK_ULONG statedCount,
                       CK_ATTRIBUTE* tmpl, CK_ULONG callerCount, int depth) {
    if (!tmpl) return rv;
    const CK_ULONG n =
        std::min<CK_ULONG>({statedCount, static_cast<CK_ULONG>(answer.size()), callerCount});
    CK_RV result = rv;
    for (CK_ULONG i = 0; i < n; ++i) {
        const pkcs11::CK_ATTRIBUTE& a = answer.Get(static_cast<int>(i));
        CK_ATTRIBUTE& mine = tmpl[i];
        if (copyBackTemplateValue(a, mine, depth, result)) continue;
        mine.type = a.type();
        if (!mine.pValue) {
            mine.ulValueLen = a.ulvaluelen();  // length query
        } else if (a.ulvaluelen() > mine.ulValueLen && a.has_pvalue()) {
            mine.ulValueLen = CK_UNAVAILABLE_INFORMATION;
            if (rv == CKR_OK) result = CKR_BUFFER_TOO_SMALL;
        } else if (a.has_pvalue()) {
            const size_t copied = boundedCopy(a.ulvaluelen(), a.pvalue().size(), mine.ulValueLen);
            memcpy(mine.pValue, a.pvalue().data(), copied);
            mine.ulValueLen = copied;
        }
    }
    return result;
}

void overwriteTemplate(const AttributeList& answer, CK_ATTRIBUTE* tmpl, CK_ULONG callerCount) {
    if (!tmpl) return;
    const CK_ULONG n = std::min<CK_ULONG>(static_cast<CK_ULONG>(answer.size()), callerCount);
    for (CK_ULONG i = 0; i < n; ++i) {
        const pkcs11::CK_ATTRIBUTE& a = answer.Get(static_cast<int>(i));
        CK_ATTRIBUTE& mine = tmpl[i];
        if (holdsTemplate(mine)) continue;
        mine.type = a.type();
        if (!mine.pValue) {
            mine.ulValueLen = a.ulvaluelen();
            continue;
        }
        const size_t copied = boundedCopy(a.ulvaluelen(), a.pvalue().size(), mine.ulValueLen);
        memcpy(mine.pValue, a.pvalue().data(), copied);
        mine.ulValueLen = copied;
    }
}

void putList(NumberList* out, const CK_ULONG* list, CK_ULONG count) {
    if (!list) return;
    for (CK_ULONG i = 0; i < count; ++i) out->Add(list[i]);
}

CK_RV copyBackList(CK_RV rv, const NumberList& answer, CK_ULONG statedCount, CK_ULONG* list,
                   CK_ULONG capacity, CK_ULONG* pulCount) {
    if (!list) {
        if (pulCount) *pulCount = statedCount;
        return rv;
    }
    const Reported r = reportLength(rv, statedCount, static_cast<size_t>(answer.size()), capacity);
    for (size_t i = 0; i < r.copied; ++i) list[i] = answer.Get(static_cast<int>(i));
    if (pulCount) *pulCount = r.length;
    return r.rv;
}

void putMechanism(pkcs11::CK_MECHANISM* out, const CK_MECHANISM* mechanism) {
    if (!mechanism) return;
    out->set_mechanism(mechanism->mechanism);
    const InputBuffer parameter{mechanism->pParameter, mechanism->ulParameterLen};
    if (parameter.present()) out->set_pparameter(parameter.contents());
    out->set_ulparameterlen(mechanism->ulParameterLen);
    putParameterValue(out, *mechanism);
}

CK_RV copyBackOutput(CK_RV rv, const std::string& data, CK_ULONG statedLength,
                     const OutputBuffer& out) {
    if (!out.buffer) {
        if (out.length) *out.length = statedLength;
        return rv == CKR_BUFFER_TOO_SMALL ? CKR_OK : rv;
    }
    const Reported r = reportLength(rv, statedLength, data.size(), out.capacity());
    memcpy(out.buffer, data.data(), r.copied);
    if (out.length) *out.length = r.length;
    return r.rv;
}

void copyIntoInput(const std::string& data, CK_BYTE* buffer, CK_ULONG length) {
    if (buffer) memcpy(buffer, data.data(), boundedCopy(length, data.size(), length));
}

void copyPaddedText(CK_UTF8CHAR* field, size_t width, const std::string& text) {
    memset(field, 0, width);
    memcpy(field, text.data(), std::min(width, text.size()));
}

void copyTerminatedText(void* structure, size_t offset, size_t width, const std::string& text) {
    if (text.size() > width) return;
    unsigned char* at = static_cast<unsigned char*>(structure) + offset;
    const size_t n = strnlen(text.c_str(), text.size());
    memcpy(at, text.data(), n);
    at[n] = 0;
}

}  // namespace client
}  // namespace vok
