// Memory of the MAA shell: heap allocations and the fixed tagged pool layout.
#pragma once

#include "maa/MAA_Types.h"

constexpr U32 MAA_MEM_POOL_SIZE = 10240;
constexpr U32 MAA_MEM_SEG_SIZE = 1024 * 1024;

constexpr U32 SIZE_MASK = 0x00ffffff;
constexpr U32 FREE = 0;
constexpr U32 IN_USE = 0x01000000;
constexpr U32 MIN_ALLOC_SIZE = 8;

constexpr U32 MEM4_ALIGN(U32 n) { return (n + 3) & ~3u; }

typedef struct {
    U32 ulState_Size;  // state in the high bits, size in the low 24
} TBufferTag;

typedef struct _TFreeBufDesc {
    TBufferTag *pstTag;
    struct _TFreeBufDesc *pstNextFree;
    struct _TFreeBufDesc *pstLastFree;
} TFreeBufDesc;

#define FREE_BUF_HEAD (reinterpret_cast<TFreeBufDesc *>(-1))

constexpr U32 MIN_BLK_SIZE = sizeof(TFreeBufDesc) + sizeof(TBufferTag) + 8;

typedef struct {
    U8 *pubPool_Addr;  // pool start, aligned to 4
    U32 ulPoolSize;    // bytes from that start to the end of the pool area
    TFreeBufDesc *pstFree_Bufs;
    U32 ulBuffer_Size;
    U8 ubNext_Free_Pool;
} TMemPoolInfo;

alignas(8) extern U8 abDmMemPool[MAA_MEM_POOL_SIZE];
extern TMemPoolInfo stPoolTable;

// Process heap. Failure logs "\r\n Alloc Error" and returns nullptr: a line that
// needs the memory is rejected, the process goes on.
void *MAA_Alloc(U32 ulSize);
void MAA_Free(void *pvPtr);
// Process heap; the pool number is ignored. May return nullptr.
void *MAA_HeapAlloc(U32 ulSize, U32 ulPool);
// Zeroed, for buffers handed out clean (large ones come as untouched zero pages).
void *MAA_HeapAllocZeroed(U32 ulSize, U32 ulPool);
void MAA_HeapFree(void *pvPtr, U32 ulPool);
// The segment allocator is not supported: logs and returns nullptr.
void *MAA_SegAlloc(U32 ulSize, U32 ulPool);
void MAA_SegFree(void *pvPtr, U32 ulPool);
void MAA_SegmentInitialize();
// Lays out the tagged pool: a guard tag, one free block, a guard tag.
void MAA_InitMem();

// ---- host-to-device downloads of the current session
// Every download stays addressable until the session ends, since factory
// scripts download several files before passing each address to a function.
constexpr U32 MAA_DOWNLOAD_TOTAL_MAX = 256u << 20;  // per session

// A buffer of ulSize bytes for the download that follows, and its address in
// the shell's map (0 for an empty buffer). Null, and no current download, when
// the session's total would pass MAA_DOWNLOAD_TOTAL_MAX or memory is short.
// Its bytes are the download's: the reader of the file fills it, and zeroes
// what a cut transfer did not fill (MAA_DownloadZeroFrom), before any test
// function can see it.
U8 *MAA_DownloadAlloc(U32 ulSize, U32 *pulAddress);
void MAA_DownloadZeroFrom(U32 ulOffset);
// The current download (the newest, null when its allocation failed) and its size.
U8 *MAA_DownloadBuffer(U32 *pulSize);
// Bytes the session's downloads hold.
U32 MAA_DownloadTotal(void);
// The session is over: every download is unmapped and freed.
void MAA_DownloadFreeAll(void);
