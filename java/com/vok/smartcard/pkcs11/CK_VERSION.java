package com.vok.smartcard.pkcs11;

/**
 * A PKCS#11 version number: major and minor, each one unsigned byte.
 *
 * <p>The native bridge reads and writes the public fields by name; objects it returns are built
 * without running a constructor.
 */
public class CK_VERSION {
    /** Major version, an unsigned byte (read it with {@code major & 0xff}). */
    public byte major;

    /** Minor version, an unsigned byte; 40 in version 2.40. */
    public byte minor;

    /** Creates an object with every field zero or null. */
    public CK_VERSION() {
    }

    /**
     * Creates a version from two numbers, each cut to one unsigned byte.
     *
     * @param major major version, 0 to 255
     * @param minor minor version, 0 to 255
     */
    public CK_VERSION(int major, int minor) {
        this.major = (byte) major;
        this.minor = (byte) minor;
    }

    @Override
    public String toString() {
        return (major & 0xff) + "." + String.format(java.util.Locale.ROOT, "%02d", minor & 0xff);
    }
}
