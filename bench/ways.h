#ifndef VOK_BENCH_WAYS_H
#define VOK_BENCH_WAYS_H

// The three ways the benchmark reaches one SoftHSM2 token, each through the
// packed interface of this system, and the operations it times on each.
//
//   direct   the module bridge loaded in this process, calling SoftHSM2
//   proxy    libQuorvelPkcs11Wrapper.so -> socket -> Java service host ->
//            module bridge -> SoftHSM2
//   p11-kit  a second copy of the module bridge calling p11-kit-client.so ->
//            socket -> `p11-kit server` -> SoftHSM2
//
// Every way crosses the module bridge exactly once, so the bridge's small
// conversion cost falls on all three alike.

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

#include "pkcs11_calls.h"

namespace vok {
namespace bench {

struct Way {
    std::string name;
    CK_FUNCTION_LIST* f = nullptr;
    std::unique_ptr<demo::Session> session;
    CK_OBJECT_HANDLE ecPrivate = CK_INVALID_HANDLE;
    CK_OBJECT_HANDLE aesKey = CK_INVALID_HANDLE;
    std::string failure;  // set once an operation failed on this way: its cells stop

    CK_SESSION_HANDLE handle() const { return session->handle(); }
};

// Loads a copy of the module bridge serving `module` (the bridge reads its
// module's name from the environment once, when first asked for its list, so
// each copy must be a file of its own) and returns its function list.
CK_FUNCTION_LIST* loadBridge(const std::string& bridgeCopy, const std::string& module);

// C_Initialize, a read/write session on the first slot with a token, login,
// and the session keys the operations use. Throws on failure.
void prepareWay(Way& way, const std::string& userPin);

// Buffers shared by every operation; inputs are filled once.
struct Scratch {
    Scratch();
    std::vector<CK_BYTE> data;  // the largest input, 1 MiB
    std::vector<CK_BYTE> out;   // zeroed before each call: the proxy sends it as a C string
    CK_BYTE digest[32];         // what ECDSA signs
    CK_BYTE iv[16];
};

// One timed operation: `prepare` (untimed: the Init call an operation needs,
// zeroing the output) then `call` (timed). Each returns a CK_RV.
struct Operation {
    const char* name;
    const char* key;    // short name for the JSON and the chart
    size_t bytes;       // payload that crosses, for MB/s; 0 for none
    size_t floorBytes;  // the ping-pong it compares with
    double p11kitGoal;  // the proxy's time at most this times p11-kit's; 0: none
    double floorGoal;   // the proxy's time at most this times the floor's; 0: none
    CK_RV (*prepare)(Way&, Scratch&);
    CK_RV (*call)(Way&, Scratch&);
};

const std::vector<Operation>& operations();

// The memory probe's calls: the i-th of a cycle of small calls, and a SHA-256
// C_Digest of all of `data`.
CK_RV smallCall(Way& way, Scratch& scratch, size_t i);
CK_RV digestOf(Way& way, std::vector<CK_BYTE>& data);

}  // namespace bench
}  // namespace vok

#endif
