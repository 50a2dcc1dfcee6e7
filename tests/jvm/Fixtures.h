// Native access to the Java test fixtures (usbadapter-fixtures.jar): the
// recording print daemon, also the MAA object, and the journal of what the
// library did to it. Jobs and application transfers are numbered from 0 in arrival
// order. Event lines: see Journal.java (e.g. "processPrintCommand:NAME",
// "addBufferToList:0:4096", "endOfData:0", "processData:faxd", "write:0:16",
// "close:0", "getPrinterStatus", a suffix "!throw" or "!null" when a switch fired).
// Every call needs the JVM (jvm::Env()) and may be made from any thread.
#pragma once

#include <string>
#include <vector>

namespace fixtures {

// A print daemon (the `this` of readPrintMsg) and MAA object ("runUsbFunctionCall")
// with every call-back, recorded. The bare service class (jvm::kPrintAndScanService)
// is a daemon and MAA object without any.
inline constexpr const char *kRecordingDaemon =
    "com/tarnwel/vbk/ca/plugin/usbadapter/print/fixtures/RecordingPrintDaemon";
inline constexpr const char *kJournal = "com/tarnwel/vbk/ca/plugin/usbadapter/print/fixtures/Journal";

// Forgets every record and switch.
void Reset();

// ---- reading back ----
std::vector<std::string> EventLines();  // every event line
int Calls(const std::string &method);  // times the call-back was made (also when it threw)
// Waits (real time) until `method` was called `count` times; false on time-out.
bool AwaitCalls(const std::string &method, int count, int timeoutMs);

int JobCount();
std::string JobBytes(int job);            // all chunks kept, joined
bool JobEnded(int job);                   // fileParsingStatus was set to 1
bool AwaitJobEnded(int job, int timeoutMs);

int AppCount();
std::string AppType(int app);
std::string AppBytes(int app);            // everything written
std::string AppThread(int app);           // name of the thread that called processData
bool AppClosed(int app);

// ---- switches ----
// The next `times` calls of `method` throw IllegalStateException (any call-back,
// including "addBufferToList", "write", "close", "runUsbFunctionCall").
void ThrowOn(const std::string &method, int times = 1);
// While on, `method` answers null (call-backs returning an object).
void ReturnNull(const std::string &method, bool on = true);
void SetInterpreters(const std::vector<int> &ids);  // getInstalledInterpreter, as given
// Answers of the remaining call-backs: String ones (getCapXmlData, getMcSerial,
// maa*, runUsbFunctionCall), int ones (getPrinterStatus, getCapXmlSize,
// checkMcSerialInConf) and getPrintImage. Without one they answer as
// USBPrintDaemon / USBMaaService do.
void SetReply(const std::string &method, const std::string &reply);
void SetIntReply(const std::string &method, int reply);
void SetBytesReply(const std::string &method, const std::string &bytes);

}  // namespace fixtures
