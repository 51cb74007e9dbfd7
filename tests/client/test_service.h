#ifndef VOK_TEST_CLIENT_TEST_SERVICE_H
#define VOK_TEST_CLIENT_TEST_SERVICE_H

// A service in the test process: the channel's real server end with a callback
// that records every Operation and answers with a scripted OperationResult.
// The client end is connected to it, so proxies travel the real socket.

#include <cstdint>
#include <string>
#include <vector>

#include "vok_proto.h"

namespace voktest {

class TestService {
public:
    // Starts the server end (once per process) and connects the client end.
    static TestService& start();

    // The next request is answered with `answer`; unscripted requests get an
    // OperationResult carrying their own name and result 0.
    void script(const pkcs11::OperationResult& answer);
    // The next request is answered with these raw bytes (possibly empty).
    void scriptRaw(const std::string& bytes);

    size_t requestCount() const;
    pkcs11::Operation lastRequest() const;
    std::string lastRequestBytes() const;

    static int32_t serve(const void* request, int32_t length, void** response,
                         uint32_t* responseLength);
};

}  // namespace voktest

#endif
