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
                  const std::vector<Member>& members, int& seed,
                  const TrackedAllocations& tracked, const std::string& where) {
    for (const Member& m : members) {
        std::string what = where + "." + m.name;
        std::size_t o = at + m.offset;
        int s = seed++;
        switch (m.kind) {
            case Kind::Long:
                EXPECT_EQ(readAt<CK_ULONG>(base, o), static_cast<CK_ULONG>(longValue(s))) << what;
                cover(covered, o, sizeof(CK_ULONG));
                break;
            case Kind::Bool:
            case Kind::Byte:
                EXPECT_EQ(base[o], m.kind == Kind::Bool ? 1 : byteValue(s)) << what;
                cover(covered, o, 1);
                break;
            case Kind::Bytes:
            case Kind::Chars: {
                auto* data = readAt<uint8_t*>(base, o);
                Bytes expected = bytesValue(s);
                ASSERT_NE(data, nullptr) << what;
                EXPECT_EQ(tracked.sizeOf(data), expected.size()) << what;
                EXPECT_EQ(nativeBytes(data, expected.size()), expected) << what;
                cover(covered, o, sizeof data);
                if (m.lengthOffset != kNoLength) {
                    EXPECT_EQ(readAt<CK_ULONG>(base, at + m.lengthOffset), expected.size()) << what;
                    cover(covered, at + m.lengthOffset, sizeof(CK_ULONG));
                }
                break;
            }
            case Kind::Embedded:
                checkMembers(base, covered, o, m.members, seed, tracked, what);
                break;
            case Kind::Pointed: {
                auto* pointed = readAt<uint8_t*>(base, o);
                cover(covered, o, sizeof pointed);
                ASSERT_NE(pointed, nullptr) << what;
                EXPECT_EQ(tracked.sizeOf(pointed), m.size) << what;
                checkNative(pointed, m.size, m.members, seed, tracked, what);
                break;
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

void setField(JNIEnv* env, jobject object, const char* name, const char* signature,
              jvalue value) {
    jclass cls = env->GetObjectClass(object);
    jfieldID id = env->GetFieldID(cls, name, signature);
    ASSERT_NE(id, nullptr) << name;
    switch (signature[0]) {
        case 'J': env->SetLongField(object, id, value.j); break;
        case 'Z': env->SetBooleanField(object, id, value.z); break;
        case 'B': env->SetByteField(object, id, value.b); break;
        default: env->SetObjectField(object, id, value.l); break;
    }
    env->DeleteLocalRef(cls);
}

jvalue getField(JNIEnv* env, jobject object, const char* name, const char* signature) {
    jvalue value{};
    jclass cls = env->GetObjectClass(object);
    jfieldID id = env->GetFieldID(cls, name, signature);
    env->DeleteLocalRef(cls);
    if (id == nullptr) {
        ADD_FAILURE() << "no field " << name;
        env->ExceptionClear();
        return value;
    }
    switch (signature[0]) {
        case 'J': value.j = env->GetLongField(object, id); break;
        case 'Z': value.z = env->GetBooleanField(object, id); break;
        case 'B': value.b = env->GetByteField(object, id); break;
        default: value.l = env->GetObjectField(object, id); break;
    }
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

std::string classNameOf(JNIEnv* env, jobject object) {
    if (object == nullptr) return "null";
    jclass cls = env->GetObjectClass(object);
    jclass classClass = env->GetObjectClass(cls);
    auto name = static_cast<jstring>(env->CallObjectMethod(
        cls, env->GetMethodID(classClass, "getName", "()Ljava/lang/String;")));
    if (env->ExceptionCheck()) return "exception";
    const char* chars = env->GetStringUTFChars(name, nullptr);
    std::string result = chars;
    env->ReleaseStringUTFChars(name, chars);
    env->DeleteLocalRef(name);
    env->DeleteLocalRef(classClass);
    env->DeleteLocalRef(cls);
    return result;
}

Bytes nativeBytes(const void* data, std::size_t size) {
    const auto* bytes = static_cast<const uint8_t*>(data);
    return bytes != nullptr ? Bytes(bytes, bytes + size) : Bytes();
}

jobject buildJava(JNIEnv* env, const char* className, const std::vector<Member>& members,
                  int& seed) {
    jobject object = newObject(env, className);
    for (const Member& m : members) {
        int s = seed++;
        jvalue v{};
        std::string signature;
        switch (m.kind) {
            case Kind::Long: v.j = longValue(s); signature = "J"; break;
            case Kind::Bool: v.z = JNI_TRUE; signature = "Z"; break;
            case Kind::Byte: v.b = static_cast<jbyte>(byteValue(s)); signature = "B"; break;
            case Kind::Bytes: v.l = newBytes(env, bytesValue(s)); signature = "[B"; break;
            case Kind::Chars: v.l = newChars(env, charsValue(s)); signature = "[C"; break;
            case Kind::Embedded:
            case Kind::Pointed:
                v.l = buildJava(env, m.className, m.members, seed);
                signature = nestedSignature(m);
                break;
        }
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

void checkJava(JNIEnv* env, jobject object, const void* native, std::size_t size,
               const std::vector<Member>& members, const std::string& where) {
    ASSERT_NE(object, nullptr) << where;
    std::size_t covered = 0;
    for (const Member& m : members) {
        std::string what = where + "." + m.name;
        switch (m.kind) {
            case Kind::Long:
                EXPECT_EQ(static_cast<CK_ULONG>(getField(env, object, m.name, "J").j),
                          readAt<CK_ULONG>(native, m.offset))
                    << what;
                covered += sizeof(CK_ULONG);
                break;
            case Kind::Byte:
                EXPECT_EQ(static_cast<uint8_t>(getField(env, object, m.name, "B").b),
                          readAt<uint8_t>(native, m.offset))
                    << what;
                covered += 1;
                break;
            case Kind::Chars: {
                jobject chars = getField(env, object, m.name, "[C").l;
                std::u16string expected;
                for (uint8_t b : nativeBytes(static_cast<const uint8_t*>(native) + m.offset, m.size))
                    expected += static_cast<char16_t>(b);
                EXPECT_EQ(charsOf(env, chars), expected) << what;
                env->DeleteLocalRef(chars);
                covered += m.size;
                break;
            }
            case Kind::Embedded: {
                jobject nested = getField(env, object, m.name, nestedSignature(m).c_str()).l;
                checkJava(env, nested, static_cast<const uint8_t*>(native) + m.offset, m.size,
                          m.members, what);
                env->DeleteLocalRef(nested);
                covered += m.size;
                break;
            }
            default:
                ADD_FAILURE() << what << ": kind not used for information structures";
        }
    }
    EXPECT_EQ(covered, size) << where << ": the table leaves members out";
}

}  // namespace convtest
