#ifndef VOK_TEST_MEMBER_TABLE_H
#define VOK_TEST_MEMBER_TABLE_H

// Where every member of the information structures lies on each side, written
// out member by member from the two headers (not from the bridge's own
// description), so that a member the bridge misplaces or swaps shows up.

#include <cstddef>
#include <cstring>
#include <string>
#include <vector>

#include "host_pkcs11.h"

namespace vok {
namespace test {

struct Member {
    const char* name;
    size_t packedOffset, packedSize;
    size_t standardOffset, standardSize;
};

#define VOK_MEMBER(P, p, H, h) \
    Member { #P "." #p, offsetof(P, p), sizeof(P::p), offsetof(H, h), sizeof(H::h) }

inline const std::vector<Member> kInfoMembers = {
    VOK_MEMBER(CK_INFO, cryptokiVersion, host::ck_info, cryptoki_version),
    VOK_MEMBER(CK_INFO, manufacturerID, host::ck_info, manufacturer_id),
    VOK_MEMBER(CK_INFO, flags, host::ck_info, flags),
    VOK_MEMBER(CK_INFO, libraryDescription, host::ck_info, library_description),
    VOK_MEMBER(CK_INFO, libraryVersion, host::ck_info, library_version),
};

inline const std::vector<Member> kSlotInfoMembers = {
    VOK_MEMBER(CK_SLOT_INFO, slotDescription, host::ck_slot_info, slot_description),
    VOK_MEMBER(CK_SLOT_INFO, manufacturerID, host::ck_slot_info, manufacturer_id),
    VOK_MEMBER(CK_SLOT_INFO, flags, host::ck_slot_info, flags),
    VOK_MEMBER(CK_SLOT_INFO, hardwareVersion, host::ck_slot_info, hardware_version),
    VOK_MEMBER(CK_SLOT_INFO, firmwareVersion, host::ck_slot_info, firmware_version),
};

inline const std::vector<Member> kTokenInfoMembers = {
    VOK_MEMBER(CK_TOKEN_INFO, label, host::ck_token_info, label),
    VOK_MEMBER(CK_TOKEN_INFO, manufacturerID, host::ck_token_info, manufacturer_id),
    VOK_MEMBER(CK_TOKEN_INFO, model, host::ck_token_info, model),
    VOK_MEMBER(CK_TOKEN_INFO, serialNumber, host::ck_token_info, serial_number),
    VOK_MEMBER(CK_TOKEN_INFO, flags, host::ck_token_info, flags),
    VOK_MEMBER(CK_TOKEN_INFO, ulMaxSessionCount, host::ck_token_info, max_session_count),
    VOK_MEMBER(CK_TOKEN_INFO, ulSessionCount, host::ck_token_info, session_count),
    VOK_MEMBER(CK_TOKEN_INFO, ulMaxRwSessionCount, host::ck_token_info, max_rw_session_count),
    VOK_MEMBER(CK_TOKEN_INFO, ulRwSessionCount, host::ck_token_info, rw_session_count),
    VOK_MEMBER(CK_TOKEN_INFO, ulMaxPinLen, host::ck_token_info, max_pin_len),
    VOK_MEMBER(CK_TOKEN_INFO, ulMinPinLen, host::ck_token_info, min_pin_len),
    VOK_MEMBER(CK_TOKEN_INFO, ulTotalPublicMemory, host::ck_token_info, total_public_memory),
    VOK_MEMBER(CK_TOKEN_INFO, ulFreePublicMemory, host::ck_token_info, free_public_memory),
    VOK_MEMBER(CK_TOKEN_INFO, ulTotalPrivateMemory, host::ck_token_info, total_private_memory),
    VOK_MEMBER(CK_TOKEN_INFO, ulFreePrivateMemory, host::ck_token_info, free_private_memory),
    VOK_MEMBER(CK_TOKEN_INFO, hardwareVersion, host::ck_token_info, hardware_version),
    VOK_MEMBER(CK_TOKEN_INFO, firmwareVersion, host::ck_token_info, firmware_version),
    VOK_MEMBER(CK_TOKEN_INFO, utcTime, host::ck_token_info, utc_time),
};

inline const std::vector<Member> kSessionInfoMembers = {
    VOK_MEMBER(CK_SESSION_INFO, slotID, host::ck_session_info, slot_id),
    VOK_MEMBER(CK_SESSION_INFO, state, host::ck_session_info, state),
    VOK_MEMBER(CK_SESSION_INFO, flags, host::ck_session_info, flags),
    VOK_MEMBER(CK_SESSION_INFO, ulDeviceError, host::ck_session_info, device_error),
};

inline const std::vector<Member> kMechanismInfoMembers = {
    VOK_MEMBER(CK_MECHANISM_INFO, ulMinKeySize, host::ck_mechanism_info, min_key_size),
    VOK_MEMBER(CK_MECHANISM_INFO, ulMaxKeySize, host::ck_mechanism_info, max_key_size),
    VOK_MEMBER(CK_MECHANISM_INFO, flags, host::ck_mechanism_info, flags),
};

#undef VOK_MEMBER

// The names of the members whose bytes differ between `packed` and `standard`.
inline std::vector<std::string> differingMembers(const std::vector<Member>& members,
                                                 const void* packed, const void* standard) {
    std::vector<std::string> differ;
    for (const Member& m : members)
        if (m.packedSize != m.standardSize ||
            std::memcmp(static_cast<const char*>(packed) + m.packedOffset,
                        static_cast<const char*>(standard) + m.standardOffset, m.packedSize) != 0)
            differ.push_back(m.name);
    return differ;
}

}  // namespace test
}  // namespace vok

#endif
