// Java/native conversion through a real Java VM under -Xcheck:jni: the value
// dispatcher's rows in order, the status results, the information structures,
// the attribute type table both ways and nested templates; every mechanism
// parameter class against its packed layout and freed by its mechanism type,
// classes freed by another type's rule, and the four copy-backs. Member
// tables let one row describe a whole structure: the Java object is built
// from it with a distinct value per field, and the native bytes are checked
// against it member by member.
#include "converters.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <csignal>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <map>
#include <stdexcept>
#include <string>
#include <vector>

#include "jvm_fixture.h"
#include "log_capture.h"

namespace {

using Bytes = std::vector<uint8_t>;

// Each buffer is followed by guard bytes: a write past its end shows when it
// is freed, without the address sanitizer.
constexpr std::size_t kGuard = 16;
constexpr uint8_t kGuardByte = 0xA5;
std::map<void*, std::size_t> gLive;
int gCountdown = 0;  // the allocation that fails, counted down; 0: none
int gStrays = 0, gOverruns = 0;

void checkGuard(void* buffer, std::size_t size) {
    const auto* guard = static_cast<const uint8_t*>(buffer) + size;
    for (std::size_t i = 0; i < kGuard; ++i)
        if (guard[i] != kGuardByte) {
            ++gOverruns;
            return;
        }
}

void* trackedAlloc(std::size_t size) {
    if (gCountdown > 0 && --gCountdown == 0) return nullptr;
    auto* buffer = static_cast<uint8_t*>(std::malloc(size + kGuard));
    std::memset(buffer + size, kGuardByte, kGuard);
    gLive[buffer] = size;
    return buffer;
}

// A pointer never handed out is counted, not freed: the case then fails
// instead of the process.
void trackedFree(void* buffer) {
    if (buffer == nullptr) return;
    auto found = gLive.find(buffer);
    if (found == gLive.end()) {
        ++gStrays;
        return;
    }
    checkGuard(buffer, found->second);
    gLive.erase(found);
    std::free(buffer);
}

// Routes gConverterAlloc / gConverterFree through a record of live buffers
// for its lifetime, and can make one allocation fail. The case fails when a
// buffer was written past its end or a pointer freed that was never handed
// out (or freed twice).
class TrackedAllocations {
public:
    TrackedAllocations() {
        gLive.clear();
        gCountdown = gStrays = gOverruns = 0;
        gConverterAlloc = trackedAlloc;
        gConverterFree = trackedFree;
    }
    ~TrackedAllocations() {
        gConverterAlloc = std::malloc;
        gConverterFree = std::free;
        for (auto& entry : gLive) {
            checkGuard(entry.first, entry.second);
            std::free(entry.first);
        }
        gLive.clear();
        EXPECT_EQ(gOverruns, 0) << "a converter wrote past a buffer it allocated";
        EXPECT_EQ(gStrays, 0) << "a pointer was freed that the converters never handed out";
    }
    void failAllocation(int nth) { gCountdown = nth; }  // 1: the next one
    std::size_t live() const { return gLive.size(); }
    std::size_t sizeOf(const void* buffer) const {  // 0 when not live
        auto found = gLive.find(const_cast<void*>(buffer));
        return found != gLive.end() ? found->second : 0;
    }
    void release(void* buffer) { trackedFree(buffer); }  // one the code under test leaves
};

// A jvalue holding v in its member of v's type.
template <typename T>
jvalue jv(T v) {
    jvalue value{};
    std::memcpy(&value, &v, sizeof v);
    return value;
}

// Classes without a '/' are the binding's own.
std::string fullName(const char* className) {
    return std::strchr(className, '/') != nullptr || className[0] == '['
               ? className
               : std::string("com/vok/smartcard/pkcs11/") + className;
}

jobject newObject(JNIEnv* env, const char* className) {
    jclass cls = env->FindClass(fullName(className).c_str());
    if (cls == nullptr) return nullptr;
    jobject object = env->AllocObject(cls);
    env->DeleteLocalRef(cls);
    return object;
}

jobject newBoxed(JNIEnv* env, const char* className, const char* signature, jvalue value) {
    jclass cls = env->FindClass(className);
    jobject boxed = env->NewObjectA(cls, env->GetMethodID(cls, "<init>", signature), &value);
    EXPECT_FALSE(env->ExceptionCheck());
    env->DeleteLocalRef(cls);
    return boxed;
}

jbyteArray newBytes(JNIEnv* env, const Bytes& bytes) {
    jbyteArray array = env->NewByteArray(static_cast<jsize>(bytes.size()));
    env->SetByteArrayRegion(array, 0, static_cast<jsize>(bytes.size()),
                            reinterpret_cast<const jbyte*>(bytes.data()));
    return array;
}

jcharArray newChars(JNIEnv* env, const std::u16string& chars) {
    jcharArray array = env->NewCharArray(static_cast<jsize>(chars.size()));
    env->SetCharArrayRegion(array, 0, static_cast<jsize>(chars.size()),
                            reinterpret_cast<const jchar*>(chars.data()));
    return array;
}

void setField(JNIEnv* env, jobject object, const char* name, const char* signature,
                     jvalue value) {
    jclass cls = env->GetObjectClass(object);
    jfieldID id = env->GetFieldID(cls, name, signature);
    env->DeleteLocalRef(cls);
    ASSERT_NE(id, nullptr) << name;
    if (*signature == 'J') env->SetLongField(object, id, value.j);
    if (*signature == 'Z') env->SetBooleanField(object, id, value.z);
    if (*signature == 'B') env->SetByteField(object, id, value.b);
    if (*signature == 'L' || *signature == '[') env->SetObjectField(object, id, value.l);
}

jvalue getField(JNIEnv* env, jobject object, const char* name, const char* signature) {
    jvalue value{};
    jclass cls = env->GetObjectClass(object);
    jfieldID id = env->GetFieldID(cls, name, signature);
    env->DeleteLocalRef(cls);
    EXPECT_NE(id, nullptr) << name;
    if (id == nullptr) env->ExceptionClear();
    if (id != nullptr && *signature == 'J') value.j = env->GetLongField(object, id);
    if (id != nullptr && *signature == 'B') value.b = env->GetByteField(object, id);
    if (id != nullptr && (*signature == 'L' || *signature == '['))
        value.l = env->GetObjectField(object, id);
    return value;
}

Bytes bytesOf(JNIEnv* env, jobject byteArray) {
    auto array = static_cast<jbyteArray>(byteArray);
    Bytes bytes(array != nullptr ? env->GetArrayLength(array) : 0);
    if (!bytes.empty())
        env->GetByteArrayRegion(array, 0, static_cast<jsize>(bytes.size()),
                                reinterpret_cast<jbyte*>(bytes.data()));
    return bytes;
}

std::u16string charsOf(JNIEnv* env, jobject charArray) {
    auto array = static_cast<jcharArray>(charArray);
    std::u16string chars(array != nullptr ? env->GetArrayLength(array) : 0, u'\0');
    if (!chars.empty())
        env->GetCharArrayRegion(array, 0, static_cast<jsize>(chars.size()),
                                reinterpret_cast<jchar*>(&chars[0]));
    return chars;
}

bool isA(JNIEnv* env, jobject object, const char* className) {  // false for null
    jclass cls = env->FindClass(fullName(className).c_str());
    bool result = object != nullptr && cls != nullptr && env->IsInstanceOf(object, cls);
    env->DeleteLocalRef(cls);
    return result;
}

Bytes nativeBytes(const void* data, std::size_t size) {
    const auto* bytes = static_cast<const uint8_t*>(data);
    return bytes != nullptr ? Bytes(bytes, bytes + size) : Bytes();
}

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
#define VOK_MEMBER(kind, S, f, ...) Member{Kind::kind, #f, offsetof(S, f), __VA_ARGS__}
#define VOK_LONG(S, f) VOK_MEMBER(Long, S, f)
#define VOK_BOOL(S, f) VOK_MEMBER(Bool, S, f)
#define VOK_BYTE(S, f) VOK_MEMBER(Byte, S, f)
#define VOK_BYTES(S, p, len) VOK_MEMBER(Bytes, S, p, offsetof(S, len))
#define VOK_BYTES_ONLY(S, p) VOK_MEMBER(Bytes, S, p)
#define VOK_CHARS(S, p, len) VOK_MEMBER(Chars, S, p, offsetof(S, len))
#define VOK_CHARS_ONLY(S, p) VOK_MEMBER(Chars, S, p)
#define VOK_FIXED_CHARS(S, f) VOK_MEMBER(Chars, S, f, kNoLength, sizeof(S::f))
// An embedded CK_VERSION.
#define VOK_VERSION(S, f)                                                               \
    Member {                                                                  \
        Kind::Embedded, #f, offsetof(S, f), kNoLength, 0, "CK_VERSION", \
        {VOK_BYTE(CK_VERSION, major), VOK_BYTE(CK_VERSION, minor)}                      \
    }

// The distinct values, numbered by seed in member order.
jlong longValue(int seed) { return static_cast<jlong>(0xA1B2C3D4E5F60000ull + seed); }
uint8_t byteValue(int seed) { return static_cast<uint8_t>(0x80 | seed); }
Bytes bytesValue(int seed) {
    Bytes bytes(seed % 5 + 2);
    for (std::size_t k = 0; k < bytes.size(); ++k) bytes[k] = static_cast<uint8_t>(seed << 4 | k);
    return bytes;
}
// Chars carry a high byte the conversion must drop.
std::u16string charsValue(int seed) {
    std::u16string chars;
    for (uint8_t b : bytesValue(seed)) chars += static_cast<char16_t>(0x2A00 | b);
    return chars;
}
// The bytes of a fixed-size character field, high bits set so that a
// conversion widening with sign shows.
Bytes fixedBytes(int seed, std::size_t size) {
    Bytes bytes(size);
    for (std::size_t k = 0; k < size; ++k)
        bytes[k] = static_cast<uint8_t>(((seed << 4) + k) ^ 0x80);
    return bytes;
}

template <typename T>
T readAt(const void* base, std::size_t offset) {
    T value;
    std::memcpy(&value, static_cast<const uint8_t*>(base) + offset, sizeof value);
    return value;
}

std::string nestedSignature(const Member& m) { return "L" + fullName(m.className) + ";"; }

// Builds a Java object of className with a distinct value in every member;
// a check with the same seed expects the same values.
jobject buildJava(JNIEnv* env, const char* className, const std::vector<Member>& members,
                         int& seed) {
    static const char* const kSignatures[] = {"J", "Z", "B", "[B", "[C"};
    jobject object = newObject(env, className);
    for (const Member& m : members) {
        int s = seed++;
        jvalue v{};
        if (m.kind == Kind::Long) v.j = longValue(s);
        if (m.kind == Kind::Bool) v.z = JNI_TRUE;
        if (m.kind == Kind::Byte) v.b = static_cast<jbyte>(byteValue(s));
        if (m.kind == Kind::Bytes) v.l = newBytes(env, bytesValue(s));
        if (m.kind == Kind::Chars) v.l = newChars(env, charsValue(s));
        if (m.className != nullptr) v.l = buildJava(env, m.className, m.members, seed);
        std::string signature =
            m.className != nullptr ? nestedSignature(m) : kSignatures[static_cast<int>(m.kind)];
        setField(env, object, m.name, signature.c_str(), v);
        if (signature.size() > 1) env->DeleteLocalRef(v.l);
    }
    return object;
}

void checkNative(const void* native, std::size_t size, const std::vector<Member>& members,
                        int& seed, const TrackedAllocations& tracked, const std::string& where);

void checkMembers(const uint8_t* base, std::vector<bool>& covered, std::size_t at,
                         const std::vector<Member>& members, int& seed,
                         const TrackedAllocations& tracked, const std::string& where) {
    auto cover = [&covered](std::size_t from, std::size_t count) {
        for (std::size_t i = from; i < from + count && i < covered.size(); ++i) covered[i] = true;
    };
    for (const Member& m : members) {
        std::string what = where + "." + m.name;
        std::size_t o = at + m.offset;
        int s = seed++;
        if (m.kind == Kind::Long) {
            EXPECT_EQ(readAt<CK_ULONG>(base, o), static_cast<CK_ULONG>(longValue(s))) << what;
            cover(o, sizeof(CK_ULONG));
        } else if (m.kind == Kind::Bool || m.kind == Kind::Byte) {
            EXPECT_EQ(base[o], m.kind == Kind::Bool ? 1 : byteValue(s)) << what;
            cover(o, 1);
        } else if (m.kind == Kind::Embedded) {
            checkMembers(base, covered, o, m.members, seed, tracked, what);
        } else {
            // A buffer or a structure behind a pointer, of its own exact size.
            auto* data = readAt<uint8_t*>(base, o);
            cover(o, sizeof data);
            ASSERT_NE(data, nullptr) << what;
            Bytes expected = bytesValue(s);
            std::size_t size = m.kind == Kind::Pointed ? m.size : expected.size();
            EXPECT_EQ(tracked.sizeOf(data), size) << what;
            if (m.kind == Kind::Pointed) {
                checkNative(data, m.size, m.members, seed, tracked, what);
                continue;
            }
            EXPECT_EQ(nativeBytes(data, expected.size()), expected) << what;
            if (m.lengthOffset != kNoLength) {
                EXPECT_EQ(readAt<CK_ULONG>(base, at + m.lengthOffset), expected.size()) << what;
                cover(at + m.lengthOffset, sizeof(CK_ULONG));
            }
        }
    }
}

// Checks native bytes against the values buildJava put into the Java object,
// and that every byte no member describes is zero.
void checkNative(const void* native, std::size_t size, const std::vector<Member>& members,
                        int& seed, const TrackedAllocations& tracked, const std::string& where) {
    std::vector<bool> covered(size);
    checkMembers(static_cast<const uint8_t*>(native), covered, 0, members, seed, tracked, where);
    for (std::size_t i = 0; i < size; ++i)
        if (!covered[i]) {
            EXPECT_EQ(static_cast<const uint8_t*>(native)[i], 0) << where << " byte " << i;
        }
}

// Plays a module that writes results: every value the members describe in
// the native structure is inverted (buffers byte by byte).
void invertNative(void* native, const std::vector<Member>& members, int& seed) {
    for (const Member& m : members) {
        int s = seed++;
        uint8_t* at = static_cast<uint8_t*>(native) + m.offset;
        std::size_t size = m.kind == Kind::Long ? sizeof(CK_ULONG) : 1;
        if (m.kind == Kind::Bytes || m.kind == Kind::Chars) {
            size = bytesValue(s).size();
            at = readAt<uint8_t*>(at, 0);
        }
        if (m.kind == Kind::Embedded) invertNative(at, m.members, seed);
        if (m.kind == Kind::Pointed) invertNative(readAt<uint8_t*>(at, 0), m.members, seed);
        for (std::size_t i = 0; m.className == nullptr && i < size; ++i)
            at[i] = static_cast<uint8_t>(~at[i]);
    }
}

// Fills a native structure's members with distinct values (fixed chars with
// high bits set), for a conversion to Java checked by checkJavaValues.
void fillNative(void* native, const std::vector<Member>& members, int& seed) {
    for (const Member& m : members) {
        int s = seed++;
        uint8_t* at = static_cast<uint8_t*>(native) + m.offset;
        jlong l = longValue(s);
        if (m.kind == Kind::Long) std::memcpy(at, &l, sizeof l);
        if (m.kind == Kind::Byte) *at = byteValue(s);
        if (m.kind == Kind::Chars) std::memcpy(at, fixedBytes(s, m.size).data(), m.size);
        if (m.kind == Kind::Embedded) fillNative(at, m.members, seed);
    }
}

// Checks the Java object's fields against the values buildJava or
// fillNative put there, or against their inversions.
void checkJavaValues(JNIEnv* env, jobject object, const std::vector<Member>& members,
                            int& seed, bool inverted, const std::string& where) {
    ASSERT_NE(object, nullptr) << where;
    auto invert = [inverted](Bytes b) {
        for (uint8_t& x : b) x = static_cast<uint8_t>(inverted ? ~x : x);
        return b;
    };
    for (const Member& m : members) {
        std::string what = where + "." + m.name;
        int s = seed++;
        if (m.kind == Kind::Long) {
            EXPECT_EQ(getField(env, object, m.name, "J").j, inverted ? ~longValue(s) : longValue(s))
                << what;
        } else if (m.kind == Kind::Byte) {
            EXPECT_EQ(static_cast<uint8_t>(getField(env, object, m.name, "B").b),
                      invert({byteValue(s)})[0])
                << what;
        } else if (m.kind == Kind::Bytes) {
            EXPECT_EQ(bytesOf(env, getField(env, object, m.name, "[B").l), invert(bytesValue(s)))
                << what;
        } else if (m.kind == Kind::Chars) {
            std::u16string expected = charsValue(s);
            Bytes fixed = fixedBytes(s, m.size);
            if (m.size != 0) expected.assign(fixed.begin(), fixed.end());
            EXPECT_EQ(charsOf(env, getField(env, object, m.name, "[C").l), expected) << what;
        } else {
            jobject nested = getField(env, object, m.name, nestedSignature(m).c_str()).l;
            checkJavaValues(env, nested, m.members, seed, inverted, what);
            env->DeleteLocalRef(nested);
        }
    }
}


using ::testing::ElementsAre;
using voktest::takePendingException;

const std::string kTag = "[native jni pkcs11wrapper]";
const char* const kRuntimeException = "com.vok.smartcard.pkcs11.PKCS11RuntimeException";
const char* const kOutOfMemory = "java.lang.OutOfMemoryError";

Bytes le64(uint64_t v) { return nativeBytes(&v, sizeof v); }
Bytes operator+(Bytes a, const Bytes& b) {
    a.insert(a.end(), b.begin(), b.end());
    return a;
}
Bytes text(const char* s) { return Bytes(s, s + std::strlen(s)); }

jobject date(JNIEnv* env, const char16_t* y, const char16_t* m, const char16_t* d) {
    jobject object = newObject(env, "CK_DATE");
    const char* names[] = {"year", "month", "day"};
    const char16_t* values[] = {y, m, d};
    for (int i = 0; i < 3; ++i) {
        setField(env, object, names[i], "[C",
                           jv(values[i] != nullptr ? newChars(env, values[i]) : nullptr));
    }
    return object;
}

jobject attribute(JNIEnv* env, CK_ATTRIBUTE_TYPE type, jobject value) {
    jobject object = newObject(env, "CK_ATTRIBUTE");
    setField(env, object, "type", "J", jv(static_cast<jlong>(type)));
    setField(env, object, "pValue", "Ljava/lang/Object;", jv(value));
    return object;
}

jobjectArray attributes(JNIEnv* env, std::initializer_list<jobject> elements) {
    jclass cls = env->FindClass("com/vok/smartcard/pkcs11/CK_ATTRIBUTE");
    jobjectArray array = env->NewObjectArray(static_cast<jsize>(elements.size()), cls, nullptr);
    jsize i = 0;
    for (jobject e : elements) env->SetObjectArrayElement(array, i++, e);
    return array;
}

// New Java arrays of the given elements.
#define ARRAY_OF(name, Type, T)                                                                   \
    jobject name(JNIEnv* env, std::initializer_list<T> values) {                                  \
        auto array = env->New##Type##Array(static_cast<jsize>(values.size()));                    \
        env->Set##Type##ArrayRegion(array, 0, static_cast<jsize>(values.size()), values.begin()); \
        return array;                                                                             \
    }
ARRAY_OF(booleans, Boolean, jboolean)
ARRAY_OF(ints, Int, jint)
ARRAY_OF(longs, Long, jlong)

class Converters : public voktest::JvmTest {
protected:
    jobject box(const char* simpleName, const char* signature, jvalue v) {
        return newBoxed(env_, (std::string("java/lang/") + simpleName).c_str(), signature, v);
    }
};

TEST_F(Converters, EachValueClassTakesItsRowInOrder) {
    struct {
        const char* what;
        jobject value;
        Bytes buffer;  // leading bytes of the native buffer; empty: null buffer
        CK_ULONG length;
        const char* exception = nullptr;
        const char* logged = nullptr;
    } rows[] = {
        // clang-format off
        {"null", nullptr, {}, 0},
        {"Long", box("Long", "(J)V", jv(jlong(0x0102030405060708))), le64(0x0102030405060708), 8},
        {"Boolean true", box("Boolean", "(Z)V", jv(jboolean(1))), {1}, 1, nullptr, "TRUE>"},
        {"Boolean false", box("Boolean", "(Z)V", jv(jboolean(0))), {0}, 1, nullptr, "FALSE>"},
        {"byte[]", newBytes(env_, {'A', 'B', 0, 'C'}), {'A', 'B', 0, 'C'}, 4, nullptr,
         "<Byte value AB>"},
        {"char[]", newChars(env_, u"\u4131\u00e9"), {0x31, 0xE9}, 2},
        {"Byte", box("Byte", "(B)V", jv(jbyte(-2))), {0xFE}, 1, nullptr,
         "<converted byte value FE>"},
        {"CK_DATE", date(env_, u"2024", u"01", u"31"), text("20240131"), 8},
        // Fields cut to their size, short or null ones ending in zeros.
        {"CK_DATE", date(env_, u"24", nullptr, u"31xyz"), {'2', '4', 0, 0, 0, 0, '3', '1'}, 8},
        {"Character", box("Character", "(C)V", jv(jchar(u'x'))), {}, 0,
         "java.lang.NoClassDefFoundError: java/lang/Char"},
        {"Integer", box("Integer", "(I)V", jv(jint(-2))), le64(0xFFFFFFFFFFFFFFFEull), 8},
        // Only exactly 1 is true.
        {"boolean[]", booleans(env_, {1, 0, 2}), {1, 0, 0}, 3},
        // Length in elements, each element read as 64 bits.
        {"int[]", ints(env_, {1, 2, 3}),
         le64(0x0000000200000001) + le64(3) + le64(0), 3},
        // Length in bytes.
        {"long[]", longs(env_, {5, -1}), le64(5) + le64(~0ull), 16},
        {"String", env_->NewStringUTF("a\xc3\xa9"), {'a', 0xC3, 0xA9, 0}, 3},
        {"Double", box("Double", "(D)V", jv(jdouble(1.5))), {}, 0,
         "com.vok.smartcard.pkcs11.PKCS11RuntimeException: Java object of this class cannot be "
         "converted to native PKCS#11 type: java.lang.Double"},
        // clang-format on
    };
    for (const auto& row : rows) {
        voktest::LogCapture log;
        TrackedAllocations tracked;
        CK_VOID_PTR buffer = reinterpret_cast<CK_VOID_PTR>(1);
        CK_ULONG length = 99;
        jObjectToPrimitiveCKObjectPtrPtr(env_, row.value, &buffer, &length);
        voktest::ThrownException thrown = takePendingException(env_);
        EXPECT_EQ(thrown.thrown ? thrown.className + ": " + thrown.message : "",
                  row.exception ? row.exception : "")
            << row.what;
        EXPECT_EQ(length, row.length) << row.what;
        EXPECT_EQ(nativeBytes(buffer, row.buffer.size()), row.buffer) << row.what;
        EXPECT_TRUE(!row.buffer.empty() || buffer == nullptr) << row.what;
        EXPECT_TRUE(row.logged == nullptr || log.contains(kTag, row.logged)) << row.what;
        auto texts = log.texts(kTag);
        EXPECT_EQ(texts.front(), "\nDEBUG: jObjectToPrimitiveCKObjectPtrPtr") << row.what;
        EXPECT_EQ(texts.back(), "FINISHED\n") << row.what;
        tracked.release(buffer);
        EXPECT_EQ(tracked.live(), 0u) << row.what << ": a temporary was kept";
    }
}

// One status row: the converter, its output type and the Java argument.
#define STATUS_ROW(convert, Out, make, first, second)                                             \
    {                                                                                             \
#convert, [](JNIEnv * e, void** o,                                                        \
                     CK_ULONG* l) { return convert(e, make, reinterpret_cast<Out*>(o), l); },     \
                                                                                           first, \
                                                                                           second \
    }

