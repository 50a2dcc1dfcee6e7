// The operator-panel tests against a real UI-server peer on loopback: the bytes
// the server receives and the records the host receives (the lines written at
// once, then the returned record, which the shell writes too).
#include <gtest/gtest.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>
#include <vector>

#include "LoggerHost.h"
#include "UiPeer.h"
#include "support/TempRoot.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_Panel.h"

namespace {

struct Record {
    U32 enContinue;
    std::string text;
    bool operator==(const Record &) const = default;
};
std::ostream &operator<<(std::ostream &os, const Record &r) {
    return os << (r.enContinue == MAA_RESULT_END ? "END " : "CONTINUE ") << '"' << r.text << '"';
}

std::vector<Record> written;
void capture(const TMAAResult *r) {
    written.push_back({r->enContinue, std::string(reinterpret_cast<const char *>(r->pubData),
                                                  r->pubData ? r->ulDataSize : 0)});
}

Record cont(const std::string &text) { return {MAA_RESULT_CONTINUE, text}; }
Record end(const std::string &text) { return {MAA_RESULT_END, text}; }

const std::string kAddressFile = "/root/Halvard/osgi/socketAddress.prop";

class PanelTest : public ::testing::Test {
protected:
    void SetUp() override {
        written.clear();
        enSpecialMode = MAA_NORMAL_CMD;
        MAA_SetResultWriter(&capture);
        MAA_PanelSetWaits(2000, 2000, 2000);
        std::filesystem::create_directories(root / "/root/Halvard/osgi");
        writeAddress("127.000.000.001");  // inet_addr reads the zeros as octal: 127.0.0.1
    }
    void TearDown() override {
        MAA_SetResultWriter(nullptr);
        ::unsetenv("USBADAPTER_UI_PORT");
        MAA_PanelSetWaits(0, 0, 0);
    }

    void writeAddress(const std::string &text) { std::ofstream(root / kAddressFile, std::ios::binary) << text; }
    static void usePort(uint16_t port) { ::setenv("USBADAPTER_UI_PORT", std::to_string(port).c_str(), 1); }

    // What the host receives from one call: the records written at once, then
    // the returned one.
    static std::vector<Record> hostSees(const std::function<TMAAResult *()> &call) {
        written.clear();
        TMAAResult *r = call();
        EXPECT_EQ(r, &stMAASysResult);
        capture(r);
        return written;
    }

