#ifndef VOK_JNI_ENTRY_FRAME_H
#define VOK_JNI_ENTRY_FRAME_H

// The frame every PKCS#11 native method of com.vok.smartcard.pkcs11.Pkcs11
// runs in, and the owners of the native buffers it hands a module.
//
// A method's body is a lambda that gets the module's function list; it
// converts its Java arguments into the owners below (each returns false with
// a Java exception pending, and the body then returns at once), makes one
// module call or the two-call length query, and builds its Java result with
// resultOf, which raises PKCS11Exception for a result other than CKR_OK. The
// owners free every buffer when the body returns, on every path; a mechanism's
// parameter is freed after the body's copy-backs.

#include <android/log.h>
#include <jni.h>

#include <cstddef>
#include <string>

#include "converters.h"
#include "exceptions.h"
#include "vok_pkcs11.h"
#include "vok_registry.h"

namespace vokjni {

constexpr const char* kJniTag = "[native jni pkcs11wrapper]";

// How a method's start differs from the common one.
struct MethodRules {
    const char* nameTag = kJniTag;    // the tag of the line that logs the method's name
    const char* afterName = nullptr;  // a line logged right after the name
    int missingEntryLines = 0;        // "failed getting module entry" lines before the throw
    bool listMayBeMissing = false;    // the body runs (with null) for an entry without a list
};

// The module registered for `thiz`, held while this object lives so that a
// disconnect on another thread does not unload it under the call; or no
// functions, with an exception pending: the "not connected"
// PKCS11RuntimeException when there is no module (or its list is missing and
// the rules do not allow that).
class ConnectedModule {
public:
    ConnectedModule(JNIEnv* env, jobject thiz, const MethodRules& rules);
    ~ConnectedModule();
    ConnectedModule(const ConnectedModule&) = delete;
    ConnectedModule& operator=(const ConnectedModule&) = delete;
    CK_FUNCTION_LIST_PTR functions() const { return functions_; }

private:
    ModuleEntry* entry_ = nullptr;
    CK_FUNCTION_LIST_PTR functions_ = nullptr;
};

// A C++ exception (only std::bad_alloc can reach here) ends the method with
// OutOfMemoryError, unless a Java exception is already pending.
void failWithPendingOrOutOfMemory(JNIEnv* env);

// Logs the name, finds the module, runs the body. Nothing the body throws
// leaves the method.
template <typename Result, typename Body>
Result nativeMethod(JNIEnv* env, jobject thiz, const char* name, Body&& body,
                    const MethodRules& rules = MethodRules()) noexcept {
    try {
        __android_log_print(ANDROID_LOG_DEBUG, rules.nameTag, "%s", name);
        if (rules.afterName != nullptr)
            __android_log_print(ANDROID_LOG_DEBUG, kJniTag, "%s", rules.afterName);
        ConnectedModule module(env, thiz, rules);
        if (module.functions() == nullptr && !rules.listMayBeMissing) return Result();
        if (env->ExceptionCheck()) return Result();
        return body(module.functions());
    } catch (...) {
        failWithPendingOrOutOfMemory(env);
        return Result();
    }
}

// One entry point of the module's list; a list without it answers
// CKR_FUNCTION_NOT_SUPPORTED.
template <typename Function, typename... Args>
CK_RV callModule(Function function, Args... args) {
    return function != nullptr ? function(args...) : CKR_FUNCTION_NOT_SUPPORTED;
}

// The method's Java result: nothing while an exception is pending;
// PKCS11Exception (and nothing) for a result other than CKR_OK; otherwise
// what convert() builds.
template <typename Convert>
auto resultOf(JNIEnv* env, CK_RV rv, Convert convert) -> decltype(convert()) {
    using Result = decltype(convert());
    if (env->ExceptionCheck()) return Result();
    if (ckAssertReturnValueOK(env, rv) != CKR_OK) return Result();
    return convert();
}
inline void resultOf(JNIEnv* env, CK_RV rv) {
    if (!env->ExceptionCheck()) ckAssertReturnValueOK(env, rv);
}

// A length a module reported with CKR_OK for a buffer of `capacity`
// elements. More than the buffer holds is reported as PKCS#11 reports it,
// CKR_BUFFER_TOO_SMALL, so that nothing is read past the buffer.
inline CK_RV withinCapacity(CK_RV rv, CK_ULONG length, CK_ULONG capacity) {
    return rv == CKR_OK && length > capacity ? CKR_BUFFER_TOO_SMALL : rv;
}

// ---- Owners of the native buffers a module gets ---------------------------

// Bytes converted from a Java byte[] or char[] (one byte per char).
class NativeBytes {
public:
    NativeBytes() = default;
    ~NativeBytes() { reset(); }
    NativeBytes(const NativeBytes&) = delete;
    NativeBytes& operator=(const NativeBytes&) = delete;

