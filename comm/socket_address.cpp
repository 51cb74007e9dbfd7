#include <cerrno>
#include <cstring>

#include "comm_internal.h"

namespace vokcomm {

void buildSocketAddress(const char* serverId, sockaddr_un* addr) {
    std::memset(addr, 0, sizeof(*addr));
    addr->sun_family = AF_UNIX;
    if (serverId != nullptr) std::strncpy(addr->sun_path, serverId, sizeof(addr->sun_path) - 1);
    // The id's first character only holds the place of this NUL.
    addr->sun_path[0] = '\0';
}

ssize_t sendRetrying(int fd, const void* buf, size_t len, int flags) {
    ssize_t n;
    do {
        n = send(fd, buf, len, flags);
    } while (n < 0 && errno == EINTR);
    return n;
}

ssize_t recvRetrying(int fd, void* buf, size_t len, int flags) {
    ssize_t n;
    do {
        n = recv(fd, buf, len, flags);
    } while (n < 0 && errno == EINTR);
    return n;
}

}  // namespace vokcomm
