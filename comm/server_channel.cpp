// Server end of the channel: one thread per process that accepts one client
// at a time, answers the version command itself and hands every PKCS#11
// command to the registered callback.

#include <signal.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <mutex>
#include <new>
#include <vector>

#define LOG_TAG "VOKPKCS11-COMM_SERVER"
#include "comm_internal.h"
#include "vok_log.h"

namespace {

constexpr int kListenBacklog = 1;
// A request's header and a payload of up to this size arrive with one recv.
constexpr size_t kReceiveStageBytes = 64 * 1024;
constexpr useconds_t kAcceptBackoffMicros = 100 * 1000;

uint8_t serverInitialized = 0;
char serverIdCopy[256];
pthread_t serverThreadHandle;
int listenFd = -1;
// Stored by init after the thread has started, read by the thread.
std::atomic<CommandCallback> commandCallback{nullptr};
// Written by the server thread, read by anyone without a lock.
std::atomic<int32_t> lastRequestTime{0};
std::atomic<int32_t> lastResponseTime{0};

// The first piece of a payload taken before its bytes arrive; it doubles as
// they do, so a header alone never makes the service allocate what it claims.
constexpr size_t kFirstPayloadPiece = 64 * 1024;

// Peers that may connect, by user id; not set, anyone may. Set from Java
// threads, read by the server thread after each accept.
std::mutex allowedPeersLock;
bool allowedPeersSet = false;
std::vector<uid_t> allowedPeers;

void (*const volatile wipeWith)(void*, int, size_t) = [](void* p, int c, size_t n) {
    std::memset(p, c, n);
};

// A received payload: grown as its bytes arrive, wiped before it is released
// (requests carry PINs).
class Payload {
public:
    Payload() = default;
    ~Payload() { release(); }
    Payload(const Payload&) = delete;
    Payload& operator=(const Payload&) = delete;

