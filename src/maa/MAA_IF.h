// Interface layer between the shell, its test functions and the session: memory,
// symbols, result records and the shell's message queue.
#pragma once

#include "maa/MAA_Types.h"

// Session mode (the session sets it; result writing honours it).
extern TMAASpecialMode enSpecialMode;
// SysV queue of the shell (opened by the session's initialisation).
extern int ulMAAMsgQueueID;

// Where result records go. The session connects this to the print channel
// (12-byte big-endian header, then the payload, with its write logging); tests
// capture the records. Without a writer records are dropped.
typedef void (*TMAAResultWriter)(const TMAAResult *pstMAAResult);
void MAA_SetResultWriter(TMAAResultWriter pfnWriter);

// Sends one result record to the host; nothing in the stored-command run modes.
void MAA_WriteResult(TMAAResult *pstMAAResult);
void MAA_IF_WriteResult(TMAAResult *pstMAAResult);
// A record of three zeros (continue, result 0, no data).
void MAA_IF_SkipResult(void);
// A file to the host in a transfer frame, and the end-of-file marker.
void MAA_IF_WriteFile(const U8 *pubFileBuffer, U32 ulFileSize);
void MAA_IF_FileEnd(void);

void *MAA_IF_HeapAlloc(U32 ulSize, U32 ulPool);
void MAA_IF_HeapFree(void *pvPtr, U32 ulPool);
void *MAA_IF_SegAlloc(U32 ulSize, U32 ulPool);
void MAA_IF_SegFree(void *pvPtr, U32 ulPool);

void MAA_IF_SymbolAdd(TMAATarget fMaaTarget, const char *pubName, U32 ulType, U32 ulAddress, U8 ubPramCount);
TSymbol *MAA_IF_SymbolFind(const char *pubName);
void MAA_IF_SymbolPrint(const TSymbol *pstSymbol);

struct maa_mesgq {
    U32 ulMsg1;  // message type
    U32 ulMsg2;
    U32 ulMsg3;
    U32 ulMsg4;
};
// Sends (msg2, msg3, msg4, 0) with type msg1 on ulMAAMsgQueueID without waiting
// (a full queue must not stall the shell). A failure is
// logged ("\r\n MAA Send Message Fail"); the caller goes on.
void MAA_IF_SendMessage(U32 ulMsg1, U32 ulMsg2, U32 ulMsg3, U32 ulMsg4);

// The command text and called name, for test functions that forward the
// command unchanged.
extern const U8 *pub_MaaCmdStr;
extern U8 pub_MaaCmdName[256];
void MAA_SetCmdString(const U8 *pubText);
void MAA_SetCmdName(const U8 *pubName);
