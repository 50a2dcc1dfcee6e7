// What the shell writes back: result and transfer frames write by write (a
// packet socket keeps each write apart), Dump_File, and the start-up files.
#include <sys/msg.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <cstdio>
#include <thread>

#include "support/TempRoot.h"
#include "adapter/prn_thread.h"
#include "maa_session/SessionFixture.h"

namespace maasession {
namespace {

// Runs `body` in a child that a hang cannot outlive (it is killed after
// `seconds`); the child's exit code, or -1 when it did not exit by itself.
int InChild(const std::function<int()> &body, unsigned seconds) {
    const pid_t pid = ::fork();
    if (pid == 0) {
        ::alarm(seconds);
        std::_Exit(body());
    }
    int status = 0;
    if (pid < 0 || ::waitpid(pid, &status, 0) != pid) return -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

class ResultTest : public maatest::ShellBase {
protected:
    void SetUp() override {
        ShellBase::SetUp();
        ASSERT_GE(channel.device, 0);
        ulDrvHandle = static_cast<U32>(channel.device);
        MAA_SetResultWriter(&MAA_WriteResultFrame);
    }
    PacketChannel channel;
};

TEST_F(ResultTest, FramesAndTheirWrites) {
    static std::string hello = "hello", file = Pattern(10000), mixed, cut, forwarded;
    mixed = Frame(0, 1, "abc") + Transfer(MAA_FILE_TRANS_T2H, 5000) + file.substr(0, 5000) + Transfer(MAA_FILE_END, 0) +
            Transfer(MAA_FILE_TRANS_T2H, 5) + Frame(1, 1, "");
    cut = Frame(1, 0, std::string(100, 'x')).substr(0, 17);
    forwarded = Frame(1, 2, "xy");
    auto text = [](std::string &s) { return reinterpret_cast<U8 *>(s.data()); };
    auto size = [](const std::string &s) { return static_cast<U32>(s.size()); };
    auto Forward = [&](std::string &s) {
        TMAAResult r{MAA_RESULT_CONTINUE, 0, size(s), text(s)};
        MAA_WriteResultForward(&r);
    };
    struct Row { const char *name; std::function<void()> action; std::vector<std::string> writes; } rows[] = {
        {"result without data", [] { TMAAResult r{MAA_RESULT_END, 7, 0, nullptr}; MAA_WriteResult(&r); },
         {Frame(1, 7, "")}},
        {"result with text", [&] { TMAAResult r{MAA_RESULT_CONTINUE, 0, 5, text(hello)}; MAA_IF_WriteResult(&r); },
         {Frame(0, 0, hello).substr(0, 12), hello}},
        {"skip", [] { MAA_IF_SkipResult(); }, {std::string(12, '\0')}},
        {"file end", [] { MAA_IF_FileEnd(); }, {Transfer(0xA0, 0)}},
        {"file of 10000 bytes", [&] { MAA_IF_WriteFile(text(file), size(file)); },
         {Transfer(1, 10000), file.substr(0, 4096), file.substr(4096, 4096), file.substr(8192)}},
        {"scanner file", [&] { MAA_Scanner_WriteFile(text(file), 5000); },
         {file.substr(0, 4096), file.substr(4096, 904)}},
        {"forwarded frames", [&] { Forward(mixed); },
         {mixed.substr(0, 12), "abc", Transfer(1, 5000), file.substr(0, 4096), file.substr(4096, 904),
          Transfer(0xA0, 0), Transfer(1, 5), Frame(1, 1, "")}},
        {"forwarded frame cut short", [&] { Forward(cut); }, {cut.substr(0, 12), "xxxxx"}},
        {"file forward", [&] { MAA_WriteFileForward(text(forwarded), size(forwarded)); },
         {forwarded.substr(0, 12), "xy"}},
        {"acknowledgement", [] { MAA_ResponseOK(); }, {kAck}},
        {"auto run",
         [&] {
             enSpecialMode = MAA_AUTO_RUN_CMD;
             TMAAResult r{MAA_RESULT_END, 1, 5, text(hello)};
             MAA_WriteResult(&r);
             MAA_IF_SkipResult();
             Forward(forwarded);
         },
         {}},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.name);
        r.action();
        EXPECT_EQ(channel.Writes(), r.writes);
    }
}

TEST_F(ResultTest, PulledCableIsLoggedNeverFatal) {
    IsDisconnected = 1;
    TMAAResult r{MAA_RESULT_END, 1, 2, reinterpret_cast<U8 *>(const_cast<char *>("ok"))};
    MAA_WriteResult(&r);
    MAA_ResponseOK();
    EXPECT_EQ(MAA_SendCmdToHost(0, MAA_FILE_END), 0u);
    EXPECT_TRUE(channel.Writes().empty());
    EXPECT_EQ(LoggerHost_Count("\r\n[MAA:MAA_WriteResult1] Cable Disconnected during MAA_WriteResult"), 1);
    EXPECT_EQ(LoggerHost_Count("\r\n[MAA:MAA_WriteResult2] Cable Disconnected during MAA_WriteResult"), 1);
    EXPECT_EQ(LoggerHost_Count("\r\n[MAA:MAA_ResponseOK] Cable Disconnected during MAA_ResponseOK"), 1);
}

TEST_F(ResultTest, DumpFileSendsLinesUntilTheFirstEmptyOne) {
    TempRoot root;
    std::string path = "/halvard/dump.txt";
    const U32 address = MAA_AddrMap(path.data(), static_cast<U32>(path.size() + 1));
    struct Row {
        const char *name;
        const char *content;  // nullptr: no such file
        std::vector<std::string> lines;
        U32 result;
        std::string last;
    } rows[] = {
        {"empty line ends it", "one\ntwo\n\nthree\n", {"one", "two"}, 1, "File Read Complete : /halvard/dump.txt"},
        {"no final line feed", "alpha\nbeta", {"alpha", "beta"}, 1, "File Read Complete : /halvard/dump.txt"},
        {"empty file", "", {}, 1, "File Read Complete : /halvard/dump.txt"},
        {"no file", nullptr, {}, 0, "File Open Error /halvard/dump.txt"},
    };
    for (const Row &r : rows) {
        SCOPED_TRACE(r.name);
        std::remove((root / path).c_str());
        if (r.content) std::ofstream(root / path) << r.content;
        TMAAResult *res = Dump_File(address);
        std::vector<std::string> want;
        for (const std::string &l : r.lines) want.insert(want.end(), {Frame(0, 0, l).substr(0, 12), l});
        EXPECT_EQ(channel.Writes(), want);
        ASSERT_NE(res, nullptr);
        EXPECT_EQ(Of(res), End(r.last, r.result));
    }
}

TEST_F(ResultTest, DumpFileRefusesWhatIsNoTextFileAndStopsWhenTheHostIsGone) {
    TempRoot root;
    // An endless device and a pipe nobody writes: the answer is the open error,
    // at once. Each runs in a child that a hang cannot outlive.
    std::filesystem::create_symlink("/dev/zero", root / "/halvard/zero");
    ASSERT_EQ(::mkfifo((root / "/halvard/fifo").c_str(), 0600), 0);
    for (std::string path : {"/halvard/zero", "/halvard/fifo"}) {
        SCOPED_TRACE(path);
        const U32 address = MAA_AddrMap(path.data(), static_cast<U32>(path.size() + 1));
        EXPECT_EQ(InChild([&] { return Of(Dump_File(address)) == End("File Open Error " + path, 0) ? 0 : 1; }, 5), 0)
            << "-1: still dumping after 5 s, 1: not answered with the open error";
        EXPECT_TRUE(channel.Writes().empty());
        MAA_AddrUnmap(address);
    }

    // A long file for a host that has gone: the dump stops instead of reading on.
    std::string path = "/halvard/long.txt";
    {
        std::ofstream out(root / path);
        for (int i = 0; i < 1000; ++i) out << "line " << i << "\n";
    }
    IsDisconnected = 1;
    Dump_File(MAA_AddrMap(path.data(), static_cast<U32>(path.size() + 1)));
    EXPECT_EQ(LoggerHost_Count("\r\n[MAA] Dump_File: cable disconnected, dump stopped"), 1);
    EXPECT_TRUE(channel.Writes().empty());
}

TEST(StartUp, UsbSpeedFileGetsHighWithoutTruncation) {
    LoggerHost_StartCapture();
    {
        TempRoot root;
        const std::string file = root / "/halvard/sys/statusinfo/usb_speed.txt";
        MAA_DummyUsbSpeed();
        EXPECT_EQ(ReadFile(file), "HIGH");
        std::ofstream(file) << "ABCDEFGH";
        MAA_DummyUsbSpeed();
        EXPECT_EQ(ReadFile(file), "HIGHEFGH");
        std::filesystem::remove_all(root / "/halvard/sys");
        MAA_DummyUsbSpeed();
        EXPECT_EQ(LoggerHost_Count("\r\n[MAA] usb_speed.txt open failed"), 1);
    }
    LoggerHost_StopCapture();
}

TEST(StartUp, SerialStringIsFollowedByTheModelSeries) {
    TempRoot root;
    const std::string file = root / "/halvard/sys/statusinfo/usb_version.txt";
    std::ofstream(file) << "an older and much longer line than the new one";
    MAA_WriteSerialString("ABC123");
    std::string text = ReadFile(file);
    ASSERT_EQ(text.size(), 6u + 16u);
    EXPECT_EQ(text.substr(0, 7), "ABC123\t");
    MAA_WriteSerialString(std::string(60, 'S').c_str());
    EXPECT_EQ(ReadFile(file), std::string(23, 'S') + text.substr(6)) << "the serial is cut, not the series";
}

// The stand-alone start: a queue of its own and the print reader on a new
// thread. Run in a child: the reader never ends.
TEST(StartUp, CompEntryOpensTheShellQueueAndStartsTheReader) {
    TempRoot root;
    const int status = InChild([&] {
        const bool existed = ::msgget(1234, 0) >= 0;
        int code = MAA_CompEntry(0) == 1 ? 0 : 1;
        for (int i = 0; i < 500 && !startreading_enter; ++i) std::this_thread::sleep_for(std::chrono::milliseconds(10));
        if (!startreading_enter) code |= 2;
        if (ulMAAMsgQueueID < 0 || ulMAAMsgQueueID != ::msgget(1234, 0)) code |= 4;
        if (ReadFile(root / "/halvard/sys/statusinfo/usb_speed.txt") != "HIGH") code |= 8;
        if (!existed) ::msgctl(ulMAAMsgQueueID, IPC_RMID, nullptr);
        return code;
    }, 10);
    EXPECT_EQ(status, 0) << "-1 hung, 1 entry result, 2 reader, 4 queue, 8 usb_speed.txt";
}

}  // namespace
}  // namespace maasession
