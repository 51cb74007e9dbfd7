// What each helper leaves pending: the Java class and message, read back
// through the VM.
#include "exceptions.h"

#include <gtest/gtest.h>

#include <functional>
#include <string>

#include "jvm_fixture.h"

namespace {

class ExceptionHelpers : public voktest::JvmTest {
protected:
    jlong errorCodeOf(jthrowable exception) {
        jclass cls = env_->GetObjectClass(exception);
        jmethodID getErrorCode = env_->GetMethodID(cls, "getErrorCode", "()J");
        jlong code = env_->CallLongMethod(exception, getErrorCode);
        EXPECT_FALSE(env_->ExceptionCheck());
        return code;
    }
};

const jchar* utf16(const char16_t* text) { return reinterpret_cast<const jchar*>(text); }

const char* const kPkcs11Exception = "com.vok.smartcard.pkcs11.PKCS11Exception";
const char* const kRuntimeException = "com.vok.smartcard.pkcs11.PKCS11RuntimeException";

// A return value other than OK is passed through and carried whole.
std::function<void(JNIEnv*)> notOk(CK_RV rv) {
    return [rv](JNIEnv* env) { EXPECT_EQ(ckAssertReturnValueOK(env, rv), rv); };
}

TEST_F(ExceptionHelpers, EachHelperThrowsItsClassAndMessage) {
    EXPECT_EQ(ckAssertReturnValueOK(env_, CKR_OK), CKR_OK);
    EXPECT_FALSE(env_->ExceptionCheck());
    struct {
        const char* what;
        std::function<void(JNIEnv*)> raise;
        const char* className;
        const char* message;  // null: getMessage() answers null
        jlong errorCode = 0;  // of a PKCS11Exception
    } cases[] = {
        {"PIN incorrect", notOk(CKR_PIN_INCORRECT), kPkcs11Exception, "CKR 0x00000000000000A0",
         0xA0},
        {"buffer too small", notOk(CKR_BUFFER_TOO_SMALL), kPkcs11Exception,
         "CKR 0x0000000000000150", 0x150},
        {"vendor defined", notOk(CKR_VENDOR_DEFINED), kPkcs11Exception, "CKR 0x0000000080000000",
         0x80000000},
        {"all ones", notOk(0xFFFFFFFFFFFFFFFFull), kPkcs11Exception, "CKR 0xFFFFFFFFFFFFFFFF", -1},
        {"disconnected", throwDisconnectedRuntimeException, kRuntimeException,
         "This object is not connected to a module."},
        {"runtime with message",
         [](JNIEnv* env) { throwPKCS11RuntimeException(env, env->NewStringUTF("token removed")); },
         kRuntimeException, "token removed"},
        {"runtime without message", [](JNIEnv* env) { throwPKCS11RuntimeException(env, nullptr); },
         kRuntimeException, nullptr},
        {"out of memory", throwOutOfMemoryError, "java.lang.OutOfMemoryError", nullptr},
        {"I/O",
         [](JNIEnv* env) { throwIOException(env, "libvendor.so: cannot open shared object file"); },
         "java.io.IOException", "libvendor.so: cannot open shared object file"},
        {"I/O, UTF-16",
         [](JNIEnv* env) { throwIOExceptionUnicodeMessage(env, utf16(u"Gr\u00fc\u00dfe \u20ac")); },
         "java.io.IOException", "Gr\u00fc\u00dfe \u20ac"},
        {"I/O, UTF-16 up to the first zero",
         [](JNIEnv* env) { throwIOExceptionUnicodeMessage(env, utf16(u"head\0tail")); },
         "java.io.IOException", "head"},
        {"I/O, UTF-16 empty", [](JNIEnv* env) { throwIOExceptionUnicodeMessage(env, utf16(u"")); },
         "java.io.IOException", ""},
        {"I/O, UTF-16 null", [](JNIEnv* env) { throwIOExceptionUnicodeMessage(env, nullptr); },
         "java.io.IOException", ""},
        {"file not found",
         [](JNIEnv* env) {
             throwFileNotFoundException(env, env->NewStringUTF("/no/such/module.so"));
         },
         "java.io.FileNotFoundException", "/no/such/module.so"},
    };
    for (const auto& c : cases) {
        c.raise(env_);
        voktest::ThrownException thrown = voktest::takePendingException(env_);
        ASSERT_TRUE(thrown.thrown) << c.what;
        EXPECT_EQ(thrown.className, c.className) << c.what;
        EXPECT_EQ(thrown.hasMessage, c.message != nullptr) << c.what;
        if (c.message != nullptr) {
            EXPECT_EQ(thrown.message, c.message) << c.what;
        }
        if (std::string(c.className) == kPkcs11Exception) {
            EXPECT_EQ(errorCodeOf(thrown.object), c.errorCode) << c.what;
        }
    }
}

}  // namespace
