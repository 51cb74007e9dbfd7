package com.vok.smartcard.pkcs11;

/**
 * The keys and IVs that {@code CKM_SSL3_KEY_AND_MAC_DERIVE} creates.
 *
 * <p>The module fills it during {@code C_DeriveKey}: the handles and the IV bytes come back into
 * this object with {@code CKM_SSL3_KEY_AND_MAC_DERIVE} (not with
 * {@code CKM_TLS_KEY_AND_MAC_DERIVE}).
 */
public class CK_SSL3_KEY_MAT_OUT {
    /** Handle of the client MAC secret key. */
    public long hClientMacSecret;

    /** Handle of the server MAC secret key. */
    public long hServerMacSecret;

    /** Handle of the client key. */
    public long hClientKey;

    /** Handle of the server key. */
    public long hServerKey;

    /** Room for the client IV; its length is the room the module gets. */
    public byte[] pIVClient;

    /** Room for the server IV; its length is the room the module gets. */
    public byte[] pIVServer;

    /** Creates an object with every field zero or null. */
    public CK_SSL3_KEY_MAT_OUT() {
    }

    /**
     * Creates the output with room for the two IVs.
     *
     * @param pIVClient room for the client IV; its length is the room the module gets
     * @param pIVServer room for the server IV; its length is the room the module gets
     */
    public CK_SSL3_KEY_MAT_OUT(byte[] pIVClient, byte[] pIVServer) {
        this.pIVClient = pIVClient;
        this.pIVServer = pIVServer;
    }

    @Override
    public String toString() {
        return "CK_SSL3_KEY_MAT_OUT{"
                + "hClientMacSecret=" + Pkcs11Text.hex(hClientMacSecret) + ", "
                + "hServerMacSecret=" + Pkcs11Text.hex(hServerMacSecret) + ", "
                + "hClientKey=" + Pkcs11Text.hex(hClientKey) + ", "
                + "hServerKey=" + Pkcs11Text.hex(hServerKey) + ", "
                + "pIVClient=" + Pkcs11Text.hex(pIVClient) + ", "
                + "pIVServer=" + Pkcs11Text.hex(pIVServer)
                + "}";
    }
}
