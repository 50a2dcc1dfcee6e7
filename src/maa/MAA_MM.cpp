#include "maa/MAA_MM.h"

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <vector>

#include "common/Log.h"
#include "maa/MAA_Address.h"

alignas(8) U8 abDmMemPool[MAA_MEM_POOL_SIZE];
TMemPoolInfo stPoolTable;

void *MAA_Alloc(U32 ulSize) {
    void *p = std::malloc(ulSize ? ulSize : 1);
    if (p == nullptr) USBADP_LOG(ERROR, "\r\n Alloc Error");
    return p;
}

void MAA_Free(void *pvPtr) { std::free(pvPtr); }

void *MAA_HeapAlloc(U32 ulSize, U32 /*ulPool*/) { return std::malloc(ulSize ? ulSize : 1); }

void *MAA_HeapAllocZeroed(U32 ulSize, U32 /*ulPool*/) { return std::calloc(ulSize ? ulSize : 1, 1); }

void MAA_HeapFree(void *pvPtr, U32 /*ulPool*/) {
    if (pvPtr != nullptr) std::free(pvPtr);
}

void *MAA_SegAlloc(U32 /*ulSize*/, U32 /*ulPool*/) {
    USBADP_LOG(ERROR, "\r\n[MAA:MAA_SegAlloc] unsupported: pubAllocAddr");
    return nullptr;
}

void MAA_SegFree(void * /*pvPtr*/, U32 /*ulPool*/) {}

void MAA_SegmentInitialize() {}

void MAA_InitMem() {
    std::memset(abDmMemPool, 0, sizeof abDmMemPool);
    uintptr_t start = (reinterpret_cast<uintptr_t>(abDmMemPool) + 3) & ~static_cast<uintptr_t>(3);
    U8 *pool = reinterpret_cast<U8 *>(start);
    U32 size = static_cast<U32>(abDmMemPool + sizeof abDmMemPool - pool) & ~3u;

    auto tagAt = [pool](U32 offset) { return reinterpret_cast<TBufferTag *>(pool + offset); };
    // Guard in front, one free block, guard behind with the free size before it.
    tagAt(0)->ulState_Size = IN_USE | sizeof(TBufferTag);
    TBufferTag *freeTag = tagAt(sizeof(TBufferTag));
    U32 freeSize = size - 2 * sizeof(TBufferTag);
    freeTag->ulState_Size = FREE | freeSize;
    auto *desc = reinterpret_cast<TFreeBufDesc *>(pool + 2 * sizeof(TBufferTag));
    desc->pstTag = freeTag;
    desc->pstNextFree = nullptr;
    desc->pstLastFree = FREE_BUF_HEAD;
    tagAt(size - 2 * sizeof(TBufferTag))->ulState_Size = freeSize;
    tagAt(size - sizeof(TBufferTag))->ulState_Size = IN_USE | sizeof(TBufferTag);

    stPoolTable.pubPool_Addr = pool;
    stPoolTable.ulPoolSize = size;
    stPoolTable.pstFree_Bufs = desc;
    stPoolTable.ulBuffer_Size = 0;
    stPoolTable.ubNext_Free_Pool = 0;
}

namespace {

struct Download {
    U8 *data;
    U32 size;
    U32 address;
};
std::vector<Download> downloads;
U8 *currentDownload = nullptr;
U32 currentSize = 0;
U32 downloadTotal = 0;

}  // namespace

U8 *MAA_DownloadAlloc(U32 ulSize, U32 *pulAddress) {
    *pulAddress = 0;
    currentDownload = nullptr;
    currentSize = 0;
    if (ulSize > MAA_DOWNLOAD_TOTAL_MAX - downloadTotal) return nullptr;
    // Not zeroed here: the download fills it, and zeroes what a cut transfer
    // left (MAA_DownloadZeroFrom); zeroing twice costs as much as the transfer.
    U8 *p = static_cast<U8 *>(std::malloc(ulSize ? ulSize : 1));
    if (p == nullptr) return nullptr;
    const U32 address = ulSize != 0 ? MAA_AddrMap(p, ulSize) : 0;
    downloads.push_back({p, ulSize, address});
    downloadTotal += ulSize;
    currentDownload = p;
    currentSize = ulSize;
    *pulAddress = address;
    return p;
}

U8 *MAA_DownloadBuffer(U32 *pulSize) {
    *pulSize = currentSize;
    return currentDownload;
}

void MAA_DownloadZeroFrom(U32 ulOffset) {
    if (currentDownload != nullptr && ulOffset < currentSize)
        std::memset(currentDownload + ulOffset, 0, currentSize - ulOffset);
}

U32 MAA_DownloadTotal(void) { return downloadTotal; }

void MAA_DownloadFreeAll(void) {
    for (const Download &d : downloads) {
        // Only while the address is still this buffer's (a reset map may reuse it).
        if (d.address != 0 && MAA_AddrTranslate(d.address, 1) == d.data) MAA_AddrUnmap(d.address);
        std::free(d.data);
    }
    downloads.clear();
    downloadTotal = 0;
    currentDownload = nullptr;
    currentSize = 0;
}
