// Values of unknown class, attributes, templates and the initialisation
// arguments: the conversions whose result depends on a Java class or on an
// attribute type.

#define LOG_TAG "[native jni pkcs11wrapper]"
#include <algorithm>
#include <cstdint>
#include <cstring>
#include <string>

#include "converters.h"
#include "exceptions.h"
#include "java_objects.h"
#include "vok_log.h"

using vokjni::allocArray;
using vokjni::allocZeroed;
using vokjni::findBindingClass;
using vokjni::fitsJavaArray;
using vokjni::LocalFrame;
using vokjni::LocalRef;
using vokjni::ObjectBuilder;
using vokjni::ObjectFields;

namespace {

// The classes a value may have, in the order they are tested: the first
// match decides.
enum ValueClass {
    kLongObject,
    kBooleanObject,
    kByteArray,
    kCharArray,
    kByteObject,
    kDate,
    kCharacterObject,
    kIntegerObject,
    kBooleanArray,
    kIntArray,
    kLongArray,
    kString,
    kValueClassCount
};

const char* const kValueClassNames[kValueClassCount] = {
    "java/lang/Long",
    "java/lang/Boolean",
    "[B",
    "[C",
    "java/lang/Byte",
    "com/vok/smartcard/pkcs11/CK_DATE",
    "java/lang/Character",
    "java/lang/Integer",
    "[Z",
    "[I",
    "[J",
    "java/lang/String",
};

const char* const kAttributeArrayClass = "[Lcom/vok/smartcard/pkcs11/CK_ATTRIBUTE;";

bool isTemplateType(CK_ATTRIBUTE_TYPE type) {
    return type == CKA_WRAP_TEMPLATE || type == CKA_UNWRAP_TEMPLATE;
}

// Calls a no-argument object method found on the object's own class.
jobject callObjectMethod(JNIEnv* env, jobject object, const char* name, const char* signature) {
    LocalRef<jclass> cls(env, env->GetObjectClass(object));
    jmethodID method = env->GetMethodID(cls.get(), name, signature);
    if (method == nullptr) return nullptr;
    jobject result = env->CallObjectMethod(object, method);
    return env->ExceptionCheck() ? nullptr : result;
}

// PKCS11RuntimeException naming the object's class, the message built in
// Java. Call inside a local frame.
void throwUnconvertible(JNIEnv* env, jobject object) {
    jobject javaClass = callObjectMethod(env, object, "getClass", "()Ljava/lang/Class;");
    if (javaClass == nullptr) return;
    jobject className = callObjectMethod(env, javaClass, "getName", "()Ljava/lang/String;");
    if (env->ExceptionCheck()) return;
    jclass bufferClass = env->FindClass("java/lang/StringBuffer");
    if (bufferClass == nullptr) return;
    jmethodID constructor = env->GetMethodID(bufferClass, "<init>", "(Ljava/lang/String;)V");
    jmethodID append = constructor != nullptr
                           ? env->GetMethodID(bufferClass, "append",
                                              "(Ljava/lang/String;)Ljava/lang/StringBuffer;")
                           : nullptr;
    if (append == nullptr) return;
    jstring prefix =
        env->NewStringUTF("Java object of this class cannot be converted to native PKCS#11 type: ");
    if (prefix == nullptr) return;
    jobject buffer = env->NewObject(bufferClass, constructor, prefix);
    if (env->ExceptionCheck() || buffer == nullptr) return;
    env->CallObjectMethod(buffer, append, className);
    if (env->ExceptionCheck()) return;
    // The exception takes a String: the buffer's text is handed over, not
    // the buffer itself.
    auto message =
        static_cast<jstring>(callObjectMethod(env, buffer, "toString", "()Ljava/lang/String;"));
    if (env->ExceptionCheck()) return;
    throwPKCS11RuntimeException(env, message);
}

// The bytes as printf's %s would show them, without reading past length.
std::string boundedText(const CK_BYTE* bytes, CK_ULONG length) {
    if (bytes == nullptr) return std::string();
    const auto* text = reinterpret_cast<const char*>(bytes);
    return std::string(text,
                       strnlen(text, static_cast<size_t>(std::min<CK_ULONG>(length, SIZE_MAX))));
}

// Converts a non-null value by the first class it is an instance of. Call
// inside a local frame; the outputs stay null / 0 on failure.
void convertValue(JNIEnv* env, jobject object, CK_VOID_PTR* out, CK_ULONG_PTR length) {
    jclass classes[kValueClassCount];
    for (int i = 0; i < kValueClassCount; ++i) {
        classes[i] = env->FindClass(kValueClassNames[i]);
        if (classes[i] == nullptr) return;
    }
    int match = 0;
    while (match < kValueClassCount && !env->IsInstanceOf(object, classes[match])) ++match;

    void* value = nullptr;
    CK_ULONG size = 0;
    switch (match) {
        case kLongObject:
            value = jLongObjectToCKULongPtr(env, object);
            size = sizeof(CK_ULONG);
            break;
        case kBooleanObject: {
            CK_BBOOL_PTR b = jBooleanObjectToCKBBoolPtr(env, object);
            value = b;
            size = sizeof(CK_BBOOL);
            if (b != nullptr) {
                VOK_LOGD(" <converted boolean value ");
                VOK_LOGD("%s", *b == CK_TRUE ? "TRUE>" : "FALSE>");
            }
            break;
        }
        case kByteArray: {
            CK_BYTE_PTR bytes = nullptr;
            jByteArrayToCKByteArray(env, static_cast<jbyteArray>(object), &bytes, &size);
            value = bytes;
            if (bytes != nullptr) {
                VOK_LOGD("<Byte value %s>", boundedText(bytes, size).c_str());
                VOK_LOGD("ckpLength: %llu", static_cast<unsigned long long>(size));
            }
            break;
        }
        case kCharArray: {
            CK_CHAR_PTR chars = nullptr;
            jCharArrayToCKCharArray(env, static_cast<jcharArray>(object), &chars, &size);
            value = chars;
            break;
        }
        case kByteObject: {
            CK_BYTE_PTR b = jByteObjectToCKBytePtr(env, object);
            value = b;
            size = sizeof(CK_BYTE);
            if (b != nullptr) VOK_LOGD("<converted byte value %X>", static_cast<unsigned>(*b));
            break;
        }
        case kDate:
            value = jDateObjectPtrToCKDatePtr(env, object);
            size = sizeof(CK_DATE);
            break;
        case kCharacterObject: {
            CK_CHAR_PTR c = jCharObjectToCKCharPtr(env, object);
            value = c;
            size = sizeof(CK_CHAR);
            if (c != nullptr) VOK_LOGD("<converted char value %c>", *c);
            break;
        }
        case kIntegerObject:
            value = jIntegerObjectToCKULongPtr(env, object);
            size = sizeof(CK_ULONG);
            break;
        case kBooleanArray: {
            CK_BBOOL_PTR bools = nullptr;
            jBooleanArrayToCKBBoolArray(env, static_cast<jbooleanArray>(object), &bools, &size);
            value = bools;
            break;
        }
        case kIntArray:
        case kLongArray: {
            // Both go through the long-array converter; only a long[] reports
            // its length in bytes, an int[] in elements (kept so).
            CK_ULONG_PTR longs = nullptr;
            jLongArrayToCKULongArray(env, static_cast<jlongArray>(object), &longs, &size);
            value = longs;
            if (match == kLongArray) size *= sizeof(CK_ULONG);
            break;
        }
        case kString: {
            CK_UTF8CHAR_PTR text = nullptr;
            jStringToCKUTF8CharArray(env, static_cast<jstring>(object), &text, &size);
            value = text;
            break;
        }
        default:
            throwUnconvertible(env, object);
            return;
    }
    if (value == nullptr || env->ExceptionCheck()) {
        gConverterFree(value);
        return;
    }
    *out = value;
    *length = size;
}

// Which Java type an attribute value becomes, by attribute type.
enum class ValueKind { Long, Boolean, Chars, Date, Template, LongArray, Bytes };

ValueKind valueKindOf(CK_ATTRIBUTE_TYPE type) {
    switch (type) {
        case CKA_CLASS:
        case CKA_CERTIFICATE_TYPE:
        case CKA_CERTIFICATE_CATEGORY:
        case CKA_JAVA_MIDP_SECURITY_DOMAIN:
        case CKA_KEY_TYPE:
        case CKA_MODULUS_BITS:
        case CKA_PRIME_BITS:
        case CKA_SUBPRIME_BITS:
        case CKA_VALUE_BITS:
        case CKA_VALUE_LEN:
        case CKA_KEY_GEN_MECHANISM:
        case CKA_AUTH_PIN_FLAGS:
        case CKA_HW_FEATURE_TYPE:
            return ValueKind::Long;
        case CKA_TOKEN:
        case CKA_PRIVATE:
        case CKA_TRUSTED:
        case CKA_SENSITIVE:
        case CKA_ENCRYPT:
        case CKA_DECRYPT:
        case CKA_WRAP:
        case CKA_UNWRAP:
        case CKA_SIGN:
        case CKA_SIGN_RECOVER:
        case CKA_VERIFY:
        case CKA_VERIFY_RECOVER:
        case CKA_DERIVE:
        case CKA_EXTRACTABLE:
        case CKA_LOCAL:
        case CKA_NEVER_EXTRACTABLE:
        case CKA_ALWAYS_SENSITIVE:
        case CKA_MODIFIABLE:
        case CKA_SECONDARY_AUTH:
        case CKA_ALWAYS_AUTHENTICATE:
        case CKA_WRAP_WITH_TRUSTED:
        case CKA_RESET_ON_INIT:
        case CKA_HAS_RESET:
            return ValueKind::Boolean;
        case CKA_LABEL:
        case CKA_APPLICATION:
        case CKA_URL:
            return ValueKind::Chars;
        case CKA_START_DATE:
        case CKA_END_DATE:
            return ValueKind::Date;
        case CKA_WRAP_TEMPLATE:
        case CKA_UNWRAP_TEMPLATE:
            return ValueKind::Template;
        case CKA_ALLOWED_MECHANISMS:
            return ValueKind::LongArray;
        default:
            return ValueKind::Bytes;
    }
}

}  // namespace