    uint8_t* data() const { return data_; }
    size_t capacity() const { return capacity_; }
    bool grow(size_t capacity) {
        auto* grown = static_cast<uint8_t*>(std::malloc(capacity));
        if (grown == nullptr) return false;
        if (data_ != nullptr) std::memcpy(grown, data_, capacity_);
        release();
        data_ = grown;
        capacity_ = capacity;
        return true;
    }
    void release() {
        if (data_ != nullptr) wipeWith(data_, 0, capacity_);
        std::free(data_);
        data_ = nullptr;
        capacity_ = 0;
    }

private:
    uint8_t* data_ = nullptr;
    size_t capacity_ = 0;
};

// Seconds plus the milliseconds of the current second: the mixed unit is what
// the usage statistics have always reported.
int32_t usageTimeNow() {
    timeval now;
    gettimeofday(&now, nullptr);
    return static_cast<int32_t>(now.tv_sec) + static_cast<int32_t>(now.tv_usec) / 1000;
}

void recordRequestTime() {
    lastRequestTime = usageTimeNow();
#pragma GCC diagnostic push
    // The line's "%l" has never had a conversion; the text is kept as it is.
#pragma GCC diagnostic ignored "-Wformat"
#pragma GCC diagnostic ignored "-Wformat-extra-args"
    VOK_LOGD("Last used Time Request: %l\n", static_cast<int>(lastRequestTime));
#pragma GCC diagnostic pop
}

void recordResponseTime() {
    lastResponseTime = usageTimeNow();
#pragma GCC diagnostic push
    // As above: the incomplete "%l" is part of the line.
#pragma GCC diagnostic ignored "-Wformat"
#pragma GCC diagnostic ignored "-Wformat-extra-args"
    VOK_LOGD("Last used Time Response: %l\n", static_cast<int>(lastResponseTime));
#pragma GCC diagnostic pop
}

sigset_t sigpipeSet() {
    sigset_t set;
    sigemptyset(&set);
    sigaddset(&set, SIGPIPE);
    return set;
}

// The server's sends carry no MSG_NOSIGNAL; a client that vanishes mid-send
// must not take the service down with it.
void blockSigpipe() {
    sigset_t set = sigpipeSet();
    pthread_sigmask(SIG_BLOCK, &set, nullptr);
}

void consumePendingSigpipe() {
    sigset_t set = sigpipeSet();
    timespec noWait = {0, 0};
    sigtimedwait(&set, nullptr, &noWait);
}

int32_t exitWith(int32_t status) {
    VOK_LOGD("Exit ret:%d", status);
    return status;
}

void reportRead(ssize_t n) { VOK_LOGD("Bytes read:%d", static_cast<int>(n)); }

void reportWritten(ssize_t n) {
    if (n < 0 && errno == EPIPE) consumePendingSigpipe();
    VOK_LOGD("Bytes written:%d", static_cast<int>(n));
}

// server_recv_data, through a connection's stage.
int32_t receive(int fd, vokcomm::ReceiveStage& stage, void* buf, int32_t len) {
    VOK_LOGD("Entry - Recv buf len:%d", len);
    if (fd < 0 || buf == nullptr || len < 1) {
        std::printf("[%s]:%s() - Invalid argument\n", LOG_TAG, "server_recv_data");
        return CHANNEL_INVALID_ARGUMENTS;
    }
    const ssize_t n = stage.read(fd, buf, static_cast<size_t>(len), reportRead);
    if (n < 1) return exitWith(n < 0 ? CHANNEL_SERVER_IO_FAILED : CHANNEL_SERVER_PEER_CLOSED);
    return exitWith(CHANNEL_OK);
}

bool closesConnection(int32_t status) {
    return status == CHANNEL_NO_CALLBACK || status == CHANNEL_SERVER_PEER_CLOSED ||
           status == CHANNEL_SEND_FAILED;
}

int32_t callCallback(CommandCallback callback, const void* request, int32_t length, void** response,
                     uint32_t* responseLength) {
    // An exception out of the dispatcher is most likely a failed allocation.
    return vokcomm::noThrow(CHANNEL_OUT_OF_MEMORY,
                            [&] { return callback(request, length, response, responseLength); });
}

int32_t processPkcs11Command(const void* payload, int32_t length, void** response,
                             uint32_t* responseLength) {
    VOK_LOGD("Entry - cmd_data_len:%d", length);
    if (length < 1) {
        VOK_LOGD("Invalid argument");
        return CHANNEL_INVALID_ARGUMENTS;
    }
    // A command that beats init's store of the callback gets no answer.
    CommandCallback callback = commandCallback;
    int32_t status = callback == nullptr
                         ? static_cast<int32_t>(CHANNEL_NO_CALLBACK)
                         : callCallback(callback, payload, length, response, responseLength);
    return exitWith(status);
}

int32_t processVersionCommand(const void* payload, int32_t length, void** response,
                              uint32_t* responseLength) {
    VOK_LOGD("Entry");
    if (length != static_cast<int32_t>(sizeof(int32_t))) {
        VOK_LOGD("Command len invalid");
        return CHANNEL_BAD_REQUEST_HEADER;
    }
    // Same allocator as the callback's answers, so one release path fits both.
    std::unique_ptr<uint8_t[]> reply(new (std::nothrow) uint8_t[sizeof(int32_t)]);
    if (!reply) {
        VOK_LOGD("Malloc error");
        return CHANNEL_OUT_OF_MEMORY;
    }
    int32_t clientVersion;
    std::memcpy(&clientVersion, payload, sizeof(clientVersion));
    VOK_LOGD("Client ver:%d Server ver:%d", clientVersion, CHANNEL_PROTOCOL_VERSION);
    if (clientVersion != CHANNEL_PROTOCOL_VERSION) {
        // No answer: the client's handshake runs into its receive timeout.
        VOK_LOGD("Client and server version mismatch");
        return CHANNEL_VERSION_MISMATCH;
    }
    const int32_t serverVersion = CHANNEL_PROTOCOL_VERSION;
    std::memcpy(reply.get(), &serverVersion, sizeof(serverVersion));
    *response = reply.release();
    *responseLength = sizeof(serverVersion);
    return CHANNEL_OK;
}

int32_t processCommand(int32_t id, const void* payload, int32_t length, void** response,
                       uint32_t* responseLength) {
    switch (id) {
        case FRAME_ID_PKCS11:
            return processPkcs11Command(payload, length, response, responseLength);
        case FRAME_ID_VERSION:
            return processVersionCommand(payload, length, response, responseLength);
        default:
            return CHANNEL_UNKNOWN_COMMAND;
    }
}

// Header and answer in one sendmsg, with server_send_data's statuses.
int32_t sendHeaderAndAnswer(int fd, const FrameHeader& header, const void* payload,
                            bool* headerSent) {
    VOK_LOGD("Entry - send data len:%d", static_cast<int>(sizeof(header)) + header.data_len);
    const vokcomm::FrameSend sent = vokcomm::sendFrame(
        fd, header, payload, static_cast<size_t>(header.data_len), 0, reportWritten);
    *headerSent = sent.sent >= sizeof(header);
    if (sent.failed == 1) return exitWith(CHANNEL_OK);
    return exitWith(sent.failed < 0 ? CHANNEL_SEND_FAILED : CHANNEL_SERVER_IO_FAILED);
}

int32_t sendResponse(int fd, FrameHeader header, void* response, uint32_t responseLength) {
    // Allocated with new[] by the callback (and by the version command).
    std::unique_ptr<uint8_t[]> owned(static_cast<uint8_t*>(response));
    header.data_len = static_cast<int32_t>(responseLength);
    header.type = FRAME_TYPE_RESPONSE;
    header.status = CHANNEL_OK;
    int32_t status;
    bool headerSent = false;
    if (owned && header.data_len > 0) {
        status = sendHeaderAndAnswer(fd, header, owned.get(), &headerSent);
    } else {
        // The header goes alone; the send helper then refuses the empty answer.
        status = server_send_data(fd, &header, sizeof(header));
        headerSent = status == CHANNEL_OK;
        if (headerSent) status = server_send_data(fd, owned.get(), header.data_len);
    }
    if (!headerSent) {
        VOK_LOGD("Send header failed %d", status);
        return status;
    }
    recordResponseTime();
    owned.reset();
    return exitWith(status);
}

// Takes memory for the payload only as its bytes arrive: a departure from
// allocating the whole length a header claims before any of it is there.
int32_t receivePayload(int fd, vokcomm::ReceiveStage& stage, int32_t length, Payload& payload) {
    const size_t total = length < 0 ? 0 : static_cast<size_t>(length);
    if (length < 0 || !payload.grow(std::min(total, kFirstPayloadPiece))) {
        VOK_LOGD("Malloc failed");
        return CHANNEL_OUT_OF_MEMORY;
    }
    for (size_t received = 0; received < total; received = payload.capacity()) {
        if (received == payload.capacity() && !payload.grow(std::min(total, 2 * received))) {
            VOK_LOGD("Malloc failed");
            return CHANNEL_OUT_OF_MEMORY;
        }
        const int32_t status = receive(fd, stage, payload.data() + received,
                                       static_cast<int32_t>(payload.capacity() - received));
        if (status != CHANNEL_OK) {
            VOK_LOGD("Receive command data failed");
            return status;
        }
    }
    return CHANNEL_OK;
}

int32_t processClientCommand(int fd, vokcomm::ReceiveStage& stage) {
    VOK_LOGD("\n\n================");
    VOK_LOGD("Entry");
    void* response = nullptr;
    uint32_t responseLength = 0;
    FrameHeader header = {};

    int32_t status = receive(fd, stage, &header, sizeof(header));
    VOK_LOGD("Header data length field value :%d", header.data_len);
    VOK_LOGD("Received command:%d", header.id);
    if (status != CHANNEL_OK) {
        VOK_LOGD("server_recv_data failed ret:%d", status);
        return status;
    }
    if (header.data_len == 0 || header.type != FRAME_TYPE_REQUEST) {
        VOK_LOGD("Receive header failed");
        return CHANNEL_BAD_REQUEST_HEADER;
    }
    recordRequestTime();

    // The peer decides the size; a negative one fails here like an allocation
    // failure, without being handed to malloc. The unread payload is then
    // taken for the next header.
    Payload payload;
    status = receivePayload(fd, stage, header.data_len, payload);
    if (status != CHANNEL_OK) return status;
    status = processCommand(header.id, payload.data(), header.data_len, &response, &responseLength);
    payload.release();
    if (status != CHANNEL_OK) {
        VOK_LOGD("process command returned :%d", status);
        return status;
    }
    return sendResponse(fd, header, response, responseLength);
}

void serveClient(int fd) {
    vokcomm::ReceiveStage stage(kReceiveStageBytes);
    int32_t status;
    do {
        status = processClientCommand(fd, stage);
        VOK_LOGD("process_client_command ret :%d", status);
    } while (!closesConnection(status));
}

// Never hands back -1: a failed accept is logged and tried again. Only a
// client that gave up while queued is retried at once; any other error may
// last (no descriptors left, a broken listening socket), so it is retried
// after a pause rather than in a loop that would burn the service's CPU.
int acceptClient(int fd) {
    for (;;) {
        int client = accept(fd, nullptr, nullptr);
        if (client >= 0) return client;
        const int error = errno;
        if (error == EINTR) continue;
        VOK_LOGD("socket accept failed");
        if (error != ECONNABORTED) usleep(kAcceptBackoffMicros);
    }
}

// The abstract socket has no file permissions: with an allow list set, a
// peer whose user id is not on it is closed before anything is read.
bool peerAllowed(int fd) {
    std::lock_guard<std::mutex> lock(allowedPeersLock);
    if (!allowedPeersSet) return true;
    ucred peer{};
    socklen_t length = sizeof(peer);
    if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &peer, &length) != 0) {
        VOK_LOGE("Client credentials unavailable - connection closed");
        return false;
    }
    if (std::find(allowedPeers.begin(), allowedPeers.end(), peer.uid) != allowedPeers.end())
        return true;
    VOK_LOGE("Client uid %u not allowed - connection closed", static_cast<unsigned>(peer.uid));
    return false;
}

