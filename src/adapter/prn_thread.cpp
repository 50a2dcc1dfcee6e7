#include "adapter/prn_thread.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <sys/ioctl.h>
#include <sys/msg.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>

#include "adapter/Classifier.h"
#include "adapter/Descriptors.h"
#include "adapter/SerialNumber.h"
#include "adapter/USB.h"
#include "common/Log.h"
#include "common/Wait.h"
#include "maa/MAA_Hook.h"
#include "platform/Platform.h"
#include "print/USBPrint.h"

S32 slPollTimeout = POLL_TIMEOUT_IDLE;
S32 readFlag = 0;
S32 jobCounter = 0;
S32 startUELFlag = 0;
S32 splitPatternFlag = 0;
S32 splitPatternMarker = 0;
S32 splitDataSize = 0;
S32 UelPosition = 0;
S32 restData = 0;
S32 dataStart = 0;
S32 dataEnd = 0;
U32 prnSizeReceived = 0;
char PrndataFileName[256];

namespace {

constexpr char kManufacturer[] = "Tarnwel Electronics Co., Ltd.";

// A read lands behind at most FRM_DETECT_BUFFER_SIZE classifier bytes.
static_assert(TEMP_SEND_BUFFER_SIZE >= FRM_DETECT_BUFFER_SIZE + RX_BUFFER_SIZE);

// Allocated once when reading starts and kept for the life of the process.
U8 *received_data;       // the rest of a transfer read ahead for a host application
U8 *vlx_command;         // kept for the layout of the reader; not used
U8 *firmware_command;    // bytes the classifier took off the node (at most 80)
U8 *tempSendBuffer;      // firmware_command bytes, then the read: the current chunk
U8 *temp2UelSendBuffer;  // held UEL bytes + the current chunk
U8 *tempUelSendBuffer;   // cursor into the chunk being delivered
U8 aubcommand[COMMAND_SIZE];
U8 aubsplitUelSendBuffer[COMMAND_SIZE];

bool shouldPark() { return !IsConfigured.load() || hibernation_flag.load() != 0; }
bool mayRead() { return !shouldPark(); }

// Written when the reader is asked to park from another thread (the close):
// its wait on the node ends at once, not after up to POLL_TIMEOUT_UEL. -1 when
// it cannot be had: the wait then ends at the next signal or time-out.
int parkWakeFd() {
    static const int fd = ::eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC);
    return fd;
}

// poll for input on the print node. A signal (the bridge's notifications come
// as SIGIO) does not end the wait unless the reader is to park.
int pollPrn(int timeoutMs, short *revents) {
    return Wait_PollIn(fdPrn.load(), timeoutMs, revents, shouldPark, parkWakeFd());
}

// The node said it was ready and gave nothing (hung up, closed, failed): the
// poll period is over only when its time is, or the reader would spin.
void idleRestOfPeriod(int64_t start, int periodMs) { Wait_IdleRest(start, periodMs, shouldPark); }

// A five-minute wait inside a UEL-framed job that saw no data falls back to
// the idle wait.
void fallBackAfterUelTimeout() {
    if (slPollTimeout != POLL_TIMEOUT_UEL) return;
    slPollTimeout = POLL_TIMEOUT_IDLE;
    USBADP_LOG(INFO, "[USBAdp] Print channel poll timeout updated to 5sec\n");
}

// Opens a job if none is open. False when Java refused it; the chunk that
// needed it is then dropped.
bool openJob(const TPrintDelivery &d, const char *createdLine) {
    if (readFlag == 1) return true;
    readFlag = 1;
    USBADP_LOG(INFO, "%s", createdLine);
    S8 r = d.RegisterJob(PrndataFileName);
    USBADP_LOG(INFO, "[USBAdp]receiving %d\n", r);
    if (r < 0) {
        USBADP_LOG(ERROR, "[USBAdp]returning back\n");
        // No job: a UEL already counted for it must not count for the next
        // one, nor a UEL cut at the end of the dropped chunk mark the next.
        readFlag = 0;
        jobCounter = 0;
        splitPatternFlag = 0;
        return false;
    }
    return true;
}

// UEL bytes held back at a chunk's end belong to the job that is open; pass
// them before the job is ended without a closing UEL, so none are lost.
void passHeldBytes(const TPrintDelivery &d) {
    if (startUELFlag != 1 || splitDataSize <= 0) return;
    USBADP_LOG(INFO, "[USBAdp]Held UEL bytes passed at end of job: [%d]\n", splitDataSize);
    d.PassData(aubsplitUelSendBuffer, splitDataSize);
}

