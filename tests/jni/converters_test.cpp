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
using convtest::classNameOf;
using convtest::nativeBytes;
using convtest::newBoxed;
using convtest::TrackedAllocations;
using voktest::takePendingException;

const std::string kTag = "[native jni pkcs11wrapper]";
const char* const kRuntimeException = "com.vok.smartcard.pkcs11.PKCS11RuntimeException";
const char* const kOutOfMemory = "java.lang.OutOfMemoryError";

jvalue J(jlong v) { jvalue x; x.j = v; return x; }
jvalue Z(jboolean v) { jvalue x; x.z = v; return x; }
jvalue B(jbyte v) { jvalue x; x.b = v; return x; }
jvalue I(jint v) { jvalue x; x.i = v; return x; }
jvalue C(jchar v) { jvalue x; x.c = v; return x; }
jvalue D(jdouble v) { jvalue x; x.d = v; return x; }

Bytes le64(uint64_t v) { return nativeBytes(&v, sizeof v); }
Bytes operator+(Bytes a, const Bytes& b) { a.insert(a.end(), b.begin(), b.end()); return a; }
Bytes text(const char* s) { return Bytes(s, s + std::strlen(s)); }

jobject date(JNIEnv* env, const char16_t* y, const char16_t* m, const char16_t* d) {
    jobject object = convtest::newObject(env, "CK_DATE");
    const char* names[] = {"year", "month", "day"};
    const char16_t* values[] = {y, m, d};
    for (int i = 0; i < 3; ++i) {
        jvalue v;
        v.l = values[i] != nullptr ? convtest::newChars(env, values[i]) : nullptr;
        convtest::setField(env, object, names[i], "[C", v);
    }
    return object;
}

jobject attribute(JNIEnv* env, CK_ATTRIBUTE_TYPE type, jobject value) {
    jobject object = convtest::newObject(env, "CK_ATTRIBUTE");
    convtest::setField(env, object, "type", "J", J(static_cast<jlong>(type)));
    jvalue v;
    v.l = value;
    convtest::setField(env, object, "pValue", "Ljava/lang/Object;", v);
    return object;
}

jobjectArray attributes(JNIEnv* env, std::initializer_list<jobject> elements) {
    jclass cls = env->FindClass("com/vok/smartcard/pkcs11/CK_ATTRIBUTE");
    jobjectArray array = env->NewObjectArray(static_cast<jsize>(elements.size()), cls, nullptr);
    jsize i = 0;
    for (jobject e : elements) env->SetObjectArrayElement(array, i++, e);
    return array;
}

class Converters : public voktest::JvmTest {};