TEST_F(Converters, ArrayConvertersReportWhichAllocationFailed) {
    struct {
        const char* what;
        int (*convert)(JNIEnv*, void**, CK_ULONG*);
        int firstFails, secondFails;  // status when that allocation fails
    } rows[] = {
        STATUS_ROW(jByteArrayToCKByteArray, CK_BYTE_PTR, newBytes(e, {1, 2}), 1, 0),
        STATUS_ROW(jCharArrayToCKCharArray, CK_CHAR_PTR, newChars(e, u"ab"), 1, 2),
        STATUS_ROW(jBooleanArrayToCKBBoolArray, CK_BBOOL_PTR, e->NewBooleanArray(2), 1, 2),
        STATUS_ROW(jLongArrayToCKULongArray, CK_ULONG_PTR, e->NewLongArray(2), 1, 2),
        // The string's first "allocation" is the VM's own copy.
        STATUS_ROW(jStringToCKUTF8CharArray, CK_UTF8CHAR_PTR, e->NewStringUTF("ab"), 2, 0),
    };
    for (const auto& row : rows) {
        for (int nth : {1, 2}) {
            TrackedAllocations tracked;
            tracked.failAllocation(nth);
            void* out = reinterpret_cast<void*>(1);
            CK_ULONG length = 99;
            int expected = nth == 1 ? row.firstFails : row.secondFails;
            EXPECT_EQ(row.convert(env_, &out, &length), expected) << row.what << " #" << nth;
            EXPECT_EQ(takePendingException(env_).className, expected != 0 ? kOutOfMemory : "")
                << row.what << " #" << nth;
            EXPECT_TRUE(expected == 0 || (out == nullptr && length == 0)) << row.what;
            tracked.release(expected == 0 ? out : nullptr);
            EXPECT_EQ(tracked.live(), 0u) << row.what << " #" << nth;
        }
    }
}

