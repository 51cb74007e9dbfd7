#include "handler_frame.h"

#include "marshal.h"

namespace vok {
namespace server {

std::string serialised(const pkcs11::OperationResult& response) {
    std::string bytes;
    if (!response.SerializeToString(&bytes) || bytes.size() > kFrameLimit) return std::string();
    return bytes;
}

std::string refused(const char* responseName, CK_RV result) noexcept {
    try {
        pkcs11::OperationResult response;
        response.set_name(responseName);
        response.set_result(result);
        return serialised(response);
    } catch (...) {
        return std::string();
    }
}

}  // namespace server
}  // namespace vok