void endJob(const TPrintDelivery &d) {
    d.NotifyEndOfData();
    InitializeVars();
    slPollTimeout = POLL_TIMEOUT_IDLE;
}

// Delivers the chunk at tempUelSendBuffer (restData bytes), cutting jobs at
// UELs. Bytes of a UEL cut by the chunk's end are held for the next chunk.
void frameChunk(const TPrintDelivery &d) {
    while (restData > 0) {
        USBADP_LOG(DEBUG, "[USBAdp]Inside while(restData > 0) --- 1\n");
        USBADP_LOG(DEBUG, "[USBAdp]restData : [%d]\n", restData);
        if (startUELFlag == 1) {
            USBADP_LOG(DEBUG, "[USBAdp]splitDataSize : [%d]\n", splitDataSize);
            std::memcpy(temp2UelSendBuffer, aubsplitUelSendBuffer, static_cast<size_t>(splitDataSize));
            std::memcpy(temp2UelSendBuffer + splitDataSize, tempUelSendBuffer, static_cast<size_t>(restData));
            tempUelSendBuffer = temp2UelSendBuffer;
            restData += splitDataSize;
            startUELFlag = 0;
            splitPatternFlag = 0;
        }

        if (CheckUELCommand(tempUelSendBuffer, restData) == 1) {
            slPollTimeout = POLL_TIMEOUT_UEL;
            USBADP_LOG(DEBUG, "[USBAdp] start UEL, PollTimeout: %d\n", slPollTimeout);
            dataStart = UelPosition;
            USBADP_LOG(DEBUG, "[USBAdp]dataStart: [%d]\n", dataStart);

            if (dataStart == 0) {
                restData -= UEL_PATTERN_SIZE;
                if (jobCounter == 1) {
                    USBADP_LOG(DEBUG, "[USBAdp]Inside (jobCounter == 1) \n");
                    if (!openJob(d, "[USBAdp]Going to call RegisterJob...New Job Created! 3\n")) return;
                    USBADP_LOG(DEBUG,
                               "[USBAdp]Inside (CheckUELCommand(tempUelSendBuffer+UEL_PATTERN_SIZE, restData))\n");
                    if (CheckUELCommand(tempUelSendBuffer + UEL_PATTERN_SIZE, restData) == 1) {
                        // Both UELs and what lies between them.
                        dataEnd = UelPosition + 2 * UEL_PATTERN_SIZE;
                        USBADP_LOG(DEBUG, "[USBAdp]UelPosition: [%d]\n", UelPosition);
                        USBADP_LOG(DEBUG, "[USBAdp]dataEnd: [%d]\n", dataEnd);
                        USBADP_LOG(DEBUG, "[USBAdp]Just before PassData(tempUelSendBuffer, dataEnd); -- 3\n");
                        d.PassData(tempUelSendBuffer, dataEnd);
                        tempUelSendBuffer += dataEnd;
                        restData += dataStart + UEL_PATTERN_SIZE - dataEnd;
                        if (jobCounter == 2) {
                            USBADP_LOG(DEBUG, "[USBAdp]Inside (jobCounter == 2)  -- 1\n");
                            USBADP_LOG(INFO, "[USBAdp]NotifyEndOfData() called -- 4\n");
                            d.NotifyEndOfData();
                            USBADP_LOG(INFO, "[USBAdp]prnSizeReceived : %ld\n", static_cast<long>(prnSizeReceived));
                            InitializeVars();
                            slPollTimeout = POLL_TIMEOUT_IDLE;
                            USBADP_LOG(DEBUG, "[USBAdp] EndUEL2, PollTimeout: %d\n", slPollTimeout);
                        }
                    } else if (splitPatternFlag != 1) {
                        // The whole rest, opening UEL included; the job stays open.
                        dataEnd = restData + UEL_PATTERN_SIZE;
                        USBADP_LOG(DEBUG, "[USBAdp]Just before PassData(tempUelSendBuffer, dataEnd); -- 5\n");
                        d.PassData(tempUelSendBuffer, dataEnd);
                        restData = 0;
                        return;
                    } else {
                        USBADP_LOG(DEBUG,
                                   "[USBAdp]splitpattern case (incase when start of UEL may be splitted at the end)\n");
                        startUELFlag = 1;
                        dataEnd = restData + UEL_PATTERN_SIZE - splitPatternMarker;
                        USBADP_LOG(DEBUG, "[USBAdp]splitPatternMarker: [%d]\n", splitPatternMarker);
                        USBADP_LOG(DEBUG, "[USBAdp]Just before PassData(tempUelSendBuffer, dataEnd); -- 4\n");
                        d.PassData(tempUelSendBuffer, dataEnd);
                        tempUelSendBuffer += dataEnd;
                        std::memcpy(aubsplitUelSendBuffer, tempUelSendBuffer, static_cast<size_t>(splitPatternMarker));
                        splitDataSize = splitPatternMarker;
                        splitPatternMarker = 0;
                        restData = 0;
                        return;
                    }
                } else if (jobCounter == 2) {
                    // A closing UEL at the start of the chunk.
                    USBADP_LOG(DEBUG, "[USBAdp]Inside (jobCounter  == 2) -- 2\n");
                    USBADP_LOG(DEBUG,
                               "[USBAdp]Just before PassData(tempUelSendBuffer, dataStart + UEL_PATTERN_SIZE); -- 6\n");
                    d.PassData(tempUelSendBuffer, UEL_PATTERN_SIZE);
                    tempUelSendBuffer += UEL_PATTERN_SIZE;
                    USBADP_LOG(INFO, "[USBAdp]NotifyEndOfData() called -- 5\n");
                    endJob(d);
                    USBADP_LOG(DEBUG, "[USBAdp] EndUEL3, PollTimeout: %d\n", slPollTimeout);
                }
                // Any other count delivers nothing for this UEL; the search
                // goes on over what is left.
                USBADP_LOG(DEBUG, "[USBAdp] again trying to loop with restData: [%d]\n", restData);
                continue;
            }

            USBADP_LOG(DEBUG, "[USBAdp]Inside dataStart != 0 \n");
            slPollTimeout = POLL_TIMEOUT_IDLE;
            if (!openJob(d, "[USBAdp]Going to call RegisterJob...New Job Created! 2\n")) return;
            // The data in front of the UEL and the UEL itself.
            dataEnd = UelPosition + UEL_PATTERN_SIZE;
            USBADP_LOG(DEBUG, "[USBAdp]Just before PassData(tempUelSendBuffer, dataEnd); -- 2\n");
            d.PassData(tempUelSendBuffer, dataEnd);
            tempUelSendBuffer += dataEnd;
            restData -= dataEnd;
            if (restData == 0 && jobCounter != 2) return;
            USBADP_LOG(INFO, "[USBAdp]NotifyEndOfData() called -- 3\n");
            endJob(d);
            USBADP_LOG(DEBUG, "[USBAdp] EndUEL1, PollTimeout: %d\n", slPollTimeout);
            continue;
        }

        if (splitPatternFlag != 1) {
            if (readFlag != 1) {
                if (!openJob(d, "[USBAdp]Going to call RegisterJob...New Job Created! 5\n")) return;
                jobCounter += 1;
            }
            USBADP_LOG(DEBUG, "[USBAdp]Just before PassData(tempUelSendBuffer, restData); -- 8\n");
            d.PassData(tempUelSendBuffer, restData);
            restData = 0;
            return;
        }

        // The chunk ends inside a UEL: deliver what is in front of it, hold the rest.
        dataStart = UelPosition;
        if (dataStart != 0) {
            USBADP_LOG(DEBUG, "[USBAdp]Inside dataStart != 0 \n");
            if (readFlag != 1) {
                if (!openJob(d, "[USBAdp]Going to call RegisterJob...New Job Created! 4\n")) return;
                jobCounter += 1;
            }
            dataEnd = UelPosition;
            USBADP_LOG(DEBUG, "[USBAdp]Just before PassData(tempUelSendBuffer, dataEnd); -- 7\n");
            d.PassData(tempUelSendBuffer, dataEnd);
            tempUelSendBuffer += dataEnd;
            restData -= dataEnd;
        }
        USBADP_LOG(DEBUG, "[USBAdp]splitpattern case\n");
        startUELFlag = 1;
        std::memcpy(aubsplitUelSendBuffer, tempUelSendBuffer, static_cast<size_t>(restData));
        splitDataSize = restData;
        restData = 0;
        return;
    }
}

