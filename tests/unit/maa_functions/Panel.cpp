// The operator-panel tests against a real UI-server peer on loopback: the bytes
// the server receives and the records the host receives (the lines written at
// once, then the returned record, which the shell writes too).
#include <chrono>
#include <cstdlib>
#include <filesystem>

#include "UiPeer.h"
#include "maa_functions/FnFixture.h"

namespace fntest {
namespace {

const std::string kAddressFile = "/root/Halvard/osgi/socketAddress.prop";

class Panel : public FnTest {
protected:
    void SetUp() override {
        FnTest::SetUp();
        MAA_PanelSetWaits(2000, 2000, 2000);
        std::filesystem::create_directories(root / "/root/Halvard/osgi");
        writeAddress("127.000.000.001");  // inet_addr reads the zeros as octal: 127.0.0.1
    }
    void TearDown() override {
        ::unsetenv("USBADAPTER_UI_PORT");
        FnTest::TearDown();
    }

    void writeAddress(const std::string &text) { std::ofstream(root / kAddressFile, std::ios::binary) << text; }
    static void usePort(uint16_t port) { ::setenv("USBADAPTER_UI_PORT", std::to_string(port).c_str(), 1); }
};

// Each registered name, called through the shell, which writes the returned
// record. Without an answer (the server closes, or holds the connection past
// the answer wait) the header is the last record.
TEST_F(Panel, ClientTestsSendTheirRequestAndMapTheAnswer) {
    struct Answer {
        std::string answer;  // "": nothing is sent
        std::string final;   // the final record; "": the header again
        bool hold = false;   // the connection is kept open without an answer
    };
    struct Case { const char *line; std::string request, header; std::vector<Answer> answers; } cases[] = {
        {"UISSM_MAA_KeyInTest(5)", std::string("1\x05", 2), "[ UISSM_IF_KeyInTest : Argument=5 ]",
         {{"9", "KEY TEST DONE"}, {"x9", "KEY TEST FAIL"}}},
        {"UISSM_MAA_LED_Test(1)", "2\x01", "[ UISSM_IF_LED_Test : Argument=1 ]",
         {{"9", "LED TEST DONE"}, {"1", "LED TEST FAIL"}}},
        {"UISSM_MAA_Key_WaitTest()", "3", "[ UISSM_IF_Key_WaitTest ]",
         {{"9", "WAIT TEST DONE"}, {"3", "WAIT TEST FAIL"}, {"", ""}}},
        {"UISSM_MAA_Key_LCD_Test()", "4", "[ UISSM_IF_Key_LCD_Test ]",
         {{"9", "LCD TEST DONE"}, {"0", "LCD TEST FAIL"}}},
        {"UISSM_MAA_CountrySkip()", "5", "[ UISSM_MAA_CountrySkip ]",
         {{"9", "COUNTRY SKIP DONE"}, {"x", "COUNTRY SKIP FAIL"}}},
        {"UISSM_MAA_TrayConfirmSkip()", "6", "[ UISSM_MAA_TrayConfirmSkip ]",
         {{"9", "TRAY CONFIRM SKIP DONE"}, {"x", "TRAY CONFIRM SKIP FAIL"}}},
        {"SPI_Set_UI_Power_Save(1)", "7", "[ SPI_Set_UI_Power_Save : Argument=1 ]",
         {{"9", "SPI_Set_UI_Power_Save DONE"}}},
        {"SPI_Set_UI_Power_Save(0)", "8", "[ SPI_Set_UI_Power_Save : Argument=0 ]",
         {{"x", "SPI_Set_UI_Power_Save FAIL"}}},
        {"SPI_Set_UI_Power_Save(2)", std::string(1, '\0'), "[ SPI_Set_UI_Power_Save : Argument=2 ]",
         {{"9", "SPI_Set_UI_Power_Save DONE"}}},  // any other: one zero byte
        {"UISSM_MAA_TSPCalibration_Result(0)", "0", "[ UISSM_MAA_TSPCalibration_Result : Argument=0 ]",
         {{"9", "UISSM_MAA_TSPCalibration_Result DONE"}, {"1", "Result= OK"}, {"2", "Result= NG"}}},
        {"UISSM_MAA_TSPCalibration_Result(7)", std::string(1, '\0'), "[ UISSM_MAA_TSPCalibration_Result : Argument=7 ]",
         {{"3", "UISSM_MAA_TSPCalibration_Result FAIL"}}},
        {"PbaMode_UI_Data_clear()", "9", "[ PbaMode_UI_Data_clear ]", {{"9", "UI Clear = OK"}, {"8", "UI Clear = NG"}}},
        {"SPI_Get_UI()", "A", "[ SPI_Get_UI ]",
         {{"1", "SPI_Get_UI = OLD"}, {"2", "SPI_Get_UI = NEW"}, {"9", "SPI_Get_UI = FAIL"},  // 9 is no success here
          {"", "", true}}},
        {"SPI_Set_UI_Reboot()", "B", "[ SPI_Set_UI_Reboot ]", {{"9", "UI Reboot = OK"}, {"x", "UI Reboot = FAIL"}}},
        {"UISSM_MAA_Set_KeySound(0)", std::string("C\0", 2), "[ UISSM_MAA_Set_KeySound : Argument = 0 ]",
         {{"9", "Key Sound On = OK"}, {"1", "Key Sound On = NG"}, {"", ""}}},  // 0 is on
        {"UISSM_MAA_Set_KeySound(1)", "C\x01", "[ UISSM_MAA_Set_KeySound : Argument = 1 ]",
         {{"9", "Key Sound Off = OK"}, {"0", "Key Sound Off = NG"}}},
        // Neither on nor off: answers are read past until the server closes.
        {"UISSM_MAA_Set_KeySound(2)", "C\x02", "[ UISSM_MAA_Set_KeySound : Argument = 2 ]", {{"9", ""}}},
        {"UISSM_MAA_MIC_Test()", "D", "[ UISSM_MAA_MIC_Test ]", {{"9", "MIC TEST DONE"}, {"x", "MIC TEST FAIL"}}},
        {"UISSM_MAA_HAPTIC(0x1FF)", "E\xFF", "[ UISSM_MAA_HAPTIC : Argument=511 ]",
         {{"9", "HAPTIC TEST DONE"}, {"x", "HAPTIC TEST FAIL"}}},  // the argument's low byte
        {"UISSM_MAA_Speaker(0xFFFFFFFF)", "F\xFF", "[ SPI_Set_Speaker_Test : Argument=-1 ]",
         {{"9", "[SPI_Set_Speaker_Test] DONE"}, {"x", "[SPI_Set_Speaker_Test] FAIL"}}},  // the fax speaker test's name
        {"UISSM_MAA_USB_Test()", "G", "[ UISSM_MAA_USB_Test ]", {{"9", "OK"}, {"x", "NG"}}},
    };
    for (const Case &c : cases) {
        for (const Answer &a : c.answers) {
            SCOPED_TRACE(std::string(c.line) + " answered " + a.answer + (a.hold ? " holding" : ""));
            uipeer::Server server(a.hold ? uipeer::Scripted({{a.answer, true}}) : uipeer::AnswerAll(a.answer));
            ASSERT_TRUE(server.ok());
            usePort(server.port());
            const auto start = std::chrono::steady_clock::now();
            EXPECT_EQ(HostSees(c.line), (Recs{Cont(c.header), a.final.empty() ? Cont(c.header) : End(a.final)}));
            // Not the operator's minutes.
            EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(10));
            ASSERT_TRUE(server.awaitServed(1, 2000));
            EXPECT_EQ(server.requests(), std::vector<std::string>{c.request});
        }
    }
}

TEST_F(Panel, TheAddressComesFromItsFileElseTheDefault) {
    // The peer listens on 127.0.0.1 only: any other address finds nobody.
    struct Case {
        const char *name;
        const char *file;  // nullptr: no file
        bool reached;
        const char *logged;  // the address a failed connect names
    } cases[] = {
        {"missing file: the default", nullptr, false, "127.254.254.253"},
        {"leading zeros", "127.000.000.001", true, nullptr},
        {"only 15 bytes are read", "127.000.000.001:8080", true, nullptr},
        {"a shorter address", "127.0.0.1\n", true, nullptr},
        {"not an address", "panel.local", false, "panel.local"},
    };
    uipeer::Server server(uipeer::AnswerAll("9"));
    ASSERT_TRUE(server.ok());
    usePort(server.port());
    size_t served = 0;
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        std::filesystem::remove(root / kAddressFile);
        if (c.file) writeAddress(c.file);
        LoggerHost_StartCapture();
        const auto records = HostSees("UISSM_MAA_USB_Test()");
        LoggerHost_StopCapture();
        if (c.reached) {
            EXPECT_EQ(records.back(), End("OK"));
            EXPECT_TRUE(server.awaitServed(++served, 2000));
        } else {
            EXPECT_EQ(records, (Recs{Cont("[ UISSM_MAA_USB_Test ]"), End("Connect To UIServer Fails")}));
            EXPECT_TRUE(LoggerHost_Contains(c.logged));
        }
    }
    EXPECT_EQ(server.requests().size(), served);
}

