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
 * connect and disconnect, with a server that this same process runs: only the library's own
 * bare name opens the channel; modules connected under any other name, or without a server
 * id, are used in the process itself.
 */
class ConnectTest {
    private static final String GETTER = Pkcs11.DEFAULT_FUNCTION_LIST_NAME;
    private static final String SERVER_ID = TestModules.uniqueServerId();

    private final List<Pkcs11> objects = new ArrayList<>();
    private int nodesBefore;

    @BeforeAll
    static void startServer() throws Exception {
        Pkcs11 service = new Pkcs11();
        service.initializeLibrary();
        service.connect(TestModules.fakeVendor(), GETTER, SERVER_ID, Pkcs11.ROLE_SERVER);
        TestModules.awaitListening(SERVER_ID);
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
    void theLibrarysOwnNameOpensTheChannelAndDisconnectClosesIt() throws Exception {
        for (String name : new String[] {TestModules.fakeVendor(), TestModules.wrapperPath()}) {
            Pkcs11 other = newPkcs11();
            other.connect(name, GETTER, SERVER_ID, Pkcs11.ROLE_CLIENT);
            assertEquals(SERVER_ID, NativeProbe.moduleNameOf(other));
            assertEquals(TestModules.ALL_ONES, NativeProbe.channelGetInfo(), name);
        }
        Pkcs11 client = newPkcs11();
        client.connect(Pkcs11.WRAPPER_LIBRARY_NAME, GETTER, SERVER_ID, Pkcs11.ROLE_CLIENT);
        // Answered by the service's module, which nobody has initialised; the object's module
        // is the proxy, not the vendor.
        assertEquals(TestModules.CKR_CRYPTOKI_NOT_INITIALIZED, NativeProbe.channelGetInfo());
        assertEquals(TestModules.CKR_CRYPTOKI_NOT_INITIALIZED, NativeProbe.moduleGetInfo(client));
        client.disconnect();
        assertEquals(TestModules.ALL_ONES, NativeProbe.channelGetInfo());
    }

    /** Unloading the module is DisconnectRace's; here the node, and disconnects that find none. */
    @Test
    void connectingTwiceKeepsOneNodeWithTheNewerEntryAndDisconnectRemovesIt() throws Exception {
        Pkcs11 pkcs11 = newPkcs11();
        pkcs11.connect(TestModules.fakeVendor(), GETTER, "Xfirst", Pkcs11.ROLE_CLIENT);
        pkcs11.connect(TestModules.fakeVendor(), GETTER, "Xsecond", Pkcs11.ROLE_CLIENT);
        assertEquals(nodesBefore + 1, NativeProbe.nodeCount());
        assertEquals("Xsecond", NativeProbe.moduleNameOf(pkcs11));
        pkcs11.disconnect();
        assertFalse(NativeProbe.isConnected(pkcs11));
        pkcs11.disconnect();
        newPkcs11().disconnect();
        assertEquals(nodesBefore, NativeProbe.nodeCount());
    }

    @Test
    void aNullServerIdRegistersTheModuleWithoutANameAndOpensNoChannel() throws Exception {
        Pkcs11 server = newPkcs11();
        server.connect(TestModules.fakeVendor(), GETTER, null, Pkcs11.ROLE_SERVER);
        assertNull(NativeProbe.moduleNameOf(server));
        assertTrue(NativeProbe.hasFunctionList(server));
        Pkcs11 client = newPkcs11();
        client.connect(Pkcs11.WRAPPER_LIBRARY_NAME, GETTER, null, Pkcs11.ROLE_CLIENT);
        assertNull(NativeProbe.moduleNameOf(client));
        assertEquals(TestModules.ALL_ONES, NativeProbe.channelGetInfo());
    }

    /** The loader's texts or the missing name, and nothing left registered or loaded. */
    @Test
    void aConnectWithoutModuleOrGetterThrowsAndKeepsNothing() throws Exception {
        String module = TestModules.fakeVendorCopy();
        String missing = "/nonexistent/libvokmissing.so";
        String noFile = missing + ": cannot open shared object file: No such file or directory";
        String noGetter = module + ": undefined symbol: C_NoSuchGetter";
        Object[][] rows = {  // library, getter, exception, message, the log's last lines
            {missing, GETTER, IOException.class, noFile, new String[] {"3|" + noFile + "..."}},
            {module, "C_NoSuchGetter", IOException.class, noGetter,
                new String[] {"3|C_GetFunctionList load failed", "3|" + noGetter + "..."}},
            {null, GETTER, NullPointerException.class, "connect: libraryName must not be null",
                new String[0]},
            {module, null, NullPointerException.class,
                "connect: functionListName must not be null", new String[0]}};
        for (Object[] row : rows) {
            Pkcs11 pkcs11 = newPkcs11();
            NativeProbe.captureLog();
            Throwable e = assertThrows(Exception.class, () -> pkcs11.connect((String) row[0],
                    (String) row[1], "Xid", Pkcs11.ROLE_CLIENT));
            assertEquals(row[2], e.getClass());
            assertEquals(row[3], e.getMessage());
            String[] log = NativeProbe.takeLog("[native]");
            String[] last = (String[]) row[4];
            assertArrayEquals(last, Arrays.copyOfRange(log, log.length - last.length, log.length));
            assertFalse(NativeProbe.isConnected(pkcs11));
            assertEquals(nodesBefore, NativeProbe.nodeCount());
            assertFalse(TestModules.isMapped(module), "a failed connect kept the library loaded");
        }
    }

    @Test
    void aFailingGetterThrowsItsReturnValueAndStillRegistersTheModule() throws Exception {
        String module = TestModules.fakeVendor();
        long vendor = NativeProbe.openVendor(module);
        try {
            NativeProbe.setNextVendorRv(vendor, "C_GetFunctionList", 0x6);  // FUNCTION_FAILED
            Pkcs11 pkcs11 = newPkcs11();
            PKCS11Exception e = assertThrows(PKCS11Exception.class,
                    () -> pkcs11.connect(module, GETTER, "Xid", Pkcs11.ROLE_CLIENT));
            assertEquals(0x6, e.getErrorCode());
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
