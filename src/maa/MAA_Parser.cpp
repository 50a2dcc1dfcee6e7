#include "maa/MAA_Parser.h"

#include <cstring>

#include "common/Log.h"
#include "maa/MAA_Address.h"
#include "maa/MAA_Executor.h"
#include "maa/MAA_MM.h"

TStack astStack[STACK_SIZE];
U32 ulStackPointer = 0;

const REV_TBL revTbl[] = {
    {"char", R_CHAR},
    {"short", R_SHORT},
    {"long", R_LONG},
    {"int", R_INT},
    {nullptr, 0},
};

const U8 *inpptr = nullptr;
TStackData stVal;
TStackData stTempVal1;
U32 ulLastSymbol = 0;
U32 ulUngetFlag = 0;
U8 *paubAllocTable[MAA_MAX_STRINGS];
U32 ulAllocCount = 0;
bool fMAALineReject = false;

namespace {

// Map addresses of the literals in paubAllocTable.
U32 aulAllocAddr[MAA_MAX_STRINGS];
// Counts MAA_FreeParamString calls, so the parser sees that a reduction (a
// statement that called a function) has cleared its stack.
U32 ulStackClears = 0;

bool isDigit(U8 c) { return c >= '0' && c <= '9'; }
bool isLetter(U8 c) { return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || c == '_'; }
bool isSpace(U8 c) { return c == ' ' || c == '\t' || c == '\n' || c == '\v' || c == '\f' || c == '\r'; }

// Value of c as a digit (letters from 10 up), or 99.
U32 digitValue(U8 c) {
    if (isDigit(c)) return c - '0';
    if (c >= 'A' && c <= 'Z') return c - 55;
    if (c >= 'a' && c <= 'z') return c - 87;
    return 99;
}

// Ends the line: every later token is 0.
U32 endOfInput() {
    inpptr = nullptr;
    return 0;
}

U32 rejectLine() {
    fMAALineReject = true;
    return endOfInput();
}

U32 lexString(const U8 *start) {
    const U8 *p = start + 1;
    while (*p != '"') {
        if (*p == 0) {
            USBADP_LOG(ERROR, "\r\ninvalid string");
            return endOfInput();
        }
        if (*p == '\\') {
            MAA_DecodeEscape(&p);
            if (fMAALineReject) return endOfInput();
        } else {
            ++p;
        }
    }
    if (ulAllocCount >= MAA_MAX_STRINGS) {
        USBADP_LOG(ERROR, "\r\ntoo many string literals (%u)", MAA_MAX_STRINGS);
        return rejectLine();
    }
    U32 size = static_cast<U32>(p + 1 - start) + 1;
    auto *text = static_cast<U8 *>(MAA_Alloc(size));
    if (text == nullptr) return rejectLine();
    std::memset(text, 0, size);
    U32 address = MAA_AddrMap(text, size);
    if (address == 0) {
        MAA_Free(text);
        return rejectLine();
    }
    paubAllocTable[ulAllocCount] = text;
    aulAllocAddr[ulAllocCount] = address;
    ++ulAllocCount;

    U8 *out = text;
    for (const U8 *q = start + 1; q != p;) {
        if (*q == '\\') *out++ = MAA_DecodeEscape(&q);
        else *out++ = *q++;
    }
    *out = 0;
    inpptr = p + 1;
    stVal.pubString = text;
    return STRING;
}

U32 lexChar() {
    U8 c = *inpptr;
    U32 value;
    if (c == 0) {
        USBADP_LOG(ERROR, "\r\ninvalid charactor constant");
        return endOfInput();
    }
    if (c == '\\') {
        value = MAA_DecodeEscape(&inpptr);
        if (fMAALineReject) return endOfInput();
    } else {
        value = c;
        ++inpptr;
    }
    if (*inpptr != '\'') {
        USBADP_LOG(ERROR, "\r\ninvalid charactor constant");
        return endOfInput();
    }
    ++inpptr;
    stVal.ulNumber = value;
    return CONSTANT;
}

U32 lexIdentifier(const U8 *start) {
    while (isLetter(*inpptr) || isDigit(*inpptr)) ++inpptr;
    size_t len = static_cast<size_t>(inpptr - start);
    // A name that merely begins with a type word is that type word.
    for (const REV_TBL *row = revTbl; row->name != nullptr; ++row) {
        if (std::strncmp(reinterpret_cast<const char *>(start), row->name, std::strlen(row->name)) == 0)
            return row->token;
    }
    auto *name = static_cast<U8 *>(MAA_Alloc(static_cast<U32>(len + 1)));
    if (name == nullptr) {
        USBADP_LOG(ERROR, "\r\nnot enough memory");
        return rejectLine();
    }
    std::memcpy(name, start, len);
    name[len] = 0;
    stVal.pubSymbol = name;
    return IDENTIFIER;
}

// Longest match of an operator that begins with c (already consumed).
U32 lexOperator(U8 c) {
    auto next = [](U8 expected) {
        if (*inpptr != expected) return false;
        ++inpptr;
        return true;
    };
    switch (c) {
        case '!': return next('=') ? NE : '!';
        case '%': return next('=') ? RE : '%';
        case '*': return next('=') ? TE : '*';
        case '/': return next('=') ? DE : '/';
        case '^': return next('=') ? EXE : '^';
        case '=': return next('=') ? EQ : '=';
        case '&': return next('=') ? AE : next('&') ? LAND : '&';
        case '|': return next('=') ? OE : next('&') ? LOR : '|';
        case '+': return next('+') ? PP : next('=') ? PE : '+';
        case '-': return next('-') ? MM : next('=') ? ME : '-';
        case '<':
            if (next('=')) return LE;
            if (next('<')) return next('=') ? LSE : LS;
            return '<';
        case '>':
            if (next('=')) return GE;
            if (next('>')) return next('=') ? RSE : RS;
            return '>';
        case '(': case ')': case ',': case ':': case ';': case '?': case '~':
            return c;
        default:
            return 0;
    }
}

// ---- parser

bool push(U32 state, U32 symbol, TStackData value) {
    if (ulStackPointer >= STACK_SIZE) {
        USBADP_LOG(ERROR, "\r\nparser stack overflow");
        return false;
    }
    astStack[ulStackPointer++] = {state, symbol, value};
    return true;
}

TStack pop() { return astStack[--ulStackPointer]; }

constexpr U32 kSymIdentifier = 3;

void freeTokenValue(U32 symbol, TStackData value) {
    if (symbol == kSymIdentifier) MAA_Free(value.pubSymbol);
}

// Releases what an unfinished parse still holds: identifier texts not yet
// reduced, and the line's string literals.
U32 finish(U32 result) {
    for (U32 i = 0; i < ulStackPointer; ++i) {
        if (astStack[i].ulSymbol == kSymIdentifier) {
            MAA_Free(astStack[i].stSTD.pubSymbol);
            astStack[i].stSTD.pubSymbol = nullptr;
        }
    }
    ulStackPointer = 0;
    ulUngetFlag = 0;
    MAA_FreeParamString();
    return result;
}

}  // namespace

