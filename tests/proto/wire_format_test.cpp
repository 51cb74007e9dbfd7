// The schema is a wire contract with peers built from other sources, so these
// tests pin bytes computed by hand rather than round-tripping through the same
// generated code.
#include <gtest/gtest.h>

#include <cstdint>
#include <string>

#include "vok_proto.h"

namespace {

std::string hex(const std::string& bytes) {
    static const char* digits = "0123456789abcdef";
    std::string out;
    for (unsigned char c : bytes) {
        if (!out.empty()) out += ' ';
        out += digits[c >> 4];
        out += digits[c & 15];
    }
    return out;
}

std::string unhex(const std::string& text) {
    std::string out;
    for (size_t i = 0; i + 1 < text.size();) {
        if (text[i] == ' ') { ++i; continue; }
        out += static_cast<char>(std::stoi(text.substr(i, 2), nullptr, 16));
        i += 2;
    }
    return out;
}

std::string le64(uint64_t v) {
    std::string s(8, '\0');
    for (int i = 0; i < 8; ++i) s[i] = static_cast<char>(v >> (8 * i));
    return s;
}

void setAttribute(pkcs11::CK_ATTRIBUTE* a, uint64_t type, const std::string& value) {
    a->set_type(type);
    a->set_pvalue(value);
    a->set_ulvaluelen(value.size());
}

TEST(Envelope, NameOnlyOperationIsFieldOneAlone) {
    for (const std::string name : {"C_Finalize", "C_GetInfo"}) {
        pkcs11::Operation op;
        op.set_name(name);
        std::string wire;
        ASSERT_TRUE(op.SerializeToString(&wire));
        EXPECT_EQ(hex(wire), hex(std::string("\x0a", 1) + char(name.size()) + name));

        pkcs11::Operation back;
        ASSERT_TRUE(back.ParseFromString(wire));
        EXPECT_EQ(back.name(), name);
        EXPECT_FALSE(back.has_initialize());
    }
}

TEST(Envelope, RequiredFieldsDecideInitialisation) {
    pkcs11::Operation noName;
    EXPECT_FALSE(noName.IsInitialized());
    EXPECT_FALSE(noName.ParseFromString(unhex("12 02 08 01")));  // initialize only

    // name "x" without result
    pkcs11::OperationResult res;
    EXPECT_FALSE(res.ParseFromString(unhex("0a 01 78")));
    // result 0 (CKR_OK) and no sub-message is complete
    EXPECT_TRUE(res.ParseFromString(unhex("0a 01 78 10 00")));
    EXPECT_EQ(res.result(), 0u);
    EXPECT_FALSE(res.has_infores());
}

TEST(Envelope, AllOnesResultSurvivesRoundTrip) {
    pkcs11::OperationResult res;
    res.set_name("C_Login");
    res.set_result(UINT64_MAX);
    std::string wire;
    ASSERT_TRUE(res.SerializeToString(&wire));
    EXPECT_EQ(hex(wire), hex(unhex("0a 07") + "C_Login" + unhex("10 ff ff ff ff ff ff ff ff ff 01")));
    pkcs11::OperationResult back;
    ASSERT_TRUE(back.ParseFromString(wire));
    EXPECT_EQ(back.result(), UINT64_MAX);
}

TEST(Envelope, DeliberateFieldSpellingsKeepTheirNumbers) {
    pkcs11::Operation op;
    op.set_name("n");
    op.mutable_destoryobj()->set_hobject(2);
    op.mutable_decint()->set_hkey(3);
    op.mutable_digestint();
    std::string wire;
    ASSERT_TRUE(op.SerializeToString(&wire));
    // destoryobj = 9, decint = 16, digestint = 18 (an empty sub-message is still written)
    EXPECT_EQ(hex(wire), hex(unhex("0a 01 6e 4a 02 10 02 82 01 02 18 03 92 01 00")));

    pkcs11::OperationResult res;
    res.set_name("n");
    res.set_result(0);
    res.mutable_findobjintres()->set_ulcount(1);
    ASSERT_TRUE(res.SerializeToString(&wire));
    EXPECT_EQ(hex(wire), hex(unhex("0a 01 6e 10 00 42 02 10 01")));  // findobjintres = 8
}

TEST(RepeatedNumbers, WrittenUnpackedReadEitherWay) {
    pkcs11::C_GetSlotList_Response list;
    for (uint64_t id : {1u, 2u, 300u}) list.add_slotidlist(id);
    list.set_pulcount(3);
    std::string wire;
    ASSERT_TRUE(list.SerializeToString(&wire));
    EXPECT_EQ(hex(wire), "08 01 08 02 08 ac 02 10 03");

    for (const char* form : {"08 01 08 02 08 ac 02", "0a 04 01 02 ac 02", "08 01 0a 03 02 ac 02"}) {
        pkcs11::C_GetSlotList_Response back;
        ASSERT_TRUE(back.ParseFromString(unhex(form))) << form;
        ASSERT_EQ(back.slotidlist_size(), 3) << form;
        EXPECT_EQ(back.slotidlist(0), 1u);
        EXPECT_EQ(back.slotidlist(1), 2u);
        EXPECT_EQ(back.slotidlist(2), 300u);
    }

    pkcs11::C_FindObjects_Response empty;
    ASSERT_TRUE(empty.SerializeToString(&wire));
    EXPECT_TRUE(wire.empty());
    EXPECT_EQ(empty.phobject_size(), 0);
}

TEST(Bytes, AbsentAndEmptyDifferOnTheWire) {
    pkcs11::C_Encrypt query;  // length query: capacity without a buffer
    query.set_pulencrypteddatalen(16);
    pkcs11::C_Encrypt empty = query;
    empty.set_pencrypteddata("");
    std::string a, b;
    ASSERT_TRUE(query.SerializeToString(&a));
    ASSERT_TRUE(empty.SerializeToString(&b));
    EXPECT_EQ(hex(a), "28 10");
    EXPECT_EQ(hex(b), "22 00 28 10");

    pkcs11::C_Encrypt back;
    ASSERT_TRUE(back.ParseFromString(a));
    EXPECT_FALSE(back.has_pencrypteddata());
    ASSERT_TRUE(back.ParseFromString(b));
    EXPECT_TRUE(back.has_pencrypteddata());

    pkcs11::CK_ATTRIBUTE attr;  // an attribute length query has no value field
    attr.set_type(3);
    attr.set_ulvaluelen(5);
    ASSERT_TRUE(attr.SerializeToString(&a));
    EXPECT_EQ(hex(a), "08 03 18 05");

    pkcs11::C_Login login;  // an empty PIN keeps its field
    login.set_ppin("");
    login.set_ulpinlen(0);
    ASSERT_TRUE(login.SerializeToString(&a));
    EXPECT_EQ(hex(a), "1a 00 20 00");
}

TEST(StructureMessages, TokenInfoUtcTimeIsFieldEighteenAndVersionsWiden) {
    pkcs11::CK_TOKEN_INFO info;
    info.set_utctime("2026112212000000");
    info.mutable_firmwareversion()->set_verminor(40);
    std::string wire;
    ASSERT_TRUE(info.SerializeToString(&wire));
    EXPECT_EQ(hex(wire), hex(unhex("8a 01 02 10 28 92 01 10") + "2026112212000000"));

    pkcs11::CK_VERSION zero;
    ASSERT_TRUE(zero.SerializeToString(&wire));
    EXPECT_TRUE(wire.empty());
    zero.set_vermajor(0);
    zero.set_verminor(0);
    ASSERT_TRUE(zero.SerializeToString(&wire));
    EXPECT_EQ(hex(wire), "08 00 10 00");
}

TEST(FunctionMessages, UnwrapKeyLongestRequest) {
    pkcs11::Operation op;
    op.set_name("C_UnWrapKey");
    auto* m = op.mutable_unwrapkey();
    m->set_hsession(1);
    m->mutable_pmechanism()->set_mechanism(0x2109);  // CKM_AES_KEY_WRAP
    m->mutable_pmechanism()->set_ulparameterlen(0);
    m->set_hunwrappingkey(7);
    m->set_pwrappedkey(std::string("\x01\x02\x03", 3));
    m->set_ulwrappedkeylen(3);
    setAttribute(m->add_ptemplate(), 0x0, le64(4));     // CKA_CLASS = CKO_SECRET_KEY
    setAttribute(m->add_ptemplate(), 0x100, le64(0x1f)); // CKA_KEY_TYPE = CKK_AES
    m->set_ulattributecount(2);

    std::string wire;
    ASSERT_TRUE(op.SerializeToString(&wire));
    const std::string expected =
        unhex("0a 0b") + "C_UnWrapKey" +
        unhex("f2 03 35"                      // field 62, 53 bytes
              " 08 01"                        // hSession
              " 12 05 08 89 42 18 00"         // pMechanism
              " 18 07"                        // hUnwrappingKey
              " 22 03 01 02 03 28 03"         // pWrappedKey, ulWrappedKeyLen
              " 32 0e 08 00 12 08 04 00 00 00 00 00 00 00 18 08"
              " 32 0f 08 80 02 12 08 1f 00 00 00 00 00 00 00 18 08"
              " 38 02");                      // ulAttributeCount
    EXPECT_EQ(hex(wire), hex(expected));
}

TEST(FunctionMessages, GenerateKeyPairCarriesTwoTemplatesWithCounts) {
    pkcs11::Operation op;
    op.set_name("C_GenerateKeyPair");
    auto* m = op.mutable_generatekeypair();
    m->set_hsession(5);
    m->mutable_pmechanism()->set_mechanism(0);  // CKM_RSA_PKCS_KEY_PAIR_GEN
    setAttribute(m->add_ppublickeytemplate(), 0x121, le64(2048));  // CKA_MODULUS_BITS
    m->set_ulpublickeyattributecount(1);
    setAttribute(m->add_pprivatekeytemplate(), 0x2, std::string("\x01", 1));  // CKA_PRIVATE
    m->set_ulprivatekeyattributecount(1);

    std::string wire;
    ASSERT_TRUE(op.SerializeToString(&wire));
    const std::string expected =
        unhex("0a 11") + "C_GenerateKeyPair" +
        unhex("e2 03 24"                                              // field 60, 36 bytes
              " 08 05 12 02 08 00"
              " 1a 0f 08 a1 02 12 08 00 08 00 00 00 00 00 00 18 08 20 01"  // public, count
              " 2a 07 08 02 12 01 01 18 01 30 01");                  // private, count
    EXPECT_EQ(hex(wire), hex(expected));

    pkcs11::Operation back;
    ASSERT_TRUE(back.ParseFromString(wire));
    ASSERT_EQ(back.generatekeypair().ppublickeytemplate_size(), 1);
    ASSERT_EQ(back.generatekeypair().pprivatekeytemplate_size(), 1);
    EXPECT_EQ(back.generatekeypair().pprivatekeytemplate(0).type(), 2u);
}

TEST(FunctionMessages, SubMessageSentTwiceIsMerged) {
    pkcs11::Operation op;
    // login {hSession 1} then login {userType 1}
    ASSERT_TRUE(op.ParseFromString(unhex("3a 02 08 01 0a 01 6e 3a 02 10 01")));
    EXPECT_EQ(op.name(), "n");
    EXPECT_EQ(op.login().hsession(), 1u);
    EXPECT_EQ(op.login().usertype(), 1u);
}

}  // namespace
