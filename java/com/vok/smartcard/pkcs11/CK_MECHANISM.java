package com.vok.smartcard.pkcs11;

/**
 * A mechanism and its parameter, for the cryptographic and key functions.
 *
 * <p>The parameter is one of the {@code CK_..._PARAMS} classes of this package, a {@code byte[]}
 * (for example an IV), a {@code Long} (8 bytes), a {@link CK_VERSION}, or any value an attribute
 * may hold. The native structure is chosen by the parameter's class, but its nested buffers are
 * released by the mechanism type: give each mechanism the parameter class the standard defines
 * for it.
 *
 * <p>The native bridge reads and writes the public fields by name; objects it returns are built
 * without running a constructor.
 */
public class CK_MECHANISM {
    /** The mechanism type, a {@code CKM_} constant. */
    public long mechanism;

    /** The parameter, or null. See the class description. */
    public Object pParameter;

    /** Creates an object with every field zero or null. */
    public CK_MECHANISM() {
    }

    /**
     * Creates a mechanism without parameter.
     *
     * @param mechanism the mechanism type
     */
    public CK_MECHANISM(long mechanism) {
        this.mechanism = mechanism;
    }

    /**
     * Creates a mechanism with a parameter.
     *
     * @param mechanism the mechanism type
     * @param pParameter the parameter, or null
     */
    public CK_MECHANISM(long mechanism, Object pParameter) {
        this.mechanism = mechanism;
        this.pParameter = pParameter;
    }

    @Override
    public String toString() {
        return "CK_MECHANISM{"
                + "mechanism=" + Pkcs11Text.hex(mechanism) + ", "
                + "pParameter=" + Pkcs11Text.value(pParameter)
                + "}";
    }
}
