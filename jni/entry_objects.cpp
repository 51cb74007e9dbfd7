// Native methods of the object functions: create, copy, destroy, size,
// attribute values and object search.

#define LOG_TAG "[native jni pkcs11wrapper]"
#include <cstdint>
#include <vector>

#include "entry_frame.h"
#include "java_objects.h"
#include "vok_export.h"
#include "vok_log.h"

using namespace vokjni;

namespace {

bool isTemplateType(CK_ATTRIBUTE_TYPE type) {
    return type == CKA_WRAP_TEMPLATE || type == CKA_UNWRAP_TEMPLATE;
}

bool isUnavailable(CK_ULONG length) { return length == CK_UNAVAILABLE_INFORMATION; }

// The value buffers C_GetAttributeValue lends a module, owned here and never
// taken from memory the module wrote: after each call every pointer in the
// template is checked against the buffer lent for it. A template attribute
// (CKA_WRAP_TEMPLATE, CKA_UNWRAP_TEMPLATE) holds attributes of its own; their
// values get buffers of their own for a third call. Pointers one level deeper
// were never lent and are cleared, so no value is read through them.
class LentValues {
public:
    LentValues(CK_ATTRIBUTE_PTR attributes, CK_ULONG count)
        : attributes_(attributes), outer_(count), nested_(count) {}
    ~LentValues() {
        for (CK_ULONG i = 0; i < outer_.size(); ++i) attributes_[i].pValue = nullptr;
        for (auto& list : nested_)
            for (Lent& lent : list) gConverterFree(lent.data);
        for (Lent& lent : outer_) gConverterFree(lent.data);
    }
    LentValues(const LentValues&) = delete;
    LentValues& operator=(const LentValues&) = delete;

    // A buffer of the reported length for every attribute that has one.
    bool lendValues(JNIEnv* env) {
        for (CK_ULONG i = 0; i < outer_.size(); ++i) {
            CK_ATTRIBUTE& a = attributes_[i];
            if (isUnavailable(a.ulValueLen)) continue;
            if (!lend(env, a.ulValueLen, outer_[i])) return false;
            a.pValue = outer_[i].data;
        }
        return true;
    }

    // After a call: the lent pointers back in place, lengths within them.
    CK_RV settle(CK_RV rv) {
        for (CK_ULONG i = 0; i < outer_.size(); ++i) {
            CK_ATTRIBUTE& a = attributes_[i];
            a.pValue = outer_[i].data;
            if (a.pValue == nullptr) continue;
            rv = withinCapacity(rv, isUnavailable(a.ulValueLen) ? 0 : a.ulValueLen,
                                outer_[i].capacity);
            if (isTemplateType(a.type)) settleNested(i);
        }
        return rv;
    }

    bool needsNestedValues() const {
        for (CK_ULONG i = 0; i < outer_.size(); ++i)
            if (hasNestedValues(i)) return true;
        return false;
    }

    // Buffers for the values of the attributes inside template attributes.
    bool lendNestedValues(JNIEnv* env) {
        for (CK_ULONG i = 0; i < outer_.size(); ++i) {
            if (!hasNestedValues(i)) continue;
            CK_ATTRIBUTE_PTR inner = nestedArray(i);
            nested_[i].resize(nestedCount(i));
            for (CK_ULONG j = 0; j < nested_[i].size(); ++j) {
                if (isUnavailable(inner[j].ulValueLen)) continue;
                if (!lend(env, inner[j].ulValueLen, nested_[i][j])) return false;
                inner[j].pValue = nested_[i][j].data;
            }
        }
        return true;
    }

    CK_RV settleNestedLengths(CK_RV rv) const {
        for (CK_ULONG i = 0; i < outer_.size(); ++i) {
            if (!isTemplateType(attributes_[i].type)) continue;
            CK_ATTRIBUTE_PTR inner = nestedArray(i);
            for (CK_ULONG j = 0; j < nested_[i].size() && j < nestedCount(i); ++j)
                if (inner[j].pValue != nullptr && !isUnavailable(inner[j].ulValueLen))
                    rv = withinCapacity(rv, inner[j].ulValueLen, nested_[i][j].capacity);
        }
        return rv;
    }

private:
    struct Lent {
        void* data = nullptr;
        CK_ULONG capacity = 0;
    };

    static bool lend(JNIEnv* env, CK_ULONG length, Lent& lent) {
        void* data = nullptr;
        if (!allocateOutput(env, length, 1, &data)) return false;
        lent.data = data;
        lent.capacity = length;
        return true;
    }

    bool hasNestedValues(CK_ULONG i) const {
        return isTemplateType(attributes_[i].type) && !isUnavailable(attributes_[i].ulValueLen) &&
               nestedCount(i) != 0;
    }