void jObjectToPrimitiveCKObjectPtrPtr(JNIEnv* env, jobject jObject, CK_VOID_PTR* ckpObjectPtr,
                                      CK_ULONG_PTR ckpLength) {
    *ckpObjectPtr = nullptr;
    *ckpLength = 0;
    VOK_LOGD("\nDEBUG: jObjectToPrimitiveCKObjectPtrPtr");
    if (jObject != nullptr) {
        LocalFrame frame(env, kValueClassCount + 16);
        if (frame.pushed()) convertValue(env, jObject, ckpObjectPtr, ckpLength);
    }
    VOK_LOGD("FINISHED\n");
}

CK_ATTRIBUTE jAttributeToCKAttribute(JNIEnv* env, jobject jAttribute) {
    CK_ATTRIBUTE attribute{};
    VOK_LOGD("\nDEBUG: jAttributeToCKAttribute");
    if (jAttribute == nullptr) {
        vokjni::throwNullPointerException(env, "a template holds a null CK_ATTRIBUTE");
        return attribute;
    }
    VOK_LOGD(", getting attribute object class");
    ObjectFields reader(env, jAttribute);
    VOK_LOGD(", getting type field");
    CK_ATTRIBUTE_TYPE type = reader.getULong("type");
    if (reader.failed()) return attribute;
    VOK_LOGD(", type=0x%lX", static_cast<unsigned long>(type));
    VOK_LOGD(", getting pValue field");
    LocalRef<jobject> value(env, reader.getObject("pValue", "Ljava/lang/Object;"));
    if (reader.failed()) return attribute;
    VOK_LOGD(", pValue=%p", static_cast<void*>(value.get()));
    VOK_LOGD(", converting pValue to primitive object");
    attribute.type = type;

    if (isTemplateType(type)) {
        VOK_LOGD("\nCKF_ARRAY_ATTRIBUTE: \n");
        if (value.get() != nullptr) {
            // Anything but a CK_ATTRIBUTE[] is refused like any value of an
            // unknown class, rather than read as an array it is not.
            LocalRef<jclass> arrayClass(env, env->FindClass(kAttributeArrayClass));
            if (arrayClass.get() == nullptr) return attribute;
            if (!env->IsInstanceOf(value.get(), arrayClass.get())) {
                LocalFrame frame(env, 16);
                if (frame.pushed()) throwUnconvertible(env, value.get());
                return attribute;
            }
        }
        CK_ATTRIBUTE_PTR nested = nullptr;
        CK_ULONG count = 0;
        if (jAttributeArrayToCKAttributeArray(env, static_cast<jobjectArray>(value.get()), &nested,
                                              &count) != CK_CONVERSION_OK) {
            vokjni::throwOutOfMemoryUnlessPending(env);
            return attribute;
        }
        attribute.pValue = nested;
        attribute.ulValueLen = count * sizeof(CK_ATTRIBUTE);
    } else {
        CK_VOID_PTR converted = nullptr;
        CK_ULONG length = 0;
        jObjectToPrimitiveCKObjectPtrPtr(env, value.get(), &converted, &length);
        attribute.pValue = converted;
        attribute.ulValueLen = length;
    }
    VOK_LOGD("\nFINISHED\n");
    return attribute;
}

