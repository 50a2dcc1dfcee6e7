// The shell's message queue.
#include <sys/ipc.h>
#include <sys/msg.h>

#include "maa/ShellFixture.h"

namespace maatest {
namespace {

using Memory = ShellTest;

TEST_F(Memory, SendMessagePostsSixteenBytesOnTheShellQueueAndAFailureIsOnlyLogged) {
    int queue = msgget(IPC_PRIVATE, IPC_CREAT | 0600);
    ASSERT_GE(queue, 0);
    ulMAAMsgQueueID = queue;
    MAA_IF_SendMessage(7, 0x11, 0x22, 0x33);
    struct { long mtype; U32 text[8]; } msg{};
    ssize_t n = msgrcv(queue, &msg, sizeof msg.text, 0, IPC_NOWAIT);
    msgctl(queue, IPC_RMID, nullptr);
    ulMAAMsgQueueID = -1;
    ASSERT_EQ(n, 16);
    EXPECT_EQ(msg.mtype, 7);
    EXPECT_EQ(std::vector<U32>(msg.text, msg.text + 4), (std::vector<U32>{0x11, 0x22, 0x33, 0}));
    EXPECT_EQ(LoggerHost_Count("\r\n[MAA] SendMessage Msg1: 7, Msg2: 11, Msg3: 22, Msg4: 33 "), 1);

    MAA_IF_SendMessage(1, 2, 3, 4);
    EXPECT_EQ(LoggerHost_Count("\r\n MAA Send Message Fail"), 1);
}

}  // namespace
}  // namespace maatest
