// Client end of the channel: one connection per process, one request/response
// exchange at a time under clientLock.

#include <sys/time.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <string>

#define LOG_TAG "VOKPKCS11-COMM_CLIENT"
#include "comm_internal.h"
#include "vok_log.h"

namespace {

constexpr time_t kReceiveTimeoutSeconds = 30;

int socketFd = -1;
// Read without the lock by every caller of execute_command.
std::atomic<uint8_t> initialized{0};
// One lock for the life of the process, taken by init, deinit and every
// exchange, so that setting the channel up again never pulls the connection
// (or the lock itself) from under an exchange in flight.
pthread_mutex_t clientLock = PTHREAD_MUTEX_INITIALIZER;
uint8_t drainBuffer[256];
// Under clientLock. What the service sent beyond the frame being read stays
// here until the next exchange's drain discards it, as it would have
// discarded it from the socket.
constexpr size_t kReceiveStageBytes = 16 * 1024;
vokcomm::ReceiveStage receiveStage(kReceiveStageBytes);

// Under clientLock. After a timeout or any failure that leaves the stream's
// framing in doubt, a late answer may still come on this connection, after
// any drain; the next exchange therefore connects again instead of reading it.
bool connectionUsable = false;
std::string connectedServerId;

class ClientLockGuard {
public:
    ClientLockGuard() { pthread_mutex_lock(&clientLock); }
    ~ClientLockGuard() { pthread_mutex_unlock(&clientLock); }
    ClientLockGuard(const ClientLockGuard&) = delete;
    ClientLockGuard& operator=(const ClientLockGuard&) = delete;
};

using MallocBuffer = std::unique_ptr<void, decltype(&std::free)>;

bool invalidTransferArguments(int fd, const void* buf, int32_t len, const char* function) {
    if (fd >= 0 && buf != nullptr && len >= 1) return false;
    std::printf("[%s]:%s() - Invalid arguments\n", LOG_TAG, function);
    return true;
}

int32_t exitWith(int32_t status) {
    VOK_LOGD("Exit %d", status);
    return status;
}

void closeSocket() {
    close(socketFd);
    socketFd = -1;
    receiveStage.discard();
}

void reportWritten(ssize_t n) { VOK_LOGD("Bytes written:%d", static_cast<int>(n)); }
void reportRead(ssize_t n) { VOK_LOGD("Bytes read:%d", static_cast<int>(n)); }

// Checked in this order; the first mismatch decides the status.
int32_t checkVersionHeader(const FrameHeader& header) {
    if (header.id != FRAME_ID_VERSION) return CHANNEL_HANDSHAKE_BAD_ID;
    if (header.data_len != static_cast<int32_t>(sizeof(int32_t)))
        return CHANNEL_HANDSHAKE_BAD_LENGTH;
    if (header.type != FRAME_TYPE_RESPONSE) return CHANNEL_HANDSHAKE_BAD_TYPE;
    if (header.status != CHANNEL_OK) return CHANNEL_HANDSHAKE_BAD_STATUS;
    return CHANNEL_OK;
}

int32_t checkVersion(int fd) {
    FrameHeader request = {FRAME_ID_VERSION, FRAME_TYPE_REQUEST, 0, sizeof(int32_t)};
    int32_t status = client_send_data(fd, &request, sizeof(request));
    VOK_LOGD("Client send version returned %d", status);
    if (status != CHANNEL_OK) {
        // Misleading, but long-standing: log readers expect this line here.
        VOK_LOGD("Exit - success");
        return status;
    }
    const int32_t clientVersion = CHANNEL_PROTOCOL_VERSION;
    status = client_send_data(fd, &clientVersion, sizeof(clientVersion));
    if (status != CHANNEL_OK) return status;

    FrameHeader response = {};
    status = client_recv_data(fd, &response, sizeof(response));
    if (status != CHANNEL_OK) return status;
    status = checkVersionHeader(response);
    if (status != CHANNEL_OK) return status;

    int32_t serverVersion = 0;
    status = client_recv_data(fd, &serverVersion, sizeof(serverVersion));
    if (status != CHANNEL_OK) return status;
    return serverVersion == CHANNEL_PROTOCOL_VERSION ? CHANNEL_OK : CHANNEL_VERSION_MISMATCH;
}

int32_t connectAndCheckVersion(const char* serverId) {
    socketFd = socket(AF_UNIX, SOCK_STREAM, 0);
    if (socketFd == -1) {
        VOK_LOGD("Socket create failed");
        return CHANNEL_SOCKET_CREATE_FAILED;
    }
    sockaddr_un addr;
    vokcomm::buildSocketAddress(serverId, &addr);
    if (connect(socketFd, reinterpret_cast<const sockaddr*>(&addr),
                vokcomm::socketAddressLength()) == -1) {
        VOK_LOGD("Socket connect failed");
        closeSocket();
        return CHANNEL_CONNECT_FAILED;
    }
    // Also bounds the drain and the handshake: a server that answers nothing
    // must not hang the caller.
    timeval timeout = {kReceiveTimeoutSeconds, 0};
    setsockopt(socketFd, SOL_SOCKET, SO_RCVTIMEO, &timeout, sizeof(timeout));

    int32_t status = checkVersion(socketFd);
    if (status != CHANNEL_OK) {
        VOK_LOGD("Client check version failed %d", status);
        closeSocket();
        return CHANNEL_HANDSHAKE_FAILED;
    }
    VOK_LOGD("Exit - success");
    connectionUsable = true;
    connectedServerId = serverId != nullptr ? serverId : "";
    return CHANNEL_OK;
}

int32_t reconnect() {
    VOK_LOGD("Reconnect to server id %s", connectedServerId.c_str());
    closeSocket();
    const int32_t status = connectAndCheckVersion(connectedServerId.c_str());
    if (status == CHANNEL_OK)
        VOK_LOGD("Reconnected");
    else
        VOK_LOGD("Reconnect failed %d", status);
    return status;
}

// Passes a failed exchange's status through, and gives up the connection
// when what it left on the stream cannot be known.
int32_t framingLost(int32_t status) {
    connectionUsable = false;
    return status;
}

// Discards bytes that no header announced (a misbehaving service's leftovers)
// so the next header read lines up with a fresh response. An abandoned
// exchange's late answer never comes here: its connection has been given up.
void drainStaleBytes() {
    if (receiveStage.staged() > 0) {
        VOK_LOGD("Recv returned :%d", static_cast<int>(receiveStage.staged()));
        receiveStage.discard();
    }
    ssize_t n;
    while ((n = recv(socketFd, drainBuffer, sizeof(drainBuffer), MSG_DONTWAIT)) > 0)
        VOK_LOGD("Recv returned :%d", static_cast<int>(n));
    VOK_LOGD("Errno:%s", std::strerror(errno));
}

// client_recv_data's statuses and lines, through the stage: the answer's
// header and a small payload come in with one recv.
int32_t receiveStaged(void* buf, int32_t len) {
    if (invalidTransferArguments(socketFd, buf, len, "client_recv_data"))
        return CHANNEL_INVALID_ARGUMENTS;
    const ssize_t n = receiveStage.read(socketFd, buf, static_cast<size_t>(len), reportRead);
    if (n < 1) return exitWith(n < 0 ? CHANNEL_RECV_FAILED : CHANNEL_PEER_CLOSED);
    return exitWith(CHANNEL_OK);
}

int32_t receivePayload(int32_t dataLen, void** response, uint32_t* responseLength) {
    // The peer decides the size: a negative length is an impossible request,
    // failed like any other allocation failure (and never handed to malloc).
    MallocBuffer payload(dataLen < 0 ? nullptr : std::malloc(static_cast<size_t>(dataLen)),
                         &std::free);
    if (!payload) {
        VOK_LOGD("Malloc failed");
        return framingLost(CHANNEL_OUT_OF_MEMORY);
    }
    int32_t status = receiveStaged(payload.get(), dataLen);
    if (status != CHANNEL_OK) {
        VOK_LOGD("Client receive data failed %d", status);
        return framingLost(status);
    }
    *response = payload.release();
    *responseLength = static_cast<uint32_t>(dataLen);
    VOK_LOGD("Exit - Success");
    return CHANNEL_OK;
}

// Header and request in one sendmsg, with client_send_data's statuses; a
// failure is logged as the header's when the header did not get out whole.
int32_t sendRequest(const FrameHeader& header, const void* request) {
    const vokcomm::FrameSend sent =
        vokcomm::sendFrame(socketFd, header, request, static_cast<size_t>(header.data_len),
                           MSG_NOSIGNAL, reportWritten);
    if (sent.failed == 1) return exitWith(CHANNEL_OK);
    const int32_t status = exitWith(sent.failed < 0 ? CHANNEL_SEND_FAILED : CHANNEL_PEER_CLOSED);
    if (sent.sent < sizeof(header))
        VOK_LOGD("Client send header failed %d", status);
    else
        VOK_LOGD("Client send data failed %d", status);
    return status;
}

int32_t exchangeLocked(const void* request, int32_t length, void** response,
                       uint32_t* responseLength) {
    if (length < 1 || request == nullptr || response == nullptr || responseLength == nullptr) {
        VOK_LOGD("Invalid arguments");
        return CHANNEL_INVALID_ARGUMENTS;
    }
    if (!connectionUsable) {
        const int32_t status = reconnect();
        if (status != CHANNEL_OK) return status;
    }
    drainStaleBytes();

    // From the first byte sent on, a failure leaves the stream in doubt: the
    // service may hold half a request, or answer it later.
    FrameHeader header = {FRAME_ID_PKCS11, FRAME_TYPE_REQUEST, 0, length};
    int32_t status = sendRequest(header, request);
    if (status != CHANNEL_OK) return framingLost(status);

    header = FrameHeader{};
    status = receiveStaged(&header, sizeof(header));
    if (status != CHANNEL_OK) {
        VOK_LOGD("Client receive header failed %d", status);
        return framingLost(status);
    }
    // A header whose payload is left unread leaves that payload on the stream.
    const bool unreadPayload = header.data_len != 0;
    if (header.status != CHANNEL_OK) {
        // Reported as success without data; the caller then parses an empty
        // response.
        VOK_LOGD("Client receive header failed %d", CHANNEL_OK);
        return unreadPayload ? framingLost(CHANNEL_OK) : CHANNEL_OK;
    }
    VOK_LOGD("Header data_len:%d", header.data_len);
    VOK_LOGD("Header id:%d, type:%d", header.id, header.type);
    if (header.data_len == 0 || header.id != FRAME_ID_PKCS11 ||
        header.type != FRAME_TYPE_RESPONSE) {
        VOK_LOGD("Client header error %d", CHANNEL_OK);
        return unreadPayload ? framingLost(CHANNEL_BAD_RESPONSE_HEADER)
                             : CHANNEL_BAD_RESPONSE_HEADER;
    }
    return receivePayload(header.data_len, response, responseLength);
}

}  // namespace

