package com.vok.smartcard.pkcs11;

/**
 * General information about a PKCS#11 module, as {@code C_GetInfo} returns it.
 *
 * <p>The native bridge reads and writes the public fields by name; objects it returns are built
 * without running a constructor.
 */
public class CK_INFO {
    /** The PKCS#11 interface version the module implements. */
    public CK_VERSION cryptokiVersion;

    /** The module maker, 32 chars padded with blanks. */
    public char[] manufacturerID;

    /** Bit flags; none are defined. */
    public long flags;

    /** The module's description, 32 chars padded with blanks. */
    public char[] libraryDescription;

    /** The module's own version. */
    public CK_VERSION libraryVersion;

    /** Creates an object with every field zero or null. */
    public CK_INFO() {
    }

    @Override
    public String toString() {
        return "CK_INFO{"
                + "cryptokiVersion=" + cryptokiVersion + ", "
                + "manufacturerID=" + Pkcs11Text.text(manufacturerID) + ", "
                + "flags=" + Pkcs11Text.hex(flags) + ", "
                + "libraryDescription=" + Pkcs11Text.text(libraryDescription) + ", "
                + "libraryVersion=" + libraryVersion
                + "}";
    }
}
