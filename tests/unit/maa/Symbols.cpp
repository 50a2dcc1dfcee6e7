// The symbol table: lookup order, the general function, printing and the dump
// records a host receives; and the shell's message queue.
#include <sys/ipc.h>
#include <sys/msg.h>

#include "maa/ShellFixture.h"

namespace maatest {
namespace {

class Symbols : public ShellTest {};

TEST_F(Symbols, TheNewestOfTwoEqualNamesIsFoundFirstAndEachKeepsItsOwnCopyOfTheName) {
    U32 first = MAA_FuncEntry<f0>(), second = MAA_FuncEntry<g0>();
    char name[] = "f";
    MAA_SymbolAdd(ftarget_ppc, name, MAA_SYM_FUNC_HIDE, first, 0);
    MAA_SymbolAdd(ftarget_ppc, "f", MAA_SYM_FUNC_HIDE, second, 0);
    name[0] = 'x';
    EXPECT_TRUE(LoggerHost_Contains("\r\n Add Symbol Start:f"));
    ASSERT_NE(MAA_SymbolFind("f"), nullptr);
    EXPECT_EQ(MAA_SymbolFind("f")->ulAddress, second);
    ASSERT_NE(MAA_SymbolFindAddress(first), nullptr);
    EXPECT_EQ(MAA_SymbolFindAddress(first)->ulAddress, first);
    EXPECT_STREQ(reinterpret_cast<const char *>(MAA_SymbolFindAddress(first)->pubName), "f");
    EXPECT_EQ(MAA_SymbolFindAddress(second)->ulAddress, second);
    EXPECT_EQ(MAA_SymbolFind("F"), nullptr);  // case-sensitive
    EXPECT_EQ(MAA_SymbolFind("f "), nullptr);  // whole names
    EXPECT_EQ(MAA_SymbolFindAddress(first + 4 * 100), nullptr);

    run("f()");
    ASSERT_EQ(calls.size(), 1u);
    EXPECT_EQ(calls[0].function, "g0");
}

TEST_F(Symbols, OneGeneralFunctionTheLaterReplacesTheEarlier) {
    EXPECT_EQ(MAA_GetGeneralSymbol(), 0u);
    MAA_SymbolAddGeneral(ftarget_ppc, "G1", MAA_SYM_FUNC_HIDE, 1111, 2);
    MAA_SymbolAddGeneral(ftarget_ppc, "MAA_GENERAL_FUNCTION", MAA_SYM_FUNC_HIDE, 2222, 2);
    EXPECT_EQ(MAA_GetGeneralSymbol(), 2222u);
    EXPECT_TRUE(LoggerHost_Contains("\r\n Add General Symbol Start:MAA_GENERAL_FUNCTION"));
    // Not part of the named list.
    EXPECT_EQ(MAA_SymbolFind("MAA_GENERAL_FUNCTION"), nullptr);
    EXPECT_EQ(MAA_SymbolFindAddress(2222), nullptr);
}

TEST_F(Symbols, PrintNamesTheKindAndTheEntry) {
    MAA_SymbolPrint(MAA_SymbolAdd(ftarget_ppc, "a", MAA_SYM_FUNC, 0x10, 0));
    MAA_SymbolPrint(MAA_SymbolAdd(ftarget_ppc, "b", MAA_SYM_DATA, 0x20, 0));
    MAA_SymbolPrint(MAA_SymbolAdd(ftarget_ppc, "c", MAA_SYM_FUNC_HIDE, 0x30, 0));
    std::vector<std::string> texts;
    for (const LoggedLine &l : LoggerHost_Captured()) {
        if (l.function == "MAA_SymbolPrint") texts.push_back(l.text);
    }
    EXPECT_EQ(texts, (std::vector<std::string>{"\r\nFUNC ", "\r\nvalue = 0x10", "\r\nDATA ", "\r\nvalue = 0x20",
                                               "\r\nunknown(4) ", "\r\nvalue = 0x30"}));
}

TEST_F(Symbols, TheDumpListsKindOneNamesAndCountsAllButKindFour) {
    U32 data = 0;
    MAA_SymbolAdd(ftarget_all, "MAA_SymbolDump", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<MAA_SymbolDump>(), 0);
    MAA_SymbolAdd(ftarget_ppc, "Pattern_Print", MAA_SYM_FUNC, MAA_FuncEntry<f2>(), 2);
    MAA_SymbolAdd(ftarget_ppc, "hidden", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<f0>(), 0);
    addData("counter", &data);
    MAA_SymbolAdd(ftarget_ppc, "SPI_Get_Log", MAA_SYM_FUNC, MAA_FuncEntry<g0>(), 0);

    EXPECT_EQ(run("MAA_SymbolDump()"), 0u);

    const std::string rule = "======================================";
    EXPECT_EQ(written, (Recs{Cont(rule, 0), Cont("|                    Symbol Name                 ", 0), Cont(rule, 0),
                             Cont("   SPI_Get_Log  ", 0), Cont("   Pattern_Print  ", 0), Cont(rule, 0),
                             Cont("The Number Of Symbol : 3 ", 1), End("", 1)}));
    EXPECT_TRUE(LoggerHost_Contains("unknown(2) "));
}

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
