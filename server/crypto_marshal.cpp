#include "crypto_marshal.h"

#include <algorithm>
#include <utility>

namespace vok {
namespace server {

namespace {

// The buffers of one call together must fit a frame, as the values of one
// template must; checked before anything is allocated.
void requireOneFrame(uint64_t first, uint64_t second) {
    if (first > kFrameLimit || second > kFrameLimit - first) throw std::bad_alloc();
}

}  // namespace

NativeMechanism::NativeMechanism(const pkcs11::CK_MECHANISM& sent)
    : parameter_(fromRequest(sent.pparameter(), sent.ulparameterlen())),
      mechanism_{sent.mechanism(), parameter_.data(), sent.ulparameterlen()},
      copy_(ParameterCopy::of(sent)) {
    if (copy_) mechanism_.pParameter = copy_->data(), mechanism_.ulParameterLen = copy_->size();
}

Output::Output(Bytes buffer) : buffer_(std::move(buffer)), length_(buffer_.count()) {}

DataBuffers singlePart(const std::string& input, uint64_t inputLength, uint64_t capacity) {
    requireOneFrame(inputLength, capacity);
    return DataBuffers{fromRequest(input, inputLength), Output(Bytes(capacity))};
}

DataBuffers multiPart(const std::string& input, uint64_t inputLength, uint64_t capacity) {
    // Never below the told input length: a longer input is not read past its buffer.
    const uint64_t inputSize = std::max(capacity, inputLength);
    requireOneFrame(inputSize, capacity);
    return DataBuffers{fromRequest(input, inputSize), Output(Bytes(capacity))};
}

Output finalPart(uint64_t capacity) { return Output(Bytes(capacity)); }

}  // namespace server
}  // namespace vok
