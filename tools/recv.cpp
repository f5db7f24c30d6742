// tavo recv: gets messages from a queue. tavo drop: gives back a use that was left with waiting messages.
#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <nlohmann/json.hpp>

#include "tools/command.h"
#include "tools/files.h"
#include "tools/numbers.h"
#include "tools/queue.h"
#include "tools/service.h"
#include "tools/stop_signals.h"
#include "tools/terminal.h"

namespace tavo::tool {
namespace {

struct Options {
    std::string key;
    unsigned long count = 1;
    bool follow = false;
    bool lines = false;
    bool json = false;
    double timeout = -1;
};

std::string base64_of(const std::string& bytes) {
    constexpr char kDigits[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    std::string text;
    for (size_t i = 0; i < bytes.size(); i += 3) {
        unsigned group = 0;
        for (size_t j = 0; j < 3; ++j) {
            group = group << 8 | (i + j < bytes.size() ? static_cast<unsigned char>(bytes[i + j]) : 0U);
        }
        for (size_t j = 0; j < 4; ++j) text += i + j <= bytes.size() ? kDigits[group >> (18 - 6 * j) & 63] : '=';
    }
    return text;
}

// Texts as they are; what is no UTF-8 as base64, because JSON has no bytes.
std::string json_of(int key, const std::string& message) {
    nlohmann::json json = {{"key", key}, {"size", message.size()}, {"text", message}};
    try {
        return json.dump() + "\n";
    } catch (const nlohmann::json::type_error&) {
        json.erase("text");
        json["base64"] = base64_of(message);
        return json.dump() + "\n";
    }
}

// Undoes taking a message that could not be written, as far as a queue lets one.
std::string put_back(Queue& queue, const std::string& message) {
    if (!queue.has_room()) {
        return "and the queue is full by now: the message of " + std::to_string(message.size()) + " bytes is lost";
    }
    queue.put(message);
    return "the message was put back, behind all others that wait";
}

class Receiver {
public:
    Receiver(const Options& options, int key)
        : queue_(key),
          key_(key),
          json_(options.json),
          adds_newline_(options.lines || isatty(STDOUT_FILENO) == 1),
          timeout_(milliseconds_of(options.timeout)) {}

    // False when a signal came instead. A message is taken only when there is somewhere to write it.
    bool receive() {
        switch (queue_.wait_for_message(timeout_, STDOUT_FILENO)) {
            case Wait::kStopped: return false;
            case Wait::kTimedOut: throw Failure("no message came in time");
            case Wait::kNoOutput: throw Failure("standard output is closed: no message was taken for it");
            default: break;
        }
        const std::string message = queue_.get();
        const std::string output = json_ ? json_of(key_, message) : message + (adds_newline_ ? "\n" : "");
        if (write_all(STDOUT_FILENO, output.data(), output.size())) return true;
        const std::string reason = strerror(errno);
        throw Failure("standard output cannot be written to (" + reason + "): " + put_back(queue_, message));
    }

private:
    Queue queue_;
    const int key_;
    const bool json_;
    const bool adds_newline_;
    const std::chrono::milliseconds timeout_;
};

int recv(const Options& options) {
    const int key = parse_key(options.key);
    if (fcntl(STDOUT_FILENO, F_GETFL) < 0) throw Failure("standard output is closed: no message was taken for it");
    const StopSignals signals;
    Receiver receiver(options, key);
    Progress progress(isatty(STDOUT_FILENO) != 1);
    for (unsigned long count = 0; options.follow || count < options.count;) {
        // Following ends in no other way, so that is a good end.
        if (!receiver.receive()) return options.follow ? int{kDone} : StopSignals::exit_status();
        progress.show(std::to_string(++count) + " messages received");
    }
    return kDone;
}

struct DropOptions {
    std::string key;
    bool force = false;
};

int drop(const DropOptions& options) {
    const int key = parse_key(options.key);
    const Binder service = find_service();
    const ServiceFigures figures = figures_of(service);
    const QueueFigures* queue = find_queue(figures, key);
    if (queue == nullptr) {
        throw Failure("the service has no queue " + options.key + ": 'tavo list' shows what it has");
    }
    if (queue->uses > 1 && !options.force) {
        throw Failure("queue " + options.key + " has " + std::to_string(queue->uses) +
                      " uses, so others are attached to it: end them first, or use --force to count one less");
    }
    if (queue->uses == 1 && queue->pending > 0 && !options.force) {
        throw Failure(std::to_string(queue->pending) + " bytes wait in queue " + options.key +
                      " and would be lost: receive them first, or use --force");
    }
    if (interface_of(service)->delete_message_queue(key) != 0) {
        throw Failure("queue " + options.key + " has gone meanwhile");
    }
    return kDone;
}

}  // namespace

void add_recv(CLI::App& app, Run& run) {
    CLI::App* command = nullptr;
    const auto options = add_command<Options>(app, run, "recv", "Gets messages from a queue", recv, command);
    command->add_option("KEY", options->key, "The queue's key, any whole number but 0")->required();
    auto* count = command->add_option("-n,--count", options->count, "Messages to receive; 1 without");
    command->add_flag("-f,--follow", options->follow, "Receive until a signal ends it")->excludes(count);
    auto* lines = command->add_flag("-l,--lines", options->lines, "A newline after each message, as on a terminal");
    command->add_flag("--json", options->json, "A line of JSON for each message")->excludes(lines);
    command->add_option("-t,--timeout", options->timeout, "Seconds to wait for each message; for ever without");
    command->footer("Messages come out as their bytes. One that cannot be written is put back.");
}

void add_drop(CLI::App& app, Run& run) {
    CLI::App* command = nullptr;
    const auto options = add_command<DropOptions>(
        app, run, "drop", "Gives back a use of a queue that nobody else will, such as 'tavo send' leaves", drop,
        command);
    command->add_option("KEY", options->key, "The queue's key, any whole number but 0")->required();
    command->add_flag("--force", options->force, "Even when others are attached, or messages wait");
}

}  // namespace tavo::tool
