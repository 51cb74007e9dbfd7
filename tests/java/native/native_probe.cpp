// Lets the Java tests look at what connect and disconnect leave behind: the
// registry's nodes, the client channel, and the fake vendor's controls. It is
// loaded into the same Java VM as the library and reads the library's own
// exported state.

#include <android/log.h>
#include <dlfcn.h>
#include <jni.h>

#include <mutex>
#include <string>
#include <vector>

#include "registry.h"
#include "vok_pkcs11.h"

namespace {

struct LogLine {
    std::string tag;
    std::string text;  // "<priority>|<message>"
};

std::mutex gLogMutex;
std::vector<LogLine> gLog;

void captureLog(const struct __android_logger_data* data, const char* message) {
    std::lock_guard<std::mutex> lock(gLogMutex);
    gLog.push_back({data->tag ? data->tag : "",
                    std::to_string(data->priority) + "|" + (message ? message : "")});
}

// Holds the registry's monitor while the test reads the list.
class RegistryLock {
public:
    explicit RegistryLock(JNIEnv* env) : env_(env), lock_(moduleListLock) {
        if (lock_ != nullptr) env_->MonitorEnter(lock_);
    }
    ~RegistryLock() {
        if (lock_ != nullptr) env_->MonitorExit(lock_);
    }
    RegistryLock(const RegistryLock&) = delete;
    RegistryLock& operator=(const RegistryLock&) = delete;

private:
    JNIEnv* env_;
    jobject lock_;
};

ModuleEntry* entryOf(JNIEnv* env, jobject object) {
    for (ModuleListNode* node = moduleListHead; node != nullptr; node = node->next)
        if (env->IsSameObject(node->key, object)) return node->entry;
    return nullptr;
}

void throwIllegalState(JNIEnv* env, const char* message) {
    jclass illegalState = env->FindClass("java/lang/IllegalStateException");
    if (illegalState != nullptr) env->ThrowNew(illegalState, message);
}

// A symbol of the fake vendor module; null, with the Java exception pending, when missing.
void* vendorSymbol(JNIEnv* env, jlong vendor, const char* name) {
    void* symbol = dlsym(reinterpret_cast<void*>(vendor), name);
    if (symbol == nullptr) throwIllegalState(env, "not the fake vendor module");
    return symbol;
}

std::string utf(JNIEnv* env, jstring text) {
    const char* chars = env->GetStringUTFChars(text, nullptr);
    if (chars == nullptr) return {};
    std::string out = chars;
    env->ReleaseStringUTFChars(text, chars);
    return out;
}

jobjectArray stringArray(JNIEnv* env, const std::vector<std::string>& texts) {
    jclass stringClass = env->FindClass("java/lang/String");
    if (stringClass == nullptr) return nullptr;
    jobjectArray result =
        env->NewObjectArray(static_cast<jsize>(texts.size()), stringClass, nullptr);
    for (size_t i = 0; result != nullptr && i < texts.size(); ++i) {
        jstring text = env->NewStringUTF(texts[i].c_str());
        if (text == nullptr) return nullptr;
        env->SetObjectArrayElement(result, static_cast<jsize>(i), text);
        env->DeleteLocalRef(text);
    }
    return result;
}

}  // namespace

