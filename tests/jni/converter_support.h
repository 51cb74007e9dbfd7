#ifndef VOK_TEST_CONVERTER_SUPPORT_H
#define VOK_TEST_CONVERTER_SUPPORT_H

// What the converter tests share: a count of the converters' native buffers,
// small JNI helpers, and member tables that let one row describe a whole
// structure: the Java object is built from it with a distinct value per
// field, and the native bytes are checked against it member by member.

#include <jni.h>

#include <cstddef>
#include <cstdint>
#include <cstring>
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
    void release(void* buffer);                    // a buffer the code under test leaves allocated
};

// A jvalue holding v in its member of v's type.
template <typename T>
jvalue jv(T v) {
    jvalue value{};
    std::memcpy(&value, &v, sizeof v);
    return value;
}

// JNI helpers; classes without a '/' are the binding's own.
jobject newObject(JNIEnv* env, const char* className);
jobject newBoxed(JNIEnv* env, const char* className, const char* signature, jvalue value);
jbyteArray newBytes(JNIEnv* env, const Bytes& bytes);
jcharArray newChars(JNIEnv* env, const std::u16string& chars);
void setField(JNIEnv* env, jobject object, const char* name, const char* signature, jvalue value);
jvalue getField(JNIEnv* env, jobject object, const char* name, const char* signature);
Bytes bytesOf(JNIEnv* env, jobject byteArray);
std::u16string charsOf(JNIEnv* env, jobject charArray);
bool isA(JNIEnv* env, jobject object, const char* className);  // false for null
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
Member member(Kind kind, const char* name, std::size_t offset, std::size_t lengthOffset = kNoLength,
              std::size_t size = 0);
Member version(const char* name, std::size_t offset);  // an embedded CK_VERSION
#define VOK_LONG(S, f) convtest::member(convtest::Kind::Long, #f, offsetof(S, f))
#define VOK_BOOL(S, f) convtest::member(convtest::Kind::Bool, #f, offsetof(S, f))
#define VOK_BYTE(S, f) convtest::member(convtest::Kind::Byte, #f, offsetof(S, f))
#define VOK_BYTES(S, p, len) \
    convtest::member(convtest::Kind::Bytes, #p, offsetof(S, p), offsetof(S, len))
#define VOK_BYTES_ONLY(S, p) convtest::member(convtest::Kind::Bytes, #p, offsetof(S, p))
#define VOK_CHARS(S, p, len) \
    convtest::member(convtest::Kind::Chars, #p, offsetof(S, p), offsetof(S, len))
#define VOK_CHARS_ONLY(S, p) convtest::member(convtest::Kind::Chars, #p, offsetof(S, p))
#define VOK_FIXED_CHARS(S, f) \
    convtest::member(convtest::Kind::Chars, #f, offsetof(S, f), convtest::kNoLength, sizeof(S::f))
#define VOK_VERSION(S, f) convtest::version(#f, offsetof(S, f))

// Builds a Java object of className with a distinct value in every member;
// seed numbers the values in member order, so a check with the same start
// expects the same ones.
jobject buildJava(JNIEnv* env, const char* className, const std::vector<Member>& members,
                  int& seed);
// Checks native bytes against the values buildJava put into the Java object,
// and that every byte no member describes is zero.
void checkNative(const void* native, std::size_t size, const std::vector<Member>& members,
                 int& seed, const TrackedAllocations& tracked, const std::string& where);
// Plays a module that writes results: every value the members describe in
// the native structure is inverted (buffers byte by byte).
void invertNative(void* native, const std::vector<Member>& members, int& seed);
// Checks the Java object's fields against the values buildJava or
// fillNative put there, or against their inversions.
void checkJavaValues(JNIEnv* env, jobject object, const std::vector<Member>& members, int& seed,
                     bool inverted, const std::string& where);
// Fills a native structure's members with distinct values (fixed chars
// with high bits set), for a conversion to Java checked by checkJavaValues.
void fillNative(void* native, const std::vector<Member>& members, int& seed);

}  // namespace convtest

#endif
