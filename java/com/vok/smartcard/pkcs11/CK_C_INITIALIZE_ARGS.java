package com.vok.smartcard.pkcs11;

/**
 * Arguments of {@code C_Initialize}.
 *
 * <p>Mutex callbacks cannot be given from Java: the module always receives null ones and uses its
 * own locking ({@code CKF_OS_LOCKING_OK}) or none.
 *
 * <p>The native bridge reads and writes the public fields by name; objects it returns are built
 * without running a constructor.
 */
public class CK_C_INITIALIZE_ARGS {
    /** {@code CKF_LIBRARY_CANT_CREATE_OS_THREADS}, {@code CKF_OS_LOCKING_OK}. */
    public long flags;

    /** Reserved; converted like an attribute value ({@link CK_ATTRIBUTE}). Normally null. */
    public Object pReserved;

    /** Creates an object with every field zero or null. */
    public CK_C_INITIALIZE_ARGS() {
    }

    /**
     * Creates arguments with the given flags.
     *
     * @param flags the initialisation flags
     */
    public CK_C_INITIALIZE_ARGS(long flags) {
        this.flags = flags;
    }

    /**
     * Creates arguments with flags and a reserved value.
     *
     * @param flags the initialisation flags
     * @param pReserved the reserved value, normally null
     */
    public CK_C_INITIALIZE_ARGS(long flags, Object pReserved) {
        this.flags = flags;
        this.pReserved = pReserved;
    }

    @Override
    public String toString() {
        return "CK_C_INITIALIZE_ARGS{"
                + "flags=" + Pkcs11Text.hex(flags) + ", "
                + "pReserved=" + Pkcs11Text.value(pReserved)
                + "}";
    }
}
