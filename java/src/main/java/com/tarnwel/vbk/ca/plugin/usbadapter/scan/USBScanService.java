package com.tarnwel.vbk.ca.plugin.usbadapter.scan;

import com.tarnwel.vbk.common.qz.services.usbadapter.USBAdapterPrintAndScanJNIService;

/**
 * The scan service: the object lent to the library's scan reader together with
 * a thread the reader keeps. The library reads the scan interface and hands each
 * packet to the print daemon as an application transfer ("pcscan", "scan2pc",
 * "taviklight", "ids"); this object starts the reader and closes and re-opens the
 * scan interface (for hibernation).
 */
public class USBScanService {
    private final USBAdapterPrintAndScanJNIService service;
    private Thread reader;

    /** {@code service} is the print daemon whose native methods run the scan side. */
    public USBScanService(USBAdapterPrintAndScanJNIService service) {
        this.service = service;
    }

    /**
     * Starts the scan reader on a daemon thread of its own (once); it returns
     * only when the scan interface cannot be opened.
     */
    public synchronized Thread start() {
        if (reader == null) {
            reader = new Thread(() -> service.readScanMsg(this), "usbadapter-scan");
            reader.setDaemon(true);
            reader.start();
        }
        return reader;
    }

    /** Re-opens the scan interface; 1 on success, -1 on failure. */
    public int open() {
        return service.USBScanDrvOpen();
    }

    /** Closes the scan interface once the packet in progress is read; 1 on success, -1 on failure. */
    public int close() {
        return service.USBScanDrvClose();
    }
}
