#ifndef VOK_SERVER_CRYPTO_MARSHAL_H
#define VOK_SERVER_CRYPTO_MARSHAL_H

// The rules of the cryptographic and key handlers: the mechanism rebuild and
// the sizing of data buffers. Every buffer is allocated once from the lengths
// in the request; the module is never asked for a size and never called
// twice. Input-only calls (C_DigestUpdate, C_SignUpdate, C_VerifyUpdate,
// C_VerifyFinal) take their input with fromRequest.

#include <string>

#include "by_value.h"
#include "marshal.h"

namespace vok {
namespace server {

// The client's mechanism for the module: its type, and a parameter buffer of
// exactly ulParameterLen bytes, never NULL even for 0. Plain parameters pass
// as bytes; a structure that holds pointers is the service's own copy, built
// from its by-value form (by_value.h), or the call is refused.
class NativeMechanism {
public:
    explicit NativeMechanism(const pkcs11::CK_MECHANISM& sent);
    NativeMechanism(const NativeMechanism&) = delete;
    NativeMechanism& operator=(const NativeMechanism&) = delete;
    CK_MECHANISM_PTR get() { return &mechanism_; }

    // What the module wrote into the parameter's output members, for the
    // answers of C_GenerateKey, C_UnwrapKey and C_DeriveKey; nothing for a
    // parameter without any.
    template <class Response>
    void answerOutputs(Response* response) const {
        if (copy_ && copy_->returnsOutputs()) copy_->answer(response->mutable_pparametervalue());
    }

private:
    Bytes parameter_;
    CK_MECHANISM mechanism_;
    std::unique_ptr<ParameterCopy> copy_;
};

// A buffer the module writes, with its in/out length, which starts at the
// buffer's size (the client's capacity). Never NULL, even for capacity 0: a
// client's length query reaches the module as a zero-capacity buffer and
// comes back with CKR_BUFFER_TOO_SMALL and the needed length.
class Output {
public:
    explicit Output(Bytes buffer);
    CK_BYTE_PTR data() const { return buffer_.data(); }
    CK_ULONG_PTR length() { return &length_; }
    // The length as the module left it, sent back whatever rv is.
    CK_ULONG reported() const { return length_; }
    // The first reported() bytes, never more than were allocated.
    std::string written() const { return leading(buffer_, length_); }

private:
    Bytes buffer_;
    CK_ULONG length_;
};

struct DataBuffers {
    Bytes input;
    Output output;
};

// Single-part calls (encrypt, decrypt, digest, sign; C_Verify's signature
// takes the output's place): the input at its stated length, the output at the
// client's capacity.
DataBuffers singlePart(const std::string& input, uint64_t inputLength, uint64_t capacity);

// Multi-part updates, the recovering calls and the dual-function updates:
// both buffers at the output capacity (the input never shorter than the length
// the module is told), the input filled to its size from the request.
DataBuffers multiPart(const std::string& input, uint64_t inputLength, uint64_t capacity);

// Finals: an output buffer only.
Output finalPart(uint64_t capacity);

}  // namespace server
}  // namespace vok

#endif
