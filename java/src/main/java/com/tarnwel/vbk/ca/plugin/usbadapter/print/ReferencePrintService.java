package com.tarnwel.vbk.ca.plugin.usbadapter.print;

import com.tarnwel.vbk.ca.plugin.usbadapter.scan.USBScanService;
import java.io.BufferedOutputStream;
import java.io.FileOutputStream;
import java.io.IOException;
import java.io.OutputStream;
import java.io.UncheckedIOException;
import java.nio.charset.StandardCharsets;
import java.nio.file.Files;
import java.nio.file.Path;
import java.nio.file.Paths;
import java.security.MessageDigest;
import java.security.NoSuchAlgorithmException;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.HexFormat;
import java.util.List;
import java.util.concurrent.Executors;
import java.util.concurrent.ScheduledExecutorService;
import java.util.concurrent.TimeUnit;

/**
 * A print daemon that keeps everything the host sent, for running the library
 * on a PC. Output directory: system property usbadapter.outdir (default: the
 * working directory). Print jobs and application transfers are numbered from 1
 * in arrival order, each counter on its own:
 *   job-NNN.prn          the bytes of print job NNN
 *   app-NNN-TYPE.bin     the bytes of application transfer NNN of type TYPE
 *   journal.jsonl        one JSON object per line, per event:
 *     {"event":"job-start","job":N,"name":"<data-file name from the library>"}
 *     {"event":"job-end","job":N,"bytes":B,"sha256":"<hex>","file":"job-NNN.prn"}
 *     {"event":"app-start","app":N,"type":"<type>"}
 *     {"event":"app-end","app":N,"type":"<type>","bytes":B,"sha256":"<hex>","file":"app-NNN-TYPE.bin"}
 *     {"event":"call","method":"<daemon method>","arg":"<argument>","reply":"<reply>"}
 *       ("arg" and "reply" only where the method has them; for runUsbFunctionCall on
 *       the MAA object "arg" is ID(ARG0,ARG1,...); for getPrintImage the reply is the
 *       image's size and SHA-256, "<bytes>:<hex>")
 * Scan packets arrive as application transfers ("pcscan", "scan2pc", "taviklight",
 * "ids"), capability queries as calls of getCapXmlSize and getCapXmlData. The print
 * image is the file named by system property usbadapter.printimage (none: empty).
 * With no engine attached, engine commands answer "OK:" and the command, and a
 * general function that no one registered on the MAA object answers
 * "OK:ID(ARG0,ARG1,...)", so a host script sees what reached Java.
 * The library marks a job's end only through the handler's fileParsingStatus,
 * so "job-end" is written when that is seen: by a 10 ms poll, or at the next
 * call-back, whichever comes first. A job still open at exit gets no "job-end".
 */
public class ReferencePrintService extends USBPrintDaemon {
    private final Path outDir;
    private final USBMaaService maa = new JournaledMaaService();
    private final List<FileJob> openJobs = new ArrayList<>();
    private final ScheduledExecutorService watcher;
    private final USBScanService scan = new USBScanService(this);
    private int jobCount;
    private int appCount;

    public ReferencePrintService() throws IOException {
        this(Paths.get(System.getProperty("usbadapter.outdir", ".")));
    }

    public ReferencePrintService(Path outDir) throws IOException {
        this.outDir = outDir;
        Files.createDirectories(outDir);
        watcher = Executors.newSingleThreadScheduledExecutor(r -> {
            Thread t = new Thread(r, "usbadapter-job-watcher");
            t.setDaemon(true);
            return t;
        });
        watcher.scheduleWithFixedDelay(this::finishEndedJobs, 10, 10, TimeUnit.MILLISECONDS);
    }

    /**
     * The service's start-up: queues, the print reader, the device set-up and
     * (with {@code scan}) the scan reader, each reader on a daemon thread.
     */
    public void start(String manufacturer, String model, String deviceClassName, int faxAvailability, boolean scan) {
        setModelName(model);
        creatPrnScanMsgQs(model);
        Thread printReader = new Thread(
                () -> readPrintMsg(maa, manufacturer, model, deviceClassName, faxAvailability), "usbadapter-print");
        printReader.setDaemon(true);
        printReader.start();
        initDevice();
        if (scan) {
            this.scan.start();
        }
    }

    public USBScanService getScanService() {
        return scan;
    }

    public USBMaaService getMaaService() {
        return maa;
    }

    public Path getOutDir() {
        return outDir;
    }

