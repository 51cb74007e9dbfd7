// The module's length rules: every output function answers a NULL buffer with
// the length, a short buffer with CKR_BUFFER_TOO_SMALL, keeps its operation
// through both, and C_GetAttributeValue applies its own per-attribute rules.

#include <functional>

#include "fake_vendor_fixture.h"

namespace fakevendor {
namespace {

struct LengthRules;

struct LengthCase {
    const char* name;
    CK_ULONG elementSize;
    std::function<void(LengthRules&)> start;
    std::function<CK_RV(LengthRules&, void*, CK_ULONG*)> produce;
    CK_ULONG needed;                              // 0: whatever the length query reports
    bool endsOperation;                           // a successful call with a buffer ends it
    std::function<Bytes(LengthRules&)> expected;  // null: checked elsewhere
};

struct LengthRules : FakeVendorTest, ::testing::WithParamInterface<LengthCase> {
    Bytes data = bytes("hello");
    Bytes wrappedValue = bytes("key-to-wrap-1234");
    CK_OBJECT_HANDLE key = CK_INVALID_HANDLE;
    CK_OBJECT_HANDLE other = CK_INVALID_HANDLE;

    void init(CK_RV (*initFn)(CK_SESSION_HANDLE, CK_MECHANISM_PTR, CK_OBJECT_HANDLE),
              CK_MECHANISM_TYPE type, CK_OBJECT_HANDLE k) {
        CK_MECHANISM m = mechanism(type);
        ASSERT_EQ(initFn(session, &m, k), CKR_OK);
    }
};

void PrintTo(const LengthCase& c, std::ostream* os) { *os << c.name; }

CK_BYTE_PTR b(void* p) { return static_cast<CK_BYTE_PTR>(p); }
CK_ULONG_PTR ul(void* p) { return static_cast<CK_ULONG_PTR>(p); }

const LengthCase kLengthCases[] = {
    {"Encrypt", 1, [](LengthRules& t) { t.init(t.f->C_EncryptInit, CKM_AES_ECB, t.aesKey()); },
     [](LengthRules& t, void* o, CK_ULONG* n) {
         return t.f->C_Encrypt(t.session, t.data.data(), 5, b(o), n);
     },
     5, true, [](LengthRules& t) { return xorWith(t.data, t.aesValue); }},
    {"Sign", 1, [](LengthRules& t) { t.init(t.f->C_SignInit, CKM_MD5_HMAC, t.macKey()); },
     [](LengthRules& t, void* o, CK_ULONG* n) {
         return t.f->C_Sign(t.session, t.data.data(), 5, b(o), n);
     },
     FAKE_VENDOR_SIGNATURE_LEN, true, nullptr},
    {"SignFinal", 1,
     [](LengthRules& t) {
         t.init(t.f->C_SignInit, CKM_MD5_HMAC, t.macKey());
         ASSERT_EQ(t.f->C_SignUpdate(t.session, t.data.data(), 5), CKR_OK);
     },
     [](LengthRules& t, void* o, CK_ULONG* n) { return t.f->C_SignFinal(t.session, b(o), n); },
     FAKE_VENDOR_SIGNATURE_LEN, true, nullptr},
    {"Digest", 1,
     [](LengthRules& t) {
         CK_MECHANISM m = mechanism(CKM_SHA256);
         ASSERT_EQ(t.f->C_DigestInit(t.session, &m), CKR_OK);
     },
     [](LengthRules& t, void* o, CK_ULONG* n) {
         return t.f->C_Digest(t.session, t.data.data(), 5, b(o), n);
     },
     FAKE_VENDOR_DIGEST_LEN, true, nullptr},
    {"DigestFinal", 1,
     [](LengthRules& t) {
         CK_MECHANISM m = mechanism(CKM_SHA256);
         ASSERT_EQ(t.f->C_DigestInit(t.session, &m), CKR_OK);
     },
     [](LengthRules& t, void* o, CK_ULONG* n) { return t.f->C_DigestFinal(t.session, b(o), n); },
     FAKE_VENDOR_DIGEST_LEN, true, nullptr},
    {"WrapKey", 1,
     [](LengthRules& t) {
         t.key = t.aesKey();
         t.other = t.secretKey(CKK_GENERIC_SECRET, t.wrappedValue);
     },
     [](LengthRules& t, void* o, CK_ULONG* n) {
         CK_MECHANISM m = mechanism(CKM_AES_ECB);
         return t.f->C_WrapKey(t.session, &m, t.key, t.other, b(o), n);
     },
     16, false, [](LengthRules& t) { return xorWith(t.wrappedValue, t.aesValue); }},
    {"GetOperationState", 1,
     [](LengthRules& t) { t.init(t.f->C_EncryptInit, CKM_AES_ECB, t.aesKey()); },
     [](LengthRules& t, void* o, CK_ULONG* n) {
         return t.f->C_GetOperationState(t.session, b(o), n);
     },
     0, false, nullptr},
    {"GetSlotList", sizeof(CK_SLOT_ID), [](LengthRules&) { fake_vendor_set_slot_count(2); },
     [](LengthRules& t, void* o, CK_ULONG* n) { return t.f->C_GetSlotList(CK_TRUE, ul(o), n); }, 2,
     false,
     [](LengthRules&) {
         const CK_SLOT_ID ids[] = {1, 2};
         return Bytes(reinterpret_cast<const CK_BYTE*>(ids),
                      reinterpret_cast<const CK_BYTE*>(ids + 2));
     }},
    {"GetMechanismList", sizeof(CK_MECHANISM_TYPE), [](LengthRules&) {},
     [](LengthRules& t, void* o, CK_ULONG* n) {
         return t.f->C_GetMechanismList(FAKE_VENDOR_SLOT_ID, ul(o), n);
     },
     0, false, nullptr},
};

TEST_P(LengthRules, NullBufferThenShortThenExact) {
    const LengthCase& c = GetParam();
    c.start(*this);

    CK_ULONG len = 12345;  // a NULL buffer makes the capacity irrelevant
    ASSERT_EQ(c.produce(*this, nullptr, &len), CKR_OK);
    const CK_ULONG needed = len;
    ASSERT_GT(needed, 0u);
    if (c.needed) {
        EXPECT_EQ(needed, c.needed);
    }

    std::vector<CK_ULONG> storage(needed + 1);  // aligned for the counted lists too
    auto* buf = reinterpret_cast<CK_BYTE*>(storage.data());
    std::fill(buf, buf + (needed + 1) * c.elementSize, CK_BYTE(0xEE));
    for (CK_ULONG capacity : {CK_ULONG(0), needed - 1}) {
        len = capacity;
        EXPECT_EQ(c.produce(*this, buf, &len), CKR_BUFFER_TOO_SMALL) << "capacity " << capacity;
        EXPECT_EQ(len, needed);
    }

    len = needed;
    ASSERT_EQ(c.produce(*this, buf, &len), CKR_OK) << "the short calls ended the operation";
    EXPECT_EQ(len, needed);
    EXPECT_EQ(buf[needed * c.elementSize], 0xEE) << "wrote past the needed length";
    const Bytes first(buf, buf + needed * c.elementSize);
    if (c.expected) {
        EXPECT_EQ(hex(first), hex(c.expected(*this)));
    }

    len = needed;
    if (c.endsOperation) {
        EXPECT_EQ(c.produce(*this, buf, &len), CKR_OPERATION_NOT_INITIALIZED);
    } else {
        ASSERT_EQ(c.produce(*this, buf, &len), CKR_OK);
        EXPECT_EQ(hex(Bytes(buf, buf + needed * c.elementSize)), hex(first));
    }
}

INSTANTIATE_TEST_SUITE_P(FakeVendor, LengthRules, ::testing::ValuesIn(kLengthCases),
                         [](const ::testing::TestParamInfo<LengthCase>& i) {
                             return std::string(i.param.name);
                         });

// ---- C_GetAttributeValue ---------------------------------------------------

struct AttributeCase {
    const char* name;
    bool sensitiveKey;
    CK_ATTRIBUTE_TYPE type;
    bool nullValue;
    CK_ULONG capacity;
    CK_RV rv;
    CK_ULONG len;
    std::string value;  // as text; checked when the call fills the buffer
};

const AttributeCase kAttributeCases[] = {
    {"NullValueGivesLength", false, CKA_LABEL, true, 0, CKR_OK, 5, ""},
    {"ShortBuffer", false, CKA_LABEL, false, 4, CKR_BUFFER_TOO_SMALL, CK_UNAVAILABLE_INFORMATION,
     ""},
    {"ExactBuffer", false, CKA_LABEL, false, 5, CKR_OK, 5, "label"},
    {"LargerBuffer", false, CKA_LABEL, false, 9, CKR_OK, 5, "label"},
    {"PlainKeyValue", false, CKA_VALUE, false, 16, CKR_OK, 16, "0123456789abcdef"},
    {"ClassDefault", false, CKA_TOKEN, false, 1, CKR_OK, 1, std::string(1, '\0')},
    {"AbsentAttribute", false, CKA_MODULUS, false, 8, CKR_ATTRIBUTE_TYPE_INVALID,
     CK_UNAVAILABLE_INFORMATION, ""},
    {"AbsentAttributeNull", false, CKA_MODULUS, true, 0, CKR_ATTRIBUTE_TYPE_INVALID,
     CK_UNAVAILABLE_INFORMATION, ""},
    {"SensitiveValue", true, CKA_VALUE, false, 16, CKR_ATTRIBUTE_SENSITIVE,
     CK_UNAVAILABLE_INFORMATION, ""},
    {"SensitiveValueNull", true, CKA_VALUE, true, 0, CKR_ATTRIBUTE_SENSITIVE,
     CK_UNAVAILABLE_INFORMATION, ""},
    {"SensitiveKeyLabel", true, CKA_LABEL, false, 5, CKR_OK, 5, "label"},
};

void PrintTo(const AttributeCase& c, std::ostream* os) { *os << c.name; }

struct AttributeRules : FakeVendorTest, ::testing::WithParamInterface<AttributeCase> {};

TEST_P(AttributeRules, OneAttribute) {
    const AttributeCase& c = GetParam();
    const CK_OBJECT_HANDLE key = secretKey(CKK_AES, aesValue, c.sensitiveKey);
    Bytes buf(c.capacity + 1, 0xEE);
    CK_ATTRIBUTE a{c.type, c.nullValue ? nullptr : buf.data(), c.capacity};
    EXPECT_EQ(f->C_GetAttributeValue(session, key, &a, 1), c.rv);
    EXPECT_EQ(CK_ULONG(a.ulValueLen), c.len);
    if (c.rv == CKR_OK && !c.nullValue) {
        EXPECT_EQ(std::string(buf.begin(), buf.begin() + c.len), c.value);
    }
    EXPECT_EQ(buf[c.capacity], 0xEE) << "wrote past the capacity";
}

INSTANTIATE_TEST_SUITE_P(FakeVendor, AttributeRules, ::testing::ValuesIn(kAttributeCases),
                         [](const ::testing::TestParamInfo<AttributeCase>& i) {
                             return std::string(i.param.name);
                         });

TEST_F(FakeVendorTest, GetAttributeValueServesEveryAttributeAndReturnsTheFirstFailure) {
    const CK_OBJECT_HANDLE key = secretKey(CKK_AES, aesValue, true);
    CK_OBJECT_CLASS cls = 0;
    CK_BYTE value[16], id[4];
    CK_ATTRIBUTE t[] = {{CKA_LABEL, nullptr, 0},
                        {CKA_MODULUS, id, sizeof id},
                        {CKA_VALUE, value, sizeof value},
                        {CKA_CLASS, &cls, sizeof cls}};
    EXPECT_EQ(f->C_GetAttributeValue(session, key, t, 4), CKR_ATTRIBUTE_TYPE_INVALID);
    EXPECT_EQ(CK_ULONG(t[0].ulValueLen), 5u);
    EXPECT_EQ(CK_ULONG(t[1].ulValueLen), CK_UNAVAILABLE_INFORMATION);
    EXPECT_EQ(CK_ULONG(t[2].ulValueLen), CK_UNAVAILABLE_INFORMATION);
    EXPECT_EQ(CK_ULONG(t[3].ulValueLen), sizeof cls);
    EXPECT_EQ(cls, CKO_SECRET_KEY);
}

TEST_F(FakeVendorTest, UnextractableKeyValueIsSensitiveAndMarkingIsOneWay) {
    const CK_OBJECT_HANDLE key = aesKey();
    Template unextractable;
    unextractable.flag(CKA_EXTRACTABLE, false);
    ASSERT_EQ(f->C_SetAttributeValue(session, key, unextractable.data(), 1), CKR_OK);
    CK_BYTE value[16];
    CK_ATTRIBUTE a{CKA_VALUE, value, sizeof value};
    EXPECT_EQ(f->C_GetAttributeValue(session, key, &a, 1), CKR_ATTRIBUTE_SENSITIVE);
    Template back;
    back.flag(CKA_EXTRACTABLE, true);
    EXPECT_EQ(f->C_SetAttributeValue(session, key, back.data(), 1), CKR_ATTRIBUTE_READ_ONLY);
}

}  // namespace
}  // namespace fakevendor
