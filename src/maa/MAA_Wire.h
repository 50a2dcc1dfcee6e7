// The test shell's fixed wire strings and command codes, shared by the session
// and the result writer.
#pragma once

#include "maa/MAA_Types.h"

constexpr U32 HDR_CMD_LEN = 10;       // ESC "w" "MAASTART"
constexpr U32 HDR_RESP_CMD_LEN = 8;   // ESC "w" "MAA-OK"
constexpr U32 TAIL_CMD_LEN = 8;       // "MAA-STOP"
constexpr U32 SPCL_CMD_LEN = 3;       // "#$%"
inline constexpr U8 HeaderCmd[HDR_CMD_LEN] = {0x1B, 0x77, 'M', 'A', 'A', 'S', 'T', 'A', 'R', 'T'};
inline constexpr U8 HeaderResCmd[HDR_RESP_CMD_LEN] = {0x1B, 0x77, 'M', 'A', 'A', '-', 'O', 'K'};
inline constexpr U8 TailCmd[TAIL_CMD_LEN] = {'M', 'A', 'A', '-', 'S', 'T', 'O', 'P'};
inline constexpr U8 SpecialCmdPrefix[SPCL_CMD_LEN] = {'#', '$', '%'};

// Special command, host to device: "#$%", code, big-endian size, then CR or LF.
#pragma pack(push, 1)
struct TMAAFileCommand {
    U8 ubPreFix[SPCL_CMD_LEN];
    U8 ubCommandCode;
    U8 ulFileSize[4];  // big-endian
};
#pragma pack(pop)
static_assert(sizeof(TMAAFileCommand) == 8);

enum MAASpcialOperation : U32 {
    MAA_FILE_TRANS_H2T = 0,
    MAA_FILE_TRANS_T2H = 1,  // device to host only
    MAA_JIG_MODE_START = 2,
    MAA_JIG_MODE_END = 3,
    MAA_AUTO_MODE_START = 4,
    MAA_AUTO_MODE_END = 5,
    MAA_FILE_END = 160,      // device to host only
};

enum TMAADeviceType : U32 { MAA_SERIAL_DEVICE = 240, MAA_USB_DEVICE = 250 };
enum maa_comm : U32 { MAA_START = 0, MAA_STOP = 1, MAA_SPECIAL_COMMNAD = 2 };

constexpr U32 MAA_LINE_SIZE = 1024;  // a longer line is cut
// A line may run a little past MAA_LINE_SIZE (the byte that crosses it, the
// raw bytes behind a "#") before it is cut; the buffer has room for that.
constexpr U32 MAA_LINE_BUFFER_SIZE = MAA_LINE_SIZE + 16;