    TempRoot root;
};

using Call = std::function<TMAAResult *()>;

TEST_F(PanelTest, ClientTestsSendTheirRequestAndMapTheAnswer) {
    struct Case {
        const char *name;
        Call call;
        std::string request, answer, header, final;
    } cases[] = {
        {"key in", [] { return UISSM_IF_KeyInTest_And_Cli(5); }, std::string("1\x05", 2), "9",
         "[ UISSM_IF_KeyInTest : Argument=5 ]", "KEY TEST DONE"},
        {"key in fails", [] { return UISSM_IF_KeyInTest_And_Cli(5); }, std::string("1\x05", 2), "x9",
         "[ UISSM_IF_KeyInTest : Argument=5 ]", "KEY TEST FAIL"},
        {"led", [] { return UISSM_IF_LED_Test_And_Cli(1); }, "2\x01", "9", "[ UISSM_IF_LED_Test : Argument=1 ]",
         "LED TEST DONE"},
        {"led fails", [] { return UISSM_IF_LED_Test_And_Cli(1); }, "2\x01", "1",
         "[ UISSM_IF_LED_Test : Argument=1 ]", "LED TEST FAIL"},
        {"wait", UISSM_IF_Key_WaitTest_And_Cli, "3", "9", "[ UISSM_IF_Key_WaitTest ]", "WAIT TEST DONE"},
        {"wait fails", UISSM_IF_Key_WaitTest_And_Cli, "3", "3", "[ UISSM_IF_Key_WaitTest ]", "WAIT TEST FAIL"},
        {"lcd", UISSM_IF_Key_LCD_Test_And_Cli, "4", "9", "[ UISSM_IF_Key_LCD_Test ]", "LCD TEST DONE"},
        {"lcd fails", UISSM_IF_Key_LCD_Test_And_Cli, "4", "0", "[ UISSM_IF_Key_LCD_Test ]", "LCD TEST FAIL"},
        {"country", UISSM_MAA_CountrySkip_And_Cli, "5", "9", "[ UISSM_MAA_CountrySkip ]", "COUNTRY SKIP DONE"},
        {"country fails", UISSM_MAA_CountrySkip_And_Cli, "5", "x", "[ UISSM_MAA_CountrySkip ]",
         "COUNTRY SKIP FAIL"},
        {"tray", UISSM_MAA_TrayConfirmSkip_And_Cli, "6", "9", "[ UISSM_MAA_TrayConfirmSkip ]",
         "TRAY CONFIRM SKIP DONE"},
        {"tray fails", UISSM_MAA_TrayConfirmSkip_And_Cli, "6", "x", "[ UISSM_MAA_TrayConfirmSkip ]",
         "TRAY CONFIRM SKIP FAIL"},
        {"power save on", [] { return SPI_Set_UI_Power_Save_And_Cli(1); }, "7", "9",
         "[ SPI_Set_UI_Power_Save : Argument=1 ]", "SPI_Set_UI_Power_Save DONE"},
        {"power save off", [] { return SPI_Set_UI_Power_Save_And_Cli(0); }, "8", "x",
         "[ SPI_Set_UI_Power_Save : Argument=0 ]", "SPI_Set_UI_Power_Save FAIL"},
        {"power save other: one zero byte", [] { return SPI_Set_UI_Power_Save_And_Cli(2); }, std::string(1, '\0'),
         "9", "[ SPI_Set_UI_Power_Save : Argument=2 ]", "SPI_Set_UI_Power_Save DONE"},
        {"tsp 0", [] { return UISSM_MAA_TSPCalibration_Result_And_Cli(0); }, "0", "9",
         "[ UISSM_MAA_TSPCalibration_Result : Argument=0 ]", "UISSM_MAA_TSPCalibration_Result DONE"},
        {"tsp ok", [] { return UISSM_MAA_TSPCalibration_Result_And_Cli(0); }, "0", "1",
         "[ UISSM_MAA_TSPCalibration_Result : Argument=0 ]", "Result= OK"},
        {"tsp ng", [] { return UISSM_MAA_TSPCalibration_Result_And_Cli(0); }, "0", "2",
         "[ UISSM_MAA_TSPCalibration_Result : Argument=0 ]", "Result= NG"},
        {"tsp other: one zero byte", [] { return UISSM_MAA_TSPCalibration_Result_And_Cli(7); },
         std::string(1, '\0'), "3", "[ UISSM_MAA_TSPCalibration_Result : Argument=7 ]",
         "UISSM_MAA_TSPCalibration_Result FAIL"},
        {"ui clear", PbaMode_UI_Data_clear, "9", "9", "[ PbaMode_UI_Data_clear ]", "UI Clear = OK"},
        {"ui clear fails", PbaMode_UI_Data_clear, "9", "8", "[ PbaMode_UI_Data_clear ]", "UI Clear = NG"},
        {"get ui old", SPI_Get_UI, "A", "1", "[ SPI_Get_UI ]", "SPI_Get_UI = OLD"},
        {"get ui new", SPI_Get_UI, "A", "2", "[ SPI_Get_UI ]", "SPI_Get_UI = NEW"},
        {"get ui: 9 is no success here", SPI_Get_UI, "A", "9", "[ SPI_Get_UI ]", "SPI_Get_UI = FAIL"},
        {"reboot", SPI_Set_UI_Reboot, "B", "9", "[ SPI_Set_UI_Reboot ]", "UI Reboot = OK"},
        {"reboot fails", SPI_Set_UI_Reboot, "B", "x", "[ SPI_Set_UI_Reboot ]", "UI Reboot = FAIL"},
        {"key sound 0 is on", [] { return UISSM_MAA_Set_KeySound_And_Cli(0); }, std::string("C\0", 2), "9",
         "[ UISSM_MAA_Set_KeySound : Argument = 0 ]", "Key Sound On = OK"},
        {"key sound on fails", [] { return UISSM_MAA_Set_KeySound_And_Cli(0); }, std::string("C\0", 2), "1",
         "[ UISSM_MAA_Set_KeySound : Argument = 0 ]", "Key Sound On = NG"},
        {"key sound 1 is off", [] { return UISSM_MAA_Set_KeySound_And_Cli(1); }, "C\x01", "9",
         "[ UISSM_MAA_Set_KeySound : Argument = 1 ]", "Key Sound Off = OK"},
        {"key sound off fails", [] { return UISSM_MAA_Set_KeySound_And_Cli(1); }, "C\x01", "0",
         "[ UISSM_MAA_Set_KeySound : Argument = 1 ]", "Key Sound Off = NG"},
        {"mic", UISSM_MAA_MIC_Test_And_Cli, "D", "9", "[ UISSM_MAA_MIC_Test ]", "MIC TEST DONE"},
        {"mic fails", UISSM_MAA_MIC_Test_And_Cli, "D", "x", "[ UISSM_MAA_MIC_Test ]", "MIC TEST FAIL"},
        {"haptic: the argument's low byte", [] { return UISSM_MAA_HAPTIC_And_Cli(0x1FF); }, "E\xFF", "9",
         "[ UISSM_MAA_HAPTIC : Argument=511 ]", "HAPTIC TEST DONE"},
        {"haptic fails", [] { return UISSM_MAA_HAPTIC_And_Cli(3); }, "E\x03", "x",
         "[ UISSM_MAA_HAPTIC : Argument=3 ]", "HAPTIC TEST FAIL"},
        {"speaker: the fax speaker test's name", [] { return UISSM_MAA_SpeakerTest_And_Cli(0xFFFFFFFFu); },
         "F\xFF", "9", "[ SPI_Set_Speaker_Test : Argument=-1 ]", "[SPI_Set_Speaker_Test] DONE"},
        {"speaker fails", [] { return UISSM_MAA_SpeakerTest_And_Cli(2); }, "F\x02", "x",
         "[ SPI_Set_Speaker_Test : Argument=2 ]", "[SPI_Set_Speaker_Test] FAIL"},
        {"usb", UISSM_MAA_USB_Test_And_Cli, "G", "9", "[ UISSM_MAA_USB_Test ]", "OK"},
        {"usb fails", UISSM_MAA_USB_Test_And_Cli, "G", "x", "[ UISSM_MAA_USB_Test ]", "NG"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        uipeer::Server server(uipeer::AnswerAll(c.answer));
        ASSERT_TRUE(server.ok());
        usePort(server.port());
        EXPECT_EQ(hostSees(c.call), (std::vector<Record>{cont(c.header), end(c.final)}));
        ASSERT_TRUE(server.awaitServed(1, 2000));
        EXPECT_EQ(server.requests(), std::vector<std::string>{c.request});
    }
}

TEST_F(PanelTest, WithoutAnAnswerTheHeaderIsTheLastRecord) {
    struct Case {
        const char *name;
        Call call;
        std::string answer;  // what the server sends back ("": nothing)
        bool hold;           // keeps the connection open without answering
        std::string header;
    };
    const std::vector<Case> cases = {
        {"closed at once", UISSM_IF_Key_WaitTest_And_Cli, "", false, "[ UISSM_IF_Key_WaitTest ]"},
        {"closed at once, key sound", [] { return UISSM_MAA_Set_KeySound_And_Cli(0); }, "", false,
         "[ UISSM_MAA_Set_KeySound : Argument = 0 ]"},
        // Neither on nor off: answers are read past until the server closes.
        {"key sound 2 answered", [] { return UISSM_MAA_Set_KeySound_And_Cli(2); }, "9", false,
         "[ UISSM_MAA_Set_KeySound : Argument = 2 ]"},
        // No answer within the answer wait.
        {"silent server", SPI_Get_UI, "", true, "[ SPI_Get_UI ]"},
    };
    MAA_PanelSetWaits(2000, 2000, 100);
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        uipeer::Server server(uipeer::Scripted({uipeer::Step{c.answer, c.hold}}));
        ASSERT_TRUE(server.ok());
        usePort(server.port());
        const auto start = std::chrono::steady_clock::now();
        EXPECT_EQ(hostSees(c.call), (std::vector<Record>{cont(c.header), cont(c.header)}));
        EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(10));  // not the operator's minutes
        EXPECT_EQ(server.requests().size(), 1u);
    }
}