// No data for a whole poll period: it ends the open job, or delivers held UEL
// bytes as a job of their own.
void onSilence(const TPrintDelivery &d) {
    if (readFlag == 1) {
        USBADP_LOG(INFO, "[USBAdp]NotifyEndOfData() called -- 2\n");
        passHeldBytes(d);
        d.NotifyEndOfData();
        USBADP_LOG(INFO, "[USBAdp]prnSizeReceivedd : %ld\n", static_cast<long>(prnSizeReceived));
        InitializeVars();
        return;
    }
    if (startUELFlag != 1) return;
    readFlag = 1;
    USBADP_LOG(INFO, "[USBAdp] Going to call RegisterJob...New Job Created! 1\n");
    S8 r = d.RegisterJob(PrndataFileName);
    USBADP_LOG(INFO, "[USBAdp] receiving %d\n", r);
    if (r < 0) {
        USBADP_LOG(ERROR, "[USBAdp] returning back\n");
        readFlag = 0;
        return;
    }
    USBADP_LOG(DEBUG, "[USBAdp]splitDataSize: [%d]\n", splitDataSize);
    USBADP_LOG(DEBUG, "[USBAdp]Just before PassData(aubsplitUelSendBuffer, splitDataSize) -- 1\n");
    d.PassData(aubsplitUelSendBuffer, splitDataSize);
    USBADP_LOG(INFO, "[USBAdp]NotifyEndOfData() called -- 1\n");
    d.NotifyEndOfData();
    InitializeVars();
}

