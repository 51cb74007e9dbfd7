#ifndef VOK_BENCH_FLOOR_H
#define VOK_BENCH_FLOOR_H

// The floor every way is measured against: a bare exchange over a Unix stream
// socket between two processes, with no PKCS#11 in it. The request carries
// `bytes` bytes (its first four hold its length), the answer 32 bytes, the
// shape of a digest request and its answer.

#include <sys/types.h>

#include <cstddef>
#include <vector>

namespace vok {
namespace bench {

class PingPong {
public:
    // Forks the peer. Call it first thing in main, before any thread or
    // library exists that a fork would copy.
    PingPong();
    ~PingPong();
    PingPong(const PingPong&) = delete;
    PingPong& operator=(const PingPong&) = delete;

    // One exchange; false when the peer is gone.
    bool exchange(size_t bytes);
    static constexpr size_t kAnswer = 32;
    static constexpr size_t kLargest = 1024 * 1024;

private:
    int fd_ = -1;
    pid_t peer_ = -1;
    std::vector<unsigned char> buffer_;
};

}  // namespace bench
}  // namespace vok

#endif
