// Symbol table of the MAA shell: registered functions and data cells by name,
// and the single general function that receives calls of unregistered entries.
#pragma once

#include "maa/MAA_Types.h"

extern TSymbolNode *pstRoot;
extern TSymbolNode *pstRootGeneral;

// Private copy of a text; nullptr when memory is exhausted.
U8 *MAA_Strdup(const char *pubText);

// Inserts at the head, so the newest of two equal names is found first.
// Returns the new symbol, nullptr when memory is exhausted (logged).
TSymbol *MAA_SymbolAdd(TMAATarget fMaaTarget, const char *pubName, U32 ulType, U32 ulAddress, U8 ubPramCount);
// Replaces the general function.
TSymbol *MAA_SymbolAddGeneral(TMAATarget fMaaTarget, const char *pubName, U32 ulType, U32 ulAddress,
                              U8 ubPramCount);
TSymbol *MAA_SymbolFind(const char *pubName);
TSymbol *MAA_SymbolFindAddress(U32 ulAddress);
// The general function's entry, 0 when none is registered.
U32 MAA_GetGeneralSymbol();
TSymbol *MAA_GetGeneralSymbolEntry();
void MAA_SymbolPrint(const TSymbol *pstSymbol);
// Registered test function "MAA_SymbolDump": lists the type-1 names to the host.
TMAAResult *MAA_SymbolDump();

// Gives an undefined (type 3) symbol its 4-byte data cell, zeroed, and makes it
// type 2. False when memory or address space is exhausted (logged).
bool MAA_SymbolDefine(TSymbol *pstSymbol);
// Empties the table and releases the cells it created (tests, fuzzing).
void MAA_SymbolClear();