    bool from(JNIEnv* env, jbyteArray array) {
        reset();
        return jByteArrayToCKByteArray(env, array, &data_, &length_) == CK_CONVERSION_OK &&
               !env->ExceptionCheck();
    }
    bool from(JNIEnv* env, jcharArray array) {
        reset();
        return jCharArrayToCKCharArray(env, array, &data_, &length_) == CK_CONVERSION_OK &&
               !env->ExceptionCheck();
    }
    CK_BYTE_PTR data() const { return data_; }
    CK_ULONG length() const { return length_; }
    // Takes over a buffer of gConverterAlloc.
    void adopt(CK_BYTE_PTR data, CK_ULONG length) {
        reset();
        data_ = data;
        length_ = length;
    }

private:
    void reset() {
        if (data_ != nullptr) gConverterFree(data_);
        data_ = nullptr;
        length_ = 0;
    }
    CK_BYTE_PTR data_ = nullptr;
    CK_ULONG length_ = 0;
};

// A template converted from a CK_ATTRIBUTE[], values included.
class NativeTemplate {
public:
    NativeTemplate() = default;
    ~NativeTemplate() { freeCKAttributeArray(array_, count_); }
    NativeTemplate(const NativeTemplate&) = delete;
    NativeTemplate& operator=(const NativeTemplate&) = delete;

    bool from(JNIEnv* env, jobjectArray array) {
        return jAttributeArrayToCKAttributeArray(env, array, &array_, &count_) ==
                   CK_CONVERSION_OK &&
               !env->ExceptionCheck();
    }
    CK_ATTRIBUTE_PTR data() const { return array_; }
    CK_ULONG count() const { return count_; }

private:
    CK_ATTRIBUTE_PTR array_ = nullptr;
    CK_ULONG count_ = 0;
};

// A mechanism converted from a CK_MECHANISM; its parameter is freed by the
// mechanism type's rule when the owner goes, after the body's copy-backs.
class NativeMechanism {
public:
    NativeMechanism() = default;
    ~NativeMechanism() {
        if (mechanism_.pParameter != nullptr) freeCKMechanismParameter(&mechanism_);
    }
    NativeMechanism(const NativeMechanism&) = delete;
    NativeMechanism& operator=(const NativeMechanism&) = delete;

    bool from(JNIEnv* env, jobject mechanism) {
        mechanism_ = jMechanismToCKMechanism(env, mechanism);
        return !env->ExceptionCheck();
    }
    CK_MECHANISM_PTR get() { return &mechanism_; }

private:
    CK_MECHANISM mechanism_{};
};

// A zero-filled output buffer of `capacity` elements; never null once
// allocated, even for 0 elements, so that the module does not take it for a
// length query.
template <typename Element>
class OutputBuffer {
public:
    OutputBuffer() = default;
    ~OutputBuffer() {
        if (data_ != nullptr) gConverterFree(data_);
    }
    OutputBuffer(const OutputBuffer&) = delete;
    OutputBuffer& operator=(const OutputBuffer&) = delete;

    // False with OutOfMemoryError pending when the buffer cannot be had, or
    // when its contents could never become a Java array.
    bool allocate(JNIEnv* env, CK_ULONG capacity);
    Element* data() const { return data_; }
    CK_ULONG capacity() const { return capacity_; }

private:
    Element* data_ = nullptr;
    CK_ULONG capacity_ = 0;
};

bool allocateOutput(JNIEnv* env, CK_ULONG capacity, std::size_t elementSize, void** data);

template <typename Element>
bool OutputBuffer<Element>::allocate(JNIEnv* env, CK_ULONG capacity) {
    if (data_ != nullptr) gConverterFree(data_);
    data_ = nullptr;
    capacity_ = 0;
    void* memory = nullptr;
    if (!allocateOutput(env, capacity, sizeof(Element), &memory)) return false;
    data_ = static_cast<Element*>(memory);
    capacity_ = capacity;
    return true;
}

// PKCS#11's two-call convention: the length with a null buffer, then a buffer
// of that length. `call(buffer, &length)` makes one module call. Returns the
// module's result, checked with withinCapacity; on a failed allocation an
// exception is pending.
template <typename Element, typename Call>
CK_RV queryThenFetch(JNIEnv* env, OutputBuffer<Element>& out, CK_ULONG& length, Call call) {
    length = 0;
    CK_RV rv = call(static_cast<Element*>(nullptr), &length);
    if (rv != CKR_OK) return rv;
    if (!out.allocate(env, length)) return CKR_HOST_MEMORY;
    length = out.capacity();
    rv = call(out.data(), &length);
    return withinCapacity(rv, length, out.capacity());
}

// The byte[] of a filled output buffer (`length` already checked against it).
inline jbyteArray bytesOf(JNIEnv* env, CK_RV rv, const OutputBuffer<CK_BYTE>& out,
                          CK_ULONG length) {
    return resultOf(env, rv, [&] { return ckByteArrayToJByteArray(env, out.data(), length); });
}

// What printf's %s shows of bytes that carry no terminator, read no further
// than `length`.
std::string boundedText(const void* bytes, CK_ULONG length);

}  // namespace vokjni

#endif
