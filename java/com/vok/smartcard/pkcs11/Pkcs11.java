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
 *
 * <p>The {@code C_} methods call the PKCS#11 function of the same name of the connected module.
 * Handles, flags, lengths and types are Java {@code long}s holding the 64-bit {@code CK_ULONG}.
 * Every one of them throws {@link PKCS11Exception} carrying the module's {@code CK_RV} when the
 * function returns anything but {@code CKR_OK} (a call that could not reach the service at all
 * carries all ones, {@code -1L}), and {@link PKCS11RuntimeException} "This object is not
 * connected to a module." on an object that is not connected, before any argument is looked at.
 * Output lengths follow PKCS#11's two-call convention (the length first, then the data) unless
 * a method says otherwise; a module that still finds the buffer too small gives
 * {@code CKR_BUFFER_TOO_SMALL}, never a cut result. Conversions of the arguments follow
 * {@link CK_ATTRIBUTE} and {@link CK_MECHANISM}.
 *
 * <p>Through the service, as a client, a few functions behave as the system has always made
 * them: {@code C_InitPIN} and {@code C_SetPIN} never reach the module (they fail with all ones),
 * the single-part {@link #C_Verify} never hands the module the signature (verify with
 * {@link #C_VerifyUpdate} and {@link #C_VerifyFinal}), and PINs, labels, seeds and signatures
 * for {@code C_Verify} travel as text that ends at their first zero byte. Calls of one process
 * are served one at a time; {@link #C_WaitForSlotEvent} holds the others for up to the
 * channel's 30-second timeout.
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
     * Restricts which local processes the service serves, by their user id. The service's
     * socket is open to every process of the device; once a list is set, a client whose user
     * id is not on it is disconnected right after it connects, and the refusal is logged.
     * Without a list, which is how a process starts, every client is served. Call it in the
     * service process before {@link #connect}; later calls take effect from the next client
     * that connects.
     *
     * @param uids the user ids to serve (an empty array serves nobody), or null to serve
     *     every client again
     */
    public static native void setAllowedPeerUids(int[] uids);

    /**
     * Unties this object from its module and unloads the module's library.
     *
     * <p>It then closes the process's channel to the service, whichever object opened it and
     * whatever module this object had: call it on the client object last. A server started by
     * {@code connect} keeps running until the process ends. On an object that is not
     * connected only the channel is affected, so calling it twice is harmless.
     */
    public native void disconnect();

    // ---- General functions -------------------------------------------------------------

    /**
     * Initialises the module. The mutex callbacks of PKCS#11 cannot be given from Java: the
     * module gets {@code flags} and {@code pReserved} of {@code pInitArgs}, never callbacks. An
     * object connected to a module whose getter gave no function list succeeds without a call.
     *
     * @param pInitArgs the arguments, or null for none
     * @throws PKCS11Exception if the module's {@code C_Initialize} failed
     */
    public native void C_Initialize(CK_C_INITIALIZE_ARGS pInitArgs) throws PKCS11Exception;

    /**
     * Tells the module that the application is done with it.
     *
     * @param pReserved handed to the module as its reserved pointer; must be 0
     * @throws PKCS11Exception if the module's {@code C_Finalize} failed
     */
    public native void C_Finalize(long pReserved) throws PKCS11Exception;

    /**
     * Returns general information about the module.
     *
     * @return a new object with the module's information
     * @throws PKCS11Exception if the module's {@code C_GetInfo} failed
     */
    public native CK_INFO C_GetInfo() throws PKCS11Exception;

    // ---- Slots and tokens -----------------------------------------------------------

    /**
     * Returns the module's slots.
     *
     * @param tokenPresent true for the slots that hold a token only
     * @return the slot IDs, possibly none
     * @throws PKCS11Exception if the module's {@code C_GetSlotList} failed
     */
    public native long[] C_GetSlotList(boolean tokenPresent) throws PKCS11Exception;

    /**
     * Returns information about a slot.
     *
     * @param slotID the slot
     * @return a new object with the slot's information
     * @throws PKCS11Exception if the module's {@code C_GetSlotInfo} failed
     */
    public native CK_SLOT_INFO C_GetSlotInfo(long slotID) throws PKCS11Exception;

    /**
     * Returns information about the token in a slot.
     *
     * @param slotID the slot
     * @return a new object with the token's information
     * @throws PKCS11Exception if the module's {@code C_GetTokenInfo} failed
     */
    public native CK_TOKEN_INFO C_GetTokenInfo(long slotID) throws PKCS11Exception;

    /**
     * Returns the mechanisms a slot's token supports.
     *
     * @param slotID the slot
     * @return the mechanism types ({@code CKM_} values), possibly none
     * @throws PKCS11Exception if the module's {@code C_GetMechanismList} failed
     */
    public native long[] C_GetMechanismList(long slotID) throws PKCS11Exception;

    /**
     * Returns what a token can do with one mechanism.
     *
     * @param slotID the slot
     * @param type the mechanism type
     * @return a new object with key sizes and flags
     * @throws PKCS11Exception if the module's {@code C_GetMechanismInfo} failed
     */
    public native CK_MECHANISM_INFO C_GetMechanismInfo(long slotID, long type)
            throws PKCS11Exception;

    /**
     * Initialises a token. A label shorter than the 32 chars of PKCS#11 is padded with blanks;
     * each char gives its low byte, as for the PIN.
     *
     * @param slotID the slot
     * @param pPin the security officer's PIN
     * @param pLabel the token's new label
     * @throws PKCS11Exception if the module's {@code C_InitToken} failed
     */
    public native void C_InitToken(long slotID, char[] pPin, char[] pLabel)
            throws PKCS11Exception;

    /**
     * Sets the user's PIN, in a session of the security officer. Through the service it never
     * reaches the module and fails with all ones.
     *
     * @param hSession the session
     * @param pPin the new PIN; each char gives its low byte
     * @throws PKCS11Exception if the module's {@code C_InitPIN} failed
     */
    public native void C_InitPIN(long hSession, char[] pPin) throws PKCS11Exception;

    /**
     * Changes the PIN of the user logged in. Through the service it never reaches the module
     * and fails with all ones.
     *
     * @param hSession the session
     * @param pOldPin the present PIN
     * @param pNewPin the new PIN
     * @throws PKCS11Exception if the module's {@code C_SetPIN} failed
     */
    public native void C_SetPIN(long hSession, char[] pOldPin, char[] pNewPin)
            throws PKCS11Exception;

    /**
     * Waits for a slot event (a token inserted or removed). Through the service the wait ends
     * after the channel's 30-second timeout with all ones, and holds the process's other calls
     * meanwhile.
     *
     * @param flags {@code CKF_DONT_BLOCK} to return at once
     * @param pReserved handed to the module as its reserved pointer; must be 0
     * @return the slot the event happened in
     * @throws PKCS11Exception if the module's {@code C_WaitForSlotEvent} failed, for example
     *     with {@code CKR_NO_EVENT}
     */
    public native long C_WaitForSlotEvent(long flags, long pReserved) throws PKCS11Exception;

    // ---- Sessions -----------------------------------------------------------------

    /**
     * Opens a session. The module gets neither {@code pApplication} nor a notification
     * callback: no notification ever reaches Java.
     *
     * @param slotID the slot
     * @param flags {@code CKF_SERIAL_SESSION}, with {@code CKF_RW_SESSION} for a read/write
     *     session
     * @param pApplication not passed on; may be null
     * @return the new session's handle
     * @throws PKCS11Exception if the module's {@code C_OpenSession} failed
     */
    public native long C_OpenSession(long slotID, long flags, Object pApplication)
            throws PKCS11Exception;

    /**
     * Closes a session.
     *
     * @param hSession the session
     * @throws PKCS11Exception if the module's {@code C_CloseSession} failed
     */
    public native void C_CloseSession(long hSession) throws PKCS11Exception;

    /**
     * Closes every session of the application with a slot's token.
     *
     * @param slotID the slot
     * @throws PKCS11Exception if the module's {@code C_CloseAllSessions} failed
     */
    public native void C_CloseAllSessions(long slotID) throws PKCS11Exception;

    /**
     * Returns information about a session.
     *
     * @param hSession the session
     * @return a new object with the session's slot, state and flags
     * @throws PKCS11Exception if the module's {@code C_GetSessionInfo} failed
     */
    public native CK_SESSION_INFO C_GetSessionInfo(long hSession) throws PKCS11Exception;

    /**
     * Returns the state of a session's operations, to be restored with
     * {@link #C_SetOperationState}.
     *
     * @param hSession the session
     * @return the state's bytes
     * @throws PKCS11Exception if the module's {@code C_GetOperationState} failed
     */
    public native byte[] C_GetOperationState(long hSession) throws PKCS11Exception;

    /**
     * Restores the state of a session's operations.
     *
     * @param hSession the session
     * @param pOperationState bytes from {@link #C_GetOperationState}
     * @param hEncryptionKey the key of an encryption or decryption in the state, or 0
     * @param hAuthenticationKey the key of a signature or MAC in the state, or 0
     * @throws PKCS11Exception if the module's {@code C_SetOperationState} failed
     */
    public native void C_SetOperationState(long hSession, byte[] pOperationState,
            long hEncryptionKey, long hAuthenticationKey) throws PKCS11Exception;

    /**
     * Logs a user into the token.
     *
     * @param hSession the session
     * @param userType {@code CKU_USER}, {@code CKU_SO} or {@code CKU_CONTEXT_SPECIFIC}
     * @param pPin the PIN; each char gives its low byte
     * @throws PKCS11Exception if the module's {@code C_Login} failed, for example with
     *     {@code CKR_PIN_INCORRECT}
     */
    public native void C_Login(long hSession, long userType, char[] pPin) throws PKCS11Exception;

    /**
     * Logs the user out of the token.
     *
     * @param hSession the session
     * @throws PKCS11Exception if the module's {@code C_Logout} failed
     */
    public native void C_Logout(long hSession) throws PKCS11Exception;

    /**
     * A legacy function of parallel operation; modules answer
     * {@code CKR_FUNCTION_NOT_PARALLEL}.
     *
     * @param hSession the session
     * @throws PKCS11Exception with the module's answer
     */
    public native void C_GetFunctionStatus(long hSession) throws PKCS11Exception;

    /**
     * A legacy function of parallel operation; modules answer
     * {@code CKR_FUNCTION_NOT_PARALLEL}.
     *
     * @param hSession the session
     * @throws PKCS11Exception with the module's answer
     */
    public native void C_CancelFunction(long hSession) throws PKCS11Exception;

    // ---- Objects ------------------------------------------------------------------

    /**
     * Creates an object.
     *
     * @param hSession the session
     * @param pTemplate the object's attributes
     * @return the new object's handle
     * @throws PKCS11Exception if the module's {@code C_CreateObject} failed
     */
    public native long C_CreateObject(long hSession, CK_ATTRIBUTE[] pTemplate)
            throws PKCS11Exception;

    /**
     * Copies an object.
     *
     * @param hSession the session
     * @param hObject the object to copy
     * @param pTemplate attributes the copy takes instead of the original's
     * @return the copy's handle
     * @throws PKCS11Exception if the module's {@code C_CopyObject} failed
     */
    public native long C_CopyObject(long hSession, long hObject, CK_ATTRIBUTE[] pTemplate)
            throws PKCS11Exception;

    /**
     * Destroys an object.
     *
     * @param hSession the session
     * @param hObject the object
     * @throws PKCS11Exception if the module's {@code C_DestroyObject} failed
     */
    public native void C_DestroyObject(long hSession, long hObject) throws PKCS11Exception;

    /**
     * Returns the size of an object on the token.
     *
     * @param hSession the session
     * @param hObject the object
     * @return its size in bytes
     * @throws PKCS11Exception if the module's {@code C_GetObjectSize} failed
     */
    public native long C_GetObjectSize(long hSession, long hObject) throws PKCS11Exception;

    /**
     * Reads attributes of an object. Only the types of {@code pTemplate} are used: each element
     * of the array is replaced by a new {@link CK_ATTRIBUTE} with the type and the value as
     * {@link CK_ATTRIBUTE} describes it (null for a value the module reports as unavailable).
     * The module is asked for the lengths, then for the values, and, when a
     * {@code CKA_WRAP_TEMPLATE} or {@code CKA_UNWRAP_TEMPLATE} holds attributes, a third time
     * for their values. A result other than {@code CKR_OK} from any of these calls, for example
     * {@code CKR_ATTRIBUTE_SENSITIVE} for one of the attributes, fails the whole call and leaves
     * the array as it was.
     *
     * @param hSession the session
     * @param hObject the object
     * @param pTemplate the attribute types to read; filled in place
     * @throws PKCS11Exception if a call of the module's {@code C_GetAttributeValue} failed
     */
    public native void C_GetAttributeValue(long hSession, long hObject, CK_ATTRIBUTE[] pTemplate)
            throws PKCS11Exception;

    /**
     * Changes attributes of an object.
     *
     * @param hSession the session
     * @param hObject the object
     * @param pTemplate the new values
     * @throws PKCS11Exception if the module's {@code C_SetAttributeValue} failed
     */
    public native void C_SetAttributeValue(long hSession, long hObject, CK_ATTRIBUTE[] pTemplate)
            throws PKCS11Exception;

    /**
     * Starts a search for the objects whose attributes match a template.
     *
     * @param hSession the session
     * @param pTemplate the attributes to match; empty or null for every object
     * @throws PKCS11Exception if the module's {@code C_FindObjectsInit} failed
     */
    public native void C_FindObjectsInit(long hSession, CK_ATTRIBUTE[] pTemplate)
            throws PKCS11Exception;

    /**
     * Continues a search.
     *
     * @param hSession the session
     * @param ulMaxObjectCount how many handles to return at most; 0 returns none
     * @return the handles found, at most {@code ulMaxObjectCount}; empty when the search is
     *     done
     * @throws PKCS11Exception if the module's {@code C_FindObjects} failed
     */
    public native long[] C_FindObjects(long hSession, long ulMaxObjectCount)
            throws PKCS11Exception;

    /**
     * Ends a search.
     *
     * @param hSession the session
     * @throws PKCS11Exception if the module's {@code C_FindObjectsFinal} failed
     */
    public native void C_FindObjectsFinal(long hSession) throws PKCS11Exception;

    // ---- Encryption and decryption -------------------------------------------------------

    /**
     * Starts an encryption.
     *
     * @param hSession the session
     * @param pMechanism the mechanism, with its parameter
     * @param hKey the key
     * @throws PKCS11Exception if the module's {@code C_EncryptInit} failed
     */
    public native void C_EncryptInit(long hSession, CK_MECHANISM pMechanism, long hKey)
            throws PKCS11Exception;

    /**
     * Encrypts data in one part. The module is called once, with room for 260 bytes of output:
     * a longer ciphertext fails with {@code CKR_BUFFER_TOO_SMALL}. Encrypt longer data in parts
     * with {@link #C_EncryptUpdate}.
     *
     * @param hSession the session
     * @param pData the data
     * @return the ciphertext, at most 260 bytes
     * @throws PKCS11Exception if the module's {@code C_Encrypt} failed
     */
    public native byte[] C_Encrypt(long hSession, byte[] pData) throws PKCS11Exception;

    /**
     * Encrypts one more part.
     *
     * @param hSession the session
     * @param pPart the part
     * @return the ciphertext the part completed, possibly empty
     * @throws PKCS11Exception if the module's {@code C_EncryptUpdate} failed
     */
    public native byte[] C_EncryptUpdate(long hSession, byte[] pPart) throws PKCS11Exception;

    /**
     * Ends a multi-part encryption.
     *
     * @param hSession the session
     * @return the last ciphertext, possibly empty
     * @throws PKCS11Exception if the module's {@code C_EncryptFinal} failed
     */
    public native byte[] C_EncryptFinal(long hSession) throws PKCS11Exception;

    /**
     * Starts a decryption.
     *
     * @param hSession the session
     * @param pMechanism the mechanism, with its parameter
     * @param hKey the key
     * @throws PKCS11Exception if the module's {@code C_DecryptInit} failed
     */
    public native void C_DecryptInit(long hSession, CK_MECHANISM pMechanism, long hKey)
            throws PKCS11Exception;

    /**
     * Decrypts data in one part.
     *
     * @param hSession the session
     * @param pEncryptedData the ciphertext
     * @return the plaintext
     * @throws PKCS11Exception if the module's {@code C_Decrypt} failed
     */
    public native byte[] C_Decrypt(long hSession, byte[] pEncryptedData) throws PKCS11Exception;

    /**
     * Decrypts one more part.
     *
     * @param hSession the session
     * @param pEncryptedPart the part
     * @return the plaintext the part completed, possibly empty
     * @throws PKCS11Exception if the module's {@code C_DecryptUpdate} failed
     */
    public native byte[] C_DecryptUpdate(long hSession, byte[] pEncryptedPart)
            throws PKCS11Exception;

    /**
     * Ends a multi-part decryption.
     *
     * @param hSession the session
     * @return the last plaintext, possibly empty
     * @throws PKCS11Exception if the module's {@code C_DecryptFinal} failed
     */
    public native byte[] C_DecryptFinal(long hSession) throws PKCS11Exception;

    // ---- Digests --------------------------------------------------------------------

    /**
     * Starts a digest.
     *
     * @param hSession the session
     * @param pMechanism the mechanism, for example {@code CKM_SHA256}
     * @throws PKCS11Exception if the module's {@code C_DigestInit} failed
     */
    public native void C_DigestInit(long hSession, CK_MECHANISM pMechanism)
            throws PKCS11Exception;

    /**
     * Digests data in one part. The module is called once, with room for 65 bytes: enough for
     * every SHA-2 digest; a longer digest fails with {@code CKR_BUFFER_TOO_SMALL}.
     *
     * @param hSession the session
     * @param pData the data
     * @return the digest, at most 65 bytes
     * @throws PKCS11Exception if the module's {@code C_Digest} failed
     */
    public native byte[] C_Digest(long hSession, byte[] pData) throws PKCS11Exception;

    /**
     * Digests one more part.
     *
     * @param hSession the session
     * @param pPart the part
     * @throws PKCS11Exception if the module's {@code C_DigestUpdate} failed
     */
    public native void C_DigestUpdate(long hSession, byte[] pPart) throws PKCS11Exception;

    /**
     * Digests the value of a secret key as one more part.
     *
     * @param hSession the session
     * @param hKey the key
     * @throws PKCS11Exception if the module's {@code C_DigestKey} failed
     */
    public native void C_DigestKey(long hSession, long hKey) throws PKCS11Exception;

    /**
     * Ends a multi-part digest.
     *
     * @param hSession the session
     * @return the digest
     * @throws PKCS11Exception if the module's {@code C_DigestFinal} failed
     */
    public native byte[] C_DigestFinal(long hSession) throws PKCS11Exception;

    // ---- Signatures and their verification --------------------------------------------

    /**
     * Starts a signature or MAC.
     *
     * @param hSession the session
     * @param pMechanism the mechanism, with its parameter
     * @param hKey the signing key
     * @throws PKCS11Exception if the module's {@code C_SignInit} failed
     */
    public native void C_SignInit(long hSession, CK_MECHANISM pMechanism, long hKey)
            throws PKCS11Exception;

    /**
     * Signs data in one part. The module is first offered 512 bytes, enough for a 4096-bit RSA
     * signature in one call; when it answers {@code CKR_BUFFER_TOO_SMALL} it is called once
     * more with the length it asked for.
     *
     * @param hSession the session
     * @param pData the data
     * @return the signature
     * @throws PKCS11Exception if the module's {@code C_Sign} failed
     */
    public native byte[] C_Sign(long hSession, byte[] pData) throws PKCS11Exception;

    /**
     * Signs one more part.
     *
     * @param hSession the session
     * @param pPart the part
     * @throws PKCS11Exception if the module's {@code C_SignUpdate} failed
     */
    public native void C_SignUpdate(long hSession, byte[] pPart) throws PKCS11Exception;

    /**
     * Ends a multi-part signature.
     *
     * @param hSession the session
     * @return the signature
     * @throws PKCS11Exception if the module's {@code C_SignFinal} failed
     */
    public native byte[] C_SignFinal(long hSession) throws PKCS11Exception;

    /**
     * Starts a signature from which the data can be recovered.
     *
     * @param hSession the session
     * @param pMechanism the mechanism, with its parameter
     * @param hKey the signing key
     * @throws PKCS11Exception if the module's {@code C_SignRecoverInit} failed
     */
    public native void C_SignRecoverInit(long hSession, CK_MECHANISM pMechanism, long hKey)
            throws PKCS11Exception;

    /**
     * Signs data so that it can be recovered from the signature.
     *
     * @param hSession the session
     * @param pData the data
     * @return the signature
     * @throws PKCS11Exception if the module's {@code C_SignRecover} failed
     */
    public native byte[] C_SignRecover(long hSession, byte[] pData) throws PKCS11Exception;

    /**
     * Starts a verification.
     *
     * @param hSession the session
     * @param pMechanism the mechanism, with its parameter
     * @param hKey the verification key
     * @throws PKCS11Exception if the module's {@code C_VerifyInit} failed
     */
    public native void C_VerifyInit(long hSession, CK_MECHANISM pMechanism, long hKey)
            throws PKCS11Exception;

    /**
     * Verifies a signature in one part. Through the service the module never gets the
     * signature (it gets a buffer of its length that does not hold it), by the system's design,
     * so the answer there says nothing about the signature: verify with
     * {@link #C_VerifyUpdate} and {@link #C_VerifyFinal} instead. A signature that is not
     * valid fails with {@code CKR_SIGNATURE_INVALID}.
     *
     * @param hSession the session
     * @param pData the data
     * @param pSignature the signature
     * @throws PKCS11Exception if the module's {@code C_Verify} failed
     */
    public native void C_Verify(long hSession, byte[] pData, byte[] pSignature)
            throws PKCS11Exception;

    /**
     * Verifies one more part.
     *
     * @param hSession the session
     * @param pPart the part
     * @throws PKCS11Exception if the module's {@code C_VerifyUpdate} failed
     */
    public native void C_VerifyUpdate(long hSession, byte[] pPart) throws PKCS11Exception;

    /**
     * Ends a multi-part verification: returns normally only when the signature is valid.
     *
     * @param hSession the session
     * @param pSignature the signature
     * @throws PKCS11Exception if the module's {@code C_VerifyFinal} failed, for example with
     *     {@code CKR_SIGNATURE_INVALID}
     */
    public native void C_VerifyFinal(long hSession, byte[] pSignature) throws PKCS11Exception;

    /**
     * Starts a verification that recovers the data from the signature.
     *
     * @param hSession the session
     * @param pMechanism the mechanism, with its parameter
     * @param hKey the verification key
     * @throws PKCS11Exception if the module's {@code C_VerifyRecoverInit} failed
     */
    public native void C_VerifyRecoverInit(long hSession, CK_MECHANISM pMechanism, long hKey)
            throws PKCS11Exception;

    /**
     * Verifies a signature and recovers the data from it.
     *
     * @param hSession the session
     * @param pSignature the signature
     * @return the recovered data
     * @throws PKCS11Exception if the module's {@code C_VerifyRecover} failed
     */
    public native byte[] C_VerifyRecover(long hSession, byte[] pSignature)
            throws PKCS11Exception;

    // ---- Dual-function updates ---------------------------------------------------------

    /**
     * Digests and encrypts one more part, in an active digest and encryption.
     *
     * @param hSession the session
     * @param pPart the part
     * @return the ciphertext the part completed
     * @throws PKCS11Exception if the module's {@code C_DigestEncryptUpdate} failed
     */
    public native byte[] C_DigestEncryptUpdate(long hSession, byte[] pPart)
            throws PKCS11Exception;

    /**
     * Decrypts and digests one more part, in an active decryption and digest.
     *
     * @param hSession the session
     * @param pEncryptedPart the part
     * @return the plaintext the part completed
     * @throws PKCS11Exception if the module's {@code C_DecryptDigestUpdate} failed
     */
    public native byte[] C_DecryptDigestUpdate(long hSession, byte[] pEncryptedPart)
            throws PKCS11Exception;

    /**
     * Signs and encrypts one more part, in an active signature and encryption.
     *
     * @param hSession the session
     * @param pPart the part
     * @return the ciphertext the part completed
     * @throws PKCS11Exception if the module's {@code C_SignEncryptUpdate} failed
     */
    public native byte[] C_SignEncryptUpdate(long hSession, byte[] pPart)
            throws PKCS11Exception;

    /**
     * Decrypts and verifies one more part, in an active decryption and verification.
     *
     * @param hSession the session
     * @param pEncryptedPart the part
     * @return the plaintext the part completed
     * @throws PKCS11Exception if the module's {@code C_DecryptVerifyUpdate} failed
     */
    public native byte[] C_DecryptVerifyUpdate(long hSession, byte[] pEncryptedPart)
            throws PKCS11Exception;

    // ---- Keys -----------------------------------------------------------------------

    /**
     * Generates a secret key. For the PBE mechanisms that produce an IV
     * ({@code CKM_PBE_MD2_DES_CBC} to {@code CKM_PBE_SHA1_CAST5_CBC}) the IV is written into
     * the {@code pInitVektor} array of the {@link CK_PBE_PARAMS} parameter (not
     * {@code pInitVector}, which the module is given), as many chars as that array holds,
     * whatever the result.
     *
     * @param hSession the session
     * @param pMechanism the mechanism, with its parameter
     * @param pTemplate the key's attributes
     * @return the new key's handle
     * @throws PKCS11Exception if the module's {@code C_GenerateKey} failed
     */
    public native long C_GenerateKey(long hSession, CK_MECHANISM pMechanism,
            CK_ATTRIBUTE[] pTemplate) throws PKCS11Exception;

    /**
     * Generates a public/private key pair.
     *
     * @param hSession the session
     * @param pMechanism the mechanism, with its parameter
     * @param pPublicKeyTemplate the public key's attributes
     * @param pPrivateKeyTemplate the private key's attributes
     * @return two handles: the public key's, then the private key's
     * @throws PKCS11Exception if the module's {@code C_GenerateKeyPair} failed
     */
    public native long[] C_GenerateKeyPair(long hSession, CK_MECHANISM pMechanism,
            CK_ATTRIBUTE[] pPublicKeyTemplate, CK_ATTRIBUTE[] pPrivateKeyTemplate)
            throws PKCS11Exception;

    /**
     * Wraps (encrypts) a key with another.
     *
     * @param hSession the session
     * @param pMechanism the wrapping mechanism, with its parameter
     * @param hWrappingKey the wrapping key
     * @param hKey the key to wrap
     * @return the wrapped key
     * @throws PKCS11Exception if the module's {@code C_WrapKey} failed
     */
    public native byte[] C_WrapKey(long hSession, CK_MECHANISM pMechanism, long hWrappingKey,
            long hKey) throws PKCS11Exception;

    /**
     * Unwraps (decrypts) a key and creates it. For {@code CKM_KEY_WRAP_SET_OAEP} the module's
     * {@code bBC} and {@code pX} are written into the {@link CK_KEY_WRAP_SET_OAEP_PARAMS}
     * parameter, whatever the result.
     *
     * @param hSession the session
     * @param pMechanism the unwrapping mechanism, with its parameter
     * @param hUnwrappingKey the unwrapping key
     * @param pWrappedKey the wrapped key
     * @param pTemplate the new key's attributes
     * @return the new key's handle
     * @throws PKCS11Exception if the module's {@code C_UnwrapKey} failed
     */
    public native long C_UnwrapKey(long hSession, CK_MECHANISM pMechanism, long hUnwrappingKey,
            byte[] pWrappedKey, CK_ATTRIBUTE[] pTemplate) throws PKCS11Exception;

    /**
     * Derives a key from a base key. For {@code CKM_SSL3_MASTER_KEY_DERIVE} the module's
     * client version is written into the parameter's {@code pVersion}, and for
     * {@code CKM_SSL3_KEY_AND_MAC_DERIVE} the handles and IVs into its
     * {@code pReturnedKeyMaterial}, whatever the result.
     *
     * @param hSession the session
     * @param pMechanism the derivation mechanism, with its parameter
     * @param hBaseKey the base key
     * @param pTemplate the new key's attributes
     * @return the new key's handle
     * @throws PKCS11Exception if the module's {@code C_DeriveKey} failed
     */
    public native long C_DeriveKey(long hSession, CK_MECHANISM pMechanism, long hBaseKey,
            CK_ATTRIBUTE[] pTemplate) throws PKCS11Exception;

    // ---- Random numbers -------------------------------------------------------------

    /**
     * Mixes seed material into the token's random number generator.
     *
     * @param hSession the session
     * @param pSeed the seed
     * @throws PKCS11Exception if the module's {@code C_SeedRandom} failed
     */
    public native void C_SeedRandom(long hSession, byte[] pSeed) throws PKCS11Exception;

    /**
     * Fills an array with random bytes from the token. The array is left as it was when the
     * call fails.
     *
     * @param hSession the session
     * @param randomData the array to fill, as long as the number of bytes wanted
     * @throws PKCS11Exception if the module's {@code C_GenerateRandom} failed
     */
    public native void C_GenerateRandom(long hSession, byte[] randomData)
            throws PKCS11Exception;
}
