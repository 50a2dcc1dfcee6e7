// The logging macros as the platform logger sees them, the fixed-path helper,
// and host bytes on their way into a Java string: NewStringUTF takes modified
// UTF-8 only, and a USB host sends whatever it likes.
#include <stdlib.h>

#include <string>
#include <thread>

#include <gtest/gtest.h>

#include "LoggerHost.h"
#include "common/FixedPath.h"
#include "common/JniUtil.h"
#include "common/Log.h"

namespace {

TEST(JniHostText, WellFormedTextIsKeptAndEveryStrayByteBecomesAQuestionMark) {
    struct Case {
        std::string in, out;
    } cases[] = {
        {"GetData(1,\"a b\")", "GetData(1,\"a b\")"},
        {"", ""},
        {"caf\xC3\xA9 \xE2\x82\xAC", "caf\xC3\xA9 \xE2\x82\xAC"},                 // 2- and 3-byte characters
        {"\xF0\x9F\x98\x80", "\xED\xA0\xBD\xED\xB8\x80"},                         // U+1F600 as a surrogate pair
        {"\xFF\xFE", "??"},                                                       // never a lead byte
        {"\x80x", "?x"},                                                          // continuation without lead
        {"\xC3", "?"},                                                            // cut by the end of the text
        {"\xE2\x82", "??"},                                                       // each stray byte on its own
        {"\xC0\x80", "??"},                                                       // an overlong NUL
        {"\xE0\x80\xAF", "???"},                                                  // an overlong '/'
        {"\xF4\x90\x80\x80", "????"},                                             // above U+10FFFF
        {"\xC3(", "?("},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.in);
        EXPECT_EQ(JNI_HostTextToModifiedUtf8(c.in.c_str()), c.out);
    }
    EXPECT_EQ(JNI_HostTextToModifiedUtf8(nullptr), "");
}

TEST(FixedPath, RootIsPrefixedWhenSetAndNotEmpty) {
    const struct {
        const char *root;  // null: unset
        const char *path, *out;
    } cases[] = {
        {nullptr, "/halvard/sys/statusinfo/usb_speed.txt", "/halvard/sys/statusinfo/usb_speed.txt"},
        {"/tmp/r/", "/proc/cpu_temp", "/tmp/r/proc/cpu_temp"},
        {"", "/proc/cpu_temp", "/proc/cpu_temp"},
    };
    for (const auto &c : cases) {
        if (c.root)
            ::setenv("USBADAPTER_ROOT", c.root, 1);
        else
            ::unsetenv("USBADAPTER_ROOT");
        EXPECT_EQ(FixedPath(c.path), c.out) << (c.root ? c.root : "(unset)");
    }
    ::unsetenv("USBADAPTER_ROOT");
}

TEST(Logging, MacroPassesLevelAndCallingFunction) {
    LoggerHost_StartCapture();
    USBADP_LOG(ERROR, "[USBAdp] value %d\n", 42);
    USBADP_LOG(DEBUG, "x");
    auto lines = LoggerHost_Captured();
    ASSERT_EQ(lines.size(), 2u);
    EXPECT_EQ(lines[0].level, 40000);
    EXPECT_EQ(lines[0].levelName, "ERROR");
    EXPECT_EQ(lines[0].text, "[USBAdp] value 42\n");
    EXPECT_EQ(lines[0].function, "TestBody");
    EXPECT_EQ(lines[1].level, 10000);
    EXPECT_EQ(lines[1].levelName, "DEBUG");
}

TEST(Logging, DeferredLinesArriveInOrderThroughTheSameLogger) {
    LoggerHost_StartCapture();
    for (long i = 0; i < 10; ++i) USBADP_LOG_ASYNC(INFO, "[USBAdp] n=%ld\n", i);
    Log_FlushDeferred();
    auto lines = LoggerHost_Captured();
    ASSERT_EQ(lines.size(), 10u);
    for (int i = 0; i < 10; ++i) EXPECT_EQ(lines[i].text, "[USBAdp] n=" + std::to_string(i) + "\n");
    EXPECT_EQ(lines[0].function, "TestBody");
}

TEST(Logging, FullDeferredQueueDropsAndCountsInsteadOfBlocking) {
    LoggerHost_StartCapture();
    const unsigned long before = Log_DeferredDropped();
    for (long i = 0; i < 1000; ++i) USBADP_LOG_ASYNC(INFO, "%ld\n", i);
    Log_FlushDeferred();
    const auto kept = LoggerHost_Captured().size();
    EXPECT_GT(kept, 0u);
    EXPECT_LT(kept, 1000u);
    EXPECT_EQ(kept + (Log_DeferredDropped() - before), 1000u);
}

TEST(Logging, WorkerPrintsDeferredLinesWithoutAFlush) {
    LoggerHost_StartCapture();
    Log_StartDeferredWorker();
    USBADP_LOG_ASYNC(INFO, "[USBAdp] from a handler %ld\n", 7L);
    for (int i = 0; i < 500 && !LoggerHost_Contains("from a handler 7"); ++i)
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    EXPECT_TRUE(LoggerHost_Contains("[USBAdp] from a handler 7\n"));
}

}  // namespace
