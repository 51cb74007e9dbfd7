package com.vok.smartcard.adapter;

import com.vok.smartcard.pkcs11.Pkcs11;

/**
 * When the PKCS#11 service in this process last answered a client, so that whoever runs the
 * sandboxed service can tell an idle service from a busy one.
 */
public final class SandboxedProcessUsageStatistics {
    static {
        // The native method lives in the library that Pkcs11 loads.
        Pkcs11.loadNativeLibrary();
    }

    private SandboxedProcessUsageStatistics() {
    }

    /**
     * Returns the time of the service's last answer, or {@code -1} while a request is being
     * served (or was never answered).
     *
     * <p>The value is the second count of the wall clock plus the milliseconds within that
     * second, so it is good for telling "later" from "earlier" and for rough idle times in
     * seconds, not as a timestamp. It is {@code 0} before the service has answered anything,
     * and in a process that does not serve.
     *
     * @return the last answer's time as described, {@code 0}, or {@code -1}
     */
    public static native long native_getLastUsageTime();
}
