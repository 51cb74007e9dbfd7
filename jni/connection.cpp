// connect and disconnect: the process's role (server, client or neither) and
// the registry entry of each connected Java Pkcs11 object.

#define LOG_TAG "[native]"
#include <dlfcn.h>
#include <jni.h>

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>
#include <vector>

#include "exceptions.h"
#include "registry.h"
#include "vok_client.h"
#include "vok_comm.h"
#include "vok_export.h"
#include "vok_log.h"
#include "vok_pkcs11.h"
#include "vok_server.h"

VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_connect(JNIEnv* env, jobject thiz,
                                                                    jstring libraryName,
                                                                    jstring functionListName,
                                                                    jstring serverId,
                                                                    jint isServer);
VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_disconnect(JNIEnv* env, jobject thiz);
VOK_C_API void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_setAllowedPeerUids(JNIEnv* env,
                                                                               jclass clazz,
                                                                               jintArray uids);
VOK_C_API jlong JNICALL
Java_com_vok_smartcard_adapter_SandboxedProcessUsageStatistics_native_1getLastUsageTime(
    JNIEnv* env, jclass clazz);

namespace {

// Connecting this name makes the process a client of the service: the
// library then registers its own proxies.
constexpr const char* kOwnLibraryName = "libQuorvelPkcs11Wrapper.so";
constexpr jint kServerRole = 1;

// The modified UTF-8 chars of one Java string, held until released.
class JavaChars {
public:
    JavaChars(JNIEnv* env, jstring text)
        : env_(env), text_(text), chars_(text ? env->GetStringUTFChars(text, nullptr) : nullptr) {}
    ~JavaChars() { release(); }
    JavaChars(const JavaChars&) = delete;
    JavaChars& operator=(const JavaChars&) = delete;

    // Right after construction: a non-null string whose chars could not be
    // had (OutOfMemoryError pending).
    bool failed() const { return text_ != nullptr && chars_ == nullptr; }
    const char* get() const { return chars_; }
    void release() {
        if (chars_ != nullptr) env_->ReleaseStringUTFChars(text_, chars_);
        chars_ = nullptr;
    }

private:
    JNIEnv* env_;
    jstring text_;
    const char* chars_;
};

// A dlopen handle, closed unless something took it over.
class LibraryHandle {
public:
    explicit LibraryHandle(void* handle) : handle_(handle) {}
    ~LibraryHandle() {
        if (handle_ != nullptr) dlclose(handle_);
    }
    LibraryHandle(const LibraryHandle&) = delete;
    LibraryHandle& operator=(const LibraryHandle&) = delete;

