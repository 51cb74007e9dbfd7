package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_RSA_PKCS_OAEP}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_RSA_PKCS_OAEP_PARAMS {
    /** The message digest mechanism, e.g. {@code CKM_SHA256}. */
    public long hashAlg;

    /** The mask generation function, e.g. {@code CKG_MGF1_SHA256}. */
    public long mgf;

    /** The source of the encoding parameter, {@code CKZ_DATA_SPECIFIED}. */
    public long source;

    /** The encoding parameter (label), or null for none. */
    public byte[] pSourceData;

    /** Creates an object with every field zero or null. */
    public CK_RSA_PKCS_OAEP_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param hashAlg the message digest mechanism, e.g. {@code CKM_SHA256}
     * @param mgf the mask generation function, e.g. {@code CKG_MGF1_SHA256}
     * @param source the source of the encoding parameter, {@code CKZ_DATA_SPECIFIED}
     * @param pSourceData the encoding parameter (label), or null for none
     */
    public CK_RSA_PKCS_OAEP_PARAMS(long hashAlg, long mgf, long source, byte[] pSourceData) {
        this.hashAlg = hashAlg;
        this.mgf = mgf;
        this.source = source;
        this.pSourceData = pSourceData;
    }

    @Override
    public String toString() {
        return "CK_RSA_PKCS_OAEP_PARAMS{"
                + "hashAlg=" + Pkcs11Text.hex(hashAlg) + ", "
                + "mgf=" + Pkcs11Text.hex(mgf) + ", "
                + "source=" + Pkcs11Text.hex(source) + ", "
                + "pSourceData=" + Pkcs11Text.hex(pSourceData)
                + "}";
    }
}
