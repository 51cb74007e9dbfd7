#ifndef VOK_DEMO_PKCS11_CALLS_H
#define VOK_DEMO_PKCS11_CALLS_H

// An application's view of the proxy: the library loaded at run time, its
// channel opened to a service, and the few PKCS#11 operations the demo and the
// real-token tests make through its function list. A call that does not
// return CKR_OK throws CallFailed.
//
// The system's own rules shape these calls: output buffers are sent as C
// strings, so they are zero-filled and sized generously (no length queries);
// the single-part C_Verify never hands the module the signature, so
// verification is multi-part.

#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

#include "vok_pkcs11.h"

namespace vok {
namespace demo {

using Bytes = std::vector<unsigned char>;

struct CallFailed : std::runtime_error {
    CallFailed(const std::string& call, CK_RV rv);
    CK_RV rv;
};

// Throws CallFailed(call, rv) unless rv is CKR_OK.
void check(const char* call, CK_RV rv);

class ProxyLibrary {
public:
    // Loads `library`, opens its channel to `serverId` (waiting up to 10 s for
    // a service that is still starting) and takes its function list; throws
    // std::runtime_error on failure.
    ProxyLibrary(const std::string& library, const std::string& serverId);
    ~ProxyLibrary();
    ProxyLibrary(const ProxyLibrary&) = delete;
    ProxyLibrary& operator=(const ProxyLibrary&) = delete;

    CK_FUNCTION_LIST* functions() const { return functions_; }

private:
    int (*deinit_)() = nullptr;
    CK_FUNCTION_LIST* functions_ = nullptr;
};

// A session on the first slot with a token.
class Session {
public:
    explicit Session(CK_FUNCTION_LIST* f);
    ~Session();
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;

    CK_SLOT_ID slot() const { return slot_; }
    CK_SESSION_HANDLE handle() const { return handle_; }
    void login(const std::string& userPin);

    // Session keys (not kept on the token).
    CK_OBJECT_HANDLE generateAes256(bool extractable);
    void generateEcP256(CK_OBJECT_HANDLE* publicKey, CK_OBJECT_HANDLE* privateKey);
    void generateRsa2048(CK_OBJECT_HANDLE* publicKey, CK_OBJECT_HANDLE* privateKey);

    // An attribute's value, read into a buffer of `capacity` bytes.
    Bytes attribute(CK_OBJECT_HANDLE object, CK_ATTRIBUTE_TYPE type, size_t capacity = 1024);

    Bytes encrypt(CK_MECHANISM mechanism, CK_OBJECT_HANDLE key, const Bytes& data);
    Bytes decrypt(CK_MECHANISM mechanism, CK_OBJECT_HANDLE key, const Bytes& data);
    Bytes sign(CK_MECHANISM mechanism, CK_OBJECT_HANDLE key, const Bytes& data);
    // ECDH without a KDF (CKM_ECDH1_DERIVE) with the peer's uncompressed
    // point: the shared secret, read from the derived generic secret.
    Bytes deriveEcdh(CK_OBJECT_HANDLE privateKey, const Bytes& peerPoint);
    // C_VerifyInit, C_VerifyUpdate, C_VerifyFinal; the final call's result.
    CK_RV verify(CK_MECHANISM mechanism, CK_OBJECT_HANDLE key, const Bytes& data,
                 const Bytes& signature);
    // SHA-256 with C_Digest; with C_DigestFinal alone for no data.
    Bytes sha256(const Bytes& data);
    Bytes random(size_t length);

private:
    CK_FUNCTION_LIST* f_;
    CK_SLOT_ID slot_ = 0;
    CK_SESSION_HANDLE handle_ = CK_INVALID_HANDLE;
};

// A blank-padded PKCS#11 text without its padding.
std::string trimmed(const CK_UTF8CHAR* text, size_t size);
std::string hex(const Bytes& bytes);

}  // namespace demo
}  // namespace vok

#endif
