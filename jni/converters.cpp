// Java arrays, strings and boxed values to native buffers and back, and the
// PKCS#11 information structures as Java objects.

#define LOG_TAG "[native jni pkcs11wrapper]"
#include "converters.h"

#include <algorithm>
#include <cstdint>
#include <cstring>
#include <string>

#include "exceptions.h"
#include "java_objects.h"
#include "vok_log.h"

using vokjni::allocArray;
using vokjni::allocZeroed;
using vokjni::fitsJavaArray;
using vokjni::LocalRef;
using vokjni::ObjectBuilder;
using vokjni::ObjectFields;
using vokjni::throwOutOfMemoryUnlessPending;

static_assert(sizeof(jlong) == sizeof(CK_ULONG), "a Java long carries a CK_ULONG whole");

namespace {

void clearOutputs(void* pointerOut, CK_ULONG_PTR lengthOut) {
    std::memset(pointerOut, 0, sizeof(void*));
    *lengthOut = 0;
}

// The shape every array converter shares: the Java elements are copied into a
// temporary buffer with one region copy (first allocation), then widened or
// narrowed into the native buffer (second allocation).
template <typename JArray, typename JElement, typename CKElement, typename Read, typename Convert>
int convertArray(JNIEnv* env, JArray jArray, CKElement** ckpArray, CK_ULONG_PTR ckpLength,
                 Read read, Convert convert) {
    *ckpArray = nullptr;
    *ckpLength = 0;
    if (jArray == nullptr) return CK_CONVERSION_OK;
    jsize length = env->GetArrayLength(jArray);
    auto* temp = static_cast<JElement*>(allocArray(length, sizeof(JElement)));
    if (temp == nullptr) {
        throwOutOfMemoryError(env);
        return CK_CONVERSION_FIRST_ALLOCATION_FAILED;
    }
    read(jArray, length, temp);
    if (env->ExceptionCheck()) {
        gConverterFree(temp);
        return CK_CONVERSION_FIRST_ALLOCATION_FAILED;
    }
    auto* out = static_cast<CKElement*>(allocArray(length, sizeof(CKElement)));
    if (out == nullptr) {
        gConverterFree(temp);
        throwOutOfMemoryError(env);
        return CK_CONVERSION_SECOND_ALLOCATION_FAILED;
    }
    for (jsize i = 0; i < length; ++i) out[i] = convert(temp[i]);
    gConverterFree(temp);
    *ckpArray = out;
    *ckpLength = static_cast<CK_ULONG>(length);
    return CK_CONVERSION_OK;
}

bool isInstanceOf(JNIEnv* env, jobject object, const char* className) {
    LocalRef<jclass> cls(env, env->FindClass(className));
    return cls.get() != nullptr && env->IsInstanceOf(object, cls.get()) == JNI_TRUE;
}

// Calls a no-argument value method ("booleanValue", "()Z") on a boxed value
// whose class is looked up by name; false with an exception pending when the
// class or method is unknown.
template <typename Result, typename Call>
bool callValueMethod(JNIEnv* env, jobject object, const char* className, const char* method,
                     const char* signature, Call call, Result* result) {
    LocalRef<jclass> cls(env, env->FindClass(className));
    if (cls.get() == nullptr) return false;
    jmethodID id = env->GetMethodID(cls.get(), method, signature);
    if (id == nullptr) return false;
    *result = (env->*call)(object, id);
    return !env->ExceptionCheck();
}

// One native value of type T in a new buffer, or null with an exception pending.
template <typename T>
T* newValue(JNIEnv* env, T value) {
    auto* out = static_cast<T*>(allocZeroed(sizeof(T)));
    if (out == nullptr) {
        throwOutOfMemoryError(env);
        return nullptr;
    }
    *out = value;
    return out;
}

// A new boxed value through its constructor.
template <typename Arg>
jobject newBoxed(JNIEnv* env, const char* className, const char* signature, Arg value) {
    LocalRef<jclass> cls(env, env->FindClass(className));
    if (cls.get() == nullptr) return nullptr;
    jmethodID constructor = env->GetMethodID(cls.get(), "<init>", signature);
    if (constructor == nullptr) return nullptr;
    jobject boxed = env->NewObject(cls.get(), constructor, value);
    return env->ExceptionCheck() ? nullptr : boxed;
}

}  // namespace