template <typename T, jobject (*Convert)(JNIEnv*, const T*)>
jobject convertAs(JNIEnv* env, const void* native) {
    return Convert(env, static_cast<const T*>(native));
}
#define INFO_ROW(T, convert, ...)                               \
    {                                                           \
#T, sizeof(T), convertAs < T, convert>, { __VA_ARGS__ } \
    }

TEST_F(Converters, InformationStructuresCarryEveryField) {
    using INFO = CK_INFO;
    using SLOT = CK_SLOT_INFO;
    using TOKEN = CK_TOKEN_INFO;
    using SESSION = CK_SESSION_INFO;
    using MECHANISM = CK_MECHANISM_INFO;
    struct {
        const char* what;
        std::size_t size;
        jobject (*convert)(JNIEnv*, const void*);
        std::vector<Member> members;
    } rows[] = {
        // clang-format off
        INFO_ROW(CK_INFO, ckInfoPtrToJInfo, VOK_VERSION(INFO, cryptokiVersion),
                 VOK_FIXED_CHARS(INFO, manufacturerID), VOK_LONG(INFO, flags),
                 VOK_FIXED_CHARS(INFO, libraryDescription), VOK_VERSION(INFO, libraryVersion)),
        INFO_ROW(CK_SLOT_INFO, ckSlotInfoPtrToJSlotInfo, VOK_FIXED_CHARS(SLOT, slotDescription),
                 VOK_FIXED_CHARS(SLOT, manufacturerID), VOK_LONG(SLOT, flags),
                 VOK_VERSION(SLOT, hardwareVersion), VOK_VERSION(SLOT, firmwareVersion)),
        INFO_ROW(CK_TOKEN_INFO, ckTokenInfoPtrToJTokenInfo, VOK_FIXED_CHARS(TOKEN, label),
                 VOK_FIXED_CHARS(TOKEN, manufacturerID), VOK_FIXED_CHARS(TOKEN, model),
                 VOK_FIXED_CHARS(TOKEN, serialNumber), VOK_LONG(TOKEN, flags),
                 VOK_LONG(TOKEN, ulMaxSessionCount), VOK_LONG(TOKEN, ulSessionCount),
                 VOK_LONG(TOKEN, ulMaxRwSessionCount), VOK_LONG(TOKEN, ulRwSessionCount),
                 VOK_LONG(TOKEN, ulMaxPinLen), VOK_LONG(TOKEN, ulMinPinLen),
                 VOK_LONG(TOKEN, ulTotalPublicMemory), VOK_LONG(TOKEN, ulFreePublicMemory),
                 VOK_LONG(TOKEN, ulTotalPrivateMemory), VOK_LONG(TOKEN, ulFreePrivateMemory),
                 VOK_VERSION(TOKEN, hardwareVersion), VOK_VERSION(TOKEN, firmwareVersion),
                 VOK_FIXED_CHARS(TOKEN, utcTime)),
        INFO_ROW(CK_SESSION_INFO, ckSessionInfoPtrToJSessionInfo, VOK_LONG(SESSION, slotID),
                 VOK_LONG(SESSION, state), VOK_LONG(SESSION, flags),
                 VOK_LONG(SESSION, ulDeviceError)),
        INFO_ROW(CK_MECHANISM_INFO, ckMechanismInfoPtrToJMechanismInfo,
                 VOK_LONG(MECHANISM, ulMinKeySize), VOK_LONG(MECHANISM, ulMaxKeySize),
                 VOK_LONG(MECHANISM, flags)),
        INFO_ROW(CK_DATE, ckDatePtrToJDateObject, VOK_FIXED_CHARS(CK_DATE, year),
                 VOK_FIXED_CHARS(CK_DATE, month), VOK_FIXED_CHARS(CK_DATE, day)),
        // clang-format on
    };
    for (const auto& row : rows) {
        Bytes native(row.size);
        int seed = 0;
        fillNative(native.data(), row.members, seed);
        jobject object = row.convert(env_, native.data());
        EXPECT_TRUE(isA(env_, object, row.what)) << row.what;
        seed = 0;
        checkJavaValues(env_, object, row.members, seed, false, row.what);
    }
}

