// disconnect while the server thread is inside a call into the module: the
// module is loaded with dlopen by connect, as in the service, and nothing else
// in this process holds it.
#include <dlfcn.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/time.h>

#include <string>
#include <thread>

#include "jvm_fixture.h"
#include "raw_peer.h"
#include "vok_proto.h"

extern "C" void Java_com_vok_smartcard_pkcs11_Pkcs11_connect(JNIEnv*, jobject, jstring, jstring,
                                                             jstring, jint);
extern "C" void Java_com_vok_smartcard_pkcs11_Pkcs11_disconnect(JNIEnv*, jobject);
extern "C" jlong Java_com_vok_smartcard_pkcs11_Pkcs11_C_1WaitForSlotEvent(JNIEnv*, jobject, jlong,
                                                                          jlong);

namespace {

bool moduleLoaded() {
    void* handle = dlopen(VOK_FAKE_VENDOR_LIBRARY, RTLD_NOW | RTLD_NOLOAD);
    if (handle != nullptr) dlclose(handle);
    return handle != nullptr;
}

// The slot event is signalled from inside the module, and the call it ends
// may unload the module at once: the test holds the module mapped until the
// signal has returned and the call has been answered.
class Mapped {
public:
    Mapped() : handle_(dlopen(VOK_FAKE_VENDOR_LIBRARY, RTLD_NOW | RTLD_NOLOAD)) {}
    ~Mapped() { release(); }
    void release() {
        if (handle_ != nullptr) dlclose(handle_);
        handle_ = nullptr;
    }

private:
    void* handle_;
};

template <class F>
F moduleFunction(const char* name) {
    void* handle = dlopen(VOK_FAKE_VENDOR_LIBRARY, RTLD_NOW | RTLD_NOLOAD);
    F function = reinterpret_cast<F>(dlsym(handle, name));
    dlclose(handle);  // connect's own handle keeps the module loaded
    return function;
}

class DisconnectRace : public voktest::JvmTest {};

TEST_F(DisconnectRace, TheModuleStaysLoadedUntilTheCallInsideItReturns) {
    const std::string id = voktest::uniqueServerId();
    jobject self = voktest::newKey();
    Java_com_vok_smartcard_pkcs11_Pkcs11_connect(
        env_, self, env_->NewStringUTF(VOK_FAKE_VENDOR_LIBRARY),
        env_->NewStringUTF("C_GetFunctionList"), env_->NewStringUTF(id.c_str()), 1);
    ASSERT_FALSE(env_->ExceptionCheck());
    ASSERT_TRUE(moduleLoaded());
    auto block = moduleFunction<void (*)(CK_BBOOL)>("fake_vendor_set_blocking_wait");
    auto signal = moduleFunction<void (*)()>("fake_vendor_signal_slot_event");
    auto waiting = moduleFunction<CK_ULONG (*)()>("fake_vendor_waiting_count");
    block(CK_TRUE);

    voktest::RawSocket client = voktest::rawConnect(id);
    // A server thread that died inside the unloaded module never answers.
    timeval limit{10, 0};
    setsockopt(client.fd(), SOL_SOCKET, SO_RCVTIMEO, &limit, sizeof(limit));
    voktest::WireHeader header;
    voktest::Bytes payload;
    ASSERT_TRUE(client.sendFrame({100, 103, 0, 4}, voktest::int32Bytes(1)));
    ASSERT_TRUE(client.recvFrame(&header, &payload));
    auto send = [&](const char* name) {
        pkcs11::Operation call;
        call.set_name(name);
        if (std::string(name) == "C_WaitForSlotEvent")
            call.mutable_waitforslotevent()->set_flags(0);
        const std::string request = call.SerializeAsString();
        return client.sendFrame({101, 103, 0, static_cast<int32_t>(request.size())},
                                voktest::Bytes(request.begin(), request.end()));
    };
    // The module waits only once it is initialized.
    ASSERT_TRUE(send("C_Initialize"));
    ASSERT_TRUE(client.recvFrame(&header, &payload));
    ASSERT_TRUE(send("C_WaitForSlotEvent"));
    ASSERT_TRUE(voktest::waitUntil([&] { return waiting() == 1; }));

    Java_com_vok_smartcard_pkcs11_Pkcs11_disconnect(env_, self);
    EXPECT_TRUE(moduleLoaded()) << "unloaded under the running call";
    Mapped mapped;
    signal();
    ASSERT_TRUE(client.recvFrame(&header, &payload));
    mapped.release();
    pkcs11::OperationResult answer;
    ASSERT_TRUE(answer.ParseFromArray(payload.data(), static_cast<int>(payload.size())));
    EXPECT_EQ("C_WaitForSlotEvent", answer.name());
    EXPECT_EQ(CKR_OK, answer.result());
    EXPECT_TRUE(voktest::waitUntil([] { return !moduleLoaded(); })) << "never unloaded";
}

// The same through the Java API: one Java thread inside a call while another
// disconnects the object.
TEST_F(DisconnectRace, AJavaCallKeepsTheModuleLoadedUntilItReturns) {
    jobject self = voktest::newKey();
    Java_com_vok_smartcard_pkcs11_Pkcs11_connect(
        env_, self, env_->NewStringUTF(VOK_FAKE_VENDOR_LIBRARY),
        env_->NewStringUTF("C_GetFunctionList"), nullptr, 0);
    ASSERT_FALSE(env_->ExceptionCheck());
    auto list = moduleFunction<CK_FUNCTION_LIST_PTR (*)()>("fake_vendor_function_list")();
    ASSERT_EQ(CKR_OK, list->C_Initialize(nullptr));
    moduleFunction<void (*)(CK_BBOOL)>("fake_vendor_set_blocking_wait")(CK_TRUE);
    auto waiting = moduleFunction<CK_ULONG (*)()>("fake_vendor_waiting_count");
    auto signal = moduleFunction<void (*)()>("fake_vendor_signal_slot_event");

    std::thread caller([&] {
        voktest::AttachedThread thread;
        Java_com_vok_smartcard_pkcs11_Pkcs11_C_1WaitForSlotEvent(thread.env(), self, 0, 0);
        thread.env()->ExceptionClear();
    });
    ASSERT_TRUE(voktest::waitUntil([&] { return waiting() == 1; }));
    Java_com_vok_smartcard_pkcs11_Pkcs11_disconnect(env_, self);
    // Unloading under the call hangs here or crashes; a test that got past
    // that without the module could not join the caller.
    ASSERT_TRUE(moduleLoaded()) << "unloaded under the running call";
    Mapped mapped;
    signal();
    caller.join();
    mapped.release();
    EXPECT_TRUE(voktest::waitUntil([] { return !moduleLoaded(); })) << "never unloaded";
}

}  // namespace