    void* get() const { return handle_; }
    void* release() {
        void* handle = handle_;
        handle_ = nullptr;
        return handle;
    }

private:
    void* handle_;
};

void throwNullPointerException(JNIEnv* env, const char* message) {
    jclass npe = env->FindClass("java/lang/NullPointerException");
    if (npe == nullptr) return;
    env->ThrowNew(npe, message);
    env->DeleteLocalRef(npe);
}

// The loader's current error text, taken at once: the next loader call may
// overwrite it. Empty when the loader has nothing to say.
std::string takeLoaderError() {
    const char* error = dlerror();
    return error != nullptr ? std::string(error) : std::string();
}

constexpr const char* kConnectName = "Java_com_vok_smartcard_pkcs11_Pkcs11_connect";
constexpr const char* kUsageTimeName =
    "Java_com_vok_smartcard_adapter_SandboxedProcessUsageStatistics_native_1getLastUsageTime";

void connect(JNIEnv* env, jobject thiz, jstring libraryNameString, jstring functionListNameString,
             jstring serverIdString, jint isServer) {
    // A Java null would otherwise crash the whole process in the loader.
    if (libraryNameString == nullptr) {
        throwNullPointerException(env, "connect: libraryName must not be null");
        return;
    }
    if (functionListNameString == nullptr) {
        throwNullPointerException(env, "connect: functionListName must not be null");
        return;
    }

    // Each one checked at once: no JNI call may follow a pending OutOfMemoryError.
    JavaChars libraryName(env, libraryNameString);
    if (libraryName.failed()) return;
    JavaChars functionListName(env, functionListNameString);
    if (functionListName.failed()) return;
    JavaChars serverId(env, serverIdString);
    if (serverId.failed()) return;

    VOK_LOGD("DEBUG: connect to PKCS#11 module: %s ... ", libraryName.get());
    VOK_LOGD("DEBUG: connect to PKCS#11 module: %s ", libraryName.get());
    VOK_LOGD("%s...", kConnectName);

    // The role. Both starts report failure only through the log: a service
    // that cannot listen, or a client that cannot reach it, shows up later as
    // failing calls.
    if (serverId.get() != nullptr) {
        if (isServer == kServerRole) {
            vokpkcs11_init_server(serverId.get());
        } else {
            VOK_LOGD("Client socket init, libraryName: %s, ", libraryName.get());
            if (std::strcmp(libraryName.get(), kOwnLibraryName) == 0)
                vokpkcs11_client_init(serverId.get());
        }
    }

    dlerror();
    LibraryHandle handle(dlopen(libraryName.get(), RTLD_NOW | RTLD_LOCAL));
    std::string loadError = takeLoaderError();
    if (handle.get() == nullptr) {
        if (loadError.empty())
            loadError = std::string("cannot load PKCS#11 module ") + libraryName.get();
        VOK_LOGD("%s...", loadError.c_str());
        throwIOException(env, loadError.c_str());
        return;
    }

    void* getterSymbol = dlsym(handle.get(), functionListName.get());
    if (getterSymbol == nullptr) {
        VOK_LOGD("C_GetFunctionList load failed");
        std::string symbolError = takeLoaderError();
        if (symbolError.empty())
            symbolError = std::string("no function-list getter ") + functionListName.get() +
                          " in " + libraryName.get();
        VOK_LOGD("%s...", symbolError.c_str());
        throwIOException(env, symbolError.c_str());
        // Nothing refers to the module yet: it is closed and the strings are
        // released here, or every failed connect would leak them.
        return;
    }

    auto* entry = static_cast<ModuleEntry*>(std::calloc(1, sizeof(ModuleEntry)));
    char* moduleName = serverId.get() != nullptr ? strdup(serverId.get()) : nullptr;
    if (entry == nullptr || (serverId.get() != nullptr && moduleName == nullptr)) {
        std::free(entry);
        std::free(moduleName);
        throwOutOfMemoryError(env);
        return;
    }
    entry->libraryHandle = handle.get();
    entry->reserved = 0;
    entry->moduleName = moduleName;

    auto getFunctionList = reinterpret_cast<CK_C_GetFunctionList>(getterSymbol);
    CK_RV getterRv = getFunctionList(&entry->functionList);

    // A getter that failed may have left the list unset; there is no
    // version to show then.
    if (entry->functionList != nullptr)
        VOK_LOGD("version from function ptr addr major %d, minor %d",
                 entry->functionList->version.major, entry->functionList->version.minor);

    // The registry takes the key and the entry over unless it is closed
    // (initializeLibrary not called) or returns with an exception pending.
    jobject key = env->NewGlobalRef(thiz);
    bool registered = false;
    if (key == nullptr) {
        throwOutOfMemoryError(env);
    } else if (moduleListLock != nullptr) {
        putModuleEntry(env, key, entry);
        registered = !env->ExceptionCheck();
    }
    libraryName.release();
    functionListName.release();
    serverId.release();
    VOK_LOGD("FINISHED\n");
    VOK_LOGD("FINISHED: %s rv:%llu", kConnectName, static_cast<unsigned long long>(getterRv));
    if (registered) {
        handle.release();
    } else {
        if (key != nullptr) env->DeleteGlobalRef(key);
        std::free(entry->moduleName);
        std::free(entry);
        if (env->ExceptionCheck()) return;
    }

    // Registered even when the getter failed: disconnect still finds and
    // closes the module.
    ckAssertReturnValueOK(env, getterRv);
}

void disconnect(JNIEnv* env, jobject thiz) {
    VOK_LOGD("DEBUG: disconnecting module...");
    // Closed once no call into the module is running any more.
    unloadModuleEntry(removeModuleEntry(env, thiz));
    // Whatever role this process took: each deinit does nothing when its end
    // is not open.
    vokpkcs11_client_deinit();
    vokpkcs11_server_deinit();
    VOK_LOGD("FINISHED\n");
}

void setAllowedPeerUids(JNIEnv* env, jintArray uids) {
    if (uids == nullptr) {
        vokpkcs11_comm_server_setAllowedPeers(nullptr, 0);
        return;
    }
    // Java ints carry the ids' 32 bits unchanged.
    std::vector<uint32_t> list(static_cast<size_t>(env->GetArrayLength(uids)));
    env->GetIntArrayRegion(uids, 0, static_cast<jsize>(list.size()),
                           reinterpret_cast<jint*>(list.data()));
    // An empty list serves nobody: it must not reach the channel as NULL.
    static const uint32_t kNone = 0;
    if (vokpkcs11_comm_server_setAllowedPeers(list.empty() ? &kNone : list.data(),
                                              static_cast<int32_t>(list.size())) != 0)
        throwOutOfMemoryError(env);
}

// Only allocation can throw in here (the error texts); it reaches Java as
// OutOfMemoryError.
void throwOutOfMemoryIfNothingPending(JNIEnv* env) {
    if (!env->ExceptionCheck()) throwOutOfMemoryError(env);
}

}  // namespace

void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_connect(JNIEnv* env, jobject thiz,
                                                          jstring libraryName,
                                                          jstring functionListName,
                                                          jstring serverId, jint isServer) {
    try {
        connect(env, thiz, libraryName, functionListName, serverId, isServer);
    } catch (...) {
        throwOutOfMemoryIfNothingPending(env);
    }
}

void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_disconnect(JNIEnv* env, jobject thiz) {
    try {
        disconnect(env, thiz);
    } catch (...) {
        throwOutOfMemoryIfNothingPending(env);
    }
}

void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_setAllowedPeerUids(JNIEnv* env, jclass,
                                                                     jintArray uids) {
    try {
        setAllowedPeerUids(env, uids);
    } catch (...) {
        throwOutOfMemoryIfNothingPending(env);
    }
}

jlong JNICALL
Java_com_vok_smartcard_adapter_SandboxedProcessUsageStatistics_native_1getLastUsageTime(
    JNIEnv* /*env*/, jclass /*clazz*/) {
    VOK_LOGD("Entered %s", kUsageTimeName);
    // −1 (a request is being served) must stay −1 in Java: widen with sign.
    int32_t lastUsage = vokpkcs11_server_getLastUsageTime();
    return static_cast<jlong>(lastUsage);
}
