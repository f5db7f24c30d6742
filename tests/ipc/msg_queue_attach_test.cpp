// Attaching to queues, in the server's own process.
#include <fcntl.h>
#include <unistd.h>

#include <climits>

#include "ipc/allocation_fault.h"
#include "ipc/descriptors.h"
#include "ipc/msg_queue_test.h"

namespace {

using tavo::test::AllocationFault;
using tavo::test::attach;
using tavo::test::attached;
using tavo::test::count_descriptors;
using tavo::test::DescriptorLimit;
using tavo::test::file_of;
using tavo::test::get;
using tavo::test::is_open;
using tavo::test::kAttachName;
using tavo::test::kEntered;
using tavo::test::kExiting;
using tavo::test::kLookup;
using tavo::test::kLookupBegins;
using tavo::test::kQueueTrace;
using tavo::test::kServiceTag;
using tavo::test::kUntouched;
using tavo::test::library_lines;
using tavo::test::line;
using tavo::test::Lines;
using tavo::test::LogCapture;
using tavo::test::logged_exactly;
using tavo::test::NoInput;
using tavo::test::PlatformHook;
using tavo::test::put;
using tavo::test::queue_of;

using Attach = tavo::test::OwnServerTest;

TEST_F(Attach, HandsOutTheServicesQueue) {
    const TAVO_INT64 handle = attached("7");
    const android::TAVO_MessageQueue& queue = queue_of(handle);
    EXPECT_NE(queue.iReadFd, service_->get_fd(7));  // what it closes is its own
    EXPECT_NE(queue.iWriteFd, service_->get_write_fd(7));
    EXPECT_EQ(file_of(queue.iReadFd), file_of(service_->get_fd(7)));
    EXPECT_EQ(file_of(queue.iWriteFd), file_of(service_->get_fd(7)));
    EXPECT_STREQ(queue.acServiceName, "7");
    EXPECT_EQ(fcntl(queue.iReadFd, F_GETFD), FD_CLOEXEC);
    EXPECT_EQ(fcntl(queue.iWriteFd, F_GETFD), FD_CLOEXEC);
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
}

TEST_F(Attach, ConnectsEveryHandleOfAKey) {
    const TAVO_INT64 sender = attached("7");
    const TAVO_INT64 receiver = attached("7");
    EXPECT_NE(sender, receiver);
    EXPECT_EQ(put(sender, "message"), TAVO_SUCCESS);
    EXPECT_EQ(get(receiver), "message");
    EXPECT_EQ(tavo_msg_queue_destroy(sender), TAVO_SUCCESS);
    EXPECT_EQ(put(receiver, "to itself"), TAVO_SUCCESS);
    EXPECT_EQ(get(receiver), "to itself");
    EXPECT_EQ(tavo_msg_queue_destroy(receiver), TAVO_SUCCESS);
}

TEST_F(Attach, LogsEveryStep) {
    TAVO_INT64 handle = kUntouched;
    const LogCapture log;
    EXPECT_EQ(attach("7", &handle), TAVO_SUCCESS);
    EXPECT_TRUE(logged_exactly(
        library_lines(log),
        Lines{kEntered} + kLookup + kQueueTrace /* the service's */ + kQueueTrace /* this one */ +
            Lines{line(1, kAttachName + " () : getting fd for 7 \n"), line(1, kAttachName + " () GOT FD \n"),
                  line(4, kAttachName + "() successfully obtained message queue \n")} +
            kQueueTrace + kQueueTrace +
            Lines{line(4, "Message queue object returned: addr PTR  :  service 7\n"), kExiting}));
    EXPECT_EQ(logged_address(log, "Message queue object returned: addr "), &queue_of(handle));
    tavo_msg_queue_destroy(handle);
}

TEST_F(Attach, RefusesNullPointersWithoutALookUp) {
    TAVO_INT64 handle = kUntouched;
    char name[] = "7";
    {
        const LogCapture log;
        EXPECT_EQ(tavo_msg_queue_sender_init(nullptr, &handle), 0x9302);
        EXPECT_TRUE(logged_exactly(library_lines(log),
                                   {kEntered, line(1, "Invalid pointer passed pcServiceName\n"), kExiting}));
    }
    EXPECT_EQ(handle, kUntouched);
    {
        const LogCapture log;
        EXPECT_EQ(tavo_msg_queue_sender_init(name, nullptr), 0x9302);
        EXPECT_TRUE(
            logged_exactly(library_lines(log), {kEntered, line(1, "Invalid pointer passed piMqId\n"), kExiting}));
    }
    EXPECT_EQ(tavo_msg_queue_sender_init(nullptr, nullptr), 0x9302);
    EXPECT_EQ(uses(7), 0);
}

TEST_F(Attach, AnswersAPlainOneWithoutTheMarker) {
    std::filesystem::remove_all(tavo::test::kMarkerDirectory);
    TAVO_INT64 handle = kUntouched;
    const LogCapture log;
    EXPECT_EQ(attach("7", &handle), 1);
    EXPECT_EQ(handle, kUntouched);
    EXPECT_TRUE(logged_exactly(library_lines(log), Lines{kEntered} + kLookupBegins +
                                                       Lines{line(1, "Service is not available\n"),
                                                             line(1, "tavo_osal_get_service() failed\n"), kExiting}));
}

TEST_F(Attach, ReportsMissingMemoryAndGivesTheUseBack) {
    TAVO_INT64 handle = kUntouched;
    {
        const AllocationFault fault(AllocationFault::kNothrowNew, 2);  // behind the service's own
        EXPECT_EQ(attach("7", &handle), 0x9003);
    }
    EXPECT_EQ(handle, kUntouched);
    EXPECT_EQ(uses(7), 0);
}

// --- the key

TEST_F(Attach, HasNoQueueForATextThatIsNoNumber) {
    for (const char* text : {"abc", "", "0", "-", " ", "x7"}) {
        TAVO_INT64 handle = kUntouched;
        const LogCapture log;
        EXPECT_EQ(attach(text, &handle), 0x9306) << text;
        EXPECT_EQ(handle, kUntouched);
        EXPECT_TRUE(logged_exactly(library_lines(log),
                                   Lines{kEntered} + kLookup + Lines{line(1, "Invalid key!!\n")} + kQueueTrace +
                                       Lines{line(1, kAttachName + " () : getting fd for 0 \n"),
                                             line(1, kAttachName + " () GOT FD \n"), line(1, "Invalid key!!\n"),
                                             line(1, " Service Exists!!But no queue in that service : fd -1 : -1 \n")} +
                                       kQueueTrace + Lines{kExiting}));
    }
}

struct KeyText {
    const char* name;
    std::string text;
    int key;
};

void PrintTo(const KeyText& key, std::ostream* out) { *out << key.key; }

class AttachKey : public Attach, public testing::WithParamInterface<KeyText> {};

TEST_P(AttachKey, IsTheSameWhenAttachingAndDestroying) {
    const LogCapture log(1);
    const TAVO_INT64 handle = attached(GetParam().text);
    EXPECT_EQ(times_logged(log, kAttachName + " () : getting fd for " + std::to_string(GetParam().key) + " \n"), 1U);
    EXPECT_GE(service_->get_fd(GetParam().key), 0);
    EXPECT_EQ(put(handle, "message"), TAVO_SUCCESS);
    EXPECT_EQ(get(handle), "message");
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
    EXPECT_EQ(service_->get_fd(GetParam().key), -1);
}

const KeyText kKeyTexts[] = {
    {"Negative", "-5", -5},
    {"LeadingBlanks", " \t12", 12},
    {"Plus", "+9", 9},
    {"Rest", "12abc", 12},
    {"Fraction", "3.9", 3},
    {"Largest", "2147483647", INT_MAX},
    {"Smallest", "-2147483648", INT_MIN},
    {"OneTooLarge", "2147483648", INT_MAX},
    {"OneTooSmall", "-2147483649", INT_MIN},
    {"TwiceThirtyTwoBits", "4294967303", INT_MAX},
    {"BeyondSixtyFourBits", "99999999999999999999999", INT_MAX},
    {"BelowSixtyFourBits", "-99999999999999999999999", INT_MIN},
    {"SixtyThreeCharacters", std::string(62, '0') + "7", 7},
    {"SixtyFourCharacters", std::string(63, '0') + "7", 7},
    {"SixtyFiveCharacters", std::string(62, '0') + "123", 12},
    {"ManyCharacters", "8" + std::string(5000, ' '), 8},
    {"ManyDigits", std::string(5000, '9'), INT_MAX},
};
INSTANTIATE_TEST_SUITE_P(Texts, AttachKey, testing::ValuesIn(kKeyTexts),
                         [](const auto& key) { return std::string(key.param.name); });

// --- descriptors run out: nothing is left behind, neither here nor in the service

TEST_F(Attach, GivesTheUseBackWhenDescriptorsRunOut) {
    const TAVO_INT64 first = attached("7");
    const size_t before = count_descriptors();
    unsigned more = 0;
    for (; more < 10; ++more) {
        TAVO_INT64 handle = kUntouched;
        TAVO_Status status = TAVO_SUCCESS;
        {
            const DescriptorLimit limit(more);
            status = attach("7", &handle);
        }
        EXPECT_TRUE(is_open(0));
        if (status == TAVO_SUCCESS) {
            EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
            break;
        }
        EXPECT_EQ(status, 0x9306) << more;
        EXPECT_EQ(handle, kUntouched);
        EXPECT_EQ(count_descriptors(), before);
    }
    EXPECT_GE(more, 2U);
    EXPECT_LE(more, 4U);
    EXPECT_EQ(tavo_msg_queue_destroy(first), TAVO_SUCCESS);
    EXPECT_EQ(uses(7), 0);
}

TEST_F(Attach, ClosesNothingThatIsNotItsOwnWithoutATemporaryPipe) {
    ASSERT_EQ(service_->create_message_queue(7), 0);
    const size_t before = count_descriptors();
    TAVO_INT64 handle = kUntouched;
    {
        const PlatformHook hook(
            tavo::test::kLibrary, "pipe2", +[](int*, int) {
                errno = EMFILE;
                return -1;
            });
        EXPECT_EQ(attach("7", &handle), TAVO_SUCCESS);
    }
    EXPECT_TRUE(is_open(0));
    EXPECT_EQ(count_descriptors(), before + 2);
    EXPECT_EQ(put(handle, "message"), TAVO_SUCCESS);
    EXPECT_EQ(get(handle), "message");
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
    EXPECT_TRUE(is_open(0));
}

TEST_F(Attach, NeverUsesDescriptorZero) {
    const NoInput input;
    const TAVO_INT64 handle = attached("7");
    EXPECT_GT(queue_of(handle).iReadFd, 0);
    EXPECT_GT(queue_of(handle).iWriteFd, 0);
    EXPECT_EQ(put(handle, "message"), TAVO_SUCCESS);
    EXPECT_EQ(get(handle), "message");
    EXPECT_FALSE(is_open(0));
    EXPECT_EQ(tavo_msg_queue_destroy(handle), TAVO_SUCCESS);
}

}  // namespace
