package com.vok.smartcard.pkcs11;

/**
 * Information about a slot, as {@code C_GetSlotInfo} returns it.
 *
 * <p>The native bridge reads and writes the public fields by name; objects it returns are built
 * without running a constructor.
 */
public class CK_SLOT_INFO {
    /** The slot's description, 64 chars padded with blanks. */
    public char[] slotDescription;

    /** The slot maker, 32 chars padded with blanks. */
    public char[] manufacturerID;

    /** {@code CKF_TOKEN_PRESENT}, {@code CKF_REMOVABLE_DEVICE}, {@code CKF_HW_SLOT}. */
    public long flags;

    /** Version of the slot's hardware. */
    public CK_VERSION hardwareVersion;

    /** Version of the slot's firmware. */
    public CK_VERSION firmwareVersion;

    /** Creates an object with every field zero or null. */
    public CK_SLOT_INFO() {
    }

    @Override
    public String toString() {
        return "CK_SLOT_INFO{"
                + "slotDescription=" + Pkcs11Text.text(slotDescription) + ", "
                + "manufacturerID=" + Pkcs11Text.text(manufacturerID) + ", "
                + "flags=" + Pkcs11Text.hex(flags) + ", "
                + "hardwareVersion=" + hardwareVersion + ", "
                + "firmwareVersion=" + firmwareVersion
                + "}";
    }
}