// ---- Java to native: arrays and strings -----------------------------------

int jByteArrayToCKByteArray(JNIEnv* env, jbyteArray jArray, CK_BYTE_PTR* ckpArray,
                            CK_ULONG_PTR ckpLength) {
    *ckpArray = nullptr;
    *ckpLength = 0;
    if (jArray == nullptr) return CK_CONVERSION_OK;
    // Bytes need no widening: the region copy goes straight into the output.
    jsize length = env->GetArrayLength(jArray);
    auto* out = static_cast<CK_BYTE_PTR>(allocZeroed(length));
    if (out == nullptr) {
        throwOutOfMemoryError(env);
        return CK_CONVERSION_FIRST_ALLOCATION_FAILED;
    }
    env->GetByteArrayRegion(jArray, 0, length, reinterpret_cast<jbyte*>(out));
    if (env->ExceptionCheck()) {
        gConverterFree(out);
        return CK_CONVERSION_FIRST_ALLOCATION_FAILED;
    }
    *ckpArray = out;
    *ckpLength = static_cast<CK_ULONG>(length);
    VOK_LOGD("ckpLength:%llu", static_cast<unsigned long long>(*ckpLength));
    return CK_CONVERSION_OK;
}

int jCharArrayToCKCharArray(JNIEnv* env, jcharArray jArray, CK_CHAR_PTR* ckpArray,
                            CK_ULONG_PTR ckpLength) {
    return convertArray<jcharArray, jchar>(
        env, jArray, ckpArray, ckpLength,
        [env](jcharArray a, jsize n, jchar* to) { env->GetCharArrayRegion(a, 0, n, to); },
        [](jchar c) { return static_cast<CK_CHAR>(c); });
}

// Both names are one function: callers may compare or look up either.
int jCharArrayToCKUTF8CharArray(JNIEnv* env, jcharArray jArray, CK_UTF8CHAR_PTR* ckpArray,
                                CK_ULONG_PTR ckpLength)
    __attribute__((alias("jCharArrayToCKCharArray")));

int jBooleanArrayToCKBBoolArray(JNIEnv* env, jbooleanArray jArray, CK_BBOOL_PTR* ckpArray,
                                CK_ULONG_PTR ckpLength) {
    return convertArray<jbooleanArray, jboolean>(
        env, jArray, ckpArray, ckpLength,
        [env](jbooleanArray a, jsize n, jboolean* to) { env->GetBooleanArrayRegion(a, 0, n, to); },
        [](jboolean b) { return static_cast<CK_BBOOL>(b == 1 ? CK_TRUE : CK_FALSE); });
}

int jLongArrayToCKULongArray(JNIEnv* env, jlongArray jArray, CK_ULONG_PTR* ckpArray,
                             CK_ULONG_PTR ckpLength) {
    if (jArray != nullptr && isInstanceOf(env, jArray, "[I")) {
        // An int[] taken for a long[]: the elements are what reading the
        // int[]'s memory as 64-bit values gives (two ints per element, low
        // one first on this little-endian target). Only the int[]'s own 4*n
        // bytes are read; the rest of the n elements stays zero.
        return convertArray<jlongArray, jlong>(
            env, jArray, ckpArray, ckpLength,
            [env](jlongArray a, jsize n, jlong* to) {
                env->GetIntArrayRegion(reinterpret_cast<jintArray>(a), 0, n,
                                       reinterpret_cast<jint*>(to));
            },
            [](jlong l) { return static_cast<CK_ULONG>(l); });
    }
    if (env->ExceptionCheck()) {
        clearOutputs(ckpArray, ckpLength);
        return CK_CONVERSION_FIRST_ALLOCATION_FAILED;
    }
    return convertArray<jlongArray, jlong>(
        env, jArray, ckpArray, ckpLength,
        [env](jlongArray a, jsize n, jlong* to) { env->GetLongArrayRegion(a, 0, n, to); },
        [](jlong l) { return static_cast<CK_ULONG>(l); });
}

