package com.vok.smartcard.pkcs11;

import static org.junit.jupiter.api.Assertions.assertEquals;

import org.junit.jupiter.api.BeforeAll;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.MethodSource;

/**
 * The client role, against a server that this same process runs: only the library's own bare
 * name opens the channel.
 */
class ClientRoleTest {
    private static final String GETTER = Pkcs11.DEFAULT_FUNCTION_LIST_NAME;
    private static final String SERVER_ID = TestModules.uniqueServerId();

    @BeforeAll
    static void startServer() throws Exception {
        Pkcs11 service = new Pkcs11();
        service.initializeLibrary();
        service.connect(TestModules.fakeVendor(), GETTER, SERVER_ID, Pkcs11.ROLE_SERVER);
        TestModules.awaitListening(SERVER_ID);
    }

    @Test
    void theLibrarysOwnNameOpensTheChannelAndDisconnectClosesIt() throws Exception {
        assertEquals(TestModules.ALL_ONES, NativeProbe.channelGetInfo());
        Pkcs11 client = new Pkcs11();
        client.connect(Pkcs11.WRAPPER_LIBRARY_NAME, GETTER, SERVER_ID, Pkcs11.ROLE_CLIENT);
        try {
            // Answered by the service's module, which nobody has initialised.
            assertEquals(TestModules.CKR_CRYPTOKI_NOT_INITIALIZED, NativeProbe.channelGetInfo());
            // The object's module is the proxy, not the vendor.
            assertEquals(TestModules.CKR_CRYPTOKI_NOT_INITIALIZED,
                    NativeProbe.moduleGetInfo(client));
            assertEquals(SERVER_ID, NativeProbe.moduleNameOf(client));
        } finally {
            client.disconnect();
        }
        assertEquals(TestModules.ALL_ONES, NativeProbe.channelGetInfo());
    }

    static String[] otherNames() {
        return new String[] {TestModules.fakeVendor(), TestModules.wrapperPath()};
    }

    @ParameterizedTest
    @MethodSource("otherNames")
    void anyOtherNameConnectsTheModuleWithoutAChannel(String libraryName) throws Exception {
        Pkcs11 client = new Pkcs11();
        client.connect(libraryName, GETTER, SERVER_ID, Pkcs11.ROLE_CLIENT);
        try {
            assertEquals(SERVER_ID, NativeProbe.moduleNameOf(client));
            assertEquals(TestModules.ALL_ONES, NativeProbe.channelGetInfo());
        } finally {
            client.disconnect();
        }
    }
}
