// Values that hold pointers, through proxy, socket, server and the fake module
// in one process: each parameter structure and nested template arrives as the
// service's copy of the caller's bytes, outputs come back, and raw frames
// carrying pointers never hand the module one.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstring>
#include <deque>
#include <functional>

#include "jvm_fixture.h"
#include "raw_peer.h"
#include "server_test_support.h"
#include "vok_client.h"

namespace {

using namespace servertest;

class ByValue : public voktest::JvmTest {
protected:
    void SetUp() override {
        JvmTest::SetUp();
        fake_vendor_reset();
        voktest::registerModule(id.c_str(), fake_vendor_function_list());
        ASSERT_EQ(0, vokpkcs11_init_server(id.c_str()));
    }
    CK_SESSION_HANDLE session() {  // through the proxies
        for (int i = 0; i < 200 && vokpkcs11_client_init(id.c_str()) != 0; ++i) usleep(5000);
        CK_SESSION_HANDLE s = 0;
        EXPECT_EQ(CKR_OK, C_Initialize(nullptr));
        EXPECT_EQ(CKR_OK, C_OpenSession(1, CKF_SERIAL_SESSION, nullptr, nullptr, &s));
        return s;
    }
    const std::string id = "vok-by-value-" + std::to_string(getpid());
};

std::string bytesOf(const void* p, size_t n) { return std::string(static_cast<const char*>(p), n); }
std::string written(size_t n) {  // what the fake module writes into an output buffer
    std::string s;
    for (size_t i = 0; i < n; ++i) s += char(0xa0 + i);
    return hex(s);
}

// The caller's buffers, each with bytes of its own, in member order, with
// what the module must find in each ("" its own bytes) and what the caller
// must hold afterwards ("" unchanged). Addresses of buffers show as zeros.
struct Buffers {
    std::deque<std::string> data;
    std::vector<std::string> arrives, after;
    CK_BYTE* add(std::string bytes, std::string arrive = "", std::string back = "") {
        data.push_back(bytes), arrives.push_back(arrive), after.push_back(back);
        return reinterpret_cast<CK_BYTE*>(&data.back()[0]);
    }
    CK_BYTE* operator()(size_t n) { return add(std::string(n, char(data.size() * 7 + 1))); }
    CK_BYTE* out(size_t n) { return add(std::string(n, 'o'), zeros(n), written(n)); }
    CK_BYTE* inout(size_t n) { return add(std::string(n, 'x'), "", written(n)); }
    CK_BYTE* none() { return add("", "null"), nullptr; }
    template <class T>
    T* put(const T& value, std::string back = "") {
        return reinterpret_cast<T*>(add(bytesOf(&value, sizeof value), "", back));
    }
    CK_SSL3_KEY_MAT_OUT* keyMat(size_t iv) {  // the structure first, then its IVs
        const CK_SSL3_KEY_MAT_OUT back{0x70, 0x71, 0x72, 0x73, nullptr, nullptr};
        auto* at = put(CK_SSL3_KEY_MAT_OUT{1, 2, 3, 4, nullptr, nullptr},
                       hex(bytesOf(&back, sizeof back)));
        at->pIVClient = out(iv), at->pIVServer = out(iv);
        return at;
    }
    std::string masked(std::string bytes) const {
        for (size_t at = 0; at + sizeof(void*) <= bytes.size(); ++at)
            for (const std::string& d : data) {
                const void* p;
                memcpy(&p, &bytes[at], sizeof p);
                if (!d.empty() && p == d.data()) memset(&bytes[at], 0, sizeof p);
            }
        return hex(bytes);
    }
    std::string now(size_t k) const { return data[k].empty() ? "null" : masked(data[k]); }
};

struct Row {
    const char* name;
    CK_MECHANISM_TYPE type;
    std::function<std::string(Buffers&)> build;  // the parameter's bytes
};

// One row per structure: its members, b(n) standing for a caller buffer of n
// bytes.
#define ROW(T, mechanism, ...)                                 \
    Row {                                                      \
        #T, mechanism, []([[maybe_unused]] Buffers& b) {       \
            const T p{__VA_ARGS__};                            \
            return bytesOf(&p, sizeof p);                      \
        }                                                      \
    }

