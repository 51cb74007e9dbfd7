#include "module_holds.h"

#include <dlfcn.h>

#include <cstdlib>
#include <mutex>
#include <unordered_map>

namespace {

struct Use {
    unsigned holds = 0;
    bool removed = false;  // out of the registry: unload after the last hold
};

std::mutex useLock;
std::unordered_map<ModuleEntry*, Use> uses;  // only entries held now or waiting

void unloadNow(ModuleEntry* entry) {
    if (entry->libraryHandle != nullptr) dlclose(entry->libraryHandle);
    std::free(entry);
}

}  // namespace

bool holdModuleEntry(ModuleEntry* entry) noexcept {
    try {
        std::lock_guard<std::mutex> lock(useLock);
        ++uses[entry].holds;
        return true;
    } catch (...) {
        return false;
    }
}

void releaseModuleEntry(ModuleEntry* entry) noexcept {
    {
        std::lock_guard<std::mutex> lock(useLock);
        auto use = uses.find(entry);
        if (use == uses.end()) return;
        if (--use->second.holds != 0) return;
        const bool removed = use->second.removed;
        uses.erase(use);
        if (!removed) return;
    }
    unloadNow(entry);
}

// Departs from unloading at once, which pulled the module out from under a
// call the server thread was making into it.
void unloadModuleEntry(ModuleEntry* entry) {
    if (entry == nullptr) return;
    {
        std::lock_guard<std::mutex> lock(useLock);
        auto use = uses.find(entry);
        if (use != uses.end()) {
            use->second.removed = true;
            return;
        }
    }
    unloadNow(entry);
}
