package com.vok.smartcard.adapter;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.vok.smartcard.pkcs11.Pkcs11;
import java.util.function.LongPredicate;
import org.junit.jupiter.api.Test;

/**
 * The usage time of a server that this process runs, as Java sees it (its -1 while a request is
 * open is the service end-to-end tests').
 */
class UsageTimeTest {
    private static String property(String name) {
        String value = System.getProperty(name);
        if (value == null) {
            throw new IllegalStateException("system property " + name + " is not set");
        }
        return value;
    }

    /** Polls the usage time until it satisfies {@code wanted}; returns the last value. */
    private static long awaitUsage(LongPredicate wanted) throws InterruptedException {
        long usage = SandboxedProcessUsageStatistics.native_getLastUsageTime();
        for (int attempt = 0; attempt < 200 && !wanted.test(usage); attempt++) {
            Thread.sleep(50);
            usage = SandboxedProcessUsageStatistics.native_getLastUsageTime();
        }
        return usage;
    }

    @Test
    void zeroBeforeTrafficThenTheAnswersTime() throws Exception {
        String serverId = "Xvok-usage-" + Long.toHexString(System.nanoTime());
        Pkcs11 service = new Pkcs11();
        service.initializeLibrary();
        service.connect(property("vok.fakeVendor"), Pkcs11.DEFAULT_FUNCTION_LIST_NAME, serverId,
                Pkcs11.ROLE_SERVER);
        assertEquals(0L, SandboxedProcessUsageStatistics.native_getLastUsageTime());

        // A client's handshake is answered: the time is the wall clock's seconds plus the
        // milliseconds within the second. A handshake that straddled a second boundary would
        // leave its request "later" than its answer, so it starts early in a second.
        long inSecond = System.currentTimeMillis() % 1000;
        if (inSecond >= 500) {
            Thread.sleep(1000 - inSecond);
        }
        long before = System.currentTimeMillis() / 1000;
        Pkcs11 client = new Pkcs11();
        client.connect(Pkcs11.WRAPPER_LIBRARY_NAME, Pkcs11.DEFAULT_FUNCTION_LIST_NAME, serverId,
                Pkcs11.ROLE_CLIENT);
        try {
            long usage = awaitUsage(value -> value > 0);
            long after = System.currentTimeMillis() / 1000;
            assertTrue(usage >= before && usage <= after + 999, "usage time " + usage);
        } finally {
            client.disconnect();
        }
    }
}
