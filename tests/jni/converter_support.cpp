#include "converter_support.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <cstring>
#include <map>

namespace convtest {
namespace {

std::map<void*, std::size_t> gLive;
int gCountdown = 0;  // the allocation that fails, counted down; 0: none
int gStrays = 0;
int gOverruns = 0;

// Each buffer is followed by guard bytes: a write past its end shows when it
// is freed, without the address sanitizer.
constexpr std::size_t kGuard = 16;
constexpr uint8_t kGuardByte = 0xA5;

bool guardIntact(void* buffer, std::size_t size) {
    const auto* guard = static_cast<const uint8_t*>(buffer) + size;
    for (std::size_t i = 0; i < kGuard; ++i)
        if (guard[i] != kGuardByte) return false;
    return true;
}

void* trackedAlloc(std::size_t size) {
    if (gCountdown > 0 && --gCountdown == 0) return nullptr;
    void* buffer = std::malloc(size + kGuard);
    std::memset(static_cast<uint8_t*>(buffer) + size, kGuardByte, kGuard);
    gLive[buffer] = size;
    return buffer;
}

void trackedFree(void* buffer) {
    if (buffer == nullptr) return;
    // A pointer never handed out is counted, not freed: the case then fails
    // instead of the process.
    auto found = gLive.find(buffer);
    if (found == gLive.end()) {
        ++gStrays;
        return;
    }
    if (!guardIntact(buffer, found->second)) ++gOverruns;
    gLive.erase(found);
    std::free(buffer);
}

std::string fullName(const char* className) {
    return std::strchr(className, '/') != nullptr || className[0] == '['
               ? className
               : std::string("com/vok/smartcard/pkcs11/") + className;
}

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

void cover(std::vector<bool>& covered, std::size_t from, std::size_t count) {
    for (std::size_t i = from; i < from + count && i < covered.size(); ++i) covered[i] = true;
}

std::string nestedSignature(const Member& m) { return "L" + fullName(m.className) + ";"; }

void checkMembers(const uint8_t* base, std::vector<bool>& covered, std::size_t at,
                  const std::vector<Member>& members, int& seed, const TrackedAllocations& tracked,
                  const std::string& where) {
    for (const Member& m : members) {
        std::string what = where + "." + m.name;
        std::size_t o = at + m.offset;
        int s = seed++;
        if (m.kind == Kind::Long) {
            EXPECT_EQ(readAt<CK_ULONG>(base, o), static_cast<CK_ULONG>(longValue(s))) << what;
            cover(covered, o, sizeof(CK_ULONG));
        } else if (m.kind == Kind::Bool || m.kind == Kind::Byte) {
            EXPECT_EQ(base[o], m.kind == Kind::Bool ? 1 : byteValue(s)) << what;
            cover(covered, o, 1);
        } else if (m.kind == Kind::Embedded) {
            checkMembers(base, covered, o, m.members, seed, tracked, what);
        } else {
            // A buffer or a structure behind a pointer, of its own exact size.
            auto* data = readAt<uint8_t*>(base, o);
            cover(covered, o, sizeof data);
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
                cover(covered, at + m.lengthOffset, sizeof(CK_ULONG));
            }
        }
    }
}

}  // namespace

TrackedAllocations::TrackedAllocations() {
    gLive.clear();
    gCountdown = 0;
    gStrays = 0;
    gConverterAlloc = trackedAlloc;
    gConverterFree = trackedFree;
}

TrackedAllocations::~TrackedAllocations() {
    gConverterAlloc = std::malloc;
    gConverterFree = std::free;
    for (auto& entry : gLive) {
        if (!guardIntact(entry.first, entry.second)) ++gOverruns;
        std::free(entry.first);
    }
    gLive.clear();
    EXPECT_EQ(gOverruns, 0) << "a converter wrote past a buffer it allocated";
    EXPECT_EQ(gStrays, 0) << "a pointer was freed that the converters never handed out";
}

void TrackedAllocations::failAllocation(int nth) { gCountdown = nth; }
std::size_t TrackedAllocations::live() const { return gLive.size(); }
std::size_t TrackedAllocations::sizeOf(const void* buffer) const {
    auto found = gLive.find(const_cast<void*>(buffer));
    return found != gLive.end() ? found->second : 0;
}
void TrackedAllocations::release(void* buffer) { trackedFree(buffer); }

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

void setField(JNIEnv* env, jobject object, const char* name, const char* signature, jvalue value) {
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

bool isA(JNIEnv* env, jobject object, const char* className) {
    jclass cls = env->FindClass(fullName(className).c_str());
    bool result = object != nullptr && cls != nullptr && env->IsInstanceOf(object, cls);
    env->DeleteLocalRef(cls);
    return result;
}

Bytes nativeBytes(const void* data, std::size_t size) {
    const auto* bytes = static_cast<const uint8_t*>(data);
    return bytes != nullptr ? Bytes(bytes, bytes + size) : Bytes();
}

Member member(Kind kind, const char* name, std::size_t offset, std::size_t lengthOffset,
              std::size_t size) {
    return Member{kind, name, offset, lengthOffset, size};
}

Member version(const char* name, std::size_t offset) {
    return Member{Kind::Embedded,
                  name,
                  offset,
                  kNoLength,
                  sizeof(CK_VERSION),
                  "CK_VERSION",
                  {member(Kind::Byte, "major", 0), member(Kind::Byte, "minor", 1)}};
}

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
                 int& seed, const TrackedAllocations& tracked, const std::string& where) {
    std::vector<bool> covered(size);
    checkMembers(static_cast<const uint8_t*>(native), covered, 0, members, seed, tracked, where);
    for (std::size_t i = 0; i < size; ++i)
        if (!covered[i]) {
            EXPECT_EQ(static_cast<const uint8_t*>(native)[i], 0) << where << " byte " << i;
        }
}

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

void checkJavaValues(JNIEnv* env, jobject object, const std::vector<Member>& members, int& seed,
                     bool inverted, const std::string& where) {
    ASSERT_NE(object, nullptr) << where;
    for (const Member& m : members) {
        std::string what = where + "." + m.name;
        int s = seed++;
        auto invert = [inverted](Bytes b) {
            for (uint8_t& x : b) x = static_cast<uint8_t>(inverted ? ~x : x);
            return b;
        };
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

}  // namespace convtest