int jStringToCKUTF8CharArray(JNIEnv* env, jstring jString, CK_UTF8CHAR_PTR* ckpString,
                             CK_ULONG_PTR ckpLength) {
    *ckpString = nullptr;
    *ckpLength = 0;
    if (jString == nullptr) return CK_CONVERSION_OK;
    const char* chars = env->GetStringUTFChars(jString, nullptr);
    if (chars == nullptr) {
        // The VM has already raised OutOfMemoryError.
        throwOutOfMemoryUnlessPending(env);
        return CK_CONVERSION_FIRST_ALLOCATION_FAILED;
    }
    std::size_t length = std::strlen(chars);
    auto* out = static_cast<CK_UTF8CHAR_PTR>(allocArray(length + 1, 1));
    if (out == nullptr) {
        env->ReleaseStringUTFChars(jString, chars);
        throwOutOfMemoryError(env);
        return CK_CONVERSION_SECOND_ALLOCATION_FAILED;
    }
    std::memcpy(out, chars, length + 1);
    env->ReleaseStringUTFChars(jString, chars);
    *ckpString = out;
    *ckpLength = length;
    return CK_CONVERSION_OK;
}

// ---- Java to native: single values ----------------------------------------

CK_BBOOL_PTR jBooleanObjectToCKBBoolPtr(JNIEnv* env, jobject jBoolean) {
    jboolean value = JNI_FALSE;
    if (!callValueMethod(env, jBoolean, "java/lang/Boolean", "booleanValue", "()Z",
                         &JNIEnv::CallBooleanMethod, &value))
        return nullptr;
    return newValue<CK_BBOOL>(env, value == 1 ? CK_TRUE : CK_FALSE);
}

CK_BYTE_PTR jByteObjectToCKBytePtr(JNIEnv* env, jobject jByte) {
    jbyte value = 0;
    if (!callValueMethod(env, jByte, "java/lang/Byte", "byteValue", "()B", &JNIEnv::CallByteMethod,
                         &value))
        return nullptr;
    return newValue<CK_BYTE>(env, static_cast<CK_BYTE>(value));
}

CK_CHAR_PTR jCharObjectToCKCharPtr(JNIEnv* env, jobject jCharacter) {
    jchar value = 0;
    // "java/lang/Char" is the name this system has always looked up; the VM
    // answers NoClassDefFoundError, which the caller sees pending.
    if (!callValueMethod(env, jCharacter, "java/lang/Char", "charValue", "()C",
                         &JNIEnv::CallCharMethod, &value))
        return nullptr;
    return newValue<CK_CHAR>(env, static_cast<CK_CHAR>(value));
}

CK_ULONG_PTR jIntegerObjectToCKULongPtr(JNIEnv* env, jobject jInteger) {
    jint value = 0;
    if (!callValueMethod(env, jInteger, "java/lang/Integer", "intValue", "()I",
                         &JNIEnv::CallIntMethod, &value))
        return nullptr;
    return newValue<CK_ULONG>(env, static_cast<CK_ULONG>(static_cast<jlong>(value)));
}

CK_ULONG_PTR jLongObjectToCKULongPtr(JNIEnv* env, jobject jLong) {
    jlong value = 0;
    if (!callValueMethod(env, jLong, "java/lang/Long", "longValue", "()J", &JNIEnv::CallLongMethod,
                         &value))
        return nullptr;
    return newValue<CK_ULONG>(env, static_cast<CK_ULONG>(value));
}

CK_VERSION_PTR jVersionToCKVersionPtr(JNIEnv* env, jobject jVersion) {
    if (jVersion == nullptr) return nullptr;
    ObjectFields reader(env, jVersion);
    CK_VERSION version{};
    version.major = static_cast<CK_BYTE>(reader.getByte("major"));
    version.minor = static_cast<CK_BYTE>(reader.getByte("minor"));
    if (reader.failed()) return nullptr;
    return newValue<CK_VERSION>(env, version);
}

