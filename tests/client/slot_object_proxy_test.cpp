// What the slot, session and object proxies copy back: information records,
// counted lists, templates and handles.
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

class SlotObjectProxies : public ::testing::Test {
protected:
    TestService& service = TestService::start();
    void script(const char* name, CK_RV rv, int field, const std::vector<Field>& fields) {
        service.scriptRaw(encodeAnswer(name, rv, field, fields));
    }
};

// C_GetSlotList and C_GetMechanismList share the list rule; both answers carry
// the list in field 1 and the count in field 2.
TEST_F(SlotObjectProxies, ListsFollowTheTwoCallConventionWithinTheCallersList) {
    struct ListProxy {
        const char* name;
        CK_RV (*call)(CK_ULONG* list, CK_ULONG* count);
        int answerField;
        List (*sentList)(const pkcs11::Operation&);
        uint64_t (*sentCount)(const pkcs11::Operation&);
    };
    const ListProxy proxies[] = {
        {"C_GetSlotList", [](CK_ULONG* l, CK_ULONG* n) { return C_GetSlotList(CK_TRUE, l, n); }, 4,
         [](const pkcs11::Operation& op) {
             return List(op.slotlist().slotidlist().begin(), op.slotlist().slotidlist().end());
         },
         [](const pkcs11::Operation& op) { return op.slotlist().pulcount(); }},
        {"C_GetMechanismList",
         [](CK_ULONG* l, CK_ULONG* n) { return C_GetMechanismList(kSlot, l, n); }, 21,
         [](const pkcs11::Operation& op) {
             const auto& sent = op.mechanismlist().pmechanismlist();
             return List(sent.begin(), sent.end());
         },
         [](const pkcs11::Operation& op) { return op.mechanismlist().pulcount(); }},
    };
    for (const ListProxy& proxy : proxies) {
        SCOPED_TRACE(proxy.name);
        auto sentList = [&] { return proxy.sentList(service.lastRequest()); };
        CK_ULONG count = 7;
        script(proxy.name, CKR_OK, proxy.answerField, {Field(), 3});
        ASSERT_EQ(CKR_OK, proxy.call(nullptr, &count));
        EXPECT_EQ(7u, proxy.sentCount(service.lastRequest()));
        EXPECT_TRUE(sentList().empty());
        EXPECT_EQ(3u, count);

        List list = {1, 2, 3, kPattern};  // three entries and a guard
        script(proxy.name, CKR_OK, proxy.answerField, {Field::repeated({21, 22, 23}), 3});
        ASSERT_EQ(CKR_OK, proxy.call(list.data(), &count));
        EXPECT_EQ((List{1, 2, 3}), sentList());
        EXPECT_EQ((List{21, 22, 23, kPattern}), list);

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
        EXPECT_EQ(0u, proxy.sentCount(service.lastRequest()));
        EXPECT_EQ((List{41, 22, 23, kPattern}), list);
    }
}

// C_GetAttributeValue and C_SetAttributeValue share the template copy-back.
TEST_F(SlotObjectProxies, TemplateCopyBackStaysWithinTheCallersBuffersAndCount) {
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
TEST_F(SlotObjectProxies, RawBytesNeverLandInACallersNestedTemplate) {
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

TEST_F(SlotObjectProxies, FindObjectsCopiesNoMoreHandlesThanTheCallerAllows) {
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
TEST_F(SlotObjectProxies, PinsAndLabelsAreReadWithinTheirLength) {
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
TEST_F(SlotObjectProxies, NullOutputPointersAreNotDereferenced) {
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
