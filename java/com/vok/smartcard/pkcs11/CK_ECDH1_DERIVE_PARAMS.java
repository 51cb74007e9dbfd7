package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_ECDH1_DERIVE} and {@code CKM_ECDH1_COFACTOR_DERIVE}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_ECDH1_DERIVE_PARAMS {
    /** The key derivation function, e.g. {@code CKD_NULL}. */
    public long kdf;

    /** Shared data, or null. */
    public byte[] pSharedData;

    /** The other party's public key value. */
    public byte[] pPublicData;

    /** Creates an object with every field zero or null. */
    public CK_ECDH1_DERIVE_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param kdf the key derivation function, e.g. {@code CKD_NULL}
     * @param pSharedData shared data, or null
     * @param pPublicData the other party's public key value
     */
    public CK_ECDH1_DERIVE_PARAMS(long kdf, byte[] pSharedData, byte[] pPublicData) {
        this.kdf = kdf;
        this.pSharedData = pSharedData;
        this.pPublicData = pPublicData;
    }

    @Override
    public String toString() {
        return "CK_ECDH1_DERIVE_PARAMS{"
                + "kdf=" + Pkcs11Text.hex(kdf) + ", "
                + "pSharedData=" + Pkcs11Text.hex(pSharedData) + ", "
                + "pPublicData=" + Pkcs11Text.hex(pPublicData)
                + "}";
    }
}
