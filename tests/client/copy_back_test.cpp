// The rules for what proxies read from and write into the caller's memory:
// output buffers, counted lists, templates, echoed bytes, and lengths.
#include <gtest/gtest.h>

#include <cstring>
#include <memory>
#include <vector>

#include "proxy_calls.h"
#include "test_service.h"

namespace voktest {
namespace {

constexpr CK_ULONG kPattern = 0xa5a5a5a5a5a5a5a5;
using List = std::vector<CK_ULONG>;
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

class CallerBuffers : public ::testing::Test {
protected:
    TestService& service = TestService::start();
    void script(const char* name, CK_RV rv, int field, const std::vector<Field>& fields) {
        service.scriptRaw(encodeAnswer(name, rv, field, fields));
    }
};

TEST_F(CallerBuffers, MechanismParameterTravelsByteForByteAndPointersByValue) {
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
TEST_F(CallerBuffers, EchoedBytesStayWithinTheCallersBuffer) {
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
TEST_F(CallerBuffers, InputLengthsAboveFourGiB) {
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

// C_GetSlotList and C_GetMechanismList share the list rule; both answers carry
// the list in field 1 and the count in field 2.
TEST_F(CallerBuffers, ListsFollowTheTwoCallConventionWithinTheCallersList) {
    struct ListProxy {
        const char* name;
        CK_RV (*call)(CK_ULONG* list, CK_ULONG* count);
        int answerField, requestField;
        CK_ULONG first;  // the request's first field
    };
    const ListProxy proxies[] = {
        {"C_GetSlotList", [](CK_ULONG* l, CK_ULONG* n) { return C_GetSlotList(CK_TRUE, l, n); }, 4,
         3, 1},
        {"C_GetMechanismList",
         [](CK_ULONG* l, CK_ULONG* n) { return C_GetMechanismList(kSlot, l, n); }, 21, 29, kSlot},
    };
    for (const ListProxy& proxy : proxies) {
        SCOPED_TRACE(proxy.name);
        const auto expectSent = [&](CK_ULONG count) {
            const std::vector<Field> sent = {proxy.first, Field(), count};
            EXPECT_EQ(hex(encodeRequest(proxy.name, proxy.requestField, sent)),
                      hex(service.lastRequestBytes()));
        };
        CK_ULONG count = 7;  // a length query: no list sent, the stated count back
        script(proxy.name, CKR_OK, proxy.answerField, {Field(), 3});
        ASSERT_EQ(CKR_OK, proxy.call(nullptr, &count));
        expectSent(7);
        EXPECT_EQ(3u, count);

        List list = {21, 22, 23, kPattern};  // three entries and a guard
        count = 2;  // more than the caller holds: too small, with the needed count
        script(proxy.name, CKR_OK, proxy.answerField, {Field::repeated({31, 32, 33, 34}), 4});
        ASSERT_EQ(CKR_BUFFER_TOO_SMALL, proxy.call(list.data(), &count));
        EXPECT_EQ((List{21, 22, 23, kPattern}), list);
        EXPECT_EQ(4u, count);

        count = 3;  // a stated count larger than what arrived: what was written
        script(proxy.name, CKR_OK, proxy.answerField, {Field::repeated({41}), 3});
        ASSERT_EQ(CKR_OK, proxy.call(list.data(), &count));
        EXPECT_EQ((List{41, 22, 23, kPattern}), list);
        EXPECT_EQ(1u, count);

        script(proxy.name, CKR_OK, proxy.answerField, {Field::repeated({51, 52}), 2});
        ASSERT_EQ(CKR_BUFFER_TOO_SMALL, proxy.call(list.data(), nullptr));
        expectSent(0);
        EXPECT_EQ((List{41, 22, 23, kPattern}), list);
    }
}

// C_GetAttributeValue and C_SetAttributeValue share the template copy-back.
TEST_F(CallerBuffers, TemplateCopyBackStaysWithinTheCallersBuffersAndCount) {
    struct TemplateProxy {
        const char* name;
        CK_RV (*call)(CK_ATTRIBUTE* tmpl, CK_ULONG count);
        int answerField;  // the answer holds the template, then the count
    };
    const TemplateProxy proxies[] = {
        {"C_GetAttributeValue",
         [](CK_ATTRIBUTE* t, CK_ULONG n) { return C_GetAttributeValue(kSession, kObject, t, n); },
         7},
        {"C_SetAttributeValue",
         [](CK_ATTRIBUTE* t, CK_ULONG n) { return C_SetAttributeValue(kSession, kObject, t, n); },
         26},
    };
    const Field answered = Field::attributes({{CKA_MODULUS_BITS, Field(), 300},  // length query
                                              {CKA_TOKEN, "0123456789", 10},  // beyond the buffer
                                              {CKA_KEY_TYPE, Field(), 5},     // no value: kept
                                              {CKA_ID, "x", 1}});
    for (const TemplateProxy& proxy : proxies) {
        SCOPED_TRACE(proxy.name);
        char small[4 + 4], kept[8] = "kept";  // `small` holds 4 bytes, then a guard
        memcpy(small, "....####", 8);
        alignas(8) CK_ATTRIBUTE tmpl[4] = {{CKA_VALUE, nullptr, 0},
                                           {CKA_LABEL, small, 4},
                                           {CKA_LABEL, kept, 8},
                                           {CKA_CLASS, nullptr, 99}};  // beyond the caller's count
        script(proxy.name, CKR_ATTRIBUTE_SENSITIVE, proxy.answerField, {answered, 4});
        ASSERT_EQ(CKR_ATTRIBUTE_SENSITIVE, proxy.call(tmpl, 3));
        EXPECT_EQ(CKA_MODULUS_BITS, tmpl[0].type);
        EXPECT_EQ(300u, tmpl[0].ulValueLen);
        EXPECT_EQ(CKA_TOKEN, tmpl[1].type);
        EXPECT_EQ("....####", std::string(small, 8));
        EXPECT_EQ(CK_UNAVAILABLE_INFORMATION, tmpl[1].ulValueLen);
        EXPECT_EQ(CKA_KEY_TYPE, tmpl[2].type);
        EXPECT_EQ(8u, tmpl[2].ulValueLen);
        EXPECT_STREQ("kept", kept);
        EXPECT_EQ(CKA_CLASS, tmpl[3].type);
        EXPECT_EQ(99u, tmpl[3].ulValueLen);

        tmpl[1] = CK_ATTRIBUTE{CKA_LABEL, small, 4};  // the stated count limits the copy
        script(proxy.name, CKR_OK, proxy.answerField, {answered, 1});
        ASSERT_EQ(CKR_OK, proxy.call(tmpl, 3));
        EXPECT_EQ(CKA_LABEL, tmpl[1].type);
        script(proxy.name, CKR_OK, proxy.answerField, {answered, 4});  // "success" too large
        EXPECT_EQ(CKR_BUFFER_TOO_SMALL, proxy.call(tmpl, 3));
    }
}

// A caller's nested template holds the caller's pointers: raw bytes from the
// service, which could hold anything, never replace them.
TEST_F(CallerBuffers, RawBytesNeverLandInACallersNestedTemplate) {
    const std::pair<int, CK_RV (*)(CK_ATTRIBUTE*)> proxies[] = {
        {7, [](CK_ATTRIBUTE* t) { return C_GetAttributeValue(kSession, kObject, t, 1); }},
        {26, [](CK_ATTRIBUTE* t) { return C_SetAttributeValue(kSession, kObject, t, 1); }},
        {8, [](CK_ATTRIBUTE* t) { return C_FindObjectsInit(kSession, t, 1); }}};
    for (const auto& [answerField, call] : proxies) {
        CK_BYTE value[4] = {1, 2, 3, 4};
        CK_ATTRIBUTE nested[1] = {{CKA_LABEL, value, 4}};
        const CK_ATTRIBUTE before = nested[0];
        CK_ATTRIBUTE tmpl[1] = {{CKA_WRAP_TEMPLATE, nested, sizeof nested}};
        const std::string raw(sizeof nested, 'A');
        script("", CKR_OK, answerField,
               {Field::attributes({{CKA_WRAP_TEMPLATE, raw, sizeof nested}}), 1});
        ASSERT_EQ(CKR_OK, call(tmpl));
        EXPECT_EQ(0, memcmp(&before, nested, sizeof before)) << answerField;
        EXPECT_EQ(sizeof nested, tmpl[0].ulValueLen);
    }
}

TEST_F(CallerBuffers, FindObjectsCopiesNoMoreHandlesThanTheCallerAllows) {
    List handles(4, kPattern);
    CK_ULONG found = 0;
    script("C_FindObjects", CKR_OK, 9, {Field::repeated({1, 2, 3, 4, 5}), 5});
    ASSERT_EQ(CKR_OK, C_FindObjects(kSession, handles.data(), 3, &found));
    EXPECT_EQ((List{1, 2, 3, kPattern}), handles);
    EXPECT_EQ(3u, found);

    script("C_FindObjects", CKR_OK, 9, {Field::repeated({9}), 2});  // more stated than arrived
    ASSERT_EQ(CKR_OK, C_FindObjects(kSession, handles.data(), 3, &found));
    EXPECT_EQ((List{9, 2, 3, kPattern}), handles);
    EXPECT_EQ(1u, found);
}

// Texts are read only within the caller's stated length (exact-size heap
// buffers let the sanitizer see an over-read); a NULL PIN sends none.
TEST_F(CallerBuffers, PinsAndLabelsAreReadWithinTheirLength) {
    std::unique_ptr<CK_UTF8CHAR[]> pin(new CK_UTF8CHAR[4]{'9', '8', '7', '6'});
    std::unique_ptr<CK_UTF8CHAR[]> label(new CK_UTF8CHAR[32]);
    memset(label.get(), 'T', 32);
    ASSERT_EQ(CKR_OK, C_Login(kSession, CKU_USER, pin.get(), 4));
    EXPECT_EQ("9876", service.lastRequest().login().ppin());
    ASSERT_EQ(CKR_OK, C_InitToken(kSlot, pin.get(), 4, label.get()));
    EXPECT_EQ(std::string(32, 'T'), service.lastRequest().inittoken().plabel());
    ASSERT_EQ(CKR_OK, C_SetPIN(kSession, pin.get(), 2, pin.get(), 4));
    EXPECT_EQ("98", service.lastRequest().setpin().poldpin());
    EXPECT_EQ("9876", service.lastRequest().setpin().pnewpin());
    ASSERT_EQ(CKR_OK, C_Login(kSession, CKU_USER, nullptr, 0));  // protected authentication path
    EXPECT_FALSE(service.lastRequest().login().has_ppin());
}

// Answers that carry their response message, to callers that passed NULL
// where the proxy would store it.
TEST_F(CallerBuffers, NullOutputPointersAreNotDereferenced) {
    struct Case {
        const char* name;
        CK_RV (*call)();
        int field;
        std::vector<Field> fields;
    };
    const Field empty = Field::message({}), one = Field::repeated({1});
    const Field attribute = Field::attributes({{CKA_ID, "x", 1}});
    // clang-format off
    const Case cases[] = {
        {"C_GetInfo", [] { return C_GetInfo(nullptr); }, 3, {empty}},
        {"C_GetSlotInfo", [] { return C_GetSlotInfo(kSlot, nullptr); }, 5, {empty}},
        {"C_GetTokenInfo", [] { return C_GetTokenInfo(kSlot, nullptr); }, 16, {empty}},
        {"C_GetSessionInfo", [] { return C_GetSessionInfo(kSession, nullptr); }, 15, {empty}},
        {"C_GetMechanismInfo", [] { return C_GetMechanismInfo(kSlot, 0, nullptr); }, 17, {empty}},
        {"C_GetSlotList", [] { return C_GetSlotList(CK_FALSE, nullptr, nullptr); }, 4, {one, 1}},
        {"C_GetMechanismList", [] { return C_GetMechanismList(kSlot, nullptr, nullptr); }, 21,
         {one, 1}},
        {"C_OpenSession", [] { return C_OpenSession(kSlot, 0, nullptr, nullptr, nullptr); }, 6, {1}},
        {"C_GetObjectSize", [] { return C_GetObjectSize(kSession, kObject, nullptr); }, 25, {1}},
        {"C_GetAttributeValue", [] { return C_GetAttributeValue(kSession, 0, nullptr, 2); }, 7,
         {attribute, 1}},
        {"C_FindObjectsInit", [] { return C_FindObjectsInit(kSession, nullptr, 2); }, 8, {attribute}},
        {"C_FindObjects", [] { return C_FindObjects(kSession, nullptr, 4, nullptr); }, 9, {one, 1}},
        {"C_CreateObject", [] { return C_CreateObject(kSession, nullptr, 0, nullptr); }, 23, {one}},
        {"C_CopyObject", [] { return C_CopyObject(kSession, kObject, nullptr, 0, nullptr); }, 24,
         {one}},
        {"C_GenerateKey", [] { return C_GenerateKey(kSession, nullptr, nullptr, 0, nullptr); }, 39,
         {1}},
        {"C_GenerateKeyPair", [] {
             return C_GenerateKeyPair(kSession, nullptr, nullptr, 0, nullptr, 0, nullptr, nullptr);
         }, 40, {1, 2}},
        {"C_UnWrapKey", [] {
             return C_UnwrapKey(kSession, nullptr, kKey, nullptr, 0, nullptr, 0, nullptr);
         }, 42, {1}},
        {"C_DeriveKey", [] { return C_DeriveKey(kSession, nullptr, kKey, nullptr, 0, nullptr); }, 43,
         {1}},
        {"C_Verify", [] { return C_Verify(kSession, nullptr, 0, nullptr, 4); }, 14, {"sig", 3}},
        {"C_SeedRandom", [] { return C_SeedRandom(kSession, nullptr, 4); }, 20, {"seed", 4}},
        {"C_GenerateRandom", [] { return C_GenerateRandom(kSession, nullptr, 4); }, 19, {"rand", 4}},
        {"C_WaitForSlotEvent", [] { return C_WaitForSlotEvent(kFlags, nullptr, nullptr); }, 44,
         {kSlot}},
    };
    // clang-format on
    for (const Case& c : cases) {
        SCOPED_TRACE(c.name);
        script(c.name, CKR_DEVICE_ERROR, c.field, c.fields);
        EXPECT_EQ(CKR_DEVICE_ERROR, c.call());
        EXPECT_EQ(c.name, service.lastRequest().name());
    }
}

}  // namespace
}  // namespace voktest
