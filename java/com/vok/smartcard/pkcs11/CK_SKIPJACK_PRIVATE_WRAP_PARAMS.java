package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_SKIPJACK_PRIVATE_WRAP}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_SKIPJACK_PRIVATE_WRAP_PARAMS {
    /** The password. */
    public byte[] pPassword;

    /** The other party's public key value. */
    public byte[] pPublicData;

    /** Random value A. */
    public byte[] pRandomA;

    /** Prime p. */
    public byte[] pPrimeP;

    /** Base g; must be as long as {@code pPrimeP}, whose length is the one passed. */
    public byte[] pBaseG;

    /** Subprime q. */
    public byte[] pSubprimeQ;

    /** Creates an object with every field zero or null. */
    public CK_SKIPJACK_PRIVATE_WRAP_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param pPassword the password
     * @param pPublicData the other party's public key value
     * @param pRandomA random value A
     * @param pPrimeP prime p
     * @param pBaseG base g; must be as long as {@code pPrimeP}, whose length is the one passed
     * @param pSubprimeQ subprime q
     */
    public CK_SKIPJACK_PRIVATE_WRAP_PARAMS(
            byte[] pPassword, byte[] pPublicData, byte[] pRandomA, byte[] pPrimeP, byte[] pBaseG,
            byte[] pSubprimeQ) {
        this.pPassword = pPassword;
        this.pPublicData = pPublicData;
        this.pRandomA = pRandomA;
        this.pPrimeP = pPrimeP;
        this.pBaseG = pBaseG;
        this.pSubprimeQ = pSubprimeQ;
    }

    @Override
    public String toString() {
        return "CK_SKIPJACK_PRIVATE_WRAP_PARAMS{"
                + "pPassword=" + Pkcs11Text.secret(pPassword) + ", "
                + "pPublicData=" + Pkcs11Text.hex(pPublicData) + ", "
                + "pRandomA=" + Pkcs11Text.hex(pRandomA) + ", "
                + "pPrimeP=" + Pkcs11Text.hex(pPrimeP) + ", "
                + "pBaseG=" + Pkcs11Text.hex(pBaseG) + ", "
                + "pSubprimeQ=" + Pkcs11Text.hex(pSubprimeQ)
                + "}";
    }
}
