// Java/native value conversion through a real Java VM under -Xcheck:jni: the
// value dispatcher's rows in order, the status results, the information
// structures, the attribute type table both ways and nested templates.
#include "converters.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstring>
#include <functional>
#include <string>

#include "converter_support.h"
#include "jvm_fixture.h"
#include "log_capture.h"

namespace {

using convtest::Bytes;
using convtest::bytesOf;
using convtest::isA;
using convtest::jv;
using convtest::nativeBytes;
using convtest::newBoxed;
using convtest::TrackedAllocations;
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
    jobject object = convtest::newObject(env, "CK_DATE");
    const char* names[] = {"year", "month", "day"};
    const char16_t* values[] = {y, m, d};
    for (int i = 0; i < 3; ++i) {
        convtest::setField(env, object, names[i], "[C",
                           jv(values[i] != nullptr ? convtest::newChars(env, values[i]) : nullptr));
    }
    return object;
}

jobject attribute(JNIEnv* env, CK_ATTRIBUTE_TYPE type, jobject value) {
    jobject object = convtest::newObject(env, "CK_ATTRIBUTE");
    convtest::setField(env, object, "type", "J", jv(static_cast<jlong>(type)));
    convtest::setField(env, object, "pValue", "Ljava/lang/Object;", jv(value));
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
        {"byte[]", convtest::newBytes(env_, {'A', 'B', 0, 'C'}), {'A', 'B', 0, 'C'}, 4, nullptr,
         "<Byte value AB>"},
        {"char[]", convtest::newChars(env_, u"\u4131\u00e9"), {0x31, 0xE9}, 2},
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
        STATUS_ROW(jByteArrayToCKByteArray, CK_BYTE_PTR, convtest::newBytes(e, {1, 2}), 1, 0),
        STATUS_ROW(jCharArrayToCKCharArray, CK_CHAR_PTR, convtest::newChars(e, u"ab"), 1, 2),
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
    using namespace convtest;
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
            EXPECT_EQ(convtest::getField(env_, object, "type", "J").j, static_cast<jlong>(type));
            jobject value = convtest::getField(env_, object, "pValue", "Ljava/lang/Object;").l;
            EXPECT_TRUE(isA(env_, value, group.javaClass)) << std::hex << type;
            EXPECT_TRUE(std::string(group.javaClass) != "[C" ||
                        convtest::charsOf(env_, value) == u"Key\u00e9");

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
        ASSERT_EQ(native.ulValueLen, 2 * sizeof(CK_ATTRIBUTE));

        jobject object = ckAttributePtrToJAttribute(env_, &native);
        auto array = static_cast<jobjectArray>(
            convtest::getField(env_, object, "pValue", "Ljava/lang/Object;").l);
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
    jobject notATemplate = convtest::newBytes(env_, {1, 2});
    jobjectArray templates[] = {
        attributes(env_, {attribute(env_, CKA_LABEL, convtest::newChars(env_, u"k")),
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
    jobject args = convtest::newObject(env_, "CK_C_INITIALIZE_ARGS");
    convtest::setField(env_, args, "flags", "J", jv(jlong(CKF_OS_LOCKING_OK)));
    jobject reserved = newBoxed(env_, "java/lang/Long", "(J)V", jv(jlong(0x1234)));
    convtest::setField(env_, args, "pReserved", "Ljava/lang/Object;", jv(reserved));

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
        attributes(env_, {attribute(env_, CKA_ID, convtest::newBytes(env_, {'I', 'D'}))});
    CK_ATTRIBUTE_PTR out = nullptr;
    CK_ULONG count = 0;
    ASSERT_EQ(jAttributeArrayToCKAttributeArray(env_, array, &out, &count), 0);
    auto texts = log.texts(kTag);
    ASSERT_EQ(texts.size(), 21u);
    texts[10] = texts[10].substr(0, 11);  // the object's address varies
    EXPECT_THAT(
        texts,
        ::testing::ElementsAre(
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

}  // namespace