int32_t failSetUp(const char* line, int32_t status) {
    VOK_LOGD("%s", line);
    close(listenFd);
    listenFd = -1;
    return status;
}

int32_t runServer(const char* serverId) {
    blockSigpipe();
    VOK_LOGD("Entry %s", serverId);
    listenFd = socket(AF_UNIX, SOCK_STREAM, 0);
    if (listenFd == -1) {
        VOK_LOGD("socket creation failed");
        return CHANNEL_SOCKET_CREATE_FAILED;
    }
    sockaddr_un addr;
    vokcomm::buildSocketAddress(serverId, &addr);
    const int reuse = 1;
    if (setsockopt(listenFd, SOL_SOCKET, SO_REUSEADDR, &reuse, sizeof(reuse)) == -1)
        VOK_LOGD("SetSockOpt of SO_REUSEADDR returned error %d", -1);
    if (bind(listenFd, reinterpret_cast<const sockaddr*>(&addr), vokcomm::socketAddressLength()) ==
        -1)
        return failSetUp("socket bind failed", CHANNEL_BIND_FAILED);
    if (listen(listenFd, kListenBacklog) == -1)
        return failSetUp("socket listen failed", CHANNEL_LISTEN_FAILED);

    VOK_LOGD("Wait for new client %s", serverId);
    for (;;) {
        int client = acceptClient(listenFd);
        if (!peerAllowed(client)) {
            close(client);
            continue;
        }
        VOK_LOGD("Client connected - socket id:%d", client);
        serveClient(client);
        VOK_LOGD("Socket error. Wait for new client");
        close(client);
        VOK_LOGD("Wait for new client %s", serverId);
    }
}

