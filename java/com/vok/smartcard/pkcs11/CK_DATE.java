package com.vok.smartcard.pkcs11;

/**
 * A PKCS#11 date: year, month and day as ASCII digits, as in {@code CKA_START_DATE}.
 *
 * <p>A field shorter than its size leaves the rest of that field zero on the native side; a null
 * field is all zeros.
 *
 * <p>The native bridge reads and writes the public fields by name; objects it returns are built
 * without running a constructor.
 */
public class CK_DATE {
    /** Four digits, e.g. {@code "2024"}. Only the first four chars reach a module. */
    public char[] year;

    /** Two digits, {@code "01"} to {@code "12"}. Only the first two chars reach a module. */
    public char[] month;

    /** Two digits, {@code "01"} to {@code "31"}. Only the first two chars reach a module. */
    public char[] day;

    /** Creates an object with every field zero or null. */
    public CK_DATE() {
    }

    /**
     * Creates a date from its digit fields as given.
     *
     * @param year four year digits
     * @param month two month digits
     * @param day two day digits
     */
    public CK_DATE(char[] year, char[] month, char[] day) {
        this.year = year;
        this.month = month;
        this.day = day;
    }

    /**
     * Creates a date from numbers, written with leading zeros.
     *
     * @param year the year, 0 to 9999
     * @param month the month, 1 to 12
     * @param day the day of the month, 1 to 31
     */
    public CK_DATE(int year, int month, int day) {
        this.year = String.format(java.util.Locale.ROOT, "%04d", year).toCharArray();
        this.month = String.format(java.util.Locale.ROOT, "%02d", month).toCharArray();
        this.day = String.format(java.util.Locale.ROOT, "%02d", day).toCharArray();
    }

    @Override
    public String toString() {
        return Pkcs11Text.digits(year) + "-" + Pkcs11Text.digits(month) + "-"
                + Pkcs11Text.digits(day);
    }
}