int jAttributeArrayToCKAttributeArray(JNIEnv* env, jobjectArray jArray, CK_ATTRIBUTE_PTR* ckpArray,
                                      CK_ULONG_PTR ckpCount) {
    VOK_LOGD("%s", "jAttributeArrayToCKAttributeArray");
    VOK_LOGD("\nDEBUG: jAttributeArrayToCKAttributeArray");
    *ckpArray = nullptr;
    *ckpCount = 0;
    if (jArray == nullptr) return CK_CONVERSION_OK;
    jsize count = env->GetArrayLength(jArray);
    auto* array = static_cast<CK_ATTRIBUTE_PTR>(allocArray(count, sizeof(CK_ATTRIBUTE)));
    if (array == nullptr) {
        throwOutOfMemoryError(env);
        return CK_CONVERSION_FIRST_ALLOCATION_FAILED;
    }
    VOK_LOGD(", converting %ld attributes", static_cast<long>(count));
    for (jsize i = 0; i < count && !env->ExceptionCheck(); ++i) {
        VOK_LOGD(", getting %llu. attribute", static_cast<unsigned long long>(i));
        LocalRef<jobject> element(env, env->GetObjectArrayElement(jArray, i));
        if (env->ExceptionCheck()) break;
        VOK_LOGD(", converting %llu. attribute", static_cast<unsigned long long>(i));
        array[i] = jAttributeToCKAttribute(env, element.get());
    }
    if (env->ExceptionCheck()) {
        freeCKAttributeArray(array, count);
        return CK_CONVERSION_FIRST_ALLOCATION_FAILED;
    }
    VOK_LOGD("FINISHED\n");
    VOK_LOGD("\nConverted template with following types: ");
    VOK_LOGD("\n");
    *ckpArray = array;
    *ckpCount = static_cast<CK_ULONG>(count);
    return CK_CONVERSION_OK;
}

