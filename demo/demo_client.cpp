// The demo's client application: it loads the proxy library, reaches the
// service by its server id and uses the token behind it, one step per line
// with the time each took, then a summary. Exit status 0 only when every step
// checked out.
//
//   vok_demo_client <proxy library> <server id> <user PIN> <file to digest>

#include <chrono>
#include <cstdio>
#include <fstream>
#include <functional>
#include <iostream>
#include <iterator>
#include <memory>
#include <string>
#include <vector>

#include "openssl_checks.h"
#include "pkcs11_calls.h"

namespace {

using namespace vok::demo;
using Clock = std::chrono::steady_clock;

const char kMessage[] = "Signed on the token, behind the proxy.";

struct Demo {
    std::string library, serverId, pin, file;
    std::unique_ptr<ProxyLibrary> proxy;
    CK_FUNCTION_LIST* f = nullptr;
    std::unique_ptr<Session> session;
    CK_OBJECT_HANDLE ecPublic = CK_INVALID_HANDLE, ecPrivate = CK_INVALID_HANDLE;
    CK_OBJECT_HANDLE rsaPublic = CK_INVALID_HANDLE, rsaPrivate = CK_INVALID_HANDLE;
    Bytes message = Bytes(kMessage, kMessage + sizeof kMessage - 1);
    Bytes ecSignature, rsaSignature;
};

struct Step {
    const char* name;
    std::function<std::string(Demo&)> run;  // what it showed; throws when it did not check out
};

void expect(bool condition, const std::string& what) {
    if (!condition) throw std::runtime_error(what);
}

Bytes bytes(const std::string& text) { return Bytes(text.begin(), text.end()); }

std::string version(const CK_VERSION& v) {
    return std::to_string(v.major) + "." + std::to_string(v.minor);
}

Bytes readFile(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    expect(in.good(), "cannot read " + path);
    return Bytes(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
}

std::string sha256sumOf(const std::string& path) {
    expect(path.find('\'') == std::string::npos, "a file name with a quote");
    FILE* pipe = popen(("sha256sum '" + path + "'").c_str(), "r");
    expect(pipe != nullptr, "cannot run sha256sum");
    char line[256] = {0};
    const bool read = std::fgets(line, sizeof line, pipe) != nullptr;
    const int status = pclose(pipe);
    expect(read && status == 0, "sha256sum failed");
    return std::string(line).substr(0, 64);
}

CK_MECHANISM sha256RsaPkcs() { return CK_MECHANISM{CKM_SHA256_RSA_PKCS, nullptr, 0}; }

const std::vector<Step> kSteps = {
    {"connect",
     [](Demo& d) {
         d.proxy.reset(new ProxyLibrary(d.library, d.serverId));
         d.f = d.proxy->functions();
         check("C_Initialize", d.f->C_Initialize(nullptr));
         return "channel open to service \"" + d.serverId + "\", C_Initialize";
     }},
    {"library",
     [](Demo& d) {
         CK_INFO info{};
         check("C_GetInfo", d.f->C_GetInfo(&info));
         return "C_GetInfo: \"" + trimmed(info.manufacturerID, sizeof info.manufacturerID) +
                "\", Cryptoki " + version(info.cryptokiVersion) + ", library " +
                version(info.libraryVersion);
     }},
    {"token",
     [](Demo& d) {
         d.session.reset(new Session(d.f));
         CK_TOKEN_INFO info{};
         check("C_GetTokenInfo", d.f->C_GetTokenInfo(d.session->slot(), &info));
         expect((info.flags & CKF_TOKEN_INITIALIZED) != 0, "token not initialised");
         return "slot " + std::to_string(d.session->slot()) + ": \"" +
                trimmed(info.label, sizeof info.label) + "\", " +
                trimmed(info.manufacturerID, sizeof info.manufacturerID) + " " +
                trimmed(info.model, sizeof info.model) + ", serial " +
                trimmed(info.serialNumber, sizeof info.serialNumber) + "; session open";
     }},
    {"login",
     [](Demo& d) {
         d.session->login(d.pin);
         CK_SESSION_INFO info{};
         check("C_GetSessionInfo", d.f->C_GetSessionInfo(d.session->handle(), &info));
         expect(info.state == CKS_RW_USER_FUNCTIONS, "session not in the user's state");
         return std::string("C_Login as the token's user; session state: user functions");
     }},
    {"aes-256",
     [](Demo& d) {
         const CK_OBJECT_HANDLE key = d.session->generateAes256(false);
         Bytes iv = d.session->random(16);
         const Bytes plain = bytes("A message for the AES key on the token.");
         CK_MECHANISM cbcPad = {CKM_AES_CBC_PAD, iv.data(), iv.size()};
         const Bytes cipher = d.session->encrypt(cbcPad, key, plain);
         const Bytes back = d.session->decrypt(cbcPad, key, cipher);
         expect(cipher != plain && cipher.size() == 48,
                "ciphertext of " + std::to_string(cipher.size()) + " bytes");
         expect(back == plain, "decryption gave other bytes");
         return "key generated on the token; CBC-PAD: " + std::to_string(plain.size()) +
                " bytes -> " + std::to_string(cipher.size()) + " encrypted -> decrypted back";
     }},
    {"ec-p256",
     [](Demo& d) {
         d.session->generateEcP256(&d.ecPublic, &d.ecPrivate);
         // SoftHSM2 2.6 signs with plain ECDSA: the token digests, then signs the digest.
         const Bytes digest = d.session->sha256(d.message);
         d.ecSignature = d.session->sign({CKM_ECDSA, nullptr, 0}, d.ecPrivate, digest);
         expect(d.ecSignature.size() == 64,
                "signature of " + std::to_string(d.ecSignature.size()) + " bytes");
         return "key pair generated on the token; SHA-256 digest and ECDSA signature made on "
                "the token: " +
                hex(d.ecSignature).substr(0, 16) + "...";
     }},
    {"rsa-2048",
     [](Demo& d) {
         d.session->generateRsa2048(&d.rsaPublic, &d.rsaPrivate);
         d.rsaSignature = d.session->sign(sha256RsaPkcs(), d.rsaPrivate, d.message);
         expect(d.rsaSignature.size() == 256,
                "signature of " + std::to_string(d.rsaSignature.size()) + " bytes");
         return "key pair generated on the token; SHA256-RSA-PKCS signature made on the token: " +
                hex(d.rsaSignature).substr(0, 16) + "...";
     }},
    // C_Verify never hands the module the signature, so verification through
    // the proxy is multi-part, which SoftHSM2 2.6 offers for RSA, not ECDSA.
    {"verify",
     [](Demo& d) {
         const CK_RV valid =
             d.session->verify(sha256RsaPkcs(), d.rsaPublic, d.message, d.rsaSignature);
         expect(valid == CKR_OK, "C_VerifyFinal rejected the RSA signature");
         Bytes changed = d.message;
         changed.back() ^= 1;
         const CK_RV forged =
             d.session->verify(sha256RsaPkcs(), d.rsaPublic, changed, d.rsaSignature);
         expect(forged == CKR_SIGNATURE_INVALID, "a changed message was not rejected");
         return std::string(
             "RSA signature checked on the token with C_VerifyUpdate/"
             "C_VerifyFinal: valid; changed message: CKR_SIGNATURE_INVALID");
     }},
    {"openssl",
     [](Demo& d) {
         const Bytes point = d.session->attribute(d.ecPublic, CKA_EC_POINT);
         expect(verifyEcdsaP256Sha256(point, d.message, d.ecSignature),
                "OpenSSL rejected the ECDSA signature");
         const Bytes modulus = d.session->attribute(d.rsaPublic, CKA_MODULUS);
         const Bytes exponent = d.session->attribute(d.rsaPublic, CKA_PUBLIC_EXPONENT);
         expect(verifyRsaPkcs1Sha256(modulus, exponent, d.message, d.rsaSignature),
                "OpenSSL rejected the RSA signature");
         return std::string(
             "OpenSSL verifies both signatures with the public keys read from "
             "the token (CKA_EC_POINT; CKA_MODULUS, CKA_PUBLIC_EXPONENT)");
     }},
    {"sha-256",
     [](Demo& d) {
         const Bytes content = readFile(d.file);
         const std::string onToken = hex(d.session->sha256(content));
         const std::string reference = sha256sumOf(d.file);
         expect(onToken == reference, "token " + onToken + ", sha256sum " + reference);
         return d.file + " (" + std::to_string(content.size()) +
                " bytes): " + onToken.substr(0, 16) + "... equals sha256sum";
     }},
    {"random",
     [](Demo& d) {
         const Bytes random = d.session->random(32);
         expect(random != Bytes(32, 0), "32 zero bytes");
         return "C_GenerateRandom: " + hex(random);
     }},
    {"finish",
     [](Demo& d) {
         check("C_Logout", d.f->C_Logout(d.session->handle()));
         d.session.reset();
         check("C_Finalize", d.f->C_Finalize(nullptr));
         return std::string("C_Logout, C_CloseSession, C_Finalize");
     }},
};

double millisecondsSince(Clock::time_point start) {
    return std::chrono::duration<double, std::milli>(Clock::now() - start).count();
}

}  // namespace

int main(int argc, char** argv) {
    if (argc != 5) {
        std::cerr << "usage: vok_demo_client <proxy library> <server id> <user PIN> <file>\n";
        return 2;
    }
    Demo demo;
    demo.library = argv[1];
    demo.serverId = argv[2];
    demo.pin = argv[3];
    demo.file = argv[4];

    size_t passed = 0;
    const Clock::time_point begin = Clock::now();
    for (const Step& step : kSteps) {
        const Clock::time_point start = Clock::now();
        std::string shown, verdict = "ok  ";
        try {
            shown = step.run(demo);
            ++passed;
        } catch (const std::exception& e) {
            shown = e.what();
            verdict = "FAIL";
        }
        std::printf("%s [%8.1f ms] %-8s %s\n", verdict.c_str(), millisecondsSince(start), step.name,
                    shown.c_str());
        std::fflush(stdout);
    }
    std::printf("summary: %zu of %zu steps checked out in %.1f ms\n", passed, kSteps.size(),
                millisecondsSince(begin));
    return passed == kSteps.size() ? 0 : 1;
}
