// Arbitrary request bytes into the dispatcher, with the fake vendor module
// behind it. An input is a run of requests on a fresh token, each behind its
// length in two bytes (low byte first), so that one request can use the
// sessions and objects of those before it.

#include <cstddef>
#include <cstdint>
#include <memory>

#include "fake_vendor.h"
#include "fuzz_support.h"
#include "vok_proto.h"
#include "vok_server.h"

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    vokfuzz::quietLogs();
    vokfuzz::registerModule(vokfuzz::serverId("dispatcher").c_str(), fake_vendor_function_list());
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    fake_vendor_reset();
    while (size >= 2) {
        const size_t length = std::min<size_t>(data[0] | data[1] << 8, size - 2);
        void* answer = nullptr;
        uint32_t answerLength = 0;
        Generate_Operation_Result_Server(data + 2, static_cast<int32_t>(length), &answer,
                                         &answerLength);
        std::unique_ptr<uint8_t[]> owned(static_cast<uint8_t*>(answer));
        // An answer is either empty or a whole OperationResult.
        pkcs11::OperationResult result;
        if (answerLength != 0 &&
            !result.ParseFromArray(owned.get(), static_cast<int>(answerLength)))
            __builtin_trap();
        data += 2 + length;
        size -= 2 + length;
    }
    return 0;
}
