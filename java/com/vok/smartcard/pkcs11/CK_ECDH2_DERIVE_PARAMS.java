package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_ECMQV_DERIVE}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_ECDH2_DERIVE_PARAMS {
    /** The key derivation function. */
    public long kdf;

    /** Shared data, or null. */
    public byte[] pSharedData;

    /** The other party's first public key value. */
    public byte[] pPublicData;

    /** Length of the second private key. */
    public long ulPrivateDataLen;

    /** Handle of the second private key. */
    public long hPrivateData;

    /** The other party's second public key value. */
    public byte[] pPublicData2;

    /** Creates an object with every field zero or null. */
    public CK_ECDH2_DERIVE_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param kdf the key derivation function
     * @param pSharedData shared data, or null
     * @param pPublicData the other party's first public key value
     * @param ulPrivateDataLen length of the second private key
     * @param hPrivateData handle of the second private key
     * @param pPublicData2 the other party's second public key value
     */
    public CK_ECDH2_DERIVE_PARAMS(
            long kdf, byte[] pSharedData, byte[] pPublicData, long ulPrivateDataLen,
            long hPrivateData, byte[] pPublicData2) {
        this.kdf = kdf;
        this.pSharedData = pSharedData;
        this.pPublicData = pPublicData;
        this.ulPrivateDataLen = ulPrivateDataLen;
        this.hPrivateData = hPrivateData;
        this.pPublicData2 = pPublicData2;
    }

    @Override
    public String toString() {
        return "CK_ECDH2_DERIVE_PARAMS{"
                + "kdf=" + Pkcs11Text.hex(kdf) + ", "
                + "pSharedData=" + Pkcs11Text.hex(pSharedData) + ", "
                + "pPublicData=" + Pkcs11Text.hex(pPublicData) + ", "
                + "ulPrivateDataLen=" + ulPrivateDataLen + ", "
                + "hPrivateData=" + Pkcs11Text.hex(hPrivateData) + ", "
                + "pPublicData2=" + Pkcs11Text.hex(pPublicData2)
                + "}";
    }
}