TEST_F(Converters, AttributeTypesConvertBothWaysOrToNull) {
    struct {
        std::vector<CK_ATTRIBUTE_TYPE> types;
        Bytes value;
        const char* javaClass;
    } groups[] = {
        {{0x0, 0x80, 0x87, 0x88, 0x100, 0x121, 0x133, 0x134, 0x160, 0x161, 0x166, 0x201, 0x300},
         le64(0x8877665544332211),
         "java/lang/Long"},
        {{0x1,   0x2,   0x86,  0x103, 0x104, 0x105, 0x106, 0x107, 0x108, 0x109, 0x10A, 0x10B,
          0x10C, 0x162, 0x163, 0x164, 0x165, 0x170, 0x200, 0x202, 0x210, 0x301, 0x302},
         {1},
         "java/lang/Boolean"},
        {{0x3, 0x10, 0x89}, {'K', 'e', 'y', 0xE9}, "[C"},
        {{0x110, 0x111}, text("20240131"), "CK_DATE"},
        {{0x40000600}, le64(0x1082) + le64(0x250), "[J"},
        // Types next to the listed ones, and vendor-defined ones, are bytes.
        {{0x11, 0x102, 0x10D, 0x167, 0x171, 0x40000213, 0x80000001}, {0xDE, 0xAD, 0xBE}, "[B"},
    };
    for (const auto& group : groups) {
        for (CK_ATTRIBUTE_TYPE type : group.types) {
            TrackedAllocations tracked;
            CK_ATTRIBUTE native{type, const_cast<uint8_t*>(group.value.data()), group.value.size()};
            jobject object = ckAttributePtrToJAttribute(env_, &native);
            ASSERT_FALSE(env_->ExceptionCheck()) << std::hex << type;
            EXPECT_EQ(getField(env_, object, "type", "J").j, static_cast<jlong>(type));
            jobject value = getField(env_, object, "pValue", "Ljava/lang/Object;").l;
            EXPECT_TRUE(isA(env_, value, group.javaClass)) << std::hex << type;
            EXPECT_TRUE(std::string(group.javaClass) != "[C" ||
                        charsOf(env_, value) == u"Key\u00e9");

            CK_ATTRIBUTE back = jAttributeToCKAttribute(env_, object);
            ASSERT_FALSE(env_->ExceptionCheck()) << std::hex << type;
            EXPECT_EQ(back.type, type);
            EXPECT_EQ(back.ulValueLen, group.value.size()) << std::hex << type;
            EXPECT_EQ(nativeBytes(back.pValue, back.ulValueLen), group.value) << std::hex << type;
            freeCKAttributeValue(&back);
            EXPECT_EQ(tracked.live(), 0u);

            // Unavailable (all ones), empty or absent values are null; only
            // the length's low word counts.
            for (CK_ULONG length : {CK_UNAVAILABLE_INFORMATION, CK_ULONG(0), CK_ULONG(1) << 32,
                                    CK_ULONG(0x1FFFFFFFF), CK_ULONG(8)}) {
                native.ulValueLen = length;
                if (length == 8) native.pValue = nullptr;
                EXPECT_EQ(ckAttributeValueToJObject(env_, &native), nullptr) << std::hex << type;
            }
        }
    }
    // A flag byte other than 1 is false, and goes back as 0.
    CK_BBOOL notOne = 0xFF;
    CK_ATTRIBUTE token{CKA_TOKEN, &notOne, 1};
    jobject flag = ckAttributePtrToJAttribute(env_, &token);
    CK_ATTRIBUTE back = jAttributeToCKAttribute(env_, flag);
    EXPECT_EQ(nativeBytes(back.pValue, back.ulValueLen), Bytes{0});
    freeCKAttributeValue(&back);
}

