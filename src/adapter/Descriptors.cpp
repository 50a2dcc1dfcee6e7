#include "adapter/Descriptors.h"

#include "common/Log.h"

U8 aub_mf_string[USB_STRING_SIZE];
U8 aub_pd_string[USB_STRING_SIZE];
U8 aub_serial_str[USB_STRING_SIZE];
U8 aub_dev1284_str[DEV_ID_STRING_SIZE];
U8 manufacturingString[JAVA_NAME_SIZE];
U8 deviceClassName[JAVA_NAME_SIZE];

// Interim: the Device ID builder is not built yet; the Device ID stays empty.
void SetDeviceIDString(void) { USBADP_LOG(INFO, "[USBAdp] SetDeviceIDString() not available yet\n"); }

// Interim: descriptors are not sent yet; answers as a failed request.
S32 MfpDevSetDesc(void) {
    USBADP_LOG(INFO, "[USBAdp] MfpDevSetDesc() not available yet\n");
    return -1;
}

// Interim: the serial-number vendor record is not sent yet; answers as failed.
S32 USBADP_SetSerialNumber(void) {
    USBADP_LOG(INFO, "[USBAdp] USBADP_SetSerialNumber() not available yet\n");
    return -1;
}
