package com.vok.smartcard.pkcs11;

/**
 * Client and server random data of the SSL 3.0 and TLS key derivations.
 *
 * <p>Part of {@link CK_SSL3_MASTER_KEY_DERIVE_PARAMS} and {@link CK_SSL3_KEY_MAT_PARAMS}.
 */
public class CK_SSL3_RANDOM_DATA {
    /** The client's random data. */
    public byte[] pClientRandom;

    /** The server's random data. */
    public byte[] pServerRandom;

    /** Creates an object with every field zero or null. */
    public CK_SSL3_RANDOM_DATA() {
    }

    /**
     * Creates the parameters from their values.
     *
     * @param pClientRandom the client's random data
     * @param pServerRandom the server's random data
     */
    public CK_SSL3_RANDOM_DATA(byte[] pClientRandom, byte[] pServerRandom) {
        this.pClientRandom = pClientRandom;
        this.pServerRandom = pServerRandom;
    }

    @Override
    public String toString() {
        return "CK_SSL3_RANDOM_DATA{"
                + "pClientRandom=" + Pkcs11Text.hex(pClientRandom) + ", "
                + "pServerRandom=" + Pkcs11Text.hex(pServerRandom)
                + "}";
    }
}