int32_t client_send_data(int fd, const void* buf, int32_t len) {
    if (invalidTransferArguments(fd, buf, len, "client_send_data"))
        return CHANNEL_INVALID_ARGUMENTS;
    const uint8_t* p = static_cast<const uint8_t*>(buf);
    int32_t remaining = len;
    while (remaining > 0) {
        // The peer going away must not raise SIGPIPE in the application.
        ssize_t n = vokcomm::sendRetrying(fd, p, static_cast<size_t>(remaining), MSG_NOSIGNAL);
        VOK_LOGD("Bytes written:%d", static_cast<int>(n));
        if (n < 1) return exitWith(n < 0 ? CHANNEL_SEND_FAILED : CHANNEL_PEER_CLOSED);
        p += n;
        remaining -= static_cast<int32_t>(n);
    }
    return exitWith(CHANNEL_OK);
}

int32_t client_recv_data(int fd, void* buf, int32_t len) {
    if (invalidTransferArguments(fd, buf, len, "client_recv_data"))
        return CHANNEL_INVALID_ARGUMENTS;
    uint8_t* p = static_cast<uint8_t*>(buf);
    int32_t remaining = len;
    while (remaining > 0) {
        ssize_t n = vokcomm::recvRetrying(fd, p, static_cast<size_t>(remaining), 0);
        VOK_LOGD("Bytes read:%d", static_cast<int>(n));
        if (n < 1) return exitWith(n < 0 ? CHANNEL_RECV_FAILED : CHANNEL_PEER_CLOSED);
        p += n;
        remaining -= static_cast<int32_t>(n);
    }
    return exitWith(CHANNEL_OK);
}