TEST_F(PanelTest, TheAddressComesFromItsFileElseTheDefault) {
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
        const auto records = hostSees(UISSM_MAA_USB_Test_And_Cli);
        LoggerHost_StopCapture();
        if (c.reached) {
            EXPECT_EQ(records.back(), end("OK"));
            EXPECT_TRUE(server.awaitServed(++served, 2000));
        } else {
            EXPECT_EQ(records, (std::vector<Record>{cont("[ UISSM_MAA_USB_Test ]"), end("Connect To UIServer Fails")}));
            EXPECT_TRUE(LoggerHost_Contains(c.logged));
        }
    }
    EXPECT_EQ(server.requests().size(), served);
}

TEST_F(PanelTest, ListeningTestsAcceptOnlyAnAnswerBeginningWithTheirCommand) {
    struct Case {
        const char *name;
        Call call;
        std::vector<std::string> answers;
        std::vector<Record> records;
        std::string peerReceived;  // the command, then '3' padded to the answer's length
    } cases[] = {
        {"key test", UISSM_IF_KeyInTest, {"2", "x", "1ab"},
         {cont("[ UISSM_IF_KeyInTest ]"), end("KEY TEST DONE")}, std::string("13\0\0", 4)},
        {"led test", UISSM_IF_LED_Test, {"2"}, {cont("[ UISSM_IF_LED_Test ]"), end("LED TEST DONE")}, "23"},
        {"closed without answer", UISSM_IF_KeyInTest, {},
         {cont("[ UISSM_IF_KeyInTest ]"), cont("[ UISSM_IF_KeyInTest ]")}, "1"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.name);
        const uint16_t port = uipeer::FreePort();
        ASSERT_NE(port, 0);
        usePort(port);
        uipeer::Client peer(c.answers, port);
        EXPECT_EQ(hostSees(c.call), c.records);
        peer.join();
        EXPECT_TRUE(peer.connected());
        EXPECT_EQ(peer.received(), c.peerReceived);
    }
}

TEST_F(PanelTest, ListeningTestsNameTheStepThatFailed) {
    // Nobody connects in time.
    MAA_PanelSetWaits(2000, 50, 2000);
    usePort(uipeer::FreePort());
    EXPECT_EQ(hostSees(UISSM_IF_LED_Test), (std::vector<Record>{cont("[ UISSM_IF_LED_Test ]"),
                                                                end("Accept from UIServer Fails")}));
    // The port is taken by a listener.
    uipeer::Server other(uipeer::AnswerAll("9"));
    ASSERT_TRUE(other.ok());
    usePort(other.port());
    EXPECT_EQ(hostSees(UISSM_IF_KeyInTest), (std::vector<Record>{cont("[ UISSM_IF_KeyInTest ]"),
                                                                 end("Bind To UIServer Fails")}));
}

TEST_F(PanelTest, SetUIEnableWithoutThePrintServiceFails) {
    EXPECT_EQ(hostSees(SetUIEnable), (std::vector<Record>{cont("[ SetUIEnable ]"), end("Failed")}));
}

}  // namespace
