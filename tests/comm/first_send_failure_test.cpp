// The handshake's first send failing. This executable is linked with
// --wrap=connect so that the peer can drop the connection in the instant
// between the client's connect and its first send.

#include <android/log.h>
#include <gtest/gtest.h>
#include <sys/socket.h>

#include <functional>

#include "log_capture.h"
#include "raw_peer.h"
#include "vok_comm.h"

namespace {
std::function<void()> afterConnect;
}

extern "C" int __real_connect(int fd, const sockaddr* addr, socklen_t length);

extern "C" int __wrap_connect(int fd, const sockaddr* addr, socklen_t length) {
    const int result = __real_connect(fd, addr, length);
    if (result == 0 && afterConnect) {
        auto hook = std::move(afterConnect);
        afterConnect = nullptr;
        hook();
    }
    return result;
}

namespace voktest {
namespace {

TEST(FirstHandshakeSend, FailsAfterTheMisleadingSuccessLine) {
    LogCapture log;
    const std::string id = uniqueServerId();
    RawListener listener(id);
    afterConnect = [&] { listener.accept().closeWithReset(); };

    EXPECT_EQ(3, vokpkcs11_comm_client_init(id.c_str()));
    EXPECT_EQ((std::vector<std::string>{"Entry server id " + id, "Bytes written:-1", "Exit 11",
                                        "Client send version returned 11", "Exit - success",
                                        "Client check version failed 11"}),
              log.texts("VOKPKCS11-COMM_CLIENT"));
    for (const auto& line : log.lines()) EXPECT_EQ(ANDROID_LOG_DEBUG, line.priority) << line;
}

}  // namespace
}  // namespace voktest
