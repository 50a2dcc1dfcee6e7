#include "maa/MAA_Address.h"

#include <cstdint>
#include <cstring>

#include "common/Log.h"

namespace {

struct Region {
    U32 ulBase;
    U32 ulSize;
    U8 *pubHost;
};

// Sorted by base. Regions are few (cells, the literals of one line, download
// buffers), so a sorted array with binary search is enough.
Region astRegions[MAA_ADDR_MAX_REGIONS];
U32 ulRegionCount = 0;
// New regions are placed from here on, so a stale address typed by a host is
// unlikely to land in a buffer that has just been reused.
uint64_t ullCursor = MAA_ADDR_BASE;

constexpr uint64_t kAlign = 16;
constexpr uint64_t kGuard = 16;  // unmapped gap between neighbours

uint64_t alignUp(uint64_t v) { return (v + kAlign - 1) & ~(kAlign - 1); }

// First region whose base is >= address.
U32 lowerBound(uint64_t address) {
    U32 lo = 0, hi = ulRegionCount;
    while (lo < hi) {
        U32 mid = (lo + hi) / 2;
        if (astRegions[mid].ulBase < address) lo = mid + 1;
        else hi = mid;
    }
    return lo;
}

// The region containing address, or nullptr.
Region *find(U32 address) {
    U32 i = lowerBound(static_cast<uint64_t>(address) + 1);  // first base > address
    if (i == 0) return nullptr;
    Region *r = &astRegions[i - 1];
    return address - r->ulBase < r->ulSize ? r : nullptr;
}

// A free gap of `span` bytes at or after `from`, below the limit; 0 if none.
uint64_t placeFrom(uint64_t from, uint64_t span) {
    uint64_t candidate = alignUp(from);
    U32 i = lowerBound(candidate);
    if (i > 0) {
        const Region &prev = astRegions[i - 1];
        uint64_t prevEnd = alignUp(static_cast<uint64_t>(prev.ulBase) + prev.ulSize) + kGuard;
        if (prevEnd > candidate) candidate = prevEnd;
    }
    for (;; ++i) {
        if (candidate + span > MAA_ADDR_LIMIT) return 0;
        if (i == ulRegionCount || candidate + span <= astRegions[i].ulBase) return candidate;
        candidate = alignUp(static_cast<uint64_t>(astRegions[i].ulBase) + astRegions[i].ulSize) + kGuard;
    }
}

struct FuncEntry {
    TMAAEntry pfnEntry;
    TMAAGeneralEntry pfnGeneral;
};
FuncEntry astFuncs[MAA_FUNC_MAX_ENTRIES];
U32 ulFuncCount = 0;

U32 addFunc(TMAAEntry entry, TMAAGeneralEntry general) {
    for (U32 i = 0; i < ulFuncCount; ++i) {
        if (astFuncs[i].pfnEntry == entry && astFuncs[i].pfnGeneral == general) return MAA_FUNC_HANDLE_BASE + 4 * i;
    }
    if (ulFuncCount == MAA_FUNC_MAX_ENTRIES) {
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_AddrFuncHandle] function table full");
        return 0;
    }
    astFuncs[ulFuncCount] = {entry, general};
    return MAA_FUNC_HANDLE_BASE + 4 * ulFuncCount++;
}

const FuncEntry *funcAt(U32 handle) {
    if (handle < MAA_FUNC_HANDLE_BASE || (handle - MAA_FUNC_HANDLE_BASE) % 4 != 0) return nullptr;
    U32 index = (handle - MAA_FUNC_HANDLE_BASE) / 4;
    return index < ulFuncCount ? &astFuncs[index] : nullptr;
}

}  // namespace

U32 MAA_AddrMap(void *pvHost, U32 ulSize) {
    if (pvHost == nullptr || ulSize == 0 || ulSize > MAA_ADDR_LIMIT - MAA_ADDR_BASE) {
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_AddrMap] cannot map %u bytes", ulSize);
        return 0;
    }
    if (ulRegionCount == MAA_ADDR_MAX_REGIONS) {
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_AddrMap] address map full");
        return 0;
    }
    uint64_t span = alignUp(ulSize);
    uint64_t base = placeFrom(ullCursor, span);
    if (base == 0) base = placeFrom(MAA_ADDR_BASE, span);
    if (base == 0) {
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_AddrMap] no room for %u bytes", ulSize);
        return 0;
    }
    U32 i = lowerBound(base);
    std::memmove(&astRegions[i + 1], &astRegions[i], (ulRegionCount - i) * sizeof(Region));
    astRegions[i] = {static_cast<U32>(base), ulSize, static_cast<U8 *>(pvHost)};
    ++ulRegionCount;
    ullCursor = base + span + kGuard;
    return static_cast<U32>(base);
}