const Row kRows[] = {
    ROW(CK_RSA_PKCS_OAEP_PARAMS, CKM_RSA_PKCS_OAEP, CKM_SHA256, CKG_MGF1_SHA256, CKZ_DATA_SPECIFIED,
        b(5), 5),
    ROW(CK_KEA_DERIVE_PARAMS, CKM_KEA_KEY_DERIVE, CK_TRUE, 20, b(20), b(20), 64, b(64)),
    ROW(CK_RC2_CBC_PARAMS, CKM_RC2_CBC, 40, {1, 2, 3, 4, 5, 6, 7, 8}),
    ROW(CK_RC2_MAC_GENERAL_PARAMS, CKM_RC2_MAC_GENERAL, 40, 4),
    ROW(CK_RC5_PARAMS, CKM_RC5_ECB, 4, 12),
    ROW(CK_RC5_CBC_PARAMS, CKM_RC5_CBC_PAD, 4, 12, b(8), 8),
    ROW(CK_RC5_MAC_GENERAL_PARAMS, CKM_RC5_MAC_GENERAL, 4, 12, 3),
    ROW(CK_SKIPJACK_PRIVATE_WRAP_PARAMS, CKM_SKIPJACK_PRIVATE_WRAP, 6, b(6), 7, b(7), 9, 10, 11,
        b(11), b(9), b(9), b(10)),
    ROW(CK_SKIPJACK_RELAYX_PARAMS, CKM_SKIPJACK_RELAYX, 3, b(3), 4, b(4), 5, b(5), 6, b(6), 7, b(7),
        9, b(9), 10, b(10)),
    ROW(CK_PBE_PARAMS, CKM_PBE_SHA1_DES3_EDE_CBC, b.out(8), b(5), 5, b(9), 9, 1000),
    ROW(CK_PKCS5_PBKD2_PARAMS, CKM_PKCS5_PBKD2, CKZ_SALT_SPECIFIED, b(16), 16, 1000,
        CKP_PKCS5_PBKD2_HMAC_SHA1, b(3), 3, b(7), b.put<CK_ULONG>(7)),
    ROW(CK_KEY_DERIVATION_STRING_DATA, CKM_XOR_BASE_AND_DATA, b(5), 5),
    ROW(CK_KEY_WRAP_SET_OAEP_PARAMS, CKM_KEY_WRAP_SET_OAEP, 0x21, b.inout(6), 6),
    ROW(CK_SSL3_MASTER_KEY_DERIVE_PARAMS, CKM_TLS_MASTER_KEY_DERIVE, {b(32), 32, b(31), 31},
        b.put(CK_VERSION{3, 1}, "7071")),
    ROW(CK_SSL3_KEY_MAT_PARAMS, CKM_SSL3_KEY_AND_MAC_DERIVE, 160, 128, 64, CK_TRUE,
        {b(32), 32, b(31), 31}, b.keyMat(8)),
    ROW(CK_RSA_PKCS_PSS_PARAMS, CKM_SHA256_RSA_PKCS_PSS, CKM_SHA256, CKG_MGF1_SHA256, 32),
    ROW(CK_ECDH1_DERIVE_PARAMS, CKM_ECDH1_DERIVE, CKD_NULL, 0, b.none(), 65, b(65)),
    ROW(CK_ECDH2_DERIVE_PARAMS, CKM_ECMQV_DERIVE, CKD_SHA1_KDF, 3, b(3), 65, b(65), 32, 0x123, 66,
        b(66)),
    ROW(CK_X9_42_DH1_DERIVE_PARAMS, CKM_X9_42_DH_DERIVE, CKD_NULL, 4, b(4), 128, b(128)),
    ROW(CK_X9_42_DH2_DERIVE_PARAMS, CKM_X9_42_MQV_DERIVE, CKD_NULL, 4, b(4), 128, b(128), 64, 0x456,
        129, b(129)),
    ROW(CK_DES_CBC_ENCRYPT_DATA_PARAMS, CKM_DES3_CBC_ENCRYPT_DATA, {1, 2, 3, 4, 5, 6, 7, 8}, b(16),
        16),
    ROW(CK_AES_CBC_ENCRYPT_DATA_PARAMS, CKM_AES_CBC_ENCRYPT_DATA, {1, 2, 3, 4, 5, 6, 7, 8, 9},
        b(32), 32),
    ROW(CK_GCM_PARAMS, CKM_AES_GCM, b(12), 12, 96, b(20), 20, 128),
    ROW(CK_CCM_PARAMS, CKM_AES_CCM, 64, b(13), 13, b(20), 20, 16),
};

