package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_RC5_CBC} and {@code CKM_RC5_CBC_PAD}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_RC5_CBC_PARAMS {
    /** Word size in bytes. */
    public long ulWordsize;

    /** Number of rounds. */
    public long ulRounds;

    /** The initialization vector, twice the word size long. */
    public byte[] pIv;

    /** Creates an object with every field zero or null. */
    public CK_RC5_CBC_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param ulWordsize word size in bytes
     * @param ulRounds number of rounds
     * @param pIv the initialization vector, twice the word size long
     */
    public CK_RC5_CBC_PARAMS(long ulWordsize, long ulRounds, byte[] pIv) {
        this.ulWordsize = ulWordsize;
        this.ulRounds = ulRounds;
        this.pIv = pIv;
    }

    @Override
    public String toString() {
        return "CK_RC5_CBC_PARAMS{"
                + "ulWordsize=" + ulWordsize + ", "
                + "ulRounds=" + ulRounds + ", "
                + "pIv=" + Pkcs11Text.hex(pIv)
                + "}";
    }
}
