package com.vok.smartcard.pkcs11;

import java.io.IOException;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.nio.file.Paths;
import java.nio.file.StandardCopyOption;
import java.util.List;
import java.util.Random;

/** Paths the build hands to the tests, server ids, and what /proc tells about them. */
final class TestModules {
    static final long CKR_CRYPTOKI_NOT_INITIALIZED = 0x190L;
    /** What a proxy returns when the channel fails. */
    static final long ALL_ONES = -1L;

    private static final Random RANDOM = new Random();

    private TestModules() {
    }

    static String property(String name) {
        String value = System.getProperty(name);
        if (value == null) {
            throw new IllegalStateException("system property " + name + " is not set");
        }
        return value;
    }

    /** The fake vendor module's path. */
    static String fakeVendor() {
        return property("vok.fakeVendor");
    }

    /** The library's own path (not its bare name). */
    static String wrapperPath() {
        return property("vok.wrapper");
    }

    /**
     * A private copy of the fake vendor: the loader treats it as a library of its own, so
     * whether it is mapped tells whether anything still holds it.
     */
    static String fakeVendorCopy() throws IOException {
        Path copy = Files.createTempFile("vokfakevendor-", ".so");
        copy.toFile().deleteOnExit();
        Files.copy(Paths.get(fakeVendor()), copy, StandardCopyOption.REPLACE_EXISTING);
        return copy.toString();
    }

    static boolean isMapped(String library) throws IOException {
        List<String> maps =
                Files.readAllLines(Paths.get("/proc/self/maps"), StandardCharsets.UTF_8);
        for (String line : maps) {
            if (line.endsWith(" " + library)) {
                return true;
            }
        }
        return false;
    }

    /** A server id no other test process uses; its first character is a placeholder. */
    static String uniqueServerId() {
        return "Xvok-junit-" + Long.toHexString(System.nanoTime()) + "-"
                + Integer.toHexString(RANDOM.nextInt());
    }

    /**
     * Waits until a server listens under {@code serverId}: its abstract name is the id from the
     * second character on, zero-padded, which /proc/net/unix prints with '@' for each zero.
     */
    static void awaitListening(String serverId) throws IOException, InterruptedException {
        String name = " @" + serverId.substring(1) + "@";
        for (int attempt = 0; attempt < 200; attempt++) {
            List<String> sockets =
                    Files.readAllLines(Paths.get("/proc/net/unix"), StandardCharsets.UTF_8);
            for (String line : sockets) {
                // Flags 00010000: a listening socket.
                if (line.contains(name) && line.contains(" 00010000 ")) {
                    return;
                }
            }
            Thread.sleep(50);
        }
        throw new IllegalStateException("no server listens under " + serverId);
    }
}