class Parameters : public ByValue, public ::testing::WithParamInterface<Row> {};

// Every member arrives, every pointer leads to the service's copy of the
// caller's bytes (recorded before the module writes its outputs) and none is
// the caller's own; what the module wrote comes back into the caller's
// buffers, whose addresses stay the caller's.
TEST_P(Parameters, ArriveAsTheServicesCopyAndOutputsComeBack) {
    const CK_SESSION_HANDLE s = session();
    Buffers b;
    const std::string bytes = GetParam().build(b);
    std::vector<std::string> arrives, arrived;
    for (size_t k = 0; k < b.data.size(); ++k)
        arrives.push_back(b.arrives[k].empty() ? b.now(k) : b.arrives[k]);
    std::string parameter = bytes;
    CK_MECHANISM m{GetParam().type, &parameter[0], parameter.size()};
    CK_OBJECT_HANDLE key = 0;
    C_DeriveKey(s, &m, 1, nullptr, 0, &key);

    const fakevendor::Call call = fakevendor::lastCall("C_DeriveKey");
    const fakevendor::Item& got = call.arg("pMechanism").items.at(0);
    EXPECT_EQ(std::to_string(GetParam().type) + " " + std::to_string(bytes.size()) + " " +
                  b.masked(bytes),
              std::to_string(got.type) + " " + std::to_string(got.len) + " " + got.hex);
    for (const fakevendor::Arg& a : call.args)
        for (size_t i = 0; a.name == "parameter" && i < a.items.size(); ++i)
            arrived.push_back(a.items[i].null ? "null" : a.items[i].hex);
    EXPECT_EQ(arrives, arrived);
    for (size_t k = 0; k < b.data.size(); ++k) {
        EXPECT_EQ(b.after[k].empty() ? arrives[k] : b.after[k], b.now(k)) << "buffer " << k;
        EXPECT_FALSE(fake_vendor_saw_pointer(b.data[k].data())) << "buffer " << k;
    }
    EXPECT_EQ(0u, fake_vendor_foreign_pointer_count());
}

INSTANTIATE_TEST_SUITE_P(EveryStructure, Parameters, ::testing::ValuesIn(kRows),
                         [](const auto& info) { return std::string(info.param.name); });

