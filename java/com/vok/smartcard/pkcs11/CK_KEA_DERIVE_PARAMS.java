package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_KEA_KEY_DERIVE}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_KEA_DERIVE_PARAMS {
    /** True when this side sends. */
    public boolean isSender;

    /** Random value A; must be as long as {@code pRandomB}, whose length is the one passed. */
    public byte[] pRandomA;

    /** Random value B. */
    public byte[] pRandomB;

    /** The other party's public key value. */
    public byte[] pPublicData;

    /** Creates an object with every field zero or null. */
    public CK_KEA_DERIVE_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param isSender true when this side sends
     * @param pRandomA random value A; must be as long as {@code pRandomB}, whose length is the one
     *     passed
     * @param pRandomB random value B
     * @param pPublicData the other party's public key value
     */
    public CK_KEA_DERIVE_PARAMS(
            boolean isSender, byte[] pRandomA, byte[] pRandomB, byte[] pPublicData) {
        this.isSender = isSender;
        this.pRandomA = pRandomA;
        this.pRandomB = pRandomB;
        this.pPublicData = pPublicData;
    }

    @Override
    public String toString() {
        return "CK_KEA_DERIVE_PARAMS{"
                + "isSender=" + isSender + ", "
                + "pRandomA=" + Pkcs11Text.hex(pRandomA) + ", "
                + "pRandomB=" + Pkcs11Text.hex(pRandomB) + ", "
                + "pPublicData=" + Pkcs11Text.hex(pPublicData)
                + "}";
    }
}
