package com.vok.smartcard.pkcs11;

/**
 * Data for {@code CKM_CONCATENATE_BASE_AND_DATA}, {@code CKM_XOR_BASE_AND_DATA} and the ECB
 * encrypt-data derivations.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_KEY_DERIVATION_STRING_DATA {
    /** The data. */
    public byte[] pData;

    /** Creates an object with every field zero or null. */
    public CK_KEY_DERIVATION_STRING_DATA() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param pData the data
     */
    public CK_KEY_DERIVATION_STRING_DATA(byte[] pData) {
        this.pData = pData;
    }

    @Override
    public String toString() {
        return "CK_KEY_DERIVATION_STRING_DATA{"
                + "pData=" + Pkcs11Text.hex(pData)
                + "}";
    }
}
