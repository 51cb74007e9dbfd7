package com.vok.smartcard.pkcs11;

/**
 * Information about a token, as {@code C_GetTokenInfo} returns it.
 *
 * <p>The native bridge reads and writes the public fields by name; objects it returns are built
 * without running a constructor.
 */
public class CK_TOKEN_INFO {
    /** The token's label, 32 chars padded with blanks. */
    public char[] label;

    /** The token maker, 32 chars padded with blanks. */
    public char[] manufacturerID;

    /** The token model, 16 chars padded with blanks. */
    public char[] model;

    /** The serial number, 16 chars padded with blanks. */
    public char[] serialNumber;

    /** Token flags such as {@code CKF_TOKEN_INITIALIZED} and {@code CKF_LOGIN_REQUIRED}. */
    public long flags;

    /**
     * Most sessions open at once. {@code CK_UNAVAILABLE_INFORMATION} (-1) or
     * {@code CK_EFFECTIVELY_INFINITE} (0) where the standard allows.
     */
    public long ulMaxSessionCount;

    /** Sessions open now. */
    public long ulSessionCount;

    /**
     * Most read/write sessions open at once. {@code CK_UNAVAILABLE_INFORMATION} (-1) or
     * {@code CK_EFFECTIVELY_INFINITE} (0) where the standard allows.
     */
    public long ulMaxRwSessionCount;

    /** Read/write sessions open now. */
    public long ulRwSessionCount;

    /** Longest PIN, in bytes. */
    public long ulMaxPinLen;

    /** Shortest PIN, in bytes. */
    public long ulMinPinLen;

    /** Memory for public objects, in bytes. */
    public long ulTotalPublicMemory;

    /** Free memory for public objects, in bytes. */
    public long ulFreePublicMemory;

    /** Memory for private objects, in bytes. */
    public long ulTotalPrivateMemory;

    /** Free memory for private objects, in bytes. */
    public long ulFreePrivateMemory;

    /** Version of the token's hardware. */
    public CK_VERSION hardwareVersion;

    /** Version of the token's firmware. */
    public CK_VERSION firmwareVersion;

    /** The token's clock, {@code YYYYMMDDhhmmss00}, when it has one. */
    public char[] utcTime;

    /** Creates an object with every field zero or null. */
    public CK_TOKEN_INFO() {
    }

    @Override
    public String toString() {
        return "CK_TOKEN_INFO{"
                + "label=" + Pkcs11Text.text(label) + ", "
                + "manufacturerID=" + Pkcs11Text.text(manufacturerID) + ", "
                + "model=" + Pkcs11Text.text(model) + ", "
                + "serialNumber=" + Pkcs11Text.text(serialNumber) + ", "
                + "flags=" + Pkcs11Text.hex(flags) + ", "
                + "ulMaxSessionCount=" + ulMaxSessionCount + ", "
                + "ulSessionCount=" + ulSessionCount + ", "
                + "ulMaxRwSessionCount=" + ulMaxRwSessionCount + ", "
                + "ulRwSessionCount=" + ulRwSessionCount + ", "
                + "ulMaxPinLen=" + ulMaxPinLen + ", "
                + "ulMinPinLen=" + ulMinPinLen + ", "
                + "ulTotalPublicMemory=" + ulTotalPublicMemory + ", "
                + "ulFreePublicMemory=" + ulFreePublicMemory + ", "
                + "ulTotalPrivateMemory=" + ulTotalPrivateMemory + ", "
                + "ulFreePrivateMemory=" + ulFreePrivateMemory + ", "
                + "hardwareVersion=" + hardwareVersion + ", "
                + "firmwareVersion=" + firmwareVersion + ", "
                + "utcTime=" + Pkcs11Text.text(utcTime)
                + "}";
    }
}
