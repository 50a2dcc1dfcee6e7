// Lexer and table-driven LR parser of the MAA command language. Parsing and
// execution are one pass: every reduction calls MAA_DoAction, and a statement
// runs as soon as it is reduced.
#pragma once

#include "maa/MAA_Types.h"

constexpr U32 NUM_STATE = 126;  // automaton states
constexpr U32 NUM_SYM = 144;    // symbol numbers (table columns)
constexpr U32 NUM_RULE = 90;
constexpr U32 MAA_MAX_STRINGS = 20;  // string literals per line

typedef struct {
    U32 ulLen;           // symbols on the right side
    U32 ulGenSymbol;     // left side
    S32 ulReduceAction;  // mid-rule action number of a marker rule, else -1
    const char *pubTest; // the rule as text, for tracing
} RULEINFO;

typedef struct {
    U32 ulState;
    U32 ulSymbol;
    TStackData stSTD;
} TStack;

// Generated from grammar/MAA_Grammar.y (MAA_Parser_Tables.cpp).
extern const S32 aulNstate[NUM_STATE + 1][NUM_SYM];
extern const S32 aulDefaultAction[NUM_STATE];
extern const RULEINFO ruleInfo[NUM_RULE];

extern TStack astStack[STACK_SIZE];
extern U32 ulStackPointer;

// ---- lexer

typedef struct {
    const char *name;
    U32 token;
} REV_TBL;
extern const REV_TBL revTbl[];

extern const U8 *inpptr;  // next character; nullptr once the line has ended
extern TStackData stVal;
extern TStackData stTempVal1;
extern U32 ulLastSymbol;
extern U32 ulUngetFlag;
extern U8 *paubAllocTable[MAA_MAX_STRINGS];
extern U32 ulAllocCount;
// Set when the current line must be rejected whole (an unknown escape, too
// many string literals, no memory for a token); cleared by MAA_InputSet.
extern bool fMAALineReject;

void MAA_InputSet(const U8 *pubLine);
U32 MAA_TokenDivider();
U32 MAA_GetToken(TStackData *pstValue);
void MAA_UngetToken();
void MAA_SkipSpace(const U8 **ppubText);
U8 MAA_DecodeEscape(const U8 **ppubText);
U32 MAA_Logic(const U8 *pubText, const U8 **ppubEnd, U32 ulBase);

// ---- parser

U32 MAA_GetSymbolCode(U32 ulToken);
// 0 accepted, 1 rejected (invalid token, syntax error or a rejected line).
U32 MAA_Parser();
// Releases the line's string literals and clears the parser stack.
void MAA_FreeParamString();
