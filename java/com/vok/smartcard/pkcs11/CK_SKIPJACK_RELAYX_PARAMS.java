package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_SKIPJACK_RELAYX}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_SKIPJACK_RELAYX_PARAMS {
    /** The old wrapped key. */
    public byte[] pOldWrappedX;

    /** The old password. */
    public byte[] pOldPassword;

    /** The old public key value. */
    public byte[] pOldPublicData;

    /** The old random value A. */
    public byte[] pOldRandomA;

    /** The new password. */
    public byte[] pNewPassword;

    /** The new public key value. */
    public byte[] pNewPublicData;

    /** The new random value A. */
    public byte[] pNewRandomA;

    /** Creates an object with every field zero or null. */
    public CK_SKIPJACK_RELAYX_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param pOldWrappedX the old wrapped key
     * @param pOldPassword the old password
     * @param pOldPublicData the old public key value
     * @param pOldRandomA the old random value A
     * @param pNewPassword the new password
     * @param pNewPublicData the new public key value
     * @param pNewRandomA the new random value A
     */
    public CK_SKIPJACK_RELAYX_PARAMS(
            byte[] pOldWrappedX, byte[] pOldPassword, byte[] pOldPublicData, byte[] pOldRandomA,
            byte[] pNewPassword, byte[] pNewPublicData, byte[] pNewRandomA) {
        this.pOldWrappedX = pOldWrappedX;
        this.pOldPassword = pOldPassword;
        this.pOldPublicData = pOldPublicData;
        this.pOldRandomA = pOldRandomA;
        this.pNewPassword = pNewPassword;
        this.pNewPublicData = pNewPublicData;
        this.pNewRandomA = pNewRandomA;
    }

    @Override
    public String toString() {
        return "CK_SKIPJACK_RELAYX_PARAMS{"
                + "pOldWrappedX=" + Pkcs11Text.hex(pOldWrappedX) + ", "
                + "pOldPassword=" + Pkcs11Text.secret(pOldPassword) + ", "
                + "pOldPublicData=" + Pkcs11Text.hex(pOldPublicData) + ", "
                + "pOldRandomA=" + Pkcs11Text.hex(pOldRandomA) + ", "
                + "pNewPassword=" + Pkcs11Text.secret(pNewPassword) + ", "
                + "pNewPublicData=" + Pkcs11Text.hex(pNewPublicData) + ", "
                + "pNewRandomA=" + Pkcs11Text.hex(pNewRandomA)
                + "}";
    }
}
