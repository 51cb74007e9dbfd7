#include "ways.h"

#include <dlfcn.h>

#include <cstdlib>
#include <cstring>
#include <stdexcept>

namespace vok {
namespace bench {

namespace {

constexpr size_t kKiB = 1024, kMiB = 1024 * 1024;

CK_RV zeroOutput(Way&, Scratch& s) {
    std::memset(s.out.data(), 0, 64);
    return CKR_OK;
}

CK_RV digestInit(Way& w, Scratch& s) {
    CK_MECHANISM sha256 = {CKM_SHA256, nullptr, 0};
    std::memset(s.out.data(), 0, 64);
    return w.f->C_DigestInit(w.handle(), &sha256);
}

template <size_t N>
CK_RV digest(Way& w, Scratch& s) {
    CK_ULONG length = 64;
    return w.f->C_Digest(w.handle(), s.data.data(), N, s.out.data(), &length);
}

CK_RV signInit(Way& w, Scratch& s) {
    CK_MECHANISM ecdsa = {CKM_ECDSA, nullptr, 0};
    std::memset(s.out.data(), 0, 128);
    return w.f->C_SignInit(w.handle(), &ecdsa, w.ecPrivate);
}

CK_RV sign(Way& w, Scratch& s) {
    CK_ULONG length = 128;
    return w.f->C_Sign(w.handle(), s.digest, sizeof s.digest, s.out.data(), &length);
}

constexpr size_t kEncryptOut = 4 * kKiB + 64;

CK_RV encryptInit(Way& w, Scratch& s) {
    CK_MECHANISM cbcPad = {CKM_AES_CBC_PAD, s.iv, sizeof s.iv};
    std::memset(s.out.data(), 0, kEncryptOut);
    return w.f->C_EncryptInit(w.handle(), &cbcPad, w.aesKey);
}

CK_RV encrypt(Way& w, Scratch& s) {
    CK_ULONG length = kEncryptOut;
    return w.f->C_Encrypt(w.handle(), s.data.data(), 4 * kKiB, s.out.data(), &length);
}

CK_RV getInfo(Way& w, Scratch&) {
    CK_INFO info;
    return w.f->C_GetInfo(&info);
}

CK_RV getSlotList(Way& w, Scratch&) {
    CK_SLOT_ID slots[8] = {0};
    CK_ULONG count = 8;
    return w.f->C_GetSlotList(CK_TRUE, slots, &count);
}

CK_RV random32(Way& w, Scratch& s) { return w.f->C_GenerateRandom(w.handle(), s.out.data(), 32); }

CK_RV none(Way&, Scratch&) { return CKR_OK; }

}  // namespace

CK_FUNCTION_LIST* loadBridge(const std::string& bridgeCopy, const std::string& module) {
    setenv("VOK_BRIDGE_MODULE", module.c_str(), 1);
    void* handle = dlopen(bridgeCopy.c_str(), RTLD_NOW | RTLD_LOCAL);
    if (!handle) throw std::runtime_error(std::string("cannot load ") + dlerror());
    auto getter = reinterpret_cast<CK_C_GetFunctionList>(dlsym(handle, "C_GetFunctionList"));
    if (!getter) throw std::runtime_error(bridgeCopy + ": no C_GetFunctionList");
    CK_FUNCTION_LIST* functions = nullptr;
    demo::check("C_GetFunctionList", getter(&functions));
    unsetenv("VOK_BRIDGE_MODULE");
    return functions;
}

void prepareWay(Way& way, const std::string& userPin) {
    demo::check("C_Initialize", way.f->C_Initialize(nullptr));
    way.session.reset(new demo::Session(way.f));
    way.session->login(userPin);
    CK_OBJECT_HANDLE ecPublic;
    way.session->generateEcP256(&ecPublic, &way.ecPrivate);
    way.aesKey = way.session->generateAes256(false);
}

Scratch::Scratch() : data(kMiB), out(kEncryptOut) {
    for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<CK_BYTE>(i * 131 + 7);
    for (size_t i = 0; i < sizeof digest; ++i) digest[i] = static_cast<CK_BYTE>(0xa0 + i);
    for (size_t i = 0; i < sizeof iv; ++i) iv[i] = static_cast<CK_BYTE>(i);
}

const std::vector<Operation>& operations() {
    // The goals: small calls within 0.8 of p11-kit and 1.3 of the bare 32-byte
    // exchange; a 4 KiB digest and a signature within 0.8 of p11-kit; a 1 MiB
    // digest at 1.2 times p11-kit's throughput.
    static const std::vector<Operation> table = {
        {"C_GetInfo", "getinfo", 0, 32, 0.8, 1.3, none, getInfo},
        {"C_GetSlotList", "slotlist", 0, 32, 0.8, 1.3, none, getSlotList},
        {"C_GenerateRandom 32 B", "random32", 0, 32, 0.8, 1.3, zeroOutput, random32},
        {"C_Digest SHA-256 64 B", "digest64", 64, 32, 0, 0, digestInit, digest<64>},
        {"C_Digest SHA-256 4 KiB", "digest4k", 4 * kKiB, 4 * kKiB, 0.8, 0, digestInit,
         digest<4 * kKiB>},
        {"C_Digest SHA-256 1 MiB", "digest1m", kMiB, kMiB, 1 / 1.2, 0, digestInit, digest<kMiB>},
        {"C_Sign ECDSA P-256", "ecdsa", 0, 32, 0.8, 0, signInit, sign},
        {"C_Encrypt AES-CBC-PAD 4 KiB", "aes4k", 4 * kKiB, 4 * kKiB, 0, 0, encryptInit, encrypt},
    };
    return table;
}

CK_RV smallCall(Way& way, Scratch& scratch, size_t i) {
    switch (i % 3) {
        case 0:
            return getInfo(way, scratch);
        case 1:
            return getSlotList(way, scratch);
        default:
            return random32(way, scratch);
    }
}

CK_RV digestOf(Way& way, std::vector<CK_BYTE>& data) {
    CK_MECHANISM sha256 = {CKM_SHA256, nullptr, 0};
    CK_RV rv = way.f->C_DigestInit(way.handle(), &sha256);
    if (rv != CKR_OK) return rv;
    CK_BYTE out[64] = {0};
    CK_ULONG length = sizeof out;
    return way.f->C_Digest(way.handle(), data.data(), data.size(), out, &length);
}

}  // namespace bench
}  // namespace vok
