// Types shared by the MAA shell: result records, symbols, token and parser
// values, evaluation values and operator codes.
#pragma once

#include "usbadapter/types.h"

// ---- result records (sent to the host as 12-byte big-endian headers + data)

enum TMAAResultStatus : U32 {
    MAA_RESULT_CONTINUE = 0,  // more records follow
    MAA_RESULT_END = 1,       // last record of this command
    MAA_RESULT_NONE = 2,      // nothing to send
};

struct TMAAResult {
    TMAAResultStatus enContinue;
    U32 ulResult;
    U32 ulDataSize;
    U8 *pubData;
};

enum TMAASpecialMode : U32 {
    MAA_NORMAL_CMD = 10,
    MAA_JIG_SAVE_CMD = 11,
    MAA_JIG_RUN_CMD = 12,
    MAA_AUTO_SAVE_CMD = 13,
    MAA_AUTO_RUN_CMD = 14,
};

// ---- symbols

enum TMAATarget : U32 {
    ftarget_all = 0,
    ftarget_ppc = 1,  // main controller
    ftarget_scn = 2,  // scanner/fax side: such functions send their own results
};

// Symbol kinds.
constexpr U32 MAA_SYM_FUNC = 1;       // function, listed by the dump
constexpr U32 MAA_SYM_DATA = 2;       // 4-byte data cell at ulAddress
constexpr U32 MAA_SYM_UNDEF = 3;      // declared; becomes data on first assignment
constexpr U32 MAA_SYM_FUNC_HIDE = 4;  // function, not listed by the dump

typedef struct _Maasymbol {
    U8 *pubName;
    U32 ulType;
    U32 ulAddress;  // function handle or data address in the shell's address map
    U8 ubPramCount;
    TMAATarget fMaaTarget;
} TSymbol;

typedef struct _symbol_node {
    struct _symbol_node *pstNext;
    TSymbol *pstSymbol;
} TSymbolNode;

// ---- lexer tokens

constexpr U32 IDENTIFIER = 257;
constexpr U32 CONSTANT = 258;
constexpr U32 STRING = 259;
constexpr U32 GE = 260;
constexpr U32 LE = 261;
constexpr U32 EQ = 262;
constexpr U32 NE = 263;
constexpr U32 PE = 264;
constexpr U32 ME = 265;
constexpr U32 TE = 266;
constexpr U32 DE = 267;
constexpr U32 RE = 268;
constexpr U32 AE = 269;
constexpr U32 OE = 270;
constexpr U32 EXE = 271;
constexpr U32 LSE = 272;
constexpr U32 RSE = 273;
constexpr U32 PP = 274;
constexpr U32 MM = 275;
constexpr U32 LS = 276;
constexpr U32 RS = 277;
constexpr U32 LOR = 278;
constexpr U32 LAND = 279;
constexpr U32 R_CHAR = 280;
constexpr U32 R_SHORT = 281;
constexpr U32 R_LONG = 282;
constexpr U32 R_INT = 283;

// Semantic value of a token or grammar symbol.
typedef union {
    U8 *pubString;  // string literal text
    U8 *pubSymbol;  // identifier text
    U32 ulNumber;   // constant value
    U32 ulOperator; // operator code
} TStackData;

// ---- evaluation values

constexpr U32 V_TYPE_SYM = 1;
constexpr U32 V_TYPE_NUM = 2;
constexpr U32 V_TYPE_REF = 3;  // assignable memory cell
constexpr U32 V_TYPE_PTR = 4;  // address with an element size
constexpr U32 V_TYPE_OP = 5;   // operator in the postfix queue

// Addresses are 32-bit words of the shell's address map, never host pointers.
struct _vref {
    U32 ref;
    U32 size;
};
struct _vptr {
    U32 ptr;
    U32 size;
};

