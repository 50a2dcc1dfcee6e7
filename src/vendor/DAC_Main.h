// Answers of the status utility and device-capability queries, staged in the
// gadget bridge for the host's vendor requests. Java hands each answer down as
// bytes; each entry copies them into its module buffer (cut to it) and stages
// one vendor record on the print node.
#pragma once

#include "usbadapter/types.h"

#define MFP_DEV_KIVORO_DATA 0x0D
#define MFP_DEV_KIVORO_PRINTSTATUS 0x02
#define MFP_DEV_KIVORO_JOBSTATUS 0x05
#define SET_EXT_COMMAND 0xE0
#define MFP_FW_VERSION 0x56
#define MFP_MPS_WAKEUP 0x99
#define KIVORO_SIZE_VAL_INFO 0
#define KIVORO_DATA_VAL_INFO 1
// Longest status-utility data sent: 180 blocks of 1024 bytes.
#define KIVORO_DATA_MAX_SIZE 0x2D000
#define KIVORO_BLOCK_SIZE 1024
#define USB_VEN_ECOBUFSIZE 255
