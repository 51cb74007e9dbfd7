package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_RC5_MAC_GENERAL}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_RC5_MAC_GENERAL_PARAMS {
    /** Word size in bytes. */
    public long ulWordsize;

    /** Number of rounds. */
    public long ulRounds;

    /** MAC length in bytes. */
    public long ulMacLength;

    /** Creates an object with every field zero or null. */
    public CK_RC5_MAC_GENERAL_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param ulWordsize word size in bytes
     * @param ulRounds number of rounds
     * @param ulMacLength MAC length in bytes
     */
    public CK_RC5_MAC_GENERAL_PARAMS(long ulWordsize, long ulRounds, long ulMacLength) {
        this.ulWordsize = ulWordsize;
        this.ulRounds = ulRounds;
        this.ulMacLength = ulMacLength;
    }

    @Override
    public String toString() {
        return "CK_RC5_MAC_GENERAL_PARAMS{"
                + "ulWordsize=" + ulWordsize + ", "
                + "ulRounds=" + ulRounds + ", "
                + "ulMacLength=" + ulMacLength
                + "}";
    }
}
