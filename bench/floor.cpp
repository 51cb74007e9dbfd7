#include "floor.h"

#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <stdexcept>

namespace vok {
namespace bench {

namespace {

bool writeAll(int fd, const unsigned char* p, size_t n) {
    while (n > 0) {
        ssize_t w = write(fd, p, n);
        if (w < 0 && errno == EINTR) continue;
        if (w <= 0) return false;
        p += w;
        n -= static_cast<size_t>(w);
    }
    return true;
}

// Reads until `n` bytes are in; false at end of stream or on error.
bool readAll(int fd, unsigned char* p, size_t n) {
    while (n > 0) {
        ssize_t r = read(fd, p, n);
        if (r < 0 && errno == EINTR) continue;
        if (r <= 0) return false;
        p += r;
        n -= static_cast<size_t>(r);
    }
    return true;
}

// The peer: takes whatever arrives (one read for a small request), learns the
// request's length from its first four bytes, and answers 32 bytes.
[[noreturn]] void servePeer(int fd) {
    std::vector<unsigned char> in(PingPong::kLargest);
    unsigned char answer[PingPong::kAnswer] = {0};
    for (;;) {
        size_t have = 0;
        while (have < sizeof(uint32_t)) {
            ssize_t r = read(fd, in.data() + have, in.size() - have);
            if (r < 0 && errno == EINTR) continue;
            if (r <= 0) _exit(0);
            have += static_cast<size_t>(r);
        }
        uint32_t length;
        std::memcpy(&length, in.data(), sizeof length);
        if (length > in.size() || length < have) _exit(1);
        if (!readAll(fd, in.data() + have, length - have)) _exit(0);
        if (!writeAll(fd, answer, sizeof answer)) _exit(0);
    }
}

}  // namespace

PingPong::PingPong() : buffer_(kLargest) {
    int fds[2];
    if (socketpair(AF_UNIX, SOCK_STREAM, 0, fds) != 0)
        throw std::runtime_error("socketpair failed");
    peer_ = fork();
    if (peer_ < 0) throw std::runtime_error("fork failed");
    if (peer_ == 0) {
        close(fds[0]);
        servePeer(fds[1]);
    }
    close(fds[1]);
    fd_ = fds[0];
}

PingPong::~PingPong() {
    close(fd_);
    if (peer_ > 0) waitpid(peer_, nullptr, 0);
}

bool PingPong::exchange(size_t bytes) {
    const uint32_t length = static_cast<uint32_t>(bytes);
    std::memcpy(buffer_.data(), &length, sizeof length);
    unsigned char answer[kAnswer];
    return writeAll(fd_, buffer_.data(), bytes) && readAll(fd_, answer, sizeof answer);
}

}  // namespace bench
}  // namespace vok