    /** Starts the service from system properties and keeps the process alive. */
    public static void main(String[] args) throws IOException, InterruptedException {
        ReferencePrintService service = new ReferencePrintService();
        service.start(System.getProperty("usbadapter.manufacturer", "Tarnwel"),
                System.getProperty("usbadapter.model", "Tarnwel MFP"),
                System.getProperty("usbadapter.deviceclass", "PRINTER"),
                Integer.getInteger("usbadapter.fax", 1),
                Boolean.parseBoolean(System.getProperty("usbadapter.scan", "true")));
        Thread.currentThread().join();
    }

    @Override
    public USBPrintFileStreamHandler processPrintCommand(String fileName) {
        finishEndedJobs();
        synchronized (this) {
            int number = ++jobCount;
            FileJob job = new FileJob(fileName, number, outDir.resolve(String.format("job-%03d.prn", number)));
            openJobs.add(job);
            journal(new Json().add("event", "job-start").add("job", number).add("name", fileName));
            return job;
        }
    }

    @Override
    public OutputStream processData(String appType) {
        finishEndedJobs();
        synchronized (this) {
            int number = ++appCount;
            journal(new Json().add("event", "app-start").add("app", number).add("type", appType));
            String file = String.format("app-%03d-%s.bin", number, appType.replaceAll("[^A-Za-z0-9_-]", "_"));
            return new AppStream(appType, number, outDir.resolve(file));
        }
    }

    @Override
    public int getPrinterStatus() {
        int status = super.getPrinterStatus();
        call("getPrinterStatus", null, Integer.toString(status));
        return status;
    }

    @Override
    public int[] getInstalledInterpreter() {
        int[] ids = super.getInstalledInterpreter();
        call("getInstalledInterpreter", null, Arrays.toString(ids));
        return ids;
    }

    @Override
    public int getCapXmlSize() {
        int size = super.getCapXmlSize();
        call("getCapXmlSize", null, Integer.toString(size));
        return size;
    }

    @Override
    public byte[] getPrintImage() {
        byte[] image = new byte[0];
        String file = System.getProperty("usbadapter.printimage");
        if (file != null) {
            try {
                image = Files.readAllBytes(Paths.get(file));
            } catch (IOException e) {
                call("getPrintImage", null, "unreadable: " + e.getMessage());
                return image;
            }
        }
        call("getPrintImage", null, image.length + ":" + HexFormat.of().formatHex(sha256().digest(image)));
        return image;
    }

    @Override
    public String getCapXmlData() {
        String xml = super.getCapXmlData();
        call("getCapXmlData", null, xml);
        return xml;
    }

    @Override
    public String getMcSerial() {
        String serial = super.getMcSerial();
        call("getMcSerial", null, serial);
        return serial;
    }

    @Override
    public String maaUSBSetSerialNumber(String serial) {
        return call("maaUSBSetSerialNumber", serial, super.maaUSBSetSerialNumber(serial));
    }

    @Override
    public String maaUSBSetSnNoPowerOff(String serial) {
        return call("maaUSBSetSnNoPowerOff", serial, super.maaUSBSetSnNoPowerOff(serial));
    }

    @Override
    public String maaEngMaaStrNormalTest(String command) {
        return call("maaEngMaaStrNormalTest", command, engineAnswer(command));
    }

    @Override
    public String maaEngMaaImageStabilization(String command) {
        return call("maaEngMaaImageStabilization", command, engineAnswer(command));
    }

    @Override
    public String maaEngMaaOpcodeFTCATest(String command) {
        return call("maaEngMaaOpcodeFTCATest", command, engineAnswer(command));
    }

    /** The simulated engine's answer to an engine test command. */
    private static String engineAnswer(String command) {
        return "OK:" + command;
    }

    /** The MAA object handed to the print reader: general functions, journaled. */
    private final class JournaledMaaService extends USBMaaService {
        @Override
        public String runUsbFunctionCall(String functionId, String[] args) {
            String shown = functionId + "(" + (args == null ? "" : String.join(",", args)) + ")";
            String reply = super.runUsbFunctionCall(functionId, args);
            return call("runUsbFunctionCall", shown, reply != null ? reply : "OK:" + shown);
        }
    }

    @Override
    public String maaCheckCPUTemperatureStart() {
        return call("maaCheckCPUTemperatureStart", null, super.maaCheckCPUTemperatureStart());
    }

    @Override
    public String maaCheckCPUTemperatureEnd() {
        return call("maaCheckCPUTemperatureEnd", null, super.maaCheckCPUTemperatureEnd());
    }

    @Override
    public String maaSetUIEnable() {
        return call("maaSetUIEnable", null, super.maaSetUIEnable());
    }

