package com.vok.smartcard.pkcs11;

/**
 * Parameters of the password-based mechanisms {@code CKM_PBE_...} and
 * {@code CKM_PBA_SHA1_WITH_SHA1_HMAC}.
 *
 * <p>The initialization vector goes to the module in {@link #pInitVector} but comes back in
 * {@link #pInitVektor} (spelt so): the two fields are read and written by name.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_PBE_PARAMS {
    /**
     * Room for the initialization vector the module generates, one char per byte (e.g.
     * {@code new char[8]}); its length is the room the module gets. Only sent: the result does not
     * come back here.
     */
    public char[] pInitVector;

    /**
     * Receives the initialization vector after {@code C_GenerateKey} with
     * {@code CKM_PBE_MD2_DES_CBC} to {@code CKM_PBE_SHA1_CAST5_CBC}, one byte per char, as many as
     * this array holds (at most the length of {@code pInitVector}); left as it is when null. The
     * constructors make it the same array as {@code pInitVector}.
     */
    public char[] pInitVektor;

    /** The password, one byte per char (the low byte of each). */
    public char[] pPassword;

    /** The salt, one byte per char (the low byte of each). */
    public char[] pSalt;

    /** The iteration count. */
    public long ulIteration;

    /** Creates an object with every field zero or null. */
    public CK_PBE_PARAMS() {
    }

    /**
     * Creates the parameters; the initialization vector comes back in the {@code initVector} array,
     * which both {@code pInitVector} and {@code pInitVektor} refer to.
     *
     * @param initVector room for the initialization vector, e.g. {@code new char[8]}, or null
     * @param password the password
     * @param salt the salt
     * @param iteration the iteration count
     */
    public CK_PBE_PARAMS(char[] initVector, char[] password, char[] salt, long iteration) {
        this.pInitVector = initVector;
        this.pInitVektor = initVector;
        this.pPassword = password;
        this.pSalt = salt;
        this.ulIteration = iteration;
    }

    @Override
    public String toString() {
        return "CK_PBE_PARAMS{"
                + "pInitVector=" + Pkcs11Text.hex(pInitVector) + ", "
                + "pInitVektor=" + Pkcs11Text.hex(pInitVektor) + ", "
                + "pPassword=" + Pkcs11Text.secret(pPassword) + ", "
                + "pSalt=" + Pkcs11Text.hex(pSalt) + ", "
                + "ulIteration=" + ulIteration
                + "}";
    }
}
