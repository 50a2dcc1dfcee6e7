// Reading and removing the System V queues the library creates.
#pragma once

#include <sys/msg.h>

#include <optional>

#include "support/TempRoot.h"
#include "usbadapter/mfpbridge.h"

// Takes the next message without waiting; the status field, or nothing.
inline std::optional<int> TakeQueueStatus(int queueId) {
    TMessageBuf msg{};
    if (msgrcv(queueId, &msg, MSGBUF_TEXT_SIZE, 0, IPC_NOWAIT) != MSGBUF_TEXT_SIZE) return std::nullopt;
    return msg.status;
}

inline void RemoveQueue(int queueId) {
    if (queueId >= 0) msgctl(queueId, IPC_RMID, nullptr);
}

// The key file the library makes its queues on, inside a TempRoot.
inline constexpr const char *kQueueKeyFile = "/halvard/spool/tmp/testfile";

// The queue the library made for project id `proj` (5 print, 6 scan) under
// `root`, or -1.
inline int QueueOf(const TempRoot &root, int proj) {
    key_t key = ftok((root / kQueueKeyFile).c_str(), proj);
    return key == -1 ? -1 : msgget(key, 0);
}

// Removes both queues of `root`: a reused inode gives the same keys, so a
// crashed run's queues would otherwise be found again.
inline void RemoveQueues(const TempRoot &root) {
    RemoveQueue(QueueOf(root, 5));
    RemoveQueue(QueueOf(root, 6));
}