VOK_C_API ChannelStatus vokpkcs11_comm_client_init(const char* serverId) {
    return vokcomm::noThrow(CHANNEL_OUT_OF_MEMORY, [&] {
        VOK_LOGD("Entry server id %s", serverId != nullptr ? serverId : "(null)");
        ClientLockGuard lock;
        if (initialized == 1) {
            VOK_LOGD("Already initialized");
            return static_cast<int32_t>(CHANNEL_ALREADY_INITIALIZED);
        }
        const int32_t status = connectAndCheckVersion(serverId);
        if (status != CHANNEL_OK) return status;
        initialized = 1;
        VOK_LOGD("Exit - Init success");
        return status;
    });
}

VOK_C_API ChannelStatus vokpkcs11_comm_client_execute_command(const void* request,
                                                              int32_t requestLength,
                                                              void** response,
                                                              uint32_t* responseLength) {
    return vokcomm::noThrow(CHANNEL_OUT_OF_MEMORY, [&] {
        VOK_LOGD("Entry");
        if (!initialized) {
            VOK_LOGD("Not initialized");
            return static_cast<int32_t>(CHANNEL_NOT_INITIALIZED);
        }
        ClientLockGuard lock;
        if (!initialized) {  // a deinit came first
            VOK_LOGD("Not initialized");
            return static_cast<int32_t>(CHANNEL_NOT_INITIALIZED);
        }
        return exchangeLocked(request, requestLength, response, responseLength);
    });
}

VOK_C_API ChannelStatus vokpkcs11_comm_client_deinit(void) {
    VOK_LOGD("Entry");
    ClientLockGuard lock;
    if (!initialized) {
        VOK_LOGD("Not initialized");
        return CHANNEL_NOT_INITIALIZED;
    }
    closeSocket();
    connectionUsable = false;
    initialized = 0;
    VOK_LOGD("Exit - Success");
    return CHANNEL_OK;
}
