#ifndef VOK_REGISTRY_H
#define VOK_REGISTRY_H

#include <stdint.h>

#include "vok_export.h"
#include "vok_pkcs11.h"

// One loaded PKCS#11 module. While it is registered the registry owns
// moduleName; the record itself and libraryHandle belong to whoever removes it.
typedef struct ModuleEntry {
    void* libraryHandle;                // dlopen handle of the module
    CK_FUNCTION_LIST_PTR functionList;  // filled by the module's function-list getter
    uintptr_t reserved;                 // always 0
    char* moduleName;                   // server id the module was connected under, or NULL
} ModuleEntry;

// Callable from any thread; a thread without a JNI environment is attached to
// the Java VM for the lookup. A NULL name means the first module connected.
VOK_C_API ModuleEntry* getModuleEntryByName(const char* name);
VOK_C_API CK_FUNCTION_LIST_PTR getFunctionsByModule(const char* name);

// For the server thread, which looks its module up for every command: attaches
// the calling thread to the Java VM once, as a daemon thread, and leaves it
// attached, so that its lookups find their JNI environment at once. Any other
// native thread is still attached and detached around each lookup. Returns 1
// when the thread is attached (now or before), 0 without a Java VM or when the
// VM refuses. Not exported.
VOK_EXTERN_C int keepThreadAttachedToJavaVm(void);

#ifdef __cplusplus
// Internal to the library. A call into a module holds its entry: disconnect
// may take the entry out of the registry meanwhile, but the module is unloaded
// only once the last call that holds it has returned.
class ModuleHold {
public:
    // getFunctionsByModule(name), with the entry held while this object lives.
    explicit ModuleHold(const char* name);
    ~ModuleHold();
    ModuleHold(const ModuleHold&) = delete;
    ModuleHold& operator=(const ModuleHold&) = delete;
    CK_FUNCTION_LIST_PTR functions() const { return functions_; }

private:
    ModuleEntry* entry_;
    CK_FUNCTION_LIST_PTR functions_;
};

// Closes the library of an entry taken out of the registry and frees the
// entry: at once when no call holds it, otherwise when the last one returns.
void unloadModuleEntry(ModuleEntry* entry);
#endif

#endif
