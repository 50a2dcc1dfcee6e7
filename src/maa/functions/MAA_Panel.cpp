#include "maa/functions/MAA_Panel.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <string>

#include "adapter/USB.h"
#include "common/FixedPath.h"
#include "common/JniUtil.h"
#include "common/Log.h"
#include "common/UniqueFd.h"
#include "common/Wait.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_SysResult.h"
#include "print/USBPrint.h"

namespace {

constexpr U16 UIPORT = 10000;
constexpr size_t UIBUFSIZE = 1024;
constexpr char kDefaultAddress[] = "127.254.254.253";
constexpr size_t kAddressLength = sizeof kDefaultAddress - 1;  // 15

// The UI server is local, so a connection is made at once or never; answers
// wait for an operator working the panel, hence the long answer wait.
constexpr int kConnectWaitMs = 5000;
constexpr int kAcceptWaitMs = 60000;
constexpr int kAnswerWaitMs = 300000;
int connectWaitMs = kConnectWaitMs;
int acceptWaitMs = kAcceptWaitMs;
int answerWaitMs = kAnswerWaitMs;

bool cableGone() { return MAA_IsUSBDisconnected() != 0; }

U16 uiPort() {
    if (const char *text = std::getenv("USBADAPTER_UI_PORT"); text != nullptr && *text != 0) {
        char *end = nullptr;
        const long port = std::strtol(text, &end, 10);
        if (*end == 0 && port > 0 && port <= 0xFFFF) return static_cast<U16>(port);
        USBADP_LOG(ERROR, "[UISSM] USBADAPTER_UI_PORT(%s) ignored\n", text);
    }
    return UIPORT;
}

// The file holds the dotted address, read as 15 bytes like the default one.
std::string uiServerAddress() {
    char address[kAddressLength + 1] = {};
    if (FILE *f = std::fopen(FixedPath("/root/Halvard/osgi/socketAddress.prop").c_str(), "rb")) {
        const size_t got = std::fread(address, 1, kAddressLength, f);
        std::fclose(f);
        address[got] = 0;
        return address;
    }
    return kDefaultAddress;
}

// poll(2) for `events` until the deadline, resumed after signals.
bool waitFor(int fd, short events, int64_t deadline) {
    for (;;) {
        const int64_t left = deadline - Wait_NowMs();
        if (left <= 0 || cableGone()) return false;
        pollfd p{fd, events, 0};
        const int rc = ::poll(&p, 1, static_cast<int>(left));
        if (rc > 0) return true;
        if (rc < 0 && errno != EINTR) return false;
    }
}

bool connectUIServer(int fd) {
    const std::string address = uiServerAddress();
    sockaddr_in sa{};
    sa.sin_family = AF_INET;
    sa.sin_port = htons(uiPort());
    sa.sin_addr.s_addr = inet_addr(address.c_str());
    if (::connect(fd, reinterpret_cast<sockaddr *>(&sa), sizeof sa) == 0) return true;
    int err = errno;
    if (err == EINPROGRESS || err == EINTR) {
        socklen_t len = sizeof err;
        err = ETIMEDOUT;
        if (waitFor(fd, POLLOUT, Wait_NowMs() + connectWaitMs) &&
            ::getsockopt(fd, SOL_SOCKET, SO_ERROR, &err, &len) == 0 && err == 0) {
            return true;
        }
    }
    USBADP_LOG(ERROR, "[UISSM] connect %s:%d: %s\n", address.c_str(), static_cast<int>(ntohs(sa.sin_port)),
               std::strerror(err));
    return false;
}

// One read of an answer within `deadline`; <= 0: closed, failed or no answer in time.
ssize_t readAnswer(int fd, U8 *buf, int64_t deadline) {
    if (!waitFor(fd, POLLIN, deadline)) return -1;
    ssize_t n;
    do {
        n = ::recv(fd, buf, UIBUFSIZE, 0);
    } while (n < 0 && errno == EINTR);
    return n;
}

bool sendAll(int fd, const U8 *data, size_t size) {
    while (size > 0) {
        const ssize_t n = ::send(fd, data, size, MSG_NOSIGNAL);
        if (n < 0 && errno == EINTR) continue;
        if (n < 0 && errno == EAGAIN && waitFor(fd, POLLOUT, Wait_NowMs() + connectWaitMs)) continue;
        if (n <= 0) return false;
        data += n;
        size -= static_cast<size_t>(n);
    }
    return true;
}

struct TUIVerdict {
    U8 answer;
    const char *text;
};
// Verdicts by the answer's first byte, then the text for any other byte.
struct TUIAnswers {
    TUIVerdict known[3];
    const char *otherwise;
};

const char *verdictOf(const TUIAnswers &answers, U8 first) {
    for (const TUIVerdict &v : answers.known) {
        if (v.text != nullptr && v.answer == first) return v.text;
    }
    return answers.otherwise;
}

// The connected socket, or none after reporting why.
UniqueFd openClient() {
    UniqueFd fd(::socket(AF_INET, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    if (!fd) {
        MAA_ReportF(1, "UIServer socket create Fails");
        return fd;
    }
    if (!connectUIServer(fd.get())) {
        MAA_ReportF(1, "Connect To UIServer Fails");
        fd.reset();
    }
    return fd;
}

// A client test: header, request, one answer mapped to the final text. Without
// an answer the header stays the last record.
TMAAResult *uiClientTest(const char *header, U32 argument, U8 command, const U8 *argByte,
                         const TUIAnswers &answers) {
    MAA_ReportF(0, header, static_cast<int>(argument));
    UniqueFd fd = openClient();
    if (!fd) return &stMAASysResult;
    U8 request[2] = {command, argByte ? *argByte : U8(0)};
    if (!sendAll(fd.get(), request, argByte ? 2 : 1)) {
        USBADP_LOG(ERROR, "[UISSM] request not sent: %s\n", std::strerror(errno));
    }
    U8 answer[UIBUFSIZE] = {};
    if (readAnswer(fd.get(), answer, Wait_NowMs() + answerWaitMs) > 0) {
        MAA_ReportF(1, "%s", verdictOf(answers, answer[0]));
    }
    return &stMAASysResult;
}

TMAAResult *uiClientTest(const char *header, U32 argument, U8 command, const TUIAnswers &answers) {
    return uiClientTest(header, argument, command, nullptr, answers);
}

TMAAResult *uiClientTestWithArg(const char *header, U32 argument, U8 command, const TUIAnswers &answers) {
    const U8 argByte = static_cast<U8>(argument);
    return uiClientTest(header, argument, command, &argByte, answers);
}

// A listening test: the UI server connects, gets the command byte and answers;
// an answer that begins with the command byte passes and is acknowledged with
// '3'. Other answers are waited past.
TMAAResult *uiListeningTest(const char *header, U8 command, const char *success) {
    MAA_ReportF(0, "%s", header);
    UniqueFd listener(::socket(AF_INET, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0));
    if (!listener) return MAA_ReportF(1, "UIServer socket create Fails");
    const int on = 1;
    ::setsockopt(listener.get(), SOL_SOCKET, SO_REUSEADDR, &on, sizeof on);
    sockaddr_in sa{};
    sa.sin_family = AF_INET;
    sa.sin_port = htons(uiPort());
    sa.sin_addr.s_addr = htonl(INADDR_ANY);
    if (::bind(listener.get(), reinterpret_cast<sockaddr *>(&sa), sizeof sa) != 0) {
        return MAA_ReportF(1, "Bind To UIServer Fails");
    }
    if (::listen(listener.get(), 5) != 0) return MAA_ReportF(1, "Listen To UIServer Fails");
    UniqueFd peer;
    if (waitFor(listener.get(), POLLIN, Wait_NowMs() + acceptWaitMs)) {
        peer.reset(::accept4(listener.get(), nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC));
    }
    if (!peer) return MAA_ReportF(1, "Accept from UIServer Fails");

    U8 sendBuf[UIBUFSIZE] = {command};
    U8 recvBuf[UIBUFSIZE];
    sendAll(peer.get(), sendBuf, 1);
    const int64_t deadline = Wait_NowMs() + answerWaitMs;
    for (;;) {
        std::memset(recvBuf, 0, sizeof recvBuf);
        const ssize_t n = readAnswer(peer.get(), recvBuf, deadline);
        if (n <= 0) break;
        if (recvBuf[0] == command) {
            MAA_ReportF(1, "%s", success);
            sendBuf[0] = '3';
            sendAll(peer.get(), sendBuf, static_cast<size_t>(n));
            break;
        }
        USBADP_LOG(DEBUG, "[UISSM] answer '%c' ignored\n", recvBuf[0]);
    }
    ::shutdown(peer.get(), SHUT_RDWR);
    ::shutdown(listener.get(), SHUT_RDWR);
    return &stMAASysResult;
}

}  // namespace

void MAA_PanelSetWaits(int connectMs, int acceptMs, int answerMs) {
    connectWaitMs = connectMs > 0 ? connectMs : kConnectWaitMs;
    acceptWaitMs = acceptMs > 0 ? acceptMs : kAcceptWaitMs;
    answerWaitMs = answerMs > 0 ? answerMs : kAnswerWaitMs;
}

TMAAResult *UISSM_IF_KeyInTest() { return uiListeningTest("[ UISSM_IF_KeyInTest ]", '1', "KEY TEST DONE"); }

TMAAResult *UISSM_IF_LED_Test() { return uiListeningTest("[ UISSM_IF_LED_Test ]", '2', "LED TEST DONE"); }

TMAAResult *UISSM_IF_KeyInTest_And_Cli(U32 arg) {
    return uiClientTestWithArg("[ UISSM_IF_KeyInTest : Argument=%d ]", arg, '1',
                               {{{'9', "KEY TEST DONE"}}, "KEY TEST FAIL"});
}

TMAAResult *UISSM_IF_LED_Test_And_Cli(U32 arg) {
    return uiClientTestWithArg("[ UISSM_IF_LED_Test : Argument=%d ]", arg, '2',
                               {{{'9', "LED TEST DONE"}}, "LED TEST FAIL"});
}

TMAAResult *UISSM_IF_Key_WaitTest_And_Cli() {
    return uiClientTest("[ UISSM_IF_Key_WaitTest ]", 0, '3', {{{'9', "WAIT TEST DONE"}}, "WAIT TEST FAIL"});
}

TMAAResult *UISSM_IF_Key_LCD_Test_And_Cli() {
    return uiClientTest("[ UISSM_IF_Key_LCD_Test ]", 0, '4', {{{'9', "LCD TEST DONE"}}, "LCD TEST FAIL"});
}

TMAAResult *UISSM_MAA_CountrySkip_And_Cli() {
    return uiClientTest("[ UISSM_MAA_CountrySkip ]", 0, '5', {{{'9', "COUNTRY SKIP DONE"}}, "COUNTRY SKIP FAIL"});
}

TMAAResult *UISSM_MAA_TrayConfirmSkip_And_Cli() {
    return uiClientTest("[ UISSM_MAA_TrayConfirmSkip ]", 0, '6',
                        {{{'9', "TRAY CONFIRM SKIP DONE"}}, "TRAY CONFIRM SKIP FAIL"});
}

TMAAResult *SPI_Set_UI_Power_Save_And_Cli(U32 arg) {
    const U8 command = arg == 1 ? '7' : arg == 0 ? '8' : 0;
    return uiClientTest("[ SPI_Set_UI_Power_Save : Argument=%d ]", arg, command,
                        {{{'9', "SPI_Set_UI_Power_Save DONE"}}, "SPI_Set_UI_Power_Save FAIL"});
}

TMAAResult *UISSM_MAA_TSPCalibration_Result_And_Cli(U32 arg) {
    return uiClientTest("[ UISSM_MAA_TSPCalibration_Result : Argument=%d ]", arg, arg == 0 ? '0' : 0,
                        {{{'9', "UISSM_MAA_TSPCalibration_Result DONE"}, {'1', "Result= OK"}, {'2', "Result= NG"}},
                         "UISSM_MAA_TSPCalibration_Result FAIL"});
}

TMAAResult *PbaMode_UI_Data_clear() {
    return uiClientTest("[ PbaMode_UI_Data_clear ]", 0, '9', {{{'9', "UI Clear = OK"}}, "UI Clear = NG"});
}

TMAAResult *SPI_Get_UI() {
    return uiClientTest("[ SPI_Get_UI ]", 0, 'A',
                        {{{'1', "SPI_Get_UI = OLD"}, {'2', "SPI_Get_UI = NEW"}}, "SPI_Get_UI = FAIL"});
}

TMAAResult *SPI_Set_UI_Reboot() {
    return uiClientTest("[ SPI_Set_UI_Reboot ]", 0, 'B', {{{'9', "UI Reboot = OK"}}, "UI Reboot = FAIL"});
}

// 0 switches the key sound on, 1 off. Any other argument gets no verdict: the
// answers are read until the server closes.
TMAAResult *UISSM_MAA_Set_KeySound_And_Cli(U32 arg) {
    MAA_ReportF(0, "[ UISSM_MAA_Set_KeySound : Argument = %d ]", static_cast<int>(arg));
    UniqueFd fd = openClient();
    if (!fd) return &stMAASysResult;
    const U8 request[2] = {'C', static_cast<U8>(arg)};
    if (!sendAll(fd.get(), request, sizeof request)) {
        USBADP_LOG(ERROR, "[UISSM] request not sent: %s\n", std::strerror(errno));
    }
    U8 answer[UIBUFSIZE];
    const int64_t deadline = Wait_NowMs() + answerWaitMs;
    for (;;) {
        std::memset(answer, 0, sizeof answer);
        if (readAnswer(fd.get(), answer, deadline) <= 0) break;
        if (arg == 0) {
            MAA_ReportF(1, "%s", answer[0] == '9' ? "Key Sound On = OK" : "Key Sound On = NG");
            break;
        }
        if (arg == 1) {
            MAA_ReportF(1, "%s", answer[0] == '9' ? "Key Sound Off = OK" : "Key Sound Off = NG");
            break;
        }
    }
    return &stMAASysResult;
}

TMAAResult *UISSM_MAA_MIC_Test_And_Cli() {
    return uiClientTest("[ UISSM_MAA_MIC_Test ]", 0, 'D', {{{'9', "MIC TEST DONE"}}, "MIC TEST FAIL"});
}

TMAAResult *UISSM_MAA_HAPTIC_And_Cli(U32 arg) {
    return uiClientTestWithArg("[ UISSM_MAA_HAPTIC : Argument=%d ]", arg, 'E',
                               {{{'9', "HAPTIC TEST DONE"}}, "HAPTIC TEST FAIL"});
}

// Reported under the fax-side speaker test's name, as the factory scripts expect.
TMAAResult *UISSM_MAA_SpeakerTest_And_Cli(U32 arg) {
    return uiClientTestWithArg("[ SPI_Set_Speaker_Test : Argument=%d ]", arg, 'F',
                               {{{'9', "[SPI_Set_Speaker_Test] DONE"}}, "[SPI_Set_Speaker_Test] FAIL"});
}

TMAAResult *UISSM_MAA_USB_Test_And_Cli() {
    return uiClientTest("[ UISSM_MAA_USB_Test ]", 0, 'G', {{{'9', "OK"}}, "NG"});
}

// The panel is switched on by the print service, which owns the UI state.
TMAAResult *SetUIEnable() {
    MAA_ReportF(0, "[ SetUIEnable ]");
    jobject daemon = globalPrintObj.load();
    JNIEnv *env = daemon ? USBPrint_ThreadEnv() : nullptr;
    if (env == nullptr) {
        USBADP_LOG(ERROR, "[UISSM] SetUIEnable: no print service\n");
        return MAA_ReportF(1, "Failed");
    }
    LocalRef<jclass> cls(env, env->GetObjectClass(daemon));
    jmethodID mid = cls ? env->GetMethodID(cls.get(), "maaSetUIEnable", "()Ljava/lang/String;") : nullptr;
    if (mid == nullptr) {
        JNI_ExceptionSweep(env);
        USBADP_LOG(ERROR, "[UISSM] SetUIEnable: can't find maaSetUIEnable()\n");
        return MAA_ReportF(1, "Failed");
    }
    LocalRef<jstring> reply(env, static_cast<jstring>(env->CallObjectMethod(daemon, mid)));
    JNI_ExceptionSweep(env);
    UtfChars text(env, reply.get());
    if (!text) {
        USBADP_LOG(ERROR, "[UISSM] SetUIEnable: no reply\n");
        return MAA_ReportF(1, "Failed");
    }
    SysPBA_IF_PrintResult(reinterpret_cast<const U8 *>(text.get()), 1, 0);
    return &stMAASysResult;
}
