// What the service holds, as its clients find it.
#pragma once

#include <gtest/gtest.h>
#include <sys/ioctl.h>

#include <cctype>
#include <functional>
#include <string>

#include "ipc/ITavoBinder.h"
#include "ipc/msg_queue_test.h"
#include "ipc/shared_memory_test.h"
#include "reliability/peer.h"
#include "support/eventually.h"

namespace tavo::test {

// Takes every use of a queue back; how many there were.
inline int take_queue_uses(int key) {
    const android::sp<android::ITavoBinder> service = tavo_osal_get_service(nullptr);
    if (service == nullptr) return -1;
    int count = 0;
    while (service->delete_message_queue(key) == 0) ++count;
    return count;
}

// The same of a block. The service does not tell when there is none left: the next block has no mark then.
inline int take_block_uses(uint32_t key) {
    const android::sp<android::ITavoBinder> service = tavo_osal_get_service(nullptr);
    if (service == nullptr) return -1;
    const auto take = [&] { service->delete_shared_mem(static_cast<int>(key)); };
    const Block marked(key, 100);
    marked.bytes()[99] = 'm';
    for (int count = 0;; ++count) {
        take();
        const Block found(key, 100);
        const bool is_last = found.bytes()[99] != 'm';
        take();  // this look's own
        if (is_last) return count;
    }
}

inline int bytes_in(int descriptor) {
    int bytes = -1;
    ioctl(descriptor, FIONREAD, &bytes);
    return bytes;
}

// A point's text as part of a test's name.
inline std::string words(const std::string& point) {
    std::string name;
    bool begins = true;
    for (const char c : point) {
        if (isalnum(static_cast<unsigned char>(c)) != 0) name += begins ? static_cast<char>(toupper(c)) : c;
        begins = isalnum(static_cast<unsigned char>(c)) == 0;
    }
    return name;
}

// Kills a client at every one of its calls to the platform while it obeys a command; how many there were.
inline int kill_everywhere(const std::string& calls, const std::string& before, const std::string& command,
                           const std::function<void()>& check) {
    for (int n = 1;; ++n) {
        Peer client;
        if (!before.empty()) {
            EXPECT_EQ(client.ask(before), kDone);
        }
        if (!client.is_killed_by(calls + " " + std::to_string(n), command)) return n - 1;
        SCOPED_TRACE(calls + " " + std::to_string(n));
        check();
        if (testing::Test::HasFailure()) return 0;
    }
}

// A server in a process of its own, and this process as one that looks on.
class CrashTest : public MsgQueueTest {
protected:
    CrashTest() : server_("serve") {
        // What a first call leaves in either process is no leak: connections and threads that stay.
        drop(attached("99"));
        EXPECT_EQ(take_queue_uses(99), 1);
    }
    // The service answers a client that comes anew.
    void expect_service() {
        Peer fresh("attach 98");
        EXPECT_EQ(fresh.ask("put 98 1000"), kDone);
        EXPECT_EQ(fresh.ask("get 98"), "1000 whole");
        EXPECT_EQ(fresh.ask("destroy 98"), kDone);
        EXPECT_EQ(fresh.ask("acquire 98 100"), kDone);
        EXPECT_EQ(fresh.ask("see 98"), "0");
        EXPECT_EQ(fresh.ask("release 98"), kDone);
        EXPECT_EQ(fresh.ask("delete 98 100"), kDone);
    }
    // Wherever a client is killed in a command that takes a use, that use is all it leaves, and at some of the points,
    // those behind the service's reply, it does. `take` takes the uses back and counts them.
    void expect_at_most_its_use_left(const std::string& calls, const std::string& command,
                                     const std::function<int()>& take) {
        const Holdings server(server_.pid());
        int uses = 0;
        const int points = kill_everywhere(calls, "", command, [&] {
            const int taken = take();
            EXPECT_TRUE(taken == 0 || taken == 1) << taken;
            uses += taken;
            EXPECT_TRUE(comes_back_to(server, server_.pid()));
        });
        EXPECT_GE(points, 1);
        EXPECT_GE(uses, 1);
        expect_service();
    }

    Peer server_;
};

}  // namespace tavo::test
