// The conversions of the structures whose layouts differ on this host, in both
// directions: every member lands where the other header puts it, and a member
// a callee leaves alone keeps the caller's value.

#include "host_abi.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <vector>

#include "member_table.h"

namespace {

using vok::test::differingMembers;
using vok::test::Member;
using Bytes = std::vector<unsigned char>;

// No two bytes alike (7 is odd, so i*7 runs through all 256 values), so a
// member read from the wrong place cannot match by chance.
Bytes pattern(size_t size) {
    Bytes bytes(size);
    for (size_t i = 0; i < size; ++i) bytes[i] = static_cast<unsigned char>(i * 7 + 1);
    return bytes;
}

template <class P, class H>
void expectEveryMemberPlaced(const char* name, const std::vector<Member>& members) {
    const Bytes standard = pattern(sizeof(H)), packed = pattern(sizeof(P));
    // Exactly the structures' sizes: a longer write overruns.
    Bytes toPacked(sizeof(P), 0xEE), toStandard(sizeof(H), 0xEE);
    vok::hostabi::convert(*reinterpret_cast<const H*>(standard.data()),
                          reinterpret_cast<P*>(toPacked.data()));
    vok::hostabi::convert(*reinterpret_cast<const P*>(packed.data()),
                          reinterpret_cast<H*>(toStandard.data()));
    EXPECT_THAT(differingMembers(members, toPacked.data(), standard.data()), ::testing::IsEmpty())
        << name << " to the packed layout";
    EXPECT_THAT(differingMembers(members, packed.data(), toStandard.data()), ::testing::IsEmpty())
        << name << " to the standard layout";
    // Through a callee that writes nothing, the caller's structure comes back
    // as it was: the callee's starts as the caller's.
    Bytes packedCaller = packed, standardCaller = standard;
    CK_RV (*writesStandard)(H*) = [](H*) -> CK_RV { return CKR_OK; };
    CK_RV (*writesPacked)(P*) = [](P*) -> CK_RV { return CKR_OK; };
    vok::hostabi::cross(writesStandard, reinterpret_cast<P*>(packedCaller.data()));
    vok::hostabi::cross(writesPacked, reinterpret_cast<H*>(standardCaller.data()));
    EXPECT_EQ(packedCaller, packed) << name << " from the packed layout and back";
    EXPECT_EQ(standardCaller, standard) << name << " from the standard layout and back";
    size_t covered = 0;
    for (const Member& m : members) covered += m.packedSize;
    EXPECT_EQ(covered, sizeof(P)) << name << ": the table misses members";
}

TEST(HostAbiConversion, EveryMemberLandsWhereTheOtherHeaderPutsIt) {
    expectEveryMemberPlaced<CK_INFO, host::ck_info>("CK_INFO", vok::test::kInfoMembers);
    expectEveryMemberPlaced<CK_SLOT_INFO, host::ck_slot_info>("CK_SLOT_INFO",
                                                              vok::test::kSlotInfoMembers);
    expectEveryMemberPlaced<CK_TOKEN_INFO, host::ck_token_info>("CK_TOKEN_INFO",
                                                                vok::test::kTokenInfoMembers);
}

}  // namespace
