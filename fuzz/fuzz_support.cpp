#include "fuzz_support.h"

#include <android/log.h>
#include <google/protobuf/stubs/logging.h>
#include <jni.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <mutex>

#include "registry.h"
#include "vok_comm.h"
#include "vok_server.h"

#if defined(__has_feature)
#if __has_feature(address_sanitizer)
#include <sanitizer/asan_interface.h>
#define VOK_FUZZ_POISON(p, n) __asan_poison_memory_region((p), (n))
#define VOK_FUZZ_UNPOISON(p, n) __asan_unpoison_memory_region((p), (n))
#endif
#endif
#ifndef VOK_FUZZ_POISON
#define VOK_FUZZ_POISON(p, n) ((void)(p), (void)(n))
#define VOK_FUZZ_UNPOISON(p, n) ((void)(p), (void)(n))
#endif

namespace vokfuzz {

namespace {

std::recursive_mutex monitor;

jint JNICALL getEnv(JavaVM*, void** env, jint);
jint JNICALL monitorEnter(JNIEnv*, jobject) {
    monitor.lock();
    return JNI_OK;
}
jint JNICALL monitorExit(JNIEnv*, jobject) {
    monitor.unlock();
    return JNI_OK;
}

JNINativeInterface_ envFunctions = [] {
    JNINativeInterface_ table;
    std::memset(&table, 0, sizeof(table));
    table.MonitorEnter = monitorEnter;
    table.MonitorExit = monitorExit;
    return table;
}();
JNIEnv_ standInEnv{&envFunctions};

JNIInvokeInterface_ vmFunctions = [] {
    JNIInvokeInterface_ table;
    std::memset(&table, 0, sizeof(table));
    table.GetEnv = getEnv;
    return table;
}();
JavaVM_ standInVm{&vmFunctions};

jint JNICALL getEnv(JavaVM*, void** env, jint) {
    *env = &standInEnv;
    return JNI_OK;
}

int lockObject, keyObject;

}  // namespace

void registerModule(const char* name, CK_FUNCTION_LIST_PTR list) {
    gJavaVM = &standInVm;
    moduleListLock = reinterpret_cast<jobject>(&lockObject);
    auto* entry = static_cast<ModuleEntry*>(std::calloc(1, sizeof(ModuleEntry)));
    entry->functionList = list;
    entry->moduleName = strdup(name);
    // The list is empty, so putModuleEntry compares no keys.
    putModuleEntry(&standInEnv, reinterpret_cast<jobject>(&keyObject), entry);
    setModuleName_Server(name);
}

GuardedMemory::GuardedMemory(size_t slots) {
    const size_t page = static_cast<size_t>(sysconf(_SC_PAGESIZE));
    const size_t usable = (kMaxSize + page - 1) / page * page;
    for (size_t i = 0; i < slots; ++i) {
        void* p = mmap(nullptr, usable + page, PROT_READ | PROT_WRITE, MAP_PRIVATE | MAP_ANONYMOUS,
                       -1, 0);
        if (p == MAP_FAILED) std::abort();
        auto* base = static_cast<uint8_t*>(p);
        mprotect(base + usable, page, PROT_NONE);
        slots_.push_back({base, base + usable});
    }
}

GuardedMemory::~GuardedMemory() {
    reset();
    const size_t page = static_cast<size_t>(sysconf(_SC_PAGESIZE));
    for (const Slot& s : slots_) munmap(s.base, static_cast<size_t>(s.end - s.base) + page);
}

void* GuardedMemory::place(size_t size, uint8_t fill) {
    if (used_ == slots_.size() || size > kMaxSize) return nullptr;
    const Slot& s = slots_[used_++];
    uint8_t* p = s.end - size;
    VOK_FUZZ_POISON(s.base, static_cast<size_t>(p - s.base));
    std::memset(p, fill, size);
    return p;
}

void GuardedMemory::reset() {
    for (size_t i = 0; i < used_; ++i)
        VOK_FUZZ_UNPOISON(slots_[i].base, static_cast<size_t>(slots_[i].end - slots_[i].base));
    used_ = 0;
}

std::string frame(int32_t id, int32_t type, const std::string& payload) {
    const FrameHeader header{id, type, 0, static_cast<int32_t>(payload.size())};
    return std::string(reinterpret_cast<const char*>(&header), sizeof(header)) + payload;
}

void quietLogs() {
    __android_log_set_minimum_priority(ANDROID_LOG_VERBOSE);
    __android_log_set_logger([](const struct __android_logger_data*, const char*) {});
    // Nor protobuf's complaints about the malformed messages fuzzing makes.
    google::protobuf::SetLogHandler(nullptr);
}

std::string serverId(const char* target) {
    return std::string("Xvok-fuzz-") + target + "-" + std::to_string(getpid());
}

}  // namespace vokfuzz
