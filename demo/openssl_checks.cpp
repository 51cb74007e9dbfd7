#include "openssl_checks.h"

#include <openssl/bn.h>
#include <openssl/core_names.h>
#include <openssl/ec.h>
#include <openssl/evp.h>
#include <openssl/param_build.h>

#include <memory>

namespace vok {
namespace demo {

namespace {

template <class T, void (*Free)(T*)>
struct Deleter {
    void operator()(T* p) const { Free(p); }
};
template <class T, void (*Free)(T*)>
using Owned = std::unique_ptr<T, Deleter<T, Free>>;

using Key = Owned<EVP_PKEY, EVP_PKEY_free>;
using KeyContext = Owned<EVP_PKEY_CTX, EVP_PKEY_CTX_free>;
using DigestContext = Owned<EVP_MD_CTX, EVP_MD_CTX_free>;
using Number = Owned<BIGNUM, BN_free>;

Key keyFromParameters(const char* type, const OSSL_PARAM* parameters) {
    KeyContext context(EVP_PKEY_CTX_new_from_name(nullptr, type, nullptr));
    EVP_PKEY* key = nullptr;
    if (!context || EVP_PKEY_fromdata_init(context.get()) != 1 ||
        EVP_PKEY_fromdata(context.get(), &key, EVP_PKEY_PUBLIC_KEY,
                          const_cast<OSSL_PARAM*>(parameters)) != 1)
        return Key();
    return Key(key);
}

// The P-256 public key of a CKA_EC_POINT value: 04 41 04 x y, the OCTET
// STRING around the 65-byte uncompressed point.
Key p256PublicKey(const Bytes& ecPoint) {
    if (ecPoint.size() != 67 || ecPoint[0] != 0x04 || ecPoint[1] != 65) return Key();
    Bytes point(ecPoint.begin() + 2, ecPoint.end());
    char group[] = "prime256v1";
    const OSSL_PARAM parameters[] = {
        OSSL_PARAM_construct_utf8_string(OSSL_PKEY_PARAM_GROUP_NAME, group, 0),
        OSSL_PARAM_construct_octet_string(OSSL_PKEY_PARAM_PUB_KEY, point.data(), point.size()),
        OSSL_PARAM_construct_end()};
    return keyFromParameters("EC", parameters);
}

bool verifySha256(EVP_PKEY* key, const Bytes& data, const unsigned char* signature, size_t length) {
    DigestContext context(EVP_MD_CTX_new());
    return context &&
           EVP_DigestVerifyInit(context.get(), nullptr, EVP_sha256(), nullptr, key) == 1 &&
           EVP_DigestVerify(context.get(), signature, length, data.data(), data.size()) == 1;
}

}  // namespace

bool verifyEcdsaP256Sha256(const Bytes& ecPoint, const Bytes& data, const Bytes& signature) {
    Key key = p256PublicKey(ecPoint);
    if (!key || signature.size() != 64) return false;

    // OpenSSL takes the signature DER-encoded.
    Owned<ECDSA_SIG, ECDSA_SIG_free> sig(ECDSA_SIG_new());
    BIGNUM* r = BN_bin2bn(signature.data(), 32, nullptr);
    BIGNUM* s = BN_bin2bn(signature.data() + 32, 32, nullptr);
    if (!sig || !r || !s || ECDSA_SIG_set0(sig.get(), r, s) != 1) {
        BN_free(r);
        BN_free(s);
        return false;
    }
    unsigned char* der = nullptr;
    const int length = i2d_ECDSA_SIG(sig.get(), &der);
    if (length <= 0) return false;
    const bool valid = verifySha256(key.get(), data, der, static_cast<size_t>(length));
    OPENSSL_free(der);
    return valid;
}

bool verifyRsaPkcs1Sha256(const Bytes& modulus, const Bytes& exponent, const Bytes& data,
                          const Bytes& signature) {
    Number n(BN_bin2bn(modulus.data(), static_cast<int>(modulus.size()), nullptr));
    Number e(BN_bin2bn(exponent.data(), static_cast<int>(exponent.size()), nullptr));
    Owned<OSSL_PARAM_BLD, OSSL_PARAM_BLD_free> builder(OSSL_PARAM_BLD_new());
    if (!n || !e || !builder ||
        OSSL_PARAM_BLD_push_BN(builder.get(), OSSL_PKEY_PARAM_RSA_N, n.get()) != 1 ||
        OSSL_PARAM_BLD_push_BN(builder.get(), OSSL_PKEY_PARAM_RSA_E, e.get()) != 1)
        return false;
    Owned<OSSL_PARAM, OSSL_PARAM_free> parameters(OSSL_PARAM_BLD_to_param(builder.get()));
    if (!parameters) return false;
    Key key = keyFromParameters("RSA", parameters.get());
    return key && verifySha256(key.get(), data, signature.data(), signature.size());
}

bool decryptAes256CbcPad(const Bytes& key, const Bytes& iv, const Bytes& ciphertext,
                         Bytes* plaintext) {
    if (key.size() != 32 || iv.size() != 16) return false;
    Owned<EVP_CIPHER_CTX, EVP_CIPHER_CTX_free> context(EVP_CIPHER_CTX_new());
    Bytes out(ciphertext.size() + 16);
    int first = 0, last = 0;
    if (!context ||
        EVP_DecryptInit_ex(context.get(), EVP_aes_256_cbc(), nullptr, key.data(), iv.data()) != 1 ||
        EVP_DecryptUpdate(context.get(), out.data(), &first, ciphertext.data(),
                          static_cast<int>(ciphertext.size())) != 1 ||
        EVP_DecryptFinal_ex(context.get(), out.data() + first, &last) != 1)
        return false;
    out.resize(static_cast<size_t>(first + last));
    *plaintext = out;
    return true;
}

Bytes sha256(const Bytes& data) {
    Bytes digest(EVP_MAX_MD_SIZE);
    unsigned int length = 0;
    if (EVP_Digest(data.data(), data.size(), digest.data(), &length, EVP_sha256(), nullptr) != 1)
        return Bytes();
    digest.resize(length);
    return digest;
}

bool decryptAes256Gcm(const Bytes& key, const Bytes& iv, const Bytes& aad, const Bytes& sealed,
                      Bytes* plaintext) {
    if (key.size() != 32 || sealed.size() < 16) return false;
    const size_t length = sealed.size() - 16;
    Owned<EVP_CIPHER_CTX, EVP_CIPHER_CTX_free> context(EVP_CIPHER_CTX_new());
    Bytes out(length + 16), tag(sealed.begin() + static_cast<long>(length), sealed.end());
    int written = 0, last = 0;
    if (!context ||
        EVP_DecryptInit_ex(context.get(), EVP_aes_256_gcm(), nullptr, nullptr, nullptr) != 1 ||
        EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_GCM_SET_IVLEN, static_cast<int>(iv.size()),
                            nullptr) != 1 ||
        EVP_DecryptInit_ex(context.get(), nullptr, nullptr, key.data(), iv.data()) != 1 ||
        EVP_DecryptUpdate(context.get(), nullptr, &written, aad.data(),
                          static_cast<int>(aad.size())) != 1 ||
        EVP_DecryptUpdate(context.get(), out.data(), &written, sealed.data(),
                          static_cast<int>(length)) != 1 ||
        EVP_CIPHER_CTX_ctrl(context.get(), EVP_CTRL_GCM_SET_TAG, 16, tag.data()) != 1 ||
        EVP_DecryptFinal_ex(context.get(), out.data() + written, &last) != 1)
        return false;
    out.resize(static_cast<size_t>(written + last));
    *plaintext = out;
    return true;
}

Bytes ecdhP256(const Bytes& peerPoint, Bytes* ownPoint) {
    Key peer = p256PublicKey(peerPoint);
    Key own(EVP_EC_gen("P-256"));
    KeyContext context(own ? EVP_PKEY_CTX_new_from_pkey(nullptr, own.get(), nullptr) : nullptr);
    Bytes secret(32), point(65);
    size_t secretLength = secret.size(), pointLength = 0;
    if (!peer || !context || EVP_PKEY_derive_init(context.get()) != 1 ||
        EVP_PKEY_derive_set_peer(context.get(), peer.get()) != 1 ||
        EVP_PKEY_derive(context.get(), secret.data(), &secretLength) != 1 ||
        EVP_PKEY_get_octet_string_param(own.get(), OSSL_PKEY_PARAM_PUB_KEY, point.data(),
                                        point.size(), &pointLength) != 1)
        return Bytes();
    point.resize(pointLength);
    *ownPoint = point;
    secret.resize(secretLength);
    return secret;
}

}  // namespace demo
}  // namespace vok