TEST_F(Converters, EachValueClassTakesItsRowInOrder) {
    struct {
        const char* what;
        std::function<jobject(JNIEnv*)> make;
        Bytes buffer;  // leading bytes of the native buffer; empty: null buffer
        CK_ULONG length;
        const char* exception;
        const char* logged;
    } rows[] = {
        {"null", [](JNIEnv*) { return jobject(); }, {}, 0, nullptr, nullptr},
        {"Long", [](JNIEnv* e) { return newBoxed(e, "java/lang/Long", "(J)V", J(0x0102030405060708)); },
         le64(0x0102030405060708), 8, nullptr, nullptr},
        {"Boolean true", [](JNIEnv* e) { return newBoxed(e, "java/lang/Boolean", "(Z)V", Z(1)); },
         {1}, 1, nullptr, "TRUE>"},
        {"Boolean false", [](JNIEnv* e) { return newBoxed(e, "java/lang/Boolean", "(Z)V", Z(0)); },
         {0}, 1, nullptr, "FALSE>"},
        {"byte[]", [](JNIEnv* e) { return convtest::newBytes(e, {'A', 'B', 0, 'C'}); },
         {'A', 'B', 0, 'C'}, 4, nullptr, "<Byte value AB>"},
        {"char[]", [](JNIEnv* e) { return convtest::newChars(e, u"\u4131\u00e9"); }, {0x31, 0xE9}, 2,
         nullptr, nullptr},
        {"Byte", [](JNIEnv* e) { return newBoxed(e, "java/lang/Byte", "(B)V", B(-2)); }, {0xFE}, 1,
         nullptr, "<converted byte value FE>"},
        {"CK_DATE", [](JNIEnv* e) { return date(e, u"2024", u"01", u"31"); }, text("20240131"), 8,
         nullptr, nullptr},
        {"Character",
         [](JNIEnv* e) { return newBoxed(e, "java/lang/Character", "(C)V", C(u'x')); }, {}, 0,
         "java.lang.NoClassDefFoundError", nullptr},
        {"Integer", [](JNIEnv* e) { return newBoxed(e, "java/lang/Integer", "(I)V", I(-2)); },
         le64(0xFFFFFFFFFFFFFFFEull), 8, nullptr, nullptr},
        {"boolean[]",
         [](JNIEnv* e) {
             jbooleanArray a = e->NewBooleanArray(3);
             const jboolean v[] = {1, 0, 2};  // only exactly 1 is true
             e->SetBooleanArrayRegion(a, 0, 3, v);
             return a;
         },
         {1, 0, 0}, 3, nullptr, nullptr},
        {"int[] (elements, read as 64-bit)",
         [](JNIEnv* e) {
             jintArray a = e->NewIntArray(3);
             const jint v[] = {1, 2, 3};
             e->SetIntArrayRegion(a, 0, 3, v);
             return a;
         },
         le64(0x0000000200000001) + le64(3) + le64(0), 3, nullptr, nullptr},
        {"long[] (bytes)",
         [](JNIEnv* e) {
             jlongArray a = e->NewLongArray(2);
             const jlong v[] = {5, -1};
             e->SetLongArrayRegion(a, 0, 2, v);
             return a;
         },
         le64(5) + le64(~0ull), 16, nullptr, nullptr},
        {"String", [](JNIEnv* e) { return e->NewStringUTF("a\xc3\xa9"); }, {'a', 0xC3, 0xA9, 0}, 3,
         nullptr, nullptr},
        {"Double", [](JNIEnv* e) { return newBoxed(e, "java/lang/Double", "(D)V", D(1.5)); }, {}, 0,
         kRuntimeException, nullptr},
    };
    for (const auto& row : rows) {
        voktest::LogCapture log;
        TrackedAllocations tracked;
        CK_VOID_PTR buffer = reinterpret_cast<CK_VOID_PTR>(1);
        CK_ULONG length = 99;
        jObjectToPrimitiveCKObjectPtrPtr(env_, row.make(env_), &buffer, &length);
        voktest::ThrownException thrown = takePendingException(env_);
        EXPECT_EQ(thrown.className, row.exception ? row.exception : "") << row.what;
        EXPECT_EQ(length, row.length) << row.what;
        EXPECT_EQ(nativeBytes(buffer, row.buffer.size()), row.buffer) << row.what;
        if (row.buffer.empty()) {
            EXPECT_EQ(buffer, nullptr) << row.what;
        }
        if (row.logged != nullptr) {
            EXPECT_TRUE(log.contains(kTag, row.logged)) << row.what;
        }
        auto texts = log.texts(kTag);
        EXPECT_EQ(texts.front(), "\nDEBUG: jObjectToPrimitiveCKObjectPtrPtr") << row.what;
        EXPECT_EQ(texts.back(), "FINISHED\n") << row.what;
        tracked.release(buffer);
        EXPECT_EQ(tracked.live(), 0u) << row.what << ": a temporary was kept";
        if (row.exception == kRuntimeException) {
            EXPECT_EQ(thrown.message, "Java object of this class cannot be converted to native PKCS#11 type: " "java.lang.Double");
        }
    }
}