void freeCKAttributeValue(CK_ATTRIBUTE_PTR attribute) {
    if (attribute == nullptr || attribute->pValue == nullptr) return;
    if (isTemplateType(attribute->type))
        freeCKAttributeArray(static_cast<CK_ATTRIBUTE_PTR>(attribute->pValue),
                             attribute->ulValueLen / sizeof(CK_ATTRIBUTE));
    else
        gConverterFree(attribute->pValue);
    attribute->pValue = nullptr;
}

void freeCKAttributeArray(CK_ATTRIBUTE_PTR array, CK_ULONG count) {
    if (array == nullptr) return;
    for (CK_ULONG i = 0; i < count; ++i) freeCKAttributeValue(&array[i]);
    gConverterFree(array);
}

CK_C_INITIALIZE_ARGS_PTR makeCKInitArgsAdapter(JNIEnv* env, jobject jInitArgs) {
    LocalRef<jclass> cls(env, findBindingClass(env, "CK_C_INITIALIZE_ARGS"));
    if (cls.get() == nullptr || jInitArgs == nullptr) return nullptr;
    auto* args = static_cast<CK_C_INITIALIZE_ARGS_PTR>(allocZeroed(sizeof(CK_C_INITIALIZE_ARGS)));
    if (args == nullptr) {
        throwOutOfMemoryError(env);
        return nullptr;
    }
    // Mutex callbacks written in Java cannot be handed to a module: the four
    // stay null, and the module uses its own locking or none.
    jfieldID flags = env->GetFieldID(cls.get(), "flags", "J");
    if (flags != nullptr) args->flags = static_cast<CK_FLAGS>(env->GetLongField(jInitArgs, flags));
    jfieldID reserved =
        flags != nullptr ? env->GetFieldID(cls.get(), "pReserved", "Ljava/lang/Object;") : nullptr;
    if (reserved != nullptr) {
        LocalRef<jobject> value(env, env->GetObjectField(jInitArgs, reserved));
        CK_VOID_PTR converted = nullptr;
        CK_ULONG length = 0;
        jObjectToPrimitiveCKObjectPtrPtr(env, value.get(), &converted, &length);
        args->pReserved = converted;
    }
    if (env->ExceptionCheck()) {
        freeCKInitArgsAdapter(args);
        return nullptr;
    }
    return args;
}

