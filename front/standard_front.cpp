// The standard front: this system's proxies offered to programs built for the
// host's standard PKCS#11 interface (pkcs11-tool, p11tool, OpenSSL's PKCS#11
// engine, Java's own provider). Such a program loads this library like any
// module; each of its entries converts what differs on this host (host_abi.h)
// and calls the proxy of its own name in libQuorvelPkcs11Wrapper.so, which
// carries the call to the service.
//
// The proxy library is loaded from this library's own directory, RTLD_LOCAL,
// and reached only through its function list: both libraries define the C_
// names, and a call by name could bind to the wrong one.
//
// The service is named by the environment variable VOK_SERVER_ID, the id that
// vokpkcs11_client_init takes. The first call that needs the service opens the
// channel; until it is open every call tries again, so a service that starts
// after its caller is still reached.
//
// Standard callers get standard results: where a proxy answers all ones (the
// channel failed; not a CKR_ code, and a standard caller takes unknown codes
// for fatal bugs), the entry logs why and returns CKR_DEVICE_ERROR.

#include <dlfcn.h>

#include <atomic>
#include <cstdlib>
#include <mutex>
#include <string>

#include "front.h"
#include "host_abi.h"
#include "vok_comm.h"

#define LOG_TAG "Vokpkcs11f_Front"
#include "vok_log.h"

namespace {

using vok::hostabi::cross;

constexpr const char kServerIdVariable[] = "VOK_SERVER_ID";
constexpr const char kProxyLibrary[] = "libQuorvelPkcs11Wrapper.so";
// What a proxy returns when the channel fails.
constexpr CK_RV kChannelFailure = ~static_cast<CK_RV>(0);

#define VOK_FRONT_NAME(name, params) constexpr char kName_##name[] = #name;
VOK_CK_FUNCTIONS(VOK_FRONT_NAME)
#undef VOK_FRONT_NAME

// The proxies, copied out of the proxy library's packed list into naturally
// aligned members.
struct Proxies {
#define VOK_FRONT_PROXY(name, params) CK_##name name = nullptr;
    VOK_CK_FUNCTIONS(VOK_FRONT_PROXY)
#undef VOK_FRONT_PROXY
};

// The loaded proxy library and the standard list that fronts it. The proxy
// library stays loaded for the life of the process: it keeps its channel and
// its function list (never freed) for whoever else in the process uses it.
struct Front {
    Front();
    Front(const Front&) = delete;
    Front& operator=(const Front&) = delete;

    void* handle = nullptr;
    bool loaded = false;
    Proxies proxies;
    int32_t (*clientInit)(const char* serverId) = nullptr;
    host::ck_function_list list{};
    std::mutex channelLock;
    std::atomic<bool> channelOpen{false};
};

Front& front() {
    static Front loaded;
    return loaded;
}

// The proxy library next to this one; the loader's search when this library's
// own path is unknown.
std::string proxyLibraryPath() {
    Dl_info self;
    if (dladdr(reinterpret_cast<void*>(&vok_front_list), &self) && self.dli_fname) {
        const std::string path = self.dli_fname;
        const size_t slash = path.rfind('/');
        if (slash != std::string::npos) return path.substr(0, slash + 1) + kProxyLibrary;
    }
    return kProxyLibrary;
}

host::ck_rv_t deviceError(const char* name, const char* why) {
    VOK_LOGE("%s: %s, returning CKR_DEVICE_ERROR", name, why);
    return CKR_DEVICE_ERROR;
}

bool openChannel(Front& f) {
    if (f.channelOpen.load(std::memory_order_acquire)) return true;
    try {
        std::lock_guard<std::mutex> lock(f.channelLock);
        if (f.channelOpen.load(std::memory_order_relaxed)) return true;
        const char* serverId = std::getenv(kServerIdVariable);
        if (!serverId || !*serverId) {
            VOK_LOGE("%s is not set: no service to call", kServerIdVariable);
            return false;
        }
        const int32_t status = f.clientInit(serverId);
        // Already open: someone else in this process opened the proxies' channel.
        if (status != CHANNEL_OK && status != CHANNEL_ALREADY_INITIALIZED) {
            VOK_LOGE("cannot reach service %s: channel status %d", serverId,
                     static_cast<int>(status));
            return false;
        }
        VOK_LOGD("channel open to service %s", serverId);
        f.channelOpen.store(true, std::memory_order_release);
        return true;
    } catch (...) {
        return false;
    }
}

// One entry point: the proxy named by `Proxy`, called with the caller's
// arguments crossed to the packed interface.
template <class Standard, auto Proxy, const char* Name>
struct Entry;

template <class... Args, auto Proxy, const char* Name>
struct Entry<host::ck_rv_t (*)(Args...), Proxy, Name> {
    static host::ck_rv_t call(Args... args) noexcept {
        Front& f = front();
        if (!f.loaded) return CKR_GENERAL_ERROR;
        if (!openChannel(f)) return deviceError(Name, "no channel to the service");
        const CK_RV rv = cross(f.proxies.*Proxy, args...);
        if (rv == kChannelFailure) return deviceError(Name, "the service gave no answer");
        return rv;
    }
};

// The getter is the front's own: it hands out the front's list.
template <>
struct Entry<host::CK_C_GetFunctionList, &Proxies::C_GetFunctionList, kName_C_GetFunctionList> {
    static host::ck_rv_t call(host::ck_function_list** ppFunctionList) noexcept {
        if (!ppFunctionList) return CKR_ARGUMENTS_BAD;
        Front& f = front();
        if (!f.loaded) return CKR_GENERAL_ERROR;
        *ppFunctionList = &f.list;
        return CKR_OK;
    }
};

Front::Front() {
    // The interface this list offers.
    list.version.major = 2;
    list.version.minor = 40;
#define VOK_FRONT_ENTRY(name, params) \
    list.name = &Entry<decltype(list.name), &Proxies::name, kName_##name>::call;
    VOK_CK_FUNCTIONS(VOK_FRONT_ENTRY)
#undef VOK_FRONT_ENTRY

    const std::string path = proxyLibraryPath();
    handle = dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (!handle) {
        VOK_LOGE("cannot load %s: %s", path.c_str(), dlerror());
        return;
    }
    auto getter = reinterpret_cast<CK_C_GetFunctionList>(dlsym(handle, "C_GetFunctionList"));
    clientInit = reinterpret_cast<int32_t (*)(const char*)>(dlsym(handle, "vokpkcs11_client_init"));
    CK_FUNCTION_LIST* packed = nullptr;
    if (!getter || !clientInit || getter(&packed) != CKR_OK || !packed) {
        VOK_LOGE("%s offers no proxies", path.c_str());
        return;
    }
#define VOK_FRONT_COPY(name, params) proxies.name = packed->name;
    VOK_CK_FUNCTIONS(VOK_FRONT_COPY)
#undef VOK_FRONT_COPY
    loaded = true;
}

}  // namespace

extern "C" void* vok_front_list(void) { return &front().list; }
