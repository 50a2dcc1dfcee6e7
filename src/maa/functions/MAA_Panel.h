// Operator-panel tests: each talks to the UI server over TCP (or, for the two
// listening tests, lets it connect). The server's address comes from
// /root/Halvard/osgi/socketAddress.prop (default 127.254.254.253), its port is
// 10000 unless USBADAPTER_UI_PORT names another (PC runs and tests).
#pragma once

#include "maa/MAA_Types.h"

TMAAResult *UISSM_IF_LED_Test();
TMAAResult *UISSM_IF_KeyInTest();
TMAAResult *UISSM_IF_KeyInTest_And_Cli(U32);
TMAAResult *UISSM_IF_LED_Test_And_Cli(U32);
TMAAResult *UISSM_IF_Key_WaitTest_And_Cli();
TMAAResult *UISSM_IF_Key_LCD_Test_And_Cli();
TMAAResult *UISSM_MAA_CountrySkip_And_Cli();
TMAAResult *UISSM_MAA_TrayConfirmSkip_And_Cli();
TMAAResult *SPI_Set_UI_Power_Save_And_Cli(U32);
TMAAResult *UISSM_MAA_TSPCalibration_Result_And_Cli(U32);
TMAAResult *PbaMode_UI_Data_clear();
TMAAResult *SPI_Get_UI();
TMAAResult *SPI_Set_UI_Reboot();
TMAAResult *UISSM_MAA_Set_KeySound_And_Cli(U32);
TMAAResult *UISSM_MAA_MIC_Test_And_Cli();
TMAAResult *UISSM_MAA_HAPTIC_And_Cli(U32);
TMAAResult *UISSM_MAA_SpeakerTest_And_Cli(U32);
TMAAResult *SetUIEnable();
TMAAResult *UISSM_MAA_USB_Test_And_Cli();

// Bounds of the panel tests' waits in milliseconds: connecting to the UI server,
// the UI server connecting to a listening test, and its answer (the answer
// waits for an operator: minutes by default). Tests shorten them; 0 restores
// a default.
void MAA_PanelSetWaits(int connectMs, int acceptMs, int answerMs);
