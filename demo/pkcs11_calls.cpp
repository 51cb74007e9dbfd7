#include "pkcs11_calls.h"

#include <dlfcn.h>

#include <chrono>
#include <cstdio>
#include <thread>

namespace vok {
namespace demo {

namespace {

constexpr int32_t kConnectFailed = 7;  // the channel's status: no service listening (yet)

std::string rvText(CK_RV rv) {
    char text[32];
    std::snprintf(text, sizeof text, "0x%llx", static_cast<unsigned long long>(rv));
    return text;
}

CK_ATTRIBUTE attr(CK_ATTRIBUTE_TYPE type, const void* value, CK_ULONG length) {
    return CK_ATTRIBUTE{type, const_cast<void*>(value), length};
}

const CK_BBOOL kTrue = CK_TRUE;
const CK_BBOOL kFalse = CK_FALSE;

}  // namespace

CallFailed::CallFailed(const std::string& call, CK_RV rv)
    : std::runtime_error(call + " returned " + rvText(rv)), rv(rv) {}

void check(const char* call, CK_RV rv) {
    if (rv != CKR_OK) throw CallFailed(call, rv);
}

ProxyLibrary::ProxyLibrary(const std::string& library, const std::string& serverId) {
    void* handle = dlopen(library.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (!handle) throw std::runtime_error(std::string("cannot load ") + dlerror());
    auto init = reinterpret_cast<int32_t (*)(const char*)>(dlsym(handle, "vokpkcs11_client_init"));
    deinit_ = reinterpret_cast<int (*)()>(dlsym(handle, "vokpkcs11_client_deinit"));
    auto getter = reinterpret_cast<CK_C_GetFunctionList>(dlsym(handle, "C_GetFunctionList"));
    if (!init || !deinit_ || !getter) throw std::runtime_error(library + ": missing entry points");
    int32_t status = kConnectFailed;
    for (int attempt = 0; attempt < 100 && status == kConnectFailed; ++attempt) {
        status = init(serverId.c_str());
        if (status == kConnectFailed) std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
    if (status != 0)
        throw std::runtime_error("vokpkcs11_client_init: status " + std::to_string(status));
    check("C_GetFunctionList", getter(&functions_));
}

// The library stays loaded: its function list lives as long as it does and is
// never freed, so unloading it would only lose that list.
ProxyLibrary::~ProxyLibrary() {
    if (deinit_) deinit_();
}

Session::Session(CK_FUNCTION_LIST* f) : f_(f) {
    CK_SLOT_ID slots[16] = {0};
    CK_ULONG count = 16;
    check("C_GetSlotList", f_->C_GetSlotList(CK_TRUE, slots, &count));
    if (count == 0) throw std::runtime_error("no slot with a token");
    slot_ = slots[0];
    check("C_OpenSession", f_->C_OpenSession(slot_, CKF_SERIAL_SESSION | CKF_RW_SESSION, nullptr,
                                             nullptr, &handle_));
}

Session::~Session() {
    if (handle_ != CK_INVALID_HANDLE) f_->C_CloseSession(handle_);
}

void Session::login(const std::string& userPin) {
    Bytes pin(userPin.begin(), userPin.end());
    pin.push_back(0);  // the proxy sends the PIN as a C string
    check("C_Login", f_->C_Login(handle_, CKU_USER, pin.data(), userPin.size()));
}

CK_OBJECT_HANDLE Session::generateAes256(bool extractable) {
    const CK_ULONG length = 32;
    const CK_OBJECT_CLASS secret = CKO_SECRET_KEY;
    const CK_KEY_TYPE aes = CKK_AES;
    CK_ATTRIBUTE key[] = {
        attr(CKA_CLASS, &secret, sizeof secret),
        attr(CKA_KEY_TYPE, &aes, sizeof aes),
        attr(CKA_VALUE_LEN, &length, sizeof length),
        attr(CKA_TOKEN, &kFalse, 1),
        attr(CKA_ENCRYPT, &kTrue, 1),
        attr(CKA_DECRYPT, &kTrue, 1),
        attr(CKA_SENSITIVE, extractable ? &kFalse : &kTrue, 1),
        attr(CKA_EXTRACTABLE, extractable ? &kTrue : &kFalse, 1),
    };
    CK_MECHANISM generate = {CKM_AES_KEY_GEN, nullptr, 0};
    CK_OBJECT_HANDLE handle = CK_INVALID_HANDLE;
    check("C_GenerateKey",
          f_->C_GenerateKey(handle_, &generate, key, sizeof key / sizeof *key, &handle));
    return handle;
}

void Session::generateEcP256(CK_OBJECT_HANDLE* publicKey, CK_OBJECT_HANDLE* privateKey) {
    // DER of the named curve's object identifier, 1.2.840.10045.3.1.7.
    static const CK_BYTE kP256[] = {0x06, 0x08, 0x2a, 0x86, 0x48, 0xce, 0x3d, 0x03, 0x01, 0x07};
    CK_ATTRIBUTE publicTemplate[] = {
        attr(CKA_EC_PARAMS, kP256, sizeof kP256),
        attr(CKA_TOKEN, &kFalse, 1),
        attr(CKA_VERIFY, &kTrue, 1),
    };
    CK_ATTRIBUTE privateTemplate[] = {
        attr(CKA_TOKEN, &kFalse, 1),
        attr(CKA_SIGN, &kTrue, 1),
        attr(CKA_DERIVE, &kTrue, 1),
        attr(CKA_SENSITIVE, &kTrue, 1),
    };
    CK_MECHANISM generate = {CKM_EC_KEY_PAIR_GEN, nullptr, 0};
    check("C_GenerateKeyPair", f_->C_GenerateKeyPair(handle_, &generate, publicTemplate, 3,
                                                     privateTemplate, 4, publicKey, privateKey));
}

void Session::generateRsa2048(CK_OBJECT_HANDLE* publicKey, CK_OBJECT_HANDLE* privateKey) {
    const CK_ULONG bits = 2048;
    static const CK_BYTE kExponent[] = {0x01, 0x00, 0x01};
    CK_ATTRIBUTE publicTemplate[] = {
        attr(CKA_MODULUS_BITS, &bits, sizeof bits),
        attr(CKA_PUBLIC_EXPONENT, kExponent, sizeof kExponent),
        attr(CKA_TOKEN, &kFalse, 1),
        attr(CKA_VERIFY, &kTrue, 1),
    };
    CK_ATTRIBUTE privateTemplate[] = {
        attr(CKA_TOKEN, &kFalse, 1),
        attr(CKA_SIGN, &kTrue, 1),
        attr(CKA_SENSITIVE, &kTrue, 1),
    };
    CK_MECHANISM generate = {CKM_RSA_PKCS_KEY_PAIR_GEN, nullptr, 0};
    check("C_GenerateKeyPair", f_->C_GenerateKeyPair(handle_, &generate, publicTemplate, 4,
                                                     privateTemplate, 3, publicKey, privateKey));
}

Bytes Session::attribute(CK_OBJECT_HANDLE object, CK_ATTRIBUTE_TYPE type, size_t capacity) {
    Bytes value(capacity, 0);
    CK_ATTRIBUTE read = {type, value.data(), value.size()};
    check("C_GetAttributeValue", f_->C_GetAttributeValue(handle_, object, &read, 1));
    if (read.ulValueLen > value.size()) throw CallFailed("C_GetAttributeValue", CKR_GENERAL_ERROR);
    value.resize(read.ulValueLen);
    return value;
}

// The output of a single-part call: a zero-filled buffer of `capacity` bytes.
template <class Call>
Bytes output(const char* name, size_t capacity, Call call) {
    Bytes out(capacity, 0);
    CK_ULONG length = out.size();
    check(name, call(out.data(), &length));
    if (length > out.size()) throw CallFailed(name, CKR_GENERAL_ERROR);
    out.resize(length);
    return out;
}

Bytes Session::encrypt(CK_MECHANISM mechanism, CK_OBJECT_HANDLE key, const Bytes& data) {
    check("C_EncryptInit", f_->C_EncryptInit(handle_, &mechanism, key));
    Bytes in = data;
    return output("C_Encrypt", data.size() + 64, [&](CK_BYTE* out, CK_ULONG* length) {
        return f_->C_Encrypt(handle_, in.data(), in.size(), out, length);
    });
}

Bytes Session::decrypt(CK_MECHANISM mechanism, CK_OBJECT_HANDLE key, const Bytes& data) {
    check("C_DecryptInit", f_->C_DecryptInit(handle_, &mechanism, key));
    Bytes in = data;
    return output("C_Decrypt", data.size() + 64, [&](CK_BYTE* out, CK_ULONG* length) {
        return f_->C_Decrypt(handle_, in.data(), in.size(), out, length);
    });
}

Bytes Session::sign(CK_MECHANISM mechanism, CK_OBJECT_HANDLE key, const Bytes& data) {
    check("C_SignInit", f_->C_SignInit(handle_, &mechanism, key));
    Bytes in = data;
    return output("C_Sign", 1024, [&](CK_BYTE* out, CK_ULONG* length) {
        return f_->C_Sign(handle_, in.data(), in.size(), out, length);
    });
}

Bytes Session::deriveEcdh(CK_OBJECT_HANDLE privateKey, const Bytes& peerPoint) {
    Bytes point = peerPoint;
    CK_ECDH1_DERIVE_PARAMS ecdh = {CKD_NULL, 0, nullptr, point.size(), point.data()};
    CK_MECHANISM derive = {CKM_ECDH1_DERIVE, &ecdh, sizeof ecdh};
    const CK_OBJECT_CLASS secret = CKO_SECRET_KEY;
    const CK_KEY_TYPE generic = CKK_GENERIC_SECRET;
    const CK_ULONG length = 32;
    CK_ATTRIBUTE key[] = {
        attr(CKA_CLASS, &secret, sizeof secret),
        attr(CKA_KEY_TYPE, &generic, sizeof generic),
        attr(CKA_VALUE_LEN, &length, sizeof length),
        attr(CKA_TOKEN, &kFalse, 1),
        attr(CKA_SENSITIVE, &kFalse, 1),
        attr(CKA_EXTRACTABLE, &kTrue, 1),
    };
    CK_OBJECT_HANDLE derived = CK_INVALID_HANDLE;
    check("C_DeriveKey",
          f_->C_DeriveKey(handle_, &derive, privateKey, key, sizeof key / sizeof *key, &derived));
    return attribute(derived, CKA_VALUE);
}

CK_RV Session::verify(CK_MECHANISM mechanism, CK_OBJECT_HANDLE key, const Bytes& data,
                      const Bytes& signature) {
    check("C_VerifyInit", f_->C_VerifyInit(handle_, &mechanism, key));
    Bytes in = data, sig = signature;
    check("C_VerifyUpdate", f_->C_VerifyUpdate(handle_, in.data(), in.size()));
    return f_->C_VerifyFinal(handle_, sig.data(), sig.size());
}

Bytes Session::sha256(const Bytes& data) {
    CK_MECHANISM sha = {CKM_SHA256, nullptr, 0};
    check("C_DigestInit", f_->C_DigestInit(handle_, &sha));
    Bytes in = data;
    if (in.empty())
        return output("C_DigestFinal", 64, [&](CK_BYTE* out, CK_ULONG* length) {
            return f_->C_DigestFinal(handle_, out, length);
        });
    return output("C_Digest", 64, [&](CK_BYTE* out, CK_ULONG* length) {
        return f_->C_Digest(handle_, in.data(), in.size(), out, length);
    });
}

Bytes Session::random(size_t length) {
    Bytes out(length, 0);
    check("C_GenerateRandom", f_->C_GenerateRandom(handle_, out.data(), out.size()));
    return out;
}

std::string trimmed(const CK_UTF8CHAR* text, size_t size) {
    std::string s(reinterpret_cast<const char*>(text), size);
    const size_t end = s.find_last_not_of(std::string(" \0", 2));
    return end == std::string::npos ? std::string() : s.substr(0, end + 1);
}

std::string hex(const Bytes& bytes) {
    static const char kDigits[] = "0123456789abcdef";
    std::string text;
    for (unsigned char b : bytes) {
        text += kDigits[b >> 4];
        text += kDigits[b & 15];
    }
    return text;
}

}  // namespace demo
}  // namespace vok
