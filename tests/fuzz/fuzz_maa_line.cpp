// Arbitrary command lines through the MAA lexer, parser and evaluator, with the
// whole registered vocabulary (its drivers are the virtual devices, its shell
// commands a recorder, its pauses virtual, its files under a private root), a
// few probe functions, data cells, an undefined symbol and the general
// function. Every input starts from an empty table and address map.
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <string>

#include "maa/MAA_Address.h"
#include "maa/MAA_Hook.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Parser.h"
#include "maa/MAA_Symbol.h"
#include "maa/functions/MAA_Panel.h"
#include "maa/functions/MAA_SysResult.h"
#include "vdev.h"
#include "ShellProbes.h"

namespace {

// Reads every byte of a record, as the wire writer does.
void consume(const TMAAResult *r) {
    for (U32 i = 0; r->pubData != nullptr && i < r->ulDataSize; ++i) probes::ulSink = probes::ulSink + r->pubData[i];
}

int recordCommand(const char *command, TMAARunVia) {
    probes::ulSink = probes::ulSink + static_cast<U32>(std::strlen(command));
    return 0;
}
void noPause(U32) {}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    setenv("USBADAPTER_LOG_LEVEL", "OFF", 0);
    MAA_SetResultWriter(&consume);
    MAA_SetCommandRunner(&recordCommand);
    MAA_SetSleeper(&noPause);
    MAA_PanelSetWaits(10, 10, 10);  // no UI server answers here
    // The vocabulary's fixed paths would otherwise reach this machine's own
    // /proc and /etc.
    static char root[] = "/tmp/usbadapter-fuzz-XXXXXX";
    if (::mkdtemp(root) != nullptr) setenv("USBADAPTER_ROOT", root, 1);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    // The session's line buffer: at most 1024 bytes, NUL-terminated.
    static U8 aubLine[1025];
    size_t n = size < 1024 ? size : 1024;
    std::memcpy(aubLine, data, n);
    aubLine[n] = 0;

    vdev::Reset();
    MAA_SymbolReg();
    probes::Register();
    enSpecialMode = n > 0 && data[0] == '#' ? MAA_AUTO_RUN_CMD : MAA_NORMAL_CMD;
    MAA_InputSet(aubLine);
    MAA_Parser();

    MAA_SymbolClear();
    MAA_AddrReset();
    return 0;
}
