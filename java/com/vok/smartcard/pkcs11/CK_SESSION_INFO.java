package com.vok.smartcard.pkcs11;

/**
 * Information about a session, as {@code C_GetSessionInfo} returns it.
 *
 * <p>The native bridge reads and writes the public fields by name; objects it returns are built
 * without running a constructor.
 */
public class CK_SESSION_INFO {
    /** The slot the session belongs to. */
    public long slotID;

    /** The session state, {@code CKS_RO_PUBLIC_SESSION} to {@code CKS_RW_SO_FUNCTIONS}. */
    public long state;

    /** {@code CKF_RW_SESSION} and {@code CKF_SERIAL_SESSION}. */
    public long flags;

    /** A device-specific error code. */
    public long ulDeviceError;

    /** Creates an object with every field zero or null. */
    public CK_SESSION_INFO() {
    }

    @Override
    public String toString() {
        return "CK_SESSION_INFO{"
                + "slotID=" + slotID + ", "
                + "state=" + Pkcs11Text.hex(state) + ", "
                + "flags=" + Pkcs11Text.hex(flags) + ", "
                + "ulDeviceError=" + Pkcs11Text.hex(ulDeviceError)
                + "}";
    }
}
