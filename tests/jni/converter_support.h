#ifndef VOK_TEST_CONVERTER_SUPPORT_H
#define VOK_TEST_CONVERTER_SUPPORT_H

// What the converter tests share: a count of the converters' native buffers,
// small JNI helpers, and member tables that let one row describe a whole
// structure: the Java object is built from it with a distinct value per
// field, and the native bytes are checked against it member by member.

#include <jni.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "converters.h"

namespace convtest {

using Bytes = std::vector<uint8_t>;

// Routes gConverterAlloc / gConverterFree through a record of live buffers
// for its lifetime, and can make one allocation fail. The case fails when a
// buffer was written past its end or a pointer freed that was never handed
// out (or freed twice).
class TrackedAllocations {
public:
    TrackedAllocations();
    ~TrackedAllocations();
    void failAllocation(int nth);  // 1: the next one
    std::size_t live() const;
    std::size_t sizeOf(const void* buffer) const;  // 0 when not live
    void release(void* buffer);  // a buffer the code under test leaves allocated
};

// JNI helpers; classes without a '/' are the binding's own.
jobject newObject(JNIEnv* env, const char* className);
jobject newBoxed(JNIEnv* env, const char* className, const char* signature, jvalue value);
jbyteArray newBytes(JNIEnv* env, const Bytes& bytes);
jcharArray newChars(JNIEnv* env, const std::u16string& chars);
void setField(JNIEnv* env, jobject object, const char* name, const char* signature, jvalue value);
jvalue getField(JNIEnv* env, jobject object, const char* name, const char* signature);
Bytes bytesOf(JNIEnv* env, jobject byteArray);
std::u16string charsOf(JNIEnv* env, jobject charArray);
std::string classNameOf(JNIEnv* env, jobject object);
Bytes nativeBytes(const void* data, std::size_t size);

// One member of a native structure and the Java field it mirrors.
enum class Kind { Long, Bool, Byte, Bytes, Chars, Embedded, Pointed };
constexpr std::size_t kNoLength = SIZE_MAX;
struct Member {
    Kind kind;
    const char* name;
    std::size_t offset;
    std::size_t lengthOffset = kNoLength;  // Bytes / Chars: the native length, if stored
    std::size_t size = 0;                  // Chars of an information structure; nested size
    const char* className = nullptr;       // Embedded / Pointed
    std::vector<Member> members = {};      // Embedded / Pointed
};
#define VOK_LONG(S, f) convtest::Member{convtest::Kind::Long, #f, offsetof(S, f)}
#define VOK_BOOL(S, f) convtest::Member{convtest::Kind::Bool, #f, offsetof(S, f)}
#define VOK_BYTE(S, f) convtest::Member{convtest::Kind::Byte, #f, offsetof(S, f)}
#define VOK_BYTES(S, p, len) convtest::Member{convtest::Kind::Bytes, #p, offsetof(S, p), offsetof(S, len)}
#define VOK_BYTES_ONLY(S, p) convtest::Member{convtest::Kind::Bytes, #p, offsetof(S, p)}
#define VOK_CHARS(S, p, len) convtest::Member{convtest::Kind::Chars, #p, offsetof(S, p), offsetof(S, len)}
#define VOK_CHARS_ONLY(S, p) convtest::Member{convtest::Kind::Chars, #p, offsetof(S, p)}
#define VOK_FIXED_CHARS(S, f) \
    convtest::Member{convtest::Kind::Chars, #f, offsetof(S, f), convtest::kNoLength, sizeof(S::f)}
#define VOK_VERSION(S, f)                                                                       \
    convtest::Member{convtest::Kind::Embedded, #f, offsetof(S, f), convtest::kNoLength,       \
                     sizeof(CK_VERSION), "CK_VERSION",                                         \
                     {VOK_BYTE(CK_VERSION, major), VOK_BYTE(CK_VERSION, minor)}}

// Builds a Java object of className with a distinct value in every member;
// seed numbers the values in member order, so a check with the same start
// expects the same ones.
jobject buildJava(JNIEnv* env, const char* className, const std::vector<Member>& members,
                  int& seed);
// Checks native bytes against the values buildJava put into the Java object,
// and that every byte no member describes is zero.
void checkNative(const void* native, std::size_t size, const std::vector<Member>& members,
                 int& seed, const TrackedAllocations& tracked, const std::string& where);
// Checks a Java object made from a native structure, field by field, and that
// the members cover the whole structure.
void checkJava(JNIEnv* env, jobject object, const void* native, std::size_t size,
               const std::vector<Member>& members, const std::string& where);

}  // namespace convtest

#endif
