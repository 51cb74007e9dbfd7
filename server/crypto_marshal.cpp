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

NativeMechanism::NativeMechanism(Sent<pkcs11::CK_MECHANISM> sent)
    : present_(sent.present),
      parameter_(VOK_SENT(sent.value, pparameter), sent.value.ulparameterlen()),
      mechanism_{sent.value.mechanism(), parameter_.data(), sent.value.ulparameterlen()},
      copy_(present_ ? ParameterCopy::of(sent.value) : nullptr) {
    if (copy_) mechanism_.pParameter = copy_->data(), mechanism_.ulParameterLen = copy_->size();
}

DataBuffers singlePart(Sent<std::string> input, uint64_t inputLength, bool outputPresent,
                       uint64_t capacity) {
    requireOneFrame(inputLength, capacity);
    return DataBuffers{Input(input, inputLength), Output(outputPresent, capacity)};
}

DataBuffers multiPart(Sent<std::string> input, uint64_t inputLength, bool outputPresent,
                      uint64_t capacity) {
    // Never below the told input length: a longer input is not read past its buffer.
    const uint64_t inputSize = std::max(capacity, inputLength);
    requireOneFrame(inputSize, capacity);
    return DataBuffers{Input(input, inputSize), Output(outputPresent, capacity)};
}

}  // namespace server
}  // namespace vok
