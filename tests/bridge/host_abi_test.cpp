// The conversions of the structures whose layouts differ on this host, in both
// directions: every member lands where the other header puts it.

#include "host_abi.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <functional>
#include <vector>

#include "member_table.h"

namespace {

using vok::test::differingMembers;
using vok::test::Member;
using Bytes = std::vector<unsigned char>;

struct Converted {
    const char* name;
    const std::vector<Member>& members;
    size_t packedSize, standardSize;
    std::function<void(const Bytes& standard, Bytes* packed)> toPacked;
    std::function<void(const Bytes& packed, Bytes* standard)> toStandard;
};

template <class P, class H>
Converted converted(const char* name, const std::vector<Member>& members) {
    return {name,
            members,
            sizeof(P),
            sizeof(H),
            [](const Bytes& from, Bytes* to) {
                vok::hostabi::convert(*reinterpret_cast<const H*>(from.data()),
                                      reinterpret_cast<P*>(to->data()));
            },
            [](const Bytes& from, Bytes* to) {
                vok::hostabi::convert(*reinterpret_cast<const P*>(from.data()),
                                      reinterpret_cast<H*>(to->data()));
            }};
}

const std::vector<Converted>& convertedStructures() {
    static const std::vector<Converted> table = {
        converted<CK_INFO, host::ck_info>("CK_INFO", vok::test::kInfoMembers),
        converted<CK_SLOT_INFO, host::ck_slot_info>("CK_SLOT_INFO", vok::test::kSlotInfoMembers),
        converted<CK_TOKEN_INFO, host::ck_token_info>("CK_TOKEN_INFO",
                                                      vok::test::kTokenInfoMembers),
    };
    return table;
}

// No two bytes alike (7 is odd, so i*7 runs through all 256 values), so a
// member read from the wrong place cannot match by chance.
Bytes pattern(size_t size) {
    Bytes bytes(size);
    for (size_t i = 0; i < size; ++i) bytes[i] = static_cast<unsigned char>(i * 7 + 1);
    return bytes;
}

TEST(HostAbiConversion, StandardToPackedPlacesEveryMember) {
    for (const Converted& c : convertedStructures()) {
        const Bytes standard = pattern(c.standardSize);
        Bytes packed(c.packedSize, 0xEE);  // exactly the packed size: a longer write overruns
        c.toPacked(standard, &packed);
        EXPECT_THAT(differingMembers(c.members, packed.data(), standard.data()),
                    ::testing::IsEmpty())
            << c.name;
        size_t covered = 0;
        for (const Member& m : c.members) covered += m.packedSize;
        EXPECT_EQ(covered, c.packedSize) << c.name << ": packed bytes no member writes";
    }
}

TEST(HostAbiConversion, PackedToStandardPlacesEveryMember) {
    for (const Converted& c : convertedStructures()) {
        const Bytes packed = pattern(c.packedSize);
        Bytes standard(c.standardSize, 0xEE);
        c.toStandard(packed, &standard);
        EXPECT_THAT(differingMembers(c.members, packed.data(), standard.data()),
                    ::testing::IsEmpty())
            << c.name;
    }
}

}  // namespace