void* serverThreadMain(void* serverId) {
    int32_t status = vokcomm::noThrow(
        CHANNEL_OUT_OF_MEMORY, [&] { return runServer(static_cast<const char*>(serverId)); });
    return reinterpret_cast<void*>(static_cast<intptr_t>(status));
}

int32_t startServer(const char* serverId, CommandCallback callback) {
    VOK_LOGD("Entry - server id %s", serverId != nullptr ? serverId : "(null)");
    if (serverId == nullptr || callback == nullptr) {
        VOK_LOGD("Invalid arguments");
        return CHANNEL_INVALID_ARGUMENTS;
    }
    if (serverInitialized == 1) {
        VOK_LOGD("Already initialized");
        return CHANNEL_ALREADY_INITIALIZED;
    }
    serverIdCopy[sizeof(serverIdCopy) - 1] = '\0';
    std::strncpy(serverIdCopy, serverId, sizeof(serverIdCopy) - 1);
    const int error = pthread_create(&serverThreadHandle, nullptr, serverThreadMain, serverIdCopy);
    if (error != 0) {
        VOK_LOGD("Thread create failed %d", error);
        return CHANNEL_THREAD_CREATE_FAILED;
    }
    commandCallback = callback;
    serverInitialized = 1;
    VOK_LOGD("Exit - success");
    return CHANNEL_OK;
}

}  // namespace

