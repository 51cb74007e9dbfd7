package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_RC2_MAC_GENERAL}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_RC2_MAC_GENERAL_PARAMS {
    /** Effective key bits, 1 to 1024. */
    public long ulEffectiveBits;

    /** MAC length in bytes. */
    public long ulMacLength;

    /** Creates an object with every field zero or null. */
    public CK_RC2_MAC_GENERAL_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param ulEffectiveBits effective key bits, 1 to 1024
     * @param ulMacLength MAC length in bytes
     */
    public CK_RC2_MAC_GENERAL_PARAMS(long ulEffectiveBits, long ulMacLength) {
        this.ulEffectiveBits = ulEffectiveBits;
        this.ulMacLength = ulMacLength;
    }

    @Override
    public String toString() {
        return "CK_RC2_MAC_GENERAL_PARAMS{"
                + "ulEffectiveBits=" + ulEffectiveBits + ", "
                + "ulMacLength=" + ulMacLength
                + "}";
    }
}
