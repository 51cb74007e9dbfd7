#ifndef VOK_COMM_INTERNAL_H
#define VOK_COMM_INTERNAL_H

// Helpers shared by the two ends of the channel. Hidden in the shared library;
// unit tests reach them through the static archive.

#include <pthread.h>
#include <sys/socket.h>
#include <sys/types.h>
#include <sys/un.h>

#include <cstdint>
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

// The string form of a CommandCallback, for the server executor of this
// library: it gives the same answers and statuses, but takes the request as
// the string the channel received it into and leaves the answer in `answer`,
// which the channel sends as it is, so that a large payload is not copied on
// the way. Called on the server thread only.
using StringCommandCallback = int32_t (*)(const std::string& request, std::string* answer);

// Makes the server thread call `serve` for every PKCS#11 command while
// `callback` is the registered CommandCallback. Call before
// vokpkcs11_comm_server_init.
void registerStringForm(CommandCallback callback, StringCommandCallback serve);

}  // namespace vokcomm

#endif
