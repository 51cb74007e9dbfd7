// Arbitrary answers from a service into every proxy. The caller's buffers,
// structures and templates each end at a guard page, so a proxy that writes
// (or reads) one byte beyond what the caller gave faults at once.
//
// An input is read with FuzzedDataProvider: from its end the proxy (one
// byte), how the answer travels (one byte) and the answer's length (two
// bytes); then the answer from its front; then, from the end again, the
// caller's arguments as the proxy's entry draws them. The answer travels
// either as the payload of a correct frame, or as raw bytes (header
// included) after which this test's service closes the connection. Every
// input starts on a new connection.

#include <fuzzer/FuzzedDataProvider.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "by_value_layouts.h"
#include "comm_internal.h"
#include "fuzz_support.h"
#include "vok_pkcs11.h"

namespace {

using vok::layout::Kind;
using vok::layout::Layout;
using vok::layout::Member;

// ---- The service: answers every request as the current input says ---------------

struct Script {
    bool raw = false;
    std::string answer;
};
std::mutex scriptLock;
Script script;

bool readAll(int fd, void* buffer, size_t length) {
    return length == 0 || recv(fd, buffer, length, MSG_WAITALL) == static_cast<ssize_t>(length);
}
void writeAll(int fd, const std::string& bytes) {
    if (!bytes.empty()) send(fd, bytes.data(), bytes.size(), MSG_NOSIGNAL);
}

void serve(int fd) {
    FrameHeader header;
    int32_t version;
    if (!readAll(fd, &header, sizeof(header)) || !readAll(fd, &version, sizeof(version))) return;
    writeAll(fd, vokfuzz::frame(FRAME_ID_VERSION, FRAME_TYPE_RESPONSE, std::string("\1\0\0\0", 4)));
    std::vector<char> request;
    while (readAll(fd, &header, sizeof(header)) && header.data_len > 0) {
        request.resize(static_cast<size_t>(header.data_len));
        if (!readAll(fd, request.data(), request.size())) return;
        Script now;
        {
            std::lock_guard<std::mutex> lock(scriptLock);
            now = script;
        }
        if (now.raw) return writeAll(fd, now.answer);
        writeAll(fd, vokfuzz::frame(FRAME_ID_PKCS11, FRAME_TYPE_RESPONSE, now.answer));
    }
}

void runService(int listener) {
    for (;;) {
        int fd = accept(listener, nullptr, nullptr);
        if (fd < 0) continue;
        serve(fd);
        close(fd);
    }
}

// ---- The caller: arguments drawn from the input, in guarded memory --------------

vokfuzz::GuardedMemory memory(512);
std::vector<CK_MECHANISM_TYPE> structuredMechanisms;

class Draw {
public:
    explicit Draw(FuzzedDataProvider& in) : in_(in) {}

    CK_ULONG number() { return in_.ConsumeIntegral<uint8_t>(); }
    CK_BBOOL flag() { return in_.ConsumeBool(); }
    CK_ULONG size() { return in_.ConsumeIntegralInRange<CK_ULONG>(0, 48); }
    bool null() { return in_.ConsumeIntegralInRange<uint8_t>(0, 7) == 0; }

    // A buffer the proxy reads: exactly `n` bytes, no zero among them.
    CK_BYTE_PTR bytes(CK_ULONG n) { return static_cast<CK_BYTE_PTR>(memory.place(n)); }
    struct Input {
        CK_BYTE_PTR p;
        CK_ULONG n;
    };
    Input input() {
        const CK_ULONG n = size();
        return {null() ? nullptr : bytes(n), n};
    }
    // A buffer the proxy writes, with its in/out length.
    struct Output {
        CK_BYTE_PTR p;
        CK_ULONG_PTR length;
    };
    Output output() {
        const CK_ULONG n = size();
        CK_ULONG_PTR length = memory.place<CK_ULONG>();
        *length = n;
        return {null() ? nullptr : bytes(n), length};
    }
    template <class T>
    T* out() {
        return null() ? nullptr : memory.place<T>();
    }
    // A list of handles or ids with its in/out count.
    struct List {
        CK_ULONG_PTR p;
        CK_ULONG_PTR count;
        CK_ULONG capacity;
    };
    List list() {
        const CK_ULONG n = in_.ConsumeIntegralInRange<CK_ULONG>(0, 8);
        CK_ULONG_PTR count = memory.place<CK_ULONG>();
        *count = n;
        return {null() ? nullptr : memory.place<CK_ULONG>(n), count, n};
    }

