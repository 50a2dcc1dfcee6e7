#include "maa/MAA_Executor.h"

#include <cstdio>
#include <cstring>

#include "common/Log.h"
#include "maa/MAA_Address.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_MM.h"
#include "maa/MAA_Parser.h"
#include "maa/MAA_Stack.h"
#include "maa/MAA_Symbol.h"

namespace {

constexpr U32 kFail = 0xFFFFFFFFu;

// Value of the k-th symbol from the right end of the rule being reduced.
TStackData &operandSlot(U32 k) { return astStack[ulStackPointer - k].stSTD; }
// Value of the rule's left side.
void setValue(U32 op) { astStack[ulStackPointer].stSTD.ulOperator = op; }

void enqueueOp(U32 op) {
    TVAL v;
    MAA_MakeOp(&v, op);
    MAA_QueAdd(&v);
}

const char *symbolName(const TSymbol *sym) { return reinterpret_cast<const char *>(sym->pubName); }

TMAAResult stUnknownResult;

struct OpNameRow {
    U32 op;
    const char *name;
};
const OpNameRow kOpNames[] = {
    {V_OP_POST_INC, "V_OP_POST_INC"}, {V_OP_POST_DEC, "V_OP_POST_DEC"}, {V_OP_FUNCCALL, "V_OP_FUNCCALL"},
    {V_OP_FUNCCALL_MARK, "V_OP_FUNCCALL_MARK"}, {V_OP_PRE_INC, "V_OP_PRE_INC"}, {V_OP_PRE_DEC, "V_OP_PRE_DEC"},
    {V_OP_ADDR, "V_OP_ADDR"}, {V_OP_PTR, "V_OP_PTR"}, {V_OP_PLUS, "V_OP_PLUS"}, {V_OP_MINUS, "V_OP_MINUS"},
    {V_OP_BNOT, "V_OP_BNOT"}, {V_OP_NOT, "V_OP_NOT"}, {V_OP_CAST, "V_OP_CAST"}, {V_OP_CAST_PTR1, "V_OP_CAST_PTR1"},
    {V_OP_CAST_PTR2, "V_OP_CAST_PTR2"}, {V_OP_CAST_PTR4, "V_OP_CAST_PTR4"}, {V_OP_MUL, "V_OP_MUL"},
    {V_OP_DIV, "V_OP_DIV"}, {V_OP_MOD, "V_OP_MOD"}, {V_OP_ADD, "V_OP_ADD"}, {V_OP_SUB, "V_OP_SUB"},
    {V_OP_LS, "V_OP_LS"}, {V_OP_RS, "V_OP_RS"}, {V_OP_L, "V_OP_L"}, {V_OP_G, "V_OP_G"}, {V_OP_LE, "V_OP_LE"},
    {V_OP_GE, "V_OP_GE"}, {V_OP_EQ, "V_OP_EQ"}, {V_OP_NE, "V_OP_NE"}, {V_OP_BAND, "V_OP_BAND"},
    {V_OP_BXOR, "V_OP_BXOR"}, {V_OP_BOR, "V_OP_BOR"}, {V_OP_LAND, "V_OP_LAND"}, {V_OP_LOR, "V_OP_LOR"},
    {V_OP_COND, "V_OP_COND"}, {V_OP_ASSIGN, "V_OP_ASSIGN"}, {V_OP_ASSIGN_MUL, "V_OP_ASSIGN_MUL"},
    {V_OP_ASSIGN_DIV, "V_OP_ASSIGN_DIV"}, {V_OP_ASSIGN_MOD, "V_OP_ASSIGN_MOD"},
    {V_OP_ASSIGN_ADD, "V_OP_ASSIGN_ADD"}, {V_OP_ASSIGN_SUB, "V_OP_ASSIGN_SUB"},
    {V_OP_ASSIGN_LS, "V_OP_ASSIGN_LS"}, {V_OP_ASSIGN_RS, "V_OP_ASSIGN_RS"},
    {V_OP_ASSIGN_BAND, "V_OP_ASSIGN_BAND"}, {V_OP_ASSIGN_BXOR, "V_OP_ASSIGN_BXOR"},
    {V_OP_ASSIGN_BOR, "V_OP_ASSIGN_BOR"}, {V_OP_DISCARD, "V_OP_DISCARD"},
};

// l op r for the arithmetic, comparison and logical codes and the compound
// assignments built on them. All unsigned 32-bit.
U32 compute(U32 op, U32 l, U32 r) {
    switch (op) {
        case V_OP_MUL: case V_OP_ASSIGN_MUL: return l * r;
        case V_OP_DIV: case V_OP_ASSIGN_DIV:
        case V_OP_MOD: case V_OP_ASSIGN_MOD:
            if (r == 0) {
                USBADP_LOG(ERROR, "divied by zero\n");
                return l;
            }
            return op == V_OP_DIV || op == V_OP_ASSIGN_DIV ? l / r : l % r;
        case V_OP_ADD: case V_OP_ASSIGN_ADD: return l + r;
        case V_OP_SUB: case V_OP_ASSIGN_SUB: return l - r;
        case V_OP_LS: case V_OP_ASSIGN_LS:
        case V_OP_RS: case V_OP_ASSIGN_RS: {
            U32 count = r & 0xFF;
            if (count >= 32) return 0;
            return op == V_OP_LS || op == V_OP_ASSIGN_LS ? l << count : l >> count;
        }
        case V_OP_L: return l < r;
        case V_OP_G: return l > r;
        case V_OP_LE: return l <= r;
        case V_OP_GE: return l >= r;
        case V_OP_EQ: return l == r;
        case V_OP_NE: return l != r;
        case V_OP_BAND: case V_OP_ASSIGN_BAND: return l & r;
        case V_OP_BXOR: case V_OP_ASSIGN_BXOR: return l ^ r;
        case V_OP_BOR: case V_OP_ASSIGN_BOR: return l | r;
        case V_OP_LAND: return l != 0 && r != 0;
        case V_OP_LOR: return l != 0 || r != 0;
        case V_OP_ASSIGN: return r;
        default:
            USBADP_LOG(ERROR, "unknown operator\n");
            return 0;
    }
}

// " = 'c'\n" for a printable ASCII value, else "\n".
const char *charSuffix(U32 n, char (&text)[8]) {
    if (n >= 0x20 && n < 0x7F) std::snprintf(text, sizeof text, " = '%c'\n", static_cast<char>(n));
    else std::snprintf(text, sizeof text, "\n");
    return text;
}

}  // namespace

