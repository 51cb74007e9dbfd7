package com.vok.smartcard.pkcs11;

import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import java.io.BufferedReader;
import java.io.File;
import java.io.InputStreamReader;
import java.nio.charset.StandardCharsets;
import java.util.Arrays;
import org.junit.jupiter.api.AfterAll;
import org.junit.jupiter.api.BeforeAll;
import org.junit.jupiter.api.MethodOrderer;
import org.junit.jupiter.api.Order;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.TestMethodOrder;

/**
 * The real path: this process is the application (the library's own name, client role), the
 * Java service host in a process of its own serves the fake vendor module.
 */
@TestMethodOrder(MethodOrderer.OrderAnnotation.class)
class Pkcs11ServiceTest {
    private static final long CKM_MD5_HMAC = 0x211;
    private static final long CKM_AES_ECB = 0x1081;
    private static final long CKA_CLASS = 0x0;
    private static final long CKA_LABEL = 0x3;
    private static final long CKA_VALUE = 0x11;
    private static final long CKR_PIN_INCORRECT = 0xA0;
    private static final long CKR_SIGNATURE_INVALID = 0xC0;

    private static final String SERVER_ID = TestModules.uniqueServerId();
    private static Process service;
    private static Pkcs11 p11;

    @BeforeAll
    static void startServiceAndConnect() throws Exception {
        String java = System.getProperty("java.home") + File.separator + "bin" + File.separator
                + "java";
        String libraries = new File(TestModules.wrapperPath()).getParent();
        service = new ProcessBuilder(java, "-Djava.library.path=" + libraries, "-cp",
                TestModules.property("vok.javaJar"), "com.vok.smartcard.pkcs11.ServiceHost",
                SERVER_ID, TestModules.fakeVendor())
                .redirectError(ProcessBuilder.Redirect.INHERIT).start();
        BufferedReader out = new BufferedReader(
                new InputStreamReader(service.getInputStream(), StandardCharsets.UTF_8));
        assertEquals("serving " + SERVER_ID, out.readLine());
        p11 = new Pkcs11();
        p11.initializeLibrary();
        p11.connect(Pkcs11.WRAPPER_LIBRARY_NAME, Pkcs11.DEFAULT_FUNCTION_LIST_NAME, SERVER_ID,
                Pkcs11.ROLE_CLIENT);
    }

    @AfterAll
    static void stop() {
        p11.disconnect();
        service.destroyForcibly();
    }

    @Test
    @Order(1)
    void aSessionOfWorkGoesThroughTheServiceToTheModule() throws Exception {
        p11.C_Initialize(null);
        assertEquals("\"Vok test vendor\"", Pkcs11Text.text(p11.C_GetInfo().manufacturerID));
        long[] slots = p11.C_GetSlotList(true);
        assertArrayEquals(new long[] {1}, slots);
        long session = p11.C_OpenSession(slots[0], 0x6, null);
        p11.C_Login(session, 1, "1234".toCharArray());

        byte[] secret = "sixteen byte key".getBytes(StandardCharsets.US_ASCII);
        long hmac = p11.C_CreateObject(session, new CK_ATTRIBUTE[] {
            new CK_ATTRIBUTE(CKA_CLASS, 4L), new CK_ATTRIBUTE(0x100, 0x10L),
            new CK_ATTRIBUTE(CKA_VALUE, secret), new CK_ATTRIBUTE(CKA_LABEL, "mac".toCharArray()),
            new CK_ATTRIBUTE(0x108, true), new CK_ATTRIBUTE(0x10A, true)});
        p11.C_FindObjectsInit(session,
                new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_LABEL, "mac".toCharArray())});
        assertArrayEquals(new long[] {hmac}, p11.C_FindObjects(session, 4));
        p11.C_FindObjectsFinal(session);
        CK_ATTRIBUTE[] read = {new CK_ATTRIBUTE(CKA_LABEL), new CK_ATTRIBUTE(CKA_VALUE),
            new CK_ATTRIBUTE(CKA_CLASS)};
        p11.C_GetAttributeValue(session, hmac, read);
        assertEquals("\"mac\"", Pkcs11Text.text((char[]) read[0].pValue));
        assertArrayEquals(secret, (byte[]) read[1].pValue);
        assertEquals(4L, read[2].pValue);

        long aes = p11.C_GenerateKey(session, new CK_MECHANISM(0x1080), new CK_ATTRIBUTE[] {
            new CK_ATTRIBUTE(0x161, 32L), new CK_ATTRIBUTE(0x104, true),
            new CK_ATTRIBUTE(0x105, true)});
        byte[] plain = "a block of plaintext, 32 bytes..".getBytes(StandardCharsets.US_ASCII);
        p11.C_EncryptInit(session, new CK_MECHANISM(CKM_AES_ECB), aes);
        byte[] cipher = p11.C_Encrypt(session, plain);
        assertEquals(plain.length, cipher.length);
        assertFalse(Arrays.equals(plain, cipher));
        p11.C_DecryptInit(session, new CK_MECHANISM(CKM_AES_ECB), aes);
        assertArrayEquals(plain, p11.C_Decrypt(session, cipher));

        p11.C_SignInit(session, new CK_MECHANISM(CKM_MD5_HMAC), hmac);
        byte[] mac = p11.C_Sign(session, plain);
        assertEquals(16, mac.length);
        p11.C_VerifyInit(session, new CK_MECHANISM(CKM_MD5_HMAC), hmac);
        p11.C_VerifyUpdate(session, plain);
        p11.C_VerifyFinal(session, mac);
        // The single-part C_Verify never hands the module the signature.
        p11.C_VerifyInit(session, new CK_MECHANISM(CKM_MD5_HMAC), hmac);
        PKCS11Exception unseen =
                assertThrows(PKCS11Exception.class, () -> p11.C_Verify(session, plain, mac));
        assertEquals(CKR_SIGNATURE_INVALID, unseen.getErrorCode());

        p11.C_DigestInit(session, new CK_MECHANISM(0x250));
        assertEquals(32, p11.C_Digest(session, plain).length);
        byte[] random = new byte[16];
        p11.C_GenerateRandom(session, random);
        assertFalse(Arrays.equals(new byte[16], random));
        p11.C_Logout(session);
        p11.C_CloseSession(session);
        p11.C_Finalize(0);
    }

    @Test
    @Order(2)
    void aFailingModuleResultArrivesWithTheModulesCode() throws Exception {
        p11.C_Initialize(null);
        long session = p11.C_OpenSession(1, 0x6, null);
        PKCS11Exception e = assertThrows(PKCS11Exception.class,
                () -> p11.C_Login(session, 1, "9999".toCharArray()));
        assertEquals(CKR_PIN_INCORRECT, e.getErrorCode());
        p11.C_Finalize(0);
    }

    @Test
    @Order(3)
    void aKilledServiceGivesAllOnesWithinTheChannelTimeout() throws Exception {
        service.destroyForcibly().waitFor();
        long start = System.nanoTime();
        PKCS11Exception e = assertThrows(PKCS11Exception.class, () -> p11.C_GetInfo());
        assertEquals(TestModules.ALL_ONES, e.getErrorCode());
        assertTrue(System.nanoTime() - start < 30_000_000_000L, "within the 30-second timeout");
    }
}
