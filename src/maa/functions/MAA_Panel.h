// Operator-panel tests: each talks to the UI server over TCP (or, for the two
// listening tests, lets it connect).
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
