#define LOG_TAG "[native jni pkcs11wrapper]"
#include "registry.h"

#include <cstdlib>
#include <cstring>

#include "exceptions.h"
#include "module_holds.h"
#include "vok_log.h"

JavaVM* gJavaVM = nullptr;
jobject moduleListLock = nullptr;
ModuleListNode* moduleListHead = nullptr;

void* (*gModuleListNodeAlloc)(std::size_t size) = std::malloc;

// Nothing in this file throws C++ exceptions: only the C allocator, JNI and
// the log are called, so the exported functions need no guard.

namespace {

constexpr jint kJniVersion = 0x10002;  // JNI 1.2
constexpr const char* kLibraryVersion = "2.4";

enum class Match { No, Yes, Failed };  // Failed: a Java exception is pending

// Identity comparison: java.lang.Object's own equals, called non-virtually.
// Class and method are looked up for every comparison.
Match sameObject(JNIEnv* env, jobject obj, jobject other) {
    jclass objectClass = env->FindClass("java/lang/Object");
    if (objectClass == nullptr) return Match::Failed;
    Match result = Match::Failed;
    jmethodID objectEquals = env->GetMethodID(objectClass, "equals", "(Ljava/lang/Object;)Z");
    if (objectEquals != nullptr) {
        jboolean equal = env->CallNonvirtualBooleanMethod(obj, objectClass, objectEquals, other);
        if (!env->ExceptionCheck()) result = equal == 1 ? Match::Yes : Match::No;
    }
    env->DeleteLocalRef(objectClass);
    return result;
}

bool sameName(const char* name, const char* moduleName) {
    return moduleName != nullptr && std::strcmp(name, moduleName) == 0;
}

// printf of a null %s is undefined; this prints what glibc would.
const char* printable(const char* text) { return text != nullptr ? text : "(null)"; }

struct Walk {
    ModuleListNode* node = nullptr;  // where the walk stopped; null for an empty list
    ModuleListNode* prev = nullptr;  // its predecessor; null at the head
    Match match = Match::No;
};

// The walk every lookup shares: stop at the first match, else at the tail,
// then compare the node where it stopped once more; that last comparison
// decides. Call with the monitor held.
template <typename Compare>
Walk walkList(Compare compare) {
    Walk walk;
    walk.node = moduleListHead;
    if (walk.node == nullptr) return walk;
    while (walk.node->next != nullptr) {
        Match match = compare(walk.node);
        if (match == Match::Failed) {
            walk.match = Match::Failed;
            return walk;
        }
        if (match == Match::Yes) break;
        walk.prev = walk.node;
        walk.node = walk.node->next;
    }
    walk.match = compare(walk.node);
    return walk;
}

Walk walkByObject(JNIEnv* env, jobject obj) {
    return walkList(
        [env, obj](const ModuleListNode* node) { return sameObject(env, obj, node->key); });
}

Walk walkByName(const char* name) {
    return walkList([name](const ModuleListNode* node) {
        return sameName(name, node->entry->moduleName) ? Match::Yes : Match::No;
    });
}

// Holds the monitor of moduleListLock for one list operation.
class ListMonitor {
public:
    explicit ListMonitor(JNIEnv* env)
        : env_(env), lock_(moduleListLock), held_(env->MonitorEnter(lock_) == JNI_OK) {}
    ~ListMonitor() {
        if (held_) env_->MonitorExit(lock_);
    }
    ListMonitor(const ListMonitor&) = delete;
    ListMonitor& operator=(const ListMonitor&) = delete;

