#ifndef VOK_FUZZ_SUPPORT_H
#define VOK_FUZZ_SUPPORT_H

// Shared by the fuzz targets: the fake vendor module registered without a
// Java VM, and caller memory that ends at a guard page.

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "vok_pkcs11.h"

namespace vokfuzz {

// Registers `list` under `name` in the library's real registry and names it
// the module the server serves. The registry reaches Java only for a JNI
// environment and the list's monitor, so a stand-in VM that offers those two
// (and nothing else: any other call would fault) runs the registry's own
// code. A real VM does not fit a fuzzing process: it takes SIGSEGV for its
// own purposes, which the fuzzer counts as crashes, and it starts slowly.
void registerModule(const char* name, CK_FUNCTION_LIST_PTR list);

// Places caller buffers so that each ends exactly at an inaccessible page:
// a proxy that writes one byte past what the caller gave faults at once. The
// bytes before a buffer are poisoned for the address sanitizer, so writing
// in front of it is caught too. Buffers live until reset().
class GuardedMemory {
public:
    explicit GuardedMemory(size_t slots = 256);
    ~GuardedMemory();
    GuardedMemory(const GuardedMemory&) = delete;
    GuardedMemory& operator=(const GuardedMemory&) = delete;

    // `size` bytes (at most kMaxSize) ending at a guard page, filled with
    // `fill`; nullptr when every slot is taken.
    void* place(size_t size, uint8_t fill = 0xa5);
    template <class T>
    T* place(size_t count = 1) {
        return static_cast<T*>(place(count * sizeof(T)));
    }
    void reset();

    static constexpr size_t kMaxSize = 2 * 4096;

private:
    struct Slot {
        uint8_t* base;
        uint8_t* end;  // the guard page
    };
    std::vector<Slot> slots_;
    size_t used_ = 0;
};

// A frame as it travels: header and payload.
std::string frame(int32_t id, int32_t type, const std::string& payload);

// Every log line is formatted, as in the service, and then dropped;
// protobuf logs nothing.
void quietLogs();

// A server id of this fuzzing process.
std::string serverId(const char* target);

}  // namespace vokfuzz

#endif
