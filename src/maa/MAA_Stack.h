// Postfix queue of a statement and the value stack it is evaluated on.
#pragma once

#include "maa/MAA_Types.h"

extern TVAL valQue[QUE_SIZE];
extern U32 valPtr;
extern TVAL valStack[STACK_SIZE];
extern U32 valSp;

void MAA_QueClean();
// A full queue drops the value ("\r\nvalue que overflow").
void MAA_QueAdd(const TVAL *pstValue);
void MAA_QueDump();
void MAA_StackClean();
// A full stack drops the value ("\r\nvalue stack overflow").
void MAA_StackPush(const TVAL *pstValue);
// An empty stack leaves *pstOut as it was ("\r\nvalue stack underflow").
void MAA_StackPop(TVAL *pstOut);
// Runs the queue from *pulIndex to its end on the value stack; 0, or
// 0xFFFFFFFF on an unknown operator.
U32 MAA_QueEvalSub(U32 *pulIndex);
// Runs the whole queue and pops the statement's value into *pstOut.
U32 MAA_QueEval(TVAL *pstOut);
