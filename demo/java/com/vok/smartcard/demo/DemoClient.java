package com.vok.smartcard.demo;

import com.vok.smartcard.pkcs11.CK_ATTRIBUTE;
import com.vok.smartcard.pkcs11.CK_INFO;
import com.vok.smartcard.pkcs11.CK_MECHANISM;
import com.vok.smartcard.pkcs11.CK_TOKEN_INFO;
import com.vok.smartcard.pkcs11.PKCS11Exception;
import com.vok.smartcard.pkcs11.Pkcs11;
import java.io.ByteArrayOutputStream;
import java.io.IOException;
import java.io.InputStream;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.nio.file.Paths;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.Base64;
import java.util.List;
import java.util.Locale;

/**
 * The demo's client application, in Java: it reaches the service as its client and uses the
 * token behind it, one step per line with the time each took, then a summary. The exit status
 * is 0 only when every step checked out.
 *
 * <p>Usage: {@code DemoClient <serverId> <userPin> <fileToDigest>}.
 */
public final class DemoClient {
    private static final long CKF_RW_SERIAL_SESSION = 0x6;
    private static final long CKF_TOKEN_INITIALIZED = 0x400;
    private static final long CKS_RW_USER_FUNCTIONS = 3;
    private static final long CKM_RSA_PKCS_KEY_PAIR_GEN = 0x0;
    private static final long CKM_SHA256_RSA_PKCS = 0x40;
    private static final long CKM_SHA256 = 0x250;
    private static final long CKM_EC_KEY_PAIR_GEN = 0x1040;
    private static final long CKM_ECDSA = 0x1041;
    private static final long CKM_AES_KEY_GEN = 0x1080;
    private static final long CKM_AES_CBC_PAD = 0x1085;
    private static final long CKA_TOKEN = 0x1;
    private static final long CKA_VALUE_LEN = 0x161;
    private static final long CKA_ENCRYPT = 0x104;
    private static final long CKA_DECRYPT = 0x105;
    private static final long CKA_SIGN = 0x108;
    private static final long CKA_VERIFY = 0x10A;
    private static final long CKA_SENSITIVE = 0x103;
    private static final long CKA_EXTRACTABLE = 0x162;
    private static final long CKA_MODULUS = 0x120;
    private static final long CKA_MODULUS_BITS = 0x121;
    private static final long CKA_PUBLIC_EXPONENT = 0x122;
    private static final long CKA_EC_PARAMS = 0x180;
    private static final long CKA_EC_POINT = 0x181;
    private static final long CKR_SIGNATURE_INVALID = 0xC0;

    /** DER of the P-256 curve's name, 1.2.840.10045.3.1.7. */
    private static final byte[] P256 = hexBytes("06082a8648ce3d030107");
    private static final byte[] MESSAGE =
            "Signed on the token, behind the proxy.".getBytes(StandardCharsets.US_ASCII);

    private final String serverId;
    private final char[] pin;
    private final Path file;
    private final Path work;
    private final Pkcs11 p11 = new Pkcs11();
    private long session;
    private final long[] ec = new long[2];   // public, private
    private final long[] rsa = new long[2];
    private byte[] ecSignature;
    private byte[] rsaSignature;

    private DemoClient(String serverId, String pin, Path file) throws IOException {
        this.serverId = serverId;
        this.pin = pin.toCharArray();
        this.file = file;
        this.work = Files.createTempDirectory("vok-demo-java");
    }

    private interface Step {
        String run() throws Exception;  // what it showed; throws when it did not check out
    }

    private final List<String> names = new ArrayList<>();
    private final List<Step> steps = new ArrayList<>();

    private void step(String name, Step run) {
        names.add(name);
        steps.add(run);
    }

