// The supplies information report, the upload of a spool file to the host,
// and which fields of a unit record are strings.
#pragma once

#include <cstddef>
#include <cstdio>

#include "maa/MAA_Types.h"

constexpr U32 MAA_CRUM_UNIT_COUNT = 27;

// The print side's record of one replaceable unit, as stored in the supplies
// file (little-endian, strings NUL-terminated in their arrays).
#pragma pack(push, 1)
struct TCrumData {
    U32 ulVersion;
    U32 ulTonerAmountPercent;
    U32 ulPageCount;
    U32 ulTargetPageCount;
    U32 ulRefPageCount;
    U32 ulAveCoverage;
    U32 ulDotCount;
    U32 ulRealDotCount;
    U32 ulTargetDotCount;
    U32 ulRefDotCount;
    U32 ulOpcCycle;
    U32 ulTargetOpcCycle;
    U32 ulRefOpcCycle;
    U32 ulDevRTime;
    U32 ulLowPageCount;
    U32 ulAfterReplace;
    U32 ulTonerAmount;
    U32 ulTargetTonerAmount;
    U32 ulRefTonerAmount;
    U8 aubSupplier[9];
    U8 aubBackupSupplier[9];
    U8 aubModelId[17];
    U8 aubPad0[1];
    U32 ulCapacity1000Unit;
    U32 ulCapacity;
    U8 aubSerialNumber[17];
    U8 aubFirstInstalledMachineSerialNumber[17];
    U8 aubLastUsedMachineSerialNumber[17];
    U8 aubMfcDate[9];
    U8 aubInstallDate[9];
    U8 aubCompany[9];
    U8 aubLastUseDate[9];
    U8 aubPad1[1];
    U32 ulEquivalentPage;
    U32 ulMotorRTime;
    U32 ulEstimatedPageRemaining;
    U32 ulCumulativeTonerAmountWeight;
    U32 ulChannel;
    U32 ulLastImageCoverage;
    U32 ulCoverageInfo1;
    U32 ulCoverageInfo2;
    U32 ulCoverageInfo3;
    U32 ulCoverageInfo4;
    U32 ulCoverageInfo5;
    U32 ulCoverageInfo6;
    U32 ulCoverageInfo7;
    U32 ulCoverageInfo8;
    U32 ulCrumImageCount;
    U32 ulIsValid;
    U32 ulResetCount;
    U32 ulNewTonerCount;
    U8 aubKindOfCartridge[5];
    U8 aubTonerLotNo[17];
    U8 aubPad2[2];
    U32 ulNewImagingUnitCount;
};

struct TSuppliesInfoData {
    U32 ulDataVersion;
    TCrumData stCrumData[MAA_CRUM_UNIT_COUNT];
    U32 aulTrayRollerLife[11];
    U32 aulFuserADCAbnormalCount[24];
    U32 ulWasteTankContainer;
    U32 ulOzonFilter;
    U32 ulDustFilter;
    U32 ulTransfer1RollerLife;
    U32 ulTransfer2RollerLife;
    U32 aulTrayRollerMaxCapacity[11];
    U32 aulTransferRollerMaxCapacity[2];
    U32 ulConsumableEmptyAlertEnable;
    U32 aulTrayForwardRollerLife[11];
    U32 aulTrayForwardMaxCapacity[11];
    U32 aulTrayRetardRollerLife[11];
    U32 aulTrayRetardMaxCapacity[11];
    U32 aulTrayPadRollerLife[11];
    U32 aulTrayPadMaxCapacity[11];
    U32 ulPTBWasteTonerContainer;
    U32 ulFinisherStapleCartridge;
    U32 ulBookletStapleCartridge;
    U32 ulPunchWasteHopper;
};
#pragma pack(pop)

