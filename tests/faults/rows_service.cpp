// The service, in this very process.
#include <binder/Parcel.h>
#include <fcntl.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <new>

#include "faults/plan.h"
#include "faults/row.h"
#include "ipc/TavoOsalService.h"
#include "tavo_osal/log.h"

namespace tavo::test::faults {
namespace {

using android::IMemoryHeap;
using android::Parcel;
using android::sp;
using android::TavoOsalService;

constexpr char kTag[] = "MSGQUEUE_BINDER";
constexpr char kKeptMapping[] = "a mapping that the platform does not take back stays";
constexpr char kLocks[] = "the service's lock is of the default kind, which cannot fail";
constexpr char kHalfMade[] = "an object that is not made is freed by its maker, whose allocations are not counted";
constexpr int kKey = 7;

Line error(std::string text) { return {TAVO_LOG_ERROR, kTag, std::move(text)}; }
Line no_block() { return {TAVO_LOG_ERROR, "OSAL_MEM", "Memory not allocated. Size Requested: *.\n"}; }
Expectation locks() { return skip({"pthread_mutex_lock", "pthread_mutex_unlock"}, kLocks); }
std::vector<const char*> any_new() { return {"_Znwm", "_Znwj", "_ZnwmRKSt9nothrow_t", "_ZnwjRKSt9nothrow_t"}; }

sp<TavoOsalService> g_service;
sp<IMemoryHeap> g_heap;
int g_file = -1;

void make_service() {
    g_service = new TavoOsalService;
    g_service->TavoOsalServiceInit(1, 1);
}
void drop_service(long) {
    g_heap = nullptr;
    g_service = nullptr;
}
void make_queue() {
    make_service();
    g_service->create_message_queue(kKey);
}
void make_block() {
    make_service();
    g_service->get_shared_mem(kKey, 100);
}
long get_block() {
    g_heap = g_service->get_shared_mem(kKey, 100);
    return g_heap != nullptr;
}
void drop_block(long result) {
    if (result != 0) g_service->delete_shared_mem(kKey);
    drop_service(0);
}

std::vector<Row> life_rows() {
    // What only tells the index file apart from an empty one is not looked at.
    const Expectation index_file = on({"fread", "fwrite", "fseek", "fclose"}, {same()});
    return {
        {"android::TavoOsalService::TavoOsalService()",
         {{"",
           nullptr,
           [] {
               try {
                   g_service = new TavoOsalService;
                   return 0L;
               } catch (const std::bad_alloc&) {
                   return long{android::NO_MEMORY};
               }
           },
           drop_service,
           {on(any_new(), {fails(android::NO_MEMORY).keeping_at_most(4, kHalfMade)}), locks()}}}},
        {"android::TavoOsalService::~TavoOsalService()",
         {{"",
           make_block,
           [] {
               g_service = nullptr;
               return 0L;
           },
           nullptr,
           {on({"close"}, {same()}), on({"munmap"}, {same()}), locks()}}}},
        {"android::TavoOsalService::TavoOsalServiceInit(unsigned int, unsigned int)",
         {{"",
           [] { g_service = new TavoOsalService; },
           [] { return long{g_service->TavoOsalServiceInit(2, 2)}; },
           drop_service,
           {on({"malloc"}, {fails(TAVO_NO_MEMORY, {no_block(), error("ERROR in malloc::\n")})}, 1),
            on({"malloc"}, {fails(TAVO_NO_MEMORY, {no_block(), error("ERROR in malloc::\n")})}, 2),
            on({"malloc"}, {fails(-1, {error("Memory allocation failed !!!\n")})}, 3),
            on({"fopen"}, {fails(0, {{TAVO_LOG_INFO, kTag, "Opening file in write mode, fp = *.\n"},
                                     error("Opening file in read write mode failed with errno =24\n")})}),
            index_file, locks()}}}},
        {"android::TavoOsalService::TavoOsalServiceDeInit()",
         {{"",
           make_queue,
           [] { return long{g_service->TavoOsalServiceDeInit()}; },
           drop_service,
           {on({"close"}, {same()}), on({"munmap"}, {same()}), locks()}}}},
    };
}

std::vector<Row> queue_rows_of_service() {
    const Outcome refused = fails(-1);
    const Outcome no_pipe = fails(-1, {{TAVO_LOG_INFO, "MSGQUEUE", "Error while openning pipe: *\n"}});
    return {
        {"android::TavoOsalService::create_message_queue(int)",
         {{"a new one",
           make_service,
           [] { return long{g_service->create_message_queue(kKey)}; },
           drop_service,
           {on(any_new(), {refused}), on({"calloc", "fcntl"}, {refused}), on({"pipe2"}, {no_pipe}),
            on({"close"}, {same()}), locks()}},
          {"a new one, for which the table grows",
           make_queue,
           [] { return long{g_service->create_message_queue(kKey + 1)}; },
           drop_service,
           {on(any_new(), {refused}), on({"calloc", "realloc", "fcntl"}, {refused}), on({"pipe2"}, {no_pipe}),
            on({"close"}, {same()}), locks()}},
          {"one that there is",
           make_queue,
           [] { return long{g_service->create_message_queue(kKey)}; },
           drop_service,
           {locks()}}}},
        {"android::TavoOsalService::delete_message_queue(int)",
         {{"",
           make_queue,
           [] { return long{g_service->delete_message_queue(kKey)}; },
           drop_service,
           {on({"close"}, {same()}), locks()}}}},
        {"android::TavoOsalService::get_fd(int)",
         {{"", make_queue, [] { return long{g_service->get_fd(kKey)}; }, drop_service, {locks()}}}},
        {"android::TavoOsalService::get_write_fd(int)",
         {{"", make_queue, [] { return long{g_service->get_write_fd(kKey)}; }, drop_service, {locks()}}}},
    };
}

std::vector<Row> block_rows_of_service() {
    // Whether a block's memory is really there is not looked at: a block without any is handed out.
    const Expectation unmapped = on({"memfd_create", "ftruncate", "mmap"}, {same()});
    return {
        {"android::TavoOsalService::get_shared_mem(int, int)",
         {{"a new one",
           make_service,
           get_block,
           drop_block,
           {on({"calloc"}, {fails(0)}), on(any_new(), {fails(0)}), unmapped, on({"fcntl", "close"}, {same()}),
            locks()}},
          {"one that there is",
           make_block,
           get_block,
           [](long result) {
               g_service->delete_shared_mem(kKey);
               drop_block(result);
           },
           {locks()}}}},
        {"android::TavoOsalService::delete_shared_mem(int)",
         {{"",
           make_block,
           [] { return long{g_service->delete_shared_mem(kKey)}; },
           drop_service,
           {on({"munmap"}, {same().keeping_mappings(1, kKeptMapping)}), on({"close"}, {same()}), locks()}}}},
    };
}

long dump_with(const char* option) {
    android::Vector<android::String16> arguments;
    if (option != nullptr) arguments.add(android::String16(option));
    return g_service->dump(g_file, arguments);
}

std::vector<Row> dump_rows() {
    const auto prepare = [] {
        make_queue();
        g_service->get_shared_mem(kKey, 100);
        g_file = memfd_create("dump", MFD_CLOEXEC);
    };
    const auto undo = [](long) {
        close(g_file);
        drop_block(1);
    };
    const std::vector<Expectation> all = {
        on(any_new(), {fails(android::NO_MEMORY)}),
        // What cannot be measured is shown as unknown.
        on({"fcntl", "ioctl", "close"}, {same()}),
        on_error("poll", EINVAL, {fails(-EINVAL)}),
        on_error("poll", EINTR, {same()}),
        on_error("write", EIO, {fails(-EIO)}),
        on_error("write", EINTR, {same()}),
        on({"send"}, {fails(-EPIPE)}),
        on({"sigpending", "sigtimedwait"}, {same()}),
        locks(),
    };
    return {{"android::TavoOsalService::dump(int, android::Vector<android::String16> const&)",
             {{"as text", prepare, [] { return dump_with(nullptr); }, undo, all},
              {"as JSON", prepare, [] { return dump_with("--json"); }, undo, all}}}};
}

}  // namespace

std::vector<Row> service_rows() {
    std::vector<Row> rows = life_rows();
    for (auto* more : {queue_rows_of_service, block_rows_of_service, dump_rows}) {
        for (Row& row : more()) rows.push_back(std::move(row));
    }
    return rows;
}

}  // namespace tavo::test::faults