// A wrap template goes in with C_GenerateKey and comes back through
// C_GetAttributeValue: the length query, the types and lengths, the values.
TEST_F(ByValue, NestedWrapTemplateInAndOut) {
    const CK_SESSION_HANDLE s = session();
    CK_OBJECT_CLASS cls = CKO_SECRET_KEY, clsBack = 0;
    CK_KEY_TYPE type = CKK_AES, typeBack = 0;
    CK_ULONG length = 16;
    CK_ATTRIBUTE wrap[] = {{CKA_CLASS, &cls, 8}, {CKA_KEY_TYPE, &type, 8}};
    CK_ATTRIBUTE tmpl[] = {{CKA_VALUE_LEN, &length, 8}, {CKA_WRAP_TEMPLATE, wrap, sizeof wrap}};
    CK_MECHANISM aes{CKM_AES_KEY_GEN, nullptr, 0};
    CK_OBJECT_HANDLE key = 0;
    ASSERT_EQ(CKR_OK, C_GenerateKey(s, &aes, tmpl, 2, &key));
    EXPECT_THAT(
        received("C_GenerateKey"),
        ::testing::Contains("nested 0 0 - 2 0 0 8 0400000000000000 256 0 8 1f00000000000000"));
    EXPECT_FALSE(fake_vendor_saw_pointer(wrap) || fake_vendor_saw_pointer(&cls));

    CK_ATTRIBUTE back[2] = {}, query[] = {{CKA_WRAP_TEMPLATE, nullptr, 0}};
    ASSERT_EQ(CKR_OK, C_GetAttributeValue(s, key, query, 1));
    EXPECT_EQ(sizeof wrap, query[0].ulValueLen);
    query[0].pValue = back;
    ASSERT_EQ(CKR_OK, C_GetAttributeValue(s, key, query, 1));
    EXPECT_TRUE(back[1].type == CKA_KEY_TYPE && back[1].ulValueLen == 8 && !back[1].pValue);
    back[0].pValue = &clsBack, back[1].pValue = &typeBack;
    ASSERT_EQ(CKR_OK, C_GetAttributeValue(s, key, query, 1));
    EXPECT_TRUE(clsBack == cls && typeBack == type && back[0].pValue == &clsBack);
    EXPECT_TRUE(query[0].ulValueLen == sizeof wrap && query[0].pValue == back);
    EXPECT_EQ(0u, fake_vendor_foreign_pointer_count());
}

// ---- Raw frames ------------------------------------------------------------------

pkcs11::CK_MECHANISM* encryptInit(pkcs11::Operation& op, CK_MECHANISM_TYPE type, size_t length) {
    op.set_name("C_EncryptInit");
    pkcs11::CK_MECHANISM* m = op.mutable_encinit()->mutable_mechanism();
    m->set_mechanism(type), m->set_pparameter(std::string(length, 'A'));
    m->set_ulparameterlen(length);
    return m;
}

// GCM by value beside bytes whose pointers are 0x4141414141414141.
void gcm(pkcs11::Operation& op, size_t rawLength, int numbers = 4) {
    pkcs11::CK_STRUCTURE* v = encryptInit(op, CKM_AES_GCM, rawLength)->mutable_pparametervalue();
    for (uint64_t n : {12, 96, 20, 128})
        if (numbers-- > 0) v->add_number(n);
    v->add_buffer()->set_data(std::string(12, 'i'));
    v->add_buffer()->set_data(std::string(20, 'a'));
}

// A wrap template of bytes 0x41: alone to create an object, with one entry
// by value to query one.
void wrapTemplate(pkcs11::Operation& op, bool query) {
    op.set_name(query ? "C_GetAttributeValue" : "C_CreateObject");
    query ? op.mutable_attvalue()->set_ulcount(1) : op.mutable_createobject()->set_ulcount(1);
    pkcs11::CK_ATTRIBUTE* a =
        query ? op.mutable_attvalue()->add_attribute() : op.mutable_createobject()->add_ptemplate();
    setAttribute(a, CKA_WRAP_TEMPLATE, std::string(sizeof(CK_ATTRIBUTE), 'A'),
                 sizeof(CK_ATTRIBUTE));
    if (query) setAttribute(a->mutable_pvaluetemplate()->add_attribute(), CKA_CLASS, "12345678", 8);
}

struct Frame {
    const char* name;
    std::function<void(pkcs11::Operation&)> fill;
    CK_RV refusedWith;               // 0: the module is called
    std::vector<std::string> lines;  // among what the module then records
};

