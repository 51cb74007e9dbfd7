// The bridge in front of SoftHSM2 in this process, against SoftHSM2 called
// directly: every information structure, converted or passed through, gives
// the module's own values member by member.

#include <dlfcn.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <stdlib.h>

#include <functional>
#include <vector>

#include "host_pkcs11.h"
#include "member_table.h"
#include "softhsm_token.h"

namespace {

using vok::test::differingMembers;
using vok::test::Member;
using vok::test::SoftHsmToken;
using Bytes = std::vector<unsigned char>;

class BridgeOverSoftHsm : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(token_.ready());
        unsetenv("VOK_BRIDGE_MODULE");  // the default module, SoftHSM2
        bridge_ = dlopen(VOK_TEST_BRIDGE, RTLD_NOW | RTLD_LOCAL);
        module_ = dlopen(SoftHsmToken::kModule, RTLD_NOW | RTLD_LOCAL);
        ASSERT_TRUE(bridge_ && module_) << dlerror();
        auto bridged = reinterpret_cast<CK_C_GetFunctionList>(dlsym(bridge_, "C_GetFunctionList"));
        auto direct =
            reinterpret_cast<host::CK_C_GetFunctionList>(dlsym(module_, "C_GetFunctionList"));
        ASSERT_TRUE(bridged && direct);
        ASSERT_EQ(bridged(&bridged_), CKR_OK);
        ASSERT_EQ(direct(&direct_), CKR_OK);
        // One module instance behind both lists: initialised once, through the bridge.
        ASSERT_EQ(bridged_->C_Initialize(nullptr), CKR_OK);
        CK_SLOT_ID slots[4];
        CK_ULONG count = 4;
        ASSERT_EQ(bridged_->C_GetSlotList(CK_TRUE, slots, &count), CKR_OK);
        ASSERT_GE(count, 1u);
        slot_ = slots[0];
        ASSERT_EQ(bridged_->C_OpenSession(slot_, CKF_SERIAL_SESSION | CKF_RW_SESSION, nullptr,
                                          nullptr, &session_),
                  CKR_OK);
    }
    void TearDown() override {
        if (bridged_) bridged_->C_Finalize(nullptr);
        if (bridge_) dlclose(bridge_);
        if (module_) dlclose(module_);
    }

    SoftHsmToken token_;
    void* bridge_ = nullptr;
    void* module_ = nullptr;
    CK_FUNCTION_LIST* bridged_ = nullptr;
    host::ck_function_list* direct_ = nullptr;
    CK_SLOT_ID slot_ = 0;
    CK_SESSION_HANDLE session_ = 0;
};

struct InfoCall {
    const char* name;
    const std::vector<Member>& members;
    size_t packedSize, standardSize;
    // Fills the packed structure through the bridge and the standard one directly.
    std::function<void(CK_FUNCTION_LIST*, host::ck_function_list*, void*, void*, CK_RV*, CK_RV*)>
        call;
};

