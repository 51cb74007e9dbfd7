// The cryptographic, key and random handlers against the fake vendor module:
// the buffers each sizing rule gives the module, the mechanism, and the exact
// answers.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cstddef>
#include <cstring>
#include <ostream>
#include <string>
#include <vector>

#include "log_capture.h"
#include "server_test_support.h"

namespace {

using namespace servertest;
using ::testing::ElementsAreArray;
using ::testing::IsSupersetOf;
using Result = pkcs11::OperationResult;

constexpr CK_RV kFailure = CKR_VENDOR_DEFINED | 0x5a;

// An answer's data field and length field.
struct Out {
    bool present;
    std::string data;
    uint64_t length;
};
#define OUT(res, data, length) \
    [](const Result& r) { return Out{r.has_##res(), r.res().data(), r.res().length()}; }

// ---- Single-part and multi-part rules -------------------------------------------

struct Io {
    std::string input;
    uint64_t inputLength;  // field 3
    uint64_t capacity;     // field 5
    bool noOutput = false;  // field 4 absent: the caller's NULL
};

struct DataRow {
    const char* command;
    Handler handler;
    size_t slot;  // offset in the list; every in/out data call has CK_C_Encrypt's type
    bool multiPart;
    void (*fill)(pkcs11::Operation&, const Io&);
    Out (*answer)(const Result&);
};
void PrintTo(const DataRow& row, std::ostream* os) { *os << row.command; }

// The output field carries bytes too; the module must not see them.
// clang-format off
#define DATA(command, sub, in, inLen, out, cap, multi)                               \
    DataRow{#command, command##_Server, offsetof(CK_FUNCTION_LIST, command), multi,    \
            [](pkcs11::Operation& op, const Io& io) {                                  \
                auto* m = op.mutable_##sub();                                          \
                m->set_##in(io.input), m->set_##inLen(io.inputLength);                 \
                if (!io.noOutput) m->set_##out("zz");                                  \
                m->set_##cap(io.capacity);                                             \
            },                                                                         \
            OUT(sub##res, out, cap)}
// clang-format on

const DataRow kDataRows[] = {
    DATA(C_Encrypt, enc, pdata, uldatalen, pencrypteddata, pulencrypteddatalen, false),
    DATA(C_Decrypt, dec, pencrypteddata, ulencrypteddatalen, pdata, puldatalen, false),
    DATA(C_Digest, digest, pdata, uldatalen, pdigest, puldigestlen, false),
    DATA(C_Sign, sign, pdata, uldatalen, psignature, pulsignaturelen, false),
    DATA(C_EncryptUpdate, encryptupdate, ppart, ulpartlen, pencryptedpart, pulencryptedpartlen,
         true),
    DATA(C_DecryptUpdate, decryptupdate, pencryptedpart, ulencryptedpartlen, ppart, pulpartlen,
         true),
    DATA(C_SignRecover, signrecover, pdata, uldatalen, psignature, pulsignaturelen, true),
    DATA(C_VerifyRecover, verifyrecover, psignature, ulsignaturelen, pdata, puldatalen, true),
    DATA(C_DigestEncryptUpdate, digestencryptupdate, ppart, ulpartlen, pencryptedpart,
         pulencryptedpartlen, true),
    DATA(C_DecryptDigestUpdate, decryptdigestupdate, pencryptedpart, ulencryptedpartlen, ppart,
         pulpartlen, true),
    DATA(C_SignEncryptUpdate, signencryptupdate, ppart, ulpartlen, pencryptedpart,
         pulencryptedpartlen, true),
    DATA(C_DecryptVerifyUpdate, decryptverifyupdate, pencryptedpart, ulencryptedpartlen, ppart,
         pulpartlen, true),
};

// A module that needs 3 bytes of output. It reads `inputWindow` bytes of its
// input, more than it is told for a multi-part call, which is what the rule
// allocates and fills.
struct Seen {
    std::string input, output;
    CK_ULONG told;
};
Seen seen;
size_t inputWindow;

CK_RV needsThreeBytes(CK_SESSION_HANDLE, CK_BYTE_PTR in, CK_ULONG told, CK_BYTE_PTR out,
                      CK_ULONG_PTR length) {
    seen = {std::string(reinterpret_cast<char*>(in), inputWindow),
            out ? std::string(reinterpret_cast<char*>(out), *length) : "NULL", told};
    const CK_ULONG capacity = *length;
    *length = 3;
    if (!out) return CKR_OK;
    if (capacity < 3) return CKR_BUFFER_TOO_SMALL;
    memcpy(out, "xyz", 3);
    return CKR_OK;
}

class DataSizing : public FakeModuleTest, public ::testing::WithParamInterface<DataRow> {};

TEST_P(DataSizing, TheModuleGetsBuffersByTheRuleAndTheAnswerWhatItWrote) {
    const DataRow& row = GetParam();
    CK_FUNCTION_LIST patched = *module_;
    // The list is packed: its entries are not aligned, so write through bytes.
    const CK_C_Encrypt replacement = needsThreeBytes;
    memcpy(reinterpret_cast<unsigned char*>(&patched) + row.slot, &replacement,
           sizeof(replacement));
    ckpFunctions = &patched;
    struct Case {
        Io io;
        size_t window;
        CK_RV rv;
        std::string data;
    };
    const Case cases[] = {
        // Multi-part: both buffers at the capacity, the input filled to it.
        {{"0123456789abcdefghijklmnopqrstuvwxyz", 16, 32},
         row.multiPart ? 32u : 16u,
         CKR_OK,
         "xyz"},
        // An input longer than the capacity, shorter than stated: zero-padded.
        {{"abcdef", 8, 4}, 8, CKR_OK, "xyz"},
        // A length query: a real buffer of capacity 0, the needed length back.
        {{"abc", 3, 0}, 3, CKR_BUFFER_TOO_SMALL, ""},
        // No output field: a NULL output, the module only measures.
        {{"abc", 3, 0, true}, 3, CKR_OK, ""},
    };
    for (const Case& c : cases) {
        inputWindow = c.window;
        const Result res =
            parsed(row.handler(requestBytes(row.command, [&](auto& op) { row.fill(op, c.io); })));
        std::string input = c.io.input.substr(0, c.window);
        input.resize(c.window, '\0');
        EXPECT_EQ(hex(input), hex(seen.input)) << c.io.capacity;
        EXPECT_EQ(c.io.inputLength, seen.told);
        const std::string output = c.io.noOutput ? "NULL" : std::string(c.io.capacity, '\0');
        EXPECT_EQ(hex(output), hex(seen.output)) << c.io.capacity;
        const Out out = row.answer(res);
        EXPECT_EQ(c.rv, res.result());
        EXPECT_TRUE(out.present);
        EXPECT_EQ(c.data, out.data);
        EXPECT_EQ(3u, out.length);
    }
}

INSTANTIATE_TEST_SUITE_P(Handlers, DataSizing, ::testing::ValuesIn(kDataRows),
                         [](const auto& info) { return std::string(info.param.command); });

// ---- Finals and input-only calls: one buffer and its length ----------------------

struct OneBufferRow {
    const char* command;
    Handler handler;
    const char* buffer;  // the module's parameter names
    const char* length;
    void (*fill)(pkcs11::Operation&, const std::string&, uint64_t);
    Out (*answer)(const Result&);  // finals; nullptr: input only, a bare answer
};
void PrintTo(const OneBufferRow& row, std::ostream* os) { *os << row.command; }

// clang-format off
#define ONE_BUFFER(command, sub, buf, len, bufName, lenName, answer)                    \
    OneBufferRow{#command, command##_Server, bufName, lenName,                          \
                 [](pkcs11::Operation& op, const std::string& bytes, uint64_t length) { \
                     op.mutable_##sub()->set_##buf(bytes);                              \
                     op.mutable_##sub()->set_##len(length);                             \
                 },                                                                     \
                 answer}
#define FINAL(command, sub, buf, len, bufName, lenName) \
    ONE_BUFFER(command, sub, buf, len, bufName, lenName, OUT(sub##res, buf, len))
#define INPUT(command, sub, buf, len, bufName, lenName) \
    ONE_BUFFER(command, sub, buf, len, bufName, lenName, nullptr)
// clang-format on

const OneBufferRow kOneBufferRows[] = {
    FINAL(C_EncryptFinal, encryptfinal, plastencryptedpart, pullastencryptedpartlen,
          "pLastEncryptedPart", "pulLastEncryptedPartLen"),
    FINAL(C_DecryptFinal, decryptfinal, plastpart, pullastpartlen, "pLastPart", "pulLastPartLen"),
    FINAL(C_DigestFinal, digestfinal, pdigest, puldigestlen, "pDigest", "pulDigestLen"),
    FINAL(C_SignFinal, signfinal, psignature, pulsignaturelen, "pSignature", "pulSignatureLen"),
    INPUT(C_DigestUpdate, digestupdate, ppart, ulpartlen, "pPart", "ulPartLen"),
    INPUT(C_SignUpdate, signupdate, ppart, ulpartlen, "pPart", "ulPartLen"),
    INPUT(C_VerifyUpdate, verifyupdate, ppart, ulpartlen, "pPart", "ulPartLen"),
    INPUT(C_VerifyFinal, verifyfinal, psignature, ulsignaturelen, "pSignature", "ulSignatureLen"),
};

class OneBuffer : public FakeModuleTest, public ::testing::WithParamInterface<OneBufferRow> {};

// A final's buffer is the capacity's zeros, whatever the request's field
// held; an input buffer is the request's bytes, zero-padded. Never NULL.
TEST_P(OneBuffer, TheModuleGetsTheStatedLength) {
    const OneBufferRow& row = GetParam();
    for (uint64_t length : {5u, 0u}) {
        ASSERT_EQ(CKR_OK, fake_vendor_set_next_rv(row.command, kFailure));
        const Result res = parsed(
            row.handler(requestBytes(row.command, [&](auto& op) { row.fill(op, "abc", length); })));
        const std::string bytes = length ? (row.answer ? zeros(5) : "6162630000") : "-";
        EXPECT_THAT(received(row.command),
                    IsSupersetOf({std::string(row.buffer) + " 0 0 " + bytes + " 0",
                                  std::string(row.length) + (row.answer ? " 0 " : " 1 ") +
                                      std::to_string(length) + " - 0"}));
        EXPECT_EQ(kFailure, res.result());
        if (!row.answer) continue;
        const Out out = row.answer(res);
        EXPECT_EQ(std::string(length, '\0'), out.data);
        EXPECT_EQ(length, out.length);
    }
}

INSTANTIATE_TEST_SUITE_P(Handlers, OneBuffer, ::testing::ValuesIn(kOneBufferRows),
                         [](const auto& info) { return std::string(info.param.command); });

// ---- Mechanism rebuild ------------------------------------------------------------

struct InitRow {
    const char* command;
    Handler handler;
    pkcs11::CK_MECHANISM* (*mechanism)(pkcs11::Operation&);
};
void PrintTo(const InitRow& row, std::ostream* os) { *os << row.command; }
// clang-format off
#define INIT(command, sub, field)               \
    InitRow{#command, command##_Server,          \
            [](pkcs11::Operation& op) { return op.mutable_##sub()->mutable_##field(); }}
// clang-format on

const InitRow kInitRows[] = {
    INIT(C_EncryptInit, encinit, mechanism),
    INIT(C_DecryptInit, decint, mechanism),
    INIT(C_DigestInit, digestint, mechanism),
    INIT(C_SignInit, signinit, mechanism),
    INIT(C_VerifyInit, verifyinit, mechanism),
    INIT(C_SignRecoverInit, signrecoverinit, pmechanism),
    INIT(C_VerifyRecoverInit, verifyrecoverinit, pmechanism),
};

class MechanismRebuild : public FakeModuleTest, public ::testing::WithParamInterface<InitRow> {};

// The parameter is exactly ulParameterLen bytes, zero-padded past what
// arrived, and a real pointer even for length 0.
TEST_P(MechanismRebuild, ParameterOfTheStatedLengthNeverNull) {
    const InitRow& row = GetParam();
    for (uint64_t length : {5u, 0u}) {
        const Result res = parsed(row.handler(requestBytes(row.command, [&](auto& op) {
            pkcs11::CK_MECHANISM* m = row.mechanism(op);
            m->set_mechanism(CKM_AES_ECB), m->set_ulparameterlen(length);
            m->set_pparameter("abc");
        })));
        EXPECT_EQ("pMechanism 0 0 - 1 " + std::to_string(CKM_AES_ECB) + " 0 " +
                      std::to_string(length) + (length ? " 6162630000" : " -"),
                  received(row.command).at(1));
        EXPECT_EQ(hex(bareAnswer(row.command, CKR_CRYPTOKI_NOT_INITIALIZED)),
                  hex(res.SerializeAsString()));
    }
}

INSTANTIATE_TEST_SUITE_P(Handlers, MechanismRebuild, ::testing::ValuesIn(kInitRows),
                         [](const auto& info) { return std::string(info.param.command); });

void label(google::protobuf::RepeatedPtrField<pkcs11::CK_ATTRIBUTE>* list, const std::string& value,
           CK_ULONG length) {
    setAttribute(list->Add(), CKA_LABEL, value, length);
}

// ---- Log lines ------------------------------------------------------------------------------

struct LogRow {
    Handler handler;
    std::vector<std::string> texts;
};

TEST(HandlerLogs, ModuleAndOutputLinesWhereTheyAreWritten) {
    const std::string present = "ckpFunctions not NULL", allocated = "sigdata memory allocated";
    const LogRow rows[] = {
        {C_Sign_Server, {present, allocated}},
        {C_SignUpdate_Server, {present}},
        {C_SignFinal_Server, {present, allocated}},
        {C_SignRecover_Server, {present, allocated}},
        {C_VerifyUpdate_Server, {present}},
        {C_VerifyFinal_Server, {present}},
        {C_VerifyRecover_Server, {present, allocated}},
        {C_DecryptUpdate_Server, {allocated}},
        {C_Encrypt_Server, {}},
        {C_Verify_Server, {}},
    };
    fake_vendor_reset();
    ckpFunctions = fake_vendor_function_list();
    for (const LogRow& row : rows) {
        voktest::LogCapture log;
        row.handler(requestBytes("any"));
        EXPECT_THAT(log.texts("Vokpkcs11f_Server"), ElementsAreArray(row.texts));
    }
    voktest::LogCapture log;
    C_GenerateKeyPair_Server(requestBytes("C_GenerateKeyPair", [](auto& op) {
        auto* m = op.mutable_generatekeypair();
        label(m->mutable_ppublickeytemplate(), "pub", 3), m->set_ulpublickeyattributecount(1);
        m->add_pprivatekeytemplate()->set_type(CKA_LABEL), m->set_ulprivatekeyattributecount(1);
    }));
    EXPECT_THAT(log.texts("Vokpkcs11f_Server"),
                ElementsAreArray({"Inside for", "attr_type set", "Inside if not NULL pdata",
                                  "attr_ulvaluelen set", "Inside for", "attr_type set",
                                  "attr_ulvaluelen set"}));
    ckpFunctions = nullptr;
}

}  // namespace
