#include "handler_frame.h"

#include "marshal.h"

namespace vok {
namespace server {

std::string serialised(const pkcs11::OperationResult& response) {
    std::string bytes;
    if (!response.SerializeToString(&bytes) || bytes.size() > kFrameLimit) return std::string();
    return bytes;
}

}  // namespace server
}  // namespace vok