void MAA_InputSet(const U8 *pubLine) {
    if (ulAllocCount != 0) MAA_FreeParamString();
    inpptr = pubLine;
    ulUngetFlag = 0;
    fMAALineReject = false;
}

void MAA_SkipSpace(const U8 **ppubText) {
    while (isSpace(**ppubText)) ++*ppubText;
}

U8 MAA_DecodeEscape(const U8 **ppubText) {
    const U8 *p = *ppubText + 1;  // behind the backslash
    U8 c = *p;
    U32 value = 0;
    switch (c) {
        case '"': case '\'': case '?': case '\\': value = c; ++p; break;
        case 'a': value = 7; ++p; break;
        case 'b': value = 8; ++p; break;
        case 'f': value = 12; ++p; break;
        case 'n': value = 10; ++p; break;
        case 'r': value = 13; ++p; break;
        case 't': value = 9; ++p; break;
        case 'v': value = 11; ++p; break;
        case 'x':
            ++p;
            for (int i = 0; i < 2 && digitValue(*p) < 16; ++i) value = value * 16 + digitValue(*p++);
            break;
        default:
            if (c >= '0' && c <= '7') {
                for (int i = 0; i < 3 && *p >= '0' && *p <= '7'; ++i) value = value * 8 + (*p++ - '0');
            } else {
                // An unknown escape is the host's mistake: reject the line.
                USBADP_LOG(ERROR, "\r\ninvalid escape: *ptr >= '0' && *ptr <= '7'");
                fMAALineReject = true;
                if (c != 0) ++p;
            }
            break;
    }
    *ppubText = p;
    return static_cast<U8>(value);
}

U32 MAA_Logic(const U8 *pubText, const U8 **ppubEnd, U32 ulBase) {
    const U8 *p = pubText;
    while (isSpace(*p)) ++p;
    bool negative = false;
    if (*p == '-' || *p == '+') negative = *p++ == '-';
    if ((ulBase == 0 || ulBase == 16) && p[0] == '0' && (p[1] == 'x' || p[1] == 'X')) {
        p += 2;
        ulBase = 16;
    }
    if (ulBase == 0) ulBase = *p == '0' ? 8 : 10;
    U32 value = 0;
    const U8 *first = p;
    if (ulBase >= 2 && ulBase <= 36) {
        for (U32 d; (d = digitValue(*p)) < ulBase; ++p) {
            // A digit that would overflow is consumed but not added.
            if (value <= (0xFFFFFFFFu - d) / ulBase) value = value * ulBase + d;
        }
    }
    if (ppubEnd != nullptr) *ppubEnd = p == first ? pubText : p;
    return negative ? ~value : value;
}

U32 MAA_TokenDivider() {
    stVal = {};
    if (inpptr == nullptr) return 0;
    MAA_SkipSpace(&inpptr);
    const U8 *start = inpptr;
    U8 c = *inpptr++;
    if (c == 0) return endOfInput();
    if (c == '"') return lexString(start);
    if (c == '\'') return lexChar();
    if (isDigit(c)) {
        U32 base = c == '0' && (*inpptr == 'x' || *inpptr == 'X') ? 16 : 10;
        stVal.ulNumber = MAA_Logic(start, &inpptr, base);
        return CONSTANT;
    }
    if (isLetter(c)) return lexIdentifier(start);
    U32 token = lexOperator(c);
    // Anything else ends the line here, as its end would.
    return token != 0 ? token : endOfInput();
}

