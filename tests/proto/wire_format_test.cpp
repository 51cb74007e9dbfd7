// The schema is a wire contract with peers built from other sources. Every
// request's and answer's field numbers are pinned byte for byte by the client
// proxies' tables (hand-encoded bytes); what remains here is what no proxy
// shows: which fields are required, and a result needing all 64 bits.
#include <gtest/gtest.h>

#include <cstdint>
#include <string>

#include "vok_proto.h"

namespace {

std::string unhex(const std::string& text) {
    std::string out;
    for (size_t i = 0; i + 1 < text.size(); i += 3)
        out += static_cast<char>(std::stoi(text.substr(i, 2), nullptr, 16));
    return out;
}

TEST(Envelope, RequiredFieldsDecideInitialisation) {
    pkcs11::Operation noName;
    EXPECT_FALSE(noName.IsInitialized());
    EXPECT_FALSE(noName.ParseFromString(unhex("12 02 08 01")));  // initialize only
    EXPECT_TRUE(noName.ParseFromString(unhex("0a 01 78")));      // name "x" alone

    pkcs11::OperationResult res;
    EXPECT_FALSE(res.ParseFromString(unhex("0a 01 78")));  // name "x" without result
    // result 0 (CKR_OK) and no sub-message is complete
    EXPECT_TRUE(res.ParseFromString(unhex("0a 01 78 10 00")));
    EXPECT_EQ(res.result(), 0u);
    EXPECT_FALSE(res.has_infores());
    // All ones, as a plain 64-bit varint.
    ASSERT_TRUE(res.ParseFromString(unhex("0a 01 78 10 ff ff ff ff ff ff ff ff ff 01")));
    EXPECT_EQ(res.result(), UINT64_MAX);
}

}  // namespace
