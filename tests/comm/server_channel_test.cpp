// The server end against raw clients that speak the frame protocol by hand,
// and the two ends together.

#include <pthread.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <list>
#include <new>
#include <thread>

#include "comm_internal.h"
#include "log_capture.h"
#include "raw_peer.h"

// accept() fails with EINVAL while this is above 0: an error that does not go
// away by itself.
std::atomic<int> failingAccepts{0};
extern "C" int __real_accept(int fd, sockaddr* address, socklen_t* length);
extern "C" int __wrap_accept(int fd, sockaddr* address, socklen_t* length) {
    if (failingAccepts > 0 && failingAccepts-- > 0) {
        errno = EINVAL;
        return -1;
    }
    return __real_accept(fd, address, length);
}

// The system calls an exchange makes, counted per end while `counting`.
namespace {
std::atomic<bool> counting{false};
std::atomic<pthread_t> clientThread;
struct Counts {
    std::atomic<int> sendmsg{0}, send{0}, recv{0};
};
Counts clientCalls, serverCalls;
Counts& callsOfThisThread() {
    return pthread_equal(pthread_self(), clientThread.load()) ? clientCalls : serverCalls;
}
}  // namespace

extern "C" ssize_t __real_sendmsg(int fd, const msghdr* message, int flags);
extern "C" ssize_t __wrap_sendmsg(int fd, const msghdr* message, int flags) {
    if (counting) ++callsOfThisThread().sendmsg;
    return __real_sendmsg(fd, message, flags);
}
extern "C" ssize_t __real_send(int fd, const void* buf, size_t len, int flags);
extern "C" ssize_t __wrap_send(int fd, const void* buf, size_t len, int flags) {
    if (counting) ++callsOfThisThread().send;
    return __real_send(fd, buf, len, flags);
}
extern "C" ssize_t __real_recv(int fd, void* buf, size_t len, int flags);
extern "C" ssize_t __wrap_recv(int fd, void* buf, size_t len, int flags) {
    if (counting) ++callsOfThisThread().recv;
    return __real_recv(fd, buf, len, flags);
}

namespace voktest {
namespace {

const char kServerTag[] = "VOKPKCS11-COMM_SERVER";
const WireHeader kVersionRequest{100, 103, 0, 4};
const WireHeader kVersionAnswer{100, 104, 0, 4};

// Hands `bytes` over the way the dispatcher does, with new[]: the sanitizer
// build sees the channel release it with anything but delete[].
int32_t answer(const Bytes& bytes, void** response, uint32_t* length) {
    auto* buffer = new (std::nothrow) uint8_t[bytes.size()];
    if (buffer == nullptr) return CHANNEL_OUT_OF_MEMORY;
    if (!bytes.empty()) std::memcpy(buffer, bytes.data(), bytes.size());
    *response = buffer;
    *length = static_cast<uint32_t>(bytes.size());
    return CHANNEL_OK;
}

// What the callback does with one request in the running test.
std::function<int32_t(const Bytes& request, void** response, uint32_t* length)> commandHandler =
    answer;

int32_t testCallback(const void* request, int32_t length, void** response,
                     uint32_t* responseLength) {
    EXPECT_EQ(nullptr, *response);
    EXPECT_EQ(0u, *responseLength);
    const auto* p = static_cast<const uint8_t*>(request);
    return commandHandler(Bytes(p, p + length), response, responseLength);
}

WireHeader commandHeader(size_t length) { return {101, 103, 0, static_cast<int32_t>(length)}; }

// The client's next answer is the one to this version request: whatever was
// sent before it was answered with nothing.
void expectVersionAnswered(RawSocket& client) {
    WireHeader h;
    Bytes payload;
    ASSERT_TRUE(client.sendFrame(kVersionRequest, int32Bytes(1)));
    ASSERT_TRUE(client.recvFrame(&h, &payload));
    EXPECT_EQ(kVersionAnswer, h);
    EXPECT_EQ(int32Bytes(1), payload);
}

class ServerChannelTest : public ::testing::Test {
protected:
    // Waits until the server thread only waits for input, so that it does not
    // log into a capture being torn down, and leaves the clients' connections
    // open until the process ends.
    void TearDown() override {
        for (auto& client : clients) client.leaveOpen();
        if (!serverRunning) return;
        const std::string waiting = "Wait for new client " + id;
        EXPECT_TRUE(waitUntil([&] {
            auto all = lines();
            return !all.empty() &&
                   (all.back() == "Entry - Recv buf len:16" || all.back() == waiting);
        }));
    }