CK_DATE* jDateObjectPtrToCKDatePtr(JNIEnv* env, jobject jDate) {
    if (jDate == nullptr) return nullptr;
    // Zero-filled, so a field shorter than its size ends in zero bytes.
    auto* date = static_cast<CK_DATE*>(allocZeroed(sizeof(CK_DATE)));
    if (date == nullptr) {
        throwOutOfMemoryError(env);
        return nullptr;
    }
    ObjectFields reader(env, jDate);
    struct {
        const char* name;
        CK_CHAR* to;
        std::size_t size;
    } fields[] = {{"year", date->year, sizeof date->year},
                  {"month", date->month, sizeof date->month},
                  {"day", date->day, sizeof date->day}};
    for (const auto& f : fields) {
        // Only the first chars that fit: a longer Java array is cut.
        CK_CHAR_PTR chars = nullptr;
        CK_ULONG length = 0;
        LocalRef<jcharArray> array(env, static_cast<jcharArray>(reader.getObject(f.name, "[C")));
        if (reader.failed() || jCharArrayToCKCharArray(env, array.get(), &chars, &length) != 0)
            break;
        if (chars != nullptr) std::memcpy(f.to, chars, std::min<CK_ULONG>(length, f.size));
        gConverterFree(chars);
    }
    if (reader.failed()) {
        gConverterFree(date);
        return nullptr;
    }
    return date;
}

// ---- Native to Java ---------------------------------------------------------

jbyteArray ckByteArrayToJByteArray(JNIEnv* env, const CK_BYTE* ckpArray, CK_ULONG ckLength) {
    if (!fitsJavaArray(env, ckLength)) return nullptr;
    auto length = static_cast<jsize>(ckLength);
    jbyteArray array = env->NewByteArray(length);
    if (array == nullptr) return nullptr;
    if (length > 0 && ckpArray != nullptr)
        env->SetByteArrayRegion(array, 0, length, reinterpret_cast<const jbyte*>(ckpArray));
    return array;
}

jcharArray ckCharArrayToJCharArray(JNIEnv* env, const CK_CHAR* ckpArray, CK_ULONG ckLength) {
    if (!fitsJavaArray(env, ckLength)) return nullptr;
    auto length = static_cast<jsize>(ckLength);
    auto* temp = static_cast<jchar*>(allocArray(length, sizeof(jchar)));
    if (temp == nullptr) {
        throwOutOfMemoryError(env);
        return nullptr;
    }
    for (jsize i = 0; i < length && ckpArray != nullptr; ++i)
        temp[i] = static_cast<jchar>(ckpArray[i]);
    jcharArray array = env->NewCharArray(length);
    if (array != nullptr) env->SetCharArrayRegion(array, 0, length, temp);
    gConverterFree(temp);
    return array;
}

jcharArray ckUTF8CharArrayToJCharArray(JNIEnv* env, const CK_UTF8CHAR* ckpArray, CK_ULONG ckLength)
    __attribute__((alias("ckCharArrayToJCharArray")));

jlongArray ckULongArrayToJLongArray(JNIEnv* env, const CK_ULONG* ckpArray, CK_ULONG ckCount) {
    if (!fitsJavaArray(env, ckCount)) return nullptr;
    auto count = static_cast<jsize>(ckCount);
    jlongArray array = env->NewLongArray(count);
    if (array == nullptr) return nullptr;
    if (count > 0 && ckpArray != nullptr)
        env->SetLongArrayRegion(array, 0, count, reinterpret_cast<const jlong*>(ckpArray));
    return array;
}

jobject ckBBoolPtrToJBooleanObject(JNIEnv* env, const CK_BBOOL* ckpValue) {
    if (ckpValue == nullptr) return nullptr;
    jboolean value = *ckpValue == CK_TRUE ? JNI_TRUE : JNI_FALSE;
    return newBoxed(env, "java/lang/Boolean", "(Z)V", value);
}

jobject ckULongPtrToJLongObject(JNIEnv* env, const CK_ULONG* ckpValue) {
    if (ckpValue == nullptr) return nullptr;
    return newBoxed(env, "java/lang/Long", "(J)V", static_cast<jlong>(*ckpValue));
}

jobject ckVersionPtrToJVersion(JNIEnv* env, const CK_VERSION* ckpVersion) {
    if (ckpVersion == nullptr) return nullptr;
    return ObjectBuilder(env, "CK_VERSION")
        .setByte("major", ckpVersion->major)
        .setByte("minor", ckpVersion->minor)
        .take();
}

jobject ckDatePtrToJDateObject(JNIEnv* env, const CK_DATE* ckpDate) {
    if (ckpDate == nullptr) return nullptr;
    return ObjectBuilder(env, "CK_DATE")
        .setChars("year", ckpDate->year, sizeof ckpDate->year)
        .setChars("month", ckpDate->month, sizeof ckpDate->month)
        .setChars("day", ckpDate->day, sizeof ckpDate->day)
        .take();
}

