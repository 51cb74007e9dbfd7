package com.vok.smartcard.example;

import com.vok.smartcard.pkcs11.CK_ATTRIBUTE;
import com.vok.smartcard.pkcs11.CK_MECHANISM;
import com.vok.smartcard.pkcs11.Pkcs11;
import java.nio.charset.StandardCharsets;

/**
 * An application's first steps with the proxy: connect to a service as its client, list the
 * slots, open a session, sign a message on the token and verify the signature.
 *
 * <p>Usage: {@code SignAndVerify <serverId> <userPin>}, with the native library on
 * {@code java.library.path}.
 */
public final class SignAndVerify {
    private static final long CKF_RW_SERIAL_SESSION = 0x6;
    private static final long CKU_USER = 1;
    private static final long CKM_RSA_PKCS_KEY_PAIR_GEN = 0x0;
    private static final long CKM_SHA256_RSA_PKCS = 0x40;
    private static final long CKA_TOKEN = 0x1;
    private static final long CKA_SIGN = 0x108;
    private static final long CKA_VERIFY = 0x10A;
    private static final long CKA_MODULUS_BITS = 0x121;
    private static final long CKA_PUBLIC_EXPONENT = 0x122;

    private SignAndVerify() {
    }

    public static void main(String[] args) throws Exception {
        Pkcs11 p11 = new Pkcs11();
        p11.initializeLibrary();
        p11.connect(Pkcs11.WRAPPER_LIBRARY_NAME, Pkcs11.DEFAULT_FUNCTION_LIST_NAME, args[0],
                Pkcs11.ROLE_CLIENT);
        try {
            p11.C_Initialize(null);
            long[] slots = p11.C_GetSlotList(true);
            for (long slot : slots) {
                String label = new String(p11.C_GetTokenInfo(slot).label).trim();
                System.out.println("slot " + slot + ": " + label);
            }
            long session = p11.C_OpenSession(slots[0], CKF_RW_SERIAL_SESSION, null);
            p11.C_Login(session, CKU_USER, args[1].toCharArray());

            // A key pair of this session only (not kept on the token).
            CK_MECHANISM generate = new CK_MECHANISM(CKM_RSA_PKCS_KEY_PAIR_GEN);
            long[] keys = p11.C_GenerateKeyPair(session, generate,
                    new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_TOKEN, false),
                        new CK_ATTRIBUTE(CKA_MODULUS_BITS, 2048L),
                        new CK_ATTRIBUTE(CKA_PUBLIC_EXPONENT, new byte[] {1, 0, 1}),
                        new CK_ATTRIBUTE(CKA_VERIFY, true)},
                    new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_TOKEN, false),
                        new CK_ATTRIBUTE(CKA_SIGN, true)});
            byte[] message = "Hello from Java".getBytes(StandardCharsets.UTF_8);
            CK_MECHANISM mechanism = new CK_MECHANISM(CKM_SHA256_RSA_PKCS);
            p11.C_SignInit(session, mechanism, keys[1]);
            byte[] signature = p11.C_Sign(session, message);

            // Verified in parts: the one-call C_Verify never hands the service the signature.
            p11.C_VerifyInit(session, mechanism, keys[0]);
            p11.C_VerifyUpdate(session, message);
            p11.C_VerifyFinal(session, signature);  // throws PKCS11Exception when not valid
            System.out.println("signed and verified: a " + signature.length + "-byte signature");

            p11.C_Logout(session);
            p11.C_CloseSession(session);
            p11.C_Finalize(0);
        } finally {
            p11.disconnect();
        }
    }
}