TEST_F(Converters, ArrayConvertersReportWhichAllocationFailed) {
    using Convert = std::function<int(JNIEnv*, void**, CK_ULONG*)>;
    auto array = [](auto convert, auto make) -> Convert {
        return [=](JNIEnv* e, void** out, CK_ULONG* length) { return convert(e, make(e), out, length); };
    };
    struct {
        const char* what;
        Convert convert;
        int firstFails, secondFails;  // status when that allocation fails
    } rows[] = {
        {"byte[]", array([](JNIEnv* e, jbyteArray a, void** o, CK_ULONG* l) {
             return jByteArrayToCKByteArray(e, a, reinterpret_cast<CK_BYTE_PTR*>(o), l);
         }, [](JNIEnv* e) { return convtest::newBytes(e, {1, 2}); }), 1, 0},
        {"char[]", array([](JNIEnv* e, jcharArray a, void** o, CK_ULONG* l) {
             return jCharArrayToCKCharArray(e, a, reinterpret_cast<CK_CHAR_PTR*>(o), l);
         }, [](JNIEnv* e) { return convtest::newChars(e, u"ab"); }), 1, 2},
        {"boolean[]", array([](JNIEnv* e, jbooleanArray a, void** o, CK_ULONG* l) {
             return jBooleanArrayToCKBBoolArray(e, a, reinterpret_cast<CK_BBOOL_PTR*>(o), l);
         }, [](JNIEnv* e) { return e->NewBooleanArray(2); }), 1, 2},
        {"long[]", array([](JNIEnv* e, jlongArray a, void** o, CK_ULONG* l) {
             return jLongArrayToCKULongArray(e, a, reinterpret_cast<CK_ULONG_PTR*>(o), l);
         }, [](JNIEnv* e) { return e->NewLongArray(2); }), 1, 2},
        // The string's first "allocation" is the VM's own copy.
        {"String", array([](JNIEnv* e, jstring s, void** o, CK_ULONG* l) {
             return jStringToCKUTF8CharArray(e, s, reinterpret_cast<CK_UTF8CHAR_PTR*>(o), l);
         }, [](JNIEnv* e) { return e->NewStringUTF("ab"); }), 2, 0},
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
            if (expected != 0) {
                EXPECT_EQ(out, nullptr) << row.what;
            }
            if (expected != 0) {
                EXPECT_EQ(length, 0u) << row.what;
            }
            tracked.release(expected == 0 ? out : nullptr);
            EXPECT_EQ(tracked.live(), 0u) << row.what << " #" << nth;
        }
    }
}

TEST_F(Converters, InformationStructuresCarryEveryField) {
    using namespace convtest;
    struct {
        const char* what;
        std::size_t size;
        std::function<jobject(JNIEnv*, const void*)> convert;
        std::vector<Member> members;
    } rows[] = {
        {"CK_INFO", sizeof(CK_INFO),
         [](JNIEnv* e, const void* n) { return ckInfoPtrToJInfo(e, static_cast<const CK_INFO*>(n)); },
         {VOK_VERSION(CK_INFO, cryptokiVersion), VOK_FIXED_CHARS(CK_INFO, manufacturerID),
          VOK_LONG(CK_INFO, flags), VOK_FIXED_CHARS(CK_INFO, libraryDescription),
          VOK_VERSION(CK_INFO, libraryVersion)}},
        {"CK_SLOT_INFO", sizeof(CK_SLOT_INFO),
         [](JNIEnv* e, const void* n) {
             return ckSlotInfoPtrToJSlotInfo(e, static_cast<const CK_SLOT_INFO*>(n));
         },
         {VOK_FIXED_CHARS(CK_SLOT_INFO, slotDescription),
          VOK_FIXED_CHARS(CK_SLOT_INFO, manufacturerID), VOK_LONG(CK_SLOT_INFO, flags),
          VOK_VERSION(CK_SLOT_INFO, hardwareVersion), VOK_VERSION(CK_SLOT_INFO, firmwareVersion)}},
        {"CK_TOKEN_INFO", sizeof(CK_TOKEN_INFO),
         [](JNIEnv* e, const void* n) {
             return ckTokenInfoPtrToJTokenInfo(e, static_cast<const CK_TOKEN_INFO*>(n));
         },
         {VOK_FIXED_CHARS(CK_TOKEN_INFO, label), VOK_FIXED_CHARS(CK_TOKEN_INFO, manufacturerID),
          VOK_FIXED_CHARS(CK_TOKEN_INFO, model), VOK_FIXED_CHARS(CK_TOKEN_INFO, serialNumber),
          VOK_LONG(CK_TOKEN_INFO, flags), VOK_LONG(CK_TOKEN_INFO, ulMaxSessionCount),
          VOK_LONG(CK_TOKEN_INFO, ulSessionCount), VOK_LONG(CK_TOKEN_INFO, ulMaxRwSessionCount),
          VOK_LONG(CK_TOKEN_INFO, ulRwSessionCount), VOK_LONG(CK_TOKEN_INFO, ulMaxPinLen),
          VOK_LONG(CK_TOKEN_INFO, ulMinPinLen), VOK_LONG(CK_TOKEN_INFO, ulTotalPublicMemory),
          VOK_LONG(CK_TOKEN_INFO, ulFreePublicMemory), VOK_LONG(CK_TOKEN_INFO, ulTotalPrivateMemory),
          VOK_LONG(CK_TOKEN_INFO, ulFreePrivateMemory), VOK_VERSION(CK_TOKEN_INFO, hardwareVersion),
          VOK_VERSION(CK_TOKEN_INFO, firmwareVersion), VOK_FIXED_CHARS(CK_TOKEN_INFO, utcTime)}},
        {"CK_SESSION_INFO", sizeof(CK_SESSION_INFO),
         [](JNIEnv* e, const void* n) {
             return ckSessionInfoPtrToJSessionInfo(e, static_cast<const CK_SESSION_INFO*>(n));
         },
         {VOK_LONG(CK_SESSION_INFO, slotID), VOK_LONG(CK_SESSION_INFO, state),
          VOK_LONG(CK_SESSION_INFO, flags), VOK_LONG(CK_SESSION_INFO, ulDeviceError)}},
        {"CK_MECHANISM_INFO", sizeof(CK_MECHANISM_INFO),
         [](JNIEnv* e, const void* n) {
             return ckMechanismInfoPtrToJMechanismInfo(e, static_cast<const CK_MECHANISM_INFO*>(n));
         },
         {VOK_LONG(CK_MECHANISM_INFO, ulMinKeySize), VOK_LONG(CK_MECHANISM_INFO, ulMaxKeySize),
          VOK_LONG(CK_MECHANISM_INFO, flags)}},
        {"CK_DATE", sizeof(CK_DATE),
         [](JNIEnv* e, const void* n) { return ckDatePtrToJDateObject(e, static_cast<const CK_DATE*>(n)); },
         {VOK_FIXED_CHARS(CK_DATE, year), VOK_FIXED_CHARS(CK_DATE, month),
          VOK_FIXED_CHARS(CK_DATE, day)}},
    };
    for (const auto& row : rows) {
        // Every byte distinct, high bits set in most: fields cannot hide
        // behind each other and chars must widen without sign.
        Bytes native(row.size);
        for (std::size_t i = 0; i < native.size(); ++i) native[i] = static_cast<uint8_t>(0x91 + i * 7);
        jobject object = row.convert(env_, native.data());
        EXPECT_FALSE(env_->ExceptionCheck()) << row.what;
        EXPECT_EQ(classNameOf(env_, object), std::string("com.vok.smartcard.pkcs11.") + row.what);
        checkJava(env_, object, native.data(), row.size, row.members, row.what);
    }
}

