package com.tarnwel.vbk.common.qz.services.usbadapter;

/**
 * Answers to the host's vendor control requests (status utility and device
 * capability queries), staged in the gadget bridge by libusbadapter. Each call
 * overwrites the previous answer of its kind; callers serialise the calls.
 * No array may be longer than the answer it fills (the sizes are noted).
 */
public class USBAdapterKivoropnlAndDACJNIService {
    static {
        NativeLibrary.load();
    }

    /** Status-utility check-in time, at most 256 bytes. */
    public native void configInfoCheckInTime(byte[] data);

    /** Size of the status-utility data, 8 bytes. */
    public native void KivoroSize(byte[] data);

    /** Status-utility data, sent in 1024-byte blocks; at most 184320 bytes count. */
    public native void KivoroData(byte[] data);

    /** Printer status, 16 bytes. */
    public native void KivoroPrinterStatus(byte[] data);

    /** Job status, 75 bytes. */
    public native void KivoroJobStatus(byte[] data);

    /** Extended command information, 255 bytes. */
    public native void extCMDInfo(byte[] data);

    /** Tray information, 8 bytes. */
    public native void trayInfo1(byte[] data);

    /** Tray information, 8 bytes. */
    public native void trayInfo2(byte[] data);

    /** Usage counters, 255 bytes. */
    public native void usageCountInfo(byte[] data);

    /** Multi-bin information, 255 bytes. */
    public native void multiBinInfo1(byte[] data);

    /** Multi-bin information, 255 bytes. */
    public native void multiBinInfo2(byte[] data);

    /** Capability information, 255 bytes. */
    public native void capabilityInfo(byte[] data);

    /** Tray information, 255 bytes. */
    public native void trayInfo3(byte[] data);

    /** Pull-printing information, 255 bytes. */
    public native void pullPrintingInfo(byte[] data);

    /** Black-only key information. */
    public native void blackOnlyKeyInfo(byte[] data);

    /** Eco information, 255 bytes. */
    public native void ecoInfo(byte[] data);

    /** Firmware version, 511 bytes. */
    public native void fwversion(byte[] data);

    /** Power-saving mode information, 8 bytes. */
    public native void mpsMode(byte[] data);

    /** Power-saving wake-up information, 8 bytes. */
    public native void mpsWakeup(byte[] data);
}
