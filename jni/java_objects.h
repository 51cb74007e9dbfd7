#ifndef VOK_JNI_JAVA_OBJECTS_H
#define VOK_JNI_JAVA_OBJECTS_H

// Small helpers the converters share: local references and frames, reading
// and building Java objects field by field, and sized native allocations.
// Each helper stops at the first pending exception, so a converter can make
// its calls in a row and look once at the end; under -Xcheck:jni no JNI call
// follows a pending exception.

#include <jni.h>

#include <cstddef>

#include "vok_pkcs11.h"

namespace vokjni {

constexpr const char* kPackage = "com/vok/smartcard/pkcs11/";

// Deletes a local reference when it goes out of scope.
template <typename T>
class LocalRef {
public:
    LocalRef(JNIEnv* env, T ref) : env_(env), ref_(ref) {}
    ~LocalRef() {
        if (ref_ != nullptr) env_->DeleteLocalRef(ref_);
    }
    LocalRef(const LocalRef&) = delete;
    LocalRef& operator=(const LocalRef&) = delete;
    T get() const { return ref_; }
    T release() {
        T ref = ref_;
        ref_ = nullptr;
        return ref;
    }

private:
    JNIEnv* env_;
    T ref_;
};

// A local frame for converters that look many classes up at once, so that a
// native method's own capacity is never exceeded. Popped on scope exit.
class LocalFrame {
public:
    LocalFrame(JNIEnv* env, jint capacity)
        : env_(env), pushed_(env->PushLocalFrame(capacity) == JNI_OK) {}
    ~LocalFrame() {
        if (pushed_) env_->PopLocalFrame(nullptr);
    }
    LocalFrame(const LocalFrame&) = delete;
    LocalFrame& operator=(const LocalFrame&) = delete;
    bool pushed() const { return pushed_; }
    // Pops the frame, keeping result alive in the enclosing one.
    jobject pop(jobject result) {
        pushed_ = false;
        return env_->PopLocalFrame(result);
    }

private:
    JNIEnv* env_;
    bool pushed_;
};

// A class of the binding's package, e.g. "CK_DATE"; null with an exception
// pending when the VM does not know it.
jclass findBindingClass(JNIEnv* env, const char* simpleName);

// Native allocations through gConverterAlloc, zero-filled; null when the size
// overflows or the allocator fails (no exception raised here).
void* allocZeroed(std::size_t size);
void* allocArray(std::size_t count, std::size_t elementSize);

// Java arrays hold at most 2^31-1 elements: a longer native length raises
// OutOfMemoryError (never a wrapped length) and answers false.
bool fitsJavaArray(JNIEnv* env, CK_ULONG length);

// OutOfMemoryError, unless the failure already left its own exception.
void throwOutOfMemoryUnlessPending(JNIEnv* env);
void throwNullPointerException(JNIEnv* env, const char* message);

// Bytes or chars converted for a native pointer / length pair.
struct NativeBuffer {
    CK_BYTE_PTR data = nullptr;
    CK_ULONG length = 0;
};

// Reads and writes fields of one (non-null) Java object, looked up on the
// object's own class. After a failure every read returns zero / null and
// every write does nothing.
class ObjectFields {
public:
    ObjectFields(JNIEnv* env, jobject object);
    ~ObjectFields();
    ObjectFields(const ObjectFields&) = delete;
    ObjectFields& operator=(const ObjectFields&) = delete;
    jobject object() const { return object_; }

    bool failed() const { return env_->ExceptionCheck() == JNI_TRUE; }
    jlong getLong(const char* name);
    CK_ULONG getULong(const char* name) { return static_cast<CK_ULONG>(getLong(name)); }
    jbyte getByte(const char* name);
    // CK_TRUE only when the Java value is exactly 1.
    CK_BBOOL getBBool(const char* name);
    // A local reference, or null.
    jobject getObject(const char* name, const char* signature);
    // A "[B" field through jByteArrayToCKByteArray, a "[C" field through
    // jCharArrayToCKCharArray; a null array gives null / 0.
    NativeBuffer getBytes(const char* name);
    NativeBuffer getChars(const char* name);
    void setLong(const char* name, CK_ULONG value);
    void setByte(const char* name, CK_BYTE value);

private:
    jfieldID field(const char* name, const char* signature);

    JNIEnv* env_;
    jobject object_;
    jclass class_;
};

// Builds a Java object without running a constructor (AllocObject) and sets
// its fields in the order they are called. take() gives it, or null when any
// step failed.
class ObjectBuilder {
public:
    ObjectBuilder(JNIEnv* env, const char* simpleName);
    ~ObjectBuilder();
    ObjectBuilder(const ObjectBuilder&) = delete;
    ObjectBuilder& operator=(const ObjectBuilder&) = delete;

    ObjectBuilder& setLong(const char* name, CK_ULONG value);
    ObjectBuilder& setByte(const char* name, CK_BYTE value);
    // value is a local reference that the builder deletes.
    ObjectBuilder& setObject(const char* name, const char* signature, jobject value);
    // A "[C" field of exactly size chars.
    ObjectBuilder& setChars(const char* name, const CK_UTF8CHAR* chars, std::size_t size);
    ObjectBuilder& setVersion(const char* name, const CK_VERSION& version);
    jobject take();

private:
    jfieldID field(const char* name, const char* signature);

    JNIEnv* env_;
    jclass class_ = nullptr;
    jobject object_ = nullptr;
};

}  // namespace vokjni

#endif
