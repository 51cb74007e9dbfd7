// The client end against a raw peer that plays the server by hand.

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstdlib>
#include <functional>
#include <thread>

#include "comm_internal.h"
#include "log_capture.h"
#include "raw_peer.h"

namespace voktest {
namespace {

const char kTag[] = "VOKPKCS11-COMM_CLIENT";
void* const kUntouched = reinterpret_cast<void*>(0x5a5a);
constexpr uint32_t kUntouchedLength = 0xa5a5;

using PeerPart = std::function<void(RawSocket&)>;

// Reads the request, then answers with `reply` as raw bytes.
PeerPart replyWith(const Bytes& reply) {
    return [reply](RawSocket& s) {
        WireHeader h;
        Bytes p;
        s.recvFrame(&h, &p);
        s.sendBytes(reply);
    };
}

struct Outcome {
    int32_t status = -1;
    void* response = kUntouched;
    uint32_t length = kUntouchedLength;
    bool untouched() const { return response == kUntouched && length == kUntouchedLength; }
    Bytes data() const {
        if (untouched()) return {};
        auto* p = static_cast<const uint8_t*>(response);
        return Bytes(p, p + length);
    }
};

class ClientChannelTest : public ::testing::Test {
protected:
    void TearDown() override {
        for (auto& o : outcomes_)
            if (!o.untouched()) std::free(o.response);
    }

    void connectClient() {
        std::thread peerThread([&] {
            peer = listener.accept();
            answerHandshake(peer);
        });
        const int32_t status = vokpkcs11_comm_client_init(id.c_str());
        peerThread.join();
        ASSERT_EQ(0, status);
        ASSERT_TRUE(peer.valid());
    }

    // One exchange while `peerPart` plays the server on another thread.
    Outcome exchange(const Bytes& request, const PeerPart& peerPart) {
        std::thread peerThread([&] { peerPart(peer); });
        Outcome o;
        o.status = vokpkcs11_comm_client_execute_command(
            request.data(), static_cast<int32_t>(request.size()), &o.response, &o.length);
        peerThread.join();
        outcomes_.push_back(o);
        return o;
    }

    std::vector<std::string> lines() const { return log.texts(kTag); }

