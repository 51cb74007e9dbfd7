#ifndef VOK_DEMO_OPENSSL_CHECKS_H
#define VOK_DEMO_OPENSSL_CHECKS_H

// Checks made outside the system, with OpenSSL's libcrypto, on what the token
// produced through the proxy.

#include <string>
#include <vector>

namespace vok {
namespace demo {

using Bytes = std::vector<unsigned char>;

// An ECDSA signature over SHA-256 of `data`, as PKCS#11 gives it (r and s,
// 32 bytes each), checked against the P-256 public key of CKA_EC_POINT (a DER
// OCTET STRING holding the uncompressed point).
bool verifyEcdsaP256Sha256(const Bytes& ecPoint, const Bytes& data, const Bytes& signature);

// An RSA PKCS#1 v1.5 signature over SHA-256 of `data`, checked against the
// public key of CKA_MODULUS and CKA_PUBLIC_EXPONENT.
bool verifyRsaPkcs1Sha256(const Bytes& modulus, const Bytes& exponent, const Bytes& data,
                          const Bytes& signature);

// AES-256-CBC decryption with PKCS#7 padding; false when it fails.
bool decryptAes256CbcPad(const Bytes& key, const Bytes& iv, const Bytes& ciphertext,
                         Bytes* plaintext);

Bytes sha256(const Bytes& data);

// AES-256-GCM decryption of ciphertext followed by its 16-byte tag; false
// when the tag does not authenticate `aad` and the ciphertext.
bool decryptAes256Gcm(const Bytes& key, const Bytes& iv, const Bytes& aad, const Bytes& sealed,
                      Bytes* plaintext);

// A fresh P-256 key of OpenSSL's: its uncompressed public point into
// *ownPoint, and the ECDH shared secret (the x coordinate) with `peerPoint`
// (CKA_EC_POINT, a DER OCTET STRING around an uncompressed point); empty on
// failure.
Bytes ecdhP256(const Bytes& peerPoint, Bytes* ownPoint);

}  // namespace demo
}  // namespace vok

#endif
