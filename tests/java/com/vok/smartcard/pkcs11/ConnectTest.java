package com.vok.smartcard.pkcs11;

import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertNull;
import static org.junit.jupiter.api.Assertions.assertThrows;
import static org.junit.jupiter.api.Assertions.assertTrue;

import java.io.IOException;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.List;
import org.junit.jupiter.api.AfterEach;
import org.junit.jupiter.api.BeforeAll;
import org.junit.jupiter.api.Test;

/**
 * connect and disconnect in a process that takes no role: modules connected without a server
 * id, or under a foreign library name, are used in the process itself.
 */
class ConnectTest {
    private static final String GETTER = Pkcs11.DEFAULT_FUNCTION_LIST_NAME;

    private final List<Pkcs11> objects = new ArrayList<>();
    private int nodesBefore;

    @BeforeAll
    static void initializeLibrary() {
        new Pkcs11().initializeLibrary();
    }

    private Pkcs11 newPkcs11() {
        if (objects.isEmpty()) {
            nodesBefore = NativeProbe.nodeCount();
        }
        Pkcs11 pkcs11 = new Pkcs11();
        objects.add(pkcs11);
        return pkcs11;
    }

    @AfterEach
    void disconnectAll() {
        for (Pkcs11 pkcs11 : objects) {
            pkcs11.disconnect();
        }
    }

    @Test
    void connectingTwiceKeepsOneNodeWithTheNewerEntry() throws Exception {
        Pkcs11 pkcs11 = newPkcs11();
        // Foreign library names open no channel, whatever the server id.
        pkcs11.connect(TestModules.fakeVendor(), GETTER, "Xfirst", Pkcs11.ROLE_CLIENT);
        pkcs11.connect(TestModules.fakeVendor(), GETTER, "Xsecond", Pkcs11.ROLE_CLIENT);

        assertEquals(nodesBefore + 1, NativeProbe.nodeCount());
        assertEquals("Xsecond", NativeProbe.moduleNameOf(pkcs11));

        pkcs11.disconnect();
        assertFalse(NativeProbe.isConnected(pkcs11));
        assertEquals(nodesBefore, NativeProbe.nodeCount());
    }

    @Test
    void aNullServerIdRegistersTheModuleWithoutANameAndOpensNoChannel() throws Exception {
        Pkcs11 server = newPkcs11();
        server.connect(TestModules.fakeVendor(), GETTER, null, Pkcs11.ROLE_SERVER);
        assertTrue(NativeProbe.isConnected(server));
        assertNull(NativeProbe.moduleNameOf(server));
        assertTrue(NativeProbe.hasFunctionList(server));

        Pkcs11 client = newPkcs11();
        client.connect(Pkcs11.WRAPPER_LIBRARY_NAME, GETTER, null, Pkcs11.ROLE_CLIENT);
        assertNull(NativeProbe.moduleNameOf(client));
        assertEquals(TestModules.ALL_ONES, NativeProbe.channelGetInfo());
    }

    @Test
    void aMissingLibraryThrowsTheLoadersText() {
        Pkcs11 pkcs11 = newPkcs11();
        String missing = "/nonexistent/libvokmissing.so";
        IOException e = assertThrows(IOException.class,
                () -> pkcs11.connect(missing, GETTER, null, Pkcs11.ROLE_CLIENT));
        assertEquals(missing + ": cannot open shared object file: No such file or directory",
                e.getMessage());
        assertFalse(NativeProbe.isConnected(pkcs11));
        assertEquals(nodesBefore, NativeProbe.nodeCount());
    }

    @Test
    void aMissingGetterThrowsTheLoadersTextAndUnloadsTheLibrary() throws Exception {
        Pkcs11 pkcs11 = newPkcs11();
        String module = TestModules.fakeVendorCopy();
        NativeProbe.captureLog();
        IOException e = assertThrows(IOException.class,
                () -> pkcs11.connect(module, "C_NoSuchGetter", "Xid", Pkcs11.ROLE_CLIENT));
        assertEquals(module + ": undefined symbol: C_NoSuchGetter", e.getMessage());
        String[] log = NativeProbe.takeLog("[native]");
        assertArrayEquals(new String[] {"3|C_GetFunctionList load failed",
            "3|" + module + ": undefined symbol: C_NoSuchGetter..."},
                Arrays.copyOfRange(log, log.length - 2, log.length));
        assertFalse(NativeProbe.isConnected(pkcs11));
        assertFalse(TestModules.isMapped(module), "the failed connect kept the library loaded");
    }

