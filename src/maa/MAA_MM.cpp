#include "maa/MAA_MM.h"

#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "common/Log.h"

alignas(8) U8 abDmMemPool[MAA_MEM_POOL_SIZE];
TMemPoolInfo stPoolTable;

void *MAA_Alloc(U32 ulSize) {
    void *p = std::malloc(ulSize ? ulSize : 1);
    if (p == nullptr) USBADP_LOG(ERROR, "\r\n Alloc Error");
    return p;
}

void MAA_Free(void *pvPtr) { std::free(pvPtr); }

void *MAA_HeapAlloc(U32 ulSize, U32 /*ulPool*/) { return std::malloc(ulSize ? ulSize : 1); }

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
