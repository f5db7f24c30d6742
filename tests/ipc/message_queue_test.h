// What the queue object's tests share.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "ipc/TAVO_MessageQueue.h"
#include "support/log_capture.h"

namespace tavo::test {

inline const ExpectedLine kEntered{6, "MSGQUEUE", "++Entered\n"};
inline const ExpectedLine kGetEntered{6, "MSGQUEUE", "++Entered at get () \n"};
inline const ExpectedLine kExiting{6, "MSGQUEUE", "--Exiting\n"};

inline ExpectedLine line(unsigned level, const std::string& message) { return {level, "MSGQUEUE", message}; }

inline unsigned char* bytes(const char* text) { return reinterpret_cast<unsigned char*>(const_cast<char*>(text)); }

inline int put(android::TAVO_MessageQueue& queue, const std::string& message) {
    return queue.tavo_android_msg_queue_put(bytes(message.data()), static_cast<unsigned>(message.size()));
}

// The received message, or "-1".
inline std::string get(android::TAVO_MessageQueue& queue) {
    std::vector<unsigned char> buffer(android::TAVO_MessageQueue::MAX_MESSAGE_SIZE);
    auto size = static_cast<unsigned>(buffer.size());
    const int result = queue.tavo_android_msg_queue_get(buffer.data(), &size);
    if (result < 0) return std::to_string(result);
    EXPECT_EQ(static_cast<unsigned>(result), size);
    return {buffer.begin(), buffer.begin() + result};
}

inline int pending(android::TAVO_MessageQueue& queue) {
    int count = -1;
    EXPECT_EQ(queue.tavo_android_get_num_of_messages(&count), 0);
    return count;
}

}  // namespace tavo::test