    void startServer(const std::string& serverId) {
        ASSERT_EQ(0, vokpkcs11_comm_server_init(serverId.c_str(), testCallback));
        serverRunning = true;
        ASSERT_TRUE(
            waitUntil([&] { return log.contains(kServerTag, "Wait for new client " + serverId); }));
    }

    RawSocket& start() {
        startServer(id);
        return connectClient();
    }

    RawSocket& connectClient() {
        clients.push_back(rawConnect(id));
        EXPECT_TRUE(clients.back().valid());
        return clients.back();
    }

    std::vector<std::string> lines() const { return log.texts(kServerTag); }
    bool waitForLine(const std::string& line) const {
        return waitUntil([&] { return log.contains(kServerTag, line); });
    }

    LogCapture log;
    std::string id = uniqueServerId();
    bool serverRunning = false;
    std::list<RawSocket> clients;
};

TEST_F(ServerChannelTest, InitDeinitStatuses) {
    EXPECT_EQ(2, vokpkcs11_comm_server_deinit());
    EXPECT_EQ("Not initialized", lines().back());
    EXPECT_EQ(5, vokpkcs11_comm_server_init(nullptr, testCallback));
    EXPECT_EQ(5, vokpkcs11_comm_server_init(id.c_str(), nullptr));
    EXPECT_EQ("Invalid arguments", lines().back());

    RawSocket& client = start();
    EXPECT_TRUE(inOrder(lines(), {"Entry - server id " + id, "Exit - success"}));
    EXPECT_EQ(1, vokpkcs11_comm_server_init(id.c_str(), testCallback));
    EXPECT_EQ(0, vokpkcs11_comm_server_deinit());
    EXPECT_TRUE(inOrder(lines(), {"vokpkcs11_comm_server_deinit Entry", "Exit"}));
    // deinit stops nothing.
    EXPECT_EQ(1, vokpkcs11_comm_server_init(id.c_str(), testCallback));
    expectVersionAnswered(client);
}

// Frames the server answers with nothing, keeping the connection: a version
// other than 1, a version command of the wrong length, a response type, no
// payload, an unknown id, a length that cannot be allocated.
TEST_F(ServerChannelTest, InvalidFramesGetNoAnswerAndKeepTheConnection) {
    RawSocket& client = start();
    ASSERT_TRUE(client.sendFrame(kVersionRequest, int32Bytes(2)));
    ASSERT_TRUE(client.sendFrame({100, 103, 0, 8}, Bytes(8, 1)));
    ASSERT_TRUE(client.sendHeader({101, 104, 0, 4}));
    ASSERT_TRUE(client.sendHeader({101, 103, 0, 0}));
    ASSERT_TRUE(client.sendFrame({19, 103, 0, 3}, textBytes("abc")));
    ASSERT_TRUE(client.sendHeader({101, 103, 0, -8}));
    expectVersionAnswered(client);
    EXPECT_TRUE(inOrder(lines(), {"Client ver:2 Server ver:1", "Client and server version mismatch",
                                  "process command returned :4", "process_client_command ret :4",
                                  "Command len invalid", "process command returned :18",
                                  "Receive header failed", "process_client_command ret :18",
                                  "Receive header failed", "process_client_command ret :18",
                                  "process command returned :19", "process_client_command ret :19",
                                  "Malloc failed", "process_client_command ret :21",
                                  "Client ver:1 Server ver:1"}));
}

TEST_F(ServerChannelTest, EmptyAnswerSendsAHeaderWithDataLenZero) {
    commandHandler = [](const Bytes&, void** response, uint32_t* length) {
        return answer({}, response, length);
    };
    RawSocket& client = start();
    WireHeader h;
    Bytes payload;
    ASSERT_TRUE(client.sendFrame(commandHeader(1), {1}));
    ASSERT_TRUE(client.recvFrame(&h, &payload));
    EXPECT_EQ((WireHeader{101, 104, 0, 0}), h);
    expectVersionAnswered(client);
    EXPECT_TRUE(inOrder(lines(), {"Entry - send data len:0", "Invalid argument", "Exit ret:5",
                                  "process_client_command ret :5"}));
}

// A callback's failure sends nothing; only 2, 10 and 11 close the connection.
TEST_F(ServerChannelTest, CallbackStatusesSendNothingAndCloseOnlyOnTwoTenEleven) {
    int32_t status = 0;
    commandHandler = [&](const Bytes&, void**, uint32_t*) { return status; };
    RawSocket* client = &start();
    for (const auto& [s, closes] : {std::pair<int32_t, bool>{2, true},
                                    {10, true},
                                    {11, true},
                                    {1, false},
                                    {12, false},
                                    {21, false}}) {
        SCOPED_TRACE(s);
        status = s;
        ASSERT_TRUE(client->sendFrame(commandHeader(1), {1}));
        if (closes) {
            EXPECT_TRUE(client->readsEndOfStream());
            client = &connectClient();
        }
        expectVersionAnswered(*client);
        const std::string n = std::to_string(s);
        EXPECT_TRUE(inOrder(lines(), {"Exit ret:" + n, "process command returned :" + n,
                                      "process_client_command ret :" + n}));
    }
}

TEST_F(ServerChannelTest, ResetByClientIsTwelveThenTheClosedConnectionIsDropped) {
    RawSocket& first = start();
    ASSERT_TRUE(first.sendFrame(kVersionRequest, int32Bytes(1)));
    ASSERT_TRUE(first.waitQueued(20));
    first.close();  // the answer unread: the server's next receive is reset
    ASSERT_TRUE(waitForLine("Socket error. Wait for new client"));
    EXPECT_TRUE(
        inOrder(lines(), {"server_recv_data failed ret:12", "process_client_command ret :12",
                          "server_recv_data failed ret:10", "process_client_command ret :10",
                          "Socket error. Wait for new client", "Wait for new client " + id}));
    expectVersionAnswered(connectClient());
}

TEST_F(ServerChannelTest, ClientGoneDuringLargeAnswerDoesNotStopTheService) {
    commandHandler = [](const Bytes&, void** response, uint32_t* length) {
        *length = 64 << 20;
        *response = new (std::nothrow) uint8_t[*length]();
        return *response != nullptr ? CHANNEL_OK : CHANNEL_OUT_OF_MEMORY;
    };
    RawSocket& first = start();
    WireHeader h;
    ASSERT_TRUE(first.sendFrame(commandHeader(1), {1}));
    ASSERT_TRUE(first.recvHeader(&h));
    EXPECT_EQ(64 << 20, h.dataLen);
    first.close();
    // SIGPIPE keeps its default action here: raised in the server thread, it
    // would end this process.
    expectVersionAnswered(connectClient());
    EXPECT_TRUE(inOrder(lines(), {"Exit ret:11", "process_client_command ret :11",
                                  "Socket error. Wait for new client"}));
}

TEST_F(ServerChannelTest, UsageTimeIsMinusOneWhileACommandIsWorkedOn) {
    Gate entered, release;
    commandHandler = [&](const Bytes& request, void** response, uint32_t* length) {
        entered.open();
        release.wait();
        return answer(request, response, length);
    };
    RawSocket& client = start();
    EXPECT_EQ(0, vokpkcs11_comm_server_getLastUsageTime());
    ASSERT_TRUE(client.sendFrame(commandHeader(1), {1}));
    ASSERT_TRUE(entered.wait());
    EXPECT_EQ(-1, vokpkcs11_comm_server_getLastUsageTime());
    release.open();
    WireHeader h;
    Bytes payload;
    ASSERT_TRUE(client.recvFrame(&h, &payload));

    // A window within one second, so that the request's and the response's
    // values compare as times. The answer's time is recorded just after it is
    // sent: its own log line says when.
    auto answerTimesRecorded = [&] {
        auto all = lines();
        return std::count_if(all.begin(), all.end(), [](const std::string& l) {
            return l.rfind("Last used Time Response", 0) == 0;
        });
    };
    timeval before, after;
    do {
        const auto recorded = answerTimesRecorded();
        gettimeofday(&before, nullptr);
        expectVersionAnswered(client);
        ASSERT_TRUE(waitUntil([&] { return answerTimesRecorded() > recorded; }));
        gettimeofday(&after, nullptr);
    } while (before.tv_sec != after.tv_sec);
    // Seconds plus the milliseconds of the current second, as the server keeps it.
    const int32_t value = vokpkcs11_comm_server_getLastUsageTime();
    EXPECT_GE(value, before.tv_sec + before.tv_usec / 1000);
    EXPECT_LE(value, after.tv_sec + after.tv_usec / 1000);

    char expected[64];
#pragma GCC diagnostic push
#pragma GCC diagnostic ignored "-Wformat"
#pragma GCC diagnostic ignored "-Wformat-extra-args"
    std::snprintf(expected, sizeof(expected), "Last used Time Response: %l\n", value);
#pragma GCC diagnostic pop
    EXPECT_TRUE(log.contains(kServerTag, expected));
}

struct SetUpFailureCase {
    const char* name;
    int32_t exitStatus;
    const char* line;
};

void PrintTo(const SetUpFailureCase& c, std::ostream* os) { *os << c.name; }

class ServerSetUpFailure : public ServerChannelTest,
                           public ::testing::WithParamInterface<SetUpFailureCase> {};

TEST_P(ServerSetUpFailure, EndsTheThreadAfterInitSucceeded) {
    RawListener squatter(id);
    if (GetParam().exitStatus == CHANNEL_SOCKET_CREATE_FAILED) {
        ASSERT_TRUE(setSoftLimit(RLIMIT_NOFILE, static_cast<uint64_t>(lowestFreeDescriptor())));
    }
    ASSERT_EQ(0, vokpkcs11_comm_server_init(id.c_str(), testCallback));
    void* exitValue = nullptr;
    ASSERT_EQ(0, pthread_join(vokcomm::serverThread(), &exitValue));
    EXPECT_EQ(GetParam().exitStatus, static_cast<int32_t>(reinterpret_cast<intptr_t>(exitValue)));
    EXPECT_TRUE(inOrder(lines(), {"Entry " + id, GetParam().line}));
}

INSTANTIATE_TEST_SUITE_P(Causes, ServerSetUpFailure,
                         ::testing::Values(SetUpFailureCase{"NameTaken", 8, "socket bind failed"},
                                           SetUpFailureCase{"NoDescriptor", 6,
                                                            "socket creation failed"}),
                         [](const ::testing::TestParamInfo<SetUpFailureCase>& info) {
                             return std::string(info.param.name);
                         });

TEST_F(ServerChannelTest, ThreadCreationFailureIsFourteenAndInitCanBeRetried) {
#if defined(__SANITIZE_ADDRESS__)
    GTEST_SKIP() << "the sanitizer reserves more address space than the limit leaves";
#endif
    const uint64_t saved = softLimit(RLIMIT_AS);
    ASSERT_TRUE(setSoftLimit(RLIMIT_AS, addressSpaceInUse() + (1u << 20)));
    const int32_t status = vokpkcs11_comm_server_init(id.c_str(), testCallback);
    ASSERT_TRUE(setSoftLimit(RLIMIT_AS, saved));
    EXPECT_EQ(14, status);
    EXPECT_EQ("Thread create failed " + std::to_string(EAGAIN), lines().back());
    expectVersionAnswered(start());
}

TEST_F(ServerChannelTest, APersistentAcceptErrorIsRetriedAfterAPauseNotInABusyLoop) {
    failingAccepts = 1 << 30;
    startServer(id);
    auto failures = [&] {
        auto all = lines();
        return std::count(all.begin(), all.end(), "socket accept failed");
    };
    ASSERT_TRUE(waitUntil([&] { return failures() > 0; }));
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    EXPECT_LT(failures(), 20);
    failingAccepts = 0;
    expectVersionAnswered(connectClient());
}

TEST(ServerTransferHelpers, RejectInvalidArguments) {
    LogCapture log;
    uint8_t buffer[4] = {};
    ::testing::internal::CaptureStdout();
    EXPECT_EQ(5, server_recv_data(-1, buffer, 4));
    EXPECT_EQ(5, server_recv_data(0, nullptr, 4));
    EXPECT_EQ(5, server_recv_data(0, buffer, 0));
    EXPECT_EQ(
        "[VOKPKCS11-COMM_SERVER]:server_recv_data() - Invalid argument\n"
        "[VOKPKCS11-COMM_SERVER]:server_recv_data() - Invalid argument\n"
        "[VOKPKCS11-COMM_SERVER]:server_recv_data() - Invalid argument\n",
        ::testing::internal::GetCapturedStdout());
    EXPECT_EQ(5, server_send_data(-1, buffer, 4));
    EXPECT_EQ(5, server_send_data(0, nullptr, 4));
    EXPECT_EQ(5, server_send_data(0, buffer, -1));
    EXPECT_EQ((std::vector<std::string>{
                  "Entry - Recv buf len:4", "Entry - Recv buf len:4", "Entry - Recv buf len:0",
                  "Entry - send data len:4", "Invalid argument", "Entry - send data len:4",
                  "Invalid argument", "Entry - send data len:-1", "Invalid argument"}),
              log.texts(kServerTag));
}

std::string exchangeText(const std::string& request, int32_t* status) {
    void* response = nullptr;
    uint32_t length = 0;
    *status = vokpkcs11_comm_client_execute_command(
        request.data(), static_cast<int32_t>(request.size()), &response, &length);
    std::string text(static_cast<const char*>(response), response ? length : 0);
    std::free(response);
    return text;
}

TEST_F(ServerChannelTest, IdsDifferingOnlyInTheirFirstCharacterMeet) {
    std::string serverId = id, clientId = id;
    serverId[0] = 'A';
    clientId[0] = 'B';
    startServer(serverId);
    ASSERT_EQ(0, vokpkcs11_comm_client_init(clientId.c_str()));
    int32_t status = -1;
    EXPECT_EQ("ping", exchangeText("ping", &status));
    EXPECT_EQ(0, status);
}

// A frame leaves in one sendmsg, and an answer's header and small payload
// arrive with one recv.
TEST_F(ServerChannelTest, AnExchangeIsOneSendmsgAndOneRecvAtEachEnd) {
    startServer(id);
    ASSERT_EQ(0, vokpkcs11_comm_client_init(id.c_str()));
    clientThread = pthread_self();
    constexpr int kExchanges = 10;
    counting = true;
    for (int i = 0; i < kExchanges; ++i) {
        const std::string request(static_cast<size_t>(100 + i), 'x');
        int32_t status = -1;
        EXPECT_EQ(request, exchangeText(request, &status));
        EXPECT_EQ(0, status);
    }
    counting = false;
    EXPECT_EQ(clientCalls.sendmsg, kExchanges);
    EXPECT_EQ(clientCalls.send, 0);
    EXPECT_EQ(clientCalls.recv, 2 * kExchanges);  // the drain's, and the answer's
    EXPECT_EQ(serverCalls.sendmsg, kExchanges);
    EXPECT_EQ(serverCalls.send, 0);
    // The last recv may be the one that waits for the next request.
    EXPECT_GE(serverCalls.recv, kExchanges);
    EXPECT_LE(serverCalls.recv, kExchanges + 1);
}

// Requests and answers around the sizes of both ends' receive stages (64 KiB
// on the server, 16 KiB at the client) and beyond a socket's buffer, back to
// back: each arrives whole, alone, and in its own exchange.
TEST_F(ServerChannelTest, FramesOfEverySizeAroundTheReceiveStagesArriveWhole) {
    commandHandler = [](const Bytes& request, void** response, uint32_t* length) {
        Bytes reversed(request.rbegin(), request.rend());
        return answer(reversed, response, length);
    };
    startServer(id);
    ASSERT_EQ(0, vokpkcs11_comm_client_init(id.c_str()));
    for (size_t size : {1, 15, 16, 17, 16367, 16368, 16369, 16384, 65519, 65520, 65521, 65536,
                        (1 << 20) + 3, 2, 65537}) {
        std::string request(size, '\0');
        for (size_t i = 0; i < size; ++i) request[i] = static_cast<char>(i * 7 + size);
        int32_t status = -1;
        const std::string text = exchangeText(request, &status);
        EXPECT_EQ(0, status) << size;
        EXPECT_TRUE(text == std::string(request.rbegin(), request.rend())) << size;
    }
}

// Exchanges on 8 threads: first alone, each answered with its own answer and
// the callback never entered twice at once; then while another thread takes
// the channel down and sets it up again, when an exchange may fail but never
// get another's answer.
TEST_F(ServerChannelTest, ConcurrentExchangesAreNeverMixedUp) {
    std::atomic<int> inCallback{0};
    std::atomic<bool> overlapped{false};
    commandHandler = [&](const Bytes& request, void** response, uint32_t* length) {
        if (++inCallback > 1) overlapped = true;
        Bytes marked = textBytes("answer to ");
        marked.insert(marked.end(), request.begin(), request.end());
        --inCallback;
        return answer(marked, response, length);
    };
    startServer(id);
    ASSERT_EQ(0, vokpkcs11_comm_client_init(id.c_str()));
    for (bool settingUp : {false, true}) {
        SCOPED_TRACE(settingUp);
        std::atomic<bool> done{false};
        std::atomic<int> answered{0}, wrong{0};
        std::vector<std::thread> threads;
        for (int t = 0; t < 8; ++t) {
            threads.emplace_back([&, t] {
                for (int i = 0; i < 100; ++i) {
                    // Lengths differ per request, so a mix-up also shows in the sizes.
                    const std::string request = "t" + std::to_string(t) + "-" + std::to_string(i) +
                                                std::string(static_cast<size_t>(t * 37 + i), '.');
                    int32_t status = -1;
                    const std::string text = exchangeText(request, &status);
                    if (status == 0) ++(text == "answer to " + request ? answered : wrong);
                }
            });
        }
        std::thread setUp([&] {
            while (settingUp && !done) {
                vokpkcs11_comm_client_deinit();
                vokpkcs11_comm_client_init(id.c_str());
            }
        });
        for (auto& thread : threads) thread.join();
        done = true;
        setUp.join();
        EXPECT_EQ(0, wrong.load());
        EXPECT_TRUE(settingUp || answered == 800) << answered;
        EXPECT_GT(answered.load(), 0);
    }
    EXPECT_FALSE(overlapped);
}

// Whether a client process running under `uid` gets its version command
// answered. The child uses bare system calls only.
bool answeredAs(uid_t uid, const std::string& serverId) {
    const std::string name = abstractName(serverId);
    const Bytes request = encodeFrame(kVersionRequest, int32Bytes(1));
    const pid_t child = fork();
    if (child == 0) {
        if (setgid(uid) != 0 || setuid(uid) != 0) _exit(2);
        int fd = socket(AF_UNIX, SOCK_STREAM, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::memcpy(address.sun_path, name.data(), sizeof(address.sun_path));
        timeval limit{5, 0};
        setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof(limit));
        uint8_t answer[20];
        const bool answered =
            connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof(address)) == 0 &&
            send(fd, request.data(), request.size(), MSG_NOSIGNAL) ==
                static_cast<ssize_t>(request.size()) &&
            recv(fd, answer, sizeof(answer), MSG_WAITALL) == sizeof(answer);
        _exit(answered ? 0 : 1);
    }
    int status = 0;
    waitpid(child, &status, 0);
    EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) != 2) << "could not take uid " << uid;
    return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

