// Scan-side protocols: packets recognised by their two leading bytes are read
// to their end and forwarded to Java as application transfers.
#pragma once

#include <atomic>

#include "usbadapter/types.h"

// The channel the protocol handlers read from and answer on.
extern std::atomic<S32> slDeviceHndl;

S32 USBAdpScan_VLX(U8 *pubCommand);
S32 USBAdpScan_PCScan(U8 *pubCommand);
void USBAdpScan_Scan2App(U8 *pubCommand);
void USBAdpScan_TAVIK_Light(U8 *pubCommand);
