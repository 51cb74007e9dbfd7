package com.vok.smartcard.pkcs11;

/**
 * A misuse of the binding that no PKCS#11 return value describes, for example calling a
 * PKCS#11 method on an object that is not connected to a module.
 */
public class PKCS11RuntimeException extends RuntimeException {
    private static final long serialVersionUID = 1L;

    /** Creates an exception without a message. */
    public PKCS11RuntimeException() {
        super();
    }

    /**
     * Creates an exception with a message.
     *
     * @param message what went wrong
     */
    public PKCS11RuntimeException(String message) {
        super(message);
    }
}
