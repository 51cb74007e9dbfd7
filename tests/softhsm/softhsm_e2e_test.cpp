// The real path: this process is the application, calling the exported C_
// proxies; the Java service host serves SoftHSM2 through the module bridge
// across the socket. What the token produces is checked with OpenSSL, and the
// information structures against SoftHSM2 called directly.

#include <dlfcn.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "host_pkcs11.h"
#include "member_table.h"
#include "openssl_checks.h"
#include "pkcs11_calls.h"
#include "service_host.h"
#include "softhsm_token.h"

namespace {

using namespace vok::demo;
using vok::test::differingMembers;
using vok::test::SoftHsmToken;

std::string directoryOf(const std::string& path) { return path.substr(0, path.rfind('/')); }

Bytes bytes(const std::string& text) { return Bytes(text.begin(), text.end()); }

class SoftHsmThroughProxy : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(token_.ready());
        const auto* test = ::testing::UnitTest::GetInstance()->current_test_info();
        const std::string serverId =
            "Xvok-softhsm-" + std::to_string(getpid()) + "-" + test->name();
        host_.reset(new vok::test::ServiceHostProcess(
            VOK_TEST_JAVA, VOK_TEST_JAR, directoryOf(VOK_TEST_WRAPPER), serverId, VOK_TEST_BRIDGE));
        ASSERT_TRUE(host_->serving()) << host_->output();
        proxy_.reset(new ProxyLibrary(VOK_TEST_WRAPPER, serverId));
        f_ = proxy_->functions();
        check("C_Initialize", f_->C_Initialize(nullptr));
        session_.reset(new Session(f_));
        session_->login(SoftHsmToken::kUserPin);
    }
    void TearDown() override {
        session_.reset();
        if (f_) f_->C_Finalize(nullptr);
        proxy_.reset();
        host_.reset();
    }

    SoftHsmToken token_;
    std::unique_ptr<vok::test::ServiceHostProcess> host_;
    std::unique_ptr<ProxyLibrary> proxy_;
    CK_FUNCTION_LIST* f_ = nullptr;
    std::unique_ptr<Session> session_;
};

// SoftHSM2 2.6 signs with plain CKM_ECDSA only: the token signs the SHA-256
// digest, which OpenSSL's ECDSA-SHA256 verification computes itself.
TEST_F(SoftHsmThroughProxy, EcdsaP256SignatureVerifiesWithOpenSsl) {
    CK_OBJECT_HANDLE publicKey, privateKey;
    session_->generateEcP256(&publicKey, &privateKey);
    const Bytes data = bytes("ECDSA over SHA-256, made on the token");
    const Bytes signature = session_->sign({CKM_ECDSA, nullptr, 0}, privateKey, sha256(data));
    const Bytes point = session_->attribute(publicKey, CKA_EC_POINT);
    EXPECT_TRUE(verifyEcdsaP256Sha256(point, data, signature)) << hex(point) << "\n"
                                                               << hex(signature);
    Bytes other = data;
    other[0] ^= 1;
    EXPECT_FALSE(verifyEcdsaP256Sha256(point, other, signature));
}

TEST_F(SoftHsmThroughProxy, RsaPkcs1SignatureVerifiesWithOpenSsl) {
    CK_OBJECT_HANDLE publicKey, privateKey;
    session_->generateRsa2048(&publicKey, &privateKey);
    const Bytes data = bytes("RSA PKCS#1 v1.5 over SHA-256, made on the token");
    const Bytes signature = session_->sign({CKM_SHA256_RSA_PKCS, nullptr, 0}, privateKey, data);
    const Bytes modulus = session_->attribute(publicKey, CKA_MODULUS);
    const Bytes exponent = session_->attribute(publicKey, CKA_PUBLIC_EXPONENT);
    EXPECT_EQ(modulus.size(), 256u);
    EXPECT_EQ(signature.size(), 256u);
    EXPECT_TRUE(verifyRsaPkcs1Sha256(modulus, exponent, data, signature));
}

TEST_F(SoftHsmThroughProxy, AesCbcPadCiphertextDecryptsWithOpenSsl) {
    const CK_OBJECT_HANDLE key = session_->generateAes256(true);
    Bytes iv = {0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15};
    const Bytes plain = bytes("forty-one bytes of plain text to encrypt.");
    const Bytes cipher = session_->encrypt({CKM_AES_CBC_PAD, iv.data(), iv.size()}, key, plain);
    EXPECT_EQ(cipher.size(), 48u);
    Bytes decrypted;
    ASSERT_TRUE(decryptAes256CbcPad(session_->attribute(key, CKA_VALUE), iv, cipher, &decrypted));
    EXPECT_EQ(decrypted, plain);
}

TEST_F(SoftHsmThroughProxy, Sha256DigestsMatchOpenSsl) {
    for (size_t size : {size_t(0), size_t(1), size_t(4096), size_t(1) << 20}) {
        Bytes data(size);
        for (size_t i = 0; i < size; ++i) data[i] = static_cast<unsigned char>(i * 31 + 7);
        EXPECT_EQ(hex(session_->sha256(data)), hex(sha256(data))) << size << " bytes";
    }
}

