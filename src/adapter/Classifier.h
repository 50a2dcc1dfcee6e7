// Data classifier: decides from the first bytes of a burst on the print
// channel what it is, runs the host application it belongs to, and finds the
// PJL Universal Exit Language that cuts print jobs.
#pragma once

#include "usbadapter/types.h"

#define COMMAND_SIZE 10
#define UEL_PATTERN_SIZE 9
#define IDS_HEADER 16
#define DCU_HEADER 16
#define AMPV_HEADER 16
#define ND_HEADER 16
#define FAXD_HEADER 16
#define VLX_HEADER 10
#define PCSCAN_FAIL (-2)
#define FRM_DETECT_BUFFER_SIZE 80
#define HOST_APP_NAME_SIZE 15

enum TUSBAdp_ParserID : S32 {
    enPCSCAN_PARSER = 0,
    enVLX_PARSER = 1,
    enIDS_PARSER = 2,
    enS2A_PARSER = 3,
    enTAVIK_LIGHT_PARSER = 4,
    enMAA_PARSER = 5,
    enPJL_PARSER = 6,
    enDCU_PARSER = 7,
    enAMPV_PARSER = 8,
    enND_PARSER = 9,
    enOther = 10,
};

extern const U8 UELPattern[UEL_PATTERN_SIZE];
extern const char aubHostApp[11][HOST_APP_NAME_SIZE];

// 0: consumed by a host application; -1: deliver *slfirmRes bytes of
// pubfirmware_command as the start of print data; -2: failure.
S32 USBAdpater_StartDataClassifier(U8 *pubCommand, U8 *pubfirmware_command, S32 *slfirmRes,
                                   TUSBAdp_ParserID *enParserID);

// The class the two bytes select; enOther when no host application.
TUSBAdp_ParserID USBAdp_ParserOf(const U8 *pubCommand);

// Given the 16-byte header: 1 recognised and delivered, 0 not this
// application, -2 recognised but delivery failed.
S32 USBADP_CheckDCUApp(U8 *hdr);
S32 USBADP_CheckAMPVApp(U8 *hdr);
S32 USBADP_CheckNDApp(U8 *hdr);
S32 USBADP_CheckFAXDApp(U8 *hdr);

// 1 when a whole UEL lies in the buffer (UelPosition, jobCounter updated);
// 0 otherwise, with splitPatternFlag/splitPatternMarker set when the buffer
// ends inside a UEL.
S32 CheckUELCommand(U8 *buffer, S32 size);
