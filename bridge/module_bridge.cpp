// The module bridge: a standard-interface PKCS#11 module (SoftHSM2 by
// default) offered through this system's packed 64-bit interface, so that the
// service connects it like any vendor module:
//
//     connect("libvokbridge.so", "C_GetFunctionList", serverId, 1)
//
// The module is named by the environment variable VOK_BRIDGE_MODULE (a path
// or a name the dynamic loader finds) and defaults to Debian's SoftHSM2. It is
// loaded on the first C_GetFunctionList and stays loaded with the bridge.
//
// Each of the 68 entry points calls the module's function of the same name;
// its arguments cross through host_abi.h, which converts what differs on this
// host and passes everything else as it is.

#include <dlfcn.h>

#include <cstdio>
#include <cstdlib>

#include "host_abi.h"

namespace {

using vok::hostabi::cross;

constexpr const char kModuleVariable[] = "VOK_BRIDGE_MODULE";
constexpr const char kDefaultModule[] = "/usr/lib/softhsm/libsofthsm2.so";

// The loaded module and the packed list that fronts it.
struct Bridge {
    Bridge();
    ~Bridge() {
        if (handle) dlclose(handle);
    }
    Bridge(const Bridge&) = delete;
    Bridge& operator=(const Bridge&) = delete;

    void* handle = nullptr;
    host::ck_function_list* module = nullptr;
    CK_FUNCTION_LIST list{};
    CK_RV status = CKR_GENERAL_ERROR;
};

Bridge& bridge() {
    static Bridge loaded;
    return loaded;
}

// One entry point: the module's function named by `Member`, called with the
// caller's arguments crossed to the module's interface.
template <class PackedFunction, auto Member>
struct Entry;

template <class... Args, auto Member>
struct Entry<CK_RV (*)(Args...), Member> {
    static CK_RV call(Args... args) noexcept {
        auto function = bridge().module->*Member;
        if (!function) return CKR_FUNCTION_NOT_SUPPORTED;
        return cross(function, args...);
    }
};

// The getter is the bridge's own: it hands out the bridge's list.
template <>
struct Entry<CK_C_GetFunctionList, &host::ck_function_list::C_GetFunctionList> {
    static CK_RV call(CK_FUNCTION_LIST_PTR_PTR ppFunctionList) noexcept {
        return C_GetFunctionList(ppFunctionList);
    }
};

Bridge::Bridge() {
    const char* path = std::getenv(kModuleVariable);
    if (!path || !*path) path = kDefaultModule;
    handle = dlopen(path, RTLD_NOW | RTLD_LOCAL);
    if (!handle) {
        std::fprintf(stderr, "vokbridge: cannot load %s: %s\n", path, dlerror());
        return;
    }
    auto getter = reinterpret_cast<host::CK_C_GetFunctionList>(dlsym(handle, "C_GetFunctionList"));
    if (!getter) {
        std::fprintf(stderr, "vokbridge: %s has no C_GetFunctionList\n", path);
        return;
    }
    status = getter(&module);
    if (status != CKR_OK || !module) {
        std::fprintf(stderr, "vokbridge: C_GetFunctionList of %s failed: 0x%lx\n", path,
                     static_cast<unsigned long>(status));
        if (status == CKR_OK) status = CKR_GENERAL_ERROR;
        return;
    }
    list.version.major = module->version.major;
    list.version.minor = module->version.minor;
    // Every entry forwards to the module's function of the same name.
#define VOK_BRIDGE_ENTRY(name, params) \
    list.name = &Entry<CK_##name, &host::ck_function_list::name>::call;
    VOK_CK_FUNCTIONS(VOK_BRIDGE_ENTRY)
#undef VOK_BRIDGE_ENTRY
}

}  // namespace

// The bridge's own list, not the module's: the module's is laid out for the
// host's standard interface.
CK_RV C_GetFunctionList(CK_FUNCTION_LIST_PTR_PTR ppFunctionList) {
    if (!ppFunctionList) return CKR_ARGUMENTS_BAD;
    Bridge& loaded = bridge();
    if (loaded.status != CKR_OK) return loaded.status;
    *ppFunctionList = &loaded.list;
    return CKR_OK;
}
