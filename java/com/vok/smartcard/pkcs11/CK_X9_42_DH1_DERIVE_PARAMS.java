package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_X9_42_DH_DERIVE}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_X9_42_DH1_DERIVE_PARAMS {
    /** The key derivation function. */
    public long kdf;

    /** Other information, or null. */
    public byte[] pOtherInfo;

    /** The other party's public key value. */
    public byte[] pPublicData;

    /** Creates an object with every field zero or null. */
    public CK_X9_42_DH1_DERIVE_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param kdf the key derivation function
     * @param pOtherInfo other information, or null
     * @param pPublicData the other party's public key value
     */
    public CK_X9_42_DH1_DERIVE_PARAMS(long kdf, byte[] pOtherInfo, byte[] pPublicData) {
        this.kdf = kdf;
        this.pOtherInfo = pOtherInfo;
        this.pPublicData = pPublicData;
    }

    @Override
    public String toString() {
        return "CK_X9_42_DH1_DERIVE_PARAMS{"
                + "kdf=" + Pkcs11Text.hex(kdf) + ", "
                + "pOtherInfo=" + Pkcs11Text.hex(pOtherInfo) + ", "
                + "pPublicData=" + Pkcs11Text.hex(pPublicData)
                + "}";
    }
}
