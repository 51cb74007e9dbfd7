#ifndef VOK_COMM_INTERNAL_H
#define VOK_COMM_INTERNAL_H

// Helpers shared by the two ends of the channel. Hidden in the shared library;
// unit tests reach them through the static archive.

#include <pthread.h>
#include <sys/socket.h>
#include <sys/types.h>
#include <sys/un.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

#include "vok_comm.h"

static_assert(sizeof(FrameHeader) == 16, "the frame header is four 32-bit integers");

// Full-length loops over one descriptor; each returns a ChannelStatus.
int32_t client_send_data(int fd, const void* buf, int32_t len);
int32_t client_recv_data(int fd, void* buf, int32_t len);
int32_t server_send_data(int fd, const void* buf, int32_t len);
int32_t server_recv_data(int fd, void* buf, int32_t len);

namespace vokcomm {

// The abstract address of a server id: the id's first character is replaced
// by the NUL that selects the abstract namespace, and the name is the whole
// zero-padded sun_path, so both ends must pass socketAddressLength().
void buildSocketAddress(const char* serverId, sockaddr_un* addr);
constexpr socklen_t socketAddressLength() { return sizeof(sockaddr_un); }

// send/recv that retry when a signal interrupts them; a receive timeout still
// fails.
ssize_t sendRetrying(int fd, const void* buf, size_t len, int flags);
ssize_t recvRetrying(int fd, void* buf, size_t len, int flags);

// Told the result of every send or recv call a transfer makes (each end logs
// it under its own tag).
using CallReport = void (*)(ssize_t result);

// Header and payload of one frame leave together, in one sendmsg unless the
// socket takes less at a time, so that the peer wakes once for the whole
// frame. Signals interrupting a call are retried.
struct FrameSend {
    ssize_t failed = 1;  // 1: all sent; else the failed call's result (0 or -1)
    int error = 0;       // errno of a failed call
    size_t sent = 0;     // bytes that did leave, the header's first
};
FrameSend sendFrame(int fd, const FrameHeader& header, const void* payload, size_t length,
                    int flags, CallReport report);

// One connection's received bytes that no read has asked for yet. A read
// smaller than the stage fills it with whatever has arrived, so a frame's
// header and a small payload come in with one recv; a read larger than the
// stage takes what is staged and receives the rest straight into the caller's
// buffer, never beyond it. Bytes beyond a frame stay for the next read: the
// framing is the stream's, whatever the calls. Without memory for the stage
// every read goes straight to the caller's buffer.
class ReceiveStage {
public:
    explicit ReceiveStage(size_t capacity) : capacity_(capacity) {}
    ~ReceiveStage() { discard(); }
    ReceiveStage(const ReceiveStage&) = delete;
    ReceiveStage& operator=(const ReceiveStage&) = delete;
    // Reads exactly `length` bytes. Returns 1 once they are in, else the
    // result (0 or -1) of the recv that failed.
    ssize_t read(int fd, void* buffer, size_t length, CallReport report);
    size_t staged() const { return end_ - begin_; }
    // Staged bytes are wiped once read or dropped: requests carry PINs.
    void discard();

private:
    size_t capacity_;
    std::unique_ptr<uint8_t[]> bytes_;
    size_t begin_ = 0, end_ = 0;
};

// Keeps a C++ exception from crossing a C boundary: it becomes `onException`.
template <typename Body>
int32_t noThrow(int32_t onException, Body&& body) {
    try {
        return body();
    } catch (...) {
        return onException;
    }
}

// The server thread, for tests that need its exit value. Valid once
// vokpkcs11_comm_server_init has returned 0.
pthread_t serverThread();

}  // namespace vokcomm

#endif
