package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_SSL3_KEY_AND_MAC_DERIVE} and {@code CKM_TLS_KEY_AND_MAC_DERIVE}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_SSL3_KEY_MAT_PARAMS {
    /** MAC secret size in bits. */
    public long ulMacSizeInBits;

    /** Key size in bits. */
    public long ulKeySizeInBits;

    /** IV size in bits; 0 for none. */
    public long ulIVSizeInBits;

    /** True for an export version. */
    public boolean bIsExport;

    /** The client and server random data. */
    public CK_SSL3_RANDOM_DATA RandomInfo;

    /** Receives the derived handles and IVs; may be null. */
    public CK_SSL3_KEY_MAT_OUT pReturnedKeyMaterial;

    /** Creates an object with every field zero or null. */
    public CK_SSL3_KEY_MAT_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param ulMacSizeInBits MAC secret size in bits
     * @param ulKeySizeInBits key size in bits
     * @param ulIVSizeInBits IV size in bits; 0 for none
     * @param bIsExport true for an export version
     * @param RandomInfo the client and server random data
     * @param pReturnedKeyMaterial receives the derived handles and IVs; may be null
     */
    public CK_SSL3_KEY_MAT_PARAMS(
            long ulMacSizeInBits, long ulKeySizeInBits, long ulIVSizeInBits, boolean bIsExport,
            CK_SSL3_RANDOM_DATA RandomInfo, CK_SSL3_KEY_MAT_OUT pReturnedKeyMaterial) {
        this.ulMacSizeInBits = ulMacSizeInBits;
        this.ulKeySizeInBits = ulKeySizeInBits;
        this.ulIVSizeInBits = ulIVSizeInBits;
        this.bIsExport = bIsExport;
        this.RandomInfo = RandomInfo;
        this.pReturnedKeyMaterial = pReturnedKeyMaterial;
    }

    @Override
    public String toString() {
        return "CK_SSL3_KEY_MAT_PARAMS{"
                + "ulMacSizeInBits=" + ulMacSizeInBits + ", "
                + "ulKeySizeInBits=" + ulKeySizeInBits + ", "
                + "ulIVSizeInBits=" + ulIVSizeInBits + ", "
                + "bIsExport=" + bIsExport + ", "
                + "RandomInfo=" + RandomInfo + ", "
                + "pReturnedKeyMaterial=" + pReturnedKeyMaterial
                + "}";
    }
}
