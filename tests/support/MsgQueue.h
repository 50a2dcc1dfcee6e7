// Reading and removing the System V queues the library creates.
#pragma once

#include <sys/msg.h>

#include <optional>

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