void MAA_AddrUnmap(U32 ulAddress) {
    U32 i = lowerBound(ulAddress);
    if (i == ulRegionCount || astRegions[i].ulBase != ulAddress) return;
    std::memmove(&astRegions[i], &astRegions[i + 1], (ulRegionCount - i - 1) * sizeof(Region));
    --ulRegionCount;
}

U32 MAA_AddrOf(const void *pvHost) {
    const U8 *p = static_cast<const U8 *>(pvHost);
    for (U32 i = 0; i < ulRegionCount; ++i) {
        const Region &r = astRegions[i];
        if (p >= r.pubHost && static_cast<size_t>(p - r.pubHost) < r.ulSize)
            return r.ulBase + static_cast<U32>(p - r.pubHost);
    }
    return 0;
}

void *MAA_AddrTranslate(U32 ulAddress, U32 ulSize) {
    Region *r = find(ulAddress);
    if (r == nullptr || ulSize > r->ulSize - (ulAddress - r->ulBase)) {
        USBADP_LOG(ERROR, "invalid address 0x%x", ulAddress);
        return nullptr;
    }
    return r->pubHost + (ulAddress - r->ulBase);
}

const char *MAA_AddrString(U32 ulAddress) {
    Region *r = find(ulAddress);
    if (r != nullptr) {
        U32 offset = ulAddress - r->ulBase;
        const U8 *text = r->pubHost + offset;
        if (std::memchr(text, 0, r->ulSize - offset) != nullptr) return reinterpret_cast<const char *>(text);
    }
    USBADP_LOG(ERROR, "invalid address 0x%x", ulAddress);
    return nullptr;
}

bool MAA_AddrRead(U32 ulAddress, U32 ulSize, U32 *pulValue) {
    *pulValue = 0;
    const U8 *p = static_cast<const U8 *>(MAA_AddrTranslate(ulAddress, ulSize));
    if (p == nullptr) return false;
    switch (ulSize) {
        case 1: *pulValue = *p; break;
        case 2: { U16 v; std::memcpy(&v, p, 2); *pulValue = v; break; }
        case 4: std::memcpy(pulValue, p, 4); break;
        default: return false;
    }
    return true;
}

bool MAA_AddrWrite(U32 ulAddress, U32 ulSize, U32 ulValue) {
    U8 *p = static_cast<U8 *>(MAA_AddrTranslate(ulAddress, ulSize));
    if (p == nullptr) return false;
    switch (ulSize) {
        case 1: *p = static_cast<U8>(ulValue); break;
        case 2: { U16 v = static_cast<U16>(ulValue); std::memcpy(p, &v, 2); break; }
        case 4: std::memcpy(p, &ulValue, 4); break;
        default: return false;
    }
    return true;
}

U32 MAA_AddrRegionCount() { return ulRegionCount; }

void MAA_AddrReset() {
    ulRegionCount = 0;
    ullCursor = MAA_ADDR_BASE;
}

U32 MAA_AddrFuncHandle(TMAAEntry pfnEntry) {
    return pfnEntry ? addFunc(pfnEntry, nullptr) : 0;
}

U32 MAA_AddrGeneralHandle(TMAAGeneralEntry pfnEntry) {
    return pfnEntry ? addFunc(nullptr, pfnEntry) : 0;
}

TMAAEntry MAA_AddrFunc(U32 ulHandle) {
    const FuncEntry *e = funcAt(ulHandle);
    return e ? e->pfnEntry : nullptr;
}

TMAAGeneralEntry MAA_AddrGeneral(U32 ulHandle) {
    const FuncEntry *e = funcAt(ulHandle);
    return e ? e->pfnGeneral : nullptr;
}
