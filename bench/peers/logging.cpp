// Lines of a log into a file in memory, by one thread and by two; and lines that the filter drops. What was written is
// read again after each round. The lines of all but the bare write carry the same: tag, level, time, process, thread.
#include <android/log.h>
#include <fcntl.h>
#include <spdlog/sinks/basic_file_sink.h>
#include <spdlog/spdlog.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cstring>

#include "helper.h"
#include "log/module_log.h"
#include "peer.h"

namespace tavo::peers {
namespace {

constexpr char kTag[] = "BENCH";

// --- the loggers: each writes line(value) into the file, or drops(value)

struct Bare {
    explicit Bare(int file) : file_(file) {}

    void line(uint64_t value) {
        char text[64];
        const int length =
            snprintf(text, sizeof text, "%d::value %llu\n", __LINE__, static_cast<unsigned long long>(value));
        if (write(file_, text, static_cast<size_t>(length)) != length) fail("write");
    }
    void drop(uint64_t value) {
        if (level_.load(std::memory_order_relaxed) > 0) line(value);
    }

    const int file_;
    std::atomic<int> level_{0};
};

// The library's log goes to standard error, and so does the platform's.
struct StandardError {
    explicit StandardError(int file) {
        if (dup2(file, STDERR_FILENO) < 0) fail("dup2");
    }
};

struct Platform : StandardError {
    using StandardError::StandardError;

    void line(uint64_t value) {
        __android_log_print(ANDROID_LOG_WARN, kTag, "%d::value %llu", __LINE__, static_cast<unsigned long long>(value));
    }
};

struct Ours : StandardError {
    explicit Ours(int file) : StandardError(file) { g_uiMxEnabledLogLevel = TAVO_LOG_WARNING; }

    void line(uint64_t value) {
        tavo_print_log(TAVO_LOG_WARNING, 0, __LINE__, kTag, "value %llu", static_cast<unsigned long long>(value));
    }
    void drop(uint64_t value) {
        tavo_print_log(TAVO_LOG_INFO, 0, __LINE__, kTag, "value %llu", static_cast<unsigned long long>(value));
    }
};

// As the library's own sources log.
struct OurMacro : Ours {
    using Ours::Ours;

    void drop(uint64_t value) { TAVO_LOG(kTag, TAVO_LOG_INFO, "value %llu", static_cast<unsigned long long>(value)); }
};

template <bool flushed>
struct Spdlog {
    explicit Spdlog(int file)
        : logger_(kTag, std::make_shared<spdlog::sinks::basic_file_sink_mt>("/proc/self/fd/" + std::to_string(file))) {
        logger_.set_level(spdlog::level::warn);
        logger_.set_pattern("%n %L %m-%d %H:%M:%S %P %t %v");
        logger_.flush_on(flushed ? spdlog::level::trace : spdlog::level::off);
    }
    ~Spdlog() { spdlog::drop_all(); }

    void line(uint64_t value) { logger_.warn("{}::value {}", __LINE__, value); }
    void drop(uint64_t value) { logger_.info("{}::value {}", __LINE__, value); }
    void flush() { logger_.flush(); }

    spdlog::logger logger_;
};

template <typename Logger>
void flush(Logger&) {}
template <>
void flush(Spdlog<false>& logger) {
    logger.flush();
}

// --- what is done with them

class File {
public:
    File() : file_(memfd_create("log", 0)) {
        if (file_ < 0 || fcntl(file_, F_SETFL, O_APPEND) != 0) fail("memfd_create");
    }
    ~File() { close(file_); }
    File(const File&) = delete;
    File& operator=(const File&) = delete;

    int descriptor() const { return file_; }

    // The numbers that the lines end with. Two threads' lines come in any order, so the sum has to do.
    void take(Flow& flow) {
        const off_t size = lseek(file_, 0, SEEK_END);
        std::string text(static_cast<size_t>(size), '\0');
        if (pread(file_, text.data(), text.size(), 0) != size || ftruncate(file_, 0) != 0) fail("pread");
        size_t start = 0;
        for (size_t end; (end = text.find('\n', start)) != std::string::npos; start = end + 1) {
            const size_t number = text.rfind(' ', end) + 1;
            ++flow.count;
            flow.checksum += strtoull(text.c_str() + number, nullptr, 10);
        }
        if (start != text.size()) ++flow.count;  // half a line is one too many
    }

private:
    const int file_;
};

template <typename Logger>
class Lines : public Party {
public:
    explicit Lines(int helper_cpu) {
        if (helper_cpu != kNoHelper) helper_.emplace(helper_cpu, [this](size_t operations) { write(operations); });
    }

    void run(size_t operations) override {
        if (helper_) {
            helper_->beside(operations, [this](size_t own) { write(own); });
        } else {
            write(operations);
        }
        const uint64_t threads = helper_ ? 2 : 1;
        tally_.out.count += threads * operations;
        tally_.out.checksum += threads * (operations * (operations + 1) / 2);
    }
    Tally tally() override {
        flush(logger_);
        file_.take(tally_.in);
        return tally_;
    }

private:
    void write(size_t operations) {
        for (uint64_t value = 1; value <= operations; ++value) logger_.line(value);
    }

    File file_;
    Logger logger_{file_.descriptor()};
    Tally tally_;
    std::optional<Helper> helper_;
};

// Nothing may come of them.
template <typename Logger>
class DroppedLines : public Party {
public:
    explicit DroppedLines(int) {}

    void run(size_t operations) override {
        for (uint64_t value = 1; value <= operations; ++value) logger_.drop(value);
    }
    Tally tally() override {
        flush(logger_);
        file_.take(tally_.in);
        return tally_;
    }

private:
    File file_;
    Logger logger_{file_.descriptor()};
    Tally tally_;
};

Contest written(const char* operation, int cpus, int helper_cpu) {
    return {"logging",
            operation,
            {},
            cpus,
            {alone<Lines<Bare>>("bare write", Role::limit, helper_cpu),
             alone<Lines<Ours>>("TAVO log", Role::ours, helper_cpu),
             alone<Lines<Platform>>("liblog", Role::peer, helper_cpu),
             alone<Lines<Spdlog<true>>>("spdlog, flushed", Role::peer, helper_cpu),
             alone<Lines<Spdlog<false>>>("spdlog, buffered", Role::peer, helper_cpu)}};
}

}  // namespace

std::vector<Contest> log_contests() {
    return {
        {"logging",
         "dropped line",
         {},
         1,
         {alone<DroppedLines<Bare>>("bare compare", Role::limit, kNoHelper),
          alone<DroppedLines<Ours>>("TAVO log", Role::ours, kNoHelper),
          alone<DroppedLines<OurMacro>>("TAVO log, in the library", Role::ours, kNoHelper),
          alone<DroppedLines<Spdlog<true>>>("spdlog", Role::peer, kNoHelper)}},
        written("written line", 1, kNoHelper),
        written("written line, two threads", 1, places(1).second),
        written("written line, two threads", 2, places(2).second),
    };
}

}  // namespace tavo::peers
