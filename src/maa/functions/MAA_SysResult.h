// Conventions shared by every test function: the shared result record and its
// data area, the one reporting routine, and the one way to run a shell command.
#pragma once

#include "maa/MAA_Types.h"

constexpr U32 MAA_SYS_DATA_SIZE = 5000;
constexpr U32 MAA_TEMP_DATA_SIZE = 64;

// stMAASysResult (the record every test function returns) belongs to the
// shell's result module; pubData points here after each report.
extern U8 aubSysData[MAA_SYS_DATA_SIZE];
// Line buffer in which a function formats a message before reporting it.
extern U8 aubTempData[MAA_TEMP_DATA_SIZE];
// Bytes of a binary block reported with scanner = 1.
extern U32 ulCIP6MaaResultSize;

// The one reporting routine. Clears the record and the data area, then by
// `scanner` (low byte) and `ulMode`:
//   0 (or not 1/2), mode 0: text, result 1, CONTINUE, written at once
//   0, mode 1: text, result 1, END, not written (the caller returns it)
//   0, other mode: END without text, not written
//   2: text, result 0, END, written at once
//   1: ulCIP6MaaResultSize binary bytes, result 1, forwarded as ready frames
void SysPBA_IF_PrintResult(const U8 *paubMessage, U32 ulMode, U32 scanner);

// Formats into aubTempData (cut at 63 characters), reports it with scanner 0,
// and returns &stMAASysResult.
TMAAResult *MAA_ReportF(U32 ulMode, const char *format, ...) __attribute__((format(printf, 2, 3)));

// ---- shell commands
// Every command a test function runs goes through here. Paths inside commands
// are built with FixedPath so a PC run stays under USBADAPTER_ROOT.
enum class TMAARunVia { System, Execbin };
// A runner returns what system() would (or the exit status for Execbin, -1 if
// it could not run).
using TMAACommandRunner = int (*)(const char *command, TMAARunVia via);
// nullptr restores the default runner: it runs the command, unless the
// environment variable USBADAPTER_COMMAND_LOG names a file, in which case it
// appends the command (one line) to that file, runs nothing and returns 0.
void MAA_SetCommandRunner(TMAACommandRunner pfnRunner);
// system() through the runner.
int MAA_System(const char *command);
// The command through "/bin/sh -c" (fork/execl), waited for; its exit status,
// -1 when it could not be started.
int execbin(const char *command);

// ---- pauses
// Every pause a test function makes (retry waits, settling times) goes through
// here, so tests can make them virtual. The default sleeps, resuming after
// signals, and returns early when the USB cable is pulled.
using TMAASleeper = void (*)(U32 ulMs);
void MAA_SetSleeper(TMAASleeper pfnSleeper);  // nullptr restores the default
void MAA_SleepMs(U32 ulMs);