// ---- values

void MAA_MakeOp(TVAL *v, U32 op) {
    v->type = V_TYPE_OP;
    v->val.op = op;
}

void MAA_MakeRef(TVAL *v, U32 ulAddress, U32 ulSize) {
    v->type = V_TYPE_REF;
    v->val.ref = {ulAddress, ulSize};
}

void MAA_MakePtr(TVAL *v, U32 ulAddress, U32 ulSize) {
    v->type = V_TYPE_PTR;
    v->val.ptr = {ulAddress, ulSize};
}

void MAA_MakeFromNum(TVAL *v, U32 n) {
    v->type = V_TYPE_NUM;
    v->val.num = n;
}

void MAA_MakeFromStr(TVAL *v, const U8 *pubText) { MAA_MakePtr(v, MAA_AddrOf(pubText), 1); }

void MAA_MakeSym(TVAL *v, const U8 *pubName) {
    TSymbol *sym = MAA_SymbolFind(reinterpret_cast<const char *>(pubName));
    if (sym == nullptr) return;
    v->type = V_TYPE_SYM;
    v->val.sym = sym;
}

U32 MAA_MakeFromSym(TVAL *v, TSymbol *pstSymbol, U32 create) {
    switch (pstSymbol->ulType) {
        case MAA_SYM_UNDEF:
            if (!create) {
                USBADP_LOG(ERROR, "Undefined symbol '%s'\n", symbolName(pstSymbol));
                return kFail;
            }
            if (!MAA_SymbolDefine(pstSymbol)) return kFail;
            MAA_MakeRef(v, pstSymbol->ulAddress, 4);
            return 0;
        case MAA_SYM_DATA:
            MAA_MakeRef(v, pstSymbol->ulAddress, 4);
            return 0;
        case MAA_SYM_FUNC:
        case MAA_SYM_FUNC_HIDE:
            MAA_MakeFromNum(v, pstSymbol->ulAddress);
            return 0;
        default:
            return 0;
    }
}

U32 MAA_SymEval(TVAL *out, const TVAL *in, U32 create) {
    *out = *in;
    return valueIsSym(in) ? MAA_MakeFromSym(out, in->val.sym, create) : 0;
}

