#ifndef VOK_SERVER_CRYPTO_MARSHAL_H
#define VOK_SERVER_CRYPTO_MARSHAL_H

// The rules of the cryptographic and key handlers: the mechanism rebuild and
// the sizing of data buffers. Every buffer is allocated once from the lengths
// in the request; the module is never asked for a size and never called
// twice. Input-only calls (C_DigestUpdate, C_SignUpdate, C_VerifyUpdate,
// C_VerifyFinal) take theirs as an Input.

#include <string>

#include "marshal.h"

namespace vok {
namespace server {

// The client's mechanism for the module: its type, and a parameter buffer of
// exactly ulParameterLen bytes, never NULL even for 0 unless the client's was
// NULL. The mechanism itself is NULL when the request carries none. The
// parameter is passed through as bytes: a structure that holds pointers
// arrives with the client process's pointer values, which is for the module
// to judge.
class NativeMechanism {
public:
    explicit NativeMechanism(Sent<pkcs11::CK_MECHANISM> sent);
    NativeMechanism(const NativeMechanism&) = delete;
    NativeMechanism& operator=(const NativeMechanism&) = delete;
    CK_MECHANISM_PTR get() { return present_ ? &mechanism_ : nullptr; }

private:
    bool present_;
    Input parameter_;
    CK_MECHANISM mechanism_;
};

struct DataBuffers {
    Input input;
    Output output;
};

// Single-part calls (encrypt, decrypt, digest, sign; C_Verify's signature
// takes the output's place): the input at its stated length, the output at the
// client's capacity.
DataBuffers singlePart(Sent<std::string> input, uint64_t inputLength, bool outputPresent,
                       uint64_t capacity);

// Multi-part updates, the recovering calls and the dual-function updates:
// both buffers at the output capacity (the input never shorter than the length
// the module is told), the input filled to its size from the request.
DataBuffers multiPart(Sent<std::string> input, uint64_t inputLength, bool outputPresent,
                      uint64_t capacity);

}  // namespace server
}  // namespace vok

#endif