    struct Template {
        CK_ATTRIBUTE_PTR p = nullptr;
        CK_ULONG count = 0;
    };
    Template attributes(int depth = 0) {
        static const CK_ATTRIBUTE_TYPE kTypes[] = {
            CKA_CLASS,   CKA_LABEL,         CKA_VALUE,           CKA_TOKEN,          CKA_VALUE_LEN,
            CKA_MODULUS, CKA_WRAP_TEMPLATE, CKA_UNWRAP_TEMPLATE, CKA_DERIVE_TEMPLATE};
        const CK_ULONG n = in_.ConsumeIntegralInRange<CK_ULONG>(0, 4);
        if (null()) return {nullptr, n};
        CK_ATTRIBUTE_PTR t = memory.place<CK_ATTRIBUTE>(n);
        for (CK_ULONG i = 0; t && i < n; ++i) {
            t[i].type = in_.PickValueInArray(kTypes);
            // A template's value is an array of attributes, never raw bytes:
            // those would be pointers of nobody's.
            if (vok::layout::isTemplateAttribute(t[i].type)) {
                Template inner = depth < 2 && !null() ? attributes(depth + 1) : Template{};
                t[i].pValue = inner.p;
                t[i].ulValueLen = inner.count * sizeof(CK_ATTRIBUTE);
            } else {
                t[i].ulValueLen = size();
                t[i].pValue = null() ? nullptr : bytes(t[i].ulValueLen);
            }
        }
        return {t, n};
    }

    CK_MECHANISM_PTR mechanism() {
        if (null()) return nullptr;
        CK_MECHANISM_PTR m = memory.place<CK_MECHANISM>();
        if (!m) return nullptr;
        switch (in_.ConsumeIntegralInRange(0, 2)) {
            case 0:  // a parameter of raw bytes
                m->mechanism = CKM_AES_CBC;
                m->ulParameterLen = size();
                m->pParameter = null() ? nullptr : bytes(m->ulParameterLen);
                break;
            default: {  // a structure that holds pointers, some of them written back
                m->mechanism = structuredMechanisms[in_.ConsumeIntegralInRange<size_t>(
                    0, structuredMechanisms.size() - 1)];
                const Layout& l = *vok::layout::forMechanism(m->mechanism);
                m->pParameter = structure(l, nullptr, nullptr, 0);
                m->ulParameterLen = l.size;
            }
        }
        return m;
    }

private:
    void* structure(const Layout& l, const Layout* parentLayout, void* parent, int depth) {
        void* s = memory.place(l.size);
        if (!s) return nullptr;
        // Numbers first: buffers take their lengths from them.
        for (size_t i = 0; i < l.count; ++i) {
            const Member& m = l.members[i];
            if (m.kind == Kind::kNumber || m.kind == Kind::kByte)
                vok::layout::writeNumber(m, s, in_.ConsumeIntegralInRange<uint64_t>(0, 48));
        }
        for (size_t i = 0; i < l.count; ++i) {
            const Member& m = l.members[i];
            if (m.kind == Kind::kStructure)
                vok::layout::writePointer(
                    m, s, depth < 3 && !null() ? structure(*m.pointee, &l, s, depth + 1) : nullptr);
        }
        for (size_t i = 0; i < l.count; ++i) {
            const Member& m = l.members[i];
            if (m.kind != Kind::kBuffer) continue;
            const CK_ULONG n = vok::layout::bufferLength(l, m, s, parentLayout, parent);
            vok::layout::writePointer(m, s, null() ? nullptr : bytes(n));
        }
        return s;
    }

    FuzzedDataProvider& in_;
};

using F = CK_FUNCTION_LIST_PTR;
struct Proxy {
    const char* name;
    CK_RV (*call)(F, Draw&);
};

// clang-format off
#define PROXY(name, ...) {#name, [](F f, [[maybe_unused]] Draw& d) -> CK_RV { __VA_ARGS__ }}
#define IN_OUT(name) PROXY(name, auto i = d.input(); auto o = d.output(); \
                                 return f->name(d.number(), i.p, i.n, o.p, o.length);)
#define OUT(name) PROXY(name, auto o = d.output(); return f->name(d.number(), o.p, o.length);)
#define IN(name) PROXY(name, auto i = d.input(); return f->name(d.number(), i.p, i.n);)
#define INIT(name) PROXY(name, return f->name(d.number(), d.mechanism(), d.number());)
#define SESSION(name) PROXY(name, return f->name(d.number());)