    // The attributes inside template attribute i, as far as its buffer holds them.
    CK_ULONG nestedCount(CK_ULONG i) const {
        const CK_ATTRIBUTE& a = attributes_[i];
        if (a.pValue == nullptr) return 0;
        const CK_ULONG capacity = outer_[i].capacity;
        const CK_ULONG length =
            isUnavailable(a.ulValueLen) || a.ulValueLen > capacity ? capacity : a.ulValueLen;
        return length / sizeof(CK_ATTRIBUTE);
    }
    CK_ATTRIBUTE_PTR nestedArray(CK_ULONG i) const {
        return static_cast<CK_ATTRIBUTE_PTR>(attributes_[i].pValue);
    }

    // Inside template attribute i only pointers lent by nested_ may stay;
    // inside those, none.
    void settleNested(CK_ULONG i) {
        CK_ATTRIBUTE_PTR inner = nestedArray(i);
        for (CK_ULONG j = 0; j < nestedCount(i); ++j) {
            void* lent = j < nested_[i].size() ? nested_[i][j].data : nullptr;
            if (inner[j].pValue != lent) inner[j].pValue = nullptr;
            if (inner[j].pValue != nullptr && isTemplateType(inner[j].type)) {
                const CK_ULONG capacity = nested_[i][j].capacity;
                CK_ULONG deeper =
                    (isUnavailable(inner[j].ulValueLen) || inner[j].ulValueLen > capacity
                         ? capacity
                         : inner[j].ulValueLen) /
                    sizeof(CK_ATTRIBUTE);
                auto* deepest = static_cast<CK_ATTRIBUTE_PTR>(inner[j].pValue);
                for (CK_ULONG k = 0; k < deeper; ++k) deepest[k].pValue = nullptr;
            }
        }
    }

    CK_ATTRIBUTE_PTR attributes_;
    std::vector<Lent> outer_;
    std::vector<std::vector<Lent>> nested_;
};

// Each element of the Java template replaced by a new CK_ATTRIBUTE.
void replaceElements(JNIEnv* env, jobjectArray jTemplate, const NativeTemplate& ckTemplate) {
    for (CK_ULONG i = 0; i < ckTemplate.count(); ++i) {
        LocalRef<jobject> element(env, ckAttributePtrToJAttribute(env, &ckTemplate.data()[i]));
        if (env->ExceptionCheck()) return;
        env->SetObjectArrayElement(jTemplate, static_cast<jsize>(i), element.get());
        if (env->ExceptionCheck()) return;
    }
}

}  // namespace

VOK_C_API jlong JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1CreateObject(
    JNIEnv* env, jobject thiz, jlong jSession, jobjectArray jTemplate) {
    return nativeMethod<jlong>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeTemplate attributes;
        if (!attributes.from(env, jTemplate)) return jlong(0);
        CK_OBJECT_HANDLE object = CK_INVALID_HANDLE;
        CK_RV rv = callModule(f->C_CreateObject, static_cast<CK_SESSION_HANDLE>(jSession),
                              attributes.data(), attributes.count(), &object);
        return resultOf(env, rv, [&] { return static_cast<jlong>(object); });
    });
}

VOK_C_API jlong JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1CopyObject(
    JNIEnv* env, jobject thiz, jlong jSession, jlong jObject, jobjectArray jTemplate) {
    return nativeMethod<jlong>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeTemplate attributes;
        if (!attributes.from(env, jTemplate)) return jlong(0);
        CK_OBJECT_HANDLE copy = CK_INVALID_HANDLE;
        CK_RV rv = callModule(f->C_CopyObject, static_cast<CK_SESSION_HANDLE>(jSession),
                              static_cast<CK_OBJECT_HANDLE>(jObject), attributes.data(),
                              attributes.count(), &copy);
        return resultOf(env, rv, [&] { return static_cast<jlong>(copy); });
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1DestroyObject(JNIEnv* env,
                                                                             jobject thiz,
                                                                             jlong jSession,
                                                                             jlong jObject) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        resultOf(env, callModule(f->C_DestroyObject, static_cast<CK_SESSION_HANDLE>(jSession),
                                 static_cast<CK_OBJECT_HANDLE>(jObject)));
    });
}

VOK_C_API jlong JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GetObjectSize(JNIEnv* env,
                                                                              jobject thiz,
                                                                              jlong jSession,
                                                                              jlong jObject) {
    return nativeMethod<jlong>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        CK_ULONG size = 0;
        CK_RV rv = callModule(f->C_GetObjectSize, static_cast<CK_SESSION_HANDLE>(jSession),
                              static_cast<CK_OBJECT_HANDLE>(jObject), &size);
        return resultOf(env, rv, [&] { return static_cast<jlong>(size); });
    });
}