TEST_F(BridgeOverSoftHsm, InformationStructuresMatchTheModuleMemberByMember) {
    const CK_SLOT_ID slot = slot_;
    const CK_SESSION_HANDLE session = session_;
    const std::vector<InfoCall> calls = {
        {"C_GetInfo", vok::test::kInfoMembers, sizeof(CK_INFO), sizeof(host::ck_info),
         [](auto* b, auto* d, void* p, void* s, CK_RV* rb, CK_RV* rd) {
             *rb = b->C_GetInfo(static_cast<CK_INFO*>(p));
             *rd = d->C_GetInfo(static_cast<host::ck_info*>(s));
         }},
        {"C_GetSlotInfo", vok::test::kSlotInfoMembers, sizeof(CK_SLOT_INFO),
         sizeof(host::ck_slot_info),
         [slot](auto* b, auto* d, void* p, void* s, CK_RV* rb, CK_RV* rd) {
             *rb = b->C_GetSlotInfo(slot, static_cast<CK_SLOT_INFO*>(p));
             *rd = d->C_GetSlotInfo(slot, static_cast<host::ck_slot_info*>(s));
         }},
        {"C_GetTokenInfo", vok::test::kTokenInfoMembers, sizeof(CK_TOKEN_INFO),
         sizeof(host::ck_token_info),
         [slot](auto* b, auto* d, void* p, void* s, CK_RV* rb, CK_RV* rd) {
             *rb = b->C_GetTokenInfo(slot, static_cast<CK_TOKEN_INFO*>(p));
             *rd = d->C_GetTokenInfo(slot, static_cast<host::ck_token_info*>(s));
         }},
        {"C_GetSessionInfo", vok::test::kSessionInfoMembers, sizeof(CK_SESSION_INFO),
         sizeof(host::ck_session_info),
         [session](auto* b, auto* d, void* p, void* s, CK_RV* rb, CK_RV* rd) {
             *rb = b->C_GetSessionInfo(session, static_cast<CK_SESSION_INFO*>(p));
             *rd = d->C_GetSessionInfo(session, static_cast<host::ck_session_info*>(s));
         }},
        {"C_GetMechanismInfo", vok::test::kMechanismInfoMembers, sizeof(CK_MECHANISM_INFO),
         sizeof(host::ck_mechanism_info),
         [slot](auto* b, auto* d, void* p, void* s, CK_RV* rb, CK_RV* rd) {
             *rb = b->C_GetMechanismInfo(slot, CKM_EC_KEY_PAIR_GEN,
                                         static_cast<CK_MECHANISM_INFO*>(p));
             *rd = d->C_GetMechanismInfo(slot, CKM_EC_KEY_PAIR_GEN,
                                         static_cast<host::ck_mechanism_info*>(s));
         }},
    };
    for (const InfoCall& c : calls) {
        Bytes packed(c.packedSize, 0xEE);  // exactly the packed size: a longer write overruns
        Bytes standard(c.standardSize, 0x11);
        CK_RV bridgedRv = ~0UL, directRv = ~0UL;
        c.call(bridged_, direct_, packed.data(), standard.data(), &bridgedRv, &directRv);
        EXPECT_EQ(bridgedRv, CKR_OK) << c.name;
        EXPECT_EQ(directRv, CKR_OK) << c.name;
        EXPECT_THAT(differingMembers(c.members, packed.data(), standard.data()),
                    ::testing::IsEmpty())
            << c.name;
    }
}

// Parameters whose standard layout differs and that the standard header does
// not describe are refused before the module sees them; the others reach it.
TEST_F(BridgeOverSoftHsm, RefusesOnlyParametersThatWouldBeMisread) {
    const struct {
        CK_MECHANISM_TYPE mechanism;
        bool refused;
    } rows[] = {
        {CKM_KEA_KEY_DERIVE, true},
        {CKM_KEA_DERIVE, true},
        {CKM_KEY_WRAP_SET_OAEP, true},
        {CKM_SSL3_KEY_AND_MAC_DERIVE, true},
        {CKM_TLS_KEY_AND_MAC_DERIVE, true},
        {CKM_TLS12_KEY_AND_MAC_DERIVE, true},
        {CKM_TLS12_KEY_SAFE_DERIVE, true},
        {CKM_WTLS_SERVER_KEY_AND_MAC_DERIVE, true},
        {CKM_WTLS_CLIENT_KEY_AND_MAC_DERIVE, true},
        {CKM_ECDH1_DERIVE, false},
        {CKM_SSL3_MASTER_KEY_DERIVE, false},
    };
    unsigned char parameter[128] = {0};
    for (const auto& row : rows) {
        CK_MECHANISM mechanism = {row.mechanism, parameter, sizeof parameter};
        CK_OBJECT_HANDLE key = 0;
        const CK_RV rv = bridged_->C_DeriveKey(session_, &mechanism, 0, nullptr, 0, &key);
        if (row.refused)
            EXPECT_EQ(rv, CKR_MECHANISM_PARAM_INVALID) << std::hex << row.mechanism;
        else
            EXPECT_NE(rv, CKR_MECHANISM_PARAM_INVALID) << std::hex << row.mechanism;
    }
}

}  // namespace
