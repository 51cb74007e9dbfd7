package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_RSA_PKCS_PSS} and the hash-and-PSS mechanisms.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_RSA_PKCS_PSS_PARAMS {
    /** The message digest mechanism, e.g. {@code CKM_SHA256}. */
    public long hashAlg;

    /** The mask generation function, e.g. {@code CKG_MGF1_SHA256}. */
    public long mgf;

    /** The salt length in bytes. */
    public long sLen;

    /** Creates an object with every field zero or null. */
    public CK_RSA_PKCS_PSS_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param hashAlg the message digest mechanism, e.g. {@code CKM_SHA256}
     * @param mgf the mask generation function, e.g. {@code CKG_MGF1_SHA256}
     * @param sLen the salt length in bytes
     */
    public CK_RSA_PKCS_PSS_PARAMS(long hashAlg, long mgf, long sLen) {
        this.hashAlg = hashAlg;
        this.mgf = mgf;
        this.sLen = sLen;
    }

    @Override
    public String toString() {
        return "CK_RSA_PKCS_PSS_PARAMS{"
                + "hashAlg=" + Pkcs11Text.hex(hashAlg) + ", "
                + "mgf=" + Pkcs11Text.hex(mgf) + ", "
                + "sLen=" + sLen
                + "}";
    }
}
