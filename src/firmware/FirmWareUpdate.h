// Firmware files sent down the print channel: each 80-byte PJL header and its
// image body are received into a temporary file, checksummed and handed to the
// update manager, whose progress is followed to the end.
#pragma once

#include <cstdio>

#include "usbadapter/types.h"

#define FW_PJL_HEADER_SIZE 80
#define PARTIAL_HEADER_SIZE 31
#define SIGNATURE_SIZE 4
#define BUFFER_SIZE 0x10000
#define FLUSH_BUFFER_SIZE 1024
#define HEADER_SIGNATURE "$IMG"
#define END_SIGNATURE "$END"
// Relative: lands in the working directory the Java service gives the process.
#define TEMP_FW_IMAGE "fw.bin"
#define VERIFY_CHECK_SUM 0xA5A5
#define FW_PASS 0
#define FW_FAIL (-1)

// Offsets in the PJL header.
#define FW_SUBSYSTEM_ID_OFFSET 31
#define FW_SIZE_OFFSET 74

enum TFirmwareType : U32 {
    SCAN = 1,
    DADF = 2,
    VIDEO = 3,
    VIDEOBOOT = 4,
    ENGINE = 5,
    SCF = 6,
    HCF = 7,
    FINISHER = 8,
    UI = 9,
    UNAVAILABLE = 10,
    UBOOT = 11,
    CONVERT = 12,
    FAX = 13,
    KERNEL = 14,
    ROOTFS = 15,
    EMULATOR = 16,
    SCANDRIVER = 17,
    VPUDRIVER = 18,
    FAXDRIVER = 19,
    TARNWELMMDRIVER = 20,
};

// The record checksummed and announced to the update manager; the integers
// are held in wire order (big-endian).
#pragma pack(push, 1)
struct ImageHeader {
    U8 aubSig[SIGNATURE_SIZE];
    U32 ulSizeofBody;
    U32 ulTypeofImage;
};
#pragma pack(pop)
static_assert(sizeof(ImageHeader) == 12);

// The fixed text in front of every firmware header: UEL, "@PJL", CR LF,
// "@PJL FIRMWARE = ".
extern const U8 kFirmwareHeaderText[PARTIAL_HEADER_SIZE];

// 0: every image delivered and the update manager reported the end; -1:
// firmware recognised but the download failed (or commandlen > 79);
// otherwise the number of bytes in firmware_command (at most 80) that are not
// firmware and must be processed as ordinary data.
S32 FirmWareDownload(S32 fdPrn, U8 *command, U32 commandlen, U8 *firmware_command, S32 *firmware);

// Type of a 4-character subsystem id (only the first three are looked at,
// case-insensitively); prints the subsystem's name on standard output.
U32 Convert_FW_SubSID(const U8 *id);
// Log name of a type; "Unknown" for 17..20 and anything else.
const char *FirmwareType(U32 type);
// Plain 16-bit sum of big-endian words, seeded; an odd last byte counts first,
// as a high byte.
U16 make_checksum(const U8 *pub_pool, U32 data_size, U32 chksum_seed);
// 0xA5A5 minus the sum of the temporary file seeded with fw_checksum; 0xFFFF on
// error.
U16 update_chksum(U32 fw_checksum, U32 fil_size);
// 0 or -1; on failure what is still expected is discarded from the channel.
S32 read_fw_into_file(S32 fdPrn, S32 sl_remain_size);
// size or -1.
S32 read_from_file(FILE *file, U8 *buffer, U32 size);
void flush_usb(S32 fdPrn, S32 remain_size);

// The temporary file's name.
extern char pub_output[30];
