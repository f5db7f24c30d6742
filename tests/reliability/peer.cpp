#include "reliability/peer.h"

#include <signal.h>
#include <sys/resource.h>

#include <algorithm>
#include <fstream>
#include <iostream>
#include <map>
#include <memory>
#include <set>
#include <sstream>
#include <vector>

#include "reliability/crash_point.h"
#include "support/eventually.h"
#include "tavo_osal/init.h"
#include "tavo_osal/ipc_semaphore.h"
#include "tavo_osal/msg_queue.h"
#include "tavo_osal/shared_memory.h"

namespace tavo::test {
namespace {

// Setting the log preference writes to standard output, so answers are lines of a kind.
constexpr char kAnswer[] = "answer ";

// Kept whatever becomes of the process: what a handle owns is the library's.
struct State {
    std::map<std::string, TAVO_INT64> queues;
    std::map<std::string, void*> blocks;
    TAVO_INT64 semaphore = 0;
    std::unique_ptr<CrashPoint> point;
};
State& state() {
    static State& instance = *new State;
    return instance;
}

std::vector<unsigned char> message_of(size_t size) {
    std::vector<unsigned char> message(size);
    for (size_t i = 0; i < size; ++i) message[i] = static_cast<unsigned char>((i * 31 + size) % 251);
    return message;
}

std::string text_of(TAVO_Status status) { return std::to_string(status); }

std::string attach(const std::string& key) {
    std::string name = key;
    TAVO_INT64 handle = 0;
    const TAVO_Status status = tavo_msg_queue_sender_init(name.data(), &handle);
    if (status == TAVO_SUCCESS) state().queues[key] = handle;
    return text_of(status);
}

std::string put(const std::string& key, size_t size) {
    std::vector<unsigned char> message = message_of(size);
    message.resize(std::max<size_t>(size, 1));
    return text_of(tavo_msg_queue_put(state().queues.at(key), message.data(), static_cast<unsigned>(size)));
}

// A message's size is known to be right only when every byte is.
std::string get(const std::string& key) {
    std::vector<unsigned char> buffer(TAVO_MSG_QUEUE_MAX_SIZE);
    auto size = static_cast<unsigned>(buffer.size());
    const TAVO_Status status = tavo_msg_queue_get(state().queues.at(key), buffer.data(), &size);
    if (status != TAVO_SUCCESS) return text_of(status);
    buffer.resize(size);
    return std::to_string(size) + (buffer == message_of(size) ? " whole" : " short");
}

TavoShmHandle* handle_of(const std::string& key, uint32_t size) {
    TavoShmHandle* handle = nullptr;
    tavo_shm_init(static_cast<uint32_t>(std::stoul(key)), &handle, size);
    return handle;
}

std::string acquire(const std::string& key, uint32_t size) {
    TavoShmHandle* handle = handle_of(key, size);
    void* address = nullptr;
    const TAVO_Status status = tavo_shm_acquire(handle, &address);
    free(handle);
    if (status == TAVO_SUCCESS) state().blocks[key] = address;
    return text_of(status);
}

std::string release(const std::string& key) { return text_of(tavo_shm_release(state().blocks.at(key))); }

std::string remove(const std::string& key, uint32_t size) {
    TavoShmHandle* handle = handle_of(key, size);
    const TAVO_Status status = tavo_shm_delete(handle);
    if (status != TAVO_SUCCESS) free(handle);
    return text_of(status);
}

std::string hammer(const std::string& key) {
    std::set<std::string> statuses;
    while (statuses.empty() || (statuses.size() == 1 && *statuses.begin() == kDone)) {
        statuses.insert(attach(key));
        if (const auto queue = state().queues.find(key); queue != state().queues.end()) {
            const std::string status = text_of(tavo_msg_queue_destroy(queue->second));
            if (status == kDone) state().queues.erase(queue);
            statuses.insert(status);
        }
        const std::string acquired = acquire(key, 100);
        statuses.insert(acquired);
        if (acquired == kDone) statuses.insert(release(key));
        statuses.insert(remove(key, 100));
    }
    std::string text;
    for (const std::string& status : statuses) text += (text.empty() ? "" : " ") + status;
    return text;
}

// Calls for each of so many keys until a status is not 0, which is returned.
template <typename Call>
std::string each(int from, int count, Call call) {
    for (int key = from; key < from + count; ++key) {
        const std::string status = call(std::to_string(key));
        if (status != kDone) return status;
    }
    return kDone;
}

// A queue with a message, and a block, whose contents say which key they are of.
std::string hold(const std::string& key) {
    std::string status = attach(key);
    if (status == kDone) status = put(key, std::stoul(key));
    if (status == kDone) status = acquire(key, 4096);
    if (status == kDone) *static_cast<int*>(state().blocks.at(key)) = std::stoi(key);
    return status;
}

std::string drop_held(const std::string& key) {
    std::string status = text_of(tavo_msg_queue_destroy(state().queues.at(key)));
    if (status == kDone) status = release(key);
    return status == kDone ? remove(key, 4096) : status;
}

std::string check_held(const std::string& key) {
    std::string status = attach(key);
    if (status == kDone && get(key) != key + " whole") status = "another queue's message";
    if (status == kDone) status = put(key, std::stoul(key));
    if (status == kDone) status = acquire(key, 1);
    if (status == kDone && *static_cast<int*>(state().blocks.at(key)) != std::stoi(key)) status = "another block";
    return status == kDone ? drop_held(key) : status;
}

constexpr int kAll = 1000000;
constexpr char kAllGiven[] = "all";

std::string limit(rlim_t count) {
    rlimit now = {};
    getrlimit(RLIMIT_NOFILE, &now);
    now.rlim_cur = std::min(count, now.rlim_max);
    return std::to_string(setrlimit(RLIMIT_NOFILE, &now));
}

std::string obey(const std::string& line) {
    std::istringstream words(line);
    std::string command, key;
    words >> command;
    if (command == "arm") {
        std::string point;
        std::getline(words, point);
        state().point = nullptr;
        state().point = std::make_unique<CrashPoint>(point);
        return kDone;
    }
    if (command == "serve") return text_of(tavo_osal_init(25, 25));
    if (command == "lock") return text_of(tavo_semaphore_acquire(state().semaphore));
    if (command == "unlock") return text_of(tavo_semaphore_release(state().semaphore));
    unsigned number = 0;
    words >> key >> number;
    if (command == "attach") return attach(key);
    if (command == "destroy") return text_of(tavo_msg_queue_destroy(state().queues.at(key)));
    if (command == "put") return put(key, number);
    if (command == "get") return get(key);
    if (command == "acquire") return acquire(key, number);
    if (command == "release") return release(key);
    if (command == "delete") return remove(key, number);
    if (command == "see") return std::to_string(*static_cast<unsigned char*>(state().blocks.at(key)));
    if (command == "set") {
        *static_cast<unsigned char*>(state().blocks.at(key)) = static_cast<unsigned char>(number);
        return kDone;
    }
    if (command == "semaphore") {
        return text_of(tavo_semaphore_init(static_cast<uint32_t>(std::stoul(key)), &state().semaphore));
    }
    if (command == "hammer") return hammer(key);
    const int first = static_cast<int>(strtol(key.c_str(), nullptr, 10));
    if (command == "hold") return each(first, static_cast<int>(number), hold);
    if (command == "check") return each(first, static_cast<int>(number), check_held);
    if (command == "drop") return each(first, static_cast<int>(number), drop_held);
    if (command == "flood") return each(first, kAll, attach);
    if (command == "ebb") {
        return each(first, kAll, [](const std::string& held) {
            const auto queue = state().queues.find(held);
            if (queue == state().queues.end()) return std::string(kAllGiven);
            return text_of(tavo_msg_queue_destroy(queue->second));
        });
    }
    if (command == "soak")
        return each(first, TAVO_SHM_MAX_ACQUIRED, [](const std::string& block) { return acquire(block, 100); });
    if (command == "limit") return limit(std::stoul(key));
    return "no such command: " + line;
}

}  // namespace

TEST_ROLE(peer) {
    for (std::string line; std::getline(std::cin, line);) {
        const std::string answer = obey(line);
        std::cout << "\n" << kAnswer << answer << std::endl;
    }
    return 0;
}

std::string Peer::answer() {
    for (int empty = 0; empty < 10;) {
        const std::string line = process_.read_line();
        if (line.rfind(kAnswer, 0) == 0) return line.substr(sizeof kAnswer - 1);
        empty = line.empty() ? empty + 1 : 0;  // also at the end of the output
    }
    return kEnded;
}

bool Peer::is_killed_by(const std::string& point, const std::string& command) {
    EXPECT_EQ(ask("arm " + point + " kill own"), kDone);
    if (ask(command) != kEnded) return false;
    EXPECT_EQ(process_.wait(), -SIGKILL) << point << ": " << command;
    return true;
}

void Peer::crash(const std::string& point, const std::string& command) {
    EXPECT_TRUE(is_killed_by(point, command)) << point << ": " << command;
}

void Peer::stop(const std::string& point, const std::string& command) {
    EXPECT_EQ(ask("arm " + point + " stop any"), kDone);
    if (command.empty()) return;
    tell(command);
    EXPECT_TRUE(has_stopped(pid())) << point << ": " << command;
}

void Peer::kill() {
    process_.kill(SIGKILL);
    EXPECT_EQ(process_.wait(), -SIGKILL);
}

bool is_in(pid_t pid, long call) {
    std::ifstream file("/proc/" + std::to_string(pid) + "/syscall");
    long number = -1;
    std::string argument;
    // Standard input and output are where it waits for commands.
    return file >> number >> argument && number == call && std::stoull(argument, nullptr, 16) > 2;
}

testing::AssertionResult waits_in(pid_t pid, long call) {
    if (comes_true([&] { return is_in(pid, call); })) return testing::AssertionSuccess();
    return testing::AssertionFailure() << "never seen in system call " << call;
}

testing::AssertionResult comes_back_to(const Holdings& before, pid_t pid) {
    if (comes_true([&] { return Holdings(pid).within(before); })) return testing::AssertionSuccess();
    const Holdings now(pid);
    return testing::AssertionFailure() << "descriptors " << before.descriptors << " -> " << now.descriptors
                                       << ", threads " << before.threads << " -> " << now.threads << ", blocks "
                                       << before.blocks << " -> " << now.blocks;
}

}  // namespace tavo::test