constexpr CK_RV kParam = CKR_MECHANISM_PARAM_INVALID, kValue = CKR_ATTRIBUTE_VALUE_INVALID;
const CK_GCM_PARAMS kGcm{nullptr, 12, 96, nullptr, 20, 128};  // the module's, pointers zeroed
const std::vector<std::string> kGcmLines = {
    "pMechanism 0 0 - 1 4231 0 " + std::to_string(sizeof kGcm) + " " +
        hex(bytesOf(&kGcm, sizeof kGcm)),
    "parameter 0 0 - 2 0 0 12 " + hex(std::string(12, 'i')) + " 1 0 20 " +
        hex(std::string(20, 'a'))};

const Frame kFrames[] = {
    {"GcmRaw", [](auto& op) { encryptInit(op, CKM_AES_GCM, sizeof kGcm); }, kParam, {}},
    {"GcmByValue", [](auto& op) { gcm(op, sizeof kGcm); }, 0, kGcmLines},
    // A 32-bit client's raw bytes at a 64-bit service, or the other way round.
    {"GcmOfTheOtherWidth", [](auto& op) { gcm(op, sizeof(void*) == 8 ? 40 : 48); }, 0, kGcmLines},
    {"GcmShortOfANumber", [](auto& op) { gcm(op, sizeof kGcm, 3); }, kParam, {}},
    {"VendorMechanism", [](auto& op) { encryptInit(op, CKM_VENDOR_DEFINED | 7, 16); }, kParam, {}},
    {"PointersWithoutForm", [](auto& op) { encryptInit(op, CKM_TLS_PRF, 48); }, kParam, {}},
    {"PlainIv", [](auto& op) { encryptInit(op, CKM_AES_CBC, 16); }, 0,
     {"pMechanism 0 0 - 1 4226 0 16 " + hex(std::string(16, 'A'))}},
    {"NestedRaw", [](auto& op) { wrapTemplate(op, false); }, kValue, {}},
    {"NestedByValue", [](auto& op) { wrapTemplate(op, true); }, 0,
     {"nested 0 0 - 1 0 0 8 " + hex("12345678")}},
};

class RawFrames : public ByValue, public ::testing::WithParamInterface<Frame> {};

// Refused frames get name and code only, without a module call; the others
// reach the module with no pointer it cannot read, and the answer carries
// no bytes of the service's own entries.
TEST_P(RawFrames, NeverHandTheModuleAClientPointer) {
    voktest::RawSocket peer = voktest::rawConnect(id);
    voktest::WireHeader header;
    voktest::Bytes answer;
    pkcs11::Operation op;
    GetParam().fill(op);
    const std::string request = op.SerializeAsString();
    ASSERT_TRUE(peer.sendFrame({100, 103, 0, 4}, voktest::int32Bytes(1)));
    ASSERT_TRUE(peer.recvFrame(&header, &answer));
    ASSERT_TRUE(peer.sendFrame({101, 103, 0, int32_t(request.size())},
                               voktest::Bytes(request.begin(), request.end())));
    ASSERT_TRUE(peer.recvFrame(&header, &answer));
    const std::string result(answer.begin(), answer.end());
    if (GetParam().refusedWith) {
        EXPECT_EQ(hex(bareAnswer(op.name(), GetParam().refusedWith)), hex(result));
        EXPECT_EQ(0u, fake_vendor_call_count());
        return;
    }
    ASSERT_EQ(1u, fake_vendor_call_count());
    EXPECT_THAT(received(fakevendor::call(0).function), ::testing::IsSupersetOf(GetParam().lines));
    EXPECT_EQ(0u, fake_vendor_foreign_pointer_count());
    const pkcs11::OperationResult res = parsed(result);
    EXPECT_FALSE(res.has_attvalueres() && res.attvalueres().attribute(0).has_pvalue());
}

INSTANTIATE_TEST_SUITE_P(Hostile, RawFrames, ::testing::ValuesIn(kFrames),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace
