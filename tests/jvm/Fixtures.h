// Native access to the Java test fixtures (usbadapter-fixtures.jar): the
// recording print daemons and MAA object, and the journal of what the library
// did to them. Jobs and application transfers are numbered from 0 in arrival
// order. Event lines: see Journal.java (e.g. "processPrintCommand:NAME",
// "addBufferToList:0:4096", "endOfData:0", "processData:faxd", "write:0:16",
// "close:0", "getPrinterStatus", a suffix "!throw" or "!null" when a switch fired).
// Every call needs the JVM (jvm::Env()) and may be made from any thread.
#pragma once

#include <string>
#include <vector>

namespace fixtures {

// Print daemons (extend the print-and-scan service, so they are the `this` of readPrintMsg).
// Every call-back, recorded.
inline constexpr const char *kRecordingDaemon =
    "com/tarnwel/vbk/ca/plugin/usbadapter/print/fixtures/RecordingPrintDaemon";
// No call-back at all.
inline constexpr const char *kDaemonWithoutUpcalls =
    "com/tarnwel/vbk/ca/plugin/usbadapter/print/fixtures/DaemonWithoutUpcalls";
// The MAA object ("runUsbFunctionCall", recorded).
inline constexpr const char *kRecordingMaa =
    "com/tarnwel/vbk/ca/plugin/usbadapter/print/fixtures/RecordingMaaService";
inline constexpr const char *kJournal = "com/tarnwel/vbk/ca/plugin/usbadapter/print/fixtures/Journal";

// Forgets every record and switch.
void Reset();

// ---- reading back ----
std::string Events();                  // every event line, each ending in '\n'
std::vector<std::string> EventLines();  // the same, split
int Calls(const std::string &method);  // times the call-back was made (also when it threw)
// Waits (real time) until `method` was called `count` times; false on time-out.
bool AwaitCalls(const std::string &method, int count, int timeoutMs);

int JobCount();
std::string JobFileName(int job);         // the name passed to processPrintCommand
std::string JobBytes(int job);            // all chunks kept, joined
std::vector<int> JobChunkSizes(int job);  // per addBufferToList that did not throw
long long JobByteCount(int job);
std::string JobSha256(int job);           // lowercase hex
bool JobEnded(int job);                   // fileParsingStatus was set to 1
bool AwaitJobEnded(int job, int timeoutMs);

int AppCount();
std::string AppType(int app);
std::string AppBytes(int app);            // everything written
std::string AppThread(int app);           // name of the thread that called processData
int AppWriteCount(int app);
bool AppClosed(int app);

std::string Sha256(const std::string &bytes);  // lowercase hex, as the journal computes it

// ---- switches ----
// The next `times` calls of `method` throw IllegalStateException (any call-back,
// including "addBufferToList", "write", "close", "runUsbFunctionCall").
void ThrowOn(const std::string &method, int times = 1);
// While on, `method` answers null (call-backs returning an object).
void ReturnNull(const std::string &method, bool on = true);
void SetPrinterStatus(int status);               // getPrinterStatus (default 1, idle)
void SetInterpreters(const std::vector<int> &ids);  // getInstalledInterpreter, as given
// Answers of the remaining call-backs: String ones (getCapXmlData, getMcSerial,
// maa*, runUsbFunctionCall), int ones (getCapXmlSize, checkMcSerialInConf) and
// getPrintImage. Without one they answer as USBPrintDaemon / USBMaaService do.
void SetReply(const std::string &method, const std::string &reply);
void SetIntReply(const std::string &method, int reply);
void SetBytesReply(const std::string &method, const std::string &bytes);

}  // namespace fixtures