typedef struct _value {
    union {
        TSymbol *sym;
        U32 num;
        _vref ref;
        _vptr ptr;
        U32 op;
    } val;
    U32 type;
} TVAL;

// High byte: precedence class; low byte: member.
constexpr U32 V_OP_POST_INC = 0x0001;
constexpr U32 V_OP_POST_DEC = 0x0002;
constexpr U32 V_OP_FUNCCALL = 0x0003;
constexpr U32 V_OP_FUNCCALL_MARK = 0x0004;
constexpr U32 V_OP_PRE_INC = 0x0101;
constexpr U32 V_OP_PRE_DEC = 0x0102;
constexpr U32 V_OP_ADDR = 0x0103;
constexpr U32 V_OP_PTR = 0x0104;
constexpr U32 V_OP_PLUS = 0x0105;
constexpr U32 V_OP_MINUS = 0x0106;
constexpr U32 V_OP_BNOT = 0x0107;
constexpr U32 V_OP_NOT = 0x0108;
constexpr U32 V_OP_CAST = 0x0109;
constexpr U32 V_OP_CAST_PTR1 = 0x010a;
constexpr U32 V_OP_CAST_PTR2 = 0x010b;
constexpr U32 V_OP_CAST_PTR4 = 0x010c;
constexpr U32 V_OP_MUL = 0x0201;
constexpr U32 V_OP_DIV = 0x0202;
constexpr U32 V_OP_MOD = 0x0203;
constexpr U32 V_OP_ADD = 0x0301;
constexpr U32 V_OP_SUB = 0x0302;
constexpr U32 V_OP_LS = 0x0401;
constexpr U32 V_OP_RS = 0x0402;
constexpr U32 V_OP_L = 0x0501;
constexpr U32 V_OP_G = 0x0502;
constexpr U32 V_OP_LE = 0x0503;
constexpr U32 V_OP_GE = 0x0504;
constexpr U32 V_OP_EQ = 0x0601;
constexpr U32 V_OP_NE = 0x0602;
constexpr U32 V_OP_BAND = 0x0701;
constexpr U32 V_OP_BXOR = 0x0702;
constexpr U32 V_OP_BOR = 0x0703;
constexpr U32 V_OP_LAND = 0x0801;
constexpr U32 V_OP_LOR = 0x0802;
constexpr U32 V_OP_COND = 0x0901;
constexpr U32 V_OP_ASSIGN = 0x0a01;
constexpr U32 V_OP_ASSIGN_MUL = 0x0a02;
constexpr U32 V_OP_ASSIGN_DIV = 0x0a03;
constexpr U32 V_OP_ASSIGN_MOD = 0x0a04;
constexpr U32 V_OP_ASSIGN_ADD = 0x0a05;
constexpr U32 V_OP_ASSIGN_SUB = 0x0a06;
constexpr U32 V_OP_ASSIGN_LS = 0x0a07;
constexpr U32 V_OP_ASSIGN_RS = 0x0a08;
constexpr U32 V_OP_ASSIGN_BAND = 0x0a09;
constexpr U32 V_OP_ASSIGN_BXOR = 0x0a0a;
constexpr U32 V_OP_ASSIGN_BOR = 0x0a0b;
constexpr U32 V_OP_DISCARD = 0x0b01;

inline bool valueIsRef(const TVAL *v) { return v->type == V_TYPE_REF; }
inline bool valueIsPtr(const TVAL *v) { return v->type == V_TYPE_PTR; }
inline bool valueIsSym(const TVAL *v) { return v->type == V_TYPE_SYM; }
inline bool opIsAssign(U32 op) { return op >= V_OP_ASSIGN && op <= V_OP_ASSIGN_BOR; }

// At most this many arguments reach a test function.
constexpr U32 MAX_FUNC_ARMAA = 10;

// Depth of the parser stack and of the value stack; length of the postfix queue.
constexpr U32 STACK_SIZE = 128;
constexpr U32 QUE_SIZE = 128;
