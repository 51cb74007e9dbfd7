package com.vok.smartcard.pkcs11;

import static com.vok.smartcard.pkcs11.Pkcs11Text.hex;
import static com.vok.smartcard.pkcs11.Pkcs11Text.text;
import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;
import static org.junit.jupiter.api.Assertions.fail;

import java.lang.reflect.InvocationTargetException;
import java.lang.reflect.Method;
import java.lang.reflect.Modifier;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.Collections;
import java.util.List;
import java.util.Set;
import java.util.TreeSet;
import java.util.function.Consumer;
import org.junit.jupiter.api.BeforeAll;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Test;

/**
 * Every C_ method of Pkcs11 against the fake vendor module in this process (no channel): what
 * reached the module, as its call record shows it, and what came back to Java. The values of
 * the structures and attributes are the converters' tables'; here one value per method shows
 * that it reached its own function and brought back its own result.
 */
class Pkcs11MethodsTest {
    private static final long SLOT = 1;
    private static final long SESSION = 1;
    private static final long HMAC = 0x100000001L;  // the fake's first object handle
    private static final long COPY = HMAC + 1;
    private static final long AES = HMAC + 2;
    private static final long RSA_PUBLIC = HMAC + 3;
    private static final long RSA_PRIVATE = HMAC + 4;
    private static final long CKF_RW_SERIAL = 0x6;
    private static final long CKA_CLASS = 0x0;
    private static final long CKA_LABEL = 0x3;
    private static final long CKA_VALUE = 0x11;
    private static final long CKA_ENCRYPT = 0x104;
    private static final long CKA_SIGN = 0x108;
    private static final long CKA_VALUE_LEN = 0x161;
    private static final long CKA_WRAP_TEMPLATE = 0x40000211L;
    private static final long CKR_BUFFER_TOO_SMALL = 0x150;

    private static final byte[] DATA = {'a', 'b', 'c'};
    private static final byte[] HMAC_VALUE = bytes(16, 1, 1);
    private static final byte[] IV = bytes(16, 0x11, 0);
    private static final byte[] BLOCK = bytes(16, '0', 1);

    private static Pkcs11 p11;
    private static long vendor;

    private byte[] cipher;
    private final byte[] random = new byte[8];
    private final CK_ATTRIBUTE[] readBack = {new CK_ATTRIBUTE(CKA_LABEL, "old".toCharArray()),
        new CK_ATTRIBUTE(CKA_CLASS), new CK_ATTRIBUTE(CKA_SIGN), new CK_ATTRIBUTE(CKA_VALUE)};
    private final CK_ATTRIBUTE[] wrapTemplate = {new CK_ATTRIBUTE(CKA_WRAP_TEMPLATE)};

    @BeforeAll
    static void connectTheFakeVendor() throws Exception {
        p11 = new Pkcs11();
        p11.initializeLibrary();
        p11.connect(TestModules.fakeVendor(), Pkcs11.DEFAULT_FUNCTION_LIST_NAME, null,
                Pkcs11.ROLE_CLIENT);
        vendor = NativeProbe.openVendor(TestModules.fakeVendor());
    }

    @BeforeEach
    void freshToken() {
        NativeProbe.resetVendor(vendor);
    }

    // ---- The table: one row per call, in the order a token's life runs ----------------

    private interface Step {
        Object run() throws Exception;
    }

    private interface VoidStep {
        void run() throws Exception;
    }

    private static Step v(VoidStep step) {
        return () -> {
            step.run();
            return null;
        };
    }

    private static final class Row {
        final String function;
        final int calls;
        final Step step;
        final Consumer<Object> check;  // the result, or the PKCS11Exception of a failing row
        final String[] seen;  // lines of the last call; "first:" lines of the first
        final boolean fails;

        Row(String function, int calls, Step step, Consumer<Object> check, boolean fails,
                String... seen) {
            this.function = function;
            this.calls = calls;
            this.step = step;
            this.check = check;
            this.fails = fails;
            this.seen = seen;
        }
    }