TEST_F(Converters, WrapTemplatesNestBothWays) {
    for (CK_ATTRIBUTE_TYPE type : {CKA_WRAP_TEMPLATE, CKA_UNWRAP_TEMPLATE}) {
        TrackedAllocations tracked;
        CK_ULONG keyClass = CKO_SECRET_KEY;
        CK_BBOOL yes = CK_TRUE;
        CK_ATTRIBUTE nested[] = {{CKA_CLASS, &keyClass, sizeof keyClass}, {CKA_TOKEN, &yes, 1}};
        CK_ATTRIBUTE native{type, nested, sizeof nested};
        jobject object = ckAttributePtrToJAttribute(env_, &native);
        auto array = static_cast<jobjectArray>(
            getField(env_, object, "pValue", "Ljava/lang/Object;").l);
        ASSERT_TRUE(isA(env_, array, "[Lcom/vok/smartcard/pkcs11/CK_ATTRIBUTE;"));
        ASSERT_EQ(env_->GetArrayLength(array), 2);
        CK_ATTRIBUTE back = jAttributeToCKAttribute(env_, object);
        ASSERT_FALSE(env_->ExceptionCheck());
        EXPECT_EQ(back.type, type);
        ASSERT_EQ(back.ulValueLen, 2 * sizeof(CK_ATTRIBUTE));
        auto* elements = static_cast<CK_ATTRIBUTE*>(back.pValue);
        for (int i = 0; i < 2; ++i) {
            EXPECT_EQ(elements[i].type, nested[i].type);
            EXPECT_EQ(nativeBytes(elements[i].pValue, elements[i].ulValueLen),
                      nativeBytes(nested[i].pValue, nested[i].ulValueLen));
        }
        freeCKAttributeValue(&back);
        EXPECT_EQ(tracked.live(), 0u) << "nested values are freed with their template";
    }
}

TEST_F(Converters, LengthsBeyondJavaArraysRaiseOutOfMemory) {
    uint8_t small[4] = {};
    const CK_ULONG wraps = 0x100000000ull;  // would be 0 as a Java length
    std::function<jobject()> calls[] = {
        [&] { return ckByteArrayToJByteArray(env_, small, wraps); },
        [&] { return ckCharArrayToJCharArray(env_, small, wraps); },
        [&] { return ckULongArrayToJLongArray(env_, reinterpret_cast<CK_ULONG*>(small), wraps); },
        [&] {
            return ckAttributeArrayToJAttributeArray(env_, reinterpret_cast<CK_ATTRIBUTE*>(small),
                                                     wraps * sizeof(CK_ATTRIBUTE));
        },
    };
    for (auto& call : calls) {
        EXPECT_EQ(call(), nullptr);
        EXPECT_EQ(takePendingException(env_).className, kOutOfMemory);
    }
    EXPECT_EQ(env_->GetArrayLength(ckULongArrayToJLongArray(env_, nullptr, 0)), 0);
}

TEST_F(Converters, FailedTemplateElementLeavesNothingAllocated) {
    jobject doubleValue = newBoxed(env_, "java/lang/Double", "(D)V", jv(jdouble(2.5)));
    jobject notATemplate = newBytes(env_, {1, 2});
    jobjectArray templates[] = {
        attributes(env_, {attribute(env_, CKA_LABEL, newChars(env_, u"k")),
                          attribute(env_, CKA_VALUE, doubleValue)}),
        attributes(env_, {attribute(env_, CKA_WRAP_TEMPLATE,
                                    attributes(env_, {attribute(env_, CKA_VALUE, doubleValue)}))}),
        attributes(env_, {attribute(env_, CKA_UNWRAP_TEMPLATE, notATemplate)}),
    };
    for (jobjectArray array : templates) {
        TrackedAllocations tracked;
        CK_ATTRIBUTE_PTR out = reinterpret_cast<CK_ATTRIBUTE_PTR>(1);
        CK_ULONG count = 9;
        EXPECT_NE(jAttributeArrayToCKAttributeArray(env_, array, &out, &count), 0);
        EXPECT_EQ(takePendingException(env_).className, kRuntimeException);
        EXPECT_TRUE(out == nullptr && count == 0);
        EXPECT_EQ(tracked.live(), 0u);
    }
}

TEST_F(Converters, InitArgsAdapterCarriesFlagsAndReservedValue) {
    TrackedAllocations tracked;
    EXPECT_EQ(makeCKInitArgsAdapter(env_, nullptr), nullptr);
    jobject args = newObject(env_, "CK_C_INITIALIZE_ARGS");
    setField(env_, args, "flags", "J", jv(jlong(CKF_OS_LOCKING_OK)));
    jobject reserved = newBoxed(env_, "java/lang/Long", "(J)V", jv(jlong(0x1234)));
    setField(env_, args, "pReserved", "Ljava/lang/Object;", jv(reserved));

    CK_C_INITIALIZE_ARGS_PTR native = makeCKInitArgsAdapter(env_, args);
    ASSERT_NE(native, nullptr);
    EXPECT_TRUE(native->CreateMutex == nullptr && native->DestroyMutex == nullptr &&
                native->LockMutex == nullptr && native->UnlockMutex == nullptr);
    EXPECT_EQ(native->flags, CKF_OS_LOCKING_OK);
    EXPECT_EQ(nativeBytes(native->pReserved, 8), le64(0x1234));
    freeCKInitArgsAdapter(native);
    EXPECT_EQ(tracked.live(), 0u);
}

TEST_F(Converters, TemplateConversionLogsEachStep) {
    voktest::LogCapture log;
    jobjectArray array =
        attributes(env_, {attribute(env_, CKA_ID, newBytes(env_, {'I', 'D'}))});
    CK_ATTRIBUTE_PTR out = nullptr;
    CK_ULONG count = 0;
    ASSERT_EQ(jAttributeArrayToCKAttributeArray(env_, array, &out, &count), 0);
    auto texts = log.texts(kTag);
    ASSERT_EQ(texts.size(), 21u);
    texts[10] = texts[10].substr(0, 11);  // the object's address varies
    EXPECT_THAT(
        texts,
        ElementsAre(
            "jAttributeArrayToCKAttributeArray", "\nDEBUG: jAttributeArrayToCKAttributeArray",
            ", converting 1 attributes", ", getting 0. attribute", ", converting 0. attribute",
            "\nDEBUG: jAttributeToCKAttribute", ", getting attribute object class",
            ", getting type field", ", type=0x102", ", getting pValue field", ", pValue=0x",
            ", converting pValue to primitive object", "\nDEBUG: jObjectToPrimitiveCKObjectPtrPtr",
            "ckpLength:2", "<Byte value ID>", "ckpLength: 2", "FINISHED\n", "\nFINISHED\n",
            "FINISHED\n", "\nConverted template with following types: ", "\n"));
    freeCKAttributeArray(out, count);
}

TEST(ConverterAliases, SecondNamesAreTheSameFunctions) {
    EXPECT_EQ(reinterpret_cast<void*>(&jCharArrayToCKUTF8CharArray),
              reinterpret_cast<void*>(&jCharArrayToCKCharArray));
    EXPECT_EQ(reinterpret_cast<void*>(&ckUTF8CharArrayToJCharArray),
              reinterpret_cast<void*>(&ckCharArrayToJCharArray));
}

// ---- Mechanism parameters ----------------------------------------------------

struct ParameterRow {
    const char* className;
    CK_MECHANISM_TYPE mechanism;  // whose rule frees it
    std::size_t size;
    std::vector<Member> members;
    std::vector<std::size_t> leftAllocated = {};  // pointers the rule leaves
};

