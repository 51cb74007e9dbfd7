package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_RC2_CBC}: not supported by the native bridge.
 *
 * <p><strong>Do not pass this class to a PKCS#11 call.</strong> The native bridge has no conversion
 * for it and stops the whole process when it meets one, so an RC2-CBC parameter never reaches a
 * module. The class exists so that such a parameter can be described, not used.
 */
public class CK_RC2_CBC_PARAMS {
    /** Effective key bits, 1 to 1024. */
    public long ulEffectiveBits;

    /** The 8-byte initialization vector. */
    public byte[] iv;

    /** Creates an object with every field zero or null. */
    public CK_RC2_CBC_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param ulEffectiveBits effective key bits, 1 to 1024
     * @param iv the 8-byte initialization vector
     */
    public CK_RC2_CBC_PARAMS(long ulEffectiveBits, byte[] iv) {
        this.ulEffectiveBits = ulEffectiveBits;
        this.iv = iv;
    }

    @Override
    public String toString() {
        return "CK_RC2_CBC_PARAMS{"
                + "ulEffectiveBits=" + ulEffectiveBits + ", "
                + "iv=" + Pkcs11Text.hex(iv)
                + "}";
    }
}
