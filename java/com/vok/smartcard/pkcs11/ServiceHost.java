package com.vok.smartcard.pkcs11;

import com.vok.smartcard.adapter.SandboxedProcessUsageStatistics;
import java.io.BufferedReader;
import java.io.IOException;
import java.io.InputStreamReader;
import java.io.PrintStream;
import java.nio.charset.StandardCharsets;
import java.util.Arrays;

/**
 * A service process in its simplest form: it connects one vendor module in the server role and
 * serves clients under a server id until it is stopped.
 *
 * <p>Usage: {@code ServiceHost [--no-stdin] [--allow-uids <uid>,...] <serverId> <moduleLibrary>
 * [<functionListName>]}.
 * Once the module is connected it prints {@code serving <serverId>} on standard output. It stops
 * when its standard input ends or when it is terminated (SIGTERM); it then disconnects the
 * module and prints {@code stopped <serverId>}. Each input line {@code usage} is answered with
 * {@code usage <time>}, the value of
 * {@link SandboxedProcessUsageStatistics#native_getLastUsageTime()}. With {@code --no-stdin}
 * it leaves standard input alone and runs until it is terminated, for starting it in the
 * background. With {@code --allow-uids} it serves only clients running under one of the given
 * user ids (see {@link Pkcs11#setAllowedPeerUids}).
 *
 * <p>Exit status: 0 when its input ended, 143 when terminated, 1 when the module cannot be
 * connected, 2 for bad arguments.
 */
public final class ServiceHost {
    private final String serverId;
    private final String moduleLibrary;
    private final String functionListName;
    private final Pkcs11 pkcs11 = new Pkcs11();
    private boolean connected;

    /**
     * Creates a host that is not serving yet.
     *
     * @param serverId the id clients connect to
     * @param moduleLibrary the vendor module's library, as the dynamic loader takes it
     * @param functionListName the name of the module's function-list getter
     */
    public ServiceHost(String serverId, String moduleLibrary, String functionListName) {
        this.serverId = serverId;
        this.moduleLibrary = moduleLibrary;
        this.functionListName = functionListName;
    }

    /**
     * Connects the module in the server role; from then on the process serves clients.
     *
     * @throws IOException if the module's library or its getter cannot be loaded
     * @throws PKCS11Exception if the module's getter failed (the module is then connected
     *     anyway, and {@link #stop} disconnects it)
     */
    public synchronized void start() throws IOException, PKCS11Exception {
        pkcs11.initializeLibrary();
        try {
            pkcs11.connect(moduleLibrary, functionListName, serverId, Pkcs11.ROLE_SERVER);
        } catch (PKCS11Exception e) {
            connected = true;
            throw e;
        }
        connected = true;
    }

    /**
     * Disconnects the module, after which clients get no answers. The server itself runs
     * until the process ends. Calling it again does nothing.
     *
     * @return whether this call disconnected the module
     */
    public synchronized boolean stop() {
        if (!connected) {
            return false;
        }
        connected = false;
        pkcs11.disconnect();
        pkcs11.finalizeLibrary();
        return true;
    }

    /**
     * Runs the host; see the class description for the arguments.
     *
     * @param args optionally {@code --no-stdin}, then server id, module library and,
     *     optionally, the getter's name
     */
    public static void main(String[] args) {
        boolean readInput = args.length == 0 || !args[0].equals("--no-stdin");
        if (!readInput) {
            args = Arrays.copyOfRange(args, 1, args.length);
        }
        int[] allowedUids = null;
        if (args.length > 1 && args[0].equals("--allow-uids")) {
            allowedUids = parseUids(args[1]);
            args = Arrays.copyOfRange(args, 2, args.length);
        }
        if (args.length < 2 || args.length > 3) {
            System.err.println("usage: ServiceHost [--no-stdin] [--allow-uids <uid>,...]"
                + " <serverId> <moduleLibrary> [<functionListName>]");
            System.exit(2);
        }
        if (allowedUids != null) {
            Pkcs11.setAllowedPeerUids(allowedUids);
        }
        String getter = args.length > 2 ? args[2] : Pkcs11.DEFAULT_FUNCTION_LIST_NAME;
        final ServiceHost host = new ServiceHost(args[0], args[1], getter);
        final PrintStream out = System.out;
        try {
            host.start();
        } catch (IOException | PKCS11Exception e) {
            System.err.println("cannot serve " + args[0] + ": " + e.getMessage());
            host.stop();
            System.exit(1);
        }
        Runtime.getRuntime().addShutdownHook(new Thread(() -> {
            if (host.stop()) {
                out.println("stopped " + host.serverId);
                out.flush();
            }
        }, "service-host-stop"));
        out.println("serving " + host.serverId);
        out.flush();
        if (!readInput) {
            waitForTermination();
        }
        try {
            answerUntilEndOfInput(out);
        } catch (IOException e) {
            System.err.println("standard input failed: " + e.getMessage());
        }
        System.exit(0);
    }

    private static int[] parseUids(String list) {
        String[] parts = list.split(",");
        int[] uids = new int[parts.length];
        try {
            for (int i = 0; i < uids.length; i++) {
                uids[i] = Integer.parseInt(parts[i].trim());
            }
        } catch (NumberFormatException e) {
            System.err.println("not a list of user ids: " + list);
            System.exit(2);
        }
        return uids;
    }

    private static void waitForTermination() {
        Object never = new Object();
        synchronized (never) {
            while (true) {
                try {
                    never.wait();
                } catch (InterruptedException e) {
                    // Only termination ends the host.
                }
            }
        }
    }

    private static void answerUntilEndOfInput(PrintStream out) throws IOException {
        BufferedReader in =
                new BufferedReader(new InputStreamReader(System.in, StandardCharsets.UTF_8));
        String line;
        while ((line = in.readLine()) != null) {
            if (line.trim().equals("usage")) {
                out.println("usage " + SandboxedProcessUsageStatistics.native_getLastUsageTime());
                out.flush();
            }
        }
    }
}
