// The server thread as the service runs it: commands over the real socket,
// served by the fake module that the registry holds under the server id.
#include <gtest/gtest.h>
#include <unistd.h>

#include <string>

#include "jvm_fixture.h"
#include "log_capture.h"
#include "server_test_support.h"
#include "vok_client.h"

namespace {

class ServerThread : public voktest::JvmTest {};

// The registry attaches and detaches other native threads for every lookup,
// with an error line each time; the server thread stays attached instead.
TEST_F(ServerThread, LooksItsModuleUpWithoutAttachingForEachCommand) {
    fake_vendor_reset();
    const std::string id = "vok-server-thread-" + std::to_string(getpid());
    voktest::registerModule(id.c_str(), fake_vendor_function_list());
    voktest::LogCapture log;
    ASSERT_EQ(0, vokpkcs11_init_server(id.c_str()));
    int32_t status = -1;
    for (int i = 0; i < 200 && status != 0; ++i)
        if ((status = vokpkcs11_client_init(id.c_str())) != 0) usleep(5000);
    ASSERT_EQ(0, status);

    ASSERT_EQ(CKR_OK, C_Initialize(nullptr));
    CK_INFO info;
    for (int i = 0; i < 3; ++i) ASSERT_EQ(CKR_OK, C_GetInfo(&info));
    for (const voktest::LogLine& line : log.lines()) EXPECT_NE(line.priority, 6) << line;
}

}  // namespace
