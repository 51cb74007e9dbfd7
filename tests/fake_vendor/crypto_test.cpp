// Round trips through the module's transforms, single and multi-part, and
// the rules that end or keep an operation.

#include "fake_vendor_fixture.h"

namespace fakevendor {
namespace {

class FakeVendorCrypto : public FakeVendorTest {
public:
    const Bytes plain = bytes("attack at dawn!");

    void start(CK_RV (*initFn)(CK_SESSION_HANDLE, CK_MECHANISM_PTR, CK_OBJECT_HANDLE),
               CK_MECHANISM_TYPE type, CK_OBJECT_HANDLE key, CK_SESSION_HANDLE h = 0) {
        CK_MECHANISM m = mechanism(type);
        ASSERT_EQ(initFn(h ? h : session, &m, key), CKR_OK);
    }
    void startDigest() {
        CK_MECHANISM m = mechanism(CKM_SHA256);
        ASSERT_EQ(f->C_DigestInit(session, &m), CKR_OK);
    }

    Bytes single(CK_RV (*fn)(CK_SESSION_HANDLE, CK_BYTE_PTR, CK_ULONG, CK_BYTE_PTR, CK_ULONG_PTR),
                 Bytes in) {
        return collect([&](CK_BYTE_PTR out, CK_ULONG_PTR len) {
            return fn(session, in.data(), in.size(), out, len);
        });
    }

