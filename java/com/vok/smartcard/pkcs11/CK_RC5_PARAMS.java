package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_RC5_ECB} and {@code CKM_RC5_MAC}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_RC5_PARAMS {
    /** Word size in bytes. */
    public long ulWordsize;

    /** Number of rounds. */
    public long ulRounds;

    /** Creates an object with every field zero or null. */
    public CK_RC5_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param ulWordsize word size in bytes
     * @param ulRounds number of rounds
     */
    public CK_RC5_PARAMS(long ulWordsize, long ulRounds) {
        this.ulWordsize = ulWordsize;
        this.ulRounds = ulRounds;
    }

    @Override
    public String toString() {
        return "CK_RC5_PARAMS{"
                + "ulWordsize=" + ulWordsize + ", "
                + "ulRounds=" + ulRounds
                + "}";
    }
}
