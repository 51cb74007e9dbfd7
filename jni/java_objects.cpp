#include "java_objects.h"

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

#include "converters.h"
#include "exceptions.h"

void* (*gConverterAlloc)(std::size_t size) = std::malloc;
void (*gConverterFree)(void* pointer) = std::free;

namespace vokjni {

jclass findBindingClass(JNIEnv* env, const char* simpleName) {
    std::string name = std::string(kPackage) + simpleName;
    return env->FindClass(name.c_str());
}

void* allocZeroed(std::size_t size) {
    // Never ask for 0 bytes: malloc(0) may answer null, which would read as
    // an allocation failure for an empty Java array.
    void* memory = gConverterAlloc(size != 0 ? size : 1);
    if (memory != nullptr) std::memset(memory, 0, size != 0 ? size : 1);
    return memory;
}

void* allocArray(std::size_t count, std::size_t elementSize) {
    if (elementSize != 0 && count > SIZE_MAX / elementSize) return nullptr;
    return allocZeroed(count * elementSize);
}

bool fitsJavaArray(JNIEnv* env, CK_ULONG length) {
    if (length <= static_cast<CK_ULONG>(INT32_MAX)) return true;
    throwOutOfMemoryError(env);
    return false;
}

void throwOutOfMemoryUnlessPending(JNIEnv* env) {
    if (!env->ExceptionCheck()) throwOutOfMemoryError(env);
}

void throwNullPointerException(JNIEnv* env, const char* message) {
    LocalRef<jclass> npe(env, env->FindClass("java/lang/NullPointerException"));
    if (npe.get() != nullptr) env->ThrowNew(npe.get(), message);
}

// ---- ObjectFields ----------------------------------------------------------

ObjectFields::ObjectFields(JNIEnv* env, jobject object)
    : env_(env), object_(object), class_(env->GetObjectClass(object)) {}

ObjectFields::~ObjectFields() {
    if (class_ != nullptr) env_->DeleteLocalRef(class_);
}

jfieldID ObjectFields::field(const char* name, const char* signature) {
    if (class_ == nullptr || failed()) return nullptr;
    return env_->GetFieldID(class_, name, signature);
}

jlong ObjectFields::getLong(const char* name) {
    jfieldID id = field(name, "J");
    return id != nullptr ? env_->GetLongField(object_, id) : 0;
}

jbyte ObjectFields::getByte(const char* name) {
    jfieldID id = field(name, "B");
    return id != nullptr ? env_->GetByteField(object_, id) : 0;
}

CK_BBOOL ObjectFields::getBBool(const char* name) {
    jfieldID id = field(name, "Z");
    if (id == nullptr) return CK_FALSE;
    return env_->GetBooleanField(object_, id) == 1 ? CK_TRUE : CK_FALSE;
}

jobject ObjectFields::getObject(const char* name, const char* signature) {
    jfieldID id = field(name, signature);
    return id != nullptr ? env_->GetObjectField(object_, id) : nullptr;
}

NativeBuffer ObjectFields::getBytes(const char* name) {
    NativeBuffer buffer;
    LocalRef<jbyteArray> array(env_, static_cast<jbyteArray>(getObject(name, "[B")));
    if (!failed()) jByteArrayToCKByteArray(env_, array.get(), &buffer.data, &buffer.length);
    return buffer;
}

NativeBuffer ObjectFields::getChars(const char* name) {
    NativeBuffer buffer;
    LocalRef<jcharArray> array(env_, static_cast<jcharArray>(getObject(name, "[C")));
    if (!failed()) jCharArrayToCKCharArray(env_, array.get(), &buffer.data, &buffer.length);
    return buffer;
}

void ObjectFields::setLong(const char* name, CK_ULONG value) {
    jfieldID id = field(name, "J");
    if (id != nullptr) env_->SetLongField(object_, id, static_cast<jlong>(value));
}

void ObjectFields::setByte(const char* name, CK_BYTE value) {
    jfieldID id = field(name, "B");
    if (id != nullptr) env_->SetByteField(object_, id, static_cast<jbyte>(value));
}

// ---- ObjectBuilder ---------------------------------------------------------

ObjectBuilder::ObjectBuilder(JNIEnv* env, const char* simpleName) : env_(env) {
    class_ = findBindingClass(env, simpleName);
    if (class_ != nullptr) object_ = env->AllocObject(class_);
}

ObjectBuilder::~ObjectBuilder() {
    if (object_ != nullptr) env_->DeleteLocalRef(object_);
    if (class_ != nullptr) env_->DeleteLocalRef(class_);
}

jfieldID ObjectBuilder::field(const char* name, const char* signature) {
    if (object_ == nullptr || env_->ExceptionCheck()) return nullptr;
    return env_->GetFieldID(class_, name, signature);
}

ObjectBuilder& ObjectBuilder::setLong(const char* name, CK_ULONG value) {
    jfieldID id = field(name, "J");
    if (id != nullptr) env_->SetLongField(object_, id, static_cast<jlong>(value));
    return *this;
}

ObjectBuilder& ObjectBuilder::setByte(const char* name, CK_BYTE value) {
    jfieldID id = field(name, "B");
    if (id != nullptr) env_->SetByteField(object_, id, static_cast<jbyte>(value));
    return *this;
}

ObjectBuilder& ObjectBuilder::setObject(const char* name, const char* signature, jobject value) {
    LocalRef<jobject> owned(env_, value);
    jfieldID id = field(name, signature);
    if (id != nullptr) env_->SetObjectField(object_, id, value);
    return *this;
}

ObjectBuilder& ObjectBuilder::setChars(const char* name, const CK_UTF8CHAR* chars,
                                       std::size_t size) {
    if (object_ == nullptr || env_->ExceptionCheck()) return *this;
    return setObject(name, "[C", ckCharArrayToJCharArray(env_, chars, size));
}

ObjectBuilder& ObjectBuilder::setVersion(const char* name, const CK_VERSION& version) {
    if (object_ == nullptr || env_->ExceptionCheck()) return *this;
    std::string signature = std::string("L") + kPackage + "CK_VERSION;";
    return setObject(name, signature.c_str(), ckVersionPtrToJVersion(env_, &version));
}

jobject ObjectBuilder::take() {
    if (env_->ExceptionCheck()) return nullptr;
    jobject object = object_;
    object_ = nullptr;
    return object;
}

}  // namespace vokjni