void setSerial(const U8 *text, size_t len) {
    std::memset(aub_serial_str, 0, sizeof aub_serial_str);
    std::memcpy(aub_serial_str, text, std::min(len, sizeof aub_serial_str - 1));
}

void setDefaultSerial() { setSerial(aubCONDefaultUSBSerialNumber, sizeof aubCONDefaultUSBSerialNumber); }

}  // namespace

void InitializeVars(void) {
    prnSizeReceived = 0;
    readFlag = 0;
    jobCounter = 0;
    splitPatternFlag = 0;
    startUELFlag = 0;
    splitDataSize = 0;
    dataStart = 0;
}

namespace {

// One transfer read whole at the start of a pass: the two classification
// bytes and up to RX_BUFFER_SIZE behind them, what the two reads of the
// classifier's bytes and of the data would have taken.
constexpr size_t kFirstRead = RX_BUFFER_SIZE + 2;
static_assert(TEMP_SEND_BUFFER_SIZE >= kFirstRead);

// Waits for host data and reads up to `size` bytes into dst; the first two
// (or the first and, when the transfer held one byte, the first of the next)
// go to cls. The count of classification bytes (2, or 1 when nothing came
// behind a single byte), -1 for none; *behind = bytes read behind the two.
S32 readFirst(U8 *dst, size_t size, U8 *cls, S32 *behind) {
    *behind = 0;
    const int64_t start = Wait_NowMs();
    const S32 period = slPollTimeout;
    short revents = 0;
    int r = pollPrn(period, &revents);
    if (r < 0) {
        // Interrupted only to park: not an error, and not a silence either.
        if (errno == EINTR) return -1;
        USBADP_LOG(ERROR, "[USBAdp] Error in poll in ReadDataClassifier, errno: %d\n", errno);
        idleRestOfPeriod(start, period);
        return -1;
    }
    if (r == 0) {
        fallBackAfterUelTimeout();
        return -1;
    }
    ssize_t n = Wait_Read(fdPrn.load(), dst, size, shouldPark);
    int err = errno;
    if (n > 2) *behind = static_cast<S32>(n - 2);
    if (n > 2) n = 2;
    if (n >= 1 && cls != dst) std::memcpy(cls, dst, static_cast<size_t>(n));
    if (n == 1) {
        // The host's transfer held one byte: the selector is in the next one.
        if (pollPrn(slPollTimeout, &revents) > 0 && Wait_Read(fdPrn.load(), cls + 1, 1, shouldPark) == 1) n = 2;
    }
    USBADP_LOG(DEBUG, "[USBAdp] slReadBytes: %ld, [%#x %#x]\n", static_cast<long>(n), cls[0], cls[1]);
    if (n < 0) {
        if (err == EINTR) return -1;
        USBADP_LOG(ERROR, "[USBAdp] Error in read in ReadDataClassifier, errno: %d\n", err);
        idleRestOfPeriod(start, period);
        return -1;
    }
    // Ready but nothing to read: counts as no data.
    if (n == 0) {
        if (Wait_HungUp(revents)) idleRestOfPeriod(start, period);
        return -1;
    }
    return static_cast<S32>(n);
}

}  // namespace

