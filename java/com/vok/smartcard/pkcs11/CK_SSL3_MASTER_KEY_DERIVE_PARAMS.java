package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_SSL3_MASTER_KEY_DERIVE} and the TLS and DH variants.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_SSL3_MASTER_KEY_DERIVE_PARAMS {
    /** The client and server random data. */
    public CK_SSL3_RANDOM_DATA RandomInfo;

    /**
     * Receives the SSL protocol version after {@code C_DeriveKey} with
     * {@code CKM_SSL3_MASTER_KEY_DERIVE} (not the TLS variants); may be null.
     */
    public CK_VERSION pVersion;

    /** Creates an object with every field zero or null. */
    public CK_SSL3_MASTER_KEY_DERIVE_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param RandomInfo the client and server random data
     * @param pVersion receives the SSL protocol version after {@code C_DeriveKey} with
     *     {@code CKM_SSL3_MASTER_KEY_DERIVE} (not the TLS variants); may be null
     */
    public CK_SSL3_MASTER_KEY_DERIVE_PARAMS(CK_SSL3_RANDOM_DATA RandomInfo, CK_VERSION pVersion) {
        this.RandomInfo = RandomInfo;
        this.pVersion = pVersion;
    }

    @Override
    public String toString() {
        return "CK_SSL3_MASTER_KEY_DERIVE_PARAMS{"
                + "RandomInfo=" + RandomInfo + ", "
                + "pVersion=" + pVersion
                + "}";
    }
}
