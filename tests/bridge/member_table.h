#ifndef VOK_TEST_MEMBER_TABLE_H
#define VOK_TEST_MEMBER_TABLE_H

// Where every member of the converted structures lies on each side, written
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

// clang-format off
#define VOK_MEMBER(P, p, H, h) \
    Member { #P "." #p, offsetof(P, p), sizeof(P::p), offsetof(H, h), sizeof(H::h) }
#define VOK_INFO(p, h) VOK_MEMBER(CK_INFO, p, host::ck_info, h)
#define VOK_SLOT(p, h) VOK_MEMBER(CK_SLOT_INFO, p, host::ck_slot_info, h)
#define VOK_TOKEN(p, h) VOK_MEMBER(CK_TOKEN_INFO, p, host::ck_token_info, h)

inline const std::vector<Member> kInfoMembers = {
    VOK_INFO(cryptokiVersion, cryptoki_version), VOK_INFO(manufacturerID, manufacturer_id),
    VOK_INFO(flags, flags), VOK_INFO(libraryDescription, library_description),
    VOK_INFO(libraryVersion, library_version)};

inline const std::vector<Member> kSlotInfoMembers = {
    VOK_SLOT(slotDescription, slot_description), VOK_SLOT(manufacturerID, manufacturer_id),
    VOK_SLOT(flags, flags), VOK_SLOT(hardwareVersion, hardware_version),
    VOK_SLOT(firmwareVersion, firmware_version)};

inline const std::vector<Member> kTokenInfoMembers = {
    VOK_TOKEN(label, label), VOK_TOKEN(manufacturerID, manufacturer_id), VOK_TOKEN(model, model),
    VOK_TOKEN(serialNumber, serial_number), VOK_TOKEN(flags, flags),
    VOK_TOKEN(ulMaxSessionCount, max_session_count), VOK_TOKEN(ulSessionCount, session_count),
    VOK_TOKEN(ulMaxRwSessionCount, max_rw_session_count),
    VOK_TOKEN(ulRwSessionCount, rw_session_count), VOK_TOKEN(ulMaxPinLen, max_pin_len),
    VOK_TOKEN(ulMinPinLen, min_pin_len), VOK_TOKEN(ulTotalPublicMemory, total_public_memory),
    VOK_TOKEN(ulFreePublicMemory, free_public_memory),
    VOK_TOKEN(ulTotalPrivateMemory, total_private_memory),
    VOK_TOKEN(ulFreePrivateMemory, free_private_memory),
    VOK_TOKEN(hardwareVersion, hardware_version), VOK_TOKEN(firmwareVersion, firmware_version),
    VOK_TOKEN(utcTime, utc_time)};

// clang-format on
#undef VOK_INFO
#undef VOK_SLOT
#undef VOK_TOKEN
#undef VOK_MEMBER

// The calls that fill the converted structures, one row each: the packed
// structure through `packed` (the bridge, or the proxy), the standard one
// through `standard` (SoftHSM2 called directly).
struct InfoCall {
    const char* name;
    const std::vector<Member>& members;
    size_t packedSize;
    CK_RV (*fill)(CK_FUNCTION_LIST* packed, host::ck_function_list* standard, CK_SLOT_ID slot,
                  void* packedInfo, void* standardInfo);
};

inline const std::vector<InfoCall> kInfoCalls = {
    {"C_GetInfo", kInfoMembers, sizeof(CK_INFO),
     [](CK_FUNCTION_LIST* p, host::ck_function_list* s, CK_SLOT_ID, void* pi, void* si) {
         return p->C_GetInfo(static_cast<CK_INFO*>(pi)) |
                s->C_GetInfo(static_cast<host::ck_info*>(si));
     }},
    {"C_GetSlotInfo", kSlotInfoMembers, sizeof(CK_SLOT_INFO),
     [](CK_FUNCTION_LIST* p, host::ck_function_list* s, CK_SLOT_ID slot, void* pi, void* si) {
         return p->C_GetSlotInfo(slot, static_cast<CK_SLOT_INFO*>(pi)) |
                s->C_GetSlotInfo(slot, static_cast<host::ck_slot_info*>(si));
     }},
    {"C_GetTokenInfo", kTokenInfoMembers, sizeof(CK_TOKEN_INFO),
     [](CK_FUNCTION_LIST* p, host::ck_function_list* s, CK_SLOT_ID slot, void* pi, void* si) {
         return p->C_GetTokenInfo(slot, static_cast<CK_TOKEN_INFO*>(pi)) |
                s->C_GetTokenInfo(slot, static_cast<host::ck_token_info*>(si));
     }},
};

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