S32 USBAdapter_ReadDataClassifier(U8 *buf) {
    S32 behind = 0;
    return readFirst(buf, 2, buf, &behind);
}

S32 USBAdapter_AllocateReadBuffers(void) {
    if (received_data) return 1;
    struct {
        U8 **slot;
        size_t size;
        const char *failure;
    } const buffers[] = {
        {&received_data, RX_BUFFER_SIZE, "[USBAdp] Malloc failed for received_data, errno: %d\n"},
        {&vlx_command, FRM_DETECT_BUFFER_SIZE, "[USBAdp] Malloc failed for vlx_command, errno: %d\n"},
        {&firmware_command, FRM_DETECT_BUFFER_SIZE, "[USBAdp] Malloc failed for firmware_command, errno: %d\n"},
        {&tempSendBuffer, TEMP_SEND_BUFFER_SIZE, "[USBAdp] Malloc failed for tempSendBuffer: %d\n"},
        {&temp2UelSendBuffer, TEMP2_UEL_SEND_BUFFER_SIZE, "[USBAdp] Malloc failed for temp2UelSendBuffer: %d\n"},
    };
    for (const auto &b : buffers) {
        *b.slot = static_cast<U8 *>(std::malloc(b.size));
        if (*b.slot) continue;
        USBADP_LOG(ERROR, b.failure, errno);
        for (const auto &f : buffers) {
            std::free(*f.slot);
            *f.slot = nullptr;
        }
        return 0;
    }
    return 1;
}

