#include "maa/MAA_Address.h"
#include "maa/MAA_Hook.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/MAA_Symbol.h"

// Interim: only the shell utilities are registered so far; the test-function
// families and the general function join this table with their modules.
void MAA_SymbolReg(void) {
    MAA_IF_SymbolAdd(ftarget_all, "MAA_SymbolDump", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<MAA_SymbolDump>(), 0);
    MAA_IF_SymbolAdd(ftarget_ppc, "Dump_File", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<Dump_File>(), 1);
}
