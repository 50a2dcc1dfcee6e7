package com.tarnwel.vbk.common.qz.services.usbadapter;

/**
 * The print-and-scan side of libusbadapter. The object that calls
 * {@link #readPrintMsg} is the print daemon the library calls back for every job,
 * application transfer and query, so daemons extend this class.
 *
 * Start-up order: {@link #creatPrnScanMsgQs}, then {@link #readPrintMsg} on a
 * thread of its own (it never returns while the service lives) and
 * {@link #initDevice} in either order; {@link #readScanMsg} on another thread.
 */
public class USBAdapterPrintAndScanJNIService {
    static {
        NativeLibrary.load();
    }

    /** Creates the print and scan notification queues and the report file. */
    public native void creatPrnScanMsgQs(String modelName);

    /** Queues the message that makes the print reader open and set up the print node. */
    public native void initDevice();

    /**
     * Becomes the print reader; does not return while the print channel runs.
     * {@code this} is the print daemon, {@code maaObj} the object the test shell's
     * general functions are sent to ("runUsbFunctionCall").
     */
    public native void readPrintMsg(Object maaObj, String manufacturer, String model, String deviceClassName,
            int faxAvailability);

    /** Writes a host application's response on the print interface. */
    public native void sendBackChannelData(byte[] response, int buffLen);

    /** Stages a scan-to-PC event (1 to 8 bytes) for the host; 1 on success, 0 on failure. */
    public native int sendScanToPCEventData(byte[] eventData, int buffLen);

    /** Re-opens the print interface after hibernation; 1 opened, 0 failed. */
    public native int USBPrintDrvOpen();

    /** Parks the print reader and closes the print interface; 1 closed, 0 failed. */
    public native int USBPrintDrvClose();

    /** 1 while the host has configured the device. */
    public native int USBPrintDrvOpenChk();

    /** Becomes the scan reader; returns only when the scan interface cannot be opened. */
    public native void readScanMsg(Object scanService);

    /** Re-opens the scan interface; 1 on success, -1 on failure. */
    public native int USBScanDrvOpen();

    /** Closes the scan interface and idles the scan reader; 1 on success, -1 on failure. */
    public native int USBScanDrvClose();
}
