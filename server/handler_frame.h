#ifndef VOK_SERVER_HANDLER_FRAME_H
#define VOK_SERVER_HANDLER_FRAME_H

// The steps every handler shares: parse the command into `operation`, answer
// nothing without a module, let the body call the module and fill the answer,
// set `result`, serialise.

#include <string>

#include "marshal.h"
#include "request_memory.h"
#include "vok_server.h"

namespace vok {
namespace server {

// The serialised answer, or an empty one when it could not be framed.
std::string serialised(const pkcs11::OperationResult& response);

// The answer to a request the module was not called for: name and code only.
std::string refused(const char* responseName, CK_RV result) noexcept;

// The module's entry for one function. A list that leaves it NULL does not
// offer the function: answered CKR_FUNCTION_NOT_SUPPORTED instead of calling
// through NULL (a departure from forwarding every command blindly).
template <class Function>
Function offered(Function function) {
    if (function == nullptr) throw Refusal{CKR_FUNCTION_NOT_SUPPORTED};
    return function;
}

// While one lives, `operation` already holds the request (of `size` bytes)
// that the handler is given, and serve() does not parse it again.
class ParsedRequest {
public:
    explicit ParsedRequest(size_t size) { current() = {true, size}; }
    ~ParsedRequest() { current() = {false, 0}; }
    ParsedRequest(const ParsedRequest&) = delete;
    ParsedRequest& operator=(const ParsedRequest&) = delete;
    struct State {
        bool parsed;
        size_t size;
    };
    static State& current() {
        static State state = {false, 0};
        return state;
    }
};

// body(pkcs11::OperationResult&) reads the request sub-message from
// `operation`, stores the module's return value in `rv` and fills the answer's
// sub-message whatever `rv` is. A Refusal it throws is answered with its code;
// whatever else it throws (in practice sizes from the request that cannot be
// allocated, or beyond the request's buffer allowance) ends in the empty
// answer, the one the client also gets for a command nobody serves. The
// parsed request is wiped and released before the answer leaves.
template <class Body>
std::string serve(const std::string& request, const char* responseName, Body&& body) noexcept {
    std::string answer;
    try {
        const ParsedRequest::State parsed = ParsedRequest::current();
        BufferBudget budget(parsed.parsed ? parsed.size : request.size());
        if (!parsed.parsed) operation.ParseFromString(request);
        if (ckpFunctions != nullptr) {
            pkcs11::OperationResult response;
            response.set_name(responseName);
            body(response);
            response.set_result(rv);
            answer = serialised(response);
        }
    } catch (const Refusal& refusal) {
        answer = refused(responseName, refusal.rv);
    } catch (...) {
        answer.clear();
    }
    releaseRequest();
    return answer;
}

}  // namespace server
}  // namespace vok

#endif
