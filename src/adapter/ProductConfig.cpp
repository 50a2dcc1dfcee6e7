#include "adapter/ProductConfig.h"

#include <strings.h>

#include <cstring>
#include <iterator>
#include <span>

namespace {

// Tried in order; the first prefix that matches wins, so a longer prefix of the
// same family stands above its shorter one.
constexpr TProductIdRow kProductIds[] = {
    {"TW-M4020cdn", 0x0121}, {"TW-M4020c", 0x0120},   {"TW-M4020dn", 0x0111}, {"TW-M4020", 0x0110},
    {"TW-M4025cdn", 0x0123}, {"TW-M4025c", 0x0122},   {"TW-M4025", 0x0112},   {"TW-M4030cdn", 0x0125},
    {"TW-M4030c", 0x0124},   {"TW-M4030", 0x0113},    {"TW-M4040c", 0x0126},  {"TW-M4040", 0x0114},
    {"TW-P3010", 0x0130},    {"TW-P3020dn", 0x0132},  {"TW-P3020", 0x0131},   {"TW-C5050", 0x0140},
    {"TW-C5060", 0x0141},    {"TW-X7100", 0x0150},    {"TW-X7200", 0x0151},   {"TW-4020 MFP", 0x0160},
    {"TWCOPIER", 0x0170},
};
static_assert(std::size(kProductIds) == 21);

constexpr const char *kXps[] = {"TW-X7100", "TW-X7200"};
constexpr const char *kPdfTiffJpeg[] = {"TW-C5050", "TW-C5060", "TW-X7200"};
constexpr const char *kCidPcl6Color[] = {"TW-M4020c", "TW-M4025c", "TW-M4030c", "TW-M4040c",
                                         "TW-C5050",  "TW-C5060",  "TW-X7200"};
constexpr const char *kCidPcl6Mono[] = {"TW-M4020", "TW-M4025", "TW-M4030", "TW-M4040",
                                        "TW-P3010", "TW-P3020", "TW-X7100", "TW-4020 MFP"};
constexpr const char *kCidXpsColor[] = {"TW-X7200"};
constexpr const char *kCidXpsMono[] = {"TW-X7100"};

std::span<const char *const> groupPrefixes(TModelGroup g) {
    switch (g) {
    case TModelGroup::Xps: return kXps;
    case TModelGroup::PdfTiffJpeg: return kPdfTiffJpeg;
    case TModelGroup::CidPcl6Color: return kCidPcl6Color;
    case TModelGroup::CidPcl6Mono: return kCidPcl6Mono;
    case TModelGroup::CidXpsColor: return kCidXpsColor;
    case TModelGroup::CidXpsMono: return kCidXpsMono;
    }
    return {};
}

}  // namespace

bool ProductConfig_HasPrefix(const U8 *model, const char *prefix) {
    if (!model || !prefix) return false;
    // strncasecmp stops at the model's NUL, so a shorter name never matches.
    return ::strncasecmp(reinterpret_cast<const char *>(model), prefix, std::strlen(prefix)) == 0;
}

U16 ProductConfig_ProductId(const U8 *model) {
    for (const TProductIdRow &r : kProductIds)
        if (ProductConfig_HasPrefix(model, r.prefix)) return r.pid;
    return DEV_PRODUCT_ID;
}

bool ProductConfig_InGroup(TModelGroup group, const U8 *model) {
    for (const char *p : groupPrefixes(group))
        if (ProductConfig_HasPrefix(model, p)) return true;
    return false;
}

const TProductIdRow *ProductConfig_Table(U32 *count) {
    if (count) *count = static_cast<U32>(std::size(kProductIds));
    return kProductIds;
}