void USBAdapter_ReadPass(void) {
    const TPrintDelivery &d = USBPrint_Delivery();
    USBADP_LOG(DEBUG, "[USBAdp]Prn file Handle fdPrn is [%d],readFlag:%d,PollTimeout:%d\n", fdPrn.load(), readFlag,
               slPollTimeout);
    S32 firmRes = 0;
    TUSBAdp_ParserID enParserID = enOther;
    bool readMore = false;
    // Bytes of the transfer read behind the classification bytes, in place in
    // tempSendBuffer; what the read of more data would have given.
    S32 behind = 0;
    // The last chunk ended inside a UEL: what comes next is its rest, not a new
    // stream for the classifier. It is read at once, so a closing UEL cut after
    // its 7th or 8th byte ends the job without waiting for silence.
    const bool heldUel = startUELFlag == 1;
    if (heldUel) {
        readMore = true;
    } else if (S32 got = Wait_PutBackLeft(fdPrn.load()) > 0 ? USBAdapter_ReadDataClassifier(aubcommand)
                                                                : readFirst(tempSendBuffer, kFirstRead, aubcommand, &behind);
               got == -1) {
        // Parking ends an open job on the way out, not as a silence.
        if (!shouldPark()) onSilence(d);
        return;
    } else if (got == 1) {
        // One byte and then nothing: it cannot select an application.
        firmware_command[0] = aubcommand[0];
        firmRes = 1;
        USBADP_LOG(INFO, "[USBAdp] firmRes: %ld, enParserID: %d\n", static_cast<long>(firmRes),
                   static_cast<int>(enParserID));
    } else {
        if (behind > 0 && USBAdp_ParserOf(aubcommand) != enOther) {
            // A host application reads the node itself: it finds the rest of
            // the transfer there first.
            std::memcpy(received_data, tempSendBuffer + 2, static_cast<size_t>(behind));
            Wait_PutBack(fdPrn.load(), received_data, static_cast<size_t>(behind), behind + 2 == S32{kFirstRead});
            behind = 0;
        }
        S32 r = USBAdpater_StartDataClassifier(aubcommand, firmware_command, &firmRes, &enParserID);
        if (r == 0) {
            USBADP_LOG(INFO, "[USBAdp] Host appliction executed successfully\n");
            return;
        }
        if (r != -1) {
            USBADP_LOG(ERROR, "[USBAdp] Error in executing Host App\n");
            return;
        }
        USBADP_LOG(INFO, "[USBAdp] firmRes: %ld, enParserID: %d\n", static_cast<long>(firmRes),
                   static_cast<int>(enParserID));
        if (firmRes < 0 || firmRes > FRM_DETECT_BUFFER_SIZE) {
            USBADP_LOG(ERROR, "[USBAdp] Invalid firmRes: %ld\n", static_cast<long>(firmRes));
            return;
        }
        readMore = enParserID == enOther || enParserID == enIDS_PARSER || enParserID == enMAA_PARSER ||
                   (enParserID == enPJL_PARSER && firmRes == FRM_DETECT_BUFFER_SIZE);
    }

    S32 prn_read_ret = 0;
    if (readMore && behind > 0) {
        // Already here, straight behind the two classification bytes.
        USBADP_LOG(DEBUG, "[USBAdp] PollTimeout -- 2: %d\n", slPollTimeout);
        USBADP_LOG(DEBUG, "[USBAdp] slRet from poll: %d\n", 1);
        USBADP_LOG(DEBUG, "[USBAdp]n revents in fd[0]: %d\n", POLLIN);
        prn_read_ret = behind;
        USBADP_LOG(DEBUG, "[USBAdp]Got the data with size[%d]\n", prn_read_ret);
    } else if (readMore) {
        USBADP_LOG(DEBUG, "[USBAdp] PollTimeout -- 2: %d\n", slPollTimeout);
        const int64_t start = Wait_NowMs();
        const S32 period = slPollTimeout;
        short revents = 0;
        int slRet = pollPrn(period, &revents);
        USBADP_LOG(DEBUG, "[USBAdp] slRet from poll: %d\n", slRet);
        if (revents) USBADP_LOG(DEBUG, "[USBAdp]n revents in fd[0]: %d\n", revents);
        if (slRet > 0) {
            // Straight behind the classifier's bytes: the chunk is whole without
            // a copy. tempSendBuffer holds FRM_DETECT_BUFFER_SIZE + RX_BUFFER_SIZE.
            ssize_t n = Wait_Read(fdPrn.load(), tempSendBuffer + firmRes, RX_BUFFER_SIZE, shouldPark);
            if (n > 0) {
                prn_read_ret = static_cast<S32>(n);
                USBADP_LOG(DEBUG, "[USBAdp]Got the data with size[%d]\n", prn_read_ret);
            } else if (n < 0) {
                USBADP_LOG(ERROR, "[USBAdp] Error in read of print data, errno: %d\n", errno);
            }
        }
        if (heldUel && prn_read_ret == 0) {
            // Nothing behind the held bytes: this pass was a silence.
            if (shouldPark()) return;
            if (slRet == 0) fallBackAfterUelTimeout();
            // An empty transfer is a silence of its own; a hung-up node
            // takes the period.
            if (slRet < 0 || Wait_HungUp(revents)) idleRestOfPeriod(start, period);
            onSilence(d);
            return;
        }
    } else {
        USBADP_LOG(DEBUG, "[USBAdp] Data less than 80bytes: %d\n", firmRes);
    }

    std::memcpy(tempSendBuffer, firmware_command, static_cast<size_t>(firmRes));
    if (prn_read_ret > 0) {
        USBADP_LOG(DEBUG, "[USBAdp] Normal memcpy\n");
    } else {
        USBADP_LOG(DEBUG, "[USBAdp] data less than 80 bytes\n");
    }
    USBADP_LOG(DEBUG, "[USBAdp](prn_read_ret + firmRes) as : %ld\n", static_cast<long>(prn_read_ret + firmRes));
    prnSizeReceived += static_cast<U32>(prn_read_ret + firmRes);
    tempUelSendBuffer = tempSendBuffer;
    restData = prn_read_ret + firmRes;
    dataEnd = 0;
    frameChunk(d);
}

void USBAdapter_WakeReader(void) {
    if (int fd = parkWakeFd(); fd >= 0) {
        uint64_t one = 1;
        ssize_t n = ::write(fd, &one, sizeof one);
        (void)n;
    }
}

