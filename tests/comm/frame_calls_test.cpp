// What one exchange costs in system calls, counted with the linker's --wrap
// around sendmsg, send and recv: a frame leaves in one sendmsg, and an answer's
// header and small payload arrive with one recv.
#include <sys/socket.h>

#include <atomic>
#include <cstdlib>
#include <cstring>
#include <string>

#include "comm_internal.h"
#include "raw_peer.h"

namespace {
std::atomic<bool> counting{false};
std::atomic<pthread_t> clientThread;
struct Counts {
    std::atomic<int> sendmsg{0}, send{0}, recv{0};
};
Counts client, server;
Counts& countsOfThisThread() {
    return pthread_equal(pthread_self(), clientThread.load()) ? client : server;
}
}  // namespace

extern "C" ssize_t __real_sendmsg(int fd, const msghdr* message, int flags);
extern "C" ssize_t __wrap_sendmsg(int fd, const msghdr* message, int flags) {
    if (counting) ++countsOfThisThread().sendmsg;
    return __real_sendmsg(fd, message, flags);
}
extern "C" ssize_t __real_send(int fd, const void* buf, size_t len, int flags);
extern "C" ssize_t __wrap_send(int fd, const void* buf, size_t len, int flags) {
    if (counting) ++countsOfThisThread().send;
    return __real_send(fd, buf, len, flags);
}
extern "C" ssize_t __real_recv(int fd, void* buf, size_t len, int flags);
extern "C" ssize_t __wrap_recv(int fd, void* buf, size_t len, int flags) {
    if (counting) ++countsOfThisThread().recv;
    return __real_recv(fd, buf, len, flags);
}

namespace voktest {
namespace {

int32_t echo(const void* request, int32_t length, void** response, uint32_t* responseLength) {
    auto* copy = new uint8_t[length];
    std::memcpy(copy, request, static_cast<size_t>(length));
    *response = copy;
    *responseLength = static_cast<uint32_t>(length);
    return 0;
}

TEST(FrameCalls, AnExchangeIsOneSendmsgAndOneRecvAtEachEnd) {
    const std::string id = uniqueServerId();
    clientThread = pthread_self();
    ASSERT_EQ(0, vokpkcs11_comm_server_init(id.c_str(), echo));
    ASSERT_TRUE(waitUntil([&] { return vokpkcs11_comm_client_init(id.c_str()) == 0; }));
    constexpr int kExchanges = 10;
    counting = true;
    for (int i = 0; i < kExchanges; ++i) {
        const std::string request(100 + i, 'x');
        void* response = nullptr;
        uint32_t length = 0;
        ASSERT_EQ(0, vokpkcs11_comm_client_execute_command(
                         request.data(), static_cast<int32_t>(request.size()), &response, &length));
        EXPECT_EQ(request, std::string(static_cast<char*>(response), length));
        std::free(response);
    }
    counting = false;
    EXPECT_EQ(client.sendmsg, kExchanges);
    EXPECT_EQ(client.send, 0);
    EXPECT_EQ(client.recv, 2 * kExchanges);  // the drain's, and the answer's
    EXPECT_EQ(server.sendmsg, kExchanges);
    EXPECT_EQ(server.send, 0);
    // The last recv may be the one that waits for the next request.
    EXPECT_GE(server.recv, kExchanges);
    EXPECT_LE(server.recv, kExchanges + 1);
}

}  // namespace
}  // namespace voktest
