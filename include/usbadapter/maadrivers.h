/*
 * Interface of the drivers the factory test functions reach besides the USB
 * bridge: the scanner driver (test command lines, application lock, ADF
 * mechanism), the fax driver and the JBIG codec. Records are the kernel's layout
 * (packed, little-endian on the controller); their sizes are encoded in the
 * ioctl numbers.
 */
#ifndef USBADAPTER_MAADRIVERS_H
#define USBADAPTER_MAADRIVERS_H

#include <stddef.h>
#include <sys/ioctl.h>

#include "usbadapter/types.h"

#define SCAN_DEVICE_NAME "/dev/scanner"
#define FAX_DEVICE_NAME "/dev/fax"
#define JBIG_ENC_DEVICE_NAME "/dev/jbigenc"
#define JBIG_DEC_DEVICE_NAME "/dev/jbigdec"

/* ---- scanner driver ------------------------------------------------------- */

#define SCAN_MAA_COMMAND_LENGTH 256
#define SCAN_MAA_RESPONSE_LENGTH 4194304 /* 4 MiB response buffer */
#define SCAN_MAA_TEST_ID 7575            /* jobid of every test command */
#define SCAN_MAA_RETRY_COUNT 30          /* lock retries after the first try */
/* What the lock ioctl returns once the application holds the scanner. */
#define SCAN_APP_LOCK_TAKEN 1

#define SCAN_IOC_MAGIC 'k'

#pragma pack(push, 1)

/* One test command: the driver runs the command line and writes its response
 * (ready MAA result frames) into the buffer at the kernel address bufphys. */
typedef struct TMAAScanTest {
    char string[SCAN_MAA_COMMAND_LENGTH]; /* the command line, NUL-terminated */
    uint64_t bufphys;                     /* kernel address of the response buffer */
    U32 bufsize;                          /* SCAN_MAA_RESPONSE_LENGTH */
    U32 jobid;                            /* SCAN_MAA_TEST_ID */
    U32 result;                           /* driver: response bytes written */
    U32 success;                          /* driver: its own verdict (not read) */
} TMAAScanTest;

/* ADF mechanism: the type and the firmware version of the feeder. */
typedef struct TADFMechaType {
    U32 ulType;
    U32 ulVersion;
} TADFMechaType;

#pragma pack(pop)

/* Lock and release carry no record; the lock's return value is its answer. */
#define IOCNR_SCAN_APP_LOCK _IO(SCAN_IOC_MAGIC, 61)
#define IOCNR_SCAN_APP_LOCK_RELEASE _IO(SCAN_IOC_MAGIC, 62)
#define IOC_MAA_TEST _IOWR(SCAN_IOC_MAGIC, 41, TMAAScanTest)
/* The ADF reads are ours to number: 63 and 64, next to the lock pair. The
 * multi-type is one word (0 = single mechanism). */
#define IOC_ADF_MECHA_TYPE _IOR(SCAN_IOC_MAGIC, 63, TADFMechaType)
#define IOC_ADF_MULTI_MECHA_TYPE _IOR(SCAN_IOC_MAGIC, 64, U32)

/* ---- fax driver ------------------------------------------------------------ */

#define FAX_IOC_MAGIC 'f'
#define FAX_MAA_TEST 0x50
#define FAX_MAA_COMMAND_LENGTH 256
#define FAX_MAA_RESPONSE_LENGTH 1024

#pragma pack(push, 1)

/* One fax-side test command. The number is declared _IOW, as the fax driver
 * always has; the driver nevertheless writes result, success and the response
 * text back into the same record. */
typedef struct TFaxMAATest {
    char string[FAX_MAA_COMMAND_LENGTH];     /* the command line, NUL-terminated */
    U32 result;                              /* driver: response bytes */
    U32 success;                             /* driver: 1 when the test passed */
    char response[FAX_MAA_RESPONSE_LENGTH];  /* driver: response text */
} TFaxMAATest;

#pragma pack(pop)

#define IOCNR_FAX_MAA_TEST _IOW(FAX_IOC_MAGIC, FAX_MAA_TEST, TFaxMAATest)

/* ---- JBIG codec ------------------------------------------------------------ */

#define JBIG_IOC_MAGIC 'b'

#pragma pack(push, 1)

/* Built-in self test of one codec engine: it codes a pattern of its own chosen
 * by ulPattern and checks the output against its reference. */
typedef struct TJBIGSelfTest {
    U32 ulPattern; /* in: pattern number */
    U32 ulStatus;  /* out: 0 = output matched, else the engine's error code */
} TJBIGSelfTest;

#pragma pack(pop)

#define JBIG_IOC_RESET _IO(JBIG_IOC_MAGIC, 1)
#define JBIG_IOC_SELFTEST _IOWR(JBIG_IOC_MAGIC, 2, TJBIGSelfTest)

#ifdef __cplusplus
static_assert(sizeof(TMAAScanTest) == 280);
static_assert(offsetof(TMAAScanTest, string) == 0);
static_assert(offsetof(TMAAScanTest, bufphys) == 256);
static_assert(offsetof(TMAAScanTest, bufsize) == 264);
static_assert(offsetof(TMAAScanTest, jobid) == 268);
static_assert(offsetof(TMAAScanTest, result) == 272);
static_assert(offsetof(TMAAScanTest, success) == 276);
static_assert(sizeof(TADFMechaType) == 8);
static_assert(offsetof(TADFMechaType, ulVersion) == 4);
static_assert(sizeof(TFaxMAATest) == 1288);
static_assert(offsetof(TFaxMAATest, result) == 256);
static_assert(offsetof(TFaxMAATest, success) == 260);
static_assert(offsetof(TFaxMAATest, response) == 264);
static_assert(sizeof(TJBIGSelfTest) == 8);
static_assert(offsetof(TJBIGSelfTest, ulStatus) == 4);
static_assert(IOCNR_SCAN_APP_LOCK == 0x6B3Du);
static_assert(IOCNR_SCAN_APP_LOCK_RELEASE == 0x6B3Eu);
static_assert(IOC_MAA_TEST == 0xC1186B29u);
static_assert(IOC_ADF_MECHA_TYPE == 0x80086B3Fu);
static_assert(IOC_ADF_MULTI_MECHA_TYPE == 0x80046B40u);
static_assert(IOCNR_FAX_MAA_TEST == 0x45086650u);
static_assert(JBIG_IOC_RESET == 0x6201u);
static_assert(JBIG_IOC_SELFTEST == 0xC0086202u);
#endif

#endif
