#include "tools/service.h"

#include <binder/IServiceManager.h>
#include <fcntl.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <condition_variable>
#include <cstring>
#include <mutex>
#include <nlohmann/json.hpp>
#include <thread>

#include "ipc/service_location.h"
#include "tools/command.h"

namespace tavo::tool {
namespace {

using android::sp;
using android::status_t;
using android::String16;
using std::chrono::milliseconds;

constexpr milliseconds kPatience(5000);
std::atomic<bool> g_given_up{false};

std::string read_to_end(int fd) {
    std::string text;
    char piece[4096];
    for (;;) {
        const ssize_t count = read(fd, piece, sizeof piece);
        if (count < 0 && errno == EINTR) continue;
        if (count <= 0) return text;
        text.append(piece, static_cast<size_t>(count));
    }
}

// The service writes while we read: its answer may be more than a pipe holds.
struct DumpCall {
    status_t status = android::NO_ERROR;
    std::string text;

    void run(const Binder& service, const std::vector<std::string>& arguments) {
        android::Vector<String16> args;
        for (const std::string& argument : arguments) args.add(String16(argument.c_str()));
        int ends[2];
        if (pipe2(ends, O_CLOEXEC) != 0) {
            status = -errno;
            return;
        }
        std::thread reader([this, end = ends[0]] { text = read_to_end(end); });
        status = service->dump(ends[1], args);
        close(ends[1]);
        reader.join();
        close(ends[0]);
    }
};

int number_of(const nlohmann::json& figure) { return figure.is_number() ? figure.get<int>() : -1; }

ServiceFigures parse_figures(const std::string& text) {
    const auto json = nlohmann::json::parse(text);
    ServiceFigures figures = {};
    figures.process = json.at("process");
    figures.has_queue_table = json.at("queue_table");
    figures.queue_room = json.at("queue_room");
    for (const auto& queue : json.at("queues")) {
        figures.queues.push_back({queue.at("key"), queue.at("uses"), queue.at("read_end"), queue.at("write_end"),
                                  number_of(queue.at("capacity")), number_of(queue.at("pending"))});
    }
    figures.has_block_list = json.at("block_list");
    figures.block_limit = json.at("block_limit");
    for (const auto& block : json.at("blocks")) {
        figures.blocks.push_back({block.at("key"), block.at("uses"), block.at("size"), block.at("references")});
    }
    return figures;
}

}  // namespace

void within(milliseconds patience, const char* what, std::function<void()> call) {
    struct State {
        std::mutex mutex;
        std::condition_variable changed;
        bool done = false;
    };
    const auto state = std::make_shared<State>();
    std::thread caller([state, call = std::move(call)] {
        call();
        const std::lock_guard<std::mutex> lock(state->mutex);
        state->done = true;
        state->changed.notify_all();
    });
    std::unique_lock<std::mutex> lock(state->mutex);
    if (state->changed.wait_for(lock, patience, [&] { return state->done; })) {
        lock.unlock();
        caller.join();
        return;
    }
    caller.detach();
    g_given_up = true;
    throw Failure(std::string(what) + " does not answer: it may be stopped, or hang; 'tavo doctor' looks closer");
}

bool calls_were_given_up() { return g_given_up; }

std::string marker_path() { return MarkerPath().text; }
std::string storage_root() { return TAVO_STORAGE_ROOT; }

Binder look_up_service() {
    const auto found = std::make_shared<Binder>();
    within(kPatience, "the service",
           [found] { *found = android::defaultServiceManager()->checkService(String16(kServiceName)); });
    return *found;
}

Binder find_service() {
    const std::string marker = marker_path();
    if (access(marker.c_str(), R_OK) != 0) {
        if (errno == EACCES) throw Failure("no permission to read " + marker + ": clients need it to find the service");
        throw Failure("there is no service, nor has there been one (" + marker +
                      " is missing): start one with 'tavo serve'");
    }
    Binder service = look_up_service();
    if (service == nullptr) {
        throw Failure("no service answers, although one has been here (" + marker +
                      "): start it with 'tavo serve', or see 'tavo doctor'");
    }
    return service;
}

sp<android::ITavoBinder> interface_of(const Binder& service) { return android::ITavoBinder::asInterface(service); }

std::string dump_of(const Binder& service, const std::vector<std::string>& arguments) {
    const auto call = std::make_shared<DumpCall>();
    within(kPatience, "the service", [call, service, arguments] { call->run(service, arguments); });
    if (call->status != android::NO_ERROR) {
        throw Failure("the service did not tell its figures: " + std::string(strerror(-call->status)));
    }
    if (call->text.empty()) throw Failure("the service tells no figures: it is older than this command");
    return std::move(call->text);
}

ServiceFigures figures_of(const Binder& service) {
    try {
        return parse_figures(dump_of(service, {"--json"}));
    } catch (const nlohmann::json::exception& error) {
        throw Failure(std::string("the service's figures make no sense to this command: ") + error.what());
    }
}

const QueueFigures* find_queue(const ServiceFigures& figures, int key) {
    for (const QueueFigures& queue : figures.queues) {
        if (queue.key == key) return &queue;
    }
    return nullptr;
}

const BlockFigures* find_block(const ServiceFigures& figures, int key) {
    for (const BlockFigures& block : figures.blocks) {
        if (block.key == key) return &block;
    }
    return nullptr;
}

}  // namespace tavo::tool
