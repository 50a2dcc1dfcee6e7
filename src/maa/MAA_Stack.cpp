#include "maa/MAA_Stack.h"

#include "common/Log.h"
#include "maa/MAA_Executor.h"

TVAL valQue[QUE_SIZE];
U32 valPtr = 0;
TVAL valStack[STACK_SIZE];
U32 valSp = 0;

namespace {

bool isUnary(U32 op) { return op == V_OP_POST_INC || op == V_OP_POST_DEC || (op >= V_OP_PRE_INC && op <= V_OP_CAST_PTR4); }

bool isBinary(U32 op) {
    switch (op >> 8) {
        case 0x02: return op <= V_OP_MOD;
        case 0x03: return op <= V_OP_SUB;
        case 0x04: return op <= V_OP_RS;
        case 0x05: return op <= V_OP_GE;
        case 0x06: return op <= V_OP_NE;
        case 0x07: return op <= V_OP_BOR;
        case 0x08: return op <= V_OP_LOR;
        case 0x0a: return op <= V_OP_ASSIGN_BOR;
        default: return false;
    }
}

bool isMark(const TVAL &v) { return v.type == V_TYPE_OP && v.val.op == V_OP_FUNCCALL_MARK; }

// Pops the arguments down to the call's marker and the function below it, and
// calls it: the last ten arguments are kept, the count covers all of them.
void evalCall() {
    U32 aulArgs[MAX_FUNC_ARMAA] = {};
    U32 stored = 0;
    U32 count = 0;
    for (;;) {
        if (valSp == 0) {
            USBADP_LOG(ERROR, "\r\nvalue stack underflow");
            break;
        }
        TVAL arg;
        MAA_StackPop(&arg);
        if (isMark(arg)) break;
        ++count;
        if (stored < MAX_FUNC_ARMAA) {
            U32 n = 0;
            MAA_Eval(&arg, &n);
            aulArgs[MAX_FUNC_ARMAA - ++stored] = n;
        }
    }
    TVAL function;
    MAA_MakeFromNum(&function, 0);
    MAA_StackPop(&function);
    TVAL result;
    MAA_MakeFromNum(&result, 0);
    MAA_FuncCall(&result, &function, count, &aulArgs[MAX_FUNC_ARMAA - stored]);
    MAA_StackPush(&result);
}

}  // namespace

void MAA_QueClean() { valPtr = 0; }

void MAA_QueAdd(const TVAL *pstValue) {
    if (valPtr >= QUE_SIZE) {
        USBADP_LOG(ERROR, "\r\nvalue que overflow");
        return;
    }
    valQue[valPtr++] = *pstValue;
}

void MAA_QueDump() {
    for (U32 i = 0; i < valPtr; ++i) {
        const TVAL &v = valQue[i];
        switch (v.type) {
            case V_TYPE_SYM:
                USBADP_LOG(DEBUG, "%3d: SYM %s", static_cast<int>(i), reinterpret_cast<const char *>(v.val.sym->pubName));
                break;
            case V_TYPE_NUM: USBADP_LOG(DEBUG, "%3d: NUM 0x%x", static_cast<int>(i), v.val.num); break;
            case V_TYPE_REF: USBADP_LOG(DEBUG, "%3d: REF 0x%x/%u", static_cast<int>(i), v.val.ref.ref, v.val.ref.size); break;
            case V_TYPE_PTR: USBADP_LOG(DEBUG, "%3d: PTR 0x%x/%u", static_cast<int>(i), v.val.ptr.ptr, v.val.ptr.size); break;
            case V_TYPE_OP: USBADP_LOG(DEBUG, "%3d: %s", static_cast<int>(i), MAA_OpName(v.val.op)); break;
            default: USBADP_LOG(DEBUG, "%3d: type %u", static_cast<int>(i), v.type); break;
        }
    }
}

void MAA_StackClean() { valSp = 0; }

void MAA_StackPush(const TVAL *pstValue) {
    if (valSp >= STACK_SIZE) {
        USBADP_LOG(ERROR, "\r\nvalue stack overflow");
        return;
    }
    valStack[valSp++] = *pstValue;
}

void MAA_StackPop(TVAL *pstOut) {
    if (valSp == 0) {
        USBADP_LOG(ERROR, "\r\nvalue stack underflow");
        return;
    }
    *pstOut = valStack[--valSp];
}

U32 MAA_QueEvalSub(U32 *pulIndex) {
    for (; *pulIndex < valPtr; ++*pulIndex) {
        const TVAL v = valQue[*pulIndex];
        if (v.type != V_TYPE_OP || v.val.op == V_OP_FUNCCALL_MARK) {
            MAA_StackPush(&v);
            continue;
        }
        U32 op = v.val.op;
        TVAL result;
        MAA_MakeFromNum(&result, 0);
        if (op == V_OP_FUNCCALL) {
            evalCall();
        } else if (isUnary(op)) {
            TVAL operand;
            MAA_MakeFromNum(&operand, 0);
            MAA_StackPop(&operand);
            MAA_Op1(&result, &operand, op);
            MAA_StackPush(&result);
        } else if (isBinary(op)) {
            TVAL left, right;
            MAA_MakeFromNum(&left, 0);
            MAA_MakeFromNum(&right, 0);
            MAA_StackPop(&right);
            MAA_StackPop(&left);
            MAA_Op2(&result, &left, &right, op);
            MAA_StackPush(&result);
        } else if (op == V_OP_COND) {
            TVAL condition, ifTrue, ifFalse;
            MAA_MakeFromNum(&condition, 0);
            MAA_MakeFromNum(&ifTrue, 0);
            MAA_MakeFromNum(&ifFalse, 0);
            MAA_StackPop(&ifFalse);
            MAA_StackPop(&ifTrue);
            MAA_StackPop(&condition);
            MAA_OpCond(&result, &condition, &ifTrue, &ifFalse);
            MAA_StackPush(&result);
        } else if (op == V_OP_DISCARD) {
            TVAL dropped;
            MAA_StackPop(&dropped);
        } else {
            USBADP_LOG(ERROR, "\r\nUnknown Operator");
            return 0xFFFFFFFFu;
        }
    }
    return 0;
}

U32 MAA_QueEval(TVAL *pstOut) {
    MAA_StackClean();
    U32 index = 0;
    U32 result = MAA_QueEvalSub(&index);
    MAA_StackPop(pstOut);
    return result;
}