U32 MAA_GetToken(TStackData *pstValue) {
    if (ulUngetFlag == 0) {
        ulLastSymbol = MAA_GetSymbolCode(MAA_TokenDivider());
        stTempVal1 = stVal;
    }
    *pstValue = stTempVal1;
    ulUngetFlag = 0;
    return ulLastSymbol;
}

void MAA_UngetToken() { ulUngetFlag = 1; }

U32 MAA_GetSymbolCode(U32 ulToken) {
    if (ulToken >= IDENTIFIER && ulToken <= R_INT) {
        static const U8 kClassSymbols[] = {
            3, 4, 5,                                  // IDENTIFIER CONSTANT STRING
            16, 17, 18, 19,                           // GE LE EQ NE
            26, 27, 28, 29, 30, 31, 32, 33, 34, 35,  // PE ME TE DE RE AE OE EXE LSE RSE
            36, 37, 38, 39, 40, 41,                   // PP MM LS RS LOR LAND
            45, 46, 47, 48,                           // R_CHAR R_SHORT R_LONG R_INT
        };
        static_assert(sizeof kClassSymbols == R_INT - IDENTIFIER + 1);
        return kClassSymbols[ulToken - IDENTIFIER];
    }
    switch (ulToken) {
        case 0: return 0;
        case 256: return 2;
        case ';': return 6;
        case '(': return 7;
        case ')': return 8;
        case '+': return 9;
        case '-': return 10;
        case '*': return 11;
        case '/': return 12;
        case '%': return 13;
        case '>': return 14;
        case '<': return 15;
        case '&': return 20;
        case '^': return 21;
        case '|': return 22;
        case '=': return 23;
        case '~': return 24;
        case '!': return 25;
        case ',': return 42;
        case '?': return 43;
        case ':': return 44;
        default: return 0xFFFFFFFFu;
    }
}

void MAA_FreeParamString() {
    for (U32 i = 0; i < MAA_MAX_STRINGS && paubAllocTable[i] != nullptr; ++i) {
        MAA_AddrUnmap(aulAllocAddr[i]);
        MAA_Free(paubAllocTable[i]);
        paubAllocTable[i] = nullptr;
        aulAllocAddr[i] = 0;
    }
    std::memset(static_cast<void *>(astStack), 0, sizeof astStack);
    ++ulStackClears;
    ulAllocCount = 0;
}

U32 MAA_Parser() {
    USBADP_LOG(DEBUG, "\r\nMAA Parser () Start");
    ulUngetFlag = 0;
    ulStackPointer = 0;
    TStackData value;
    U32 symbol = MAA_GetToken(&value);
    if (fMAALineReject) return finish(1);
    push(0, symbol, value);
    for (;;) {
        TStack top = pop();
        if (top.ulSymbol >= NUM_SYM) {
            USBADP_LOG(ERROR, "\r\ninvalid token");
            return finish(1);
        }
        S32 action = aulNstate[top.ulState][top.ulSymbol];
        if (action >= 0 && action < static_cast<S32>(NUM_STATE)) {
            // Shift a terminal, or go to the state after a non-terminal; either way
            // the next token becomes the look-ahead on top.
            push(top.ulState, top.ulSymbol, top.stSTD);
            symbol = MAA_GetToken(&value);
            if (fMAALineReject) return finish(1);
            if (!push(static_cast<U32>(action), symbol, value)) {
                freeTokenValue(symbol, value);
                return finish(1);
            }
            continue;
        }
        S32 rule = action < 0 ? aulDefaultAction[top.ulState] : action - static_cast<S32>(NUM_STATE);
        if (rule == 0) return finish(0);
        const RULEINFO *info = rule > 0 && rule <= static_cast<S32>(NUM_RULE) ? &ruleInfo[rule - 1] : nullptr;
        if (info == nullptr || ulStackPointer < info->ulLen) {
            USBADP_LOG(ERROR, "\r\n[MAA] syntax error (state %u, symbol %u)", top.ulState, top.ulSymbol);
            freeTokenValue(top.ulSymbol, top.stSTD);
            return finish(1);
        }
        // The look-ahead stays with the lexer while the rule is reduced.
        MAA_UngetToken();
        astStack[ulStackPointer].stSTD = {};
        U32 clears = ulStackClears;
        MAA_DoAction(static_cast<U32>(rule));
        TStackData lhs = astStack[ulStackPointer].stSTD;
        U32 state = top.ulState;
        if (clears != ulStackClears) {
            // A call inside the statement cleared the stack: what is left are
            // state-0 entries, and a completed statement continues from state 0
            // anyway. Start from the bottom instead of keeping them.
            ulStackPointer = 0;
            state = 0;
        } else {
            for (U32 i = 0; i < info->ulLen; ++i) state = pop().ulState;
        }
        push(state, info->ulGenSymbol, lhs);
    }
}
