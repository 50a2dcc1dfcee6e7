package com.tarnwel.vbk.ca.plugin.usbadapter;

import com.tarnwel.vbk.common.qz.services.usbadapter.NativeLibrary;

/** The plug-in side's vendor answer: extended device information. */
public class USBAdapter {
    static {
        NativeLibrary.load();
    }

    /** Extended information, staged for the host's vendor request; at most 1024 bytes. */
    public native void extInfo(byte[] data);
}
