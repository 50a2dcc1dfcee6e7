// Product configuration: USB ids, the model table and the model groups that
// shape the Device ID, and the product series name of the report file. The
// values are the product line's; everything that depends on a model name asks
// here.
#pragma once

#include "usbadapter/types.h"

#define DEV_VENDOR_ID 0x2F3A
#define DEV_PRODUCT_ID 0x0100

// Model groups, each a list of model-name prefixes.
enum class TModelGroup {
    Xps,             // the command set names "XPS"
    PdfTiffJpeg,     // the command set names "PDF", "TIFF" and "JPEG"
    CidPcl6Color,    // "CID:NV_PCL6_Color;"
    CidPcl6Mono,     // "CID:NV_PCL6_BW;" (when not colour)
    CidXpsColor,     // "CID:NV_XPS_Color;"
    CidXpsMono,      // "CID:NV_XPS_BW;" (when not XPS colour)
};

// A model name begins with a prefix when its first strlen(prefix) characters
// equal the prefix's, ignoring case.
bool ProductConfig_HasPrefix(const U8 *model, const char *prefix);
// USB product id of the model: the first matching row of the model table,
// DEV_PRODUCT_ID when none matches (or for null).
U16 ProductConfig_ProductId(const U8 *model);
bool ProductConfig_InGroup(TModelGroup group, const U8 *model);
// Rows of the model table, for listing.
struct TProductIdRow {
    const char *prefix;
    U16 pid;
};
const TProductIdRow *ProductConfig_Table(U32 *count);

// Written behind the serial number in the report file.
inline constexpr char kProductSeriesName[] = "TW-M4000 Series";
