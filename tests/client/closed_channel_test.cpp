// Proxies on a channel that is not open, in processes of their own: the
// channel's state cannot be reset once a test has connected it.
#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>
#include <cstring>

#include "proxy_calls.h"
#include "vok_client.h"
#include "vok_comm.h"

namespace voktest {
namespace {

std::atomic<int> gServed{0};

int32_t countingService(const void*, int32_t, void** response, uint32_t* responseLength) {
    ++gServed;
    const std::string bytes = encodeAnswer("C_Finalize", CKR_OK, 0, {});
    auto* buffer = new uint8_t[bytes.size()];
    memcpy(buffer, bytes.data(), bytes.size());
    *response = buffer;
    *responseLength = static_cast<uint32_t>(bytes.size());
    return 0;
}

void expectEveryProxyFailsUntouched() {
    CK_FUNCTION_LIST_PTR list = functionList();
    ASSERT_NE(nullptr, list);
    for (const ProxyCall& proxy : everyProxyCall()) {
        SCOPED_TRACE(proxy.name);
        gCaller.reset();
        CallerMemory before;
        memcpy(&before, &gCaller, sizeof(before));
        EXPECT_EQ(kAllOnes, proxy.call(list));
        EXPECT_EQ(0, memcmp(&before, &gCaller, sizeof(before)));
    }
}

TEST(ClosedChannel, EveryProxyReturnsAllOnesBeforeClientInit) { expectEveryProxyFailsUntouched(); }

TEST(ClosedChannel, EveryProxyReturnsAllOnesAfterClientDeinitAndSendsNothing) {
    const std::string id = "#vok-closed-channel-" + std::to_string(getpid());
    ASSERT_EQ(0, vokpkcs11_comm_server_init(id.c_str(), countingService));
    int32_t status = -1;
    for (int i = 0; i < 200 && status != 0; ++i) {
        status = vokpkcs11_client_init(id.c_str());
        if (status != 0) usleep(5000);
    }
    ASSERT_EQ(0, status);
    ASSERT_EQ(CKR_OK, C_Finalize(nullptr));
    ASSERT_EQ(1, gServed.load());

    ASSERT_EQ(0, vokpkcs11_client_deinit());
    expectEveryProxyFailsUntouched();
    EXPECT_EQ(1, gServed.load());
}

}  // namespace
}  // namespace voktest