U32 MAA_Eval(const TVAL *in, U32 *pulNumber) {
    TVAL v;
    *pulNumber = 0;
    if (MAA_SymEval(&v, in, 0) != 0) return kFail;
    switch (v.type) {
        case V_TYPE_NUM: *pulNumber = v.val.num; return 0;
        case V_TYPE_PTR: *pulNumber = v.val.ptr.ptr; return 0;
        case V_TYPE_REF: *pulNumber = MAA_RefValGet(&v); return 0;
        case V_TYPE_SYM:
            // Only a symbol of a kind nothing registers stays a symbol.
            USBADP_LOG(ERROR, "Undefined symbol '%s'\n", symbolName(v.val.sym));
            return kFail;
        default:
            USBADP_LOG(ERROR, "Unknown value type 1 \n");
            return kFail;
    }
}

U32 MAA_RefValGet(const TVAL *v) {
    U32 size = v->val.ref.size;
    if (size != 1 && size != 2 && size != 4) {
        USBADP_LOG(ERROR, "unknown refsize %d\n", static_cast<int>(size));
        return 0;
    }
    U32 n = 0;
    MAA_AddrRead(v->val.ref.ref, size, &n);
    return n;
}

void MAA_RefValSet(const TVAL *v, U32 n) {
    U32 size = v->val.ref.size;
    if (size != 1 && size != 2 && size != 4) {
        USBADP_LOG(ERROR, "unknown refsize %d\n", static_cast<int>(size));
        return;
    }
    MAA_AddrWrite(v->val.ref.ref, size, n);
}

// ---- operators

void MAA_Op1(TVAL *result, const TVAL *operand, U32 op) {
    TVAL v;
    if (MAA_SymEval(&v, operand, 0) != 0) {
        MAA_MakeFromNum(result, 0);
        return;
    }
    U32 n = 0;
    if (op != V_OP_ADDR && op != V_OP_PTR) MAA_Eval(&v, &n);
    switch (op) {
        case V_OP_POST_INC:
        case V_OP_POST_DEC:
            if (!valueIsRef(&v)) USBADP_LOG(ERROR, "invalid lvalue\n");
            else MAA_RefValSet(&v, op == V_OP_POST_INC ? n + 1 : n - 1);
            MAA_MakeFromNum(result, n);
            break;
        case V_OP_PRE_INC:
        case V_OP_PRE_DEC:
            // Writes the cell back unchanged: pre-increment does not increment.
            if (!valueIsRef(&v)) USBADP_LOG(ERROR, "invalid lvalue\n");
            else MAA_RefValSet(&v, n);
            MAA_MakeFromNum(result, n);
            break;
        case V_OP_ADDR:
            if (!valueIsRef(&v)) {
                USBADP_LOG(ERROR, "invalid lvalue\n");
                MAA_MakeFromNum(result, 0);
            } else {
                MAA_MakePtr(result, v.val.ref.ref, v.val.ref.size);
            }
            break;
        case V_OP_PTR:
            if (valueIsPtr(&v)) {
                MAA_MakeRef(result, v.val.ptr.ptr, v.val.ptr.size);
            } else {
                MAA_Eval(&v, &n);
                MAA_MakeRef(result, n, 4);
            }
            break;
        case V_OP_PLUS: MAA_MakeFromNum(result, n); break;
        case V_OP_MINUS: MAA_MakeFromNum(result, 0 - n); break;
        case V_OP_BNOT: MAA_MakeFromNum(result, ~n); break;
        case V_OP_NOT: MAA_MakeFromNum(result, n == 0); break;
        case V_OP_CAST: MAA_MakeFromNum(result, n); break;  // casts never narrow
        case V_OP_CAST_PTR1: MAA_MakePtr(result, n, 1); break;
        case V_OP_CAST_PTR2: MAA_MakePtr(result, n, 2); break;
        case V_OP_CAST_PTR4: MAA_MakePtr(result, n, 4); break;
        default:
            USBADP_LOG(ERROR, "Unknown operator\n ");
            MAA_MakeFromNum(result, 0);
            break;
    }
}

void MAA_Op2(TVAL *result, const TVAL *left, const TVAL *right, U32 op) {
    U32 r = 0, l = 0;
    TVAL lv;
    bool failed = MAA_Eval(right, &r) != 0;
    failed = MAA_SymEval(&lv, left, op == V_OP_ASSIGN) != 0 || failed;
    if (!failed && op != V_OP_ASSIGN) failed = MAA_Eval(&lv, &l) != 0;
    if (failed) {
        MAA_MakeFromNum(result, 0);
        return;
    }
    U32 value = compute(op, l, r);
    if (!opIsAssign(op)) {
        MAA_MakeFromNum(result, value);
    } else if (!valueIsRef(&lv)) {
        USBADP_LOG(ERROR, "invalid lvalue\n");
        MAA_MakeFromNum(result, value);
    } else {
        // The result is the cell itself, so "a = b = 3" assigns both.
        MAA_RefValSet(&lv, value);
        *result = lv;
    }
}