int32_t server_recv_data(int fd, void* buf, int32_t len) {
    vokcomm::ReceiveStage unstaged(0);
    return receive(fd, unstaged, buf, len);
}

int32_t server_send_data(int fd, const void* buf, int32_t len) {
    VOK_LOGD("Entry - send data len:%d", len);
    if (fd < 0 || buf == nullptr || len < 1) {
        VOK_LOGD("Invalid argument");
        return CHANNEL_INVALID_ARGUMENTS;
    }
    const uint8_t* p = static_cast<const uint8_t*>(buf);
    int32_t remaining = len;
    while (remaining > 0) {
        ssize_t n = vokcomm::sendRetrying(fd, p, static_cast<size_t>(remaining), 0);
        if (n < 0 && errno == EPIPE) consumePendingSigpipe();
        VOK_LOGD("Bytes written:%d", static_cast<int>(n));
        if (n < 1) return exitWith(n < 0 ? CHANNEL_SEND_FAILED : CHANNEL_SERVER_IO_FAILED);
        p += n;
        remaining -= static_cast<int32_t>(n);
    }
    return exitWith(CHANNEL_OK);
}

VOK_C_API ChannelStatus vokpkcs11_comm_server_init(const char* serverId, CommandCallback callback) {
    return vokcomm::noThrow(CHANNEL_OUT_OF_MEMORY, [&] { return startServer(serverId, callback); });
}

VOK_C_API ChannelStatus vokpkcs11_comm_server_deinit(void) {
    VOK_LOGD("vokpkcs11_comm_server_deinit Entry");
    if (serverInitialized != 1) {
        VOK_LOGD("Not initialized");
        return CHANNEL_NOT_INITIALIZED;
    }
    // Nothing is stopped: the thread serves until the process ends.
    VOK_LOGD("Exit");
    return CHANNEL_OK;
}

VOK_C_API int32_t vokpkcs11_comm_server_getLastUsageTime(void) {
    // A request newer than the last response is still being worked on.
    const int32_t request = lastRequestTime;
    const int32_t response = lastResponseTime;
    return request > response ? -1 : response;
}

ChannelStatus vokpkcs11_comm_server_setAllowedPeers(const uint32_t* uids, int32_t count) {
    return vokcomm::noThrow(CHANNEL_OUT_OF_MEMORY, [&] {
        std::vector<uid_t> list;
        if (uids != nullptr && count > 0) list.assign(uids, uids + count);
        std::lock_guard<std::mutex> lock(allowedPeersLock);
        allowedPeersSet = uids != nullptr && count >= 0;
        allowedPeers.swap(list);
        return CHANNEL_OK;
    });
}

pthread_t vokcomm::serverThread() { return serverThreadHandle; }
