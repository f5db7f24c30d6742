// Queues by key, shared memory and cross-process semaphores: what clients call.
#include <fcntl.h>
#include <semaphore.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <thread>

#include "faults/driver.h"
#include "faults/plan.h"
#include "faults/row.h"
#include "ipc/ITavoBinder.h"
#include "ipc/service_lookup.h"
#include "tavo_osal/init.h"
#include "tavo_osal/ipc_semaphore.h"
#include "tavo_osal/log.h"
#include "tavo_osal/msg_queue.h"
#include "tavo_osal/msg_queue_key.h"
#include "tavo_osal/shared_memory.h"

namespace tavo::test::faults {
namespace {

constexpr char kTag[] = "MSGQUEUE_BINDER";
constexpr char kMemoryTag[] = "TAVO_OSAL_SHARED_MEM";
constexpr char kLocks[] = "libbinder's and the tables' locks are of the default kind, which cannot fail";

constexpr char kUnanswered[] = "the service counts uses, not users: one whose answer was lost on the way stays counted";
constexpr char kHalfMade[] =
    "an object of libbinder's whose making fails half way leaves what libutils frees with the last reference only";
constexpr char kServesOnce[] = "a process that serves once does so until it ends: what that takes is not given back";
constexpr char kNoDriver[] = "a process opens its binder driver once, and does without it when that fails";

Line error(const char* tag, std::string text) { return {TAVO_LOG_ERROR, tag, std::move(text)}; }
Expectation peers() {
    return skip({"getsockopt"}, "asks the kernel who is at the other end of a connected socket, which it always knows");
}
Expectation locks() { return skip({"pthread_mutex_lock", "pthread_mutex_unlock"}, kLocks); }

TAVO_INT64 g_queue;
TavoShmHandle* g_block;
void* g_address;
TAVO_INT64 g_semaphore;
char g_name[] = "7";

// Each outcome as it is, and with what failures inside libbinder leave behind.
std::vector<Outcome> with_what_is_kept(std::vector<Outcome> outcomes) {
    for (size_t i = 0, count = outcomes.size(); i < count; ++i) {
        const Outcome outcome = outcomes[i];
        outcomes.push_back(outcome.keeping_at_most(8, kHalfMade));
        outcomes.push_back(outcome.keeping_at_most(12, kUnanswered).keeping_uses(kUnanswered));
    }
    return outcomes;
}

// What is needed to open the driver.
Expectation no_driver(std::vector<Outcome> outcomes) {
    for (size_t i = 0, count = outcomes.size(); i < count; ++i) outcomes.push_back(outcomes[i].ever_after(kNoDriver));
    return on({kDriverOpen, "epoll_create1", "eventfd", "open", "fstat", "epoll_ctl", "mkdir", "openat", "fstatat"},
              std::move(outcomes));
}

// -- Queues

// The ways for an attempt to attach to end.
std::vector<Outcome> attach_outcomes() {
    const Line no_service = error(kTag, "tavo_osal_get_service() failed\n");
    return with_what_is_kept({
        same(),
        same_but({{TAVO_LOG_INFO, "MSGQUEUE", "Error while openning pipe: *\n"}}),
        fails(1, {error(kTag, "Service is not available\n"), no_service}),
        fails(1, {error(kTag,
                        " android::sp<*> tavo_osal_get_service(TAVO_CHAR*) () Failed to get service "
                        "(android.tavo.osal) \n"),
                  no_service}),
        fails(TAVO_MQ_NOT_AVAILABLE, {error(kTag, " Service Exists!!But no queue in that service : fd * : * \n")}),
        fails(TAVO_NO_MEMORY),
    });
}

void destroy_queue(long result) {
    if (result == 0) tavo_msg_queue_destroy(g_queue);
}
// What a call is to find, also when the fault of the call before has cut a connection, which is noticed a little later.
template <typename Call>
void prepare(Call call) {
    for (int attempts = 0; call() != 0; ++attempts) {
        if (attempts == 1000) abort();
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
}
// So that what a process does once is done.
void get_to_know_the_service() {
    prepare([] { return tavo_msg_queue_init(9, &g_queue); });
    tavo_msg_queue_destroy(g_queue);
}

template <long (*Attach)()>
std::vector<Scenario> attachments() {
    const std::vector<Expectation> all = {on({}, attach_outcomes()), locks(), peers()};
    Scenario first = {"a process's first", nullptr, Attach, destroy_queue, all};
    first.expectations.push_back(no_driver(attach_outcomes()));
    Scenario later = {"a later one", get_to_know_the_service, Attach, destroy_queue, all};
    first.service = later.service = true;
    Scenario served = later;
    served.name = "in the service";
    served.side = Side::kService;
    return {first, later, served};
}
long attach_by_name() { return tavo_msg_queue_sender_init(g_name, &g_queue); }
long attach_by_key() { return tavo_msg_queue_init(7, &g_queue); }
long attach_with_flags() { return tavo_msg_queue_init_with_flags(7, 0, &g_queue); }

std::vector<Outcome> destroy_outcomes() {
    const Line no_service = error(kTag, "tavo_osal_get_service() failed\n");
    return with_what_is_kept({
        same(),
        fails(TAVO_FAILURE, {error(kTag, "Service is not available\n"), no_service}),
        fails(TAVO_FAILURE, {error(kTag,
                                   " android::sp<*> tavo_osal_get_service(TAVO_CHAR*) () Failed to get service "
                                   "(android.tavo.osal) \n"),
                             no_service}),
    });
}

template <TAVO_Status (*Destroy)(TAVO_INT64)>
std::vector<Scenario> destructions() {
    const auto call = [] { return long{Destroy(g_queue)}; };
    const auto undo = [](long result) {
        if (result != 0) Destroy(g_queue);
    };
    Scenario client = {"",
                       [] { prepare([] { return tavo_msg_queue_init(7, &g_queue); }); },
                       call,
                       undo,
                       {on({}, destroy_outcomes()), locks(), peers()}};
    client.service = true;
    Scenario served = client;
    served.name = "in the service";
    served.side = Side::kService;
    return {client, served};
}

// -- Blocks

constexpr char kSemaphoreFile[] = "/sdcard/7";
constexpr char kKeptMapping[] = "a mapping that the platform does not take back stays";

void make_handle() { tavo_shm_init(7, &g_block, 100); }
void drop_handle() {
    if (g_block == nullptr) return;
    --g_blocks;
    free(g_block);
    g_block = nullptr;
}

// What a look-up says that finds nothing, in the words of the blocks' functions.
std::vector<Outcome> look_up_outcomes(long result) {
    const Line no_service = {TAVO_LOG_INFO, kMemoryTag, "The TavoOsalServer is not published\n"};
    return {
        fails(result, {error(kMemoryTag, "Service is not available\n"), no_service}),
        fails(result, {error(kMemoryTag,
                             " android::sp<*> tavo_osal_get_service(TAVO_CHAR*) () Failed to get service "
                             "(android.tavo.osal) \n"),
                       no_service}),
    };
}

std::vector<Outcome> look_up_by_name() {
    return with_what_is_kept({same(), fails(0, {error(kTag, "Service is not available\n")}),
                              fails(0, {error(kTag,
                                              " android::sp<*> tavo_osal_get_service(TAVO_CHAR*) () Failed to get "
                                              "service (android.tavo.osal) \n")})});
}

std::vector<Scenario> look_ups() {
    static android::sp<android::ITavoBinder> found;
    const auto call = [] {
        found = tavo_osal_get_service(g_name);
        return long{found != nullptr};
    };
    const std::vector<Expectation> all = {on({}, look_up_by_name()), no_driver(look_up_by_name()), locks(), peers()};
    const auto undo = [](long) { found = nullptr; };
    Scenario first = {"a process's first", nullptr, call, undo, all};
    Scenario later = {"a later one", get_to_know_the_service, call, undo, all};
    first.service = later.service = true;
    return {first, later};
}

std::vector<Scenario> acquisitions() {
    std::vector<Outcome> outcomes = look_up_outcomes(TAVO_FAILURE);
    outcomes.push_back(same());
    outcomes.push_back(fails(TAVO_FAILURE, {error(kMemoryTag, "No shared memory for key 7, size 100\n")}));
    // A use that was counted for nothing is given back.
    outcomes.push_back(fails(TAVO_FAILURE, {{TAVO_LOG_INFO, "BINDER_IFACE", "Key received at get_shared_memory is 7"},
                                            error(kMemoryTag, "No shared memory for key 7, size 100\n")}));
    const auto call = [] { return long{tavo_shm_acquire(g_block, &g_address)}; };
    const auto undo = [](long result) {
        if (result == 0) tavo_shm_release(g_address);
        if (result == 0 && tavo_shm_delete(g_block) == 0) g_block = nullptr;
        drop_handle();
    };
    outcomes = with_what_is_kept(outcomes);
    const std::vector<Expectation> all = {on({}, outcomes), no_driver(outcomes), locks(), peers()};
    Scenario first = {"a process's first", make_handle, call, undo, all};
    Scenario later = {"a later one",
                      [] {
                          get_to_know_the_service();
                          make_handle();
                      },
                      call, undo, all};
    first.service = later.service = true;
    Scenario served = later;
    served.name = "in the service";
    served.side = Side::kService;
    return {first, later, served};
}

TAVO_Status release() { return tavo_shm_release(g_address); }
TAVO_Status release_by_size() { return tavo_shm_release_by_size(100, g_address); }

void acquire_block() {
    make_handle();
    prepare([] { return tavo_shm_acquire(g_block, &g_address); });
}

template <TAVO_Status (*Release)()>
std::vector<Scenario> releases() {
    Scenario scenario = {"",
                         acquire_block,
                         [] { return long{Release()}; },
                         [](long) {
                             if (tavo_shm_delete(g_block) == 0) g_block = nullptr;
                         },
                         {on({}, with_what_is_kept({same()})),
                          on({"munmap"}, {same().keeping_mappings(1, kKeptMapping)}), locks(), peers()}};
    scenario.service = true;
    return {scenario};
}

std::vector<Scenario> deletions() {
    std::vector<Outcome> outcomes = look_up_outcomes(TAVO_FAILURE);
    outcomes.push_back(same());
    Scenario client = {"",
                       [] {
                           acquire_block();
                           tavo_shm_release(g_address);
                       },
                       [] { return long{tavo_shm_delete(g_block)}; },
                       [](long result) {
                           if (result != 0) tavo_shm_delete(g_block);
                       },
                       {on({}, with_what_is_kept(outcomes)), locks(), peers()}};
    client.service = true;
    Scenario served = client;
    served.name = "in the service";
    served.side = Side::kService;
    return {client, served};
}

}  // namespace

std::vector<Row> queue_rows() {
    static int32_t key;
    const Line no_marker = error(kTag, "Failed to create file at /sdcard/com.zorla.qirserver/android.tavo.osal \n");
    const Line freed = {TAVO_LOG_INFO, kTag, "Freeing shared memory list info ptr.\n"};
    const auto init = [] { return long{tavo_osal_init(4, 4)}; };
    return {
        {"tavo_osal_init",
         {{"",
           nullptr,
           init,
           nullptr,
           // Published whether its tables could be made or not; what is not said is that it could not be published.
           {on({},
               {same().ever_after(kServesOnce), fails(0).ever_after(kServesOnce),
                fails(0, {error("OSAL_MEM", "*"), error(kTag, "ERROR in malloc::\n")}).ever_after(kServesOnce),
                fails(0, {error(kTag, "Memory allocation failed !!!\n")}).ever_after(kServesOnce),
                fails(0, {{TAVO_LOG_INFO, kTag, "Opening file in write mode, fp = *.\n"},
                          error(kTag, "Opening file in read write mode failed with errno =24\n")})
                    .ever_after(kServesOnce),
                fails(TAVO_NO_MEMORY).ever_after(kServesOnce), fails(TAVO_NO_MEMORY, {freed}).ever_after(kServesOnce),
                fails(TAVO_NO_MEMORY, {{TAVO_LOG_INFO, kTag, "Freeing shared memory list head node ptr.\n"}, freed})
                    .ever_after(kServesOnce),
                // What could not be published goes again.
                fails(0, {{TAVO_LOG_INFO, kTag, "Freeing shared memory list head node ptr.\n"}, freed})
                    .ever_after(kServesOnce),
                fails(TAVO_FAILURE, {no_marker}).ever_after(kServesOnce),
                fails(0, {error("TAVO_LOG", " pcLogPreference memory allocation failed.\n")}).ever_after(kServesOnce)}),
            locks(), peers()}}}},
        {"tavo_msg_queue_key_create",
         {{"",
           nullptr,
           [] { return long{tavo_msg_queue_key_create(&key, 1)}; },
           nullptr,
           // The file lends its identity: one that is there already does so whether it can be opened or not.
           {on({"open"},
               {fails(TAVO_MQ_KEY_FAILED, {error("OSAL_MSG_QUEUE",
                                                 "Keygen file /sdcard/key_gen_file.txt could not be opened in "
                                                 "write mode.\n"),
                                           error("OSAL_MSG_QUEUE", "IPC key generation failed. errno=2.\n")})}),
            on({"close"}, {same()}),
            on({"ftok"},
               {fails(TAVO_MQ_KEY_FAILED, {error("OSAL_MSG_QUEUE", "IPC key generation failed. errno=2.\n")})})}}}},
        {"tavo_msg_queue_sender_init", attachments<attach_by_name>()},
        // These go on to the one above.
        {"tavo_msg_queue_init", {attachments<attach_by_key>()[1]}},
        {"tavo_msg_queue_init_with_flags", {attachments<attach_with_flags>()[1]}},
        {"tavo_msg_queue_destroy", destructions<tavo_msg_queue_destroy>()},
        {"tavo_msg_queue_close", {destructions<tavo_msg_queue_close>()[0]}},
    };
}

std::vector<Row> block_rows() {
    return {
        {"tavo_osal_get_service(char*)", look_ups()},
        {"tavo_shm_init",
         {{"",
           nullptr,
           [] { return long{tavo_shm_init(7, &g_block, 100)}; },
           [](long result) {
               expect((result == 0) == (g_block != nullptr), "the handle is null on a failure");
               drop_handle();
           },
           {on({"malloc"}, {fails(TAVO_NO_MEMORY)})}}}},
        {"tavo_shm_acquire", acquisitions()},
        {"tavo_shm_release", releases<release>()},
        {"tavo_shm_release_by_size", releases<release_by_size>()},
        {"tavo_shm_delete", deletions()},
        {"tavo_osal_shared_memory_key_create",
         {{"",
           [] {
               uint32_t key = 0;
               tavo_osal_shared_memory_key_create(&key);
               const int file = open("/sdcard/shm_key_index_file.txt", O_RDWR | O_CREAT | O_CLOEXEC, 0777);
               const int index = 1;
               if (write(file, &index, sizeof index) != sizeof index) abort();
               close(file);
           },
           [] {
               uint32_t key = 0;
               return long{tavo_osal_shared_memory_key_create(&key)};
           },
           nullptr,
           // Every way ends with a key.
           {on({"fopen"},
               {fails(0, {{TAVO_LOG_INFO, kMemoryTag, "Opening file in read mode, fp = *.\n"},
                          error(kMemoryTag, "Opening file in read mode failed with errno =24\n"),
                          {TAVO_LOG_INFO, kMemoryTag, "boFileBased = 0\n"},
                          {TAVO_LOG_INFO, kMemoryTag, "Older way\n"}})},
               1),
            on({"fopen"},
               {fails(0, {error(kMemoryTag, "Opening file in write mode failed with errno =24\n"),
                          {TAVO_LOG_INFO, kMemoryTag, "boFileBased = 0\n"},
                          {TAVO_LOG_INFO, kMemoryTag, "Older way\n"}})},
               2),
            on({"fread", "fwrite", "fclose", "chmod", "ftok"}, {same()})}}}},
    };
}

std::vector<Row> ipc_semaphore_rows() {
    const auto drop = [](long result) {
        if (result == 0 && g_semaphore != -1) tavo_semaphore_delete(g_semaphore);
        remove(kSemaphoreFile);
    };
    const auto make = [] { tavo_semaphore_init(7, &g_semaphore); };
    const Outcome not_opened = fails(TAVO_FAILURE, {error("TAVO_OSAL", "Error in open shm_file /sdcard/7\n")});
    const Outcome not_made = fails(TAVO_FAILURE, {error("TAVO_OSAL", "Failed to create Semaphore\n")});
    return {
        {"tavo_semaphore_key_create", {{"", nullptr, [] { return long{tavo_semaphore_key_create()}; }, nullptr, {}}}},
        {"tavo_semaphore_init",
         {{"makes one",
           nullptr,
           [] { return long{tavo_semaphore_init(7, &g_semaphore)}; },
           drop,
           // The first open is to find the file, which the second makes.
           {on({"open"}, {same()}, 1), on({"open"}, {not_opened}, 2), on({"fstat"}, {not_opened}),
            // Where files cannot be locked the creator goes on.
            on({"flock", "fchmod", "close"}, {same()}), on({"pwrite", "mmap", "sem_init"}, {not_made}),
            on({"ftruncate"}, {not_made}), on({"nanosleep"}, {same()})}},
          {"finds one",
           [] {
               tavo_semaphore_init(7, &g_semaphore);
               tavo_semaphore_delete(g_semaphore);
           },
           [] { return long{tavo_semaphore_init(7, &g_semaphore)}; },
           drop,
           // A file that cannot be opened may be one that is not there: made, it turns out to be there.
           {on({"open"}, {same()}), on({"fstat"}, {not_opened}), on({"close"}, {same()}),
            // Success with the handle -1: documented.
            on({"mmap"}, {same()})}}}},
        {"tavo_semaphore_acquire",
         {{"",
           make,
           [] { return long{tavo_semaphore_acquire(g_semaphore)}; },
           [](long) {
               tavo_semaphore_delete(g_semaphore);
               remove(kSemaphoreFile);
           },
           {on({"sem_wait"}, {fails(TAVO_FAILURE, {error("TAVO_OSAL", "Semaphore Wait failed !")})})}}}},
        {"tavo_semaphore_release",
         {{"",
           make,
           [] { return long{tavo_semaphore_release(g_semaphore)}; },
           [](long) {
               tavo_semaphore_delete(g_semaphore);
               remove(kSemaphoreFile);
           },
           {on({"sem_post"}, {fails(TAVO_FAILURE, {error("TAVO_OSAL", "Release failed !")})})}}}},
        {"tavo_semaphore_delete",
         {{"",
           make,
           [] { return long{tavo_semaphore_delete(g_semaphore)}; },
           [](long result) {
               if (result != 0) tavo_semaphore_delete(g_semaphore);
               remove(kSemaphoreFile);
           },
           {on({"munmap"}, {fails(TAVO_SEM_DELETE_FAILED,
                                  {error("TAVO_OSAL", "Deleting the semaphore failed. errno is 0x16.\n")})})}}}},
    };
}

}  // namespace tavo::test::faults