// In the function list's order, C_GetFunctionList left out.
const Proxy kProxies[] = {
    PROXY(C_Initialize, return f->C_Initialize(d.out<CK_C_INITIALIZE_ARGS>());),
    PROXY(C_Finalize, return f->C_Finalize(nullptr);),
    PROXY(C_GetInfo, return f->C_GetInfo(d.out<CK_INFO>());),
    PROXY(C_GetSlotList, auto l = d.list(); return f->C_GetSlotList(d.flag(), l.p, l.count);),
    PROXY(C_GetSlotInfo, return f->C_GetSlotInfo(d.number(), d.out<CK_SLOT_INFO>());),
    PROXY(C_GetTokenInfo, return f->C_GetTokenInfo(d.number(), d.out<CK_TOKEN_INFO>());),
    PROXY(C_GetMechanismList, auto l = d.list();
          return f->C_GetMechanismList(d.number(), l.p, l.count);),
    PROXY(C_GetMechanismInfo,
          return f->C_GetMechanismInfo(d.number(), d.number(), d.out<CK_MECHANISM_INFO>());),
    PROXY(C_InitToken, auto i = d.input();
          return f->C_InitToken(d.number(), i.p, i.n, d.bytes(32));),
    IN(C_InitPIN),
    PROXY(C_SetPIN, auto a = d.input(); auto b = d.input();
          return f->C_SetPIN(d.number(), a.p, a.n, b.p, b.n);),
    PROXY(C_OpenSession, return f->C_OpenSession(d.number(), d.number(), nullptr, nullptr,
                                                 d.out<CK_SESSION_HANDLE>());),
    SESSION(C_CloseSession),
    SESSION(C_CloseAllSessions),
    PROXY(C_GetSessionInfo, return f->C_GetSessionInfo(d.number(), d.out<CK_SESSION_INFO>());),
    OUT(C_GetOperationState),
    PROXY(C_SetOperationState, auto i = d.input();
          return f->C_SetOperationState(d.number(), i.p, i.n, d.number(), d.number());),
    PROXY(C_Login, auto i = d.input(); return f->C_Login(d.number(), d.number(), i.p, i.n);),
    SESSION(C_Logout),
    PROXY(C_CreateObject, auto t = d.attributes();
          return f->C_CreateObject(d.number(), t.p, t.count, d.out<CK_OBJECT_HANDLE>());),
    PROXY(C_CopyObject, auto t = d.attributes();
          return f->C_CopyObject(d.number(), d.number(), t.p, t.count,
                                 d.out<CK_OBJECT_HANDLE>());),
    PROXY(C_DestroyObject, return f->C_DestroyObject(d.number(), d.number());),
    PROXY(C_GetObjectSize,
          return f->C_GetObjectSize(d.number(), d.number(), d.out<CK_ULONG>());),
    PROXY(C_GetAttributeValue, auto t = d.attributes();
          return f->C_GetAttributeValue(d.number(), d.number(), t.p, t.count);),
    PROXY(C_SetAttributeValue, auto t = d.attributes();
          return f->C_SetAttributeValue(d.number(), d.number(), t.p, t.count);),
    PROXY(C_FindObjectsInit, auto t = d.attributes();
          return f->C_FindObjectsInit(d.number(), t.p, t.count);),
    PROXY(C_FindObjects, auto l = d.list();
          return f->C_FindObjects(d.number(), l.p, l.capacity, d.out<CK_ULONG>());),
    SESSION(C_FindObjectsFinal),
    INIT(C_EncryptInit), IN_OUT(C_Encrypt), IN_OUT(C_EncryptUpdate), OUT(C_EncryptFinal),
    INIT(C_DecryptInit), IN_OUT(C_Decrypt), IN_OUT(C_DecryptUpdate), OUT(C_DecryptFinal),
    PROXY(C_DigestInit, return f->C_DigestInit(d.number(), d.mechanism());),
    IN_OUT(C_Digest), IN(C_DigestUpdate),
    PROXY(C_DigestKey, return f->C_DigestKey(d.number(), d.number());),
    OUT(C_DigestFinal),
    INIT(C_SignInit), IN_OUT(C_Sign), IN(C_SignUpdate), OUT(C_SignFinal),
    INIT(C_SignRecoverInit), IN_OUT(C_SignRecover),
    INIT(C_VerifyInit),
    PROXY(C_Verify, auto a = d.input(); auto b = d.input();
          return f->C_Verify(d.number(), a.p, a.n, b.p, b.n);),
    IN(C_VerifyUpdate), IN(C_VerifyFinal),
    INIT(C_VerifyRecoverInit), IN_OUT(C_VerifyRecover),
    IN_OUT(C_DigestEncryptUpdate), IN_OUT(C_DecryptDigestUpdate),
    IN_OUT(C_SignEncryptUpdate), IN_OUT(C_DecryptVerifyUpdate),
    PROXY(C_GenerateKey, auto m = d.mechanism(); auto t = d.attributes();
          return f->C_GenerateKey(d.number(), m, t.p, t.count, d.out<CK_OBJECT_HANDLE>());),
    PROXY(C_GenerateKeyPair, auto m = d.mechanism(); auto pub = d.attributes();
          auto priv = d.attributes();
          return f->C_GenerateKeyPair(d.number(), m, pub.p, pub.count, priv.p, priv.count,
                                      d.out<CK_OBJECT_HANDLE>(), d.out<CK_OBJECT_HANDLE>());),
    PROXY(C_WrapKey, auto m = d.mechanism(); auto o = d.output();
          return f->C_WrapKey(d.number(), m, d.number(), d.number(), o.p, o.length);),
    PROXY(C_UnwrapKey, auto m = d.mechanism(); auto i = d.input(); auto t = d.attributes();
          return f->C_UnwrapKey(d.number(), m, d.number(), i.p, i.n, t.p, t.count,
                                d.out<CK_OBJECT_HANDLE>());),
    PROXY(C_DeriveKey, auto m = d.mechanism(); auto t = d.attributes();
          return f->C_DeriveKey(d.number(), m, d.number(), t.p, t.count,
                                d.out<CK_OBJECT_HANDLE>());),
    IN(C_SeedRandom),
    IN(C_GenerateRandom),
    SESSION(C_GetFunctionStatus),
    SESSION(C_CancelFunction),
    PROXY(C_WaitForSlotEvent,
          return f->C_WaitForSlotEvent(d.number(), d.out<CK_SLOT_ID>(), nullptr);),
};
// clang-format on

