/* Uses every public header as C. "resolve" only takes the entries' addresses
 * (the loader binds them); "write-serial TEXT" calls WriteSerialString, which
 * writes the report file under $USBADAPTER_ROOT. */
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <usbadapter/maadrivers.h>
#include <usbadapter/mfpbridge.h>
#include <usbadapter/usbadapter.h>

_Static_assert(sizeof(mfp_window_data_t) == EXPECT_WINDOW_DATA_SIZE, "window data size differs from the library's");
_Static_assert(sizeof(mfp_device_id_t) == EXPECT_DEV_ID_MAX_SIZE, "device ID size differs from the library's");

typedef void (*Entry)(void);

int main(int argc, char **argv) {
    const struct {
        const char *name;
        Entry entry;
    } entries[] = {
        {"MAA_CompEntry", (Entry)MAA_CompEntry},
        {"USB_SetSerialNumber", (Entry)USB_SetSerialNumber},
        {"USB_SetSnNoPowerOff", (Entry)USB_SetSnNoPowerOff},
        {"MAAMfpDevSetDesc", (Entry)MAAMfpDevSetDesc},
        {"WriteSerialString", (Entry)WriteSerialString},
    };
    for (size_t i = 0; i < sizeof entries / sizeof entries[0]; ++i) {
        Entry volatile e = entries[i].entry;
        if (!e) {
            printf("unresolved: %s\n", entries[i].name);
            return 1;
        }
    }
    if (argc == 3 && strcmp(argv[1], "write-serial") == 0) {
        char *buf = malloc(strlen(argv[2]) + 1);
        if (!buf) return 1;
        strcpy(buf, argv[2]);
        WriteSerialString((U8 *)buf); /* takes buf */
        return 0;
    }
    return argc == 2 && strcmp(argv[1], "resolve") == 0 ? 0 : 2;
}
