#include "call_frame.h"

#include <climits>
#include <cstdlib>
#include <memory>
#include <string>

#include "vok_comm.h"

#define LOG_TAG "Vokpkcs11f"
#include "vok_log.h"

namespace vok {
namespace client {

namespace {
struct FreeDeleter {
    void operator()(void* p) const { std::free(p); }
};
}  // namespace

int32_t exchange(const pkcs11::Operation& request, pkcs11::OperationResult& response,
                 uint32_t& responseLength) {
    std::string bytes;
    request.SerializeToString(&bytes);
    if (bytes.size() > static_cast<size_t>(INT32_MAX)) return 5;  // cannot be framed

    void* answer = nullptr;
    uint32_t answerLength = 0;  // a header with non-zero status yields success without data
    int32_t status = vokpkcs11_comm_client_execute_command(
        bytes.data(), static_cast<int32_t>(bytes.size()), &answer, &answerLength);
    std::unique_ptr<void, FreeDeleter> owned(answer);
    if (status != 0) return status;

    response.ParseFromArray(answer, static_cast<int>(answer ? answerLength : 0));
    responseLength = answerLength;
    return 0;
}

void logSuccessLines(const char* name, uint32_t responseLength) {
    VOK_LOGD("%s Success", name);
    VOK_LOGD("%s response length = %d", name, static_cast<int>(responseLength));
}

}  // namespace client
}  // namespace vok
