// Arbitrary byte streams from a client into the server end's accept loop:
// headers, lengths, partial frames, early close. Each input is one
// connection. Its first byte says how the rest is written (in pieces of 1,
// 7, 16 or all bytes at once) and whether the client then closes at once or
// half-closes and reads every answer until the server closes. The callback
// answers by the first payload byte: the payload echoed, an empty answer, or
// a status that sends nothing (some of which close the connection).

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <new>
#include <string>

#include "comm_internal.h"
#include "fuzz_support.h"

namespace {

std::string id;

int32_t answer(const void* request, int32_t length, void** response, uint32_t* responseLength) {
    const auto* bytes = static_cast<const uint8_t*>(request);
    switch (bytes[0] % 4) {
        case 0:
        case 1: {
            const uint32_t n = bytes[0] % 4 == 0 ? static_cast<uint32_t>(length) : 0;
            auto* copy = new (std::nothrow) uint8_t[n];
            if (copy == nullptr) return CHANNEL_OUT_OF_MEMORY;
            if (n) std::memcpy(copy, bytes, n);
            *response = copy;
            *responseLength = n;
            return CHANNEL_OK;
        }
        default:
            return length > 1 ? bytes[1] % 24 : CHANNEL_SEND_FAILED;
    }
}

int connectToServer() {
    sockaddr_un address;
    vokcomm::buildSocketAddress(id.c_str(), &address);
    for (int attempt = 0; attempt < 1000; ++attempt) {
        int fd = socket(AF_UNIX, SOCK_STREAM, 0);
        if (connect(fd, reinterpret_cast<sockaddr*>(&address), vokcomm::socketAddressLength()) == 0)
            return fd;
        close(fd);
        usleep(1000);
    }
    __builtin_trap();  // the server never listened
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    vokfuzz::quietLogs();
    id = vokfuzz::serverId("channel");
    if (vokpkcs11_comm_server_init(id.c_str(), answer) != CHANNEL_OK) __builtin_trap();
    close(connectToServer());
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size == 0) return 0;
    const uint8_t how = data[0];
    const size_t pieces[] = {1, 7, 16, SIZE_MAX};
    const size_t piece = pieces[how % 4];
    const bool closeAtOnce = how & 4;
    ++data, --size;

    int fd = connectToServer();
    for (size_t sent = 0; sent < size;) {
        ssize_t n = send(fd, data + sent, std::min(piece, size - sent), MSG_NOSIGNAL);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) break;  // the server closed: the rest is never read
        sent += static_cast<size_t>(n);
    }
    if (!closeAtOnce) {
        shutdown(fd, SHUT_WR);
        // The server must close once the stream has ended; a hang is a finding.
        timeval limit{20, 0};
        setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof(limit));
        char sink[4096];
        ssize_t n;
        while ((n = recv(fd, sink, sizeof(sink), 0)) > 0 || (n < 0 && errno == EINTR)) {
        }
        // A server that closes with bytes of ours unread resets the
        // connection: a close too. Only the timeout is a hang.
        if (n < 0 && errno != ECONNRESET) __builtin_trap();
    }
    close(fd);
    return 0;
}
