// The standard front over the real proxy library and a service in this process
// (the channel's real server end): each of the 68 entries, through the front's
// list and by its exported name, reaches the proxy of its name and returns the
// answer's result, or CKR_DEVICE_ERROR with a log line when the channel fails.

#include <dlfcn.h>
#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <atomic>
#include <cstring>
#include <string>

#include "host_pkcs11.h"
#include "log_capture.h"
#include "vok_comm.h"
#include "vok_proto.h"

namespace {

constexpr char kTag[] = "Vokpkcs11f_Front";

// A result of its own per function name, case aside (C_UnwrapKey travels as
// "C_UnWrapKey").
CK_RV code(const std::string& name) {
    CK_RV hash = 0;
    for (char c : name) hash = hash * 31 + static_cast<unsigned char>(c | 0x20);
    return 0x80000000UL | (hash & 0x7fffffff);
}

// The service answers each request with its code, or with nothing.
std::atomic<bool> gAnswer{true};
int32_t serve(const void* request, int32_t length, void** response, uint32_t* responseLength) {
    pkcs11::Operation op;
    op.ParseFromArray(request, length);
    pkcs11::OperationResult result;
    result.set_name(op.name());
    result.set_result(code(op.name()));
    const std::string answer = gAnswer ? result.SerializeAsString() : std::string();
    *response = new uint8_t[answer.size()];
    memcpy(*response, answer.data(), answer.size());
    *responseLength = static_cast<uint32_t>(answer.size());
    return 0;
}

// Zeros and NULLs, which every proxy takes.
template <class... Args>
CK_RV callEmpty(CK_RV (*f)(Args...)) {
    return f ? f(Args{}...) : CKR_GENERAL_ERROR;
}

// Each entry through the front's list and by its exported name.
struct Entry {
    const char* name;
    CK_RV (*viaList)(host::ck_function_list*);
    CK_RV (*viaName)(void* front);
};
#define VOK_TEST_ENTRY(name, params)                                      \
    {#name, [](host::ck_function_list* l) { return callEmpty(l->name); }, \
     [](void* f) { return callEmpty(reinterpret_cast<host::CK_##name>(dlsym(f, #name))); }},
const Entry kEntries[] = {VOK_CK_FUNCTIONS(VOK_TEST_ENTRY)};
#undef VOK_TEST_ENTRY

class Front : public ::testing::Test {
protected:
    void SetUp() override {
        setenv("VOK_SERVER_ID", id_.c_str(), 1);
        ASSERT_EQ(vokpkcs11_comm_server_init(id_.c_str(), serve), 0);
        front_ = dlopen(VOK_TEST_FRONT, RTLD_NOW | RTLD_LOCAL);
        ASSERT_NE(front_, nullptr) << dlerror();
        auto getter =
            reinterpret_cast<host::CK_C_GetFunctionList>(dlsym(front_, "C_GetFunctionList"));
        ASSERT_EQ(getter(&list_), CKR_OK);
    }
    const std::string id_ = "#vok-front-test-" + std::to_string(getpid());
    void* front_ = nullptr;
    host::ck_function_list* list_ = nullptr;
    voktest::LogCapture log_;
};

// The first call with the service named opens the channel; until then every
// call tries and answers CKR_DEVICE_ERROR, as it does when the channel fails.
TEST_F(Front, EveryEntryReachesTheProxyOfItsNameOrIsADeviceError) {
    unsetenv("VOK_SERVER_ID");
    EXPECT_EQ(list_->C_Initialize(nullptr), CKR_DEVICE_ERROR);
    EXPECT_TRUE(log_.contains(kTag, "VOK_SERVER_ID is not set: no service to call"));
    setenv("VOK_SERVER_ID", id_.c_str(), 1);
    // The server thread binds after init returns.
    for (int i = 0; i < 200 && list_->C_Finalize(nullptr) == CKR_DEVICE_ERROR; ++i) usleep(5000);
    EXPECT_TRUE(log_.contains(kTag, "channel open to service " + id_));
    for (bool answer : {true, false}) {
        gAnswer = answer;
        for (const Entry& entry : kEntries) {
            if (entry.name == std::string("C_GetFunctionList")) continue;
            const CK_RV expected = answer ? code(entry.name) : CKR_DEVICE_ERROR;
            EXPECT_EQ(entry.viaList(list_), expected) << entry.name;
            EXPECT_EQ(entry.viaName(front_), expected) << entry.name << " by name";
            EXPECT_EQ(answer, !log_.contains(kTag, std::string(entry.name) +
                                                       ": the service gave no answer, returning "
                                                       "CKR_DEVICE_ERROR"));
        }
    }
}

}  // namespace
