#include "maa/MAA_Symbol.h"

#include <cstdarg>
#include <cstdio>
#include <cstring>

#include "common/Log.h"
#include "maa/MAA_Address.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_MM.h"

TSymbolNode *pstRoot = nullptr;
TSymbolNode *pstRootGeneral = nullptr;

namespace {

// Cells made for undefined symbols on first assignment; owned by the table.
struct Cell {
    Cell *pstNext;
    U32 ulAddress;
    U8 aubData[4];
};
Cell *pstCells = nullptr;

U8 aubSymbolText[512];
TMAAResult stSymbolResult;

TSymbolNode *newNode(TMAATarget target, const char *name, U32 type, U32 address, U8 count) {
    auto *sym = static_cast<TSymbol *>(MAA_Alloc(sizeof(TSymbol)));
    auto *node = static_cast<TSymbolNode *>(MAA_Alloc(sizeof(TSymbolNode)));
    U8 *copy = MAA_Strdup(name ? name : "");
    if (sym == nullptr || node == nullptr || copy == nullptr) {
        USBADP_LOG(ERROR, "\r\n[MAA:MAA_SymbolAdd] no memory for symbol %s", name ? name : "");
        MAA_Free(sym);
        MAA_Free(node);
        MAA_Free(copy);
        return nullptr;
    }
    *sym = {copy, type, address, count, target};
    *node = {nullptr, sym};
    return node;
}

void freeNode(TSymbolNode *node) {
    MAA_Free(node->pstSymbol->pubName);
    MAA_Free(node->pstSymbol);
    MAA_Free(node);
}

void sendLine(U32 result, const char *format, ...) __attribute__((format(printf, 2, 3)));
void sendLine(U32 result, const char *format, ...) {
    va_list ap;
    va_start(ap, format);
    int n = std::vsnprintf(reinterpret_cast<char *>(aubSymbolText), sizeof aubSymbolText, format, ap);
    va_end(ap);
    if (n < 0) n = 0;
    if (static_cast<size_t>(n) >= sizeof aubSymbolText) n = sizeof aubSymbolText - 1;
    stSymbolResult = {MAA_RESULT_CONTINUE, result, static_cast<U32>(n), aubSymbolText};
    MAA_IF_WriteResult(&stSymbolResult);
}

}  // namespace

U8 *MAA_Strdup(const char *pubText) {
    size_t len = std::strlen(pubText);
    auto *pubNew = static_cast<U8 *>(MAA_Alloc(static_cast<U32>(len + 1)));
    if (pubNew != nullptr) std::memcpy(pubNew, pubText, len + 1);
    return pubNew;
}

TSymbol *MAA_SymbolAdd(TMAATarget fMaaTarget, const char *pubName, U32 ulType, U32 ulAddress, U8 ubPramCount) {
    USBADP_LOG(DEBUG, "\r\n Add Symbol Start:%s", pubName ? pubName : "");
    TSymbolNode *node = newNode(fMaaTarget, pubName, ulType, ulAddress, ubPramCount);
    if (node == nullptr) return nullptr;
    node->pstNext = pstRoot;
    pstRoot = node;
    USBADP_LOG(DEBUG, "\r\n Add Symbol End");
    return node->pstSymbol;
}

TSymbol *MAA_SymbolAddGeneral(TMAATarget fMaaTarget, const char *pubName, U32 ulType, U32 ulAddress,
                              U8 ubPramCount) {
    USBADP_LOG(DEBUG, "\r\n Add General Symbol Start:%s", pubName ? pubName : "");
    TSymbolNode *node = newNode(fMaaTarget, pubName, ulType, ulAddress, ubPramCount);
    if (node == nullptr) return nullptr;
    if (pstRootGeneral != nullptr) freeNode(pstRootGeneral);
    pstRootGeneral = node;
    USBADP_LOG(DEBUG, "\r\n Add Symbol End");
    return node->pstSymbol;
}