void MAA_OpCond(TVAL *result, const TVAL *condition, const TVAL *ifTrue, const TVAL *ifFalse) {
    U32 n = 0;
    MAA_Eval(condition, &n);
    *result = n != 0 ? *ifTrue : *ifFalse;
}

void MAA_FuncCall(TVAL *result, const TVAL *function, U32 argc, const U32 *args) {
    U32 entry = 0;
    MAA_Eval(function, &entry);
    if (argc > MAX_FUNC_ARMAA) {
        USBADP_LOG(ERROR, "too many args\n");
        MAA_MakeFromNum(result, 0);
        return;
    }
    TSymbol *sym = MAA_SymbolFindAddress(entry);
    bool general = sym == nullptr;
    if (general) {
        USBADP_LOG(FINE, "pstSymbol is Null\n");
        entry = MAA_GetGeneralSymbol();
        if (entry == 0) {
            USBADP_LOG(ERROR, "Address location in Symbol Table failed\n");
            return;
        }
    } else if (sym->ubPramCount != argc) {
        return;
    }

    U32 aulWords[MAX_FUNC_ARMAA] = {};
    if (argc != 0) std::memcpy(aulWords, args, argc * sizeof(U32));
    TMAAResult *res = nullptr;
    if (general) {
        TMAAGeneralEntry pfn = MAA_AddrGeneral(entry);
        if (pfn == nullptr) {
            USBADP_LOG(ERROR, "invalid address 0x%x", entry);
            return;
        }
        USBADP_LOG(FINE, "MAA_FuncCall - IsGeneralFunc %d\n", 1);
        USBADP_LOG(FINE, "MAA_FuncCall-Call\n");
        res = pfn(argc, aulWords);
        USBADP_LOG(FINE, "MAA_FuncCall-End\n");
    } else {
        TMAAEntry pfn = MAA_AddrFunc(entry);
        if (pfn == nullptr) {
            // A data symbol's address, or a number that happens to match one.
            USBADP_LOG(ERROR, "invalid address 0x%x", entry);
            return;
        }
        res = pfn(aulWords);
    }
    MAA_FreeParamString();

    bool ownResults = !general && sym->fMaaTarget == ftarget_scn;
    if (res != nullptr && res->enContinue != MAA_RESULT_NONE && enSpecialMode != MAA_JIG_RUN_CMD &&
        enSpecialMode != MAA_AUTO_RUN_CMD && !ownResults) {
        USBADP_LOG(FINE, "[MAA_FuncCall]: MAA_WriteResult\n");
        MAA_WriteResult(res);
    }
    MAA_MakeFromNum(result, 1);
}

// ---- tracing and actions

const char *MAA_OpName(U32 op) {
    for (const OpNameRow &row : kOpNames) {
        if (row.op == op) return row.name;
    }
    static char text[40];
    std::snprintf(text, sizeof text, "unknown operator 0x%x\n", op);
    return text;
}

void MAA_CmdPrint(const TVAL *v) {
    char suffix[8];
    switch (v->type) {
        case V_TYPE_SYM: {
            MAA_SymbolPrint(v->val.sym);
            TVAL value = *v;
            if (MAA_MakeFromSym(&value, v->val.sym, 0) == 0 && !valueIsSym(&value)) MAA_CmdPrint(&value);
            else USBADP_LOG(INFO, "\n");
            break;
        }
        case V_TYPE_NUM:
            USBADP_LOG(INFO, "ValueNum = %d = 0x%x%s", static_cast<int>(v->val.num), v->val.num,
                       charSuffix(v->val.num, suffix));
            break;
        case V_TYPE_REF: {
            U32 n = MAA_RefValGet(v);
            USBADP_LOG(INFO, "ValueRef = %d = 0x%x%s", static_cast<int>(n), n, charSuffix(n, suffix));
            break;
        }
        case V_TYPE_PTR:
            USBADP_LOG(INFO, "ValueAdr = %d = 0x%x\n", static_cast<int>(v->val.ptr.ptr), v->val.ptr.ptr);
            break;
        case V_TYPE_OP: break;
        default:
            USBADP_LOG(ERROR, "Unknown value type 1 \n");
            stUnknownResult = {MAA_RESULT_END, 0, 0, nullptr};
            MAA_IF_WriteResult(&stUnknownResult);
            break;
    }
}

