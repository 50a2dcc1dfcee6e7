// Capability XML and print-image requests of the host's management utility,
// answered from the Java print daemon on the channel the request came from.
#pragma once

#include <atomic>

#include "usbadapter/types.h"

#define VLX_HEADER_SIZE 10
#define IMAGE_HEADER_SIZE 16

// Request recognition (first 3 bytes) and template of the size reply.
extern const U8 vlxHeader[VLX_HEADER_SIZE];
// Request recognition (first 12 bytes) and template of the image reply.
extern const U8 imageHeader[IMAGE_HEADER_SIZE];

// The print channel's handle, set by the classifier before a request.
extern std::atomic<U32> ulDrvHandle;

// -1 when commandlen is 0; 0 when a request was recognised and served
// (whatever the outcome); otherwise the number of bytes now in vlx_command
// (commandlen plus what was read, at most 16), to be classified further.
// Replies go out on fd.
S32 Vlx_Cap_Xml(S32 fd, U8 *command, S32 commandlen, U8 *vlx_command);

// One request each, answered on the channel of the request being served
// (ulDrvHandle outside Vlx_Cap_Xml). Nothing is sent when Java fails.
void GetCapXmlSize(void);
void GetCapXmlData(void);
void SetImageWrite(void);
// The 10-byte size reply.
void CapXmlSizeWrite(U32 xmlsize);
