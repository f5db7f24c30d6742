// tavo send: puts messages into a queue.
#include <unistd.h>

#include "tools/command.h"
#include "tools/files.h"
#include "tools/numbers.h"
#include "tools/queue.h"
#include "tools/service.h"
#include "tools/stop_signals.h"
#include "tools/terminal.h"

namespace tavo::tool {
namespace {

constexpr size_t kMaxSize = TAVO_MSG_QUEUE_MAX_SIZE;

struct Options {
    std::string key;
    std::string text;
    bool has_text = false;
    std::string file;
    bool lines = false;
    double timeout = -1;
};

std::string too_long(const std::string& what, const char* way_out) {
    return what + " is too long: a message has at most " + std::to_string(kMaxSize) + " bytes" + way_out;
}

// Puts messages one after another, and knows how many when it is asked to stop.
class Sender {
public:
    Sender(int key, double timeout) : queue_(key), timeout_(milliseconds_of(timeout)) {}

    // False when a signal came instead. The wait is for room to begin in: a message that has been begun is finished,
    // because half a message would spoil the queue for everybody.
    bool send(const std::string& message) {
        switch (queue_.wait_for_room(timeout_)) {
            case Wait::kStopped: return false;
            case Wait::kTimedOut: throw Failure("the queue is full, and nobody has made room in time" + sent_so_far());
            default: break;
        }
        queue_.put(message);
        ++count_;
        return true;
    }
    size_t count() const { return count_; }
    std::string sent_so_far() const {
        return count_ == 0 ? "" : " (the first " + std::to_string(count_) + " messages were sent)";
    }

private:
    Queue queue_;
    const std::chrono::milliseconds timeout_;
    size_t count_ = 0;
};

int stopped(const Sender& sender) {
    say("stopped after " + std::to_string(sender.count()) + " messages");
    return StopSignals::exit_status();
}

int send_one(int key, const std::string& message, double timeout) {
    Sender sender(key, timeout);
    return sender.send(message) ? kDone : stopped(sender);
}

int send_whole(int key, const Options& options) {
    Input input(options.file);
    const std::string message = input.read_up_to(kMaxSize + 1);
    if (StopSignals::received() != 0) return StopSignals::exit_status();
    if (message.size() > kMaxSize) {
        throw Failure(too_long(input.name(), ": use --lines to send each line as a message, or split it"));
    }
    return send_one(key, message, options.timeout);
}

int send_lines(int key, const Options& options) {
    Input input(options.file);
    Sender sender(key, options.timeout);
    Progress progress;
    for (std::string line; input.read_line(line, kMaxSize + 1);) {
        if (line.size() > kMaxSize) {
            throw Failure(too_long("line " + std::to_string(sender.count() + 1) + " of " + input.name(), "") +
                          sender.sent_so_far());
        }
        if (!sender.send(line)) return stopped(sender);
        progress.show(std::to_string(sender.count()) + " messages sent");
    }
    return StopSignals::received() != 0 ? stopped(sender) : kDone;
}

int send(const Options& options) {
    const int key = parse_key(options.key);
    Options from = options;
    if (options.has_text && options.text == "-" && options.file.empty()) {
        from.file = "-";
    } else if (options.has_text == !options.file.empty()) {
        throw Misuse("send what? A TEXT, a file (--file FILE) or standard input (-); 'tavo send --help' tells more");
    }
    const StopSignals signals;
    if (!from.file.empty()) return from.lines ? send_lines(key, from) : send_whole(key, from);
    if (options.lines) throw Misuse("--lines is for a file or standard input");
    if (options.text.size() > kMaxSize) throw Failure(too_long("the text", ""));
    return send_one(key, options.text, options.timeout);
}

}  // namespace

void add_send(CLI::App& app, Run& run) {
    CLI::App* command = nullptr;
    const auto options = add_command<Options>(app, run, "send", "Puts messages into a queue", send, command);
    command->add_option("KEY", options->key, "The queue's key, any whole number but 0")->required();
    command->add_option("TEXT", options->text, "The message; - for standard input")
        ->each([options](const std::string&) { options->has_text = true; });
    command->add_option("-f,--file", options->file, "Send this file, as one message; - for standard input");
    command->add_flag("-l,--lines", options->lines, "Send each line of the file as a message, without its end");
    command->add_option("-t,--timeout", options->timeout, "Seconds to wait for room in a full queue; for ever without");
    command->footer("A message has at most 409600 bytes. Keys below 0 and texts with - in front go behind --.");
}

}  // namespace tavo::tool