TEST_F(Converters, AttributeTypesConvertBothWays) {
    struct {
        std::vector<CK_ATTRIBUTE_TYPE> types;
        Bytes value;
        std::string javaClass;
    } groups[] = {
        {{0x0, 0x80, 0x87, 0x88, 0x100, 0x121, 0x133, 0x134, 0x160, 0x161, 0x166, 0x201, 0x300},
         le64(0x8877665544332211), "java.lang.Long"},
        {{0x1, 0x2, 0x86, 0x103, 0x104, 0x105, 0x106, 0x107, 0x108, 0x109, 0x10A, 0x10B, 0x10C,
          0x162, 0x163, 0x164, 0x165, 0x170, 0x200, 0x202, 0x210, 0x301, 0x302},
         {1}, "java.lang.Boolean"},
        {{0x3, 0x10, 0x89}, {'K', 'e', 'y', 0xE9}, "[C"},
        {{0x110, 0x111}, text("20240131"), "com.vok.smartcard.pkcs11.CK_DATE"},
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
            EXPECT_EQ(classNameOf(env_, value), group.javaClass) << std::hex << type;
            if (group.javaClass == "[C") {
                EXPECT_EQ(convtest::charsOf(env_, value), u"Key\u00e9") << std::hex << type;
            }

            CK_ATTRIBUTE back = jAttributeToCKAttribute(env_, object);
            ASSERT_FALSE(env_->ExceptionCheck()) << std::hex << type;
            EXPECT_EQ(back.type, type);
            EXPECT_EQ(back.ulValueLen, group.value.size()) << std::hex << type;
            EXPECT_EQ(nativeBytes(back.pValue, back.ulValueLen), group.value) << std::hex << type;
            freeCKAttributeValue(&back);
            EXPECT_EQ(tracked.live(), 0u);
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
        ASSERT_EQ(classNameOf(env_, array), "[Lcom.vok.smartcard.pkcs11.CK_ATTRIBUTE;");
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

TEST_F(Converters, EmptyAndUnavailableValuesAreNull) {
    uint8_t bytes[8] = {1, 2, 3, 4, 5, 6, 7, 8};
    struct {
        CK_VOID_PTR value;
        CK_ULONG length;
    } cases[] = {{bytes, CK_UNAVAILABLE_INFORMATION}, {bytes, 0}, {nullptr, 4},
                 // Only the length's low word decides.
                 {bytes, 0x100000000ull}, {bytes, 0x1FFFFFFFFull}};
    for (CK_ATTRIBUTE_TYPE type : {CKA_VALUE, CKA_CLASS, CKA_LABEL}) {
        for (const auto& c : cases) {
            CK_ATTRIBUTE native{type, c.value, c.length};
            EXPECT_EQ(ckAttributeValueToJObject(env_, &native), nullptr) << std::hex << c.length;
            EXPECT_FALSE(env_->ExceptionCheck());
        }
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
        [&] { return ckByteArrayToJByteArray(env_, small, 0x80000000ull); },
    };
    for (auto& call : calls) {
        EXPECT_EQ(call(), nullptr);
        EXPECT_EQ(takePendingException(env_).className, kOutOfMemory);
    }
    EXPECT_EQ(env_->GetArrayLength(ckULongArrayToJLongArray(env_, nullptr, 0)), 0);
}

TEST_F(Converters, DateFieldsAreCutToTheirSizeOrLeftZero) {
    TrackedAllocations tracked;
    jobject object = date(env_, u"24", nullptr, u"31xyz");
    CK_DATE* native = jDateObjectPtrToCKDatePtr(env_, object);
    ASSERT_NE(native, nullptr);
    EXPECT_EQ(nativeBytes(native, sizeof *native), Bytes({'2', '4', 0, 0, 0, 0, '3', '1'}));
    tracked.release(native);
    EXPECT_EQ(tracked.live(), 0u);
}

TEST_F(Converters, FailedTemplateElementLeavesNothingAllocated) {
    jobject doubleValue = newBoxed(env_, "java/lang/Double", "(D)V", D(2.5));
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
        EXPECT_EQ(out, nullptr);
        EXPECT_EQ(count, 0u);
        EXPECT_EQ(tracked.live(), 0u);
    }
}

TEST_F(Converters, InitArgsAdapterCarriesFlagsAndReservedValue) {
    TrackedAllocations tracked;
    EXPECT_EQ(makeCKInitArgsAdapter(env_, nullptr), nullptr);
    jobject args = convtest::newObject(env_, "CK_C_INITIALIZE_ARGS");
    convtest::setField(env_, args, "flags", "J", J(CKF_OS_LOCKING_OK));
    jvalue reserved;
    reserved.l = newBoxed(env_, "java/lang/Long", "(J)V", J(0x1234));
    convtest::setField(env_, args, "pReserved", "Ljava/lang/Object;", reserved);

    CK_C_INITIALIZE_ARGS_PTR native = makeCKInitArgsAdapter(env_, args);
    ASSERT_NE(native, nullptr);
    EXPECT_EQ(native->CreateMutex, nullptr);
    EXPECT_EQ(native->DestroyMutex, nullptr);
    EXPECT_EQ(native->LockMutex, nullptr);
    EXPECT_EQ(native->UnlockMutex, nullptr);
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
    EXPECT_THAT(texts, ::testing::ElementsAre(
                           "jAttributeArrayToCKAttributeArray",
                           "\nDEBUG: jAttributeArrayToCKAttributeArray", ", converting 1 attributes",
                           ", getting 0. attribute", ", converting 0. attribute",
                           "\nDEBUG: jAttributeToCKAttribute", ", getting attribute object class",
                           ", getting type field", ", type=0x102", ", getting pValue field",
                           ", pValue=0x", ", converting pValue to primitive object",
                           "\nDEBUG: jObjectToPrimitiveCKObjectPtrPtr", "ckpLength:2",
                           "<Byte value ID>", "ckpLength: 2", "FINISHED\n", "\nFINISHED\n",
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