void freeCKInitArgsAdapter(CK_C_INITIALIZE_ARGS_PTR initArgs) {
    if (initArgs == nullptr) return;
    gConverterFree(initArgs->pReserved);
    gConverterFree(initArgs);
}

// ---- Native to Java ---------------------------------------------------------

jobject ckAttributeValueToJObject(JNIEnv* env, const CK_ATTRIBUTE* ckpAttribute) {
    if (ckpAttribute == nullptr) return nullptr;
    // The length's low word decides emptiness: (CK_ULONG)-1, "unavailable",
    // reads as -1 there.
    auto lowWord = static_cast<int32_t>(static_cast<uint32_t>(ckpAttribute->ulValueLen));
    if (lowWord < 1 || ckpAttribute->pValue == nullptr) return nullptr;
    const CK_ULONG length = ckpAttribute->ulValueLen;
    const auto* bytes = static_cast<const CK_BYTE*>(ckpAttribute->pValue);

    switch (valueKindOf(ckpAttribute->type)) {
        case ValueKind::Long: {
            // A value shorter than a CK_ULONG is read as far as it goes
            // (the low bytes on this little-endian target), never past it.
            CK_ULONG value = 0;
            std::memcpy(&value, bytes, std::min<CK_ULONG>(length, sizeof value));
            return ckULongPtrToJLongObject(env, &value);
        }
        case ValueKind::Boolean:
            return ckBBoolPtrToJBooleanObject(env, bytes);
        case ValueKind::Chars:
            return ckCharArrayToJCharArray(env, bytes, length);
        case ValueKind::Date: {
            CK_DATE date{};
            std::memcpy(&date, bytes, std::min<CK_ULONG>(length, sizeof date));
            return ckDatePtrToJDateObject(env, &date);
        }
        case ValueKind::Template:
            return ckAttributeArrayToJAttributeArray(
                env, static_cast<const CK_ATTRIBUTE*>(ckpAttribute->pValue), length);
        case ValueKind::LongArray:
            return ckULongArrayToJLongArray(env, static_cast<const CK_ULONG*>(ckpAttribute->pValue),
                                            length / sizeof(CK_ULONG));
        case ValueKind::Bytes:
            break;
    }
    return ckByteArrayToJByteArray(env, bytes, length);
}

jobject ckAttributePtrToJAttribute(JNIEnv* env, const CK_ATTRIBUTE* ckpAttribute) {
    if (ckpAttribute == nullptr) return nullptr;
    jobject value = ckAttributeValueToJObject(env, ckpAttribute);
    if (env->ExceptionCheck()) return nullptr;
    return ObjectBuilder(env, "CK_ATTRIBUTE")
        .setLong("type", ckpAttribute->type)
        .setObject("pValue", "Ljava/lang/Object;", value)
        .take();
}

jobjectArray ckAttributeArrayToJAttributeArray(JNIEnv* env, const CK_ATTRIBUTE* ckpArray,
                                               CK_ULONG byteLength) {
    if (ckpArray == nullptr) return nullptr;
    CK_ULONG count = byteLength / sizeof(CK_ATTRIBUTE);
    if (!fitsJavaArray(env, count)) return nullptr;
    LocalRef<jclass> cls(env, findBindingClass(env, "CK_ATTRIBUTE"));
    if (cls.get() == nullptr) return nullptr;
    LocalRef<jobjectArray> array(
        env, env->NewObjectArray(static_cast<jsize>(count), cls.get(), nullptr));
    if (array.get() == nullptr) return nullptr;
    for (CK_ULONG i = 0; i < count; ++i) {
        LocalRef<jobject> element(env, ckAttributePtrToJAttribute(env, &ckpArray[i]));
        if (env->ExceptionCheck()) return nullptr;
        env->SetObjectArrayElement(array.get(), static_cast<jsize>(i), element.get());
        if (env->ExceptionCheck()) return nullptr;
    }
    return array.release();
}
