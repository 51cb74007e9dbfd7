// A native application process for the end-to-end tests: it loads the proxy
// library the way an application would, opens the channel to a service and
// drives PKCS#11 calls through the library's function list.
//
//   vok_e2e_client <library> <serverId> soak <rounds>
//       rounds of mixed calls on fresh random data, one line each: "round ok",
//       "round channel <call>" (the call got the channel's failure code; the
//       client stops there) or "WRONG <call>: <why>" (any other answer than
//       the one the data calls for); exit status 0 when none was wrong.
//   vok_e2e_client <library> <serverId> steps [--already-initialized]
//       one such round, C_Initialize answering exactly CKR_OK (or
//       CKR_CRYPTOKI_ALREADY_INITIALIZED).
//   vok_e2e_client <library> <serverId> call <function>...
//       prints "connected", then for each function (C_Initialize, C_GetInfo)
//       waits for a line on standard input, prints "calling <function>", makes
//       the call and prints "<function> rv=0x<rv> ms=<elapsed>".

#include <dlfcn.h>
#include <unistd.h>

#include <chrono>
#include <cstdint>
#include <cstdio>
#include <iostream>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "vok_pkcs11.h"

namespace {

constexpr CK_RV kChannelFailure = ~static_cast<CK_RV>(0);
constexpr int32_t kConnectFailed = 7;

std::string hexRv(CK_RV rv) {
    char text[32];
    std::snprintf(text, sizeof text, "0x%llx", static_cast<unsigned long long>(rv));
    return text;
}

// ---- The library ------------------------------------------------------------

struct Library {
    CK_FUNCTION_LIST_PTR functions = nullptr;
};

// Loads the library, opens its channel (waiting for a service that is still
// starting to listen) and fetches its function list; exits on failure.
Library openLibrary(const char* path, const char* serverId) {
    void* handle = dlopen(path, RTLD_NOW | RTLD_LOCAL);
    if (handle == nullptr) {
        std::cout << "FAIL load: " << dlerror() << std::endl;
        std::exit(2);
    }
    auto clientInit =
        reinterpret_cast<int32_t (*)(const char*)>(dlsym(handle, "vokpkcs11_client_init"));
    auto getFunctionList =
        reinterpret_cast<CK_C_GetFunctionList>(dlsym(handle, "C_GetFunctionList"));
    if (clientInit == nullptr || getFunctionList == nullptr) {
        std::cout << "FAIL load: missing entry points" << std::endl;
        std::exit(2);
    }
    int32_t status = kConnectFailed;
    for (int attempt = 0; attempt < 100 && status == kConnectFailed; ++attempt) {
        status = clientInit(serverId);
        if (status == kConnectFailed) std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
    if (status != 0) {
        std::cout << "FAIL vokpkcs11_client_init: status " << status << std::endl;
        std::exit(2);
    }
    Library library;
    CK_RV rv = getFunctionList(&library.functions);
    if (rv != CKR_OK || library.functions == nullptr) {
        std::cout << "FAIL C_GetFunctionList: rv " << hexRv(rv) << std::endl;
        std::exit(2);
    }
    return library;
}

// ---- Single calls on request ------------------------------------------------------

int runCalls(const Library& library, const std::vector<std::string>& functions) {
    std::cout << "connected" << std::endl;
    CK_FUNCTION_LIST_PTR f = library.functions;
    for (const std::string& function : functions) {
        std::string line;
        if (!std::getline(std::cin, line)) return 1;
        std::cout << "calling " << function << std::endl;
        auto start = std::chrono::steady_clock::now();
        CK_RV rv;
        CK_INFO info{};
        if (function == "C_Initialize")
            rv = f->C_Initialize(nullptr);
        else if (function == "C_GetInfo")
            rv = f->C_GetInfo(&info);
        else
            return 2;
        auto elapsed = std::chrono::duration_cast<std::chrono::milliseconds>(
            std::chrono::steady_clock::now() - start);
        std::cout << function << " rv=" << hexRv(rv) << " ms=" << elapsed.count() << std::endl;
    }
    return 0;
}

// ---- Rounds of mixed calls ------------------------------------------------------

// A call's rv or an output was not as expected.
struct Failure {
    std::string why;
};

void expectTrue(bool condition, const std::string& what) {
    if (!condition) throw Failure{what};
}

// A round gives up at the channel's failure code: the service may be gone.
struct ChannelLost {
    std::string call;
};

void expectRv(const char* call, CK_RV rv, CK_RV expected, CK_RV alsoFine = CKR_OK) {
    if (rv == kChannelFailure) throw ChannelLost{call};
    expectTrue(rv == expected || rv == alsoFine,
               std::string(call) + " returned " + hexRv(rv) + ", expected " + hexRv(expected));
}

CK_ATTRIBUTE attribute(CK_ATTRIBUTE_TYPE type, const void* value, CK_ULONG length) {
    return CK_ATTRIBUTE{type, const_cast<void*>(value), length};
}

std::string text(const void* bytes, CK_ULONG length) {
    return std::string(static_cast<const char*>(bytes), length);
}

CK_BYTE kIv[16] = {1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15, 16};
CK_MECHANISM kCbc = {CKM_AES_CBC, kIv, sizeof kIv};

// initialized: what C_Initialize must return; the soak test also takes
// CKR_CRYPTOKI_ALREADY_INITIALIZED.
void round(CK_FUNCTION_LIST_PTR f, std::mt19937& random, CK_RV initialized, CK_RV alsoFine) {
    std::string value(1 + random() % 200, '\0'), plain(16 * (1 + random() % 4), '\0');
    for (char& c : value) c = static_cast<char>(random());
    for (char& c : plain) c = static_cast<char>(random());
    expectRv("C_Initialize", f->C_Initialize(nullptr), initialized, alsoFine);
    // Clients killed earlier leave their sessions open; only this one is served now.
    expectRv("C_CloseAllSessions", f->C_CloseAllSessions(1), CKR_OK);
    CK_SESSION_HANDLE session = CK_INVALID_HANDLE;
    expectRv("C_OpenSession",
             f->C_OpenSession(1, CKF_SERIAL_SESSION | CKF_RW_SESSION, nullptr, nullptr, &session),
             CKR_OK);
    CK_OBJECT_CLASS dataClass = CKO_DATA;
    CK_ATTRIBUTE object[] = {attribute(CKA_CLASS, &dataClass, sizeof dataClass),
                             attribute(CKA_VALUE, value.data(), value.size())};
    CK_OBJECT_HANDLE data = CK_INVALID_HANDLE, key = CK_INVALID_HANDLE;
    expectRv("C_CreateObject", f->C_CreateObject(session, object, 2, &data), CKR_OK);
    // Handles above 32 bits: a truncating hop would hand back another.
    expectTrue(data > 0xFFFFFFFFUL, "C_CreateObject: handle " + std::to_string(data));
    std::vector<char> read(value.size() + 8);
    CK_ATTRIBUTE query = attribute(CKA_VALUE, read.data(), read.size());
    expectRv("C_GetAttributeValue", f->C_GetAttributeValue(session, data, &query, 1), CKR_OK);
    expectTrue(text(query.pValue, query.ulValueLen) == value, "C_GetAttributeValue: another value");
    CK_ULONG keyLength = 16;
    CK_ATTRIBUTE valueLen = attribute(CKA_VALUE_LEN, &keyLength, sizeof keyLength);
    CK_MECHANISM aes = {CKM_AES_KEY_GEN, nullptr, 0};
    expectRv("C_GenerateKey", f->C_GenerateKey(session, &aes, &valueLen, 1, &key), CKR_OK);
    std::vector<CK_BYTE> in(plain.begin(), plain.end()), out(plain.size() + 16);
    CK_ULONG length = out.size();
    expectRv("C_EncryptInit", f->C_EncryptInit(session, &kCbc, key), CKR_OK);
    expectRv("C_Encrypt", f->C_Encrypt(session, in.data(), in.size(), out.data(), &length), CKR_OK);
    expectTrue(length == plain.size() && text(out.data(), length) != plain, "C_Encrypt: output");
    in.assign(out.begin(), out.begin() + length);
    // The two-call form: the length first, then the data.
    length = 0;
    expectRv("C_DecryptInit", f->C_DecryptInit(session, &kCbc, key), CKR_OK);
    expectRv("C_Decrypt", f->C_Decrypt(session, in.data(), in.size(), nullptr, &length), CKR_OK);
    expectTrue(length == plain.size(), "C_Decrypt: length " + std::to_string(length));
    expectRv("C_Decrypt", f->C_Decrypt(session, in.data(), in.size(), out.data(), &length), CKR_OK);
    expectTrue(text(out.data(), length) == plain, "C_Decrypt: another plaintext");
    expectRv("C_DestroyObject", f->C_DestroyObject(session, data), CKR_OK);
    expectRv("C_DestroyObject", f->C_DestroyObject(session, key), CKR_OK);
    expectRv("C_CloseSession", f->C_CloseSession(session), CKR_OK);
}

int rounds(const Library& library, int count, CK_RV initialized, CK_RV alsoFine) {
    std::mt19937 random(static_cast<unsigned>(getpid()));
    int wrong = 0;
    for (int i = 0; i < count; ++i) {
        try {
            round(library.functions, random, initialized, alsoFine);
            std::cout << "round ok" << std::endl;
        } catch (const ChannelLost& lost) {
            // As an application would, it starts again in a new process.
            std::cout << "round channel " << lost.call << std::endl;
            break;
        } catch (const Failure& failure) {
            std::cout << "WRONG " << failure.why << std::endl;
            ++wrong;
        }
    }
    return wrong == 0 ? 0 : 1;
}

}  // namespace

int main(int argc, char** argv) {
    std::vector<std::string> args(argv + 1, argv + argc);
    if (args.size() < 3) {
        std::cerr << "usage: vok_e2e_client <library> <serverId> steps [--already-initialized]\n"
                     "       vok_e2e_client <library> <serverId> call <function>...\n"
                     "       vok_e2e_client <library> <serverId> soak <rounds>\n";
        return 2;
    }
    const std::string& mode = args[2];
    if (mode == "steps") {
        const CK_RV initialized = args.size() > 3 && args[3] == "--already-initialized"
                                      ? CKR_CRYPTOKI_ALREADY_INITIALIZED
                                      : CKR_OK;
        return rounds(openLibrary(args[0].c_str(), args[1].c_str()), 1, initialized, initialized);
    }
    if (mode == "soak" && args.size() > 3)
        return rounds(openLibrary(args[0].c_str(), args[1].c_str()), std::stoi(args[3]), CKR_OK,
                      CKR_CRYPTOKI_ALREADY_INITIALIZED);
    if (mode == "call")
        return runCalls(openLibrary(args[0].c_str(), args[1].c_str()),
                        std::vector<std::string>(args.begin() + 3, args.end()));
    std::cerr << "unknown mode " << mode << "\n";
    return 2;
}
