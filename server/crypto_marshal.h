#ifndef VOK_SERVER_CRYPTO_MARSHAL_H
#define VOK_SERVER_CRYPTO_MARSHAL_H

// The rules of the cryptographic and key handlers: the mechanism rebuild and
// the sizing of data buffers. Every buffer is allocated once from the lengths
// in the request; the module is never asked for a size and never called
// twice. Input-only calls (C_DigestUpdate, C_SignUpdate, C_VerifyUpdate,
// C_VerifyFinal) take theirs as an Input.

#include <string>

#include "by_value.h"
#include "marshal.h"

namespace vok {
namespace server {

// The client's mechanism for the module: its type, and a parameter buffer of
// exactly ulParameterLen bytes, never NULL even for 0 unless the client's was
// NULL. The mechanism itself is NULL when the request carries none. Plain
// parameters pass as bytes; a structure that holds pointers is the service's
// own copy, built from its by-value form (by_value.h), or the call is
// refused.
class NativeMechanism {
public:
    explicit NativeMechanism(Sent<pkcs11::CK_MECHANISM> sent);
    NativeMechanism(const NativeMechanism&) = delete;
    NativeMechanism& operator=(const NativeMechanism&) = delete;
    CK_MECHANISM_PTR get() { return present_ ? &mechanism_ : nullptr; }

    // What the module wrote into the parameter's output members, for the
    // answers of C_GenerateKey, C_UnwrapKey and C_DeriveKey; nothing for a
    // parameter without any.
    template <class Response>
    void answerOutputs(Response* response) const {
        if (copy_ && copy_->returnsOutputs()) copy_->answer(response->mutable_pparametervalue());
    }

private:
    bool present_;
    Input parameter_;
    CK_MECHANISM mechanism_;
    std::unique_ptr<ParameterCopy> copy_;
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
