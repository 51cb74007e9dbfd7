package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_PKCS5_PBKD2}.
 *
 * <p>There is no password field: the module receives a null password of length zero, so the
 * password must come from the base key.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_PKCS5_PBKD2_PARAMS {
    /** Where the salt comes from, {@code CKZ_SALT_SPECIFIED}. */
    public long saltSource;

    /** The salt. */
    public byte[] pSaltSourceData;

    /** The iteration count. */
    public long iterations;

    /** The pseudo-random function, e.g. {@code CKP_PKCS5_PBKD2_HMAC_SHA1}. */
    public long prf;

    /** Data for the pseudo-random function, or null. */
    public byte[] pPrfData;

    /** Creates an object with every field zero or null. */
    public CK_PKCS5_PBKD2_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param saltSource where the salt comes from, {@code CKZ_SALT_SPECIFIED}
     * @param pSaltSourceData the salt
     * @param iterations the iteration count
     * @param prf the pseudo-random function, e.g. {@code CKP_PKCS5_PBKD2_HMAC_SHA1}
     * @param pPrfData data for the pseudo-random function, or null
     */
    public CK_PKCS5_PBKD2_PARAMS(
            long saltSource, byte[] pSaltSourceData, long iterations, long prf, byte[] pPrfData) {
        this.saltSource = saltSource;
        this.pSaltSourceData = pSaltSourceData;
        this.iterations = iterations;
        this.prf = prf;
        this.pPrfData = pPrfData;
    }

    @Override
    public String toString() {
        return "CK_PKCS5_PBKD2_PARAMS{"
                + "saltSource=" + Pkcs11Text.hex(saltSource) + ", "
                + "pSaltSourceData=" + Pkcs11Text.hex(pSaltSourceData) + ", "
                + "iterations=" + iterations + ", "
                + "prf=" + Pkcs11Text.hex(prf) + ", "
                + "pPrfData=" + Pkcs11Text.hex(pPrfData)
                + "}";
    }
}
