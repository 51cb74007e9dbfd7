// Records real traffic as seed corpora for the fuzz targets: it stands
// between clients and a service, relays every frame, and writes what it saw.
//
//   vok_corpus_tap <listenId> <serviceId> <corpusDir> <connections>
//
// relays that many client connections, one after the other, and writes under
// <corpusDir>:
//   dispatcher/      each request alone, and each connection's requests in
//                    order (the dispatcher target's length-prefixed runs);
//   server_channel/  the handshake with each request, and the first requests
//                    of each connection, as the client sent them;
//   client/          each answer, for the proxy that asked for it.
// File names are a hash of the contents, so a second recording adds only
// what is new. The corpora in fuzz/corpus/ were recorded from the end-to-end
// client's step table (run twice) and three of its soak rounds, then reduced
// with libFuzzer's -merge=1.

#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>
#include <vector>

#include "comm_internal.h"
#include "fuzz_support.h"
#include "vok_pkcs11.h"
#include "vok_proto.h"

namespace {

std::string corpus;

bool readAll(int fd, void* buffer, size_t length) {
    return length == 0 || recv(fd, buffer, length, MSG_WAITALL) == static_cast<ssize_t>(length);
}

bool writeAll(int fd, const std::string& bytes) {
    return send(fd, bytes.data(), bytes.size(), MSG_NOSIGNAL) == static_cast<ssize_t>(bytes.size());
}

// One frame, header included, or "" at the end of the stream.
std::string readFrame(int fd, FrameHeader* header) {
    if (!readAll(fd, header, sizeof(*header)) || header->data_len < 0) return "";
    std::string payload(static_cast<size_t>(header->data_len), '\0');
    if (!readAll(fd, &payload[0], payload.size())) return "";
    return std::string(reinterpret_cast<const char*>(header), sizeof(*header)) + payload;
}

void save(const std::string& target, const std::string& bytes) {
    uint64_t hash = 1469598103934665603ull;  // FNV-1a
    for (unsigned char c : bytes) hash = (hash ^ c) * 1099511628211ull;
    char name[17];
    std::snprintf(name, sizeof name, "%016llx", static_cast<unsigned long long>(hash));
    mkdir((corpus + "/" + target).c_str(), 0755);
    std::ofstream(corpus + "/" + target + "/" + name, std::ios::binary) << bytes;
}

std::string lengthPrefixed(const std::string& request) {
    const size_t n = std::min<size_t>(request.size(), 0xffff);
    return std::string{static_cast<char>(n & 0xff), static_cast<char>(n >> 8)} +
           request.substr(0, n);
}

// The client target's input for `answer` to the proxy that sent `name`.
void saveAnswer(std::string name, const std::string& answer) {
#define VOK_TAP_NAME(function, params) #function,
    static const char* const kListOrder[] = {VOK_CK_FUNCTIONS(VOK_TAP_NAME)};
    if (name == "C_UnWrapKey") name = "C_UnwrapKey";
    for (size_t i = 0, proxy = 0; i < sizeof kListOrder / sizeof kListOrder[0]; ++i) {
        if (name == kListOrder[i]) {
            // Read from the end: proxy, framed answer, its length; the
            // caller's arguments from the middle, all mid-sized.
            const size_t n = std::min<size_t>(answer.size(), 0xffff);
            std::string input = answer.substr(0, n) + std::string(64, '\x21');
            input += static_cast<char>(n & 0xff);
            input += static_cast<char>(n >> 8);
            input += '\0';
            input += static_cast<char>(proxy);
            return save("client", input);
        }
        if (std::strcmp(kListOrder[i], "C_GetFunctionList") != 0) ++proxy;
    }
}

int listenOn(const std::string& id) {
    int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    sockaddr_un address;
    vokcomm::buildSocketAddress(id.c_str(), &address);
    if (bind(fd, reinterpret_cast<sockaddr*>(&address), vokcomm::socketAddressLength()) != 0 ||
        listen(fd, 1) != 0) {
        std::perror("listen");
        std::exit(1);
    }
    return fd;
}

int connectTo(const std::string& id) {
    int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    sockaddr_un address;
    vokcomm::buildSocketAddress(id.c_str(), &address);
    if (connect(fd, reinterpret_cast<sockaddr*>(&address), vokcomm::socketAddressLength()) != 0) {
        std::perror("connect");
        std::exit(1);
    }
    return fd;
}

void relay(int client, int service) {
    constexpr size_t kFirstRequests = 8;
    FrameHeader header;
    std::string handshake, stream, run;
    size_t requests = 0;
    for (;;) {
        const std::string request = readFrame(client, &header);
        if (request.empty() || !writeAll(service, request)) break;
        if (header.id == FRAME_ID_VERSION) {
            handshake = request;
        } else {
            const std::string payload = request.substr(sizeof(FrameHeader));
            save("dispatcher", lengthPrefixed(payload));
            run += lengthPrefixed(payload);
            save("server_channel", '\x03' + handshake + request);
            if (requests++ < kFirstRequests) stream += request;
        }
        const std::string answer = readFrame(service, &header);
        if (answer.empty() || !writeAll(client, answer)) break;
        pkcs11::Operation sent;
        if (header.id == FRAME_ID_PKCS11 &&
            sent.ParseFromString(request.substr(sizeof(FrameHeader))))
            saveAnswer(sent.name(), answer.substr(sizeof(FrameHeader)));
    }
    if (!run.empty()) save("dispatcher", run);
    if (!stream.empty()) save("server_channel", '\x03' + handshake + stream);
}

}  // namespace

int main(int argc, char** argv) {
    if (argc != 5) {
        std::fprintf(stderr, "usage: %s <listenId> <serviceId> <corpusDir> <connections>\n",
                     argv[0]);
        return 2;
    }
    corpus = argv[3];
    mkdir(corpus.c_str(), 0755);
    const int listener = listenOn(argv[1]);
    for (int i = std::atoi(argv[4]); i > 0; --i) {
        const int client = accept(listener, nullptr, nullptr);
        const int service = connectTo(argv[2]);
        relay(client, service);
        close(service);
        close(client);
    }
    return 0;
}
