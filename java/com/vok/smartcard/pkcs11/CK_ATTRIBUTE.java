package com.vok.smartcard.pkcs11;

/**
 * One attribute of a template: a type and a value.
 *
 * <p>Values going to a module are converted by their Java class: {@code Long} and {@code Integer}
 * become a {@code CK_ULONG} (8 bytes), {@code Boolean} a {@code CK_BBOOL}, {@code Byte} one
 * byte, {@code byte[]} its bytes, {@code char[]} one byte per char (the low byte),
 * {@code String} its modified UTF-8 bytes, {@link CK_DATE} 8 bytes, {@code boolean[]} one
 * {@code CK_BBOOL} each, and {@code long[]} 8 bytes per element. The value of
 * {@code CKA_WRAP_TEMPLATE} and {@code CKA_UNWRAP_TEMPLATE} is a {@code CK_ATTRIBUTE[]}. Any
 * other class is refused with a {@link PKCS11RuntimeException}. A {@code Character} value cannot
 * be converted (it fails with {@code NoClassDefFoundError}), and an {@code int[]} is read as if
 * it were a {@code long[]} of the same length: use {@code long[]}.
 *
 * <p>Values coming from a module have the Java type of their attribute type: {@code Long} for
 * numbers such as {@code CKA_CLASS} and {@code CKA_KEY_TYPE}, {@code Boolean} for flags such as
 * {@code CKA_TOKEN}, {@code char[]} for {@code CKA_LABEL}, {@code CKA_APPLICATION} and
 * {@code CKA_URL}, {@link CK_DATE} for the dates, {@code CK_ATTRIBUTE[]} for the two templates,
 * {@code long[]} for {@code CKA_ALLOWED_MECHANISMS}, and {@code byte[]} for everything else. An
 * empty or unavailable value is null.
 *
 * <p>The native bridge reads and writes the public fields by name; objects it returns are built
 * without running a constructor.
 */
public class CK_ATTRIBUTE {
    /** The attribute type, a {@code CKA_} constant. */
    public long type;

    /** The value, or null. See the class description for the Java type to use. */
    public Object pValue;

    /** Creates an object with every field zero or null. */
    public CK_ATTRIBUTE() {
    }

    /**
     * Creates an attribute without a value, e.g. to ask a module for its length.
     *
     * @param type the attribute type
     */
    public CK_ATTRIBUTE(long type) {
        this.type = type;
    }

    /**
     * Creates an attribute.
     *
     * @param type the attribute type
     * @param pValue the value, of a Java type listed in the class description, or null
     */
    public CK_ATTRIBUTE(long type, Object pValue) {
        this.type = type;
        this.pValue = pValue;
    }

    @Override
    public String toString() {
        return "CK_ATTRIBUTE{"
                + "type=" + Pkcs11Text.hex(type) + ", "
                + "pValue=" + Pkcs11Text.value(pValue)
                + "}";
    }
}
