#ifndef VOK_COMM_H
#define VOK_COMM_H

/*
 * Local socket channel between the application process (client end) and the
 * service process (server end). Every message in either direction is a
 * FrameHeader followed by data_len payload bytes.
 */

#include <stdint.h>

#include "vok_export.h"

#ifdef __cplusplus
extern "C" {
#endif

/* Four 32-bit integers in host byte order; both ends run on one device. */
typedef struct FrameHeader {
    int32_t id;       /* FRAME_ID_*; a response repeats the request's id */
    int32_t type;     /* FRAME_TYPE_* */
    int32_t status;   /* responses: 0; requests: sent as 0, never read */
    int32_t data_len; /* payload bytes that follow the header */
} FrameHeader;

enum {
    FRAME_ID_VERSION = 100,
    FRAME_ID_PKCS11 = 101,
    FRAME_TYPE_REQUEST = 103,
    FRAME_TYPE_RESPONSE = 104,
    CHANNEL_PROTOCOL_VERSION = 1
};

/* Status codes of both ends, one numbering. Where a code means something
 * different on each end, each end has its own name for it. */
typedef int32_t ChannelStatus;

enum {
    CHANNEL_OK = 0,
    CHANNEL_ALREADY_INITIALIZED = 1,
    CHANNEL_NOT_INITIALIZED = 2,
    CHANNEL_NO_CALLBACK = 2, /* server: no callback registered */
    CHANNEL_HANDSHAKE_FAILED = 3,
    CHANNEL_VERSION_MISMATCH = 4,
    CHANNEL_INVALID_ARGUMENTS = 5,
    CHANNEL_SOCKET_CREATE_FAILED = 6,
    CHANNEL_CONNECT_FAILED = 7,
    CHANNEL_BIND_FAILED = 8,
    CHANNEL_RECV_FAILED = 10,        /* client: recv < 0, the timeout included */
    CHANNEL_SERVER_PEER_CLOSED = 10, /* server: recv returned 0 */
    CHANNEL_SEND_FAILED = 11,        /* send < 0, both ends */
    CHANNEL_SERVER_IO_FAILED = 12,   /* server: recv < 0, or send returned 0 */
    CHANNEL_PEER_CLOSED = 13,        /* client: send or recv returned 0 */
    CHANNEL_THREAD_CREATE_FAILED = 14,
    CHANNEL_HANDSHAKE_BAD_ID = 15,
    CHANNEL_HANDSHAKE_BAD_TYPE = 16,
    CHANNEL_HANDSHAKE_BAD_LENGTH = 17,
    CHANNEL_BAD_REQUEST_HEADER = 18,
    CHANNEL_UNKNOWN_COMMAND = 19,
    CHANNEL_HANDSHAKE_BAD_STATUS = 20,
    CHANNEL_OUT_OF_MEMORY = 21,
    CHANNEL_LISTEN_FAILED = 22,
    CHANNEL_BAD_RESPONSE_HEADER = 23
};

/*
 * Serves one PKCS#11 command on the server thread. Both outputs are 0 on
 * entry. On 0 the callback has stored a buffer allocated with new[] (the
 * channel releases it with delete[]) and its length. Any other status sends
 * no response; 2, 10 and 11 also close the client's connection.
 */
typedef int32_t (*CommandCallback)(const void* request, int32_t requestLength, void** response,
                                   uint32_t* responseLength);

#ifdef __cplusplus
}
#endif

/* Client end: one connection per process, one exchange at a time. On success
 * *response is a malloc'd buffer that the caller frees. */
VOK_C_API ChannelStatus vokpkcs11_comm_client_init(const char* serverId);
VOK_C_API ChannelStatus vokpkcs11_comm_client_execute_command(const void* request,
                                                              int32_t requestLength,
                                                              void** response,
                                                              uint32_t* responseLength);
VOK_C_API ChannelStatus vokpkcs11_comm_client_deinit(void);

/* Server end: one thread per process that lives until the process ends. */
VOK_C_API ChannelStatus vokpkcs11_comm_server_init(const char* serverId, CommandCallback callback);
VOK_C_API ChannelStatus vokpkcs11_comm_server_deinit(void);
VOK_C_API int32_t vokpkcs11_comm_server_getLastUsageTime(void);

/* Internal: from now on only peers whose user id is one of the `count` in
 * `uids` are served (none for an empty list); NULL lets everyone connect, as
 * before any call. Refused peers are closed right after accept. */
ChannelStatus vokpkcs11_comm_server_setAllowedPeers(const uint32_t* uids, int32_t count);

#endif