    bool held() const { return held_; }

private:
    JNIEnv* env_;
    jobject lock_;
    bool held_;
};

ModuleListNode* newNode(jobject key, ModuleEntry* entry) {
    auto* node = static_cast<ModuleListNode*>(gModuleListNodeAlloc(sizeof(ModuleListNode)));
    if (node != nullptr) *node = ModuleListNode{key, entry, nullptr};
    return node;
}

// Frees what the registry owns of one unlinked node.
void releaseNode(JNIEnv* env, ModuleListNode* node) {
    env->DeleteGlobalRef(node->key);
    if (node->entry->moduleName != nullptr) {
        std::free(node->entry->moduleName);
        node->entry->moduleName = nullptr;
    }
    std::free(node);
}

struct ThreadEnv {
    JNIEnv* env = nullptr;
    bool attached = false;  // attached here, so detached here too
};

// Native callers may have no JNI environment; the server thread keeps one
// (keepThreadAttachedToJavaVm).
ThreadEnv envForCurrentThread() {
    JavaVM* vm = gJavaVM;
    void* existing = nullptr;
    if (vm != nullptr && vm->GetEnv(&existing, kJniVersion) == JNI_OK)
        return {static_cast<JNIEnv*>(existing), false};
    VOK_LOGE("callback_handler: failed to get JNI environment, assuming native thread");
    void* attached = nullptr;
    if (vm == nullptr || vm->AttachCurrentThread(&attached, nullptr) != JNI_OK) {
        VOK_LOGE("callback_handler: failed to attach current thread");
        return {};
    }
    return {static_cast<JNIEnv*>(attached), true};
}

// With `hold`, the entry found is held before the monitor is released.
ModuleEntry* findByName(JNIEnv* env, const char* name, bool hold) {
    ListMonitor monitor(env);
    if (!monitor.held() || moduleListHead == nullptr) return nullptr;
    ModuleEntry* entry = nullptr;
    if (name == nullptr) {
        VOK_LOGD("found default entry");
        entry = moduleListHead->entry;
    } else {
        Walk walk = walkByName(name);
        if (walk.match != Match::Yes) {
            VOK_LOGD("the entry is not in the list");
            return nullptr;
        }
        VOK_LOGD("found the entry");
        entry = walk.node->entry;
    }
    return !hold || holdModuleEntry(entry) ? entry : nullptr;
}

ModuleEntry* lookUpByName(const char* name, bool hold) {
    if (name != nullptr)
        VOK_LOGD("module name passed %s", name);
    else
        VOK_LOGD("module name passed NULL");

    ThreadEnv thread = envForCurrentThread();
    if (thread.env == nullptr) return nullptr;
    // A thread attached above stays attached on this return; long-standing
    // behaviour, kept.
    if (moduleListLock == nullptr) return nullptr;

    ModuleEntry* entry = findByName(thread.env, name, hold);
    if (thread.attached) gJavaVM->DetachCurrentThread();
    return entry;
}

CK_FUNCTION_LIST_PTR functionsOf(ModuleEntry* entry) {
    if (entry == nullptr) {
        // Logged twice: long-standing output, kept.
        VOK_LOGD("failed getting module entry");
        VOK_LOGD("failed getting module entry");
        return nullptr;
    }
    if (entry->functionList == nullptr) {
        VOK_LOGD("ckpFunctions is null %s", "getFunctionsByModule");
        return nullptr;
    }
    return entry->functionList;
}

}  // namespace

jint JNICALL JNI_OnLoad(JavaVM* vm, void* /*reserved*/) {
    VOK_LOGD("jni_onload : QUORVEL PKCS11Wrapper version : %s", kLibraryVersion);
    gJavaVM = vm;
    return kJniVersion;
}

void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_initializeLibrary(JNIEnv* env, jobject /*thiz*/) {
    if (moduleListLock != nullptr) return;
    moduleListLock = createLockObject(env);
}

void JNICALL Java_com_vok_smartcard_pkcs11_Pkcs11_finalizeLibrary(JNIEnv* env, jobject /*thiz*/) {
    removeAllModuleEntries(env);
    if (moduleListHead != nullptr) return;
    if (moduleListLock != nullptr) {
        jobject lock = moduleListLock;
        moduleListLock = nullptr;
        destroyLockObject(env, lock);
    }
}

int equals(JNIEnv* env, jobject first, jobject second) {
    if (first == nullptr) return second == nullptr ? 1 : 0;
    return sameObject(env, first, second) == Match::Yes ? 1 : 0;
}

jobject createLockObject(JNIEnv* env) {
    jclass objectClass = env->FindClass("java/lang/Object");
    if (objectClass == nullptr) return nullptr;
    jobject lock = nullptr;
    jmethodID constructor = env->GetMethodID(objectClass, "<init>", "()V");
    if (constructor != nullptr) {
        jobject object = env->NewObject(objectClass, constructor);
        if (!env->ExceptionCheck() && object != nullptr) lock = env->NewGlobalRef(object);
        if (object != nullptr) env->DeleteLocalRef(object);
    }
    env->DeleteLocalRef(objectClass);
    return lock;
}

void destroyLockObject(JNIEnv* env, jobject lock) {
    if (lock != nullptr) env->DeleteGlobalRef(lock);
}

