// The real path, run by scripts/demo as its client: this process is the
// application calling the exported C_ proxies, and the Java service host
// serves SoftHSM2 through the module bridge across the socket. What the token
// produces is checked with OpenSSL. The signatures (ECDSA, RSA) and AES-CBC-PAD
// are the native demo client's (the demo_native test), here the parameters
// that hold pointers and digests of the edge sizes.
//
//   softhsm_e2e_tests [gtest flags] <proxy library> <server id> <user PIN> <file>

#include <gtest/gtest.h>

#include <iostream>
#include <memory>
#include <string>
#include <vector>

#include "openssl_checks.h"
#include "pkcs11_calls.h"

namespace {

using namespace vok::demo;

// The application's one channel and logged-in session, for every case.
std::unique_ptr<ProxyLibrary> proxy;
std::unique_ptr<Session> session;

Bytes bytes(const std::string& text) { return Bytes(text.begin(), text.end()); }

// Parameters that hold pointers reach the token by value: GCM's IV and AAD,
// the peer's point of ECDH. (SoftHSM2 2.6 takes OAEP with SHA-1 and no label
// only, and has no PBKDF2; the fake module's tables cover those.)
TEST(SoftHsmThroughProxy, AesGcmWithIvAndAadOpensWithOpenSsl) {
    const CK_OBJECT_HANDLE key = session->generateAes256(true);
    Bytes iv(12, 0x5a), aad = bytes("authenticated, not encrypted");
    const Bytes plain = bytes("AES-GCM through the proxy");
    CK_GCM_PARAMS gcm = {iv.data(), iv.size(), 96, aad.data(), aad.size(), 128};
    const Bytes sealed = session->encrypt({CKM_AES_GCM, &gcm, sizeof gcm}, key, plain);
    Bytes opened;
    ASSERT_TRUE(decryptAes256Gcm(session->attribute(key, CKA_VALUE), iv, aad, sealed, &opened));
    EXPECT_EQ(opened, plain);
    EXPECT_EQ(session->decrypt({CKM_AES_GCM, &gcm, sizeof gcm}, key, sealed), plain);
}

TEST(SoftHsmThroughProxy, Ecdh1SecretMatchesOpenSsls) {
    CK_OBJECT_HANDLE publicKey, privateKey;
    session->generateEcP256(&publicKey, &privateKey);
    Bytes peerPoint;
    const Bytes expected = ecdhP256(session->attribute(publicKey, CKA_EC_POINT), &peerPoint);
    ASSERT_EQ(expected.size(), 32u);
    EXPECT_EQ(hex(session->deriveEcdh(privateKey, peerPoint)), hex(expected));
}

TEST(SoftHsmThroughProxy, Sha256DigestsMatchOpenSsl) {
    for (size_t size : {size_t(0), size_t(1), size_t(4096), size_t(1) << 20}) {
        Bytes data(size);
        for (size_t i = 0; i < size; ++i) data[i] = static_cast<unsigned char>(i * 31 + 7);
        EXPECT_EQ(hex(session->sha256(data)), hex(sha256(data))) << size << " bytes";
    }
}

}  // namespace

int main(int argc, char** argv) {
    ::testing::InitGoogleTest(&argc, argv);
    if (argc != 5) {
        std::cerr << "usage: " << argv[0] << " <proxy library> <server id> <user PIN> <file>\n";
        return 2;
    }
    try {
        proxy.reset(new ProxyLibrary(argv[1], argv[2]));
        check("C_Initialize", proxy->functions()->C_Initialize(nullptr));
        session.reset(new Session(proxy->functions()));
        session->login(argv[3]);
    } catch (const std::exception& e) {
        std::cerr << "cannot use the token through the proxy: " << e.what() << "\n";
        return 1;
    }
    const int status = RUN_ALL_TESTS();
    session.reset();
    proxy->functions()->C_Finalize(nullptr);
    proxy.reset();
    return status;
}
