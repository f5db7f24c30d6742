// The queue API's handles, and what it says.
#pragma once

#include <gtest/gtest.h>

#include <filesystem>
#include <string>
#include <vector>

#include "ipc/TAVO_MessageQueue.h"
#include "ipc/log_lines.h"
#include "ipc/server.h"
#include "ipc/service_lookup.h"
#include "log/log_state.h"
#include "tavo_osal/init.h"
#include "tavo_osal/msg_queue.h"

namespace tavo::test {

constexpr char kLibrary[] = "libtavoosal.so";
constexpr TAVO_INT64 kUntouched = 0x5a5a5a5a5a5a5a5a;
// What stands in the messages for the functions that write them.
inline const std::string kAttachName = "TAVO_Status tavo_msg_queue_sender_init(TAVO_CHAR*, TAVO_INT64*)";
inline const std::string kLookupName = "android::sp<android::ITavoBinder> tavo_osal_get_service(TAVO_CHAR*)";

inline ExpectedLine line(unsigned level, const std::string& message) { return {level, kServiceTag, message}; }
inline const ExpectedLine kEntered = line(6, "++Entered\n");
inline const ExpectedLine kExiting = line(6, "--Exiting\n");

using Lines = std::vector<ExpectedLine>;
inline Lines operator+(Lines first, const Lines& second) {
    first.insert(first.end(), second.begin(), second.end());
    return first;
}

inline const Lines kLookupBegins = {
    line(3, "++Entered\n"),
    line(1, "++Test Point 2\n"),
    line(1, "acMqFile /sdcard/com.zorla.qirserver/android.tavo.osal\n"),
    line(1, "service name android.tavo.osal\n"),
};
inline const Lines kLookup = kLookupBegins + Lines{line(1, " got defaultservice android.tavo.osal\n"),  //
                                                   line(3, "--Exiting\n")};
inline const Lines kQueueTrace = {{6, kQueueTag, "++Entered\n"}, {6, kQueueTag, "--Exiting\n"}};
inline const Lines kCallTrace = {{6, kBinderTag, "++Entered\n"}, {6, kBinderTag, "--Exiting\n"}};

inline android::TAVO_MessageQueue& queue_of(TAVO_INT64 handle) {
    return *reinterpret_cast<android::TAVO_MessageQueue*>(static_cast<intptr_t>(handle));
}

// Ends a handle that the API does not end: one of this process's own, or one whose server is gone.
inline void drop(TAVO_INT64 handle) { delete &queue_of(handle); }

inline TAVO_Status attach(const std::string& text, TAVO_INT64* handle) {
    std::string name = text;
    return tavo_msg_queue_sender_init(name.data(), handle);
}

// The handle of a key, which must be had.
inline TAVO_INT64 attached(const std::string& text) {
    TAVO_INT64 handle = kUntouched;
    EXPECT_EQ(attach(text, &handle), TAVO_SUCCESS);
    EXPECT_GT(handle, 0);
    return handle;
}

inline TAVO_Status put(TAVO_INT64 handle, const std::string& message) {
    std::string copy = message;
    return tavo_msg_queue_put(handle, reinterpret_cast<unsigned char*>(copy.data()),
                              static_cast<unsigned>(copy.size()));
}

// The message, or the status as text.
inline std::string get(TAVO_INT64 handle) {
    static thread_local std::vector<unsigned char> buffer(TAVO_MSG_QUEUE_MAX_SIZE);
    auto size = static_cast<unsigned>(buffer.size());
    const TAVO_Status status = tavo_msg_queue_get(handle, buffer.data(), &size);
    return status == TAVO_SUCCESS ? std::string(buffer.begin(), buffer.begin() + size)
                                  : "status " + std::to_string(status);
}

class MsgQueueTest : public LogState {
protected:
    MsgQueueTest() { std::filesystem::remove_all(kMarkerDirectory); }
};

// The service is this process's own: what it holds can be asked for without a trace.
class OwnServerTest : public MsgQueueTest {
protected:
    OwnServerTest() {
        EXPECT_EQ(tavo_osal_init(25, 25), TAVO_SUCCESS);
        service_ = tavo_osal_get_service(nullptr);
    }
    // Takes every use of a key back; how many there were.
    int uses(int key) {
        int count = 0;
        while (service_->delete_message_queue(key) == 0) ++count;
        return count;
    }

    android::sp<android::ITavoBinder> service_;
};

}  // namespace tavo::test