void USBAdapter_EndJobOnPark(void) {
    const TPrintDelivery &d = USBPrint_Delivery();
    // Transfer bytes not yet taken by a host application go the way of those
    // still in the driver (lost with the cable, or with the close).
    Wait_PutBack(-1, nullptr, 0, false);
    if (readFlag != 1) {
        // Held UEL bytes with no job: delivered as after silence, or they would
        // be taken for the start of whatever the host sends after re-plugging.
        if (startUELFlag == 1) onSilence(d);
        return;
    }
    USBADP_LOG(INFO, "[USBAdp]NotifyEndOfData() called when usb cable is plugged out in between of data transfer\n");
    passHeldBytes(d);
    d.NotifyEndOfData();
    InitializeVars();
    // The UEL job's long wait ended with it; the next one starts idle.
    slPollTimeout = POLL_TIMEOUT_IDLE;
}

void StartReading(void) {
    USBADP_LOG(INFO, "[USBAdp]Inside StartReading().\n");
    MAA_DummyUsbSpeed();
    MAA_SymbolReg();
    if (!USBAdapter_AllocateReadBuffers()) return;
    USBADP_LOG(INFO, "[USBAdp] Entered start reading function : started reading prn data.\n");
    startreading_enter = 1;
    for (;;) {
        IsCanClose = hibernation_flag.load() == 1 ? 1 : 0;
        while (!shouldPark()) USBAdapter_ReadPass();
        USBAdapter_EndJobOnPark();
        // The open job is ended: a close waiting for the reader need not
        // wait for the pause as well.
        if (hibernation_flag.load() == 1) IsCanClose = 1;
        // A second between looks at the flags, cut short once reading may go
        // on: a host that configures the device again is served at once.
        Wait_IdleRest(Wait_NowMs(), 1000, mayRead);
    }
}

bool USBAdapter_PreparePrnNode(void) {
    // The handler logs through the deferred path, whose worker must exist first.
    Log_StartDeferredWorker();
    struct sigaction sa;
    std::memset(&sa, 0, sizeof sa);
    sa.sa_handler = PrnScanSighandler;
    if (int r = sigemptyset(&sa.sa_mask); r < 0) {
        USBADP_LOG(ERROR, "[USBAdp]Error in sigemptyset for print. return value of sigemptyset is %ld\n",
                   static_cast<long>(r));
        return false;
    }
    if (int r = sigaction(SIGIO, &sa, nullptr); r < 0) {
        USBADP_LOG(ERROR, "[USBAdp][scan thread] sigaction failed for print. return value of sigaction is %ld\n",
                   static_cast<long>(r));
        return false;
    }

    const int fd = fdPrn.load();
    if (fd < 0) {
        USBADP_LOG(ERROR, "[USBAdp]Error in opening file: %s\n", MS_PRN_FILE_NAME);
        fdPrn = 0;  // so that a later set-up opens the node again
        return false;
    }
    // Asynchronous notification with the flags of descriptor 0, as the bridge
    // set-up has always done.
    if (::fcntl(fd, F_SETOWN, ::getpid()) < 0 || ::fcntl(fd, F_GETFL) < 0) {
        USBADP_LOG(ERROR, "[USBAdp]fcntl failed.\n");
        return false;
    }
    int stdinFlags = ::fcntl(0, F_GETFL);
    if (stdinFlags < 0 || ::fcntl(fd, F_SETFL, stdinFlags | FASYNC) < 0) {
        USBADP_LOG(ERROR, "[USBAdp]fcntl failed.\n");
        return false;
    }

    int flags = ::fcntl(fd, F_GETFL);
    if (flags < 0) {
        USBADP_LOG(ERROR, "[USBAdp] fcntl failed.\n");
        return false;
    }
    USBADP_LOG(INFO, "[USBAdp] fdPrn flags: %#x\n", flags);
    if (flags & O_NONBLOCK) {
        if (::fcntl(fd, F_SETFL, flags & ~O_NONBLOCK) < 0) {
            USBADP_LOG(ERROR, "[USBAdp] Fcntl failed\n");
            return false;
        }
        USBADP_LOG(INFO, "[USBAdp] FdPrn flags: %#x\n", ::fcntl(fd, F_GETFL));
    }

    if (::ioctl(fd, IOCNR_GET_MFP_TO, &stMFP_To) < 0) {
        USBADP_LOG(ERROR, "[USBAdp]ioctl failed.\n");
        return false;
    }
    stMFP_To.ul_prn_read_to = PRN_READ_TIMEOUT;
    if (::ioctl(fd, IOCNR_SET_MFP_TO, &stMFP_To) < 0) {
        USBADP_LOG(ERROR, "[USBAdp]ioctl failed.\n");
        return false;
    }
    return true;
}

