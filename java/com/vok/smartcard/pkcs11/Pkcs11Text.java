package com.vok.smartcard.pkcs11;

import java.util.Arrays;

/** How the {@code toString} methods of the PKCS#11 classes show their fields. */
final class Pkcs11Text {
    private static final char[] HEX_DIGITS = "0123456789abcdef".toCharArray();

    private Pkcs11Text() {
    }

    /** Bytes as lowercase hex digits, two per byte; "null" for null. */
    static String hex(byte[] bytes) {
        if (bytes == null) {
            return "null";
        }
        StringBuilder text = new StringBuilder(bytes.length * 2);
        for (byte b : bytes) {
            text.append(HEX_DIGITS[(b >> 4) & 0xf]).append(HEX_DIGITS[b & 0xf]);
        }
        return text.toString();
    }

    /** Chars that carry one byte each (their low byte), as hex; "null" for null. */
    static String hex(char[] chars) {
        if (chars == null) {
            return "null";
        }
        byte[] bytes = new byte[chars.length];
        for (int i = 0; i < chars.length; i++) {
            bytes[i] = (byte) chars[i];
        }
        return hex(bytes);
    }

    /** A flag word, handle or type code in hex. */
    static String hex(long value) {
        return "0x" + Long.toHexString(value);
    }

    /** A blank-padded character field, quoted, without its padding; "null" for null. */
    static String text(char[] chars) {
        if (chars == null) {
            return "null";
        }
        int end = chars.length;
        while (end > 0 && (chars[end - 1] == ' ' || chars[end - 1] == '\0')) {
            end--;
        }
        return "\"" + new String(chars, 0, end) + "\"";
    }

    /** The digits of a date field as they are; "null" for null. */
    static String digits(char[] chars) {
        return chars == null ? "null" : new String(chars);
    }

    /** A secret such as a password: only its length is shown. */
    static String secret(byte[] bytes) {
        return bytes == null ? "null" : "(" + bytes.length + " bytes)";
    }

    /** A secret such as a password: only its length is shown. */
    static String secret(char[] chars) {
        return chars == null ? "null" : "(" + chars.length + " chars)";
    }

    /** A value of any of the classes an attribute or parameter may hold. */
    static String value(Object value) {
        if (value instanceof byte[]) {
            return hex((byte[]) value);
        } else if (value instanceof char[]) {
            return text((char[]) value);
        } else if (value instanceof long[]) {
            return Arrays.toString((long[]) value);
        } else if (value instanceof int[]) {
            return Arrays.toString((int[]) value);
        } else if (value instanceof boolean[]) {
            return Arrays.toString((boolean[]) value);
        } else if (value instanceof Object[]) {
            return Arrays.toString((Object[]) value);
        } else if (value instanceof Long) {
            return hex((Long) value);
        }
        return String.valueOf(value);
    }
}
