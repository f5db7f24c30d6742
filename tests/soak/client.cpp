#include "soak/client.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>

#include "soak/blocks.h"
#include "soak/failure.h"
#include "soak/operations.h"
#include "soak/post.h"
#include "tavo_osal/msg_queue_key.h"
#include "tavo_osal/thread.h"

namespace tavo::soak {
namespace {

constexpr unsigned kRestMostUs = 2000;

Board* map_board() {
    for (const int fd : {kBoardFd, kFailureFd}) fcntl(fd, F_SETFD, FD_CLOEXEC);
    void* memory = mmap(nullptr, sizeof(Board), PROT_READ | PROT_WRITE, MAP_SHARED, kBoardFd, 0);
    return memory != MAP_FAILED ? static_cast<Board*>(memory) : nullptr;
}

void run_operation(Client& client, unsigned which) {
    client.slot.operation = which;
    client.slot.operations.fetch_add(1);
    set_operation(kOperations[which].name);
    kOperations[which].run(client);
    client.slot.done[which].fetch_add(1);
}

unsigned some_operation(Random& random) {
    static const unsigned all = [] {
        unsigned sum = 0;
        for (const Operation& operation : kOperations) sum += operation.weight;
        return sum;
    }();
    unsigned left = random.below(all), which = 0;
    while (left >= kOperations[which].weight) left -= kOperations[which++].weight;
    return which;
}

// Fast enough to be seen in seconds, slow enough for there to be descriptors left for seconds.
void leak_descriptor() {
    static auto next = std::chrono::steady_clock::now();
    if (std::chrono::steady_clock::now() < next) return;
    next += std::chrono::milliseconds(15);
    [[maybe_unused]] const int leaked = dup(kFailureFd);
}

// What a client does wrong on purpose, apart from what operations do.
void break_something(const Client& client) {
    if (client.breaks("leak-descriptor")) leak_descriptor();
    static TAVO_INT64 left = 0;
    if (client.breaks("leave-use") && left == 0) {
        tavo_msg_queue_init(static_cast<int>(own_key(client.number, client.incarnation, 0)), &left);
    }
    if (client.breaks("hang")) {
        while (!client.is_leaving()) tavo_osal_thread_sleep(1);
    }
    if (client.breaks("crash")) abort();
}

void run_until_told(Client& client) {
    while (!client.is_leaving()) {
        client.post.leave_where_told();
        client.blocks.leave_where_told(client);
        run_operation(client, some_operation(client.random));
        if (client.random.one_in(16)) tavo_osal_thread_usleep(client.random.below(kRestMostUs));
        if (!client.fault.empty()) break_something(client);
    }
}

// Every family once, so that a short run has them all.
void run_each(Client& client) {
    for (unsigned i = 0; i < kOperationCount && !client.is_leaving(); ++i) run_operation(client, i);
}

void await_leave(Client& client) {
    client.slot.stage = Stage::kQuiet;
    while (client.board.phase != Phase::kLeave) {
        // Others are let go of meanwhile, too.
        client.post.leave_where_told();
        client.blocks.leave_where_told(client);
        client.slot.operations.fetch_add(1);
        tavo_osal_thread_msleep(5);
    }
}

}  // namespace

std::string Client::own_path(const std::string& leaf) const {
    return std::string(TAVO_STORAGE_ROOT "/soak-") + std::to_string(number) + "." + std::to_string(incarnation) + "-" +
           leaf;
}

int run_client(const ClientArguments& arguments) {
    Board* board = map_board();
    if (board == nullptr) return 2;
    const std::string name = "client " + std::to_string(arguments.slot) + "." + std::to_string(arguments.incarnation);
    set_name(name);
    Post post;
    Blocks blocks;
    Client client = {*board,
                     board->slots[arguments.slot],
                     arguments.slot,
                     arguments.incarnation,
                     arguments.fault,
                     Random(mixed(arguments.seed) ^ (uint64_t{arguments.slot} << 32U) ^ arguments.incarnation),
                     post,
                     blocks};
    if (!post.start(client)) return 2;
    client.slot.stage = Stage::kRunning;
    run_each(client);
    run_until_told(client);
    set_operation("falling quiet");
    await_leave(client);
    post.end(client);
    blocks.leave_all(client);
    client.slot.stage = Stage::kGone;
    return 0;
}

}  // namespace tavo::soak