void MAA_DoAction(U32 ulRule) {
    static const U32 kUnary[] = {V_OP_ADDR, V_OP_PTR, V_OP_PLUS, V_OP_MINUS, V_OP_BNOT, V_OP_NOT};  // 21-26
    static const U32 kPtrCasts[] = {V_OP_CAST_PTR1, V_OP_CAST_PTR2, V_OP_CAST_PTR4, V_OP_CAST_PTR4};  // 33-36
    static const U32 kAssign[] = {V_OP_ASSIGN, V_OP_ASSIGN_MUL, V_OP_ASSIGN_DIV, V_OP_ASSIGN_MOD,
                                  V_OP_ASSIGN_ADD, V_OP_ASSIGN_SUB, V_OP_ASSIGN_LS, V_OP_ASSIGN_RS,
                                  V_OP_ASSIGN_BAND, V_OP_ASSIGN_BXOR, V_OP_ASSIGN_BOR};  // 74-84
    TVAL v;
    switch (ulRule) {
        case 87: MAA_QueClean(); break;
        case 4: {
            TVAL value = {};
            MAA_QueEval(&value);
            MAA_CmdPrint(&value);
            break;
        }
        case 5: {
            TStackData &slot = operandSlot(1);
            static const U8 kNoName[] = "";
            const U8 *name = slot.pubSymbol ? slot.pubSymbol : kNoName;
            MAA_MakeFromNum(&v, 0);
            MAA_MakeSym(&v, name);
            if (!valueIsSym(&v)) USBADP_LOG(ERROR, "Undefined symbol '%s'\n", reinterpret_cast<const char *>(name));
            MAA_QueAdd(&v);
            MAA_SetCmdName(name);
            MAA_Free(slot.pubSymbol);
            slot.pubSymbol = nullptr;
            break;
        }
        case 6:
            MAA_MakeFromNum(&v, operandSlot(1).ulNumber);
            MAA_QueAdd(&v);
            break;
        case 7:
            MAA_MakeFromStr(&v, operandSlot(1).pubString);
            MAA_QueAdd(&v);
            break;
        case 88: enqueueOp(V_OP_FUNCCALL_MARK); break;
        case 10:
            enqueueOp(V_OP_FUNCCALL_MARK);
            enqueueOp(V_OP_FUNCCALL);
            break;
        case 11: enqueueOp(V_OP_FUNCCALL); break;
        case 13: setValue(V_OP_POST_INC); break;
        case 14: setValue(V_OP_POST_DEC); break;
        case 12: enqueueOp(operandSlot(1).ulOperator); break;
        case 18: enqueueOp(V_OP_PRE_INC); break;
        case 19: enqueueOp(V_OP_PRE_DEC); break;
        case 21: case 22: case 23: case 24: case 25: case 26: setValue(kUnary[ulRule - 21]); break;
        case 20: case 28: enqueueOp(operandSlot(2).ulOperator); break;
        case 29: case 30: case 31: case 32: setValue(V_OP_CAST); break;
        case 33: case 34: case 35: case 36: setValue(kPtrCasts[ulRule - 33]); break;
        case 39: setValue(V_OP_MUL); break;
        case 40: setValue(V_OP_DIV); break;
        case 41: setValue(V_OP_MOD); break;
        case 44: setValue(V_OP_ADD); break;
        case 45: setValue(V_OP_SUB); break;
        case 48: setValue(V_OP_LS); break;
        case 49: setValue(V_OP_RS); break;
        case 52: setValue(V_OP_L); break;
        case 53: setValue(V_OP_G); break;
        case 54: setValue(V_OP_LE); break;
        case 55: setValue(V_OP_GE); break;
        case 58: setValue(V_OP_EQ); break;
        case 59: setValue(V_OP_NE); break;
        case 38: case 43: case 47: case 51: case 57: case 73: enqueueOp(operandSlot(2).ulOperator); break;
        case 61: enqueueOp(V_OP_BAND); break;
        case 63: enqueueOp(V_OP_BXOR); break;
        case 65: enqueueOp(V_OP_BOR); break;
        case 67: enqueueOp(V_OP_LAND); break;
        case 69: enqueueOp(V_OP_LOR); break;
        case 71: enqueueOp(V_OP_COND); break;
        case 89: enqueueOp(V_OP_DISCARD); break;
        default:
            if (ulRule >= 74 && ulRule <= 84) setValue(kAssign[ulRule - 74]);
            break;
    }
}