extern "C" {

JNIEXPORT jint JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_nodeCount(JNIEnv* env, jclass) {
    RegistryLock lock(env);
    jint count = 0;
    for (ModuleListNode* node = moduleListHead; node != nullptr; node = node->next) ++count;
    return count;
}

JNIEXPORT jboolean JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_isConnected(JNIEnv* env,
                                                                                 jclass,
                                                                                 jobject object) {
    RegistryLock lock(env);
    return entryOf(env, object) != nullptr ? JNI_TRUE : JNI_FALSE;
}

JNIEXPORT jstring JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_moduleNameOf(JNIEnv* env,
                                                                                 jclass,
                                                                                 jobject object) {
    RegistryLock lock(env);
    ModuleEntry* entry = entryOf(env, object);
    if (entry == nullptr) {
        throwIllegalState(env, "not connected");
        return nullptr;
    }
    return entry->moduleName != nullptr ? env->NewStringUTF(entry->moduleName) : nullptr;
}

JNIEXPORT jboolean JNICALL
Java_com_vok_smartcard_pkcs11_NativeProbe_hasFunctionList(JNIEnv* env, jclass, jobject object) {
    RegistryLock lock(env);
    ModuleEntry* entry = entryOf(env, object);
    if (entry == nullptr) throwIllegalState(env, "not connected");
    return entry != nullptr && entry->functionList != nullptr ? JNI_TRUE : JNI_FALSE;
}

// C_GetInfo through the object's registered function list.
JNIEXPORT jlong JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_moduleGetInfo(JNIEnv* env, jclass,
                                                                                jobject object) {
    CK_FUNCTION_LIST_PTR functions = nullptr;
    {
        RegistryLock lock(env);
        ModuleEntry* entry = entryOf(env, object);
        if (entry != nullptr) functions = entry->functionList;
    }
    if (functions == nullptr) {
        throwIllegalState(env, "no function list");
        return 0;
    }
    CK_INFO info{};
    return static_cast<jlong>(functions->C_GetInfo(&info));
}

// The library's own C_GetInfo proxy: all ones while no channel is open.
JNIEXPORT jlong JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_channelGetInfo(JNIEnv*, jclass) {
    CK_INFO info{};
    return static_cast<jlong>(C_GetInfo(&info));
}

// A handle of its own on the fake vendor module keeps it, and what it was
// told, loaded until the test lets go.
JNIEXPORT jlong JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_openVendor(JNIEnv* env, jclass,
                                                                             jstring path) {
    void* handle = dlopen(utf(env, path).c_str(), RTLD_NOW | RTLD_LOCAL);
    if (handle == nullptr) throwIllegalState(env, dlerror());
    return reinterpret_cast<jlong>(handle);
}

JNIEXPORT void JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_setNextVendorRv(
    JNIEnv* env, jclass, jlong vendor, jstring function, jlong rv) {
    auto setNextRv = reinterpret_cast<CK_RV (*)(const char*, CK_RV)>(
        vendorSymbol(env, vendor, "fake_vendor_set_next_rv"));
    if (setNextRv != nullptr && setNextRv(utf(env, function).c_str(), static_cast<CK_RV>(rv)) != CKR_OK)
        throwIllegalState(env, "fake_vendor_set_next_rv refused");
}

JNIEXPORT void JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_setNextVendorOutput(
    JNIEnv* env, jclass, jlong vendor, jstring function, jbyteArray bytes) {
    auto setNextOutput = reinterpret_cast<CK_RV (*)(const char*, const CK_BYTE*, CK_ULONG)>(
        vendorSymbol(env, vendor, "fake_vendor_set_next_output"));
    if (setNextOutput == nullptr) return;
    std::vector<CK_BYTE> data(static_cast<size_t>(env->GetArrayLength(bytes)));
    env->GetByteArrayRegion(bytes, 0, static_cast<jsize>(data.size()),
                            reinterpret_cast<jbyte*>(data.data()));
    if (setNextOutput(utf(env, function).c_str(), data.data(), data.size()) != CKR_OK)
        throwIllegalState(env, "fake_vendor_set_next_output refused");
}

// The fake vendor's record as text, one element per call.
JNIEXPORT jobjectArray JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_vendorCalls(JNIEnv* env,
                                                                                     jclass,
                                                                                     jlong vendor) {
    auto count = reinterpret_cast<CK_ULONG (*)()>(vendorSymbol(env, vendor, "fake_vendor_call_count"));
    auto text = reinterpret_cast<CK_RV (*)(CK_ULONG, char*, CK_ULONG_PTR)>(
        count != nullptr ? vendorSymbol(env, vendor, "fake_vendor_call_text") : nullptr);
    if (text == nullptr) return nullptr;
    std::vector<std::string> calls(count());
    for (CK_ULONG i = 0; i < calls.size(); ++i) {
        CK_ULONG length = 0;
        if (text(i, nullptr, &length) != CKR_OK) break;
        calls[i].resize(length);
        text(i, &calls[i][0], &length);
        calls[i].resize(length);
    }
    return stringArray(env, calls);
}

// A fresh token in the fake vendor, with an empty record.
JNIEXPORT void JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_resetVendor(JNIEnv* env, jclass,
                                                                             jlong vendor) {
    if (auto reset = reinterpret_cast<void (*)()>(vendorSymbol(env, vendor, "fake_vendor_reset")))
        reset();
}

JNIEXPORT void JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_closeVendor(JNIEnv*, jclass,
                                                                             jlong vendor) {
    dlclose(reinterpret_cast<void*>(vendor));
}

// From now on every log line of the process is kept, none printed.
JNIEXPORT void JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_captureLog(JNIEnv*, jclass) {
    {
        std::lock_guard<std::mutex> lock(gLogMutex);
        gLog.clear();
    }
    __android_log_set_minimum_priority(ANDROID_LOG_VERBOSE);
    __android_log_set_logger(captureLog);
}

// The kept lines of one tag as "<priority>|<message>", which are then forgotten.
JNIEXPORT jobjectArray JNICALL Java_com_vok_smartcard_pkcs11_NativeProbe_takeLog(JNIEnv* env,
                                                                                 jclass,
                                                                                 jstring tag) {
    const std::string wanted = utf(env, tag);
    std::vector<std::string> texts;
    {
        std::lock_guard<std::mutex> lock(gLogMutex);
        for (const LogLine& line : gLog)
            if (line.tag == wanted) texts.push_back(line.text);
        gLog.clear();
    }
    return stringArray(env, texts);
}

}  // extern "C"