TEST_F(Panel, ListeningTestsAcceptOnlyAnAnswerBeginningWithTheirCommand) {
    struct Case {
        const char *line;
        std::vector<std::string> answers;
        Recs records;
        std::string peerReceived;  // the command, then '3' padded to the answer's length
    } cases[] = {
        {"UISSM_MAA_KeyInTest_pelmar()", {"2", "x", "1ab"}, {Cont("[ UISSM_IF_KeyInTest ]"), End("KEY TEST DONE")},
         std::string("13\0\0", 4)},
        {"UISSM_MAA_LED_Test_pelmar()", {"2"}, {Cont("[ UISSM_IF_LED_Test ]"), End("LED TEST DONE")}, "23"},
        {"UISSM_MAA_KeyInTest_pelmar()", {}, {Cont("[ UISSM_IF_KeyInTest ]"), Cont("[ UISSM_IF_KeyInTest ]")}, "1"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.line);
        const uint16_t port = uipeer::FreePort();
        ASSERT_NE(port, 0);
        usePort(port);
        uipeer::Client peer(c.answers, port);
        EXPECT_EQ(HostSees(c.line), c.records);
        peer.join();
        EXPECT_TRUE(peer.connected());
        EXPECT_EQ(peer.received(), c.peerReceived);
    }
}

TEST_F(Panel, ListeningTestsNameTheStepThatFailedAndSetUIEnableNeedsThePrintService) {
    // Nobody connects in time.
    MAA_PanelSetWaits(2000, 50, 2000);
    usePort(uipeer::FreePort());
    EXPECT_EQ(HostSees("UISSM_MAA_LED_Test_pelmar()"),
              (Recs{Cont("[ UISSM_IF_LED_Test ]"), End("Accept from UIServer Fails")}));
    // The port is taken by a listener.
    uipeer::Server other(uipeer::AnswerAll("9"));
    ASSERT_TRUE(other.ok());
    usePort(other.port());
    EXPECT_EQ(HostSees("UISSM_MAA_KeyInTest_pelmar()"),
              (Recs{Cont("[ UISSM_IF_KeyInTest ]"), End("Bind To UIServer Fails")}));
    EXPECT_EQ(HostSees("SetUIEnable()"), (Recs{Cont("[ SetUIEnable ]"), End("Failed")}));
}

}  // namespace
}  // namespace fntest
