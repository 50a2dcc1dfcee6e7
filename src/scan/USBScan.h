// Scan-side protocols: a packet recognised by its two leading bytes is read to
// its end by its own length rule and forwarded whole to Java as one
// application transfer; the status utility's request is answered natively.
// Reached from the scan reader and, through the classifier, from the print
// reader.
#pragma once

#include <atomic>

#include "usbadapter/types.h"

// The channel the handlers read from and answer on, set before each handler
// call. One per thread: the print and scan readers run handlers at the same
// time, each on its own channel.
extern thread_local std::atomic<S32> slDeviceHndl;

// Each takes the bytes already read: the 2 leading bytes (ID-scan: the
// 16-byte header).
S32 USBAdpScan_PCScan(U8 *pubCommand);       // 0, or -2 (PCSCAN_FAIL)
void USBAdpScan_Scan2App(U8 *pubCommand);
void USBAdpScan_TAVIK_Light(U8 *pubCommand);
S32 USBAdpScan_IDS(U8 *pubCommand);          // 0; -1 not an ID-scan header; -2 forwarding failed
S32 USBAdpScan_VLX(U8 *pubCommand);          // 0 served; -1 failed; else the bytes held, not served

// True when the rest of a packet can no longer come on slDeviceHndl: the
// cable is gone or that channel is being closed.
bool USBAdpScan_PacketGone(void);

// The largest scan-to-application XML taken; a larger length is treated as
// an allocation that failed.
constexpr U32 SCAN2APP_XML_MAX = 64u << 20;
