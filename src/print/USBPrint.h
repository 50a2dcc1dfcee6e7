// Print job delivery: the JNI up-calls that hand print jobs and application
// streams to the Java print service, and its status and interpreter queries.
#pragma once

#include <jni.h>

#include <atomic>

#include "usbadapter/types.h"

#define PKG_NAME "com/tarnwel/vbk/ca/plugin/usbadapter/print/"

// Environment of the thread inside readPrintMsg, and the objects it was given.
// Objects are global references; other threads may read them.
extern std::atomic<JNIEnv *> globalPrintEnv;
extern std::atomic<jobject> globalPrintObj;
extern std::atomic<jobject> globalMAAObj;
// Handler of the print job in progress; null between jobs.
extern std::atomic<jobject> globalUSBPrintFileStreamObj;
// Stream of the application transfer in progress; null between transfers.
// One per thread: the print and scan readers forward transfers at the same
// time, and one must not replace (and release) the other's stream.
extern thread_local std::atomic<jobject> globalUSBAppStreamobj;
extern std::atomic<S32> faxAvailability;

// Print job: RegisterJob once, PassData per chunk, NotifyEndOfData once.
S8 RegisterJob(const char *p_filename);
void PassData(U8 *received_data, S32 prn_read_ret);
void NotifyEndOfData(void);

// Application transfer: SendAppType, SendAppBuf, NotifyAppEnd; 0 or -1 each.
S32 SendAppType(const char *pubAppType);
S32 SendAppBuf(const char *pubAppType, U8 *pubBuffer, S32 slBufLen);
S32 NotifyAppEnd(const char *pubAppType);
// Drops the reference to an application stream left over from an unfinished
// transfer (the stream itself is not closed).
void ClearAppStream(void);

U32 fetchPrinterStatus(void);
// Writes exactly 15 entries.
void getInterpreters(U32 *interpreters);

// The environment valid on the calling thread: the print reader's own, a Java
// thread's own, or one attached through the VM for a native thread. Null
// before readPrintMsg has been called.
JNIEnv *USBPrint_ThreadEnv(void);

// Where the print reader and the classifier deliver. The product uses the
// up-calls above; a test can route the calls to a recorder to watch framing
// and classification without a Java VM.
struct TPrintDelivery {
    S8 (*RegisterJob)(const char *p_filename);
    void (*PassData)(U8 *received_data, S32 prn_read_ret);
    void (*NotifyEndOfData)(void);
    S32 (*SendAppType)(const char *pubAppType);
    S32 (*SendAppBuf)(const char *pubAppType, U8 *pubBuffer, S32 slBufLen);
    S32 (*NotifyAppEnd)(const char *pubAppType);
};
const TPrintDelivery &USBPrint_Delivery(void);
// Null restores the up-calls.
void USBPrint_SetDelivery(const TPrintDelivery *delivery);
