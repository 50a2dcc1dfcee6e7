/*
 * Interface of the USB gadget bridge driver: device nodes, notification codes,
 * driver records and the ioctl set. Records are the kernel's layout (packed,
 * little-endian on the controller); their sizes are encoded in the ioctl numbers.
 */
#ifndef USBADAPTER_MFPBRIDGE_H
#define USBADAPTER_MFPBRIDGE_H

#include <stddef.h>
#include <sys/ioctl.h>

#include "usbadapter/types.h"

#define MS_PRN_FILE_NAME "/dev/usb/mfp_prn"
#define MS_SCAN_FILE_NAME "/dev/usb/mfp_scan"
#define MINOR_PRN 0
#define MINOR_SCAN 1

/* Notification codes carried in mfp_notif_t.ub_notif and in queue messages. */
#define MFP_DEV_INIT 0x00
#define MFP_DEV_DEINIT 0x01
#define MFP_DEV_RESET 0x02
#define MFP_RESET MFP_DEV_RESET
#define SCAN_COMMAND 0x03
#define MFP_SCAN_CMD SCAN_COMMAND
#define MFP_VENDOR_REQUEST 0x09
#define MFP_SCAN_NOTIF 0x0A
#define MFP_PRN_READ_NOTIF 0x0B
#define MFP_DEV_CONFIGURED 0x0C
#define MFP_DEV_DISCONNECT 0x0D

/* Driver status values. */
#define MFP_SUCCESS 0x00
#define MFP_ERR_URB 0x0E
#define MFP_ERR_TO 0x0F

typedef enum {
    eMfp_Notif_Prn = 1,
    eMfp_Notif_Scan = 2,
    eMfp_Notif_Both = 3,
} en_notif_type;

#pragma pack(push, 1)

typedef struct mfp_notif {
    U8 ub_notif;
    U8 aub_pad[3];
    S32 ub_intf; /* en_notif_type, kept 32-bit */
} mfp_notif_t;

typedef struct mfp_to {
    U32 ul_prn_read_to;
    U32 ul_prn_write_to;
    U32 ul_scan_read_to;
    U32 ul_scan_write_to;
} mfp_to_t;

/* The driver takes user-space pointers: 4 bytes each on the controller. */
typedef struct desc_str {
    U8 *pub_mf_string;
    U8 *pub_pd_string;
    U8 *pub_serial_string;
    U8 *pub_dev_id_1284;
} desc_str_t;

typedef struct desc_param {
    U16 uwVid;
    U16 uwPid;
    U16 uwLangID;
    U8 ubMf_string_size;
    U8 ubPd_string_size;
    U8 ubSerial_string_size;
    U16 uwDev_id_1284_size;
    desc_str_t stDevStrID;
} desc_param_t;

#define VENDOR_CMD_DATA_SIZE 1024

typedef struct vendor_cmd {
    U8 bRequest;
    U16 wValue;
    U16 wIndex;
    U8 data[VENDOR_CMD_DATA_SIZE];
} vendor_cmd_t;

#pragma pack(pop)

/* Queue message; senders and receivers always pass a text size of 8. */
typedef struct msgbuf_usbadp {
    long mtype;
    S32 status;
    S32 slReserved;
} TMessageBuf;

#define MSGBUF_TEXT_SIZE 8

/* ioctl group of the bridge. */
#define MFP_IOC_MAGIC 'o'

#define MFP_GET_NOTIF 0x10
#define GET_DATA_PRN 0x40
#define GET_CMD_SCAN 0x41
#define GET_DATA_SCAN 0x42
#define WAIT_CMD_SCAN 0x43
#define GET_VENDOR_REQUEST 0x45
#define SET_VENDOR_REQUEST 0x46
#define SET_PORT_STATUS 0x48
#define SET_DEVICE_ID 0x4A
#define SET_MFP_TO 0x4B
#define GET_MFP_TO 0x4C
#define SET_DESC_REQ 0x4D
#define SET_DEV_CONECT 0x4E
#define SET_VENDOR_COMMAND 0x56

#define SCAN_CMD_SIZE 4
#define VENDOR_REQ_SIZE 8
#define VENDOR_DATA_SIZE 8
/* Sizes owned by the bridge driver's own header, which this tree does not
 * have: set at configure time (USBADAPTER_WINDOW_DATA_SIZE,
 * USBADAPTER_DEV_ID_MAX_SIZE); the values below are the defaults. */
#ifndef WINDOW_DATA_SIZE
#define WINDOW_DATA_SIZE 64
#endif
#ifndef DEV_ID_MAX_SIZE
#define DEV_ID_MAX_SIZE 1024
#endif