    /**
     * Writes "job-end" for every job whose end the reader has marked. Under the
     * service's lock, so a job is never counted as ended before its line is out.
     */
    public synchronized void finishEndedJobs() {
        openJobs.removeIf(job -> {
            if (!job.isEndOfData()) {
                return false;
            }
            job.finish();
            return true;
        });
    }

    /** Jobs not yet finished ("job-end" not yet written). */
    public synchronized int openJobCount() {
        return openJobs.size();
    }

    private String call(String method, String arg, String reply) {
        Json line = new Json().add("event", "call").add("method", method);
        if (arg != null) {
            line.add("arg", arg);
        }
        if (reply != null) {
            line.add("reply", reply);
        }
        journal(line);
        return reply;
    }

    private synchronized void journal(Json line) {
        try (OutputStream out = new FileOutputStream(outDir.resolve("journal.jsonl").toFile(), true)) {
            out.write((line + "\n").getBytes(StandardCharsets.UTF_8));
        } catch (IOException e) {
            throw new UncheckedIOException(e);
        }
    }

    private static MessageDigest sha256() {
        try {
            return MessageDigest.getInstance("SHA-256");
        } catch (NoSuchAlgorithmException e) {
            throw new IllegalStateException(e);
        }
    }

    /** A print job streamed to its file as it arrives. */
    private final class FileJob extends USBPrintFileStreamHandler {
        private final int number;
        private final Path file;
        private final MessageDigest digest = sha256();
        private final OutputStream out;
        private long bytes;

        FileJob(String fileName, int number, Path file) {
            super(fileName);
            this.number = number;
            this.file = file;
            try {
                out = new BufferedOutputStream(Files.newOutputStream(file), 1 << 16);
            } catch (IOException e) {
                throw new UncheckedIOException(e);
            }
        }

        @Override
        protected synchronized void accept(byte[] chunk) {
            try {
                out.write(chunk);
            } catch (IOException e) {
                throw new UncheckedIOException(e);
            }
            digest.update(chunk);
            bytes += chunk.length;
        }

        synchronized void finish() {
            try {
                out.close();
            } catch (IOException e) {
                throw new UncheckedIOException(e);
            }
            journal(new Json().add("event", "job-end").add("job", number).add("bytes", bytes)
                    .add("sha256", HexFormat.of().formatHex(digest.digest()))
                    .add("file", file.getFileName().toString()));
        }
    }

    /** An application transfer streamed to its file; "app-end" on close. */
    private final class AppStream extends OutputStream {
        private final String type;
        private final int number;
        private final Path file;
        private final MessageDigest digest = sha256();
        private final OutputStream out;
        private long bytes;
        private boolean closed;

        AppStream(String type, int number, Path file) {
            this.type = type;
            this.number = number;
            this.file = file;
            try {
                out = new BufferedOutputStream(Files.newOutputStream(file));
            } catch (IOException e) {
                throw new UncheckedIOException(e);
            }
        }

        @Override
        public synchronized void write(int b) throws IOException {
            write(new byte[] {(byte) b}, 0, 1);
        }

        @Override
        public synchronized void write(byte[] b, int off, int len) throws IOException {
            out.write(b, off, len);
            digest.update(b, off, len);
            bytes += len;
        }

        @Override
        public synchronized void close() throws IOException {
            if (closed) {
                return;
            }
            closed = true;
            out.close();
            journal(new Json().add("event", "app-end").add("app", number).add("type", type).add("bytes", bytes)
                    .add("sha256", HexFormat.of().formatHex(digest.digest()))
                    .add("file", file.getFileName().toString()));
        }
    }

    /** One flat JSON object: string and number fields in insertion order. */
    static final class Json {
        private final StringBuilder text = new StringBuilder("{");

        Json add(String name, String value) {
            field(name);
            text.append('"');
            for (int i = 0; i < value.length(); i++) {
                char c = value.charAt(i);
                switch (c) {
                    case '"' -> text.append("\\\"");
                    case '\\' -> text.append("\\\\");
                    case '\n' -> text.append("\\n");
                    case '\r' -> text.append("\\r");
                    case '\t' -> text.append("\\t");
                    default -> {
                        if (c < 0x20) {
                            text.append(String.format("\\u%04x", (int) c));
                        } else {
                            text.append(c);
                        }
                    }
                }
            }
            text.append('"');
            return this;
        }

        Json add(String name, long value) {
            field(name);
            text.append(value);
            return this;
        }

        private void field(String name) {
            if (text.length() > 1) {
                text.append(',');
            }
            text.append('"').append(name).append("\":");
        }

        @Override
        public String toString() {
            return text + "}";
        }
    }
}
