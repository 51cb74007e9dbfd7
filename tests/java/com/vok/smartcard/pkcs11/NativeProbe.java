package com.vok.smartcard.pkcs11;

/** What the tests see of the library's native state; see native_probe.cpp. */
final class NativeProbe {
    static {
        // The probe resolves the library's symbols, so the library comes first.
        Pkcs11.loadNativeLibrary();
        System.load(TestModules.property("vok.probe"));
    }

    private NativeProbe() {
    }

    /** Nodes in the module registry. */
    static native int nodeCount();

    static native boolean isConnected(Object pkcs11);

    /** The registered entry's module name; IllegalStateException when not connected. */
    static native String moduleNameOf(Object pkcs11);

    static native boolean hasFunctionList(Object pkcs11);

    /** C_GetInfo through the object's registered function list. */
    static native long moduleGetInfo(Object pkcs11);

    /** The library's own C_GetInfo proxy: all ones while no channel is open. */
    static native long channelGetInfo();

    static native long openVendor(String path);

    /** The next call of {@code function} in the fake vendor returns {@code rv}. */
    static native void setNextVendorRv(long vendor, String function, long rv);

    /** The next call of {@code function} in the fake vendor writes {@code bytes} to its output. */
    static native void setNextVendorOutput(long vendor, String function, byte[] bytes);

    static native void closeVendor(long vendor);

    /** A fresh token in the fake vendor, with an empty call record. */
    static native void resetVendor(long vendor);

    /** The fake vendor's call record, one text per call (see fake_vendor.h). */
    static native String[] vendorCalls(long vendor);

    /** From now on the process's log lines are kept instead of printed. */
    static native void captureLog();

    /** The kept lines of {@code tag}, each as "priority|message"; they are then forgotten. */
    static native String[] takeLog(String tag);
}
