// Host stand-ins of the controller's platform services a PC lacks.
#include <cstdlib>
#include <cstring>
#include <iterator>
#include <map>
#include <mutex>
#include <vector>

#include <sanitizer/asan_interface.h>

#include "platform/Platform.h"

namespace {

// Data blocks are heap buffers, not cleared on reuse. Each live block also
// gets a 32-bit "kernel address" of its own, so that a driver model given that
// address (as a real driver is) can find the memory again; a released block's
// address no longer translates.
struct HostDataBlock {
    void *memory;
    uint32_t size;
    uint32_t kerAddr;
};

constexpr uint64_t kKerBase = 0xC0000000u;
constexpr uint64_t kKerEnd = 0xFFFFF000u;
constexpr uint64_t kPage = 4096;

std::mutex gMu;
std::map<uint32_t, HostDataBlock *> gByKerAddr;  // live blocks by kernel address

uint64_t PageUp(uint64_t n) { return (n + kPage - 1) / kPage * kPage; }

// First gap of the kernel window that holds `size` bytes; 0 when none does.
uint32_t PlaceKerAddr(uint32_t size) {
    const uint64_t need = PageUp(size ? size : 1);
    uint64_t at = kKerBase;
    for (const auto &[base, block] : gByKerAddr) {
        if (base >= at + need) break;
        at = PageUp(static_cast<uint64_t>(base) + (block->size ? block->size : 1));
    }
    return at + need <= kKerEnd ? static_cast<uint32_t>(at) : 0;
}

// Like the controller's pool, released memory is kept for the next block of
// the same size instead of going back to the system: a scanner command takes
// a 4 MiB block each time, and fresh pages for it cost more than the command.
// Parked memory is poisoned, so a use after release is still caught.
struct Spare {
    void *memory;
    uint32_t size;
};
constexpr size_t kMaxSpares = 2;
// Guarded by gMu. Never destroyed, so that the spares stay reachable (no
// leak report) and a block released while the process exits has a place.
std::vector<Spare> &gSpares = *new std::vector<Spare>;

// Both expect gMu held.
void *TakeMemoryLocked(uint32_t size) {
    // The most recently released first: its pages are the warmest.
    for (auto it = gSpares.rbegin(); it != gSpares.rend(); ++it) {
        if (it->size != size) continue;
        void *memory = it->memory;
        gSpares.erase(std::next(it).base());
        ASAN_UNPOISON_MEMORY_REGION(memory, size ? size : 1);
        return memory;
    }
    return std::calloc(1, size ? size : 1);
}

void ParkMemoryLocked(void *memory, uint32_t size) {
    if (gSpares.size() == kMaxSpares) {
        const Spare oldest = gSpares.front();
        gSpares.erase(gSpares.begin());
        ASAN_UNPOISON_MEMORY_REGION(oldest.memory, oldest.size ? oldest.size : 1);
        std::free(oldest.memory);
    }
    ASAN_POISON_MEMORY_REGION(memory, size ? size : 1);
    gSpares.push_back({memory, size});
}

}  // namespace

extern "C" {

// The board's output ports do not exist on a PC; the backup always succeeds.
int SysPBA_IO_GPOInitBackUp(void) { return 0; }

// No update path on a PC: accept and drop the bytes.
int FW_Write(const unsigned char *, unsigned int size) { return static_cast<int>(size); }

int DBPool_GetSystemPoolID(void) { return 1; }

DataBlockTicket DataBlock_CreateFromPool(int, unsigned int size) {
    auto *b = static_cast<HostDataBlock *>(std::calloc(1, sizeof(HostDataBlock)));
    if (!b) return nullptr;
    std::lock_guard lk(gMu);
    b->memory = TakeMemoryLocked(size);
    b->size = size;
    b->kerAddr = b->memory ? PlaceKerAddr(size) : 0;
    if (b->kerAddr == 0) {
        if (b->memory) ParkMemoryLocked(b->memory, size);
        std::free(b);
        return nullptr;
    }
    gByKerAddr[b->kerAddr] = b;
    return b;
}

void *DataBlock_Access(DataBlockTicket t) { return t ? static_cast<HostDataBlock *>(t)->memory : nullptr; }

uint32_t DataBlock_GetKerVirtAddress(DataBlockTicket t) { return t ? static_cast<HostDataBlock *>(t)->kerAddr : 0; }

int DataBlock_Deaccess(DataBlockTicket t) { return t ? 0 : -1; }

int DataBlock_ReleaseTicket(DataBlockTicket t) {
    if (!t) return -1;
    auto *b = static_cast<HostDataBlock *>(t);
    {
        std::lock_guard lk(gMu);
        gByKerAddr.erase(b->kerAddr);
        ParkMemoryLocked(b->memory, b->size);
    }
    std::free(b);
    return 0;
}

void *DataBlock_HostFromKerVirt(uint64_t kerAddr, uint32_t size) {
    std::lock_guard lk(gMu);
    auto it = gByKerAddr.upper_bound(kerAddr > 0xFFFFFFFFu ? 0xFFFFFFFFu : static_cast<uint32_t>(kerAddr));
    if (it == gByKerAddr.begin()) return nullptr;
    const HostDataBlock *b = std::prev(it)->second;
    const uint64_t offset = kerAddr - b->kerAddr;
    if (offset > b->size || size > b->size - offset) return nullptr;
    return static_cast<char *>(b->memory) + offset;
}
}
