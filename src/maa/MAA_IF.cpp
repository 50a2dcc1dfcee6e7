#include "maa/MAA_IF.h"

#include <sys/msg.h>

#include <cerrno>
#include <cstring>

#include "common/Log.h"
#include "maa/MAA_MM.h"
#include "maa/MAA_Result.h"
#include "maa/MAA_Symbol.h"

TMAASpecialMode enSpecialMode = MAA_NORMAL_CMD;
int ulMAAMsgQueueID = -1;

const U8 *pub_MaaCmdStr = nullptr;
U8 pub_MaaCmdName[256];

namespace {
TMAAResultWriter pfnResultWriter = nullptr;
}

void MAA_SetResultWriter(TMAAResultWriter pfnWriter) { pfnResultWriter = pfnWriter; }

void MAA_WriteResult(TMAAResult *pstMAAResult) {
    if (enSpecialMode == MAA_JIG_RUN_CMD || enSpecialMode == MAA_AUTO_RUN_CMD) return;
    if (pstMAAResult != nullptr && pfnResultWriter != nullptr) pfnResultWriter(pstMAAResult);
}

void MAA_IF_WriteResult(TMAAResult *pstMAAResult) { MAA_WriteResult(pstMAAResult); }

void MAA_IF_SkipResult(void) {
    static TMAAResult stSkip;
    stSkip = {MAA_RESULT_CONTINUE, 0, 0, nullptr};
    USBADP_LOG(INFO, "\r\n[MAA]Skip response");
    MAA_WriteResult(&stSkip);
}

void MAA_IF_WriteFile(const U8 *pubFileBuffer, U32 ulFileSize) { MAA_WriteFile(pubFileBuffer, ulFileSize); }

void MAA_IF_FileEnd(void) { MAA_FileEnd(); }

void *MAA_IF_HeapAlloc(U32 ulSize, U32 ulPool) { return MAA_HeapAlloc(ulSize, ulPool); }
void MAA_IF_HeapFree(void *pvPtr, U32 ulPool) { MAA_HeapFree(pvPtr, ulPool); }
void *MAA_IF_SegAlloc(U32 ulSize, U32 ulPool) { return MAA_SegAlloc(ulSize, ulPool); }
void MAA_IF_SegFree(void *pvPtr, U32 ulPool) { MAA_SegFree(pvPtr, ulPool); }

void MAA_IF_SymbolAdd(TMAATarget fMaaTarget, const char *pubName, U32 ulType, U32 ulAddress, U8 ubPramCount) {
    MAA_SymbolAdd(fMaaTarget, pubName, ulType, ulAddress, ubPramCount);
}

TSymbol *MAA_IF_SymbolFind(const char *pubName) { return MAA_SymbolFind(pubName); }

void MAA_IF_SymbolPrint(const TSymbol *pstSymbol) { MAA_SymbolPrint(pstSymbol); }

void MAA_IF_SendMessage(U32 ulMsg1, U32 ulMsg2, U32 ulMsg3, U32 ulMsg4) {
    USBADP_LOG(INFO, "\r\n[MAA] SendMessage Msg1: %x, Msg2: %x, Msg3: %x, Msg4: %x ", ulMsg1, ulMsg2, ulMsg3, ulMsg4);
    struct {
        long mtype;
        U32 aulText[4];
    } msg = {static_cast<long>(ulMsg1), {ulMsg2, ulMsg3, ulMsg4, 0}};
    static_assert(sizeof msg.aulText == 16);
    if (msgsnd(ulMAAMsgQueueID, &msg, sizeof msg.aulText, IPC_NOWAIT) != 0) {
        USBADP_LOG(ERROR, "\r\n MAA Send Message Fail");
    }
}

void MAA_SetCmdString(const U8 *pubText) {
    pub_MaaCmdStr = pubText;
    USBADP_LOG(FINE, "[MAACmdStr] %s\n", pubText ? reinterpret_cast<const char *>(pubText) : "");
}

void MAA_SetCmdName(const U8 *pubName) {
    const char *name = pubName ? reinterpret_cast<const char *>(pubName) : "";
    std::strncpy(reinterpret_cast<char *>(pub_MaaCmdName), name, sizeof pub_MaaCmdName - 1);
    pub_MaaCmdName[sizeof pub_MaaCmdName - 1] = 0;
    USBADP_LOG(FINE, "[MAACmdName] %s\n", name);
}
