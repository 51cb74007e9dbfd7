// Output buffers, mechanisms, and the bytes the crypto proxies write back into
// the caller's input buffers.
#include <gtest/gtest.h>

#include <cstring>
#include <memory>
#include <vector>

#include "proxy_calls.h"
#include "test_service.h"

namespace voktest {
namespace {

CK_BYTE gIn[4] = {'i', 'n', 0, 'x'};
const std::string kProduced("\x01\x00\x02\x03\x04\x05\x06\x07\x08\x09", 10);
constexpr size_t kGuard = 8;

// Every proxy whose output follows the output-buffer rule, called with the
// test's buffer and length pointer.
class OutputBuffers : public ::testing::Test {
protected:
    TestService& service = TestService::start();
    std::vector<const ProxyCall*> proxies;

    void SetUp() override {
        for (const ProxyCall& p : everyProxyCall())
            if (p.outputAnswer) proxies.push_back(&p);
        ASSERT_EQ(18u, proxies.size());
    }
    CK_RV call(const ProxyCall& p, CK_BYTE* out, CK_ULONG* outLen) {
        gCaller.reset();
        gCaller.out = out;
        gCaller.outLen = outLen;
        return p.call(functionList());
    }
    void script(const ProxyCall& p, CK_RV rv, const std::string& data, CK_ULONG length) {
        service.scriptRaw(encodeAnswer(p.name, rv, p.outputAnswer, {data, length}));
    }
    // The request's exact bytes, ending with what it said about the buffer.
    void expectSent(const ProxyCall& p, const Field& contents, CK_ULONG capacity) {
        std::vector<Field> fields = p.request;
        fields[fields.size() - 2] = contents;
        fields.back() = capacity;
        EXPECT_EQ(hex(encodeRequest(p.name, p.field, fields)), hex(service.lastRequestBytes()));
    }
};

// The caller's buffer holds `capacity` bytes, then guard bytes. Its first byte
// is 0, so the request carries the field present and empty. A stated length
// beyond the buffer never writes past it, even when the service claims
// success: the caller learns the size it needs. Beyond what arrived, only
// what arrived is copied, and the length says what was written.
TEST_F(OutputBuffers, ResultComesBackWithinTheBufferWithItsLength) {
    const struct {
        CK_ULONG capacity;
        CK_RV rv;
        std::string data;
        CK_ULONG stated;
        CK_RV returned;
        std::string written;  // the buffer's first bytes afterwards
        size_t keptFrom;      // the pattern is intact from here to the end
        CK_ULONG length;
    } answers[] = {
        {16, CKR_OK, kProduced, 10, CKR_OK, kProduced, 10, 10},
        {4, CKR_BUFFER_TOO_SMALL, kProduced, 10, CKR_BUFFER_TOO_SMALL, "", 4, 10},
        {4, CKR_OK, kProduced, 10, CKR_BUFFER_TOO_SMALL, "", 4, 10},
        {16, CKR_OK, "abc", 12, CKR_OK, "abc", 3, 3},
    };
    for (const ProxyCall* proxy : proxies) {
        for (const auto& a : answers) {
            SCOPED_TRACE(std::string(proxy->name) + " " + std::to_string(a.capacity) + " " +
                         std::to_string(a.rv) + " " + std::to_string(a.stated));
            std::vector<CK_BYTE> out(a.capacity + kGuard, 0xa5);
            out[0] = 0;
            CK_ULONG length = a.capacity;
            script(*proxy, a.rv, a.data, a.stated);
            EXPECT_EQ(a.returned, call(*proxy, out.data(), &length));
            expectSent(*proxy, "", a.capacity);
            EXPECT_EQ(a.written, std::string(out.begin(), out.begin() + a.written.size()));
            EXPECT_EQ(std::string(out.size() - a.keptFrom, '\xa5'),
                      std::string(out.begin() + a.keptFrom, out.end()));
            EXPECT_EQ(a.length, length);
        }
    }
}

// The module's CKR_BUFFER_TOO_SMALL is the answer to the caller's question.
TEST_F(OutputBuffers, NullBufferIsALengthQuery) {
    const std::pair<CK_RV, CK_RV> moduleToCaller[] = {
        {CKR_BUFFER_TOO_SMALL, CKR_OK},
        {CKR_OK, CKR_OK},
        {CKR_OPERATION_NOT_INITIALIZED, CKR_OPERATION_NOT_INITIALIZED}};
    for (const ProxyCall* proxy : proxies) {
        for (const auto& rv : moduleToCaller) {
            SCOPED_TRACE(std::string(proxy->name) + " " + std::to_string(rv.first));
            CK_ULONG length = 77;
            script(*proxy, rv.first, "", 10);
            EXPECT_EQ(rv.second, call(*proxy, nullptr, &length));
            expectSent(*proxy, Field(), 0);
            EXPECT_EQ(10u, length);
        }
    }
}

TEST_F(OutputBuffers, NullLengthPointerIsNeitherReadNorWritten) {
    for (const ProxyCall* proxy : proxies) {
        SCOPED_TRACE(proxy->name);
        std::vector<CK_BYTE> out(16, 'x');
        script(*proxy, CKR_OK, kProduced, kProduced.size());
        EXPECT_EQ(CKR_BUFFER_TOO_SMALL, call(*proxy, out.data(), nullptr));  // capacity 0
        expectSent(*proxy, "", 0);
        EXPECT_EQ(std::vector<CK_BYTE>(16, 'x'), out);
        script(*proxy, CKR_OK, kProduced, kProduced.size());
        EXPECT_EQ(CKR_OK, call(*proxy, nullptr, nullptr));
    }
}

// Without a zero byte the buffer is read only within the caller's length (an
// exact-size heap buffer lets the sanitizer see an over-read).
TEST_F(OutputBuffers, UnterminatedBufferIsReadWithinItsLength) {
    for (const ProxyCall* proxy : proxies) {
        SCOPED_TRACE(proxy->name);
        std::unique_ptr<CK_BYTE[]> out(new CK_BYTE[4]{'w', 'x', 'y', 'z'});
        CK_ULONG length = 4;
        EXPECT_EQ(CKR_OK, call(*proxy, out.get(), &length));
        expectSent(*proxy, "wxyz", 4);
    }
}

// On every pointer width: a capacity above 4 GiB limits nothing this side of
// the buffer's zero byte (cut to a 32-bit size_t it would stop at byte 1).
constexpr CK_ULONG kAbove4GiB = (CK_ULONG{1} << 32) + 1;

TEST_F(OutputBuffers, CapacityAboveFourGiBIsReadUpToTheZeroByte) {
    for (const ProxyCall* proxy : proxies) {
        SCOPED_TRACE(proxy->name);
        std::vector<CK_BYTE> out(16, 0xa5);
        memcpy(out.data(), "abc", 4);
        CK_ULONG length = kAbove4GiB;
        call(*proxy, out.data(), &length);
        expectSent(*proxy, "abc", kAbove4GiB);
    }
}

class CryptoProxies : public ::testing::Test {
protected:
    TestService& service = TestService::start();
};

TEST_F(CryptoProxies, MechanismParameterTravelsByteForByteAndPointersByValue) {
    CK_MECHANISM noParameter{CKM_SHA256, nullptr, 0};
    ASSERT_EQ(CKR_OK, C_DigestInit(kSession, &noParameter));
    EXPECT_EQ(
        hex(encodeRequest("C_DigestInit", 18, {kSession, Field::message({CKM_SHA256, "", 0})})),
        hex(service.lastRequestBytes()));

    CK_BYTE label[] = "label";
    CK_RSA_PKCS_OAEP_PARAMS oaep{CKM_SHA256, CKG_MGF1_SHA256, CKZ_DATA_SPECIFIED, label, 5};
    CK_MECHANISM withParameter{CKM_RSA_PKCS_OAEP, &oaep, sizeof(oaep)};
    ASSERT_EQ(CKR_OK, C_EncryptInit(kSession, &withParameter, kKey));
    // A pointer-holding parameter: its raw bytes with the pointer zeroed, and
    // in field 100 its numbers and its one buffer, by value.
    CK_RSA_PKCS_OAEP_PARAMS zeroed = oaep;
    zeroed.pSourceData = nullptr;
    const std::string oaepBytes(reinterpret_cast<const char*>(&zeroed), sizeof(zeroed));
    Field mechanism = Field::message({CKM_RSA_PKCS_OAEP, oaepBytes, sizeof(oaep)});
    const std::string byValue =
        encode({Field::repeated({CKM_SHA256, CKG_MGF1_SHA256, CKZ_DATA_SPECIFIED, 5}),
                Field::attributes({{"label"}})});
    mechanism.bytes += "\xa2\x06" + std::string(1, static_cast<char>(byValue.size())) + byValue;
    EXPECT_EQ(hex(encodeRequest("C_EncryptInit", 14, {kSession, mechanism, kKey})),
              hex(service.lastRequestBytes()));
}

// Signature, seed and random bytes come back into the caller's own input
// buffer, never more than its length; random data also no more than stated.
TEST_F(CryptoProxies, EchoedBytesStayWithinTheCallersBuffer) {
    struct Case {
        const char* name;
        CK_RV (*call)(CK_BYTE* buffer);  // a 4-byte buffer
        int answerField;                 // bytes in field 1, a length in field 2
        bool heedsStatedLength;
    };
    const Case cases[] = {
        {"C_Verify", [](CK_BYTE* b) { return C_Verify(kSession, gIn, 4, b, 4); }, 14, false},
        {"C_SeedRandom", [](CK_BYTE* b) { return C_SeedRandom(kSession, b, 4); }, 20, false},
        {"C_GenerateRandom", [](CK_BYTE* b) { return C_GenerateRandom(kSession, b, 4); }, 19, true},
    };
    const struct {
        std::string bytes;
        CK_ULONG stated;
        std::string whole, asStated;  // the caller's buffer afterwards
    } answers[] = {{"WX", 2, "WXcd", "WXcd"},
                   {"WXYZ+overflow", 13, "WXYZ", "WXYZ"},
                   {"WXYZ", 1, "WXYZ", "Wbcd"}};
    for (const Case& c : cases) {
        for (const auto& a : answers) {
            SCOPED_TRACE(std::string(c.name) + " " + a.bytes);
            std::vector<CK_BYTE> buffer = {'a', 'b', 'c', 'd', 0xa5, 0xa5};
            service.scriptRaw(encodeAnswer(c.name, CKR_OK, c.answerField, {a.bytes, a.stated}));
            // Random bytes short of the buffer would leave some of it not random.
            const bool short4 =
                c.heedsStatedLength && std::min<size_t>(a.stated, a.bytes.size()) < 4;
            EXPECT_EQ(short4 ? kAllOnes : CKR_OK, c.call(buffer.data()));
            EXPECT_EQ((c.heedsStatedLength ? a.asStated : a.whole) + "\xa5\xa5",
                      std::string(buffer.begin(), buffer.end()));
        }
    }
}

// An input length above 4 GiB, which no frame carries, fails the call before
// a byte is read or sent, whichever rule the input follows; a PIN's length
// only limits how far it is read.
TEST_F(CryptoProxies, InputLengthsAboveFourGiB) {
    static CK_BYTE in[] = {'a', 'b', 0, 'd'};
    static CK_RSA_PKCS_OAEP_PARAMS oaep{CKM_SHA256, CKG_MGF1_SHA256, CKZ_DATA_SPECIFIED, in,
                                        kAbove4GiB};
    static CK_ATTRIBUTE label{CKA_LABEL, in, kAbove4GiB};
    static CK_BYTE out[4];
    static CK_ULONG outLength, handle;
    const struct {
        const char* rule;
        CK_RV (*call)();
        const char* pinSent;  // nullptr: refused, nothing sent
    } cases[] = {
        {"data", [] { return C_Encrypt(kSession, in, kAbove4GiB, out, &outLength); }, nullptr},
        {"template value", [] { return C_CreateObject(kSession, &label, 1, &handle); }, nullptr},
        {"mechanism parameter",
         [] {
             CK_MECHANISM m{CKM_SHA256, in, kAbove4GiB};
             return C_DigestInit(kSession, &m);
         },
         nullptr},
        {"member by value",
         [] {
             CK_MECHANISM m{CKM_RSA_PKCS_OAEP, &oaep, sizeof oaep};
             return C_EncryptInit(kSession, &m, kKey);
         },
         nullptr},
        {"PIN", [] { return C_Login(kSession, CKU_USER, in, kAbove4GiB); }, "ab"},
    };
    for (const auto& c : cases) {
        SCOPED_TRACE(c.rule);
        const size_t requests = service.requestCount();
        const CK_RV rv = c.call();
        if (!c.pinSent) {
            EXPECT_EQ(kAllOnes, rv);
            EXPECT_EQ(requests, service.requestCount());
            continue;
        }
        EXPECT_EQ(c.pinSent, service.lastRequest().login().ppin());
        EXPECT_EQ(kAbove4GiB, service.lastRequest().login().ulpinlen());
    }
}

}  // namespace
}  // namespace voktest