#define VOK_FUZZ_NAME(name, params) #name,
const char* const kListOrder[] = {VOK_CK_FUNCTIONS(VOK_FUZZ_NAME)};

std::string id;
CK_FUNCTION_LIST_PTR functions = nullptr;

}  // namespace

extern "C" int LLVMFuzzerInitialize(int*, char***) {
    vokfuzz::quietLogs();
    // The table must follow the list's order: the corpus names proxies by it.
    for (size_t i = 0, j = 0; i < sizeof kListOrder / sizeof kListOrder[0]; ++i) {
        if (std::strcmp(kListOrder[i], "C_GetFunctionList") == 0) continue;
        if (j >= sizeof kProxies / sizeof kProxies[0] ||
            std::strcmp(kProxies[j++].name, kListOrder[i]) != 0)
            __builtin_trap();
    }
    for (CK_MECHANISM_TYPE type = 0; type < 0x2000; ++type)
        if (vok::layout::forMechanism(type)) structuredMechanisms.push_back(type);

    id = vokfuzz::serverId("client");
    int listener = socket(AF_UNIX, SOCK_STREAM, 0);
    sockaddr_un address;
    vokcomm::buildSocketAddress(id.c_str(), &address);
    if (bind(listener, reinterpret_cast<sockaddr*>(&address), vokcomm::socketAddressLength()) !=
            0 ||
        listen(listener, 1) != 0)
        __builtin_trap();
    std::thread(runService, listener).detach();
    C_GetFunctionList(&functions);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    FuzzedDataProvider in(data, size);
    const Proxy& proxy =
        kProxies[in.ConsumeIntegral<uint8_t>() % (sizeof kProxies / sizeof kProxies[0])];
    {
        std::lock_guard<std::mutex> lock(scriptLock);
        script.raw = in.ConsumeIntegral<uint8_t>() & 1;
        script.answer = in.ConsumeBytesAsString(in.ConsumeIntegral<uint16_t>());
    }
    if (vokpkcs11_comm_client_init(id.c_str()) != CHANNEL_OK) __builtin_trap();
    Draw draw(in);
    proxy.call(functions, draw);
    vokpkcs11_comm_client_deinit();
    memory.reset();
    return 0;
}
