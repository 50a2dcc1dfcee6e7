// Evaluation of the command language: values, operators, function calls and
// the parser's reduction actions.
#pragma once

#include "maa/MAA_Types.h"

void MAA_MakeOp(TVAL *v, U32 op);
void MAA_MakeRef(TVAL *v, U32 ulAddress, U32 ulSize);
void MAA_MakePtr(TVAL *v, U32 ulAddress, U32 ulSize);
void MAA_MakeFromNum(TVAL *v, U32 n);
// A pointer (element size 1) to a string literal of the current line.
void MAA_MakeFromStr(TVAL *v, const U8 *pubText);
// A symbol value when the name is registered; otherwise v is left as it was.
void MAA_MakeSym(TVAL *v, const U8 *pubName);

// 0, or 0xFFFFFFFF while the symbol stays undefined.
U32 MAA_MakeFromSym(TVAL *v, TSymbol *pstSymbol, U32 create);
U32 MAA_SymEval(TVAL *out, const TVAL *in, U32 create);
U32 MAA_Eval(const TVAL *in, U32 *pulNumber);
U32 MAA_RefValGet(const TVAL *v);
void MAA_RefValSet(const TVAL *v, U32 n);

void MAA_Op1(TVAL *result, const TVAL *operand, U32 op);
void MAA_Op2(TVAL *result, const TVAL *left, const TVAL *right, U32 op);
void MAA_OpCond(TVAL *result, const TVAL *condition, const TVAL *ifTrue, const TVAL *ifFalse);
// Calls the registered function at the entry `function` evaluates to, with
// argc words (at most ten kept) at args. A skipped call leaves *result as it was.
void MAA_FuncCall(TVAL *result, const TVAL *function, U32 argc, const U32 *args);

// The name of an operator code ("unknown operator 0x%x\n" otherwise).
const char *MAA_OpName(U32 op);
// Logs a statement's value.
void MAA_CmdPrint(const TVAL *v);
// Reduction hook of the parser: rule 1..90.
void MAA_DoAction(U32 ulRule);