// Up to three module calls: the lengths, the values, and the values inside
// template attributes once their lengths are known.
VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1GetAttributeValue(
    JNIEnv* env, jobject thiz, jlong jSession, jlong jObject, jobjectArray jTemplate) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        VOK_LOGD("DEBUG: C_GetAttributeValue");
        VOK_LOGD(", hSession=%u", static_cast<unsigned>(jSession));
        VOK_LOGD(", hObject=%ld", static_cast<long>(jObject));
        VOK_LOGD(", pTemplate=%p", static_cast<void*>(jTemplate));
        VOK_LOGD("jAttributeArrayToCKAttributeArray now with jTemplate = %d",
                 static_cast<int>(reinterpret_cast<intptr_t>(jTemplate)));
        NativeTemplate attributes;
        if (!attributes.from(env, jTemplate)) return;
        // Only the types are asked for: what the Java template held goes.
        for (CK_ULONG i = 0; i < attributes.count(); ++i) {
            freeCKAttributeValue(&attributes.data()[i]);
            attributes.data()[i].ulValueLen = 0;
        }
        LentValues values(attributes.data(), attributes.count());
        auto fetch = [&] {
            return callModule(f->C_GetAttributeValue, static_cast<CK_SESSION_HANDLE>(jSession),
                              static_cast<CK_OBJECT_HANDLE>(jObject), attributes.data(),
                              attributes.count());
        };
        if (ckAssertReturnValueOK(env, fetch()) != CKR_OK) return;
        if (!values.lendValues(env)) return;
        if (ckAssertReturnValueOK(env, values.settle(fetch())) != CKR_OK) return;
        if (values.needsNestedValues()) {
            if (!values.lendNestedValues(env)) return;
            CK_RV rv = values.settle(fetch());
            if (ckAssertReturnValueOK(env, values.settleNestedLengths(rv)) != CKR_OK) return;
        }
        replaceElements(env, jTemplate, attributes);
        VOK_LOGD("FINISHED\n");
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1SetAttributeValue(
    JNIEnv* env, jobject thiz, jlong jSession, jlong jObject, jobjectArray jTemplate) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        NativeTemplate attributes;
        if (!attributes.from(env, jTemplate)) return;
        resultOf(env, callModule(f->C_SetAttributeValue, static_cast<CK_SESSION_HANDLE>(jSession),
                                 static_cast<CK_OBJECT_HANDLE>(jObject), attributes.data(),
                                 attributes.count()));
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1FindObjectsInit(
    JNIEnv* env, jobject thiz, jlong jSession, jobjectArray jTemplate) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        VOK_LOGD("DEBUG: C_FindObjectsInit");
        VOK_LOGD(", hSession=%ld", static_cast<long>(jSession));
        VOK_LOGD(", pTemplate=%p", static_cast<void*>(jTemplate));
        NativeTemplate attributes;
        if (!attributes.from(env, jTemplate)) return;
        for (CK_ULONG i = 0; i < attributes.count(); ++i) {
            const CK_ATTRIBUTE& a = attributes.data()[i];
            VOK_LOGD(" ulValueLen:%llu", static_cast<unsigned long long>(a.ulValueLen));
            VOK_LOGD(" pvalue:%s", boundedText(a.pValue, a.ulValueLen).c_str());
        }
        resultOf(env, callModule(f->C_FindObjectsInit, static_cast<CK_SESSION_HANDLE>(jSession),
                                 attributes.data(), attributes.count()));
    });
}

VOK_C_API jlongArray JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1FindObjects(
    JNIEnv* env, jobject thiz, jlong jSession, jlong jMaxObjectCount) {
    return nativeMethod<jlongArray>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        const auto maxCount = static_cast<CK_ULONG>(jMaxObjectCount);
        VOK_LOGD(" ckMaxObjectLength:%llu", static_cast<unsigned long long>(maxCount));
        OutputBuffer<CK_OBJECT_HANDLE> objects;
        if (!objects.allocate(env, maxCount)) return jlongArray(nullptr);
        CK_ULONG count = 0;
        CK_RV rv = callModule(f->C_FindObjects, static_cast<CK_SESSION_HANDLE>(jSession),
                              objects.data(), maxCount, &count);
        VOK_LOGD(" ckActualObjectCount:%llu", static_cast<unsigned long long>(count));
        rv = withinCapacity(rv, count, maxCount);
        return resultOf(env, rv,
                        [&] { return ckULongArrayToJLongArray(env, objects.data(), count); });
    });
}

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_C_1FindObjectsFinal(JNIEnv* env,
                                                                                jobject thiz,
                                                                                jlong jSession) {
    nativeMethod<void>(env, thiz, __func__, [&](CK_FUNCTION_LIST_PTR f) {
        resultOf(env, callModule(f->C_FindObjectsFinal, static_cast<CK_SESSION_HANDLE>(jSession)));
    });
}
