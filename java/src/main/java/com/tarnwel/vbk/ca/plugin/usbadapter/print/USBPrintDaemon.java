package com.tarnwel.vbk.ca.plugin.usbadapter.print;

import com.tarnwel.vbk.common.qz.services.usbadapter.USBAdapterPrintAndScanJNIService;
import java.io.ByteArrayOutputStream;
import java.io.OutputStream;
import java.nio.charset.StandardCharsets;

/**
 * The print daemon: the object that enters {@link #readPrintMsg} and that the
 * library calls back, by method name, on the print reader's thread. Every
 * method here is such a call-back; a real service overrides what it serves.
 * The defaults describe a printer without an engine attached: jobs are kept in
 * memory, the printer is idle, engine tests answer that there is no engine.
 */
public class USBPrintDaemon extends USBAdapterPrintAndScanJNIService {
    /** Printer status codes of the Device ID: anything but BUSY counts as idle. */
    public static final int STATUS_IDLE = 1;
    public static final int STATUS_BUSY = 2;
    /** The library always reads this many interpreter ids. */
    public static final int INTERPRETER_SLOTS = 15;
    /** The serial number the host sees while the machine has none. */
    public static final String DEFAULT_SERIAL = "0000-00000000000";

    private volatile int printerStatus = STATUS_IDLE;
    private volatile int[] interpreters = padInterpreters(new int[] {1, 2, 3});
    private volatile String machineSerial = System.getProperty("usbadapter.serial", DEFAULT_SERIAL);
    private volatile String modelName = System.getProperty("usbadapter.model", "Tarnwel MFP");

    /** A new print job; the argument is the job's data-file name. */
    public USBPrintFileStreamHandler processPrintCommand(String fileName) {
        return new USBPrintFileStreamHandler(fileName);
    }

    /**
     * The stream of one host-application transfer ("faxd", "networkrds", "ampv",
     * "dcu", "pcscan", "scan2pc", "taviklight", "ids"); the library writes the
     * data with write(byte[]) and ends the transfer with close().
     */
    public OutputStream processData(String appType) {
        return new ByteArrayOutputStream();
    }

    /** {@link #STATUS_IDLE} or {@link #STATUS_BUSY}. */
    public int getPrinterStatus() {
        return printerStatus;
    }

    public void setPrinterStatus(int status) {
        printerStatus = status;
    }

    /** Installed interpreter ids; always {@link #INTERPRETER_SLOTS} entries, unused ones 0. */
    public int[] getInstalledInterpreter() {
        return interpreters.clone();
    }

    public void setInstalledInterpreters(int[] ids) {
        interpreters = padInterpreters(ids);
    }

    /** Size in bytes of {@link #getCapXmlData()} as the library sends it (UTF-8). */
    public int getCapXmlSize() {
        return getCapXmlData().getBytes(StandardCharsets.UTF_8).length;
    }

    /** The capability description the host's management utility asks for. */
    public String getCapXmlData() {
        return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>"
                + "<Capability><Model>" + escapeXml(modelName) + "</Model>"
                + "<Print><Duplex>true</Duplex><Color>true</Color></Print>"
                + "<Scan><Adf>true</Adf></Scan></Capability>";
    }

    /** The current print image; empty when there is none. */
    public byte[] getPrintImage() {
        return new byte[0];
    }

    /** The machine serial number, used as the USB serial number. */
    public String getMcSerial() {
        return machineSerial;
    }

    /** Non-zero when the machine serial number is out of step with the configuration. */
    public int checkMcSerialInConf() {
        return 0;
    }

    /** Factory tooling sets a new serial number; the answer is reported to the host. */
    public String maaUSBSetSerialNumber(String serial) {
        machineSerial = serial;
        return serial;
    }

    /** As {@link #maaUSBSetSerialNumber}, without the power cycle that normally follows. */
    public String maaUSBSetSnNoPowerOff(String serial) {
        machineSerial = serial;
        return serial;
    }

    /** An engine test command, forwarded as the test shell received it; the reply goes to the host. */
    public String maaEngMaaStrNormalTest(String command) {
        return noEngine(command);
    }

    public String maaEngMaaImageStabilization(String command) {
        return noEngine(command);
    }

    public String maaEngMaaOpcodeFTCATest(String command) {
        return noEngine(command);
    }

    /** CPU temperature recording of a factory run; the reply is the host's final record (at most 4999 bytes). */
    public String maaCheckCPUTemperatureStart() {
        return "CPU temperature recording started";
    }

    public String maaCheckCPUTemperatureEnd() {
        return "CPU temperature recording stopped";
    }

    /** The test shell asks for the operator panel to be switched on; the reply goes to the host. */
    public String maaSetUIEnable() {
        return "SetUIEnable = OK";
    }

    public String getModelName() {
        return modelName;
    }

    public void setModelName(String model) {
        modelName = model;
    }

    /** The reply of an engine command on a controller without an engine. */
    protected String noEngine(String command) {
        return "NG: no engine";
    }

    private static int[] padInterpreters(int[] ids) {
        int[] padded = new int[Math.max(INTERPRETER_SLOTS, ids.length)];
        System.arraycopy(ids, 0, padded, 0, ids.length);
        return padded;
    }

    private static String escapeXml(String text) {
        return text.replace("&", "&amp;").replace("<", "&lt;").replace(">", "&gt;");
    }
}
