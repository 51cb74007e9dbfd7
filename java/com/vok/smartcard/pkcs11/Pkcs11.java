package com.vok.smartcard.pkcs11;

import java.io.IOException;

/**
 * The Java face of {@code libQuorvelPkcs11Wrapper.so}.
 *
 * <p>An object of this class is tied to at most one PKCS#11 module at a time, through
 * {@link #connect}. The same library plays one of two roles in a process, chosen by the first
 * {@code connect} that names a server id:
 *
 * <ul>
 *   <li>In the sandboxed service process, {@code connect} with the vendor's module and
 *       {@link #ROLE_SERVER} starts the server that answers clients under the server id, and
 *       registers the vendor module under that id.
 *   <li>In an application process, {@code connect} with {@link #WRAPPER_LIBRARY_NAME} and
 *       {@link #ROLE_CLIENT} opens the channel to the service of that server id and registers
 *       this library's own proxies, which forward every call to the service.
 * </ul>
 *
 * <p>Any other module connected with {@code ROLE_CLIENT}, or any module connected without a
 * server id, is called directly in this process.
 *
 * <p>{@link #initializeLibrary} must have been called once in the process before any object
 * connects; {@link #finalizeLibrary} forgets every connection.
 */
public class Pkcs11 {
    /**
     * This library's own file name. Connecting it by exactly this name with
     * {@link #ROLE_CLIENT} and a server id makes the process a client of that service; a path
     * to the same file does not.
     */
    public static final String WRAPPER_LIBRARY_NAME = "libQuorvelPkcs11Wrapper.so";

    /** The standard name of a module's function-list getter. */
    public static final String DEFAULT_FUNCTION_LIST_NAME = "C_GetFunctionList";

    /** {@code isServer} value of {@link #connect} for an application (client) process. */
    public static final int ROLE_CLIENT = 0;

    /** {@code isServer} value of {@link #connect} for the service (server) process. */
    public static final int ROLE_SERVER = 1;

    /** Name of the native library, as {@link System#loadLibrary} takes it. */
    private static final String NATIVE_LIBRARY = "QuorvelPkcs11Wrapper";

    private static boolean nativeLibraryLoaded;

    static {
        loadNativeLibrary();
    }

    /** Creates an object that is not connected to any module. */
    public Pkcs11() {
    }

    /**
     * Loads the native library once per class loader; the classes of this binding call it
     * before their first native method.
     */
    public static synchronized void loadNativeLibrary() {
        if (!nativeLibraryLoaded) {
            System.loadLibrary(NATIVE_LIBRARY);
            nativeLibraryLoaded = true;
        }
    }

    /**
     * Prepares the process-wide registry of connected modules. Calling it again while it is
     * prepared changes nothing.
     */
    public native void initializeLibrary();

    /**
     * Forgets every connection of every object in the process and releases the registry. The
     * modules' libraries stay loaded.
     */
    public native void finalizeLibrary();

    /**
     * Loads a PKCS#11 module and ties it to this object, replacing any module this object
     * was tied to before (which then stays loaded).
     *
     * <p>When {@code serverId} is not null, the call first takes this process's role: with
     * {@code isServer} equal to {@link #ROLE_SERVER} it starts the server under
     * {@code serverId}; otherwise, and only when {@code libraryName} is exactly
     * {@link #WRAPPER_LIBRARY_NAME}, it opens the channel to the service of {@code serverId}.
     * Failures to start the server or to reach the service are not reported here; they show
     * up as failing PKCS#11 calls.
     *
     * @param libraryName the module's library, a file name or path as the dynamic loader
     *     takes it
     * @param functionListName the name of the module's function-list getter, usually
     *     {@link #DEFAULT_FUNCTION_LIST_NAME}
     * @param serverId the service's id, or null to use the module in this process only; the
     *     first character does not take part in the name, only in the id's length
     * @param isServer {@link #ROLE_SERVER} for the service process; any other value is a
     *     client
     * @throws IOException if the library cannot be loaded or lacks the getter; the message is
     *     the dynamic loader's
     * @throws PKCS11Exception if the getter failed; the module is tied to this object anyway,
     *     so {@link #disconnect} is still needed
     * @throws NullPointerException if {@code libraryName} or {@code functionListName} is null
     */
    public native void connect(
            String libraryName, String functionListName, String serverId, int isServer)
            throws IOException, PKCS11Exception;

    /**
     * Unties this object from its module and unloads the module's library.
     *
     * <p>It then closes the process's channel to the service, whichever object opened it and
     * whatever module this object had: call it on the client object last. A server started by
     * {@code connect} keeps running until the process ends. On an object that is not
     * connected only the channel is affected, so calling it twice is harmless.
     */
    public native void disconnect();
}