    LogCapture log;
    std::string id = uniqueServerId();
    RawListener listener{id};
    RawSocket peer;

private:
    std::vector<Outcome> outcomes_;
};

TEST_F(ClientChannelTest, HandshakeSendsVersionOneSecondInitKeepsConnectionDeinitCloses) {
    Bytes handshake;
    std::thread peerThread([&] {
        peer = listener.accept();
        peer.recvBytes(20, &handshake);
        peer.sendBytes(encodeFrame({100, 104, 0, 4}, int32Bytes(1)));
    });
    const int32_t status = vokpkcs11_comm_client_init(id.c_str());
    peerThread.join();
    ASSERT_EQ(0, status);
    EXPECT_EQ(encodeFrame({100, 103, 0, 4}, int32Bytes(1)), handshake);
    EXPECT_TRUE(inOrder(lines(), {"Entry server id " + id, "Client send version returned 0",
                                  "Exit - success", "Exit - Init success"}));

    EXPECT_EQ(1, vokpkcs11_comm_client_init(id.c_str()));
    EXPECT_EQ("Already initialized", lines().back());
    Outcome o =
        exchange(textBytes("ping"), replyWith(encodeFrame({101, 104, 0, 4}, textBytes("pong"))));
    EXPECT_EQ(0, o.status);
    EXPECT_EQ(textBytes("pong"), o.data());

    EXPECT_EQ(0, vokpkcs11_comm_client_deinit());
    EXPECT_EQ("Exit - Success", lines().back());
    EXPECT_TRUE(peer.readsEndOfStream());
    void* response;
    uint32_t length;
    EXPECT_EQ(2, vokpkcs11_comm_client_execute_command("x", 1, &response, &length));
    connectClient();
    EXPECT_EQ(0,
              exchange(textBytes("again"), replyWith(encodeFrame({101, 104, 0, 1}, {7}))).status);
}

struct HandshakeCase {
    const char* name;
    bool readsRequest;  // false: closes with the request unread, which resets the client
    Bytes reply;
    int32_t cause;
};

void PrintTo(const HandshakeCase& c, std::ostream* os) { *os << c.name; }

class HandshakeFailure : public ClientChannelTest,
                         public ::testing::WithParamInterface<HandshakeCase> {};

// The client closes its socket after the failure, and init can be retried.
TEST_P(HandshakeFailure, IsThreeWithTheCauseLoggedAndInitCanBeRetried) {
    const HandshakeCase& c = GetParam();
    std::thread peerThread([&] {
        peer = listener.accept();
        Bytes request;
        if (c.readsRequest)
            peer.recvBytes(20, &request);
        else
            peer.waitQueued(20);
        peer.sendBytes(c.reply);
        // Where the client read the whole answer, its close ends the stream.
        if (c.reply.size() == kWireHeaderSize || c.cause == 4) {
            EXPECT_TRUE(peer.readsEndOfStream());
        }
        peer.close();
    });
    EXPECT_EQ(3, vokpkcs11_comm_client_init(id.c_str()));
    peerThread.join();
    EXPECT_EQ("Client check version failed " + std::to_string(c.cause), lines().back());
    void* response;
    uint32_t length;
    EXPECT_EQ(2, vokpkcs11_comm_client_execute_command("x", 1, &response, &length));
    connectClient();
}

const Bytes kOne = int32Bytes(1);
INSTANTIATE_TEST_SUITE_P(
    Causes, HandshakeFailure,
    ::testing::Values(
        HandshakeCase{"WrongId", true, encodeFrame({101, 104, 0, 4}, kOne), 15},
        HandshakeCase{"IdCheckedBeforeLength", true, encodeFrame({101, 103, 1, 8}), 15},
        HandshakeCase{"WrongLength", true, encodeFrame({100, 104, 0, 8}, kOne), 17},
        HandshakeCase{"LengthCheckedBeforeType", true, encodeFrame({100, 103, 1, 0}), 17},
        HandshakeCase{"WrongType", true, encodeFrame({100, 103, 0, 4}, kOne), 16},
        HandshakeCase{"TypeCheckedBeforeStatus", true, encodeFrame({100, 103, 1, 4}, kOne), 16},
        HandshakeCase{"NonZeroStatus", true, encodeFrame({100, 104, 1, 4}, kOne), 20},
        HandshakeCase{"VersionTwo", true, encodeFrame({100, 104, 0, 4}, int32Bytes(2)), 4},
        HandshakeCase{"ClosedBeforeAnswer", true, {}, 13},
        HandshakeCase{"ClosedMidHeader", true, Bytes(8, 0), 13},
        HandshakeCase{"ResetWithRequestUnread", false, {}, 10}),
    [](const ::testing::TestParamInfo<HandshakeCase>& info) {
        return std::string(info.param.name);
    });

// Every other case's listener binds the full-length abstract name, so they
// show that the client connects with it.
TEST_F(ClientChannelTest, ConnectFailureIsSevenAndNothingWorksWithoutInit) {
    EXPECT_EQ(7, vokpkcs11_comm_client_init((id + "-nobody").c_str()));
    EXPECT_EQ("Socket connect failed", lines().back());
    log.clear();
    void* response = kUntouched;
    uint32_t length = kUntouchedLength;
    EXPECT_EQ(2, vokpkcs11_comm_client_execute_command("x", 1, &response, &length));
    EXPECT_EQ(2, vokpkcs11_comm_client_execute_command("x", 0, &response, &length));
    EXPECT_EQ(2, vokpkcs11_comm_client_deinit());
    EXPECT_EQ((std::vector<std::string>{"Entry", "Not initialized", "Entry", "Not initialized",
                                        "Entry", "Not initialized"}),
              lines());
}

TEST_F(ClientChannelTest, SocketCreationFailureIsSix) {
    ASSERT_TRUE(setSoftLimit(RLIMIT_NOFILE, static_cast<uint64_t>(lowestFreeDescriptor())));
    EXPECT_EQ(6, vokpkcs11_comm_client_init(id.c_str()));
    EXPECT_EQ("Socket create failed", lines().back());
}

TEST_F(ClientChannelTest, InvalidArgumentsAreFiveAndSendNothing) {
    connectClient();
    void* response;
    uint32_t length;
    EXPECT_EQ(5, vokpkcs11_comm_client_execute_command("x", 0, &response, &length));
    EXPECT_EQ(5, vokpkcs11_comm_client_execute_command("x", -1, &response, &length));
    EXPECT_EQ(5, vokpkcs11_comm_client_execute_command(nullptr, 1, &response, &length));
    EXPECT_EQ(5, vokpkcs11_comm_client_execute_command("x", 1, nullptr, &length));
    EXPECT_EQ(5, vokpkcs11_comm_client_execute_command("x", 1, &response, nullptr));
    EXPECT_EQ("Invalid arguments", lines().back());
    // The first bytes the peer sees are those of the next valid request.
    Bytes request;
    Outcome o = exchange(textBytes("abc"), [&](RawSocket& s) {
        s.recvBytes(19, &request);
        s.sendFrame({101, 104, 0, 1}, textBytes("z"));
    });
    EXPECT_EQ(0, o.status);
    EXPECT_EQ(encodeFrame({101, 103, 0, 3}, textBytes("abc")), request);
    EXPECT_EQ(textBytes("z"), o.data());
}

TEST_F(ClientChannelTest, NonZeroStatusIsSuccessWithoutDataAndLeftoversAreDrained) {
    connectClient();
    Bytes reply = encodeFrame({101, 104, 7, 0});
    const Bytes stray = textBytes("stale");  // framed by no header
    reply.insert(reply.end(), stray.begin(), stray.end());
    Outcome first = exchange(textBytes("one"), replyWith(reply));
    EXPECT_EQ(0, first.status);
    EXPECT_TRUE(first.untouched());
    EXPECT_EQ("Client receive header failed 0", lines().back());

    Outcome second =
        exchange(textBytes("two"), replyWith(encodeFrame({101, 104, 0, 5}, textBytes("fresh"))));
    EXPECT_EQ(0, second.status);
    EXPECT_EQ(textBytes("fresh"), second.data());
    EXPECT_TRUE(inOrder(lines(), {"Recv returned :5", "Errno:Resource temporarily unavailable"}));
}

struct ExchangeFailureCase {
    const char* name;
    PeerPart peerPart;
    int32_t status;
    const char* line;
    bool framingLost;
};

void PrintTo(const ExchangeFailureCase& c, std::ostream* os) { *os << c.name; }

class ExchangeFailure : public ClientChannelTest,
                        public ::testing::WithParamInterface<ExchangeFailureCase> {};

// After an answer whose framing is in doubt, whatever the old connection still
// delivers (here a late "late") must never be taken for the next answer: the
// next exchange connects again and shakes hands first.
TEST_P(ExchangeFailure, ReturnsStatusWritesNoOutputAndReconnectsWhenFramingIsLost) {
    const ExchangeFailureCase& c = GetParam();
    connectClient();
    if (c.status == 11) peer.close();  // the request itself cannot be sent
    Outcome o = exchange(textBytes("one"), c.peerPart);
    EXPECT_EQ(c.status, o.status);
    EXPECT_TRUE(o.untouched());
    EXPECT_EQ(c.line, lines().back());
    if (!c.framingLost) return;
    Outcome next = exchange(textBytes("two"), [&](RawSocket& old) {
        old.sendFrame({101, 104, 0, 4}, textBytes("late"));
        RawSocket fresh = listener.accept();
        WireHeader h;
        Bytes request;
        if (answerHandshake(fresh) && fresh.recvFrame(&h, &request) && request == textBytes("two"))
            fresh.sendFrame({101, 104, 0, 5}, textBytes("fresh"));
        fresh.leaveOpen();
    });
    EXPECT_EQ(0, next.status);
    EXPECT_EQ(textBytes("fresh"), next.data());
    EXPECT_TRUE(inOrder(lines(), {"Reconnect to server id " + id, "Reconnected"}));
}

void readThenClose(RawSocket& s) {
    replyWith({})(s);
    s.close();
}

// clang-format off
INSTANTIATE_TEST_SUITE_P(Peers, ExchangeFailure, ::testing::Values(
    ExchangeFailureCase{"DataLenZero", replyWith(encodeFrame({101, 104, 0, 0})), 23,
                        "Client header error 0", false},
    ExchangeFailureCase{"WrongId", replyWith(encodeFrame({100, 104, 0, 1}, {1})), 23,
                        "Client header error 0", true},
    ExchangeFailureCase{"WrongType", replyWith(encodeFrame({101, 103, 0, 1}, {1})), 23,
                        "Client header error 0", true},
    ExchangeFailureCase{"NonZeroStatusWithUnreadPayload", replyWith(encodeFrame({101, 104, 7, 5})),
                        0, "Client receive header failed 0", true},
    ExchangeFailureCase{"NegativeDataLen", replyWith(encodeFrame({101, 104, 0, -2})), 21,
                        "Malloc failed", true},
    ExchangeFailureCase{"ClosedBeforeAnswer", readThenClose, 13,
                        "Client receive header failed 13", true},
    ExchangeFailureCase{"ResetWithRequestUnread",
                        [](RawSocket& s) { s.waitQueued(16 + 3); s.close(); },
                        10, "Client receive header failed 10", true},
    ExchangeFailureCase{"ClosedMidPayload",
                        [](RawSocket& s) {
                            replyWith(encodeFrame({101, 104, 0, 10}, Bytes(4, 9)))(s);
                            s.close();
                        },
                        13, "Client receive data failed 13", true},
    ExchangeFailureCase{"PeerClosedBeforeTheRequest", [](RawSocket&) {}, 11,
                        "Client send header failed 11", true}),
    [](const ::testing::TestParamInfo<ExchangeFailureCase>& info) {
        return std::string(info.param.name);
    });
// clang-format on

TEST_F(ClientChannelTest, PeerGoneDuringRequestPayloadIsElevenWithoutSigpipe) {
    connectClient();
    Outcome o = exchange(Bytes(8 << 20, 1), [](RawSocket& s) {
        WireHeader h;
        s.recvHeader(&h);
        s.close();
    });
    EXPECT_EQ(11, o.status);
    EXPECT_EQ("Client send data failed 11", lines().back());
}

TEST_F(ClientChannelTest, SignalDuringReceiveIsRetried) {
    connectClient();
    struct sigaction action = {};
    action.sa_handler = [](int) {};  // no SA_RESTART: recv sees EINTR
    ASSERT_EQ(0, sigaction(SIGUSR1, &action, nullptr));
    const int clientTid = static_cast<int>(syscall(SYS_gettid));
    const pthread_t clientThread = pthread_self();
    Outcome o = exchange(textBytes("slow"), [&](RawSocket& s) {
        Bytes request;
        s.recvBytes(20, &request);
        EXPECT_TRUE(waitBlockedIn(clientTid, {SYS_recvfrom}));
        pthread_kill(clientThread, SIGUSR1);
        s.sendFrame({101, 104, 0, 2}, textBytes("ok"));
    });
    EXPECT_EQ(0, o.status);
    EXPECT_EQ(textBytes("ok"), o.data());
}

TEST(ClientTransferHelpers, PrintInvalidArgumentsAndReturnFive) {
    uint8_t buffer[4] = {};
    const struct {
        int fd;
        uint8_t* buf;
        int32_t len;
    } cases[] = {{-1, buffer, 4}, {0, nullptr, 4}, {0, buffer, 0}, {0, buffer, -4}};
    for (const auto& c : cases) {
        ::testing::internal::CaptureStdout();
        EXPECT_EQ(5, client_send_data(c.fd, c.buf, c.len));
        EXPECT_EQ(5, client_recv_data(c.fd, c.buf, c.len));
        EXPECT_EQ(
            "[VOKPKCS11-COMM_CLIENT]:client_send_data() - Invalid arguments\n"
            "[VOKPKCS11-COMM_CLIENT]:client_recv_data() - Invalid arguments\n",
            ::testing::internal::GetCapturedStdout());
    }
}

}  // namespace
}  // namespace voktest
