package com.vok.smartcard.pkcs11;

import java.util.Locale;

/**
 * A PKCS#11 function returned something other than {@code CKR_OK}.
 *
 * <p>The error code is the module's {@code CK_RV}, a 64-bit unsigned value held in a
 * {@code long}. A call that could not reach the service at all reports all ones
 * ({@code 0xFFFFFFFFFFFFFFFF}, that is {@code -1L}), which is not a {@code CKR_} code.
 */
public class PKCS11Exception extends Exception {
    private static final long serialVersionUID = 1L;

    /** The {@code CK_RV} the module returned. */
    private final long errorCode;

    /**
     * Creates an exception for a failed call.
     *
     * @param errorCode the {@code CK_RV} the module returned
     */
    public PKCS11Exception(long errorCode) {
        super(describe(errorCode));
        this.errorCode = errorCode;
    }

    /**
     * Returns the {@code CK_RV} the module returned.
     *
     * @return the 64-bit return value, as the module gave it
     */
    public long getErrorCode() {
        return errorCode;
    }

    private static String describe(long errorCode) {
        return String.format(Locale.ROOT, "CKR 0x%016X", errorCode);
    }
}
