// The engine string interface: test functions that forward the whole command
// text to the Java print service and report its reply. The number in a name is
// only the parameter count it is registered with; the arguments are ignored.
#pragma once

#include "maa/MAA_Types.h"

TMAAResult *Eng_MaaStrIFOpt0();
TMAAResult *Eng_MaaStrIFOpt1(U32);
TMAAResult *Eng_MaaStrIFOpt2(U32, U32);
TMAAResult *Eng_MaaStrIFOpt3(U32, U32, U32);
TMAAResult *Eng_MaaStrIFOpt4(U32, U32, U32, U32);
TMAAResult *Eng_MaaStrIFOpt5(U32, U32, U32, U32, U32);
TMAAResult *Eng_MaaStrIFOpt1_Str(U32);
TMAAResult *Eng_MaaPBAStrIFOpt0();
TMAAResult *Eng_MaaPBAStrIFOpt1(U32);
TMAAResult *Eng_MaaPBAStrIFOpt2(U32, U32);
TMAAResult *Eng_MaaPBAStrIFOpt3(U32, U32, U32);
TMAAResult *Eng_MaaPBAStrIFOpt4(U32, U32, U32, U32);
TMAAResult *Eng_MaaPBAStrIFOpt5(U32, U32, U32, U32, U32);
TMAAResult *Eng_MaaPBAStrIFOpt6(U32, U32, U32, U32, U32, U32);
TMAAResult *Eng_MaaPBAStrIFOpt7(U32, U32, U32, U32, U32, U32, U32);
TMAAResult *Eng_MaaImgStbStart(U32);
TMAAResult *Eng_MaaStrFTCATest(U32);
