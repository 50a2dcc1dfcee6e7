/* Other platform services the adapter links against on the controller. */
#ifndef PLATFORM_PLATFORM_H
#define PLATFORM_PLATFORM_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Board output ports: saves the current values; 0 on success. */
int SysPBA_IO_GPOInitBackUp(void);

/* Firmware writer of the update path; returns bytes taken or -1. */
int FW_Write(const unsigned char *data, unsigned int size);

/* Data-block library: shared buffers whose kernel address goes to drivers. */
typedef void *DataBlockTicket;
int DBPool_GetSystemPoolID(void);
DataBlockTicket DataBlock_CreateFromPool(int poolId, unsigned int size);
void *DataBlock_Access(DataBlockTicket ticket);
uint32_t DataBlock_GetKerVirtAddress(DataBlockTicket ticket);
int DataBlock_Deaccess(DataBlockTicket ticket);
int DataBlock_ReleaseTicket(DataBlockTicket ticket);

/* Host stand-in only (the virtual drivers' side of the map): the memory behind
 * [kerAddr, kerAddr + size) of a live block, NULL when the range is not inside
 * one block or the block has been released. */
void *DataBlock_HostFromKerVirt(uint64_t kerAddr, uint32_t size);

#ifdef __cplusplus
}
#endif

#endif
