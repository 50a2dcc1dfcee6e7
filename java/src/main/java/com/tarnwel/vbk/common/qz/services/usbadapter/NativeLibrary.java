package com.tarnwel.vbk.common.qz.services.usbadapter;

/**
 * Loads libusbadapter once for every class that declares its natives. A host
 * process that already holds the natives (a test binary that registered them,
 * or one that loaded the library itself) sets -Dusbadapter.noload=true.
 */
public final class NativeLibrary {
    private static boolean loaded;

    private NativeLibrary() {
    }

    public static synchronized void load() {
        if (loaded) {
            return;
        }
        if (!Boolean.parseBoolean(System.getProperty("usbadapter.noload"))) {
            System.loadLibrary("usbadapter");
        }
        loaded = true;
    }
}