TSymbol *MAA_SymbolFind(const char *pubName) {
    if (pubName == nullptr) return nullptr;
    USBADP_LOG(DEBUG, "\r\n MAA_SymbolFind pubName [%s]", pubName);
    for (TSymbolNode *n = pstRoot; n != nullptr; n = n->pstNext) {
        if (std::strcmp(reinterpret_cast<const char *>(n->pstSymbol->pubName), pubName) == 0) return n->pstSymbol;
    }
    return nullptr;
}

TSymbol *MAA_SymbolFindAddress(U32 ulAddress) {
    for (TSymbolNode *n = pstRoot; n != nullptr; n = n->pstNext) {
        if (n->pstSymbol->ulAddress == ulAddress) return n->pstSymbol;
    }
    return nullptr;
}

U32 MAA_GetGeneralSymbol() { return pstRootGeneral ? pstRootGeneral->pstSymbol->ulAddress : 0; }

TSymbol *MAA_GetGeneralSymbolEntry() { return pstRootGeneral ? pstRootGeneral->pstSymbol : nullptr; }

void MAA_SymbolPrint(const TSymbol *pstSymbol) {
    if (pstSymbol == nullptr) return;
    if (pstSymbol->ulType == MAA_SYM_FUNC) USBADP_LOG(INFO, "\r\nFUNC ");
    else if (pstSymbol->ulType == MAA_SYM_DATA) USBADP_LOG(INFO, "\r\nDATA ");
    else USBADP_LOG(INFO, "\r\nunknown(%d) ", static_cast<int>(pstSymbol->ulType));
    USBADP_LOG(INFO, "\r\nvalue = 0x%x", pstSymbol->ulAddress);
}

TMAAResult *MAA_SymbolDump() {
    static const char kRule[] = "======================================";
    sendLine(0, "%s", kRule);
    sendLine(0, "%s", "|                    Symbol Name                 ");
    sendLine(0, "%s", kRule);
    int count = 0;
    for (TSymbolNode *n = pstRoot; n != nullptr; n = n->pstNext) {
        const TSymbol *sym = n->pstSymbol;
        if (sym->ulType == MAA_SYM_FUNC_HIDE) continue;
        ++count;
        if (sym->ulType == MAA_SYM_FUNC) sendLine(0, "   %s  ", reinterpret_cast<const char *>(sym->pubName));
        else USBADP_LOG(INFO, "unknown(%d) ", static_cast<int>(sym->ulType));
    }
    sendLine(0, "%s", kRule);
    sendLine(1, "The Number Of Symbol : %d ", count);
    stSymbolResult = {MAA_RESULT_END, 1, 0, aubSymbolText};
    return &stSymbolResult;
}

bool MAA_SymbolDefine(TSymbol *pstSymbol) {
    auto *cell = static_cast<Cell *>(MAA_Alloc(sizeof(Cell)));
    if (cell == nullptr) return false;
    std::memset(cell->aubData, 0, sizeof cell->aubData);
    cell->ulAddress = MAA_AddrMap(cell->aubData, sizeof cell->aubData);
    if (cell->ulAddress == 0) {
        MAA_Free(cell);
        return false;
    }
    cell->pstNext = pstCells;
    pstCells = cell;
    pstSymbol->ulAddress = cell->ulAddress;
    pstSymbol->ulType = MAA_SYM_DATA;
    return true;
}

void MAA_SymbolClear() {
    while (pstRoot != nullptr) {
        TSymbolNode *next = pstRoot->pstNext;
        freeNode(pstRoot);
        pstRoot = next;
    }
    if (pstRootGeneral != nullptr) freeNode(pstRootGeneral);
    pstRootGeneral = nullptr;
    while (pstCells != nullptr) {
        Cell *next = pstCells->pstNext;
        MAA_AddrUnmap(pstCells->ulAddress);
        MAA_Free(pstCells);
        pstCells = next;
    }
}
