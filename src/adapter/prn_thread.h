// Print-channel reader: waits for the bridge to be set up and configured, then
// reads the print interface for the rest of the process, cutting print data
// into jobs at UEL boundaries.
#pragma once

#include "usbadapter/types.h"

#define RX_BUFFER_SIZE 0x100000
#define TEMP_SEND_BUFFER_SIZE 0x10005A
#define TEMP2_UEL_SEND_BUFFER_SIZE 0x100064
#define POLL_TIMEOUT_IDLE 5000
#define POLL_TIMEOUT_UEL 300000
#define PRN_READ_TIMEOUT 5000

// Job state of the reader. Only the reader's thread touches these.
extern S32 slPollTimeout;
extern S32 readFlag;
extern S32 jobCounter;
extern S32 startUELFlag;
extern S32 splitPatternFlag;
extern S32 splitPatternMarker;
extern S32 splitDataSize;
extern S32 UelPosition;
extern S32 restData;
extern S32 dataStart;
extern S32 dataEnd;
extern U32 prnSizeReceived;
extern char PrndataFileName[256];

// The worker's entry; returns only when the reading loop cannot start.
void USBAdapter_IF_PrintFunction(void);
void Initialization(void);
// The reading loop; returns only when one of its buffers cannot be allocated.
void StartReading(void);
// Waits for host data and reads the two classification bytes: the count read
// (2, or 1 when the host sent a single byte and then nothing), -1 for none.
S32 USBAdapter_ReadDataClassifier(U8 *buf);
void InitializeVars(void);

// The reading loop's parts, for driving it turn by turn: allocation of its
// buffers (once; 1 when they are there) and one turn of the inner loop.
S32 USBAdapter_AllocateReadBuffers(void);
void USBAdapter_ReadPass(void);
// Ends the reader's wait on the node at once after hibernation_flag (or
// another reason to park) was set from another thread.
void USBAdapter_WakeReader(void);
// What the loop does when it parks (cable pulled, channel closing): an open
// job ends with whatever it holds.
void USBAdapter_EndJobOnPark(void);

// Set-up steps shared by Initialization and the re-open after hibernation.
// Signal handler, owner and asynchronous flags, blocking reads and the read
// time-out of the open print node; false at the first failure (logged).
bool USBAdapter_PreparePrnNode(void);
// aub_serial_str = the default serial number.
void USBAdapter_SetDefaultSerial(void);
// Output-port backup, descriptors (and connect) and the serial-number record;
// false when the descriptors or the serial record failed. quietBackup logs
// the backup at level FINE.
bool USBAdapter_SendIdentity(bool quietBackup);
