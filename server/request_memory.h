#ifndef VOK_SERVER_REQUEST_MEMORY_H
#define VOK_SERVER_REQUEST_MEMORY_H

// What one request may cost the service in memory, and how it is given back.
//
// A request of S bytes may make the service allocate:
//   - for its parse (the Operation and everything in it), at most
//     kParseAllowance + kParseFactor * S bytes of messages, besides the bytes
//     of its strings, which are at most S; a request whose parse would take
//     more is not parsed at all and gets the empty answer;
//   - for the buffers the handler sizes from the request's numbers (inputs,
//     outputs, lists, templates, mechanism parameters), at most
//     kBufferAllowance + kBufferFactor * S bytes together; beyond that the
//     handler does not call the module and gives the empty answer.
// With the copies the channel and the answer make, one request never costs
// more than about 16 * S + 70 MiB, however its numbers read. When its answer
// has been sent, nothing of it stays allocated.

#include <cstddef>
#include <cstdint>
#include <string>

namespace vok {
namespace server {

constexpr uint64_t kParseAllowance = uint64_t{1} << 20;
constexpr uint64_t kParseFactor = 4;
constexpr uint64_t kBufferAllowance = uint64_t{16} << 20;
constexpr uint64_t kBufferFactor = 2;

// Whether parsing the request's `size` bytes stays within its parse
// allowance. Parses it once into memory that is counted and released again.
bool parseAffordable(const void* request, size_t size);

// The buffer allowance of the request being served on this thread, for the
// life of the object. Without one, only the per-buffer limits apply.
class BufferBudget {
public:
    explicit BufferBudget(size_t requestSize);
    ~BufferBudget();
    BufferBudget(const BufferBudget&) = delete;
    BufferBudget& operator=(const BufferBudget&) = delete;

    // Counts `bytes` against the current allowance; std::bad_alloc beyond it.
    static void charge(uint64_t bytes);
};

// Overwrites memory that held a secret before it is released, in a way the
// compiler cannot drop.
void wipe(void* data, size_t size) noexcept;
void wipe(std::string& text) noexcept;

// Wipes the PINs the parsed request holds and replaces `operation` with an
// empty message, so that nothing of the request stays allocated.
void releaseRequest() noexcept;

}  // namespace server
}  // namespace vok

#endif
