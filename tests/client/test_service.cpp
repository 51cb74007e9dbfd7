#include "test_service.h"

#include <unistd.h>

#include <cstring>
#include <deque>
#include <mutex>
#include <stdexcept>

#include "vok_client.h"
#include "vok_comm.h"

namespace voktest {
namespace {

std::mutex gMutex;
std::deque<std::string> gScript;  // raw answers, in order
std::vector<std::string> gRequests;

}  // namespace

TestService& TestService::start() {
    static TestService service;
    static bool started = [] {
        const std::string id = "#vok-client-test-" + std::to_string(getpid());
        if (vokpkcs11_comm_server_init(id.c_str(), &TestService::serve) != 0)
            throw std::runtime_error("server end did not start");
        // The server thread binds asynchronously: retry the connect briefly.
        for (int i = 0; i < 200; ++i) {
            if (vokpkcs11_client_init(id.c_str()) == 0) return true;
            usleep(5000);
        }
        throw std::runtime_error("client end did not connect");
    }();
    (void)started;
    return service;
}

void TestService::script(const pkcs11::OperationResult& answer) {
    std::string bytes;
    answer.SerializePartialToString(&bytes);
    scriptRaw(bytes);
}

void TestService::scriptRaw(const std::string& bytes) {
    std::lock_guard<std::mutex> lock(gMutex);
    gScript.push_back(bytes);
}

size_t TestService::requestCount() const {
    std::lock_guard<std::mutex> lock(gMutex);
    return gRequests.size();
}

std::string TestService::lastRequestBytes() const {
    std::lock_guard<std::mutex> lock(gMutex);
    return gRequests.empty() ? std::string() : gRequests.back();
}

pkcs11::Operation TestService::lastRequest() const {
    pkcs11::Operation op;
    op.ParseFromString(lastRequestBytes());
    return op;
}

int32_t TestService::serve(const void* request, int32_t length, void** response,
                           uint32_t* responseLength) {
    std::string bytes(static_cast<const char*>(request), static_cast<size_t>(length));
    std::string answer;
    {
        std::lock_guard<std::mutex> lock(gMutex);
        gRequests.push_back(bytes);
        if (!gScript.empty()) {
            answer = gScript.front();
            gScript.pop_front();
        } else {
            pkcs11::Operation op;
            op.ParseFromString(bytes);
            pkcs11::OperationResult res;
            res.set_name(op.name());
            res.set_result(0);
            res.SerializeToString(&answer);
        }
    }
    auto* buffer = new uint8_t[answer.size()];
    memcpy(buffer, answer.data(), answer.size());
    *response = buffer;
    *responseLength = static_cast<uint32_t>(answer.size());
    return 0;
}

}  // namespace voktest