typedef U8 mfp_scan_cmd_t[SCAN_CMD_SIZE];
typedef U8 mfp_vendor_req_t[VENDOR_REQ_SIZE];
typedef U8 mfp_vendor_data_t[VENDOR_DATA_SIZE];
typedef U8 mfp_window_data_t[WINDOW_DATA_SIZE];
typedef U8 mfp_device_id_t[DEV_ID_MAX_SIZE];

#define MFP_IOC_GET_NOTIF _IOR(MFP_IOC_MAGIC, MFP_GET_NOTIF, mfp_notif_t)
#define IOCNR_GET_CMD_SCAN _IOR(MFP_IOC_MAGIC, GET_CMD_SCAN, mfp_scan_cmd_t)
#define IOCNR_GET_SCAN_DATA _IOR(MFP_IOC_MAGIC, GET_DATA_SCAN, mfp_window_data_t)
#define IOCNR_WAIT_CMD_SCAN _IOR(MFP_IOC_MAGIC, WAIT_CMD_SCAN, mfp_scan_cmd_t)
#define IOCNR_GET_VENDOR_REQ _IOR(MFP_IOC_MAGIC, GET_VENDOR_REQUEST, mfp_vendor_req_t)
#define IOCNR_SET_VENDOR_REQ _IOW(MFP_IOC_MAGIC, SET_VENDOR_REQUEST, mfp_vendor_data_t)
#define IOCNR_SET_PORT_STATUS _IOW(MFP_IOC_MAGIC, SET_PORT_STATUS, U8)
#define IOCNR_SET_DEVICE_ID _IOW(MFP_IOC_MAGIC, SET_DEVICE_ID, mfp_device_id_t)
#define IOCNR_SET_MFP_TO _IOW(MFP_IOC_MAGIC, SET_MFP_TO, mfp_to_t)
#define IOCNR_GET_MFP_TO _IOR(MFP_IOC_MAGIC, GET_MFP_TO, mfp_to_t)
#define IOCNR_SET_DESC_REQ _IOW(MFP_IOC_MAGIC, SET_DESC_REQ, desc_param_t)
#define IOCNR_SET_DEV_CONNECT _IOW(MFP_IOC_MAGIC, SET_DEV_CONECT, U8)
#define IOCNR_SET_DEV_VENDOR _IOW(MFP_IOC_MAGIC, SET_VENDOR_COMMAND, U8)

#ifdef __cplusplus
static_assert(sizeof(mfp_notif_t) == 8);
static_assert(offsetof(mfp_notif_t, ub_intf) == 4);
static_assert(sizeof(mfp_to_t) == 16);
static_assert(offsetof(mfp_to_t, ul_scan_write_to) == 12);
static_assert(offsetof(desc_param_t, uwPid) == 2);
static_assert(offsetof(desc_param_t, uwLangID) == 4);
static_assert(offsetof(desc_param_t, ubMf_string_size) == 6);
static_assert(offsetof(desc_param_t, ubPd_string_size) == 7);
static_assert(offsetof(desc_param_t, ubSerial_string_size) == 8);
static_assert(offsetof(desc_param_t, uwDev_id_1284_size) == 9);
static_assert(offsetof(desc_param_t, stDevStrID) == 11);
static_assert(sizeof(desc_param_t) == 11 + 4 * sizeof(void *));
static_assert(sizeof(vendor_cmd_t) == 1029);
static_assert(offsetof(vendor_cmd_t, wValue) == 1);
static_assert(offsetof(vendor_cmd_t, wIndex) == 3);
static_assert(offsetof(vendor_cmd_t, data) == 5);
static_assert(MFP_IOC_GET_NOTIF == 0x80086F10u);
static_assert(IOCNR_GET_CMD_SCAN == 0x80046F41u);
static_assert(IOCNR_WAIT_CMD_SCAN == 0x80046F43u);
static_assert(IOCNR_GET_VENDOR_REQ == 0x80086F45u);
static_assert(IOCNR_SET_VENDOR_REQ == 0x40086F46u);
static_assert(IOCNR_SET_PORT_STATUS == 0x40016F48u);
static_assert(IOCNR_SET_MFP_TO == 0x40106F4Bu);
static_assert(IOCNR_GET_MFP_TO == 0x80106F4Cu);
static_assert(IOCNR_SET_DEV_CONNECT == 0x40016F4Eu);
static_assert(IOCNR_SET_DEV_VENDOR == 0x40016F56u);
#if UINTPTR_MAX == 0xFFFFFFFFu
/* The controller's ABI: pointers are 4 bytes, so the record is 27. */
static_assert(sizeof(desc_param_t) == 27);
static_assert(IOCNR_SET_DESC_REQ == 0x401B6F4Du);
#endif
#endif

#endif
