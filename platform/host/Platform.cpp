// Host stand-ins of the controller's platform services a PC lacks.
#include <cstdlib>
#include <cstring>

#include "platform/Platform.h"

extern "C" {

// The board's output ports do not exist on a PC; the backup always succeeds.
int SysPBA_IO_GPOInitBackUp(void) { return 0; }

// No update path on a PC: accept and drop the bytes.
int FW_Write(const unsigned char *, unsigned int size) { return static_cast<int>(size); }

// Data blocks are plain heap buffers; the "kernel address" is the low 32 bits of
// the user address, which host drivers (the virtual devices) never dereference.
struct HostDataBlock {
    void *memory;
    unsigned int size;
};

int DBPool_GetSystemPoolID(void) { return 1; }

DataBlockTicket DataBlock_CreateFromPool(int, unsigned int size) {
    auto *b = static_cast<HostDataBlock *>(std::calloc(1, sizeof(HostDataBlock)));
    if (!b) return nullptr;
    b->memory = std::calloc(1, size ? size : 1);
    if (!b->memory) {
        std::free(b);
        return nullptr;
    }
    b->size = size;
    return b;
}

void *DataBlock_Access(DataBlockTicket t) { return t ? static_cast<HostDataBlock *>(t)->memory : nullptr; }

uint32_t DataBlock_GetKerVirtAddress(DataBlockTicket t) {
    return t ? static_cast<uint32_t>(reinterpret_cast<uintptr_t>(static_cast<HostDataBlock *>(t)->memory)) : 0;
}

int DataBlock_Deaccess(DataBlockTicket t) { return t ? 0 : -1; }

int DataBlock_ReleaseTicket(DataBlockTicket t) {
    if (!t) return -1;
    std::free(static_cast<HostDataBlock *>(t)->memory);
    std::free(t);
    return 0;
}
}
