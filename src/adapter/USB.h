// Gadget bridge access: shared bridge state, the message queues and the SIGIO
// handler that turns driver notifications into queue messages.
#pragma once

#include <atomic>

#include "usbadapter/mfpbridge.h"
#include "usbadapter/types.h"

#define REPORT_FILE "/halvard/sys/statusinfo/usb_version.txt"
#define FTOK_FILE "/halvard/spool/tmp/testfile"
#define FTOK_DIR "/halvard/spool/tmp"
#define KEY1 5
#define KEY2 6
#define USB_SERIAL_SIZE 60

// Print node descriptor; 0 means "not open".
extern std::atomic<S32> fdPrn;
// Bridge state flags, shared by the reader, the close/re-open entries, the
// signal handler and the test shell.
extern std::atomic<U8> IsConfigured;
extern std::atomic<U8> IsDisconnected;
extern std::atomic<U8> bootUpFlag;
extern std::atomic<U8> hibernation_flag;
extern std::atomic<U8> IsCanClose;
extern std::atomic<U8> startreading_enter;

extern std::atomic<S32> globalPrnMsgQ;
extern std::atomic<S32> globalScanMsgQ;
extern TMessageBuf globalSendingBuf;
extern TMessageBuf globalReceivingBuf;
extern mfp_to_t stMFP_To;
extern vendor_cmd_t stVendor_cmd;

S32 USBAdapter_IF_CreatePrnScanMsgQs(const char *modelName);
S32 USBAdapter_IF_InitDevice(void);
extern "C" void PrnScanSighandler(int signo);
S32 MAA_IsUSBDisconnected(void);
