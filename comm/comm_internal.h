#ifndef VOK_COMM_INTERNAL_H
#define VOK_COMM_INTERNAL_H

// Helpers shared by the two ends of the channel. Hidden in the shared library;
// unit tests reach them through the static archive.

#include <pthread.h>
#include <sys/socket.h>
#include <sys/types.h>
#include <sys/un.h>

#include <cstdint>

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