    private void define() {
        step("connect", () -> {
            p11.initializeLibrary();
            p11.connect(Pkcs11.WRAPPER_LIBRARY_NAME, Pkcs11.DEFAULT_FUNCTION_LIST_NAME, serverId,
                    Pkcs11.ROLE_CLIENT);
            p11.C_Initialize(null);
            return "Java client connected to service \"" + serverId + "\", C_Initialize";
        });
        step("library", () -> {
            CK_INFO info = p11.C_GetInfo();
            return "C_GetInfo: \"" + text(info.manufacturerID) + "\", Cryptoki "
                    + info.cryptokiVersion.major + "." + info.cryptokiVersion.minor + ", library "
                    + info.libraryVersion.major + "." + info.libraryVersion.minor;
        });
        step("token", () -> {
            long[] slots = p11.C_GetSlotList(true);
            expect(slots.length > 0, "no slot with a token");
            CK_TOKEN_INFO info = p11.C_GetTokenInfo(slots[0]);
            expect((info.flags & CKF_TOKEN_INITIALIZED) != 0, "token not initialised");
            session = p11.C_OpenSession(slots[0], CKF_RW_SERIAL_SESSION, null);
            return "slot " + slots[0] + ": \"" + text(info.label) + "\", "
                    + text(info.manufacturerID) + " " + text(info.model) + ", serial "
                    + text(info.serialNumber) + "; session open";
        });
        step("login", () -> {
            p11.C_Login(session, 1, pin);
            expect(p11.C_GetSessionInfo(session).state == CKS_RW_USER_FUNCTIONS,
                    "session not in the user's state");
            return "C_Login as the token's user; session state: user functions";
        });
        step("aes-256", () -> {
            long key = p11.C_GenerateKey(session, new CK_MECHANISM(CKM_AES_KEY_GEN),
                    new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_VALUE_LEN, 32L),
                        new CK_ATTRIBUTE(CKA_TOKEN, false), new CK_ATTRIBUTE(CKA_ENCRYPT, true),
                        new CK_ATTRIBUTE(CKA_DECRYPT, true), new CK_ATTRIBUTE(CKA_SENSITIVE, true),
                        new CK_ATTRIBUTE(CKA_EXTRACTABLE, false)});
            byte[] iv = new byte[16];
            p11.C_GenerateRandom(session, iv);
            CK_MECHANISM cbcPad = new CK_MECHANISM(CKM_AES_CBC_PAD, iv);
            byte[] plain = "A message for the AES key on the token."
                    .getBytes(StandardCharsets.US_ASCII);
            p11.C_EncryptInit(session, cbcPad, key);
            byte[] cipher = p11.C_Encrypt(session, plain);
            p11.C_DecryptInit(session, cbcPad, key);
            byte[] back = p11.C_Decrypt(session, cipher);
            expect(cipher.length == 48, "ciphertext of " + cipher.length + " bytes");
            expect(Arrays.equals(back, plain), "decryption gave other bytes");
            return "key generated on the token; CBC-PAD: " + plain.length + " bytes -> "
                    + cipher.length + " encrypted -> decrypted back";
        });
        step("ec-p256", () -> {
            long[] pair = p11.C_GenerateKeyPair(session, new CK_MECHANISM(CKM_EC_KEY_PAIR_GEN),
                    new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_EC_PARAMS, P256),
                        new CK_ATTRIBUTE(CKA_TOKEN, false), new CK_ATTRIBUTE(CKA_VERIFY, true)},
                    privateTemplate());
            System.arraycopy(pair, 0, ec, 0, 2);
            // The token digests, then signs the digest with plain ECDSA: SoftHSM2 2.6
            // offers no ECDSA with SHA-256 in one mechanism.
            p11.C_DigestInit(session, new CK_MECHANISM(CKM_SHA256));
            byte[] digest = p11.C_Digest(session, MESSAGE);
            p11.C_SignInit(session, new CK_MECHANISM(CKM_ECDSA), ec[1]);
            ecSignature = p11.C_Sign(session, digest);
            expect(ecSignature.length == 64, "signature of " + ecSignature.length + " bytes");
            return "key pair generated on the token; SHA-256 digest and ECDSA signature made on"
                    + " the token: " + hex(ecSignature).substring(0, 16) + "...";
        });
        step("rsa-2048", () -> {
            long[] pair = p11.C_GenerateKeyPair(session,
                    new CK_MECHANISM(CKM_RSA_PKCS_KEY_PAIR_GEN),
                    new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_MODULUS_BITS, 2048L),
                        new CK_ATTRIBUTE(CKA_PUBLIC_EXPONENT, new byte[] {1, 0, 1}),
                        new CK_ATTRIBUTE(CKA_TOKEN, false), new CK_ATTRIBUTE(CKA_VERIFY, true)},
                    privateTemplate());
            System.arraycopy(pair, 0, rsa, 0, 2);
            p11.C_SignInit(session, new CK_MECHANISM(CKM_SHA256_RSA_PKCS), rsa[1]);
            rsaSignature = p11.C_Sign(session, MESSAGE);
            expect(rsaSignature.length == 256, "signature of " + rsaSignature.length + " bytes");
            return "key pair generated on the token; SHA256-RSA-PKCS signature made on the"
                    + " token: " + hex(rsaSignature).substring(0, 16) + "...";
        });
        // The single-part C_Verify never hands the module the signature, so the proxy
        // verifies in parts, which SoftHSM2 2.6 offers for RSA, not for ECDSA.
        step("verify", () -> {
            verifyRsa(MESSAGE);
            byte[] changed = MESSAGE.clone();
            changed[changed.length - 1] ^= 1;
            try {
                verifyRsa(changed);
                throw new IllegalStateException("a changed message was not rejected");
            } catch (PKCS11Exception e) {
                expect(e.getErrorCode() == CKR_SIGNATURE_INVALID, "changed message: " + e);
            }
            return "RSA signature checked on the token with C_VerifyUpdate/C_VerifyFinal:"
                    + " valid; changed message: CKR_SIGNATURE_INVALID";
        });
        step("openssl", () -> {
            byte[] point = attribute(ec[0], CKA_EC_POINT);  // an OCTET STRING around the point
            byte[] ecKey = der(0x30, der(0x30, hexBytes("06072a8648ce3d0201"), P256),
                    der(0x03, new byte[] {0}, Arrays.copyOfRange(point, 2, point.length)));
            byte[] half = Arrays.copyOf(ecSignature, 32);
            byte[] ecDer = der(0x30, derInteger(half),
                    derInteger(Arrays.copyOfRange(ecSignature, 32, 64)));
            opensslVerifies("EC", ecKey, ecDer);
            byte[] rsaKey = der(0x30, der(0x30, hexBytes("06092a864886f70d0101010500")),
                    der(0x03, new byte[] {0}, der(0x30,
                            derInteger(attribute(rsa[0], CKA_MODULUS)),
                            derInteger(attribute(rsa[0], CKA_PUBLIC_EXPONENT)))));
            opensslVerifies("RSA", rsaKey, rsaSignature);
            return "openssl dgst -verify accepts both signatures with the public keys read from"
                    + " the token (CKA_EC_POINT; CKA_MODULUS, CKA_PUBLIC_EXPONENT)";
        });
        step("sha-256", () -> {
            byte[] content = Files.readAllBytes(file);
            p11.C_DigestInit(session, new CK_MECHANISM(CKM_SHA256));
            String onToken = hex(p11.C_Digest(session, content));
            String reference = run("sha256sum", file.toString()).substring(0, 64);
            expect(onToken.equals(reference), "token " + onToken + ", sha256sum " + reference);
            return file + " (" + content.length + " bytes): " + onToken.substring(0, 16)
                    + "... equals sha256sum";
        });
        step("random", () -> {
            byte[] random = new byte[32];
            p11.C_GenerateRandom(session, random);
            expect(!Arrays.equals(random, new byte[32]), "32 zero bytes");
            return "C_GenerateRandom: " + hex(random);
        });
        step("finish", () -> {
            p11.C_Logout(session);
            p11.C_CloseSession(session);
            p11.C_Finalize(0);
            p11.disconnect();
            return "C_Logout, C_CloseSession, C_Finalize, disconnect";
        });
    }

    private static CK_ATTRIBUTE[] privateTemplate() {
        return new CK_ATTRIBUTE[] {new CK_ATTRIBUTE(CKA_TOKEN, false),
            new CK_ATTRIBUTE(CKA_SIGN, true), new CK_ATTRIBUTE(CKA_SENSITIVE, true)};
    }

    private void verifyRsa(byte[] message) throws PKCS11Exception {
        p11.C_VerifyInit(session, new CK_MECHANISM(CKM_SHA256_RSA_PKCS), rsa[0]);
        p11.C_VerifyUpdate(session, message);
        p11.C_VerifyFinal(session, rsaSignature);
    }

    private byte[] attribute(long object, long type) throws PKCS11Exception {
        CK_ATTRIBUTE[] template = {new CK_ATTRIBUTE(type)};
        p11.C_GetAttributeValue(session, object, template);
        expect(template[0].pValue instanceof byte[], "no value of attribute " + type);
        return (byte[]) template[0].pValue;
    }

    /** OpenSSL's command line checks a SHA-256 signature of MESSAGE with a DER public key. */
    private void opensslVerifies(String what, byte[] publicKey, byte[] signature)
            throws IOException, InterruptedException {
        Path key = work.resolve(what + ".pem");
        Path sig = work.resolve(what + ".sig");
        Path data = work.resolve("message");
        String pem = "-----BEGIN PUBLIC KEY-----\n"
                + Base64.getMimeEncoder(64, new byte[] {'\n'}).encodeToString(publicKey)
                + "\n-----END PUBLIC KEY-----\n";
        Files.write(key, pem.getBytes(StandardCharsets.US_ASCII));
        Files.write(sig, signature);
        Files.write(data, MESSAGE);
        String said = run("openssl", "dgst", "-sha256", "-verify", key.toString(), "-signature",
                sig.toString(), data.toString());
        expect(said.trim().equals("Verified OK"), "OpenSSL on the " + what + " signature: " + said);
    }

    /** Runs a command; its standard output, or IllegalStateException when it fails. */
    private static String run(String... command) throws IOException, InterruptedException {
        Process process = new ProcessBuilder(command).redirectErrorStream(true).start();
        ByteArrayOutputStream out = new ByteArrayOutputStream();
        try (InputStream in = process.getInputStream()) {
            byte[] chunk = new byte[4096];
            for (int n; (n = in.read(chunk)) > 0; ) {
                out.write(chunk, 0, n);
            }
        }
        String text = new String(out.toByteArray(), StandardCharsets.UTF_8);
        expect(process.waitFor() == 0, String.join(" ", command) + " failed: " + text);
        return text;
    }

    // ---- DER, just enough for two public keys and an ECDSA signature -------------------

    private static byte[] der(int tag, byte[]... parts) {
        ByteArrayOutputStream content = new ByteArrayOutputStream();
        for (byte[] part : parts) {
            content.write(part, 0, part.length);
        }
        int length = content.size();
        ByteArrayOutputStream all = new ByteArrayOutputStream();
        all.write(tag);
        if (length < 0x80) {
            all.write(length);
        } else {
            int bytes = length < 0x100 ? 1 : length < 0x10000 ? 2 : 3;
            all.write(0x80 | bytes);
            for (int i = bytes - 1; i >= 0; i--) {
                all.write(length >> (8 * i));
            }
        }
        byte[] body = content.toByteArray();
        all.write(body, 0, body.length);
        return all.toByteArray();
    }

    /** A positive INTEGER from big-endian magnitude bytes. */
    private static byte[] derInteger(byte[] magnitude) {
        int start = 0;
        while (start < magnitude.length - 1 && magnitude[start] == 0) {
            start++;
        }
        byte[] value = Arrays.copyOfRange(magnitude, start, magnitude.length);
        return (value[0] & 0x80) != 0 ? der(0x02, new byte[] {0}, value) : der(0x02, value);
    }

    // ---- Text -------------------------------------------------------------------------

    private static void expect(boolean condition, String what) {
        if (!condition) {
            throw new IllegalStateException(what);
        }
    }

    private static String text(char[] padded) {
        return new String(padded).trim();
    }

    private static String hex(byte[] bytes) {
        StringBuilder text = new StringBuilder();
        for (byte b : bytes) {
            text.append(String.format(Locale.ROOT, "%02x", b & 0xff));
        }
        return text.toString();
    }

    private static byte[] hexBytes(String hex) {
        byte[] bytes = new byte[hex.length() / 2];
        for (int i = 0; i < bytes.length; i++) {
            bytes[i] = (byte) Integer.parseInt(hex.substring(2 * i, 2 * i + 2), 16);
        }
        return bytes;
    }

    private int runAll() {
        int passed = 0;
        long begin = System.nanoTime();
        for (int i = 0; i < steps.size(); i++) {
            long start = System.nanoTime();
            String shown;
            String verdict = "ok  ";
            try {
                shown = steps.get(i).run();
                passed++;
            } catch (Exception e) {
                shown = e instanceof PKCS11Exception ? "PKCS11Exception " + e.getMessage()
                        : String.valueOf(e.getMessage());
                verdict = "FAIL";
            }
            System.out.printf(Locale.ROOT, "%s [%8.1f ms] %-8s %s%n", verdict, millis(start),
                    names.get(i), shown);
            System.out.flush();
        }
        System.out.printf(Locale.ROOT, "summary: %d of %d steps checked out in %.1f ms%n", passed,
                steps.size(), millis(begin));
        return passed == steps.size() ? 0 : 1;
    }

    private static double millis(long start) {
        return (System.nanoTime() - start) / 1e6;
    }

    public static void main(String[] args) throws IOException {
        if (args.length != 3) {
            System.err.println("usage: DemoClient <serverId> <userPin> <fileToDigest>");
            System.exit(2);
        }
        DemoClient demo = new DemoClient(args[0], args[1], Paths.get(args[2]));
        demo.define();
        int status = demo.runAll();
        for (String name : new String[] {"EC.pem", "EC.sig", "RSA.pem", "RSA.sig", "message"}) {
            Files.deleteIfExists(demo.work.resolve(name));
        }
        Files.deleteIfExists(demo.work);
        System.exit(status);
    }
}
