package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_X9_42_DH_HYBRID_DERIVE} and {@code CKM_X9_42_MQV_DERIVE}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_X9_42_DH2_DERIVE_PARAMS {
    /** The key derivation function. */
    public long kdf;

    /** Other information, or null. */
    public byte[] pOtherInfo;

    /** The other party's first public key value. */
    public byte[] pPublicData;

    /** Length of the second private key. */
    public long ulPrivateDataLen;

    /** Handle of the second private key. */
    public long hPrivateData;

    /** The other party's second public key value. */
    public byte[] pPublicData2;

    /** Creates an object with every field zero or null. */
    public CK_X9_42_DH2_DERIVE_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param kdf the key derivation function
     * @param pOtherInfo other information, or null
     * @param pPublicData the other party's first public key value
     * @param ulPrivateDataLen length of the second private key
     * @param hPrivateData handle of the second private key
     * @param pPublicData2 the other party's second public key value
     */
    public CK_X9_42_DH2_DERIVE_PARAMS(
            long kdf, byte[] pOtherInfo, byte[] pPublicData, long ulPrivateDataLen,
            long hPrivateData, byte[] pPublicData2) {
        this.kdf = kdf;
        this.pOtherInfo = pOtherInfo;
        this.pPublicData = pPublicData;
        this.ulPrivateDataLen = ulPrivateDataLen;
        this.hPrivateData = hPrivateData;
        this.pPublicData2 = pPublicData2;
    }

    @Override
    public String toString() {
        return "CK_X9_42_DH2_DERIVE_PARAMS{"
                + "kdf=" + Pkcs11Text.hex(kdf) + ", "
                + "pOtherInfo=" + Pkcs11Text.hex(pOtherInfo) + ", "
                + "pPublicData=" + Pkcs11Text.hex(pPublicData) + ", "
                + "ulPrivateDataLen=" + ulPrivateDataLen + ", "
                + "hPrivateData=" + Pkcs11Text.hex(hPrivateData) + ", "
                + "pPublicData2=" + Pkcs11Text.hex(pPublicData2)
                + "}";
    }
}
