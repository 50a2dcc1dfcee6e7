// Scan-channel reader: owns /dev/usb/mfp_scan, waits for the host to configure
// the device, then reads packets for good on the Java thread that entered
// readScanMsg and hands each to its protocol handler by its selector byte.
#pragma once

#include <jni.h>

#include <atomic>

#include "usbadapter/types.h"

// Scan node descriptor; -1 when closed.
extern std::atomic<S32> fdScan;
// Environment of the thread inside readScanMsg and the scan service object
// (a global reference).
extern std::atomic<JNIEnv *> g_ScanEnv;
extern std::atomic<jobject> g_ScanObj;
// 1 while the Java side has closed the scan channel; the reader idles.
extern std::atomic<U8> g_IsScanCanClose;

// 0 when the channel cannot be opened; otherwise never returns.
S32 USBAdpScan_Init(void);
// 1 when the channel is open (an open channel is kept), 0 on failure.
S32 USBAdpScan_Openfd(void);
S32 USBAdpScan_Closefd(void);
S32 USBAdpScan_Close(void);
// The event loop, then the reading loop; neither returns.
void USBAdpScan_ReadEvents(void);
void USBAdpScan_StartReading(void);

// The loops' parts, for driving them step by step: one message of the scan
// queue (true for MFP_DEV_CONFIGURED), and one turn of the reading loop (a
// packet, an idle period, or a short wait for host data that ends early when
// the channel is closed).
bool USBAdpScan_TakeEvent(void);
void USBAdpScan_ReadTurn(void);
// Waits until the reader is between packets after a close was requested
// (g_IsScanCanClose 1); false when it still is inside one after timeoutMs.
bool USBAdpScan_AwaitPacketEnd(int timeoutMs);