void putModuleEntry(JNIEnv* env, jobject key, ModuleEntry* entry) {
    if (key == nullptr || entry == nullptr || moduleListLock == nullptr) return;
    ListMonitor monitor(env);
    if (!monitor.held()) return;

    Walk walk = walkByObject(env, key);
    if (walk.match == Match::Failed) return;
    if (walk.match == Match::Yes) {
        walk.node->entry = entry;
        // The node keeps its own reference to the object; a second one would
        // be kept nowhere.
        if (key != walk.node->key) env->DeleteGlobalRef(key);
        return;
    }
    ModuleListNode* node = newNode(key, entry);
    if (node == nullptr) {
        // Departs from the old failure path, which kept the monitor entered and
        // so hung the server thread's next lookup: the monitor is released.
        throwOutOfMemoryError(env);
        return;
    }
    if (walk.node == nullptr)
        moduleListHead = node;
    else
        walk.node->next = node;
}

namespace {

ModuleEntry* entryOf(JNIEnv* env, jobject obj, bool hold) {
    if (obj == nullptr || moduleListLock == nullptr) return nullptr;
    ListMonitor monitor(env);
    if (!monitor.held() || moduleListHead == nullptr) return nullptr;

    Walk walk = walkByObject(env, obj);
    if (walk.match == Match::Yes) {
        VOK_LOGD("found the entry");
        VOK_LOGD("module name %s", printable(walk.node->entry->moduleName));
        ModuleEntry* entry = walk.node->entry;
        return !hold || holdModuleEntry(entry) ? entry : nullptr;
    }
    VOK_LOGD("the entry is not in the list");
    return nullptr;
}

}  // namespace

ModuleEntry* getModuleEntry(JNIEnv* env, jobject obj) { return entryOf(env, obj, false); }

ModuleEntry* holdModuleEntryOf(JNIEnv* env, jobject obj) { return entryOf(env, obj, true); }

int isModulePresent(JNIEnv* env, jobject obj) {
    return getModuleEntry(env, obj) != nullptr ? 1 : 0;
}

ModuleEntry* getModuleEntryByName(const char* name) { return lookUpByName(name, false); }

int keepThreadAttachedToJavaVm(void) {
    JavaVM* vm = gJavaVM;
    void* env = nullptr;
    if (vm == nullptr) return 0;
    if (vm->GetEnv(&env, kJniVersion) == JNI_OK) return 1;
    // This departs from the rule above for native threads (attach and detach
    // around each lookup), for the server thread only: it looks its module up
    // for every command, and an attach and detach per command cost tens of
    // microseconds and an error line each time. Attached once, as a daemon
    // thread so that it never holds up the VM's shutdown, and never detached,
    // it finds its environment in getModuleEntryByName like a Java thread.
    JavaVMAttachArgs args = {kJniVersion, const_cast<char*>("vokpkcs11 server"), nullptr};
    return vm->AttachCurrentThreadAsDaemon(&env, &args) == JNI_OK ? 1 : 0;
}

CK_FUNCTION_LIST_PTR getFunctionsByModule(const char* name) {
    VOK_LOGD(" %s", "getFunctionsByModule");
    return functionsOf(getModuleEntryByName(name));
}

ModuleHold::ModuleHold(const char* name) {
    VOK_LOGD(" %s", "getFunctionsByModule");
    entry_ = lookUpByName(name, true);
    functions_ = functionsOf(entry_);
}

ModuleHold::~ModuleHold() {
    if (entry_ != nullptr) releaseModuleEntry(entry_);
}

ModuleEntry* removeModuleEntry(JNIEnv* env, jobject obj) {
    if (obj == nullptr || moduleListLock == nullptr) return nullptr;
    ListMonitor monitor(env);
    if (!monitor.held()) return nullptr;

    Walk walk = walkByObject(env, obj);
    if (walk.match != Match::Yes) return nullptr;
    (walk.prev != nullptr ? walk.prev->next : moduleListHead) = walk.node->next;
    ModuleEntry* entry = walk.node->entry;
    releaseNode(env, walk.node);
    return entry;
}

void removeAllModuleEntries(JNIEnv* env) {
    if (moduleListLock == nullptr) return;
    ListMonitor monitor(env);
    if (!monitor.held()) return;
    for (ModuleListNode* node = moduleListHead; node != nullptr;) {
        ModuleListNode* next = node->next;
        releaseNode(env, node);
        node = next;
    }
    moduleListHead = nullptr;
}
