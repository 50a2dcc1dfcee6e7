#include "maa/functions/MAA_Supplies.h"

#include <sys/stat.h>

#include <cstring>
#include <memory>
#include <new>
#include <string>

#include "common/ByteOrder.h"
#include "common/FixedPath.h"
#include "common/Log.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Result.h"
#include "maa/functions/MAA_SysResult.h"

TSuppliesInfoData gstSuppliesInfoData;
FILE *pf_report_file = nullptr;

namespace {

constexpr char kSuppliesFile[] = "/halvard/sys/portability/printdid/crum_data.bin";
constexpr char kSpoolDir[] = "/halvard/spool/tmp/";
constexpr char kReportName[] = "suppliesinforeport.txt";
constexpr size_t kPathSize = 100;
constexpr size_t kReportLineSize = 256;
// Spool files are the device's own reports; one this large is not, and is
// refused like a failed allocation.
constexpr off_t kMaxUploadSize = 64L * 1024 * 1024;

struct TCrumStrField {
    U32 id;
    U32 size;  // array size, terminator included
};
constexpr TCrumStrField kCrumStrFields[] = {
    {19, sizeof TCrumData::aubSupplier},
    {20, sizeof TCrumData::aubBackupSupplier},
    {21, sizeof TCrumData::aubModelId},
    {24, sizeof TCrumData::aubSerialNumber},
    {25, sizeof TCrumData::aubFirstInstalledMachineSerialNumber},
    {26, sizeof TCrumData::aubLastUsedMachineSerialNumber},
    {27, sizeof TCrumData::aubMfcDate},
    {28, sizeof TCrumData::aubInstallDate},
    {29, sizeof TCrumData::aubCompany},
    {30, sizeof TCrumData::aubLastUseDate},
    {49, sizeof TCrumData::aubKindOfCartridge},
    {50, sizeof TCrumData::aubTonerLotNo},
};

using File = std::unique_ptr<FILE, int (*)(FILE *)>;
File openFile(const std::string &path, const char *mode) { return File(std::fopen(path.c_str(), mode), &std::fclose); }

// The failure texts are cut to the message buffer: the host gets three characters.
void setMessage(char *message, const char *text) {
    if (message == nullptr) return;
    const size_t n = strnlen(text, MAA_UPLOAD_MESSAGE_SIZE - 1);
    std::memcpy(message, text, n);
    message[n] = 0;
}

// Loads the supplies record; false when not even its version word is there.
// What the file does not hold reads as zero, never as an earlier record.
bool loadSupplies() {
    std::memset(&gstSuppliesInfoData, 0, sizeof gstSuppliesInfoData);
    File f = openFile(FixedPath(kSuppliesFile), "rb");
    if (!f) {
        USBADP_LOG(ERROR, "[MAA] Get_SuppliesInfo_Report: can't open %s\n", kSuppliesFile);
        return false;
    }
    const size_t got = std::fread(&gstSuppliesInfoData, 1, sizeof gstSuppliesInfoData, f.get());
    if (got < sizeof gstSuppliesInfoData.ulDataVersion) {
        USBADP_LOG(ERROR, "[MAA] Get_SuppliesInfo_Report: %s holds %u bytes\n", kSuppliesFile,
                   static_cast<unsigned>(got));
        return false;
    }
    if (got < sizeof gstSuppliesInfoData)
        USBADP_LOG(ERROR, "[MAA] Get_SuppliesInfo_Report: short %s (%u of %u bytes)\n", kSuppliesFile,
                   static_cast<unsigned>(got), static_cast<unsigned>(sizeof gstSuppliesInfoData));
    return true;
}

void writeReport(const std::string &reportPath) {
    pf_report_file = std::fopen(reportPath.c_str(), "wb");
    if (pf_report_file == nullptr) {
        USBADP_LOG(ERROR, "[MAA] Get_SuppliesInfo_Report: can't create %s\n", reportPath.c_str());
        return;
    }
    char line[kReportLineSize];
    const U32 version = ReadLE32(reinterpret_cast<const U8 *>(&gstSuppliesInfoData.ulDataVersion));
    std::snprintf(line, sizeof line, "DataVersion = 0x%08x\r\n", static_cast<unsigned>(version));
    save_report_data(line);
    std::fclose(pf_report_file);
    pf_report_file = nullptr;
}

}  // namespace

void save_report_data(const char *text) {
    if (pf_report_file == nullptr || text == nullptr) return;
    std::fwrite(text, 1, std::strlen(text), pf_report_file);
    std::fflush(pf_report_file);
}

S32 UploadFileData(const char *name, char *message) {
    char path[kPathSize];
    const int n = std::snprintf(path, sizeof path, "%s%s", FixedPath(kSpoolDir).c_str(), name ? name : "");
    struct stat st {};
    // A path cut by the bound would name some other file.
    if (n < 0 || static_cast<size_t>(n) >= sizeof path || ::stat(path, &st) != 0 || !S_ISREG(st.st_mode)) {
        USBADP_LOG(ERROR, "File Stat Failed\n");
        setMessage(message, "File Stat Error");
        return -4;
    }
    const size_t size = static_cast<size_t>(st.st_size);
    std::unique_ptr<U8[]> buffer(st.st_size <= kMaxUploadSize ? new (std::nothrow) U8[size ? size : 1]() : nullptr);
    if (!buffer) {
        USBADP_LOG(ERROR, "Malloc for file buffer failed\n");
        setMessage(message, "Allocation Error");
        return -5;
    }
    File f = openFile(path, "rb");
    if (!f) {
        USBADP_LOG(ERROR, "Error: Can't open file(%s)\n", path);
        setMessage(message, "File Open Error");
        return -6;
    }
    if (std::fread(buffer.get(), 1, size, f.get()) != size)
        USBADP_LOG(ERROR, "[MAA] UploadFileData: %s shrank while read\n", path);
    MAA_IF_WriteFile(buffer.get(), static_cast<U32>(size));
    MAA_IF_FileEnd();
    return 0;
}

TMAAResult *Get_SuppliesInfo_Report() {
    MAA_ReportF(0, "[ GetSuppliesInfoReport ]");
    const std::string reportPath = FixedPath(kSpoolDir) + kReportName;
    if (loadSupplies()) {
        writeReport(reportPath);
    } else {
        // Without a record there is no report: an earlier one must not go out
        // as if it were this one.
        std::remove(reportPath.c_str());
    }
    char message[MAA_UPLOAD_MESSAGE_SIZE] = {};
    if (UploadFileData(kReportName, message) == 0) return MAA_ReportF(1, "Data Upload Complete");
    return MAA_ReportF(1, "%s", message);
}

U32 MAA_GetCrumStr_S_Size(U32 unit, U32 field) {
    if (unit >= MAA_CRUM_UNIT_COUNT) return 0;
    for (const TCrumStrField &f : kCrumStrFields) {
        if (f.id == field) return f.size - 1;
    }
    return 0;
}

bool MAA_IsCrumStr(U32 field) { return MAA_GetCrumStr_S_Size(0, field) != 0; }