#define ROW(S, mechanism, ...) \
    ParameterRow { #S, mechanism, sizeof(S), __VA_ARGS__ }

Member randomInfo(std::size_t offset) {
    return {Kind::Embedded,
            "RandomInfo",
            offset,
            kNoLength,
            0,
            "CK_SSL3_RANDOM_DATA",
            {VOK_BYTES(CK_SSL3_RANDOM_DATA, pClientRandom, ulClientRandomLen),
             VOK_BYTES(CK_SSL3_RANDOM_DATA, pServerRandom, ulServerRandomLen)}};
}

// The two structures that parameters point to; the module writes into them.
const Member kVersionPointer{Kind::Pointed,
                             "pVersion",
                             offsetof(CK_SSL3_MASTER_KEY_DERIVE_PARAMS, pVersion),
                             kNoLength,
                             sizeof(CK_VERSION),
                             "CK_VERSION",
                             {VOK_BYTE(CK_VERSION, major), VOK_BYTE(CK_VERSION, minor)}};
const Member kKeyMaterialPointer{
    Kind::Pointed,
    "pReturnedKeyMaterial",
    offsetof(CK_SSL3_KEY_MAT_PARAMS, pReturnedKeyMaterial),
    kNoLength,
    sizeof(CK_SSL3_KEY_MAT_OUT),
    "CK_SSL3_KEY_MAT_OUT",
    {VOK_LONG(CK_SSL3_KEY_MAT_OUT, hClientMacSecret),
     VOK_LONG(CK_SSL3_KEY_MAT_OUT, hServerMacSecret), VOK_LONG(CK_SSL3_KEY_MAT_OUT, hClientKey),
     VOK_LONG(CK_SSL3_KEY_MAT_OUT, hServerKey), VOK_BYTES_ONLY(CK_SSL3_KEY_MAT_OUT, pIVClient),
     VOK_BYTES_ONLY(CK_SSL3_KEY_MAT_OUT, pIVServer)}};

// Every parameter class but RC2-CBC, in the dispatcher's order.
const std::vector<ParameterRow>& parameterRows() {
    using OAEP = CK_RSA_PKCS_OAEP_PARAMS;
    using KEA = CK_KEA_DERIVE_PARAMS;
    using SPW = CK_SKIPJACK_PRIVATE_WRAP_PARAMS;
    using RELAYX = CK_SKIPJACK_RELAYX_PARAMS;
    using PBKD2 = CK_PKCS5_PBKD2_PARAMS;
    using MASTER = CK_SSL3_MASTER_KEY_DERIVE_PARAMS;
    using KEYMAT = CK_SSL3_KEY_MAT_PARAMS;
    using RC2MAC = CK_RC2_MAC_GENERAL_PARAMS;
    using RC5 = CK_RC5_PARAMS;
    using RC5CBC = CK_RC5_CBC_PARAMS;
    using RC5MAC = CK_RC5_MAC_GENERAL_PARAMS;
    using PBE = CK_PBE_PARAMS;
    using PSS = CK_RSA_PKCS_PSS_PARAMS;
    using ECDH1 = CK_ECDH1_DERIVE_PARAMS;
    using DH1 = CK_X9_42_DH1_DERIVE_PARAMS;
    using ECDH2 = CK_ECDH2_DERIVE_PARAMS;
    using DH2 = CK_X9_42_DH2_DERIVE_PARAMS;
    static const std::vector<ParameterRow> rows = {
        ROW(CK_RSA_PKCS_OAEP_PARAMS, CKM_RSA_PKCS_OAEP,
            {VOK_LONG(OAEP, hashAlg), VOK_LONG(OAEP, mgf), VOK_LONG(OAEP, source),
             VOK_BYTES(OAEP, pSourceData, ulSourceDataLen)}),
        // ulRandomLen comes from pRandomB; pRandomA's length is dropped.
        ROW(CK_KEA_DERIVE_PARAMS, CKM_KEA_KEY_DERIVE,
            {VOK_BOOL(KEA, isSender), VOK_BYTES_ONLY(KEA, pRandomA),
             VOK_BYTES(KEA, pRandomB, ulRandomLen), VOK_BYTES(KEA, pPublicData, ulPublicDataLen)}),
        ROW(CK_RC2_MAC_GENERAL_PARAMS, CKM_RC2_MAC_GENERAL,
            {VOK_LONG(RC2MAC, ulEffectiveBits), VOK_LONG(RC2MAC, ulMacLength)}),
        ROW(CK_RC5_PARAMS, CKM_RC5_ECB, {VOK_LONG(RC5, ulWordsize), VOK_LONG(RC5, ulRounds)}),
        ROW(CK_RC5_CBC_PARAMS, CKM_RC5_CBC_PAD,
            {VOK_LONG(RC5CBC, ulWordsize), VOK_LONG(RC5CBC, ulRounds),
             VOK_BYTES(RC5CBC, pIv, ulIvLen)}),
        ROW(CK_RC5_MAC_GENERAL_PARAMS, CKM_RC5_MAC_GENERAL,
            {VOK_LONG(RC5MAC, ulWordsize), VOK_LONG(RC5MAC, ulRounds),
             VOK_LONG(RC5MAC, ulMacLength)}),
        ROW(CK_SKIPJACK_PRIVATE_WRAP_PARAMS, CKM_SKIPJACK_PRIVATE_WRAP,
            {VOK_BYTES(SPW, pPassword, ulPasswordLen), VOK_BYTES(SPW, pPublicData, ulPublicDataLen),
             VOK_BYTES(SPW, pRandomA, ulRandomLen), VOK_BYTES(SPW, pPrimeP, ulPAndGLen),
             VOK_BYTES_ONLY(SPW, pBaseG), VOK_BYTES(SPW, pSubprimeQ, ulQLen)}),
        ROW(CK_SKIPJACK_RELAYX_PARAMS, CKM_SKIPJACK_RELAYX,
            {VOK_BYTES(RELAYX, pOldWrappedX, ulOldWrappedXLen),
             VOK_BYTES(RELAYX, pOldPassword, ulOldPasswordLen),
             VOK_BYTES(RELAYX, pOldPublicData, ulOldPublicDataLen),
             VOK_BYTES(RELAYX, pOldRandomA, ulOldRandomLen),
             VOK_BYTES(RELAYX, pNewPassword, ulNewPasswordLen),
             VOK_BYTES(RELAYX, pNewPublicData, ulNewPublicDataLen),
             VOK_BYTES(RELAYX, pNewRandomA, ulNewRandomLen)}),
        ROW(CK_PBE_PARAMS, CKM_PBA_SHA1_WITH_SHA1_HMAC,
            {VOK_CHARS_ONLY(PBE, pInitVector), VOK_CHARS(PBE, pPassword, ulPasswordLen),
             VOK_CHARS(PBE, pSalt, ulSaltLen), VOK_LONG(PBE, ulIteration)}),
        // The password stays null: every byte no member names must be zero.
        ROW(CK_PKCS5_PBKD2_PARAMS, CKM_PKCS5_PBKD2,
            {VOK_LONG(PBKD2, saltSource), VOK_BYTES(PBKD2, pSaltSourceData, ulSaltSourceDataLen),
             VOK_LONG(PBKD2, iterations), VOK_LONG(PBKD2, prf),
             VOK_BYTES(PBKD2, pPrfData, ulPrfDataLen)}),
        ROW(CK_KEY_DERIVATION_STRING_DATA, CKM_XOR_BASE_AND_DATA,
            {VOK_BYTES(CK_KEY_DERIVATION_STRING_DATA, pData, ulLen)}),
        ROW(CK_KEY_WRAP_SET_OAEP_PARAMS, CKM_KEY_WRAP_SET_OAEP,
            {VOK_BYTE(CK_KEY_WRAP_SET_OAEP_PARAMS, bBC),
             VOK_BYTES(CK_KEY_WRAP_SET_OAEP_PARAMS, pX, ulXLen)}),
        ROW(CK_SSL3_MASTER_KEY_DERIVE_PARAMS, CKM_TLS_MASTER_KEY_DERIVE_DH,
            {randomInfo(offsetof(MASTER, RandomInfo)), kVersionPointer}),
        // The rule leaves the key material structure allocated.
        ROW(CK_SSL3_KEY_MAT_PARAMS, CKM_TLS_KEY_AND_MAC_DERIVE,
            {VOK_LONG(KEYMAT, ulMacSizeInBits), VOK_LONG(KEYMAT, ulKeySizeInBits),
             VOK_LONG(KEYMAT, ulIVSizeInBits), VOK_BOOL(KEYMAT, bIsExport),
             randomInfo(offsetof(KEYMAT, RandomInfo)), kKeyMaterialPointer},
            {offsetof(KEYMAT, pReturnedKeyMaterial)}),
        ROW(CK_RSA_PKCS_PSS_PARAMS, CKM_RSA_PKCS_PSS,
            {VOK_LONG(PSS, hashAlg), VOK_LONG(PSS, mgf), VOK_LONG(PSS, sLen)}),
        ROW(CK_ECDH1_DERIVE_PARAMS, CKM_ECDH1_COFACTOR_DERIVE,
            {VOK_LONG(ECDH1, kdf), VOK_BYTES(ECDH1, pSharedData, ulSharedDataLen),
             VOK_BYTES(ECDH1, pPublicData, ulPublicDataLen)}),
        ROW(CK_ECDH2_DERIVE_PARAMS, CKM_ECMQV_DERIVE,
            {VOK_LONG(ECDH2, kdf), VOK_BYTES(ECDH2, pSharedData, ulSharedDataLen),
             VOK_BYTES(ECDH2, pPublicData, ulPublicDataLen), VOK_LONG(ECDH2, ulPrivateDataLen),
             VOK_LONG(ECDH2, hPrivateData), VOK_BYTES(ECDH2, pPublicData2, ulPublicDataLen2)}),
        ROW(CK_X9_42_DH1_DERIVE_PARAMS, CKM_X9_42_DH_DERIVE,
            {VOK_LONG(DH1, kdf), VOK_BYTES(DH1, pOtherInfo, ulOtherInfoLen),
             VOK_BYTES(DH1, pPublicData, ulPublicDataLen)}),
        ROW(CK_X9_42_DH2_DERIVE_PARAMS, CKM_X9_42_MQV_DERIVE,
            {VOK_LONG(DH2, kdf), VOK_BYTES(DH2, pOtherInfo, ulOtherInfoLen),
             VOK_BYTES(DH2, pPublicData, ulPublicDataLen), VOK_LONG(DH2, ulPrivateDataLen),
             VOK_LONG(DH2, hPrivateData), VOK_BYTES(DH2, pPublicData2, ulPublicDataLen2)}),
        // The CBC encrypt-data rule frees nothing nested: pData stays allocated.
        ROW(CK_DES_CBC_ENCRYPT_DATA_PARAMS, CKM_DES_CBC_ENCRYPT_DATA,
            {VOK_BYTES(CK_DES_CBC_ENCRYPT_DATA_PARAMS, pData, length)},
            {offsetof(CK_DES_CBC_ENCRYPT_DATA_PARAMS, pData)}),
        ROW(CK_AES_CBC_ENCRYPT_DATA_PARAMS, CKM_AES_CBC_ENCRYPT_DATA,
            {VOK_BYTES(CK_AES_CBC_ENCRYPT_DATA_PARAMS, pData, length)},
            {offsetof(CK_AES_CBC_ENCRYPT_DATA_PARAMS, pData)}),
    };
    return rows;
}

const ParameterRow& rowOf(const std::string& className) {
    for (const auto& row : parameterRows())
        if (row.className == className) return row;
    throw std::logic_error("no row " + className);
}

jobject newMechanism(JNIEnv* env, CK_MECHANISM_TYPE type, jobject parameter) {
    jobject mechanism = newObject(env, "CK_MECHANISM");
    setField(env, mechanism, "mechanism", "J", jv(static_cast<jlong>(type)));
    setField(env, mechanism, "pParameter", "Ljava/lang/Object;", jv(parameter));
    return mechanism;
}

class MechanismParams : public voktest::JvmTest {
protected:
    // Converts a row's class, checks it member by member and frees it by
    // mechanism; the buffers that rule leaves are checked and released.
    void convertCheckAndFree(const ParameterRow& row, CK_MECHANISM_TYPE mechanism,
                             const std::vector<std::size_t>& leftAllocated) {
        std::string where = std::string(row.className) + " freed as " + std::to_string(mechanism);
        TrackedAllocations tracked;
        int seed = 0;
        jobject jParam = buildJava(env_, row.className, row.members, seed);
        CK_MECHANISM ck = jMechanismToCKMechanism(env_, newMechanism(env_, mechanism, jParam));
        ASSERT_FALSE(env_->ExceptionCheck()) << where;
        EXPECT_EQ(ck.mechanism, mechanism);
        ASSERT_EQ(ck.ulParameterLen, row.size) << where;
        seed = 0;
        checkNative(ck.pParameter, row.size, row.members, seed, tracked, where);

        std::vector<void*> left;
        for (std::size_t offset : leftAllocated) left.push_back(readAt<void*>(ck.pParameter, offset));
        freeCKMechanismParameter(&ck);
        EXPECT_EQ(tracked.live(), left.size()) << where;
        for (void* buffer : left) {
            EXPECT_NE(tracked.sizeOf(buffer), 0u) << where << ": a buffer the rule keeps was freed";
            tracked.release(buffer);
        }
    }
};

TEST_F(MechanismParams, EachClassMatchesItsPackedLayoutAndIsFreedByItsMechanism) {
    for (const auto& row : parameterRows())
        convertCheckAndFree(row, row.mechanism, row.leftAllocated);
}

TEST_F(MechanismParams, AClassIsFreedByTheMechanismTypesRuleNotByItsOwn) {
    struct {
        const char* className;
        CK_MECHANISM_TYPE mechanism;
        std::vector<std::size_t> leftAllocated;
    } cases[] = {
        // No rule for plain RSA: the OAEP source data stays.
        {"CK_RSA_PKCS_OAEP_PARAMS", CKM_RSA_PKCS, {offsetof(CK_RSA_PKCS_OAEP_PARAMS, pSourceData)}},
        // The DH2 rule's third buffer lies past this smaller structure: not read.
        {"CK_ECDH1_DERIVE_PARAMS", CKM_ECMQV_DERIVE, {}},
        {"CK_X9_42_DH1_DERIVE_PARAMS", CKM_ECDH1_DERIVE, {}},
        // Same layout as the ECB string data, but the CBC rule keeps pData.
        {"CK_KEY_DERIVATION_STRING_DATA",
         CKM_AES_CBC_ENCRYPT_DATA,
         {offsetof(CK_KEY_DERIVATION_STRING_DATA, pData)}},
    };
    for (const auto& c : cases)
        convertCheckAndFree(rowOf(c.className), c.mechanism, c.leftAllocated);
}

TEST_F(MechanismParams, PlainParametersAndTheirLengths) {
    int seed = 0;  // major 0x80, minor 0x81
    jobject version = buildJava(env_, "CK_VERSION",
                                {VOK_BYTE(CK_VERSION, major), VOK_BYTE(CK_VERSION, minor)}, seed);
    uint64_t longValue = 0x1122334455667788;
    struct {
        const char* what;
        jobject parameter;
        Bytes expected;  // empty: null parameter
        const char* exception = nullptr;
    } cases[] = {
        // clang-format off
        {"none", nullptr, {}},
        {"byte[] as is", newBytes(env_, {9, 8, 7}), {9, 8, 7}},
        {"Long", newBoxed(env_, "java/lang/Long", "(J)V", jv(jlong(longValue))),
         nativeBytes(&longValue, 8)},
        {"CK_VERSION", version, {0x80, 0x81}},
        {"Boolean, as any value", newBoxed(env_, "java/lang/Boolean", "(Z)V", jv(jboolean(1))),
         {1}},
        {"unknown class", newObject(env_, "java/lang/Object"), {},
         "com.vok.smartcard.pkcs11.PKCS11RuntimeException"},
        // clang-format on
    };
    for (const auto& c : cases) {
        TrackedAllocations tracked;
        CK_MECHANISM ck =
            jMechanismToCKMechanism(env_, newMechanism(env_, CKM_AES_CBC, c.parameter));
        EXPECT_EQ(takePendingException(env_).className, c.exception ? c.exception : "") << c.what;
        EXPECT_EQ(ck.mechanism, CKM_AES_CBC);
        EXPECT_EQ(ck.ulParameterLen, c.expected.size()) << c.what;
        EXPECT_EQ(nativeBytes(ck.pParameter, c.expected.size()), c.expected) << c.what;
        EXPECT_TRUE(!c.expected.empty() || ck.pParameter == nullptr) << c.what;
        freeCKMechanismParameter(&ck);
        EXPECT_EQ(tracked.live(), 0u) << c.what;
    }
    jMechanismToCKMechanism(env_, nullptr);
    EXPECT_EQ(takePendingException(env_).className, "java.lang.NullPointerException");
}

TEST_F(MechanismParams, CbcEncryptDataIvIsCutToTheMember) {
    for (int ivLength : {8, 16, 40}) {
        TrackedAllocations tracked;
        Bytes iv(ivLength);
        for (int i = 0; i < ivLength; ++i) iv[i] = static_cast<uint8_t>(0xA0 + i);
        for (const char* cls :
             {"CK_DES_CBC_ENCRYPT_DATA_PARAMS", "CK_AES_CBC_ENCRYPT_DATA_PARAMS"}) {
            jobject jParam = newObject(env_, cls);
            setField(env_, jParam, "iv", "[B", jv(newBytes(env_, iv)));
            void* native = nullptr;
            CK_ULONG length = 0;
            jMechanismParameterToCKMechanismParameter(env_, jParam, &native, &length);
            std::size_t member = length == sizeof(CK_DES_CBC_ENCRYPT_DATA_PARAMS) ? 8 : 16;
            Bytes expected(iv.begin(), iv.begin() + std::min<std::size_t>(member, ivLength));
            expected.resize(member);
            EXPECT_EQ(nativeBytes(native, member), expected) << cls << " " << ivLength;
            // The member is followed by pData, null here: nothing spilled into it.
            EXPECT_EQ(readAt<void*>(native, member), nullptr) << cls << " " << ivLength;
            tracked.release(native);
        }
        EXPECT_EQ(tracked.live(), 0u) << "the temporary iv buffer is freed";
    }
}

TEST_F(MechanismParams, KeyMaterialThatCannotBeAllocatedLeavesTheRest) {
    TrackedAllocations tracked;
    jobject jParam = newObject(env_, "CK_SSL3_KEY_MAT_PARAMS");
    setField(env_, jParam, "ulKeySizeInBits", "J", jv(jlong(128)));
    tracked.failAllocation(2);  // the structure, then the key material
    void* native = nullptr;
    CK_ULONG length = 0;
    jMechanismParameterToCKMechanismParameter(env_, jParam, &native, &length);
    EXPECT_EQ(takePendingException(env_).className, "java.lang.OutOfMemoryError");
    ASSERT_NE(native, nullptr);
    EXPECT_EQ(static_cast<CK_SSL3_KEY_MAT_PARAMS*>(native)->ulKeySizeInBits, 128u);
    EXPECT_EQ(readAt<void*>(native, offsetof(CK_SSL3_KEY_MAT_PARAMS, pReturnedKeyMaterial)), nullptr);
    CK_MECHANISM ck{CKM_SSL3_KEY_AND_MAC_DERIVE, native, length};
    freeCKMechanismParameter(&ck);

    // Through the mechanism, the half-made parameter is freed before return.
    tracked.failAllocation(2);
    ck = jMechanismToCKMechanism(env_, newMechanism(env_, CKM_SSL3_KEY_AND_MAC_DERIVE, jParam));
    EXPECT_EQ(takePendingException(env_).className, "java.lang.OutOfMemoryError");
    EXPECT_EQ(ck.pParameter, nullptr);
    EXPECT_EQ(tracked.live(), 0u);
}

// ---- Copy-backs ---------------------------------------------------------------

TEST_F(MechanismParams, CopyBacksActOnlyWhenTheJavaMechanismMatches) {
    using PBE = CK_PBE_PARAMS;
    using SET = CK_KEY_WRAP_SET_OAEP_PARAMS;
    // The module's results are the Java values inverted; each copy-back
    // brings back every member listed (PBE: see below).
    struct {
        void (*copyBack)(JNIEnv*, CK_MECHANISM_PTR, jobject);
        CK_MECHANISM_TYPE mechanism, tls;  // tls: its variant that gets nothing back
        const char* className;
        std::vector<Member> members;
    } rows[] = {
        // clang-format off
        {copyBackPBEInitializationVector, CKM_PBE_SHA1_CAST5_CBC, CKM_PBE_SHA1_CAST5_CBC,
         "CK_PBE_PARAMS", {VOK_CHARS_ONLY(PBE, pInitVector), {Kind::Chars, "pInitVektor", 0}}},
        {copyBackSetUnwrappedKey, CKM_KEY_WRAP_SET_OAEP, CKM_KEY_WRAP_SET_OAEP,
         "CK_KEY_WRAP_SET_OAEP_PARAMS", {VOK_BYTE(SET, bBC), VOK_BYTES(SET, pX, ulXLen)}},
        {copyBackClientVersion, CKM_SSL3_MASTER_KEY_DERIVE, CKM_TLS_MASTER_KEY_DERIVE,
         "CK_SSL3_MASTER_KEY_DERIVE_PARAMS", {kVersionPointer}},
        {copyBackSSLKeyMatParams, CKM_SSL3_KEY_AND_MAC_DERIVE, CKM_TLS_KEY_AND_MAC_DERIVE,
         "CK_SSL3_KEY_MAT_PARAMS", {kKeyMaterialPointer}},
        // clang-format on
    };
    for (const auto& row : rows) {
        struct {
            const char* how;
            CK_MECHANISM_TYPE native, java;
            bool copied;
        } variants[] = {{"matching", row.mechanism, row.mechanism, true},
                        {"not matching", row.mechanism, row.mechanism + 1, false},
                        {"TLS", row.tls, row.tls, row.tls == row.mechanism}};
        for (const auto& v : variants) {
            std::string where = std::string(row.className) + ", " + v.how;
            TrackedAllocations tracked;
            int seed = 0;
            jobject jParam = buildJava(env_, row.className, row.members, seed);
            CK_MECHANISM ck = jMechanismToCKMechanism(env_, newMechanism(env_, v.native, jParam));
            ASSERT_FALSE(env_->ExceptionCheck()) << where;
            bool pbe = row.copyBack == copyBackPBEInitializationVector;
            seed = 0;
            invertNative(ck.pParameter, pbe ? std::vector<Member>{row.members[0]} : row.members,
                         seed);
            row.copyBack(env_, &ck, newMechanism(env_, v.java, jParam));
            EXPECT_FALSE(env_->ExceptionCheck()) << where;
            seed = 0;
            if (!pbe) {
                checkJavaValues(env_, jParam, row.members, seed, v.copied, where);
            } else {
                // The IV goes out in pInitVector and comes back in pInitVektor,
                // as far as the shorter of the two reaches, widened without sign.
                jobject back = getField(env_, jParam, "pInitVektor", "[C").l;
                EXPECT_EQ(charsOf(env_, back),
                          v.copied ? u"\u00ff\u00fe\u2a12" : u"\u2a10\u2a11\u2a12")
                    << where;
                checkJavaValues(env_, jParam, {row.members[0]}, seed, false, where);
            }
            void* keyMaterialLeft = row.mechanism == CKM_SSL3_KEY_AND_MAC_DERIVE
                                        ? readAt<void*>(ck.pParameter, kKeyMaterialPointer.offset)
                                        : nullptr;
            freeCKMechanismParameter(&ck);
            tracked.release(keyMaterialLeft);
        }
    }
}

TEST_F(MechanismParams, PbeCopyBackWithoutTargetArrayCopiesNothing) {
    int seed = 0;
    jobject jParam = buildJava(env_, "CK_PBE_PARAMS", {{Kind::Chars, "pInitVector", 0}}, seed);
    jobject jMechanism = newMechanism(env_, CKM_PBE_MD2_DES_CBC, jParam);
    CK_MECHANISM ck = jMechanismToCKMechanism(env_, jMechanism);
    copyBackPBEInitializationVector(env_, &ck, jMechanism);
    EXPECT_FALSE(env_->ExceptionCheck());
    EXPECT_EQ(getField(env_, jParam, "pInitVektor", "[C").l, nullptr);
    freeCKMechanismParameter(&ck);
}

TEST_F(MechanismParams, Rc2CbcParametersStopTheProcess) {
    // A child process of its own (gtest re-runs this test there) takes the trap.
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    EXPECT_EXIT(
        {
            // The VM's own handler would turn the trap into a crash report.
            std::signal(SIGILL, SIG_DFL);
            jMechanismToCKMechanism(
                env_, newMechanism(env_, CKM_RC2_CBC, newObject(env_, "CK_RC2_CBC_PARAMS")));
        },
        ::testing::KilledBySignal(SIGILL), "");
}

}  // namespace
