// The message queue object, and the C functions that need no service.
#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <new>
#include <vector>

#include "faults/plan.h"
#include "faults/row.h"
#include "faults/waker.h"
#include "ipc/TAVO_MessageQueue.h"
#include "tavo_osal/log.h"
#include "tavo_osal/msg_queue.h"
#include "tavo_osal/msg_queue_key.h"

namespace tavo::test::faults {
namespace {

using android::TAVO_MessageQueue;

constexpr char kTag[] = "MSGQUEUE";
constexpr char kLostFrame[] = "the frame of a put whose write fails is never freed: a documented leak";
constexpr unsigned kPage = 4096;

Line info(std::string text) { return {TAVO_LOG_INFO, kTag, std::move(text)}; }
Line error(std::string text) { return {TAVO_LOG_ERROR, kTag, std::move(text)}; }
Line of_binder(std::string text) { return {TAVO_LOG_ERROR, "MSGQUEUE_BINDER", std::move(text)}; }

// In memory of its own, so that a row's constructor and destructor allocate nothing.
alignas(TAVO_MessageQueue) unsigned char g_storage[sizeof(TAVO_MessageQueue)];
TAVO_MessageQueue* g_queue;
TAVO_INT64 g_handle;
std::vector<unsigned char> g_message;
unsigned char g_buffer[TAVO_MSG_QUEUE_MAX_SIZE];

TAVO_MessageQueue* queue_of(TAVO_INT64 handle) {
    return reinterpret_cast<TAVO_MessageQueue*>(static_cast<intptr_t>(handle));
}

void make_queue() {
    g_queue = new (g_storage) TAVO_MessageQueue;
    g_handle = static_cast<TAVO_INT64>(reinterpret_cast<intptr_t>(g_queue));
}
void drop_queue(long) {
    // Where there is no pipe, descriptor 0 is not the queue's to close.
    if (!g_queue->has_pipe()) g_queue->disown_descriptors();
    g_queue->~TAVO_MessageQueue();
}
void make_sender(size_t size) {
    make_queue();
    g_message.assign(size, 'm');
}
void make_receiver(size_t size) {
    make_sender(size);
    g_queue->tavo_android_msg_queue_put(g_message.data(), static_cast<unsigned>(size));
}
// A queue with the beginning of a message, whose rest comes when this thread waits for it.
void make_receiver_of_parts() {
    static unsigned char frame[4 + 8] = {8, 0, 0, 0, 'm', 'm', 'm', 'm', 'm', 'm', 'm', 'm'};
    make_queue();
    if (write(g_queue->iWriteFd, frame, 7) != 7) abort();
    start_waker([] {
        if (write(g_queue->iWriteFd, frame + 7, 5) != 5) abort();
    });
}

Outcome not_written(long result, const char* text, std::vector<Line> more) {
    std::vector<Line> lines = {info(std::string("write() error: ") + text + "\n")};
    lines.insert(lines.end(), more.begin(), more.end());
    return fails(result, lines).keeping_blocks(1, kLostFrame);
}
Outcome not_read(long result, const char* text, std::vector<Line> more) {
    std::vector<Line> lines = {error(std::string("read() error: ") + text + " :Message queue ()\n")};
    lines.insert(lines.end(), more.begin(), more.end());
    return fails(result, lines);
}

// Both the object's put and the C functions on it, which say more.
template <long (*Put)()>
std::vector<Scenario> puts(bool through_handle) {
    const Line no_block = {TAVO_LOG_ERROR, "OSAL_MEM", "Memory not allocated. Size Requested: *.\n"};
    const auto more = [=](const char* number) {
        std::vector<Line> lines;
        if (through_handle)
            lines.push_back(of_binder("Message send on MQ failed. errno is " + std::string(number) + ".\n"));
        return lines;
    };
    const std::vector<Expectation> all = {
        on({"malloc"}, {fails(TAVO_NO_MEMORY, {no_block, error("Malloc failed \n")})}),
        on_error("write", EIO, {not_written(-1, "Input/output error", more("0x5"))}),
        on_error("write", EINTR, {not_written(-1, "Interrupted system call", more("0x4"))}),
        // Making room is only for speed.
        on({"fcntl"}, {same()}),
    };
    return {{"small", [] { make_sender(8); }, Put, drop_queue, all},
            {"large", [] { make_sender(20000); }, Put, drop_queue, all}};
}
long put_to_object() {
    return g_queue->tavo_android_msg_queue_put(g_message.data(), static_cast<unsigned>(g_message.size()));
}
long put_to_handle() { return tavo_msg_queue_put(g_handle, g_message.data(), static_cast<unsigned>(g_message.size())); }
long send_to_handle() {
    return tavo_msg_queue_sendmessage(g_handle, static_cast<unsigned>(g_message.size()), g_message.data());
}

template <long (*Get)()>
std::vector<Scenario> gets(bool through_handle) {
    const long failed = through_handle ? long{TAVO_MQ_FAILURE} : -1;
    const auto more = [=](const char* number) {
        std::vector<Line> lines;
        if (through_handle) {
            lines.push_back(of_binder("Receive message from MQ failed. errno is " + std::string(number) + ".\n"));
        }
        return lines;
    };
    const std::vector<Expectation> all = {
        on_error("read", EIO, {not_read(failed, "Input/output error", more("0x5"))}),
        on_error("read", EINTR, {not_read(failed, "Interrupted system call", more("0x4"))}),
        // Without it, the pipe is polled.
        on({"ioctl"}, {same()}),
    };
    // Behind the length, an interruption is no reason to stop.
    std::vector<Expectation> whole = all;
    whole.push_back({{"read"}, 2, {same()}, nullptr, EINTR});
    // What cannot be read without waiting is asked for, and read then.
    whole.push_back(on({"preadv2"}, {same()}));
    // Behind the first part, what has come is the message.
    std::vector<Expectation> parts = whole;
    const Outcome cut_short = fails(through_handle ? 0 : 3);
    parts.push_back({{"read"}, 3, {cut_short}, nullptr, EIO});
    parts.push_back({{"read"}, 3, {same()}, nullptr, EINTR});
    parts.push_back(on_error("poll", EINVAL, {cut_short}));
    parts.push_back(on_error("poll", EINTR, {same()}));
    const auto drop_parts = [](long result) {
        join_waker();
        drop_queue(result);
    };
    return {{"", [] { make_receiver(8); }, Get, drop_queue, whole},
            {"a whole page", [] { make_receiver(kPage); }, Get, drop_queue, whole},
            {"in parts", make_receiver_of_parts, Get, drop_parts, parts}};
}
long get_from_object() {
    unsigned size = 0;
    return g_queue->tavo_android_msg_queue_get(g_buffer, &size);
}
long get_from_handle() {
    unsigned size = 0;
    return tavo_msg_queue_get(g_handle, g_buffer, &size);
}
long receive_from_handle() {
    unsigned size = 0;
    return tavo_msg_queue_receivemessage(g_handle, &size, g_buffer);
}

int bytes_pending() {
    int bytes = 0;
    ioctl(g_queue->iReadFd, FIONREAD, &bytes);
    return bytes;
}

std::vector<Row> life_rows() {
    const Line no_pipe = info("Error while openning pipe: *\n");
    const auto construct = [] {
        make_queue();
        return long{g_queue->has_pipe()};
    };
    return {
        {"android::TAVO_MessageQueue::TAVO_MessageQueue()",
         {{"", nullptr, construct, drop_queue, {on({"pipe2"}, {fails(0, {no_pipe})})}},
          {"where descriptor 0 is free",
           [] { close(0); },
           construct,
           [](long) {
               drop_queue(0);
               expect(open("/dev/null", O_RDWR | O_CLOEXEC) == 0, "descriptor 0 is free again");
           },
           {on({"pipe2", "fcntl"}, {fails(0, {no_pipe})}), on({"close"}, {same()})}}}},
        {"android::TAVO_MessageQueue::~TAVO_MessageQueue()",
         {{"",
           make_queue,
           [] {
               g_queue->~TAVO_MessageQueue();
               return 0L;
           },
           nullptr,
           {on({"close"}, {same()})}}}},
        {"android::TAVO_MessageQueue::tavo_android_msg_queue_set_fd(int)",
         {{"",
           make_queue,
           [] { return g_queue->tavo_android_msg_queue_set_fd(-1), 0L; },
           drop_queue,
           {on({"close"}, {same()})}}}},
        {"android::TAVO_MessageQueue::tavo_android_msg_queue_set_write_fd(int)",
         {{"",
           make_queue,
           [] { return g_queue->tavo_android_msg_queue_set_write_fd(-1), 0L; },
           drop_queue,
           {on({"close"}, {same()})}}}},
        {"tavo_android_msg_queue_init",
         {{"",
           nullptr,
           [] { return long{tavo_android_msg_queue_init(&g_handle)}; },
           [](long result) {
               expect((result == 0) == (g_handle > 0), "the handle is -1 on a failure");
               if (result != 0) return;
               g_queue = queue_of(g_handle);
               drop_queue(0);
               --g_blocks;
               operator delete(g_queue);
           },
           {on({"_ZnwmRKSt9nothrow_t", "_ZnwjRKSt9nothrow_t"}, {fails(TAVO_MQ_FAILURE)}),
            on({"pipe2"}, {same_but({no_pipe})})}}}},
    };
}

std::vector<Row> transfer_rows() {
    return {
        {"android::TAVO_MessageQueue::tavo_android_msg_queue_put(unsigned char*, unsigned int)",
         puts<put_to_object>(false)},
        {"tavo_msg_queue_put", puts<put_to_handle>(true)},
        {"tavo_msg_queue_sendmessage", puts<send_to_handle>(true)},
        {"android::TAVO_MessageQueue::tavo_android_msg_queue_get(unsigned char*, unsigned int*)",
         gets<get_from_object>(false)},
        {"tavo_msg_queue_get", gets<get_from_handle>(true)},
        {"tavo_msg_queue_receivemessage", gets<receive_from_handle>(true)},
        {"android::TAVO_MessageQueue::tavo_android_msg_queue_is_empty()",
         {{"",
           make_queue,
           [] { return long{g_queue->tavo_android_msg_queue_is_empty()}; },
           drop_queue,
           {on_error("poll", EINVAL, {fails(0, {info("poll() error: Invalid argument\n")})}),
            on_error("poll", EINTR, {fails(0, {info("poll() error: Interrupted system call\n")})})}}}},
        // What a queue that could not be looked into holds is asked for otherwise; what was not received stays.
        {"android::TAVO_MessageQueue::tavo_android_msg_queue_clear()",
         {{"",
           [] { make_receiver(8); },
           [] {
               g_queue->tavo_android_msg_queue_clear();
               return long{bytes_pending()};
           },
           drop_queue,
           {on_error("poll", EINVAL, {same_but({info("poll() error: Invalid argument\n")})}),
            on_error("poll", EINTR, {same_but({info("poll() error: Interrupted system call\n")})}),
            on({"ioctl"}, {fails(12)}),
            Expectation{{"read"}, 1, {not_read(12, "Input/output error", {})}, nullptr, EIO},
            Expectation{{"read"}, 2, {not_read(8, "Input/output error", {})}, nullptr, EIO},
            Expectation{{"read"}, 1, {not_read(12, "Interrupted system call", {})}, nullptr, EINTR},
            Expectation{{"read"}, 2, {same()}, nullptr, EINTR}}}}},
        {"android::TAVO_MessageQueue::tavo_android_msg_queue_wait_for_msg(android::TAVO_MessageQueue*, "
         "android::TAVO_MessageQueue*, android::TAVO_MessageQueue*, int)",
         {{"",
           [] { make_receiver(8); },
           [] { return long{g_queue->tavo_android_msg_queue_wait_for_msg(g_queue, nullptr, nullptr, 0)}; },
           drop_queue,
           {on({"poll"}, {fails(-1, {info("Message queue returned error -1\n")})})}}}},
        {"android::TAVO_MessageQueue::tavo_android_get_num_of_messages(int*)",
         {{"",
           [] { make_receiver(8); },
           [] {
               int count = 0;
               return long{g_queue->tavo_android_get_num_of_messages(&count)};
           },
           drop_queue,
           {on({"ioctl"}, {fails(TAVO_FAILURE, {error("failed to get no of msgs. errno is 0x16\n")})})}}}},
    };
}

std::vector<Row> record_rows() {
    static unsigned char name[] = "name";
    const auto row = [](const char* symbol, long (*call)()) {
        return Row{symbol, {{"", make_queue, call, drop_queue, {}}}};
    };
    return {
        row("android::TAVO_MessageQueue::tavo_android_msg_queue_get_fd()",
            [] { return long{g_queue->tavo_android_msg_queue_get_fd()}; }),
        row("android::TAVO_MessageQueue::tavo_android_msg_queue_get_write_fd()",
            [] { return long{g_queue->tavo_android_msg_queue_get_write_fd()}; }),
        row("android::TAVO_MessageQueue::tavo_android_msg_queue_get_service_name()",
            [] { return long{*g_queue->tavo_android_msg_queue_get_service_name()}; }),
        row("android::TAVO_MessageQueue::tavo_android_msg_queue_set_service_name(unsigned char*)",
            [] { return long{g_queue->tavo_android_msg_queue_set_service_name(name)}; }),
        row("android::TAVO_MessageQueue::tavo_android_msg_queue_set_id(unsigned int)",
            [] { return long{g_queue->tavo_android_msg_queue_set_id(7)}; }),
        row("android::TAVO_MessageQueue::tavo_android_msg_queue_set_msg(unsigned char)",
            [] { return g_queue->tavo_android_msg_queue_set_msg(1), 0L; }),
    };
}

}  // namespace

std::vector<Row> queue_object_rows() {
    std::vector<Row> rows = life_rows();
    for (auto* more : {transfer_rows, record_rows}) {
        for (Row& row : more()) rows.push_back(std::move(row));
    }
    return rows;
}

}  // namespace tavo::test::faults