#define CHARS_FIELD(structure, field) #field, (structure)->field, sizeof(structure)->field

jobject ckInfoPtrToJInfo(JNIEnv* env, const CK_INFO* ckpInfo) {
    if (ckpInfo == nullptr) return nullptr;
    return ObjectBuilder(env, "CK_INFO")
        .setVersion("cryptokiVersion", ckpInfo->cryptokiVersion)
        .setChars(CHARS_FIELD(ckpInfo, manufacturerID))
        .setLong("flags", ckpInfo->flags)
        .setChars(CHARS_FIELD(ckpInfo, libraryDescription))
        .setVersion("libraryVersion", ckpInfo->libraryVersion)
        .take();
}

jobject ckSlotInfoPtrToJSlotInfo(JNIEnv* env, const CK_SLOT_INFO* ckpSlotInfo) {
    if (ckpSlotInfo == nullptr) return nullptr;
    return ObjectBuilder(env, "CK_SLOT_INFO")
        .setChars(CHARS_FIELD(ckpSlotInfo, slotDescription))
        .setChars(CHARS_FIELD(ckpSlotInfo, manufacturerID))
        .setLong("flags", ckpSlotInfo->flags)
        .setVersion("hardwareVersion", ckpSlotInfo->hardwareVersion)
        .setVersion("firmwareVersion", ckpSlotInfo->firmwareVersion)
        .take();
}

jobject ckTokenInfoPtrToJTokenInfo(JNIEnv* env, const CK_TOKEN_INFO* ckpTokenInfo) {
    if (ckpTokenInfo == nullptr) return nullptr;
    const CK_TOKEN_INFO& info = *ckpTokenInfo;
    return ObjectBuilder(env, "CK_TOKEN_INFO")
        .setChars(CHARS_FIELD(&info, label))
        .setChars(CHARS_FIELD(&info, manufacturerID))
        .setChars(CHARS_FIELD(&info, model))
        .setChars(CHARS_FIELD(&info, serialNumber))
        .setLong("flags", info.flags)
        .setLong("ulMaxSessionCount", info.ulMaxSessionCount)
        .setLong("ulSessionCount", info.ulSessionCount)
        .setLong("ulMaxRwSessionCount", info.ulMaxRwSessionCount)
        .setLong("ulRwSessionCount", info.ulRwSessionCount)
        .setLong("ulMaxPinLen", info.ulMaxPinLen)
        .setLong("ulMinPinLen", info.ulMinPinLen)
        .setLong("ulTotalPublicMemory", info.ulTotalPublicMemory)
        .setLong("ulFreePublicMemory", info.ulFreePublicMemory)
        .setLong("ulTotalPrivateMemory", info.ulTotalPrivateMemory)
        .setLong("ulFreePrivateMemory", info.ulFreePrivateMemory)
        .setVersion("hardwareVersion", info.hardwareVersion)
        .setVersion("firmwareVersion", info.firmwareVersion)
        .setChars(CHARS_FIELD(&info, utcTime))
        .take();
}

jobject ckSessionInfoPtrToJSessionInfo(JNIEnv* env, const CK_SESSION_INFO* ckpSessionInfo) {
    if (ckpSessionInfo == nullptr) return nullptr;
    return ObjectBuilder(env, "CK_SESSION_INFO")
        .setLong("slotID", ckpSessionInfo->slotID)
        .setLong("state", ckpSessionInfo->state)
        .setLong("flags", ckpSessionInfo->flags)
        .setLong("ulDeviceError", ckpSessionInfo->ulDeviceError)
        .take();
}

jobject ckMechanismInfoPtrToJMechanismInfo(JNIEnv* env, const CK_MECHANISM_INFO* ckpInfo) {
    if (ckpInfo == nullptr) return nullptr;
    return ObjectBuilder(env, "CK_MECHANISM_INFO")
        .setLong("ulMinKeySize", ckpInfo->ulMinKeySize)
        .setLong("ulMaxKeySize", ckpInfo->ulMaxKeySize)
        .setLong("flags", ckpInfo->flags)
        .take();
}
