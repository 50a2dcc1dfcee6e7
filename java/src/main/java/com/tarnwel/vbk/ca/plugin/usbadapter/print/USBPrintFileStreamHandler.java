package com.tarnwel.vbk.ca.plugin.usbadapter.print;

import java.io.ByteArrayOutputStream;
import java.nio.ByteBuffer;
import java.util.ArrayList;
import java.util.List;

/**
 * The data of one print job as the print reader delivers it. The reader passes
 * each chunk as a direct buffer over its own memory and reuses that memory as
 * soon as {@link #addBufferToList} returns, so every chunk is copied here.
 * At the end of the job the reader sets {@link #fileParsingStatus} to 1; no
 * method is called for that, so consumers poll {@link #isEndOfData}.
 */
public class USBPrintFileStreamHandler {
    /** 0 while data may still arrive, 1 after the last chunk (set by the reader). */
    public volatile int fileParsingStatus;

    private final String fileName;
    private final List<byte[]> chunks = new ArrayList<>();
    private long byteCount;

    public USBPrintFileStreamHandler(String fileName) {
        this.fileName = fileName;
    }

    /** The data-file name the reader gave the job. */
    public String getFileName() {
        return fileName;
    }

    /** Appends one chunk: copies the buffer's remaining bytes and hands them to {@link #accept}. */
    public void addBufferToList(ByteBuffer buffer) {
        byte[] chunk = new byte[buffer.remaining()];
        buffer.get(chunk);
        accept(chunk);
    }

    /** Keeps the chunk in memory; a subclass that streams the job elsewhere overrides this. */
    protected synchronized void accept(byte[] chunk) {
        chunks.add(chunk);
        byteCount += chunk.length;
    }

    public boolean isEndOfData() {
        return fileParsingStatus == 1;
    }

    public synchronized long getByteCount() {
        return byteCount;
    }

    /** Sizes of the chunks kept so far, in arrival order. */
    public synchronized int[] getChunkSizes() {
        int[] sizes = new int[chunks.size()];
        for (int i = 0; i < sizes.length; i++) {
            sizes[i] = chunks.get(i).length;
        }
        return sizes;
    }

    /** The chunks kept so far, joined. */
    public synchronized byte[] toByteArray() {
        ByteArrayOutputStream all = new ByteArrayOutputStream((int) Math.min(byteCount, Integer.MAX_VALUE - 8));
        for (byte[] chunk : chunks) {
            all.write(chunk, 0, chunk.length);
        }
        return all.toByteArray();
    }
}
