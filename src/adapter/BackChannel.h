// The Java side's answers to the host through the print interface: the bulk
// back channel for host applications and the scan-to-PC event record.
#pragma once

#include "usbadapter/types.h"

#define MFP_SET_SCAN2PCEVENT 0x56
#define SCAN_EVENT_DATA_SIZE 8
#define MFP_DEV_KIVORO_CHECKINTIME 0x26
#define CHECKIN_TIME_SIZE 256
