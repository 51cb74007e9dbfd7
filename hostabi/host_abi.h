#ifndef VOK_HOST_ABI_H
#define VOK_HOST_ABI_H

// The one place that knows both binary interfaces: this system's packed one
// (CK_ULONG 64-bit, structures packed to 1 byte) and the host's standard one
// (natural alignment). Every structure that crosses between them is described
// here once, member by member; both directions come from that description, so
// the module bridge (packed caller, standard module) and the standard front
// (standard caller, packed proxies) share it.
//
// A structure whose layout is the same on both sides crosses untouched, as
// the same bytes: no copy. The compile-time checks below prove which ones
// those are on the host being built for, so a host where one differs fails to
// build instead of handing a module a misread structure.

#include <cstddef>
#include <cstring>
#include <tuple>
#include <type_traits>

#include "host_pkcs11.h"

namespace vok {
namespace hostabi {

// ---- Member lists: (packed member, standard member), in member order -------

// clang-format off
#define VOK_HOSTABI_VERSION(F)  \
    F(major, major)             \
    F(minor, minor)
#define VOK_HOSTABI_INFO(F)                     \
    F(cryptokiVersion, cryptoki_version)        \
    F(manufacturerID, manufacturer_id)          \
    F(flags, flags)                             \
    F(libraryDescription, library_description)  \
    F(libraryVersion, library_version)
#define VOK_HOSTABI_SLOT_INFO(F)          \
    F(slotDescription, slot_description)  \
    F(manufacturerID, manufacturer_id)    \
    F(flags, flags)                       \
    F(hardwareVersion, hardware_version)  \
    F(firmwareVersion, firmware_version)
#define VOK_HOSTABI_TOKEN_INFO(F)                  \
    F(label, label)                                \
    F(manufacturerID, manufacturer_id)             \
    F(model, model)                                \
    F(serialNumber, serial_number)                 \
    F(flags, flags)                                \
    F(ulMaxSessionCount, max_session_count)        \
    F(ulSessionCount, session_count)               \
    F(ulMaxRwSessionCount, max_rw_session_count)   \
    F(ulRwSessionCount, rw_session_count)          \
    F(ulMaxPinLen, max_pin_len)                    \
    F(ulMinPinLen, min_pin_len)                    \
    F(ulTotalPublicMemory, total_public_memory)    \
    F(ulFreePublicMemory, free_public_memory)      \
    F(ulTotalPrivateMemory, total_private_memory)  \
    F(ulFreePrivateMemory, free_private_memory)    \
    F(hardwareVersion, hardware_version)           \
    F(firmwareVersion, firmware_version)           \
    F(utcTime, utc_time)
#define VOK_HOSTABI_SESSION_INFO(F)  \
    F(slotID, slot_id)               \
    F(state, state)                  \
    F(flags, flags)                  \
    F(ulDeviceError, device_error)
#define VOK_HOSTABI_MECHANISM_INFO(F)  \
    F(ulMinKeySize, min_key_size)      \
    F(ulMaxKeySize, max_key_size)      \
    F(flags, flags)
#define VOK_HOSTABI_ATTRIBUTE(F)  \
    F(type, type)                 \
    F(pValue, value)              \
    F(ulValueLen, value_len)
#define VOK_HOSTABI_DATE(F)  \
    F(year, year)            \
    F(month, month)          \
    F(day, day)
#define VOK_HOSTABI_MECHANISM(F)      \
    F(mechanism, mechanism)           \
    F(pParameter, parameter)          \
    F(ulParameterLen, parameter_len)
#define VOK_HOSTABI_INITIALIZE_ARGS(F)  \
    F(CreateMutex, create_mutex)        \
    F(DestroyMutex, destroy_mutex)      \
    F(LockMutex, lock_mutex)            \
    F(UnlockMutex, unlock_mutex)        \
    F(flags, flags)                     \
    F(pReserved, reserved)
#define VOK_HOSTABI_PSS(F)  \
    F(hashAlg, hash_alg)    \
    F(mgf, mgf)             \
    F(sLen, s_len)
#define VOK_HOSTABI_OAEP(F)              \
    F(hashAlg, hash_alg)                 \
    F(mgf, mgf)                          \
    F(source, source)                    \
    F(pSourceData, source_data)          \
    F(ulSourceDataLen, source_data_len)
#define VOK_HOSTABI_ECDH1(F)             \
    F(kdf, kdf)                          \
    F(ulSharedDataLen, shared_data_len)  \
    F(pSharedData, shared_data)          \
    F(ulPublicDataLen, public_data_len)  \
    F(pPublicData, public_data)
#define VOK_HOSTABI_STRING_DATA(F)  \
    F(pData, string_data)           \
    F(ulLen, string_data_len)
#define VOK_HOSTABI_CBC_ENCRYPT_DATA(F)  \
    F(iv, iv)                            \
    F(pData, data_params)                \
    F(length, length)
// clang-format on

// ---- Pairs ----------------------------------------------------------------

// Twin<T>::type is the other side's structure for T (packed or standard);
// kSameLayout says whether the two agree in size and in every member's offset
// and size.
template <class T>
struct Twin;

#define VOK_HOSTABI_AGREE(p, h) &&offsetof(P, p) == offsetof(H, h) && sizeof(P::p) == sizeof(H::h)
#define VOK_HOSTABI_PAIR(Packed, Standard, MEMBERS)                                            \
    template <>                                                                                \
    struct Twin<Packed> {                                                                      \
        using P = Packed;                                                                      \
        using H = Standard;                                                                    \
        using type = Standard;                                                                 \
        static constexpr bool kSameLayout = sizeof(P) == sizeof(H) MEMBERS(VOK_HOSTABI_AGREE); \
    };                                                                                         \
    template <>                                                                                \
    struct Twin<Standard> {                                                                    \
        using type = Packed;                                                                   \
        static constexpr bool kSameLayout = Twin<Packed>::kSameLayout;                         \
    };

// Structures that cross untouched on this host.
#define VOK_HOSTABI_SHARED(Packed, Standard, MEMBERS) \
    VOK_HOSTABI_PAIR(Packed, Standard, MEMBERS)       \
    static_assert(Twin<Packed>::kSameLayout,          \
                  #Packed " differs on this host: describe it with VOK_HOSTABI_CONVERTED");

VOK_HOSTABI_SHARED(CK_VERSION, host::ck_version, VOK_HOSTABI_VERSION)
VOK_HOSTABI_SHARED(CK_SESSION_INFO, host::ck_session_info, VOK_HOSTABI_SESSION_INFO)
VOK_HOSTABI_SHARED(CK_MECHANISM_INFO, host::ck_mechanism_info, VOK_HOSTABI_MECHANISM_INFO)
VOK_HOSTABI_SHARED(CK_ATTRIBUTE, host::ck_attribute, VOK_HOSTABI_ATTRIBUTE)
VOK_HOSTABI_SHARED(CK_DATE, host::ck_date, VOK_HOSTABI_DATE)
VOK_HOSTABI_SHARED(CK_MECHANISM, host::ck_mechanism, VOK_HOSTABI_MECHANISM)
VOK_HOSTABI_SHARED(CK_C_INITIALIZE_ARGS, host::ck_c_initialize_args, VOK_HOSTABI_INITIALIZE_ARGS)
// Mechanism parameters that the standard header describes: every one agrees
// here, so parameter bytes pass through as they are.
VOK_HOSTABI_SHARED(CK_RSA_PKCS_PSS_PARAMS, host::ck_rsa_pkcs_pss_params, VOK_HOSTABI_PSS)
VOK_HOSTABI_SHARED(CK_RSA_PKCS_OAEP_PARAMS, host::ck_rsa_pkcs_oaep_params, VOK_HOSTABI_OAEP)
VOK_HOSTABI_SHARED(CK_ECDH1_DERIVE_PARAMS, host::ck_ecdh1_derive_params, VOK_HOSTABI_ECDH1)
VOK_HOSTABI_SHARED(CK_KEY_DERIVATION_STRING_DATA, host::ck_key_derivation_string_data,
                   VOK_HOSTABI_STRING_DATA)
VOK_HOSTABI_SHARED(CK_DES_CBC_ENCRYPT_DATA_PARAMS, host::ck_des_cbc_encrypt_data_params,
                   VOK_HOSTABI_CBC_ENCRYPT_DATA)
VOK_HOSTABI_SHARED(CK_AES_CBC_ENCRYPT_DATA_PARAMS, host::ck_aes_cbc_encrypt_data_params,
                   VOK_HOSTABI_CBC_ENCRYPT_DATA)
// The header's AES-CTR and GCM parameters have no packed declaration here; they
// hold no padding on this host, so packed bytes read the same.
static_assert(sizeof(host::ck_aes_ctr_params) == sizeof(unsigned long) + 16, "CTR padding");
static_assert(sizeof(host::ck_gcm_params) == 6 * 8, "GCM padding");

// The function lists differ too (the standard one pads its version to the
// pointers' alignment); they are never converted: each companion library
// builds its own list of entry points.
static_assert(offsetof(CK_FUNCTION_LIST, C_Initialize) !=
                  offsetof(host::ck_function_list, C_Initialize),
              "the function lists agree on this host");

// ---- Member copies ----------------------------------------------------------

// Copies one member between the two sides, by address: packed members cannot
// be bound to references. Numbers keep their value whatever their widths;
// byte arrays (the blank-padded texts) copy what fits in both and pad with
// blanks; anything else has one layout on both sides.
template <class To, class From>
void copyMember(unsigned char* to, const unsigned char* from) {
    if constexpr (std::is_integral_v<To> && std::is_integral_v<From>) {
        From value;
        std::memcpy(&value, from, sizeof value);
        const To converted = static_cast<To>(value);
        std::memcpy(to, &converted, sizeof converted);
    } else if constexpr (std::is_array_v<To> && std::is_array_v<From>) {
        constexpr size_t kCommon = sizeof(To) < sizeof(From) ? sizeof(To) : sizeof(From);
        std::memcpy(to, from, kCommon);
        std::memset(to + kCommon, ' ', sizeof(To) - kCommon);
    } else {
        static_assert(Twin<To>::kSameLayout, "a member without a conversion");
        std::memcpy(to, from, sizeof(To));
    }
}

#define VOK_HOSTABI_TO_PACKED(p, h) \
    copyMember<decltype(P::p), decltype(H::h)>(to + offsetof(P, p), from + offsetof(H, h));
#define VOK_HOSTABI_TO_STANDARD(p, h) \
    copyMember<decltype(H::h), decltype(P::p)>(to + offsetof(H, h), from + offsetof(P, p));

// Structures that differ on this host: converted member by member, within
// both sides' sizes, in either direction.
#define VOK_HOSTABI_CONVERTED(Packed, Standard, MEMBERS)                                \
    VOK_HOSTABI_PAIR(Packed, Standard, MEMBERS)                                         \
    static_assert(!Twin<Packed>::kSameLayout,                                           \
                  #Packed " agrees on this host: describe it with VOK_HOSTABI_SHARED"); \
    inline void convert(const Standard& standard, Packed* packed) {                     \
        using P = Packed;                                                               \
        using H = Standard;                                                             \
        unsigned char* to = reinterpret_cast<unsigned char*>(packed);                   \
        const unsigned char* from = reinterpret_cast<const unsigned char*>(&standard);  \
        MEMBERS(VOK_HOSTABI_TO_PACKED)                                                  \
    }                                                                                   \
    inline void convert(const Packed& packed, Standard* standard) {                     \
        using P = Packed;                                                               \
        using H = Standard;                                                             \
        unsigned char* to = reinterpret_cast<unsigned char*>(standard);                 \
        const unsigned char* from = reinterpret_cast<const unsigned char*>(&packed);    \
        MEMBERS(VOK_HOSTABI_TO_STANDARD)                                                \
    }

// The information structures: the packed ones leave out the standard padding
// (CK_INFO.flags at 34, not 40; no tail padding after the versions).
VOK_HOSTABI_CONVERTED(CK_INFO, host::ck_info, VOK_HOSTABI_INFO)
VOK_HOSTABI_CONVERTED(CK_SLOT_INFO, host::ck_slot_info, VOK_HOSTABI_SLOT_INFO)
VOK_HOSTABI_CONVERTED(CK_TOKEN_INFO, host::ck_token_info, VOK_HOSTABI_TOKEN_INFO)

// ---- Mechanism parameters ---------------------------------------------------

// Whether a mechanism's parameter can cross as the same bytes. The standard
// parameter structures with a byte-sized member ahead of wider ones (KEA
// derivation, SET/OAEP wrapping, the SSL3, TLS 1.2 and WTLS key-and-MAC
// derivations) have another layout than the packed ones, and the standard
// header does not describe them, so there is nothing to convert them to
// without a hand-written copy: such a call is refused
// (CKR_MECHANISM_PARAM_INVALID) rather than handing a module a misread
// structure. Every other parameter agrees on this host (see above).
inline bool parameterCrosses(CK_MECHANISM_TYPE mechanism) {
    switch (mechanism) {
        case CKM_KEA_KEY_DERIVE:
        case CKM_KEA_DERIVE:
        case CKM_KEY_WRAP_SET_OAEP:
        case CKM_SSL3_KEY_AND_MAC_DERIVE:
        case CKM_TLS_KEY_AND_MAC_DERIVE:
        case CKM_TLS12_KEY_AND_MAC_DERIVE:
        case CKM_TLS12_KEY_SAFE_DERIVE:
        case CKM_WTLS_SERVER_KEY_AND_MAC_DERIVE:
        case CKM_WTLS_CLIENT_KEY_AND_MAC_DERIVE:
            return false;
        default:
            return true;
    }
}

// ---- Crossing one call ------------------------------------------------------

// One argument of a call from one interface into the other. The same type on
// both sides (numbers, byte buffers, callbacks) passes as it is.
template <class To, class From, class = void>
class Arg {
    static_assert(std::is_same_v<To, From>, "no conversion between these argument types");

public:
    explicit Arg(From value) : value_(value) {}
    To get() { return value_; }
    bool refused() const { return false; }
    void finish(CK_RV) {}

private:
    From value_;
};

inline bool refused(const CK_MECHANISM& m) { return !parameterCrosses(m.mechanism); }
inline bool refused(const host::ck_mechanism& m) { return !parameterCrosses(m.mechanism); }
template <class T>
bool refused(const T&) {
    return false;
}

// A structure pointer: the caller's own structure where both layouts agree;
// otherwise a structure of the callee's layout that starts as the caller's and
// is converted back into it after a successful call (the converted structures
// are all outputs). A member the callee leaves alone, such as a text that the
// proxies do not copy, so keeps the caller's value, as it would without the
// conversion.
template <class To, class From>
class Arg<To*, From*, std::enable_if_t<!std::is_same_v<To, From>>> {
    static_assert(std::is_same_v<typename Twin<From>::type, To>, "structures that do not pair");
    static constexpr bool kSame = Twin<From>::kSameLayout;

public:
    explicit Arg(From* caller) : caller_(caller) {
        if constexpr (!kSame)
            if (caller_) convert(*caller_, &callee_);
    }
    To* get() {
        if constexpr (kSame)
            return reinterpret_cast<To*>(caller_);
        else
            return caller_ ? &callee_ : nullptr;
    }
    bool refused() const { return caller_ && vok::hostabi::refused(*caller_); }
    void finish(CK_RV rv) {
        if constexpr (!kSame)
            if (rv == CKR_OK && caller_) convert(callee_, caller_);
    }

private:
    From* caller_;
    std::conditional_t<kSame, char, To> callee_{};
};

// Calls `callee` with the caller's arguments, each crossed by its Arg.
template <class R, class... To, class... From>
R cross(R (*callee)(To...), From... from) {
    static_assert(sizeof...(To) == sizeof...(From), "argument counts differ");
    std::tuple<Arg<To, From>...> args(from...);
    if (std::apply([](auto&... a) { return (a.refused() || ... || false); }, args))
        return CKR_MECHANISM_PARAM_INVALID;
    const R rv = std::apply([callee](auto&... a) { return callee(a.get()...); }, args);
    std::apply([rv](auto&... a) { (a.finish(rv), ...); }, args);
    return rv;
}

}  // namespace hostabi
}  // namespace vok

#endif
