// What the shell sends back on the session's channel besides the start and
// stop acknowledgements: result records, files, the end-of-file marker and
// ready-made frames forwarded as they are; and the host-to-device file read.
//
// Result frame: three big-endian U32 (enContinue, ulResult, ulDataSize), then
// the payload. Transfer frame: "#$%", operation code, size, size again
// (big-endian), so bytes 8..11 hold the payload length in both kinds.
#pragma once

#include "maa/MAA_Types.h"

constexpr U32 MAA_RESULT_HEADER_SIZE = 12;
constexpr U32 MAA_TRANSFER_FRAME_SIZE = 12;
constexpr U32 FILE_BUFFERSIZE = 4096;

// Shell-owned record, returned by most test functions.
extern TMAAResult stMAASysResult;

// The session's result writer (installed with MAA_SetResultWriter): header,
// then the payload in one write. MAA_WriteResult decides whether it is called.
void MAA_WriteResultFrame(const TMAAResult *pstMAAResult);
// 0 if the write reported a disconnect, else 1.
U32 MAA_SendCmdToHost(U32 ulFileSize, U32 enMAAop);
void MAA_WriteFile(const U8 *pubFileBuffer, U32 ulFileSize);
void MAA_Scanner_WriteFile(const U8 *pubFileBuffer, U32 ulFileSize);
void MAA_FileEnd(void);
// pubData holds ulDataSize bytes of consecutive result and transfer frames.
void MAA_WriteResultForward(const TMAAResult *pstMAAResult);
void MAA_WriteFileForward(U8 *pubFileBuffer, U32 ulFileSize);
// Reads exactly ulFileSize raw bytes into the download buffer; 0 when a
// time-out or disconnect cut the transfer short.
U32 MAA_ReadFile(U32 ulFileSize);
void MAA_ResponseOK(void);
void MAA_WriteSerialString(const char *serial);

// Registered test function: streams a text file to the host line by line.
// The argument is the address of the path text.
TMAAResult *Dump_File(U32 ulPath);
