#define LOG_TAG "[native jni pkcs11wrapper]"
#include "entry_frame.h"

#include <algorithm>
#include <cstdint>
#include <cstring>

#include "java_objects.h"
#include "module_holds.h"
#include "registry.h"
#include "vok_export.h"
#include "vok_log.h"

namespace vokjni {

ConnectedModule::ConnectedModule(JNIEnv* env, jobject thiz, const MethodRules& rules)
    : entry_(holdModuleEntryOf(env, thiz)) {
    if (env->ExceptionCheck()) return;
    if (entry_ == nullptr) {
        for (int i = 0; i < rules.missingEntryLines; ++i) VOK_LOGD("failed getting module entry");
        throwDisconnectedRuntimeException(env);
        return;
    }
    // An entry whose getter failed may have no list: no module to call.
    if (entry_->functionList == nullptr && !rules.listMayBeMissing)
        throwDisconnectedRuntimeException(env);
    functions_ = entry_->functionList;
}

ConnectedModule::~ConnectedModule() {
    if (entry_ != nullptr) releaseModuleEntry(entry_);
}

void failWithPendingOrOutOfMemory(JNIEnv* env) { throwOutOfMemoryUnlessPending(env); }

bool allocateOutput(JNIEnv* env, CK_ULONG capacity, std::size_t elementSize, void** data) {
    *data = nullptr;
    if (!fitsJavaArray(env, capacity)) return false;
    *data = allocArray(static_cast<std::size_t>(capacity), elementSize);
    if (*data == nullptr) {
        throwOutOfMemoryError(env);
        return false;
    }
    return true;
}

std::string boundedText(const void* bytes, CK_ULONG length) {
    if (bytes == nullptr) return std::string();
    const auto* text = static_cast<const char*>(bytes);
    // A length beyond the address space limits nothing (cut, it would stop short).
    return std::string(
        text, strnlen(text, static_cast<std::size_t>(std::min<CK_ULONG>(length, SIZE_MAX))));
}

}  // namespace vokjni