static_assert(sizeof(TCrumData) == 308);
static_assert(offsetof(TCrumData, ulVersion) == 0);
static_assert(offsetof(TCrumData, ulTonerAmountPercent) == 4);
static_assert(offsetof(TCrumData, ulPageCount) == 8);
static_assert(offsetof(TCrumData, ulTargetPageCount) == 12);
static_assert(offsetof(TCrumData, ulRefPageCount) == 16);
static_assert(offsetof(TCrumData, ulAveCoverage) == 20);
static_assert(offsetof(TCrumData, ulDotCount) == 24);
static_assert(offsetof(TCrumData, ulRealDotCount) == 28);
static_assert(offsetof(TCrumData, ulTargetDotCount) == 32);
static_assert(offsetof(TCrumData, ulRefDotCount) == 36);
static_assert(offsetof(TCrumData, ulOpcCycle) == 40);
static_assert(offsetof(TCrumData, ulTargetOpcCycle) == 44);
static_assert(offsetof(TCrumData, ulRefOpcCycle) == 48);
static_assert(offsetof(TCrumData, ulDevRTime) == 52);
static_assert(offsetof(TCrumData, ulLowPageCount) == 56);
static_assert(offsetof(TCrumData, ulAfterReplace) == 60);
static_assert(offsetof(TCrumData, ulTonerAmount) == 64);
static_assert(offsetof(TCrumData, ulTargetTonerAmount) == 68);
static_assert(offsetof(TCrumData, ulRefTonerAmount) == 72);
static_assert(offsetof(TCrumData, aubSupplier) == 76);
static_assert(offsetof(TCrumData, aubBackupSupplier) == 85);
static_assert(offsetof(TCrumData, aubModelId) == 94);
static_assert(offsetof(TCrumData, ulCapacity1000Unit) == 112);
static_assert(offsetof(TCrumData, ulCapacity) == 116);
static_assert(offsetof(TCrumData, aubSerialNumber) == 120);
static_assert(offsetof(TCrumData, aubFirstInstalledMachineSerialNumber) == 137);
static_assert(offsetof(TCrumData, aubLastUsedMachineSerialNumber) == 154);
static_assert(offsetof(TCrumData, aubMfcDate) == 171);
static_assert(offsetof(TCrumData, aubInstallDate) == 180);
static_assert(offsetof(TCrumData, aubCompany) == 189);
static_assert(offsetof(TCrumData, aubLastUseDate) == 198);
static_assert(offsetof(TCrumData, ulEquivalentPage) == 208);
static_assert(offsetof(TCrumData, ulMotorRTime) == 212);
static_assert(offsetof(TCrumData, ulEstimatedPageRemaining) == 216);
static_assert(offsetof(TCrumData, ulCumulativeTonerAmountWeight) == 220);
static_assert(offsetof(TCrumData, ulChannel) == 224);
static_assert(offsetof(TCrumData, ulLastImageCoverage) == 228);
static_assert(offsetof(TCrumData, ulCoverageInfo1) == 232);
static_assert(offsetof(TCrumData, ulCoverageInfo2) == 236);
static_assert(offsetof(TCrumData, ulCoverageInfo3) == 240);
static_assert(offsetof(TCrumData, ulCoverageInfo4) == 244);
static_assert(offsetof(TCrumData, ulCoverageInfo5) == 248);
static_assert(offsetof(TCrumData, ulCoverageInfo6) == 252);
static_assert(offsetof(TCrumData, ulCoverageInfo7) == 256);
static_assert(offsetof(TCrumData, ulCoverageInfo8) == 260);
static_assert(offsetof(TCrumData, ulCrumImageCount) == 264);
static_assert(offsetof(TCrumData, ulIsValid) == 268);
static_assert(offsetof(TCrumData, ulResetCount) == 272);
static_assert(offsetof(TCrumData, ulNewTonerCount) == 276);
static_assert(offsetof(TCrumData, aubKindOfCartridge) == 280);
static_assert(offsetof(TCrumData, aubTonerLotNo) == 285);
static_assert(offsetof(TCrumData, ulNewImagingUnitCount) == 304);

static_assert(sizeof(TSuppliesInfoData) == 8816);
static_assert(offsetof(TSuppliesInfoData, ulDataVersion) == 0);
static_assert(offsetof(TSuppliesInfoData, stCrumData) == 4);
static_assert(offsetof(TSuppliesInfoData, aulTrayRollerLife) == 8320);
static_assert(offsetof(TSuppliesInfoData, aulFuserADCAbnormalCount) == 8364);
static_assert(offsetof(TSuppliesInfoData, ulWasteTankContainer) == 8460);
static_assert(offsetof(TSuppliesInfoData, ulOzonFilter) == 8464);
static_assert(offsetof(TSuppliesInfoData, ulDustFilter) == 8468);
static_assert(offsetof(TSuppliesInfoData, ulTransfer1RollerLife) == 8472);
static_assert(offsetof(TSuppliesInfoData, ulTransfer2RollerLife) == 8476);
static_assert(offsetof(TSuppliesInfoData, aulTrayRollerMaxCapacity) == 8480);
static_assert(offsetof(TSuppliesInfoData, aulTransferRollerMaxCapacity) == 8524);
static_assert(offsetof(TSuppliesInfoData, ulConsumableEmptyAlertEnable) == 8532);
static_assert(offsetof(TSuppliesInfoData, aulTrayForwardRollerLife) == 8536);
static_assert(offsetof(TSuppliesInfoData, aulTrayForwardMaxCapacity) == 8580);
static_assert(offsetof(TSuppliesInfoData, aulTrayRetardRollerLife) == 8624);
static_assert(offsetof(TSuppliesInfoData, aulTrayRetardMaxCapacity) == 8668);
static_assert(offsetof(TSuppliesInfoData, aulTrayPadRollerLife) == 8712);
static_assert(offsetof(TSuppliesInfoData, aulTrayPadMaxCapacity) == 8756);
static_assert(offsetof(TSuppliesInfoData, ulPTBWasteTonerContainer) == 8800);
static_assert(offsetof(TSuppliesInfoData, ulFinisherStapleCartridge) == 8804);
static_assert(offsetof(TSuppliesInfoData, ulBookletStapleCartridge) == 8808);
static_assert(offsetof(TSuppliesInfoData, ulPunchWasteHopper) == 8812);

// The record last loaded from the supplies file, and the report being written.
extern TSuppliesInfoData gstSuppliesInfoData;
extern FILE *pf_report_file;

// Registered as GetSuppliesInfoReport. A supplies file without even its
// version word gives no report (an earlier one is removed), so the upload ends
// the test with its stat failure; a short file is reported, and the part of the
// record it lacks reads as zero, never as an earlier file's counters.
TMAAResult *Get_SuppliesInfo_Report();

// Appends the text to pf_report_file and flushes (nothing without a report file).
void save_report_data(const char *text);

// Bytes the failure text of UploadFileData may take, terminator included: the
// host sees only the first three characters.
constexpr size_t MAA_UPLOAD_MESSAGE_SIZE = 4;
// Sends the spool file "/halvard/spool/tmp/<name>" to the host as a file
// transfer. 0 on success; -4 (cannot stat), -5 (cannot allocate), -6 (cannot
// open), with the failure text in `message` (MAA_UPLOAD_MESSAGE_SIZE bytes).
S32 UploadFileData(const char *name, char *message);

// Usable string length of field `field` of a unit record (its array size minus
// one); 0 for a numeric field, an unknown field, or a unit above 26.
U32 MAA_GetCrumStr_S_Size(U32 unit, U32 field);
bool MAA_IsCrumStr(U32 field);