    // Two updates, each first asked for its length, then the final.
    Bytes multi(CK_RV (*update)(CK_SESSION_HANDLE, CK_BYTE_PTR, CK_ULONG, CK_BYTE_PTR,
                                CK_ULONG_PTR),
                CK_RV (*final)(CK_SESSION_HANDLE, CK_BYTE_PTR, CK_ULONG_PTR), Bytes in,
                CK_SESSION_HANDLE h = 0) {
        h = h ? h : session;
        Bytes all;
        for (Bytes part : {Bytes(in.begin(), in.begin() + 6), Bytes(in.begin() + 6, in.end())}) {
            Bytes out = collect([&](CK_BYTE_PTR o, CK_ULONG_PTR len) {
                return update(h, part.data(), part.size(), o, len);
            });
            all.insert(all.end(), out.begin(), out.end());
        }
        Bytes last = collect([&](CK_BYTE_PTR o, CK_ULONG_PTR len) { return final(h, o, len); });
        all.insert(all.end(), last.begin(), last.end());
        return all;
    }
};

TEST_F(FakeVendorCrypto, EncryptDecryptSingleAndMultiPart) {
    const CK_OBJECT_HANDLE key = aesKey();
    start(f->C_EncryptInit, CKM_AES_ECB, key);
    const Bytes cipher = single(f->C_Encrypt, plain);
    EXPECT_EQ(cipher, xorWith(plain, aesValue));
    start(f->C_EncryptInit, CKM_AES_CBC, key);
    EXPECT_EQ(multi(f->C_EncryptUpdate, f->C_EncryptFinal, plain), cipher);
    start(f->C_DecryptInit, CKM_AES_ECB, key);
    EXPECT_EQ(single(f->C_Decrypt, cipher), plain);
    start(f->C_DecryptInit, CKM_AES_ECB, key);
    EXPECT_EQ(multi(f->C_DecryptUpdate, f->C_DecryptFinal, cipher), plain);
}

TEST_F(FakeVendorCrypto, SignVerifySingleAndMultiPart) {
    const CK_OBJECT_HANDLE key = macKey();
    start(f->C_SignInit, CKM_MD5_HMAC, key);
    Bytes sig = single(f->C_Sign, plain);
    ASSERT_EQ(sig.size(), FAKE_VENDOR_SIGNATURE_LEN);
    start(f->C_SignInit, CKM_MD5_HMAC, key);
    ASSERT_EQ(f->C_SignUpdate(session, const_cast<CK_BYTE*>(plain.data()), 4), CKR_OK);
    ASSERT_EQ(f->C_SignUpdate(session, const_cast<CK_BYTE*>(plain.data()) + 4, plain.size() - 4),
              CKR_OK);
    EXPECT_EQ(collect([&](CK_BYTE_PTR o, CK_ULONG_PTR n) { return f->C_SignFinal(session, o, n); }),
              sig);

    Bytes data = plain;
    start(f->C_VerifyInit, CKM_MD5_HMAC, key);
    EXPECT_EQ(f->C_Verify(session, data.data(), data.size(), sig.data(), sig.size()), CKR_OK);
    start(f->C_VerifyInit, CKM_MD5_HMAC, key);
    ASSERT_EQ(f->C_VerifyUpdate(session, data.data(), data.size()), CKR_OK);
    EXPECT_EQ(f->C_VerifyFinal(session, sig.data(), sig.size()), CKR_OK);

    sig[3] ^= 1;
    start(f->C_VerifyInit, CKM_MD5_HMAC, key);
    EXPECT_EQ(f->C_Verify(session, data.data(), data.size(), sig.data(), sig.size()),
              CKR_SIGNATURE_INVALID);
    EXPECT_EQ(f->C_VerifyUpdate(session, data.data(), 1), CKR_OPERATION_NOT_INITIALIZED);
    start(f->C_VerifyInit, CKM_MD5_HMAC, key);
    EXPECT_EQ(f->C_Verify(session, data.data(), data.size(), sig.data(), sig.size() - 1),
              CKR_SIGNATURE_LEN_RANGE);
}

TEST_F(FakeVendorCrypto, SignRecoverAndVerifyRecoverWithAKeyPair) {
    CK_MECHANISM gen = mechanism(CKM_RSA_PKCS_KEY_PAIR_GEN);
    Template pub, priv;
    pub.ulong(CKA_MODULUS_BITS, 512);
    CK_OBJECT_HANDLE hPub = 0, hPriv = 0;
    ASSERT_EQ(
        f->C_GenerateKeyPair(session, &gen, pub.data(), pub.count(), priv.data(), 0, &hPub, &hPriv),
        CKR_OK);
    EXPECT_NE(hPub, hPriv);
    EXPECT_EQ(attribute(hPub, CKA_MODULUS), attribute(hPriv, CKA_MODULUS));
    EXPECT_EQ(attribute(hPub, CKA_MODULUS).size(), 64u);

    start(f->C_SignRecoverInit, CKM_RSA_X_509, hPriv);
    Bytes sig = single(f->C_SignRecover, plain);
    start(f->C_VerifyRecoverInit, CKM_RSA_X_509, hPub);
    EXPECT_EQ(single(f->C_VerifyRecover, sig), plain);
    sig[0] ^= 0x40;
    start(f->C_VerifyRecoverInit, CKM_RSA_X_509, hPub);
    CK_ULONG len = 0;
    EXPECT_EQ(f->C_VerifyRecover(session, sig.data(), sig.size(), nullptr, &len),
              CKR_SIGNATURE_INVALID);
    // Keys carry the usage of their class: a public key does not sign.
    CK_MECHANISM m = mechanism(CKM_RSA_X_509);
    EXPECT_EQ(f->C_SignInit(session, &m, hPub), CKR_KEY_FUNCTION_NOT_PERMITTED);
}

TEST_F(FakeVendorCrypto, DigestSingleMultiAndKey) {
    startDigest();
    const Bytes digest = single(f->C_Digest, plain);
    ASSERT_EQ(digest.size(), FAKE_VENDOR_DIGEST_LEN);
    startDigest();
    Bytes data = plain;
    ASSERT_EQ(f->C_DigestUpdate(session, data.data(), 6), CKR_OK);
    ASSERT_EQ(f->C_DigestUpdate(session, data.data() + 6, data.size() - 6), CKR_OK);
    EXPECT_EQ(
        collect([&](CK_BYTE_PTR o, CK_ULONG_PTR n) { return f->C_DigestFinal(session, o, n); }),
        digest);

    // Digesting a key equals digesting its value.
    startDigest();
    ASSERT_EQ(f->C_DigestKey(session, aesKey()), CKR_OK);
    Bytes value = aesValue;
    const Bytes ofKey =
        collect([&](CK_BYTE_PTR o, CK_ULONG_PTR n) { return f->C_DigestFinal(session, o, n); });
    startDigest();
    EXPECT_EQ(single(f->C_Digest, value), ofKey);
    EXPECT_NE(ofKey, digest);
}

TEST_F(FakeVendorCrypto, DualFunctionsMatchTheSeparateOperations) {
    const CK_OBJECT_HANDLE key = aesKey();
    startDigest();
    const Bytes digest = single(f->C_Digest, plain);

    startDigest();
    start(f->C_EncryptInit, CKM_AES_ECB, key);
    Bytes data = plain;
    const Bytes cipher = collect([&](CK_BYTE_PTR o, CK_ULONG_PTR n) {
        return f->C_DigestEncryptUpdate(session, data.data(), data.size(), o, n);
    });
    EXPECT_EQ(cipher, xorWith(plain, aesValue));
    EXPECT_EQ(
        collect([&](CK_BYTE_PTR o, CK_ULONG_PTR n) { return f->C_DigestFinal(session, o, n); }),
        digest)
        << "the length query must not digest the part twice";

    startDigest();
    start(f->C_DecryptInit, CKM_AES_ECB, key);
    Bytes in = cipher;
    EXPECT_EQ(collect([&](CK_BYTE_PTR o, CK_ULONG_PTR n) {
                  return f->C_DecryptDigestUpdate(session, in.data(), in.size(), o, n);
              }),
              plain);
    EXPECT_EQ(
        collect([&](CK_BYTE_PTR o, CK_ULONG_PTR n) { return f->C_DigestFinal(session, o, n); }),
        digest);

    CK_ULONG len = 0;
    EXPECT_EQ(f->C_SignEncryptUpdate(session, data.data(), data.size(), nullptr, &len),
              CKR_OPERATION_NOT_INITIALIZED);
}

TEST_F(FakeVendorCrypto, WrapUnwrapAndDerive) {
    const CK_OBJECT_HANDLE wrapping = aesKey();
    const CK_OBJECT_HANDLE key = macKey();
    CK_MECHANISM ecb = mechanism(CKM_AES_ECB);
    Bytes wrapped = collect([&](CK_BYTE_PTR o, CK_ULONG_PTR n) {
        return f->C_WrapKey(session, &ecb, wrapping, key, o, n);
    });
    EXPECT_EQ(wrapped, xorWith(macValue, aesValue));
    Template t;
    t.ulong(CKA_CLASS, CKO_SECRET_KEY).ulong(CKA_KEY_TYPE, CKK_GENERIC_SECRET);
    CK_OBJECT_HANDLE unwrapped = 0;
    ASSERT_EQ(f->C_UnwrapKey(session, &ecb, wrapping, wrapped.data(), wrapped.size(), t.data(),
                             t.count(), &unwrapped),
              CKR_OK);
    EXPECT_EQ(attribute(unwrapped, CKA_VALUE), macValue);

    CK_MECHANISM derive = mechanism(CKM_SHA256_KEY_DERIVATION);
    Template len;
    len.ulong(CKA_VALUE_LEN, 16);
    CK_OBJECT_HANDLE derived = 0, again = 0;
    ASSERT_EQ(f->C_DeriveKey(session, &derive, key, len.data(), len.count(), &derived), CKR_OK);
    ASSERT_EQ(f->C_DeriveKey(session, &derive, unwrapped, len.data(), len.count(), &again), CKR_OK);
    EXPECT_EQ(attribute(derived, CKA_VALUE).size(), 16u);
    EXPECT_EQ(attribute(derived, CKA_VALUE), attribute(again, CKA_VALUE));
    EXPECT_NE(attribute(derived, CKA_VALUE), macValue);
}

TEST_F(FakeVendorCrypto, GeneratedKeysAndRandomAreDeterministic) {
    CK_MECHANISM gen = mechanism(CKM_AES_KEY_GEN);
    Template t;
    t.ulong(CKA_VALUE_LEN, 24);
    CK_OBJECT_HANDLE key = 0;
    ASSERT_EQ(f->C_GenerateKey(session, &gen, t.data(), t.count(), &key), CKR_OK);
    const Bytes value = attribute(key, CKA_VALUE);
    EXPECT_EQ(value.size(), 24u);
    EXPECT_EQ(attribute(key, CKA_LOCAL), Bytes{CK_TRUE});
    Template bad;
    bad.ulong(CKA_VALUE_LEN, 20);
    EXPECT_EQ(f->C_GenerateKey(session, &gen, bad.data(), bad.count(), &key),
              CKR_ATTRIBUTE_VALUE_INVALID);
    EXPECT_EQ(f->C_GenerateKey(session, &gen, nullptr, 0, &key), CKR_TEMPLATE_INCOMPLETE);

    Bytes r1(8), r2(8);
    ASSERT_EQ(f->C_GenerateRandom(session, r1.data(), r1.size()), CKR_OK);
    ASSERT_EQ(f->C_GenerateRandom(session, r2.data(), r2.size()), CKR_OK);
    EXPECT_NE(r1, r2);
    SetUp();  // a fresh token repeats the same sequence
    ASSERT_EQ(f->C_GenerateKey(session, &gen, t.data(), t.count(), &key), CKR_OK);
    EXPECT_EQ(attribute(key, CKA_VALUE), value);
    Bytes again(8);
    ASSERT_EQ(f->C_GenerateRandom(session, again.data(), again.size()), CKR_OK);
    EXPECT_EQ(again, r1);
    EXPECT_EQ(f->C_GetFunctionStatus(session), CKR_FUNCTION_NOT_PARALLEL);
    EXPECT_EQ(f->C_CancelFunction(session + 100), CKR_SESSION_HANDLE_INVALID);
}

TEST_F(FakeVendorCrypto, OperationStateMovesAnEncryptionToAnotherSession) {
    const CK_OBJECT_HANDLE key = aesKey();
    start(f->C_EncryptInit, CKM_AES_ECB, key);
    Bytes data = plain;
    Bytes head(6);
    CK_ULONG len = head.size();
    ASSERT_EQ(f->C_EncryptUpdate(session, data.data(), 6, head.data(), &len), CKR_OK);
    Bytes state = collect(
        [&](CK_BYTE_PTR o, CK_ULONG_PTR n) { return f->C_GetOperationState(session, o, n); });

    const CK_SESSION_HANDLE other = open(CKF_SERIAL_SESSION);
    EXPECT_EQ(f->C_SetOperationState(other, state.data(), state.size(), 0, 0), CKR_KEY_NEEDED);
    EXPECT_EQ(f->C_SetOperationState(other, state.data(), state.size(), key, key),
              CKR_KEY_NOT_NEEDED);
    EXPECT_EQ(f->C_SetOperationState(other, state.data(), state.size(), macKey(), 0),
              CKR_KEY_CHANGED);
    EXPECT_EQ(f->C_SetOperationState(other, state.data(), state.size() - 1, key, 0),
              CKR_SAVED_STATE_INVALID);
    ASSERT_EQ(f->C_SetOperationState(other, state.data(), state.size(), key, 0), CKR_OK);
    Bytes tail(data.size() - 6);
    len = tail.size();
    ASSERT_EQ(f->C_EncryptUpdate(other, data.data() + 6, tail.size(), tail.data(), &len), CKR_OK);
    head.insert(head.end(), tail.begin(), tail.end());
    EXPECT_EQ(head, xorWith(plain, aesValue));
}

TEST_F(FakeVendorCrypto, InitRules) {
    const CK_OBJECT_HANDLE key = aesKey();
    CK_MECHANISM ecb = mechanism(CKM_AES_ECB), hmac = mechanism(CKM_MD5_HMAC),
                 unknown = mechanism(0x7777);
    CK_MECHANISM badParam{CKM_AES_CBC, nullptr, 16};
    EXPECT_EQ(f->C_EncryptInit(session, &unknown, key), CKR_MECHANISM_INVALID);
    EXPECT_EQ(f->C_EncryptInit(session, &hmac, key), CKR_MECHANISM_INVALID);
    EXPECT_EQ(f->C_EncryptInit(session, &badParam, key), CKR_MECHANISM_PARAM_INVALID);
    EXPECT_EQ(f->C_EncryptInit(session, &ecb, key + 1000), CKR_KEY_HANDLE_INVALID);
    EXPECT_EQ(f->C_SignInit(session, &hmac, key), CKR_KEY_TYPE_INCONSISTENT);
    ASSERT_EQ(f->C_EncryptInit(session, &ecb, key), CKR_OK);
    EXPECT_EQ(f->C_EncryptInit(session, &ecb, key), CKR_OPERATION_ACTIVE);
    // Any failure but a short buffer ends the operation.
    CK_ULONG len = 0;
    EXPECT_EQ(f->C_Encrypt(session, nullptr, 4, nullptr, &len), CKR_ARGUMENTS_BAD);
    EXPECT_EQ(f->C_Encrypt(session, nullptr, 0, nullptr, &len), CKR_OPERATION_NOT_INITIALIZED);
}

}  // namespace
}  // namespace fakevendor
