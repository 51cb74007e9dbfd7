package com.vok.smartcard.pkcs11;

/**
 * What a token supports for one mechanism, as {@code C_GetMechanismInfo} returns it.
 *
 * <p>The native bridge reads and writes the public fields by name; objects it returns are built
 * without running a constructor.
 */
public class CK_MECHANISM_INFO {
    /** Smallest key size, in bits or bytes as the mechanism defines. */
    public long ulMinKeySize;

    /** Largest key size, in bits or bytes as the mechanism defines. */
    public long ulMaxKeySize;

    /** What the mechanism can do: {@code CKF_ENCRYPT}, {@code CKF_SIGN} and so on. */
    public long flags;

    /** Creates an object with every field zero or null. */
    public CK_MECHANISM_INFO() {
    }

    @Override
    public String toString() {
        return "CK_MECHANISM_INFO{"
                + "ulMinKeySize=" + ulMinKeySize + ", "
                + "ulMaxKeySize=" + ulMaxKeySize + ", "
                + "flags=" + Pkcs11Text.hex(flags)
                + "}";
    }
}
