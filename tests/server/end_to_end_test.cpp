// The exported C_ proxies through the real socket to this server, which calls
// the fake module registered under its server id, all in one process: what
// only the whole road shows (a caller's NULL reaching the module as NULL, no
// PIN left behind in memory).
#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <fstream>
#include <functional>
#include <sstream>
#include <string>
#include <vector>

#include "jvm_fixture.h"
#include "raw_peer.h"
#include "server_test_support.h"
#include "vok_client.h"

namespace {

constexpr CK_RV kNoAnswer = ~CK_RV{0};

class EndToEnd : public voktest::JvmTest {
protected:
    void SetUp() override {
        JvmTest::SetUp();
        fake_vendor_reset();
        const std::string id = "vok-server-e2e-" + std::to_string(getpid());
        voktest::registerModule(id.c_str(), fake_vendor_function_list());
        ASSERT_EQ(0, vokpkcs11_init_server(id.c_str()));
        // The server thread binds asynchronously.
        int32_t status = -1;
        for (int i = 0; i < 200 && status != 0; ++i)
            if ((status = vokpkcs11_client_init(id.c_str())) != 0) usleep(5000);
        ASSERT_EQ(0, status);
    }
};

// A caller's NULL buffer, template or mechanism reaches the module as NULL:
// never as zeros of the stated length, and a NULL output stays a length query.
TEST_F(EndToEnd, NullBuffersTemplatesAndMechanismsReachTheModuleAsNull) {
    ASSERT_EQ(CKR_OK, C_Initialize(nullptr));
    CK_SESSION_HANDLE s = 0;
    ASSERT_EQ(CKR_OK, C_OpenSession(1, CKF_SERIAL_SESSION, nullptr, nullptr, &s));
    CK_ULONG n = 8;
    CK_OBJECT_HANDLE h = 0, h2 = 0;
    struct Row {
        const char* function;
        const char* nullArgs;  // the module's names, space-separated
        std::function<CK_RV()> call;
    };
    // clang-format off
#define NULL_ROW(function, args, ...) Row{#function, args, [&] { return function(__VA_ARGS__); }}
    const Row rows[] = {
        NULL_ROW(C_Encrypt, "pData pEncryptedData", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_Decrypt, "pEncryptedData pData", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_Digest, "pData pDigest", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_Sign, "pData pSignature", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_Verify, "pData pSignature", s, nullptr, 8, nullptr, 8),
        NULL_ROW(C_EncryptUpdate, "pPart pEncryptedPart", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_DecryptUpdate, "pEncryptedPart pPart", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_SignRecover, "pData pSignature", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_VerifyRecover, "pSignature pData", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_DigestEncryptUpdate, "pPart pEncryptedPart", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_DecryptDigestUpdate, "pEncryptedPart pPart", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_SignEncryptUpdate, "pPart pEncryptedPart", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_DecryptVerifyUpdate, "pEncryptedPart pPart", s, nullptr, 8, nullptr, &n),
        NULL_ROW(C_EncryptFinal, "pLastEncryptedPart", s, nullptr, &n),
        NULL_ROW(C_DecryptFinal, "pLastPart", s, nullptr, &n),
        NULL_ROW(C_DigestFinal, "pDigest", s, nullptr, &n),
        NULL_ROW(C_SignFinal, "pSignature", s, nullptr, &n),
        NULL_ROW(C_DigestUpdate, "pPart", s, nullptr, 8),
        NULL_ROW(C_SignUpdate, "pPart", s, nullptr, 8),
        NULL_ROW(C_VerifyUpdate, "pPart", s, nullptr, 8),
        NULL_ROW(C_VerifyFinal, "pSignature", s, nullptr, 8),
        NULL_ROW(C_GetOperationState, "pOperationState", s, nullptr, &n),
        NULL_ROW(C_SetOperationState, "pOperationState", s, nullptr, 8, 0, 0),
        NULL_ROW(C_Login, "pPin", s, CKU_USER, nullptr, 4),
        NULL_ROW(C_InitToken, "pPin pLabel", 1, nullptr, 4, nullptr),
        NULL_ROW(C_SeedRandom, "pSeed", s, nullptr, 8),
        NULL_ROW(C_GenerateRandom, "RandomData", s, nullptr, 8),
        NULL_ROW(C_CreateObject, "pTemplate", s, nullptr, 2, &h),
        NULL_ROW(C_CopyObject, "pTemplate", s, 1, nullptr, 2, &h),
        NULL_ROW(C_SetAttributeValue, "pTemplate", s, 1, nullptr, 2),
        NULL_ROW(C_GetAttributeValue, "pTemplate", s, 1, nullptr, 2),
        NULL_ROW(C_FindObjectsInit, "pTemplate", s, nullptr, 2),
        NULL_ROW(C_EncryptInit, "pMechanism", s, nullptr, 1),
        NULL_ROW(C_DecryptInit, "pMechanism", s, nullptr, 1),
        NULL_ROW(C_DigestInit, "pMechanism", s, nullptr),
        NULL_ROW(C_SignInit, "pMechanism", s, nullptr, 1),
        NULL_ROW(C_VerifyInit, "pMechanism", s, nullptr, 1),
        NULL_ROW(C_SignRecoverInit, "pMechanism", s, nullptr, 1),
        NULL_ROW(C_VerifyRecoverInit, "pMechanism", s, nullptr, 1),
        NULL_ROW(C_GenerateKey, "pMechanism pTemplate", s, nullptr, nullptr, 2, &h),
        NULL_ROW(C_GenerateKeyPair, "pMechanism pPublicKeyTemplate pPrivateKeyTemplate",
                 s, nullptr, nullptr, 2, nullptr, 2, &h, &h2),
        NULL_ROW(C_WrapKey, "pMechanism pWrappedKey", s, nullptr, 1, 2, nullptr, &n),
        NULL_ROW(C_UnwrapKey, "pMechanism pWrappedKey pTemplate",
                 s, nullptr, 1, nullptr, 8, nullptr, 2, &h),
        NULL_ROW(C_DeriveKey, "pMechanism pTemplate", s, nullptr, 1, nullptr, 2, &h),
    };
#undef NULL_ROW
    // clang-format on
    for (const Row& row : rows) {
        SCOPED_TRACE(row.function);
        EXPECT_NE(kNoAnswer, row.call());
        std::istringstream args(row.nullArgs);
        for (std::string arg; args >> arg;)
            EXPECT_TRUE(fakevendor::lastCall(row.function).arg(arg).null) << arg;
    }
    CK_MECHANISM noParameter{CKM_AES_CBC, nullptr, 16};
    EXPECT_NE(kNoAnswer, C_EncryptInit(s, &noParameter, 1));
    EXPECT_TRUE(fakevendor::lastCall("C_EncryptInit").arg("pMechanism").items.at(0).null);
}

// ---- PINs ----------------------------------------------------------------------

// A PIN made at run time, so that no constant in the program holds it.
class Secret {
public:
    static constexpr size_t kSize = 48;
    // A freed block's first 16 bytes hold the allocator's list links: only
    // the rest of a copy outlives its release unwiped.
    static constexpr size_t kSkip = 16;
    uint8_t at(size_t i) const { return static_cast<uint8_t>(seed_ ^ (i * 29 + 11)); }
    // Writes it over every run of kSize 'P' bytes.
    void writeOver(std::string& bytes) const {
        for (size_t p = bytes.find(std::string(kSize, 'P')); p != std::string::npos;
             p = bytes.find(std::string(kSize, 'P'), p))
            for (size_t i = 0; i < kSize; ++i) bytes[p + i] = static_cast<char>(at(i));
    }
    // Copies of it anywhere in the writable memory of this process.
    size_t copiesInMemory() const {
        const int mem = open("/proc/self/mem", O_RDONLY);
        std::vector<uint8_t> chunk(1 << 20);
        std::ifstream maps("/proc/self/maps");
        size_t found = 0;
        for (std::string line; std::getline(maps, line);) {
            unsigned long long start = 0, end = 0;
            char perms[5] = {};
            if (sscanf(line.c_str(), "%llx-%llx %4s", &start, &end, perms) != 3) continue;
            // Not the sanitizer's shadow: huge and never holding data.
            if (perms[0] != 'r' || perms[1] != 'w' || end - start > (1ull << 30)) continue;
            for (unsigned long long at = start; at < end; at += chunk.size() - kSize) {
                const ssize_t n =
                    pread(mem, chunk.data(), std::min<unsigned long long>(chunk.size(), end - at),
                          static_cast<off_t>(at));
                for (ssize_t i = 0; i + static_cast<ssize_t>(kSize) <= n; ++i) {
                    size_t k = kSkip;
                    while (k < kSize && chunk[i + k] == this->at(k)) ++k;
                    found += k == kSize;
                }
                if (n <= 0 || at + n >= end) break;
            }
        }
        close(mem);
        return found;
    }

private:
    const uint8_t seed_ = static_cast<uint8_t>(getpid() | 0x80);
};

// Functions that take a PIN and look at nothing: the fake module records what
// it receives, copies that are not the service's.
CK_FUNCTION_LIST pinRefusingModule() {
    CK_FUNCTION_LIST list = *fake_vendor_function_list();
    list.C_Login = [](CK_SESSION_HANDLE, CK_USER_TYPE, CK_UTF8CHAR_PTR, CK_ULONG) -> CK_RV {
        return CKR_PIN_INCORRECT;
    };
    list.C_InitToken = [](CK_SLOT_ID, CK_UTF8CHAR_PTR, CK_ULONG, CK_UTF8CHAR_PTR) -> CK_RV {
        return CKR_PIN_INCORRECT;
    };
    list.C_InitPIN = [](CK_SESSION_HANDLE, CK_UTF8CHAR_PTR, CK_ULONG) -> CK_RV {
        return CKR_PIN_INCORRECT;
    };
    list.C_SetPIN = [](CK_SESSION_HANDLE, CK_UTF8CHAR_PTR, CK_ULONG, CK_UTF8CHAR_PTR,
                       CK_ULONG) -> CK_RV { return CKR_PIN_INCORRECT; };
    return list;
}

using servertest::parsed;
using servertest::requestBytes;

class PinWipe : public voktest::JvmTest {};

// The channel's payload, the dispatcher's copy, both parses and the
// module's buffer: each is wiped before it is released.
TEST_F(PinWipe, NoCopyOfAPinOutlivesItsRequest) {
    static CK_FUNCTION_LIST module = pinRefusingModule();
    const std::string id = voktest::uniqueServerId();
    voktest::registerModule(id.c_str(), &module);
    ASSERT_EQ(0, vokpkcs11_init_server(id.c_str()));
    voktest::RawSocket client = voktest::rawConnect(id);
    voktest::WireHeader header;
    voktest::Bytes answer;
    ASSERT_TRUE(client.sendFrame({100, 103, 0, 4}, voktest::int32Bytes(1)));
    ASSERT_TRUE(client.recvFrame(&header, &answer));

    const Secret secret;
    const std::string pin(Secret::kSize, 'P');
    const std::vector<std::string> requests = {
        requestBytes("C_Login", [&](auto& op) { op.mutable_login()->set_ppin(pin); }),
        requestBytes("C_InitToken", [&](auto& op) { op.mutable_inittoken()->set_ppin(pin); }),
        requestBytes("C_InitPin", [&](auto& op) { op.mutable_initpin()->set_ppin(pin); }),
        requestBytes("C_SetPin",
                     [&](auto& op) {
                         op.mutable_setpin()->set_poldpin(pin),
                             op.mutable_setpin()->set_pnewpin(pin);
                     }),
    };
    for (std::string request : requests) {
        voktest::Bytes frame =
            voktest::encodeHeader({101, 103, 0, static_cast<int32_t>(request.size())});
        secret.writeOver(request);
        frame.insert(frame.end(), request.begin(), request.end());
        std::fill(request.begin(), request.end(), 0);
        ASSERT_TRUE(client.sendBytes(frame));
        std::fill(frame.begin(), frame.end(), 0);
        ASSERT_TRUE(client.recvFrame(&header, &answer));
        EXPECT_EQ(CKR_PIN_INCORRECT, parsed(std::string(answer.begin(), answer.end())).result());
    }
    EXPECT_EQ(0u, secret.copiesInMemory());
}

}  // namespace