    private static Row row(String function, int calls, Step step, Consumer<Object> check,
            String... seen) {
        return new Row(function, calls, step, check, false, seen);
    }

    /** A void method that makes one call. */
    private static Row call(String function, VoidStep step, String... seen) {
        return new Row(function, 1, v(step), r -> { }, false, seen);
    }

    private static Row fails(long rv, String function, int calls, Step step, String... seen) {
        return new Row(function, calls, step,
                r -> assertEquals(rv, ((PKCS11Exception) r).getErrorCode()), true, seen);
    }

    private static Consumer<Object> is(Object expected) {
        return r -> assertEquals(expected, r);
    }

    /** The module is told what to answer; exactly those bytes come back to Java. */
    private static Row answers(String function, int calls, byte[] reply, Step step,
            String... seen) {
        return row(function, calls, () -> {
            NativeProbe.setNextVendorOutput(vendor, function, reply);
            return step.run();
        }, isBytes(reply), seen);
    }

    private static Consumer<Object> isBytes(byte[] expected) {
        return r -> assertArrayEquals(expected, (byte[]) r);
    }

    private static Consumer<Object> lengthIs(int length) {
        return r -> assertEquals(length, ((byte[]) r).length);
    }

    private List<Row> table() {
        CK_MECHANISM hmac = new CK_MECHANISM(0x211);  // CKM_MD5_HMAC
        CK_MECHANISM ecb = new CK_MECHANISM(0x1081);
        CK_MECHANISM cbc = new CK_MECHANISM(0x1082, IV);
        CK_MECHANISM x509 = new CK_MECHANISM(0x3);
        CK_MECHANISM sha256 = new CK_MECHANISM(0x250);
        CK_ATTRIBUTE[] nested = {new CK_ATTRIBUTE(CKA_CLASS, 0L), new CK_ATTRIBUTE(
            CKA_WRAP_TEMPLATE, new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_ENCRYPT, true),
                new CK_ATTRIBUTE(CKA_VALUE_LEN, 16L)})};
        // Two entries of the module's CK_ATTRIBUTE: 20 bytes with 4-byte pointers, else 24.
        int entries = 2 * ("32".equals(System.getProperty("sun.arch.data.model")) ? 20 : 24);
        return Arrays.asList(
            call("C_Initialize", () -> p11.C_Initialize(null), "pInitArgs 1 0 - 0"),
            row("C_GetInfo", 1, () -> p11.C_GetInfo(), r -> assertEquals("\"Fake vendor module\"",
                text(((CK_INFO) r).libraryDescription)), "pInfo 0 0 - 0"),
            row("C_GetSlotList", 2, () -> p11.C_GetSlotList(true), r -> assertArrayEquals(
                new long[] {SLOT}, (long[]) r), "first:pSlotList 1 0 - 0", "tokenPresent 1 1 - 0",
                "pulCount 0 1 - 0"),
            row("C_GetSlotInfo", 1, () -> p11.C_GetSlotInfo(SLOT), r -> assertEquals(
                "\"Fake slot 1\"", text(((CK_SLOT_INFO) r).slotDescription)), "slotID 1 1 - 0"),
            row("C_GetTokenInfo", 1, () -> p11.C_GetTokenInfo(SLOT), r -> assertEquals(
                "\"FAKE-1\"", text(((CK_TOKEN_INFO) r).serialNumber)), "slotID 1 1 - 0"),
            row("C_GetMechanismList", 2, () -> p11.C_GetMechanismList(SLOT), r -> assertTrue(
                Arrays.stream((long[]) r).anyMatch(m -> m == 0x1082)),
                "first:pMechanismList 1 0 - 0", "pulCount 0 9 - 0"),
            // A second call that finds the buffer too small fails rather than cut the list.
            fails(CKR_BUFFER_TOO_SMALL, "C_GetMechanismList", 2, () -> {
                NativeProbe.setNextVendorRv(vendor, "C_GetMechanismList", 0);  // a count of 0
                NativeProbe.setNextVendorRv(vendor, "C_GetMechanismList", CKR_BUFFER_TOO_SMALL);
                return p11.C_GetMechanismList(SLOT);
            }),
            row("C_GetMechanismInfo", 1, () -> p11.C_GetMechanismInfo(SLOT, 0x1080),
                r -> assertEquals(32, ((CK_MECHANISM_INFO) r).ulMaxKeySize), "type 1 4224 - 0"),
            call("C_InitToken", () -> p11.C_InitToken(SLOT, chars("5678"), chars("fresh")),
                "pPin 0 0 35363738 0", "ulPinLen 1 4 - 0",
                "pLabel 0 0 6672657368" + repeat("20", 27) + " 0"),
            row("C_OpenSession", 1, () -> p11.C_OpenSession(SLOT, CKF_RW_SERIAL, "ignored"),
                is(SESSION), "flags 1 6 - 0", "pApplication 1 0 - 0", "Notify 1 0 - 0"),
            call("C_Login", () -> p11.C_Login(SESSION, 0, chars("5678")), "userType 1 0 - 0",
                "pPin 0 0 35363738 0"),
            call("C_InitPIN", () -> p11.C_InitPIN(SESSION, chars("1234")),
                "pPin 0 0 31323334 0", "ulPinLen 1 4 - 0"),
            call("C_SetPIN", () -> p11.C_SetPIN(SESSION, chars("5678"), chars("87654")),
                "pOldPin 0 0 35363738 0", "pNewPin 0 0 3837363534 0", "ulNewLen 1 5 - 0"),
            call("C_Logout", () -> p11.C_Logout(SESSION), "hSession 1 1 - 0"),
            call("C_Login", () -> p11.C_Login(SESSION, 1, chars("1234")), "userType 1 1 - 0"),
            row("C_GetSessionInfo", 1, () -> p11.C_GetSessionInfo(SESSION), r -> assertEquals(3,
                ((CK_SESSION_INFO) r).state), "hSession 1 1 - 0"),  // read/write user functions
            row("C_CreateObject", 1, () -> p11.C_CreateObject(SESSION, hmacKeyTemplate()),
                is(HMAC), "pTemplate 0 0 - 7 0 0 8 0400000000000000 256 0 8 1000000000000000"
                    + " 17 0 16 0102030405060708090a0b0c0d0e0f10 3 0 4 686d6163 264 0 1 01"
                    + " 266 0 1 01 268 0 1 01", "ulCount 1 7 - 0"),
            row("C_GetAttributeValue", 2, v(() -> p11.C_GetAttributeValue(SESSION, HMAC, readBack)),
                r -> assertArrayEquals(new Object[] {chars("hmac"), 4L, true, HMAC_VALUE},
                    Arrays.stream(readBack).map(a -> a.pValue).toArray()),
                "first:pTemplate 0 0 - 4 3 1 0 - 0 1 0 - 264 1 0 - 17 1 0 -",
                "pTemplate 0 0 - 4 3 0 4 00000000 0 0 8 " + repeat("00", 8) + " 264 0 1 00 17 0 16 "
                    + repeat("00", 16), "hObject 1 4294967297 - 0"),
            call("C_SetAttributeValue", () -> p11.C_SetAttributeValue(SESSION, HMAC, label("mac2")),
                "hObject 1 4294967297 - 0", "pTemplate 0 0 - 1 3 0 4 6d616332"),
            row("C_CopyObject", 1, () -> p11.C_CopyObject(SESSION, HMAC, label("copy")), is(COPY),
                "hObject 1 4294967297 - 0", "pTemplate 0 0 - 1 3 0 4 636f7079"),
            row("C_GetObjectSize", 1, () -> p11.C_GetObjectSize(SESSION, COPY),
                r -> assertTrue((Long) r > HMAC_VALUE.length), "hObject 1 4294967298 - 0"),
            call("C_FindObjectsInit", () -> p11.C_FindObjectsInit(SESSION, label("copy")),
                "pTemplate 0 0 - 1 3 0 4 636f7079"),
            row("C_FindObjects", 1, () -> p11.C_FindObjects(SESSION, 0), r -> assertArrayEquals(
                new long[0], (long[]) r), "ulMaxObjectCount 1 0 - 0"),  // and takes nothing
            row("C_FindObjects", 1, () -> p11.C_FindObjects(SESSION, 10), r -> assertArrayEquals(
                new long[] {COPY}, (long[]) r), "ulMaxObjectCount 1 10 - 0"),
            call("C_FindObjectsFinal", () -> p11.C_FindObjectsFinal(SESSION), "hSession 1 1 - 0"),
            call("C_DestroyObject", () -> p11.C_DestroyObject(SESSION, COPY),
                "hObject 1 4294967298 - 0"),
            call("C_SignInit", () -> p11.C_SignInit(SESSION, hmac, HMAC),
                "pMechanism 0 0 - 1 529 1 0 -", "hKey 1 4294967297 - 0"),
            call("C_SignUpdate", () -> p11.C_SignUpdate(SESSION, DATA), "pPart 0 0 616263 0",
                "ulPartLen 1 3 - 0"),
            answers("C_SignFinal", 2, reply(0x10, 16), () -> p11.C_SignFinal(SESSION),
                "first:pSignature 1 0 - 0", "pulSignatureLen 0 16 - 0"),
            answers("C_Sign", 1, reply(0x20, 20), () -> p11.C_Sign(SESSION, DATA),
                "pData 0 0 616263 0", "pulSignatureLen 0 512 - 0"),
            call("C_VerifyInit", () -> p11.C_VerifyInit(SESSION, x509, RSA_PUBLIC),
                "pMechanism 0 0 - 1 3 1 0 -", "hKey 1 4294967300 - 0"),
            call("C_VerifyUpdate", () -> p11.C_VerifyUpdate(SESSION, BLOCK), "pPart 0 0 "
                + hex(BLOCK) + " 0"),
            call("C_VerifyFinal", () -> p11.C_VerifyFinal(SESSION, reply(0x30, 15)),
                "pSignature 0 0 " + hex(reply(0x30, 15)) + " 0", "ulSignatureLen 1 15 - 0"),
            call("C_Verify", () -> p11.C_Verify(SESSION, DATA, reply(0x40, 14)),
                "pData 0 0 616263 0", "pSignature 0 0 " + hex(reply(0x40, 14)) + " 0",
                "ulSignatureLen 1 14 - 0"),
            row("C_GenerateKey", 1, () -> p11.C_GenerateKey(SESSION, new CK_MECHANISM(0x1080),
                aesKeyTemplate()), is(AES), "pMechanism 0 0 - 1 4224 1 0 -", "pTemplate 0 0 - 5"
                    + " 353 0 8 1000000000000000 260 0 1 01 261 0 1 01 262 0 1 01 263 0 1 01"),
            call("C_EncryptInit", () -> p11.C_EncryptInit(SESSION, cbc, AES),
                "pMechanism 0 0 - 1 4226 0 16 " + hex(IV), "hKey 1 4294967299 - 0"),
            // One call into 260 bytes: a longer result is not asked for again.
            fails(CKR_BUFFER_TOO_SMALL, "C_Encrypt", 1, () -> p11.C_Encrypt(SESSION,
                new byte[261]), "pulEncryptedDataLen 0 260 - 0"),
            row("C_Encrypt", 1, () -> cipher = p11.C_Encrypt(SESSION, BLOCK), lengthIs(16),
                "ulDataLen 1 16 - 0", "pulEncryptedDataLen 0 260 - 0"),
            call("C_DecryptInit", () -> p11.C_DecryptInit(SESSION, cbc, AES),
                "pMechanism 0 0 - 1 4226 0 16 " + hex(IV)),
            row("C_Decrypt", 2, () -> p11.C_Decrypt(SESSION, cipher), isBytes(BLOCK),
                "first:pData 1 0 - 0", "pulDataLen 0 16 - 0"),
            call("C_EncryptInit", () -> p11.C_EncryptInit(SESSION, ecb, AES),
                "pMechanism 0 0 - 1 4225 1 0 -"),
            row("C_EncryptUpdate", 2, () -> p11.C_EncryptUpdate(SESSION, BLOCK),
                r -> isBytes(cipher).accept(r), "first:pEncryptedPart 1 0 - 0",
                "pulEncryptedPartLen 0 16 - 0"),
            row("C_EncryptFinal", 2, () -> p11.C_EncryptFinal(SESSION), lengthIs(0),
                "first:pLastEncryptedPart 1 0 - 0"),
            call("C_DecryptInit", () -> p11.C_DecryptInit(SESSION, ecb, AES)),
            row("C_DecryptUpdate", 2, () -> p11.C_DecryptUpdate(SESSION, cipher), isBytes(BLOCK),
                "first:pPart 1 0 - 0", "pulPartLen 0 16 - 0"),
            row("C_DecryptFinal", 2, () -> p11.C_DecryptFinal(SESSION), lengthIs(0),
                "first:pLastPart 1 0 - 0"),
            call("C_DigestInit", () -> p11.C_DigestInit(SESSION, sha256),
                "pMechanism 0 0 - 1 592 1 0 -"),
            answers("C_Digest", 1, reply(0x50, 32), () -> p11.C_Digest(SESSION, DATA),
                "pData 0 0 616263 0", "pulDigestLen 0 65 - 0"),
            call("C_DigestUpdate", () -> p11.C_DigestUpdate(SESSION, IV), "pPart 0 0 " + hex(IV)
                + " 0"),
            call("C_DigestKey", () -> p11.C_DigestKey(SESSION, AES), "hKey 1 4294967299 - 0"),
            answers("C_DigestFinal", 2, reply(0x60, 31), () -> p11.C_DigestFinal(SESSION),
                "first:pDigest 1 0 - 0", "pulDigestLen 0 31 - 0"),
            answers("C_GetOperationState", 2, reply(0x70, 12),
                () -> p11.C_GetOperationState(SESSION), "first:pOperationState 1 0 - 0",
                "pulOperationStateLen 0 12 - 0"),
            call("C_SetOperationState", () -> p11.C_SetOperationState(SESSION, reply(0x80, 11),
                AES, HMAC), "pOperationState 0 0 " + hex(reply(0x80, 11)) + " 0",
                "ulOperationStateLen 1 11 - 0", "hEncryptionKey 1 4294967299 - 0",
                "hAuthenticationKey 1 4294967297 - 0"),
            answers("C_DigestEncryptUpdate", 2, reply(0x90, 17),
                () -> p11.C_DigestEncryptUpdate(SESSION, BLOCK), "first:pEncryptedPart 1 0 - 0",
                "pPart 0 0 " + hex(BLOCK) + " 0", "pulEncryptedPartLen 0 17 - 0"),
            answers("C_DecryptDigestUpdate", 2, reply(0xa0, 18),
                () -> p11.C_DecryptDigestUpdate(SESSION, IV), "first:pPart 1 0 - 0",
                "pEncryptedPart 0 0 " + hex(IV) + " 0", "pulPartLen 0 18 - 0"),
            answers("C_SignEncryptUpdate", 2, reply(0xb0, 19),
                () -> p11.C_SignEncryptUpdate(SESSION, DATA), "first:pEncryptedPart 1 0 - 0",
                "pPart 0 0 616263 0", "pulEncryptedPartLen 0 19 - 0"),
            answers("C_DecryptVerifyUpdate", 2, reply(0xc0, 21),
                () -> p11.C_DecryptVerifyUpdate(SESSION, reply(0xd0, 5)), "first:pPart 1 0 - 0",
                "pEncryptedPart 0 0 " + hex(reply(0xd0, 5)) + " 0", "pulPartLen 0 21 - 0"),
            // C_Sign offers 512 bytes, then asks again with the length the module names.
            answers("C_Sign", 2, reply(0xe0, 600), () -> p11.C_Sign(SESSION, DATA),
                "first:C_Sign 336\n", "first:pulSignatureLen 0 512 - 0",
                "pulSignatureLen 0 600 - 0"),
            row("C_GenerateKeyPair", 1, () -> p11.C_GenerateKeyPair(SESSION, new CK_MECHANISM(0),
                new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(0x121, 512L), new CK_ATTRIBUTE(0x10B, true)},
                new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(0x109, true)}),
                r -> assertArrayEquals(new long[] {RSA_PUBLIC, RSA_PRIVATE}, (long[]) r),
                "pMechanism 0 0 - 1 0 1 0 -",
                "pPublicKeyTemplate 0 0 - 2 289 0 8 0002000000000000 267 0 1 01",
                "pPrivateKeyTemplate 0 0 - 1 265 0 1 01"),
            call("C_SignRecoverInit", () -> p11.C_SignRecoverInit(SESSION, x509, RSA_PRIVATE),
                "pMechanism 0 0 - 1 3 1 0 -", "hKey 1 4294967301 - 0"),
            answers("C_SignRecover", 2, reply(0xf0, 4), () -> p11.C_SignRecover(SESSION, DATA),
                "first:pSignature 1 0 - 0", "pData 0 0 616263 0", "pulSignatureLen 0 4 - 0"),
            call("C_VerifyRecoverInit", () -> p11.C_VerifyRecoverInit(SESSION, x509, RSA_PUBLIC),
                "hKey 1 4294967300 - 0"),
            answers("C_VerifyRecover", 2, reply(0x15, 3), () -> p11.C_VerifyRecover(SESSION,
                reply(0x25, 4)), "first:pData 1 0 - 0", "pSignature 0 0 " + hex(reply(0x25, 4))
                + " 0", "pulDataLen 0 3 - 0"),
            answers("C_WrapKey", 2, reply(0x35, 24), () -> p11.C_WrapKey(SESSION, ecb, AES, HMAC),
                "first:pWrappedKey 1 0 - 0", "hWrappingKey 1 4294967299 - 0",
                "hKey 1 4294967297 - 0", "pulWrappedKeyLen 0 24 - 0"),
            row("C_UnwrapKey", 1, () -> p11.C_UnwrapKey(SESSION, ecb, AES, reply(0x45, 16),
                secretTemplate()), is(HMAC + 5), "hUnwrappingKey 1 4294967299 - 0",
                "pWrappedKey 0 0 " + hex(reply(0x45, 16)) + " 0", "ulWrappedKeyLen 1 16 - 0",
                "pTemplate 0 0 - 2 0 0 8 0400000000000000 256 0 8 1000000000000000"),
            row("C_DeriveKey", 1, () -> p11.C_DeriveKey(SESSION, new CK_MECHANISM(0x393), HMAC,
                secretTemplate()), is(HMAC + 6), "pMechanism 0 0 - 1 915 1 0 -",
                "hBaseKey 1 4294967297 - 0", "ulAttributeCount 1 2"),
            // The values inside a template attribute take a third call; pointers the module
            // wrote (here: the stale ones the fake stored with the object) are never followed.
            row("C_CreateObject", 1, () -> p11.C_CreateObject(SESSION, nested), is(HMAC + 7)),
            row("C_GetAttributeValue", 3, v(() -> p11.C_GetAttributeValue(SESSION, HMAC + 7,
                wrapTemplate)), r -> assertArrayEquals(new Object[] {CKA_ENCRYPT, true,
                    CKA_VALUE_LEN, 16L}, Arrays.stream((CK_ATTRIBUTE[]) wrapTemplate[0].pValue)
                    .flatMap(a -> Arrays.stream(new Object[] {a.type, a.pValue})).toArray()),
                "pTemplate 0 0 - 1 1073742353 0 " + entries + " "),
            call("C_SeedRandom", () -> p11.C_SeedRandom(SESSION, new byte[] {9, 8, 7}),
                "pSeed 0 0 090807 0", "ulSeedLen 1 3 - 0"),
            row("C_GenerateRandom", 1, v(() -> p11.C_GenerateRandom(SESSION, random)),
                r -> assertFalse(Arrays.equals(new byte[8], random)),
                "RandomData 0 0 " + repeat("00", 8) + " 0", "ulRandomLen 1 8 - 0"),
            fails(0x51, "C_GetFunctionStatus", 1, v(() -> p11.C_GetFunctionStatus(SESSION)),
                "hSession 1 1 - 0"),
            fails(0x51, "C_CancelFunction", 1, v(() -> p11.C_CancelFunction(SESSION)),
                "hSession 1 1 - 0"),
            fails(0x8, "C_WaitForSlotEvent", 1, () -> p11.C_WaitForSlotEvent(1, 0),
                "flags 1 1 - 0", "pReserved 1 0 - 0"),
            call("C_CloseSession", () -> p11.C_CloseSession(SESSION), "hSession 1 1 - 0"),
            call("C_CloseAllSessions", () -> p11.C_CloseAllSessions(SLOT), "slotID 1 1 - 0"),
            call("C_Finalize", () -> p11.C_Finalize(0), "pReserved 1 0 - 0"));
    }

    @Test
    void everyMethodReachesTheModuleWithItsArgumentsAndBringsBackItsResult() throws Exception {
        Set<String> inTable = new TreeSet<>();
        for (Row row : table()) {
            inTable.add(row.function);
            int before = NativeProbe.vendorCalls(vendor).length;
            Object result;
            try {
                result = row.step.run();
            } catch (PKCS11Exception e) {
                result = e;
            }
            String[] calls = NativeProbe.vendorCalls(vendor);
            List<String> made = Arrays.asList(calls).subList(before, calls.length);
            String where = row.function + ": " + made;
            assertEquals(row.calls, made.size(), where);
            for (String call : made) {
                assertTrue(call.startsWith(row.function + " "), where);
            }
            for (String line : row.seen) {
                String call = line.startsWith("first:") ? made.get(0) : made.get(made.size() - 1);
                assertTrue(call.contains(line.replaceFirst("^first:", "")), line + " in " + where);
            }
            assertEquals(row.fails, result instanceof PKCS11Exception, where + result);
            row.check.accept(result);
        }
        Set<String> names = new TreeSet<>();
        nativeMethods().forEach(m -> names.add(m.getName()));
        assertEquals(names, inTable, "a row for every native method");
    }

    @Test
    void everyMethodOfAnObjectThatIsNotConnectedThrowsBeforeLookingAtItsArguments()
            throws Exception {
        Pkcs11 loose = new Pkcs11();
        int before = NativeProbe.vendorCalls(vendor).length;
        for (Method method : nativeMethods()) {
            Object[] args = Arrays.stream(method.getParameterTypes()).map(t -> poison(t)).toArray();
            Throwable thrown = assertThrows(InvocationTargetException.class,
                    () -> method.invoke(loose, args), method.getName()).getCause();
            assertEquals(PKCS11RuntimeException.class, thrown.getClass(), method.getName());
            assertEquals("This object is not connected to a module.", thrown.getMessage(),
                    method.getName());
        }
        assertEquals(before, NativeProbe.vendorCalls(vendor).length);
    }

    @Test
    void logTextsStayAsTheyWere() throws Exception {
        p11.C_Initialize(null);
        p11.C_OpenSession(SLOT, CKF_RW_SERIAL, null);
        p11.C_DigestInit(SESSION, new CK_MECHANISM(0x250));
        NativeProbe.setNextVendorOutput(vendor, "C_Digest", reply(1, 32));
        NativeProbe.captureLog();
        byte[] first = p11.C_Digest(SESSION, DATA);
        assertEquals(Arrays.asList("3|Java_com_vok_smartcard_pkcs11_Pkcs11_C_1Digest"),
                Arrays.asList(NativeProbe.takeLog("%s")));
        p11.C_DigestInit(SESSION, new CK_MECHANISM(0x250));
        NativeProbe.setNextVendorOutput(vendor, "C_Digest", reply(1, 32));
        NativeProbe.captureLog();
        assertArrayEquals(first, p11.C_Digest(SESSION, DATA));
        List<String> lines = Arrays.asList(NativeProbe.takeLog("[native jni pkcs11wrapper]"));
        assertTrue(lines.containsAll(Arrays.asList("3|date to digest length:3",
                "3|date to digest:abc", "3|ckDigestLength:32")), lines.toString());

        NativeProbe.captureLog();
        assertThrows(PKCS11RuntimeException.class, () -> new Pkcs11().C_Initialize(null));
        assertEquals(Arrays.asList("3|Java_com_vok_smartcard_pkcs11_Pkcs11_C_1Initialize",
                "3|DEBUG: initializing module... ", "3|the entry is not in the list",
                "3|failed getting module entry",
                "3|failed getting module entry"),
                Arrays.asList(NativeProbe.takeLog("[native jni pkcs11wrapper]")));
    }

    // ---- Helpers ----------------------------------------------------------------

    private static List<Method> nativeMethods() {
        List<Method> methods = new ArrayList<>();
        for (Method m : Pkcs11.class.getDeclaredMethods()) {
            if (Modifier.isNative(m.getModifiers()) && m.getName().startsWith("C_")) {
                methods.add(m);
            }
        }
        assertEquals(67, methods.size());
        return methods;
    }

    /** An argument that a method touching it would fail on with another exception. */
    private static Object poison(Class<?> type) {
        Double unconvertible = 1.5;
        if (type == long.class || type == boolean.class) {
            return type == long.class ? (Object) 1L : (Object) true;
        } else if (type == CK_MECHANISM.class) {
            return new CK_MECHANISM(0x1082, unconvertible);
        } else if (type == CK_ATTRIBUTE[].class) {
            return new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_LABEL, unconvertible)};
        } else if (type == CK_C_INITIALIZE_ARGS.class) {
            CK_C_INITIALIZE_ARGS args = new CK_C_INITIALIZE_ARGS();
            args.pReserved = unconvertible;
            return args;
        }
        return null;  // arrays: null
    }

    private static void seenLast(String function, String line) {
        String[] calls = NativeProbe.vendorCalls(vendor);
        for (int i = calls.length - 1; i >= 0; i--) {
            if (calls[i].startsWith(function + " ")) {
                assertTrue(calls[i].contains(line), line + " in " + calls[i]);
                return;
            }
        }
        fail("no call of " + function);
    }

    private static CK_ATTRIBUTE[] hmacKeyTemplate() {
        return new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_CLASS, 4L),
            new CK_ATTRIBUTE(0x100, 0x10L), new CK_ATTRIBUTE(CKA_VALUE, HMAC_VALUE),
            new CK_ATTRIBUTE(CKA_LABEL, chars("hmac")), new CK_ATTRIBUTE(CKA_SIGN, true),
            new CK_ATTRIBUTE(0x10A, true), new CK_ATTRIBUTE(0x10C, true)};
    }

    private static CK_ATTRIBUTE[] aesKeyTemplate() {
        return new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_VALUE_LEN, 16L),
            new CK_ATTRIBUTE(CKA_ENCRYPT, true), new CK_ATTRIBUTE(0x105, true),
            new CK_ATTRIBUTE(0x106, true), new CK_ATTRIBUTE(0x107, true)};
    }

    private static CK_ATTRIBUTE[] secretTemplate() {
        return new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_CLASS, 4L),
            new CK_ATTRIBUTE(0x100, 0x10L)};
    }

    private static CK_ATTRIBUTE[] label(String text) {
        return new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_LABEL, chars(text))};
    }

    private static char[] chars(String text) {
        return text.toCharArray();
    }

    /** Bytes no other row's answer has: its own start and length. */
    private static byte[] reply(int first, int length) {
        return bytes(length, first, 7);
    }

    private static byte[] bytes(int length, int first, int step) {
        byte[] b = new byte[length];
        for (int i = 0; i < length; i++) {
            b[i] = (byte) (first + i * step);
        }
        return b;
    }

    private static String repeat(String text, int times) {
        return String.join("", Collections.nCopies(times, text));
    }
}
