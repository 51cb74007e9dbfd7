#include "request_memory.h"

#include <google/protobuf/arena.h>

#include <cstdlib>
#include <cstring>
#include <new>

#include "vok_server.h"

namespace vok {
namespace server {

namespace {

// Bytes the parse being measured on this thread may still take.
thread_local uint64_t parseLeft = 0;
struct ParseOverBudget {};

// Throwing here leaves the arena consistent: a block is recorded only once
// it has been allocated, and the arena releases what it has on unwinding.
void* parseBlock(size_t size) {
    if (size > parseLeft) throw ParseOverBudget{};
    parseLeft -= size;
    void* block = std::malloc(size);
    if (block == nullptr) throw std::bad_alloc();
    return block;
}

// Wiped: short strings of the request, PINs among them, live inside blocks.
void releaseParseBlock(void* block, size_t size) {
    wipe(block, size);
    std::free(block);
}

// Only fields that are there: on the parse's arena, a new one would need a
// block.
void wipePins(pkcs11::Operation& request) noexcept {
    if (request.login().has_ppin()) wipe(*request.mutable_login()->mutable_ppin());
    if (request.inittoken().has_ppin()) wipe(*request.mutable_inittoken()->mutable_ppin());
    if (request.initpin().has_ppin()) wipe(*request.mutable_initpin()->mutable_ppin());
    if (request.setpin().has_poldpin()) wipe(*request.mutable_setpin()->mutable_poldpin());
    if (request.setpin().has_pnewpin()) wipe(*request.mutable_setpin()->mutable_pnewpin());
}

struct Budget {
    bool active = false;
    uint64_t left = 0;
};
thread_local Budget bufferBudget;

void* (*const volatile wipeWith)(void*, int, size_t) = std::memset;

}  // namespace

bool parseAffordable(const void* request, size_t size) {
    parseLeft = kParseAllowance + kParseFactor * size;
    google::protobuf::ArenaOptions options;
    options.start_block_size = 4096;
    // Large blocks go back to the system as soon as they are released.
    options.max_block_size = size_t{1} << 20;
    options.block_alloc = parseBlock;
    options.block_dealloc = releaseParseBlock;
    google::protobuf::Arena arena(options);
    auto* probe = google::protobuf::Arena::CreateMessage<pkcs11::Operation>(&arena);
    bool affordable = true;
    try {
        probe->ParseFromArray(request, static_cast<int>(size));
    } catch (const ParseOverBudget&) {
        affordable = false;
    }
    wipePins(*probe);
    return affordable;
}

BufferBudget::BufferBudget(size_t requestSize) {
    bufferBudget.active = true;
    bufferBudget.left = kBufferAllowance + kBufferFactor * static_cast<uint64_t>(requestSize);
}

BufferBudget::~BufferBudget() { bufferBudget = Budget{}; }

void BufferBudget::charge(uint64_t bytes) {
    if (!bufferBudget.active) return;
    if (bytes > bufferBudget.left) throw std::bad_alloc();
    bufferBudget.left -= bytes;
}

void wipe(void* data, size_t size) noexcept {
    if (data != nullptr && size != 0) wipeWith(data, 0, size);
}

void wipe(std::string& text) noexcept { wipe(&text[0], text.size()); }

void releaseRequest() noexcept {
    wipePins(operation);
    // Clear() would keep every sub-message for reuse; a swap with an empty
    // message releases them.
    pkcs11::Operation empty;
    operation.Swap(&empty);
}

}  // namespace server
}  // namespace vok
