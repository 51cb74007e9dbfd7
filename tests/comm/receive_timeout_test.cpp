// The client's 30-second receive timeout, and the late answer that must never
// be taken for the next one. Labelled slow: it waits for the real timeout.

#include <gtest/gtest.h>

#include <chrono>
#include <cstdlib>
#include <thread>

#include "log_capture.h"
#include "raw_peer.h"
#include "vok_comm.h"

namespace voktest {
namespace {

TEST(ReceiveTimeout, IsTenAndTheLateAnswerNeverReachesTheNextExchange) {
    LogCapture log;
    const std::string id = uniqueServerId();
    RawListener listener(id);
    RawSocket peer;
    std::thread handshake([&] {
        peer = listener.accept();
        answerHandshake(peer);
    });
    const int32_t status = vokpkcs11_comm_client_init(id.c_str());
    handshake.join();
    ASSERT_EQ(0, status);

    Gate timedOut;
    std::thread server([&] {
        WireHeader h;
        Bytes first, second;
        peer.recvFrame(&h, &first);
        timedOut.wait(std::chrono::seconds(60));
        RawSocket fresh = listener.accept();
        // The abandoned request is answered only now, with the next request on its way.
        peer.sendFrame({101, 104, 0, 4}, textBytes("late"));
        if (answerHandshake(fresh) && fresh.recvFrame(&h, &second)) {
            EXPECT_EQ(textBytes("second"), second);
            fresh.sendFrame({101, 104, 0, 5}, textBytes("fresh"));
        }
    });

    void* response = nullptr;
    uint32_t length = 0;
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(10, vokpkcs11_comm_client_execute_command("first", 5, &response, &length));
    const auto waited = std::chrono::steady_clock::now() - start;
    EXPECT_GE(waited, std::chrono::seconds(30));
    EXPECT_LT(waited, std::chrono::seconds(35));
    EXPECT_EQ("Client receive header failed 10", log.texts("VOKPKCS11-COMM_CLIENT").back());
    timedOut.open();

    ASSERT_EQ(0, vokpkcs11_comm_client_execute_command("second", 6, &response, &length));
    EXPECT_EQ("fresh", std::string(static_cast<const char*>(response), length));
    std::free(response);
    server.join();
}

}  // namespace
}  // namespace voktest