    @Test
    void aFailingGetterThrowsItsReturnValueAndStillRegistersTheModule() throws Exception {
        String module = TestModules.fakeVendor();
        long vendor = NativeProbe.openVendor(module);
        try {
            NativeProbe.setNextVendorRv(
                    vendor, "C_GetFunctionList", TestModules.CKR_FUNCTION_FAILED);
            Pkcs11 pkcs11 = newPkcs11();
            PKCS11Exception e = assertThrows(PKCS11Exception.class,
                    () -> pkcs11.connect(module, GETTER, "Xid", Pkcs11.ROLE_CLIENT));
            assertEquals(TestModules.CKR_FUNCTION_FAILED, e.getErrorCode());
            assertEquals("CKR 0x0000000000000006", e.getMessage());

            assertTrue(NativeProbe.isConnected(pkcs11));
            assertFalse(NativeProbe.hasFunctionList(pkcs11));
            pkcs11.disconnect();
            assertFalse(NativeProbe.isConnected(pkcs11));
        } finally {
            NativeProbe.closeVendor(vendor);
        }
    }

    @Test
    void nullLibraryOrGetterNamesThrowNullPointerException() {
        Pkcs11 pkcs11 = newPkcs11();
        NullPointerException noLibrary = assertThrows(NullPointerException.class,
                () -> pkcs11.connect(null, GETTER, "Xid", Pkcs11.ROLE_CLIENT));
        assertTrue(noLibrary.getMessage().contains("libraryName"), noLibrary.getMessage());
        NullPointerException noGetter = assertThrows(NullPointerException.class,
                () -> pkcs11.connect(TestModules.fakeVendor(), null, "Xid", Pkcs11.ROLE_CLIENT));
        assertTrue(noGetter.getMessage().contains("functionListName"), noGetter.getMessage());
        assertEquals(nodesBefore, NativeProbe.nodeCount());
    }

    @Test
    void disconnectUnloadsTheModuleAndASecondDisconnectIsHarmless() throws Exception {
        Pkcs11 pkcs11 = newPkcs11();
        String module = TestModules.fakeVendorCopy();
        pkcs11.connect(module, GETTER, null, Pkcs11.ROLE_CLIENT);
        assertTrue(TestModules.isMapped(module));

        pkcs11.disconnect();
        assertFalse(TestModules.isMapped(module));
        assertFalse(NativeProbe.isConnected(pkcs11));

        pkcs11.disconnect();
        newPkcs11().disconnect();
        assertEquals(nodesBefore, NativeProbe.nodeCount());
    }

    @Test
    void connectAndDisconnectLogTheirStepsInOrder() throws Exception {
        Pkcs11 pkcs11 = newPkcs11();
        String module = TestModules.fakeVendor();
        NativeProbe.captureLog();
        pkcs11.connect(module, GETTER, "Xid", Pkcs11.ROLE_CLIENT);
        pkcs11.disconnect();
        assertArrayEquals(new String[] {
            "3|DEBUG: connect to PKCS#11 module: " + module + " ... ",
            "3|DEBUG: connect to PKCS#11 module: " + module + " ",
            "3|Java_com_vok_smartcard_pkcs11_Pkcs11_connect...",
            "3|Client socket init, libraryName: " + module + ", ",
            "3|version from function ptr addr major 2, minor 40",
            "3|FINISHED\n",
            "3|FINISHED: Java_com_vok_smartcard_pkcs11_Pkcs11_connect rv:0",
            "3|DEBUG: disconnecting module...",
            "3|FINISHED\n",
        }, NativeProbe.takeLog("[native]"));
    }
}
