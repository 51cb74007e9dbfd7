// The bridge in front of SoftHSM2 in this process, against SoftHSM2 called
// directly: the converted structures give the module's own values member by
// member. Run with a fresh token (scripts/softhsm-token --run).

#include <dlfcn.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <stdlib.h>

#include <vector>

#include "host_pkcs11.h"
#include "member_table.h"

namespace {

using Bytes = std::vector<unsigned char>;

TEST(BridgeOverSoftHsm, ConvertedStructuresMatchTheModuleMemberByMember) {
    ASSERT_NE(getenv("SOFTHSM2_CONF"), nullptr);
    unsetenv("VOK_BRIDGE_MODULE");  // the default module, SoftHSM2
    void* bridge = dlopen(VOK_TEST_BRIDGE, RTLD_NOW | RTLD_LOCAL);
    void* module = dlopen("/usr/lib/softhsm/libsofthsm2.so", RTLD_NOW | RTLD_LOCAL);
    ASSERT_TRUE(bridge && module) << dlerror();
    CK_FUNCTION_LIST* b = nullptr;
    host::ck_function_list* d = nullptr;
    ASSERT_EQ(
        reinterpret_cast<CK_C_GetFunctionList>(dlsym(bridge, "C_GetFunctionList"))(&b) |
            reinterpret_cast<host::CK_C_GetFunctionList>(dlsym(module, "C_GetFunctionList"))(&d),
        CKR_OK);
    // One module instance behind both lists: initialised once, through the bridge.
    ASSERT_EQ(b->C_Initialize(nullptr), CKR_OK);
    CK_SLOT_ID slots[8];
    CK_ULONG count = 8;
    ASSERT_EQ(b->C_GetSlotList(CK_TRUE, slots, &count), CKR_OK);
    const CK_SLOT_ID slot = slots[0];  // the token made; SoftHSM2 lists its free slot after it

    for (const vok::test::InfoCall& call : vok::test::kInfoCalls) {
        Bytes packed(call.packedSize, 0xEE);  // exactly the packed size: a longer write overruns
        Bytes standard(sizeof(host::ck_token_info), 0x11);
        EXPECT_EQ(call.fill(b, d, slot, packed.data(), standard.data()), CKR_OK) << call.name;
        EXPECT_THAT(vok::test::differingMembers(call.members, packed.data(), standard.data()),
                    ::testing::IsEmpty())
            << call.name;
    }
    b->C_Finalize(nullptr);
    dlclose(bridge);
    dlclose(module);
}

}  // namespace
