// What clients do, by family. Each operation checks all that it gets, and gives back all that it takes.
#pragma once

#include "soak/client.h"

namespace tavo::soak {

// thread_operations.cpp
void use_threads(Client& client);
void cancel_thread(Client& client);
void use_mutex(Client& client);
void use_condition(Client& client);
void use_event(Client& client);
void use_semaphore(Client& client);
// timer_operations.cpp
void use_timers(Client& client);
void read_clocks(Client& client);
// util_operations.cpp
void use_memory(Client& client);
void use_strings(Client& client);
void use_list(Client& client);
void write_log(Client& client);
// file_operations.cpp
void use_file(Client& client);
void run_program(Client& client);
void load_object(Client& client);
// socket_operations.cpp
void use_tcp(Client& client);
void use_udp(Client& client);
void use_unix_socket(Client& client);
void validate_addresses(Client& client);
// own_operations.cpp
void use_own_queue(Client& client);
void use_local_queue(Client& client);
void use_own_block(Client& client);
void use_own_semaphore(Client& client);
void make_keys(Client& client);
// post.cpp and blocks.cpp
void send_letters(Client& client);
void send_stream(Client& client);
void leave_a_queue(Client& client);
void use_shared_block(Client& client);
void leave_a_block(Client& client);

struct Operation {
    const char* name;
    void (*run)(Client& client);
    unsigned weight;
};

constexpr Operation kOperations[] = {
    {"threads", use_threads, 4},
    {"thread cancellation", cancel_thread, 2},
    {"mutex", use_mutex, 4},
    {"condition", use_condition, 4},
    {"event", use_event, 4},
    {"counting semaphore", use_semaphore, 8},
    {"timers", use_timers, 1},
    {"clocks", read_clocks, 8},
    {"memory", use_memory, 10},
    {"strings", use_strings, 10},
    {"list", use_list, 10},
    {"log", write_log, 10},
    {"file", use_file, 5},
    {"program", run_program, 1},
    {"dynamic loading", load_object, 3},
    {"TCP", use_tcp, 3},
    {"UDP", use_udp, 3},
    {"Unix-domain socket", use_unix_socket, 3},
    {"IPv4 texts", validate_addresses, 8},
    {"own queue", use_own_queue, 5},
    {"local queue", use_local_queue, 5},
    {"own block", use_own_block, 5},
    {"own file semaphore", use_own_semaphore, 5},
    {"keys from files", make_keys, 2},
    {"inboxes", send_letters, 60},
    {"streams", send_stream, 20},
    {"leaving a queue", leave_a_queue, 2},
    {"shared block", use_shared_block, 30},
    {"leaving a block", leave_a_block, 2},
};
constexpr unsigned kOperationCount = sizeof kOperations / sizeof kOperations[0];
static_assert(kOperationCount <= kMostOperations);

}  // namespace tavo::soak
