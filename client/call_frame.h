#ifndef VOK_CLIENT_CALL_FRAME_H
#define VOK_CLIENT_CALL_FRAME_H

// The one exchange every C_ proxy runs: build an Operation, send it over the
// channel, parse the OperationResult and copy outputs back.

#include <cstdint>
#include <exception>
#include <type_traits>

#include "vok_pkcs11.h"
#include "vok_proto.h"

namespace vok {
namespace client {

// Returned by every proxy when the channel fails. Deliberately not a CKR_
// code, so a caller can tell a broken channel from any answer of the module.
constexpr CK_RV kChannelFailure = ~static_cast<CK_RV>(0);

// Sends `request` and parses the answer into `response` (the parse result is
// not checked: what was not read stays at its default). Returns the channel
// status; on non-zero status `response` is untouched. `responseLength`
// receives the length of the answer.
int32_t exchange(const pkcs11::Operation& request, pkcs11::OperationResult& response,
                 uint32_t& responseLength);

// Logs "<name> Success" and "<name> response length = %d", the two lines most
// proxies write after a successful exchange.
void logSuccessLines(const char* name, uint32_t responseLength);

struct SuccessLines {
    const char* name;
    void operator()(uint32_t responseLength) const { logSuccessLines(name, responseLength); }
};

inline void noCopyBack(const pkcs11::OperationResult&) {}

// fill(Operation&) fills the sub-message before anything is sent;
// onSuccess(uint32_t length) logs after a successful exchange;
// copyBack(const OperationResult&) writes the caller's outputs, and does so
// only from a present response sub-message; when it returns a CK_RV, that is
// what the caller sees instead of `result`.
template <class Fill, class OnSuccess, class CopyBack>
CK_RV callService(const char* name, Fill&& fill, OnSuccess&& onSuccess, CopyBack&& copyBack) {
    try {
        pkcs11::Operation request;
        request.set_name(name);
        fill(request);
        pkcs11::OperationResult response;
        uint32_t responseLength = 0;
        if (exchange(request, response, responseLength) != 0) return kChannelFailure;
        onSuccess(responseLength);
        // No result is no answer (an empty or cut-off frame): read as CKR_OK it
        // would let a C_Login or a C_Verify "succeed".
        if (!response.has_result()) return kChannelFailure;
        if constexpr (std::is_void_v<decltype(copyBack(response))>) {
            copyBack(response);
            return response.result();
        } else {
            return copyBack(response);
        }
    } catch (...) {
        // Out of memory while building or parsing: the caller must not see an
        // exception from a C function.
        return kChannelFailure;
    }
}

// The common shape: standard success lines under the proxy's own name.
template <class Fill, class CopyBack>
CK_RV callService(const char* name, Fill&& fill, CopyBack&& copyBack) {
    return callService(name, fill, SuccessLines{name}, copyBack);
}

}  // namespace client
}  // namespace vok

#endif
