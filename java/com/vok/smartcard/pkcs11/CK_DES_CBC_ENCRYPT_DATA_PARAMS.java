package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_DES_CBC_ENCRYPT_DATA} and {@code CKM_DES3_CBC_ENCRYPT_DATA}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_DES_CBC_ENCRYPT_DATA_PARAMS {
    /** The 8-byte IV; longer arrays are cut to 8 bytes, shorter ones end in zeros. */
    public byte[] iv;

    /** The data to encrypt. */
    public byte[] pData;

    /** Creates an object with every field zero or null. */
    public CK_DES_CBC_ENCRYPT_DATA_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param iv the 8-byte IV; longer arrays are cut to 8 bytes, shorter ones end in zeros
     * @param pData the data to encrypt
     */
    public CK_DES_CBC_ENCRYPT_DATA_PARAMS(byte[] iv, byte[] pData) {
        this.iv = iv;
        this.pData = pData;
    }

    @Override
    public String toString() {
        return "CK_DES_CBC_ENCRYPT_DATA_PARAMS{"
                + "iv=" + Pkcs11Text.hex(iv) + ", "
                + "pData=" + Pkcs11Text.hex(pData)
                + "}";
    }
}
