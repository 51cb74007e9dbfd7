package com.vok.smartcard.pkcs11;

/**
 * Parameters of {@code CKM_KEY_WRAP_SET_OAEP}.
 *
 * <p>The native bridge reads the public fields by name when the object is the parameter of a
 * {@link CK_MECHANISM}.
 */
public class CK_KEY_WRAP_SET_OAEP_PARAMS {
    /** The block contents byte; after {@code C_UnwrapKey} it holds the module's value. */
    public byte bBC;

    /**
     * The concatenation of hash and data; after {@code C_UnwrapKey} as many bytes as this array
     * holds are overwritten with the module's result.
     */
    public byte[] pX;

    /** Creates an object with every field zero or null. */
    public CK_KEY_WRAP_SET_OAEP_PARAMS() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param bBC the block contents byte; after {@code C_UnwrapKey} it holds the module's value
     * @param pX the concatenation of hash and data; after {@code C_UnwrapKey} as many bytes as this
     *     array holds are overwritten with the module's result
     */
    public CK_KEY_WRAP_SET_OAEP_PARAMS(byte bBC, byte[] pX) {
        this.bBC = bBC;
        this.pX = pX;
    }

    @Override
    public String toString() {
        return "CK_KEY_WRAP_SET_OAEP_PARAMS{"
                + "bBC=" + String.valueOf(bBC & 0xff) + ", "
                + "pX=" + Pkcs11Text.hex(pX)
                + "}";
    }
}