TEST_F(ServerChannelTest, WithAnAllowListOnlyTheListedUsersAreServed) {
    if (getuid() != 0) GTEST_SKIP() << "needs root to run a client under another user id";
    const uint32_t root = 0, nobody = 65534;
    startServer(id);
    EXPECT_TRUE(answeredAs(nobody, id)) << "without a list everyone is served";
    ASSERT_EQ(0, vokpkcs11_comm_server_setAllowedPeers(&root, 1));
    EXPECT_FALSE(answeredAs(nobody, id));
    EXPECT_TRUE(waitForLine("Client uid 65534 not allowed - connection closed"));
    EXPECT_TRUE(answeredAs(root, id)) << "the next client is served";
    ASSERT_EQ(0, vokpkcs11_comm_server_setAllowedPeers(&nobody, 1));
    EXPECT_FALSE(answeredAs(root, id));
    EXPECT_TRUE(answeredAs(nobody, id));
    ASSERT_EQ(0, vokpkcs11_comm_server_setAllowedPeers(nullptr, 0));
    EXPECT_TRUE(answeredAs(root, id));
}

// A header alone never makes the service take the memory it announces.
TEST_F(ServerChannelTest, APayloadIsAllocatedOnlyAsItArrives) {
    RawSocket& client = start();
    const uint64_t before = addressSpaceInUse();
    ASSERT_TRUE(client.sendHeader(commandHeader(INT32_MAX)));
    ASSERT_TRUE(waitForLine("Bytes read:16"));  // the header alone, then the first bytes
    ASSERT_TRUE(client.sendBytes(Bytes(1000, 7)));
    ASSERT_TRUE(waitForLine("Bytes read:1000"));
    EXPECT_LT(addressSpaceInUse(), before + (64u << 20));
    client.close();
    EXPECT_TRUE(waitForLine("Receive command data failed"));
}

}  // namespace
}  // namespace voktest
