/* Fixed-width integer names used across the adapter and its drivers. */
#ifndef USBADAPTER_TYPES_H
#define USBADAPTER_TYPES_H

#include <stdint.h>

typedef uint8_t U8;
typedef uint16_t U16;
typedef uint32_t U32;
typedef int8_t S8;
typedef int16_t S16;
typedef int32_t S32;

#endif
