// Situations every proxy goes through alike: the exact request, the result
// passed through, a failed or closed channel; and the function list itself.
#include <gtest/gtest.h>

#include <cstring>

#include "log_capture.h"
#include "proxy_calls.h"
#include "test_service.h"
#include "vok_client.h"
#include "vok_comm.h"

namespace voktest {
namespace {

// Runs each proxy of the table on freshly patterned caller memory.
class Proxies : public ::testing::Test {
protected:
    CK_FUNCTION_LIST_PTR list = functionList();
    CallerMemory before;

    CK_RV run(const ProxyCall& proxy) {
        gCaller.reset();
        memcpy(&before, &gCaller, sizeof(before));
        return proxy.call(list);
    }
    bool untouched() const { return memcmp(&before, &gCaller, sizeof(before)) == 0; }
};

// Each case runs in its own process: here the channel was never opened.
TEST_F(Proxies, EveryProxyReturnsAllOnesBeforeClientInit) {
    ASSERT_NE(nullptr, list);
    for (const ProxyCall& proxy : everyProxyCall()) {
        SCOPED_TRACE(proxy.name);
        EXPECT_EQ(kAllOnes, run(proxy));
        EXPECT_TRUE(untouched());
    }
}

class EveryProxy : public Proxies {
protected:
    TestService& service = TestService::start();
};

TEST_F(EveryProxy, EveryProxyReturnsAllOnesAfterClientDeinitAndSendsNothing) {
    ASSERT_EQ(CKR_OK, C_Finalize(nullptr));  // the channel worked
    ASSERT_EQ(0, vokpkcs11_client_deinit());
    const size_t sent = service.requestCount();
    for (const ProxyCall& proxy : everyProxyCall()) {
        SCOPED_TRACE(proxy.name);
        EXPECT_EQ(kAllOnes, run(proxy));
        EXPECT_TRUE(untouched());
    }
    EXPECT_EQ(sent, service.requestCount());
}

TEST_F(EveryProxy, SendsExactlyTheRequestForItsArguments) {
    for (const ProxyCall& proxy : everyProxyCall()) {
        SCOPED_TRACE(proxy.name);
        const size_t sent = service.requestCount();
        EXPECT_EQ(CKR_OK, run(proxy));
        EXPECT_EQ(sent + 1, service.requestCount());
        EXPECT_EQ(hex(encodeRequest(proxy.name, proxy.field, proxy.request)),
                  hex(service.lastRequestBytes()));
    }
}

TEST_F(EveryProxy, ReturnsTheWholeResultAndLeavesOutputsWhenNoResponseMessage) {
    const CK_RV vendorCode = 0x80000000000000a5;  // needs all 64 bits
    for (const ProxyCall& proxy : everyProxyCall()) {
        SCOPED_TRACE(proxy.name);
        service.script(answer(proxy.name, vendorCode));
        EXPECT_EQ(vendorCode, run(proxy));
        EXPECT_TRUE(untouched());
    }
}

// No answer at all, or one without its result.
TEST_F(EveryProxy, ReturnsAllOnesAndLeavesOutputsWithoutAResult) {
    for (const ProxyCall& proxy : everyProxyCall()) {
        SCOPED_TRACE(proxy.name);
        pkcs11::OperationResult nameOnly;
        nameOnly.set_name(proxy.name);
        for (const std::string& raw : {std::string(), nameOnly.SerializePartialAsString()}) {
            service.scriptRaw(raw);
            EXPECT_EQ(kAllOnes, run(proxy));
            EXPECT_TRUE(untouched());
        }
    }
}

TEST_F(EveryProxy, InitializeArgumentsNeverReachTheService) {
    ASSERT_EQ(CKR_OK, C_Initialize(nullptr));
    const std::string withNull = service.lastRequestBytes();
    CK_C_INITIALIZE_ARGS args{};
    args.flags = CKF_OS_LOCKING_OK;
    args.pReserved = &args;
    ASSERT_EQ(CKR_OK, C_Initialize(&args));
    EXPECT_EQ(hex(encodeRequest("C_Initialize", 0, {})), hex(withNull));
    EXPECT_EQ(hex(withNull), hex(service.lastRequestBytes()));
}

// Lines whose spelling differs from the function's own name.
TEST_F(EveryProxy, LogsUnderTheSpellingsItsCallersKnow) {
    struct Case {
        CK_RV (*call)();
        std::vector<std::string> lines;
    };
    const Case cases[] = {
        {[] { return C_InitPIN(kSession, nullptr, 0); },
         {"Inside InitPin", "C_InitPin Success", "C_InitPin response length = %"}},
        {[] { return C_SetPIN(kSession, nullptr, 0, nullptr, 0); },
         {"Inside SetPin", "C_SetPin Success", "C_SetPin response length = %"}},
        {[] { return C_UnwrapKey(kSession, nullptr, kKey, nullptr, 0, nullptr, 0, nullptr); },
         {"C_UnWrapKey", "C_UnWrapKey Success", "C_UnWrapKey response length = %"}},
        {[] { return C_Initialize(nullptr); },
         {"C_Initialize", "C_Initialize serialized buffer size = 14",
          "C_Initialize serialized before server call ", "C_initialize Success",
          "C_Initialize response length = %", "C_Initialize after server call ",
          "C_Initialize return result "}},
    };
    for (const Case& c : cases) {
        const pkcs11::OperationResult res = answer("any name", CKR_OK);
        service.script(res);
        LogCapture log;
        ASSERT_EQ(CKR_OK, c.call());
        const std::string length = std::to_string(res.ByteSizeLong());
        std::vector<std::string> expected = c.lines;
        for (std::string& line : expected)
            if (line.back() == '%') line.replace(line.size() - 1, 1, length);
        EXPECT_EQ(expected, log.texts("Vokpkcs11f"));
    }
}

// Each case runs in its own process, so the list does not exist yet.
TEST(FunctionList, PointsAtTheLibrarysOwnProxiesInStandardOrder) {
    ASSERT_EQ(nullptr, mFunctionList);
    LogCapture log;
    CK_FUNCTION_LIST_PTR first = nullptr;
    ASSERT_EQ(CKR_OK, C_GetFunctionList(&first));
    EXPECT_EQ(std::vector<std::string>{"C_FunctionList"}, log.texts("Vokpkcs11f"));
    ASSERT_NE(nullptr, first);
    EXPECT_EQ(first, mFunctionList);

    std::vector<void*> expected;
#define VOK_ADDRESS_OF(name, params) expected.push_back(reinterpret_cast<void*>(&name));
    VOK_CK_FUNCTIONS(VOK_ADDRESS_OF)
#undef VOK_ADDRESS_OF
    ASSERT_EQ(68u, expected.size());
    std::vector<void*> slots(68);
    memcpy(slots.data(), reinterpret_cast<const char*>(first) + sizeof(CK_VERSION),
           68 * sizeof(void*));
    EXPECT_EQ(expected, slots);

    log.clear();
    CK_FUNCTION_LIST_PTR second = nullptr;
    ASSERT_EQ(CKR_OK, C_GetFunctionList(&second));
    EXPECT_EQ(first, second);
    EXPECT_TRUE(log.texts("Vokpkcs11f").empty());
}

}  // namespace
}  // namespace voktest