void USBAdapter_SetDefaultSerial(void) { setDefaultSerial(); }

bool USBAdapter_SendIdentity(bool quietBackup) {
    if (SysPBA_IO_GPOInitBackUp() == 0) {
        if (quietBackup)
            USBADP_LOG(FINE, "[USBAdp]GPO Value Successfully Backed Up\n");
        else
            USBADP_LOG(INFO, "[USBAdp]GPO Value Successfully Backed Up\n");
    } else if (quietBackup) {
        USBADP_LOG(FINE, "[USBAdp]GPO Value backUp Failed\n");
    } else {
        USBADP_LOG(ERROR, "[USBAdp]GPO Value backUp Failed\n");
    }
    bool ok = true;
    if (MfpDevSetDesc() == -1) {
        USBADP_LOG(ERROR, "[USBAdp]MfpDevSetDesc failed.\n");
        ok = false;
    }
    if (USBADP_SetSerialNumber() == -1) {
        USBADP_LOG(ERROR, "[USBAdp]USBADP_SetSerialNumber failed\n");
        ok = false;
    }
    return ok;
}

void Initialization(void) {
    USBADP_LOG(INFO, "[USBAdp]Entered inside Initialization(), fdPrn:%d\n", fdPrn.load());
    SetDeviceIDString();

    if (fdPrn == 0) {
        USBADP_LOG(INFO, "[USBAdp]Initialization fdPrn open\n");
        fdPrn = ::open(MS_PRN_FILE_NAME, O_RDWR);
        if (fdPrn < 0) USBADP_LOG(ERROR, "[USBAdp]Cannot open the device file of print, errno:%d\n", errno);
    }
    USBADP_LOG(INFO, "[USBAdp] Initialization =====> USB DEVICE OPEN - Print : [%d]\n", fdPrn.load());
    if (!USBAdapter_PreparePrnNode()) return;

    std::memset(aub_serial_str, 0, sizeof aub_serial_str);
    if (checkMachineSerialinConf() == 0) {
        if (const U8 *serial = getSerialString()) {
            setSerial(serial, std::strlen(reinterpret_cast<const char *>(serial)));
        } else {
            USBADP_LOG(ERROR, "[USBAdp] =====> getSerialString() is NULL\n");
            setDefaultSerial();
        }
        USBADP_LOG(INFO, "[USBAdp]USB Serial ID after checkMachineSerialinConf [%s]\n", aub_serial_str);
    } else {
        setDefaultSerial();
    }
    USBADP_LOG(INFO, "[USBAdp]aub_serial_str: %s\n", aub_serial_str);
    if (!IsValidUSBSerialString(aub_serial_str)) {
        setDefaultSerial();
        USBADP_LOG(INFO, "[USBAdp]USB Serial ID found Invalid and Default is Set [%s]\n", aub_serial_str);
    }

    USBAdapter_SendIdentity(false);
    USBADP_LOG(INFO, "[USBAdp]Exited Initialization(), fdPrn:%d\n", fdPrn.load());
}

void USBAdapter_IF_PrintFunction(void) {
    USBADP_LOG(INFO, "[USBAdp]Inside USBAdapter_IF_PrintFunction\n");
    for (;;) {
        if (::msgrcv(globalPrnMsgQ.load(), &globalReceivingBuf, MSGBUF_TEXT_SIZE, 1, 0) < 0) {
            int err = errno;
            USBADP_LOG(ERROR, "[USBAdp][print thread] Message not received.\n");
            // A queue that is gone fails at once every time: do not spin.
            if (err != EINTR) ::sleep(1);
        }
        switch (globalReceivingBuf.status) {
        case MFP_DEV_INIT:
            USBADP_LOG(INFO, "[USBAdp]Inside MFP_DEV_INIT\n");
            std::memset(aub_mf_string, 0, sizeof aub_mf_string);
            std::memcpy(aub_mf_string, kManufacturer, sizeof kManufacturer - 1);
            Initialization();
            break;
        case MFP_DEV_CONFIGURED:
            USBADP_LOG(INFO, "****************MFP ready to test USB Print****************\n");
            USBADP_LOG(INFO, "USB Port up for USB Print and Scan\n");
            StartReading();
            // Only a failed allocation gets here: the reader ends.
            return;
        default: USBADP_LOG(INFO, "switch (globalReceivingBuf.status): Inside default case.\n"); break;
        }
    }
}