// The information structures cross two conversions: SoftHSM2's standard
// layout to the packed one in the bridge, and the packed structure to the
// message and back between service and proxy.
class InformationThroughProxy : public SoftHsmThroughProxy {
protected:
    void SetUp() override {
        SoftHsmThroughProxy::SetUp();
        module_ = dlopen(SoftHsmToken::kModule, RTLD_NOW | RTLD_LOCAL);
        ASSERT_NE(module_, nullptr) << dlerror();
        auto getter =
            reinterpret_cast<host::CK_C_GetFunctionList>(dlsym(module_, "C_GetFunctionList"));
        ASSERT_TRUE(getter && getter(&direct_) == CKR_OK);
        ASSERT_EQ(direct_->C_Initialize(nullptr), CKR_OK);
        // The same sessions on both sides, so that the token's counters agree.
        ASSERT_EQ(direct_->C_OpenSession(session_->slot(), CKF_SERIAL_SESSION | CKF_RW_SESSION,
                                         nullptr, nullptr, &directSession_),
                  CKR_OK);
    }
    void TearDown() override {
        if (direct_) direct_->C_Finalize(nullptr);
        if (module_) dlclose(module_);
        SoftHsmThroughProxy::TearDown();
    }

    void* module_ = nullptr;
    host::ck_function_list* direct_ = nullptr;
    CK_SESSION_HANDLE directSession_ = 0;
};

// Every member arrives as SoftHSM2 gave it, but for the texts the system's
// own text rules do not carry: the service sends a text member as a C string
// that runs on into the following members up to the first zero byte, and the
// proxies of C_GetInfo and C_GetSlotInfo copy only a text that fits its member,
// leaving the caller's bytes otherwise (C_GetTokenInfo cuts every text to its
// member). With SoftHSM2's blank-padded texts:
// - CK_INFO.libraryDescription runs on into libraryVersion (2.6): 34 bytes;
// - CK_SLOT_INFO.slotDescription runs on through manufacturerID into flags
//   (CKF_TOKEN_PRESENT): 97 bytes; manufacturerID into flags: 33 bytes.
// CK_INFO.manufacturerID stops at flags, which are 0, and arrives whole.
TEST_F(InformationThroughProxy, StructuresMatchTheModuleButWhereTextRulesKeepTheCallersBytes) {
    constexpr unsigned char kCallers = '#';
    const CK_SLOT_ID slot = session_->slot();
    struct Row {
        const char* call;
        const std::vector<vok::test::Member>& members;
        std::vector<std::string> callersBytesKept;
        std::function<void(void* proxied, void* direct)> fill;
    };
    const std::vector<Row> rows = {
        {"C_GetInfo",
         vok::test::kInfoMembers,
         {"CK_INFO.libraryDescription"},
         [&](void* p, void* d) {
             ASSERT_EQ(f_->C_GetInfo(static_cast<CK_INFO*>(p)), CKR_OK);
             ASSERT_EQ(direct_->C_GetInfo(static_cast<host::ck_info*>(d)), CKR_OK);
         }},
        {"C_GetSlotInfo",
         vok::test::kSlotInfoMembers,
         {"CK_SLOT_INFO.slotDescription", "CK_SLOT_INFO.manufacturerID"},
         [&](void* p, void* d) {
             ASSERT_EQ(f_->C_GetSlotInfo(slot, static_cast<CK_SLOT_INFO*>(p)), CKR_OK);
             ASSERT_EQ(direct_->C_GetSlotInfo(slot, static_cast<host::ck_slot_info*>(d)), CKR_OK);
         }},
        {"C_GetTokenInfo",
         vok::test::kTokenInfoMembers,
         {},
         [&](void* p, void* d) {
             ASSERT_EQ(f_->C_GetTokenInfo(slot, static_cast<CK_TOKEN_INFO*>(p)), CKR_OK);
             ASSERT_EQ(direct_->C_GetTokenInfo(slot, static_cast<host::ck_token_info*>(d)), CKR_OK);
         }},
    };
    for (const Row& row : rows) {
        SCOPED_TRACE(row.call);
        Bytes proxied(sizeof(CK_TOKEN_INFO), kCallers);
        Bytes direct(sizeof(host::ck_token_info), 0);
        row.fill(proxied.data(), direct.data());
        EXPECT_EQ(differingMembers(row.members, proxied.data(), direct.data()),
                  row.callersBytesKept);
        for (const vok::test::Member& m : row.members) {
            const auto& kept = row.callersBytesKept;
            if (std::find(kept.begin(), kept.end(), m.name) == kept.end()) continue;
            const auto at = proxied.begin() + static_cast<long>(m.packedOffset);
            EXPECT_EQ(Bytes(at, at + static_cast<long>(m.packedSize)),
                      Bytes(m.packedSize, kCallers))
                << m.name;
        }
    }
}

}  // namespace
