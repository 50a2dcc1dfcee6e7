// Memory helpers: the tagged pool layout and the shell's message queue.
#include <sys/ipc.h>
#include <sys/msg.h>

#include <cstring>

#include "maa/MAA_MM.h"
#include "maa/ShellFixture.h"

namespace maatest {
namespace {

class Memory : public ShellTest {};

U32 wordAt(U32 offset) {
    U32 v;
    std::memcpy(&v, stPoolTable.pubPool_Addr + offset, 4);
    return v;
}

TEST_F(Memory, InitMemLaysOutGuardsAroundOneFreeBlock) {
    std::memset(abDmMemPool, 0xA5, sizeof abDmMemPool);
    MAA_InitMem();
    ASSERT_EQ(reinterpret_cast<uintptr_t>(stPoolTable.pubPool_Addr) % 4, 0u);
    U32 size = stPoolTable.ulPoolSize;
    EXPECT_EQ(stPoolTable.pubPool_Addr + size, abDmMemPool + MAA_MEM_POOL_SIZE);
    EXPECT_EQ(wordAt(0), IN_USE | 4);
    EXPECT_EQ(wordAt(4), FREE | (size - 8));
    TFreeBufDesc *desc = stPoolTable.pstFree_Bufs;
    ASSERT_NE(desc, nullptr);
    EXPECT_EQ(desc->pstTag, reinterpret_cast<TBufferTag *>(stPoolTable.pubPool_Addr + 4));
    EXPECT_EQ(desc->pstNextFree, nullptr);
    EXPECT_EQ(desc->pstLastFree, FREE_BUF_HEAD);
    EXPECT_EQ(wordAt(size - 8), size - 8);
    EXPECT_EQ(wordAt(size - 4), IN_USE | 4);
    EXPECT_EQ(wordAt(size / 2), 0u);  // zeroed
}

TEST_F(Memory, SendMessagePostsSixteenBytesOnTheShellQueue) {
    int queue = msgget(IPC_PRIVATE, IPC_CREAT | 0600);
    ASSERT_GE(queue, 0);
    ulMAAMsgQueueID = queue;
    MAA_IF_SendMessage(7, 0x11, 0x22, 0x33);
    struct {
        long mtype;
        U32 text[8];
    } msg{};
    ssize_t n = msgrcv(queue, &msg, sizeof msg.text, 0, IPC_NOWAIT);
    msgctl(queue, IPC_RMID, nullptr);
    ulMAAMsgQueueID = -1;
    ASSERT_EQ(n, 16);
    EXPECT_EQ(msg.mtype, 7);
    EXPECT_EQ(msg.text[0], 0x11u);
    EXPECT_EQ(msg.text[1], 0x22u);
    EXPECT_EQ(msg.text[2], 0x33u);
    EXPECT_EQ(msg.text[3], 0u);
    EXPECT_EQ(LoggerHost_Count("\r\n[MAA] SendMessage Msg1: 7, Msg2: 11, Msg3: 22, Msg4: 33 "), 1);
}

TEST_F(Memory, ASendFailureIsLoggedAndTheShellGoesOn) {
    ulMAAMsgQueueID = -1;
    MAA_IF_SendMessage(1, 2, 3, 4);
    EXPECT_EQ(LoggerHost_Count("\r\n MAA Send Message Fail"), 1);
}

TEST_F(Memory, SegmentsAreUnsupported) {
    EXPECT_EQ(MAA_IF_SegAlloc(16, 0), nullptr);
    EXPECT_TRUE(LoggerHost_Contains("pubAllocAddr"));
    void *p = MAA_IF_HeapAlloc(16, 0x1234);
    EXPECT_NE(p, nullptr);
    MAA_IF_HeapFree(p, 0);
}

}  // namespace
}  // namespace maatest
