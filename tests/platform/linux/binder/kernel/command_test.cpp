// What the kernel says and is told, as bytes; and whose handles are whose.
#include <gtest/gtest.h>

#include <random>

#include "platform/linux/binder/kernel/CommandQueue.h"
#include "platform/linux/binder/kernel/CommandReader.h"
#include "platform/linux/binder/kernel/Handles.h"
#include "support/fake_binder_device.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size);

namespace {

using namespace android;
using namespace android::kernel_driver;
using tavo::test::Said;
using Result = CommandReader::Result;

TEST(CommandReader, ReadsCommandsInOrder) {
    const Said said = Said()
                          .add(BR_NOOP)
                          .add(BR_ACQUIRE, binder_ptr_cookie{1, 2})
                          .add(BR_DEAD_BINDER, binder_uintptr_t{3})
                          .add(BR_TRANSACTION_COMPLETE);
    CommandReader reader(said.bytes().data(), said.bytes().size());
    Command command;
    ASSERT_EQ(reader.next(command), Result::kCommand);
    EXPECT_EQ(command.code(), BR_NOOP);
    ASSERT_EQ(reader.next(command), Result::kCommand);
    EXPECT_EQ(command.code(), BR_ACQUIRE);
    EXPECT_EQ(command.payload<binder_ptr_cookie>().cookie, 2U);
    ASSERT_EQ(reader.next(command), Result::kCommand);
    EXPECT_EQ(command.payload<binder_uintptr_t>(), 3U);
    EXPECT_FALSE(reader.atEnd());
    ASSERT_EQ(reader.next(command), Result::kCommand);
    EXPECT_TRUE(reader.atEnd());
    EXPECT_EQ(reader.next(command), Result::kEnd);
    EXPECT_EQ(command.code(), BR_TRANSACTION_COMPLETE) << "the last one";
}

TEST(CommandReader, KnowsTheLengthOfCommandsItHasNeverHeardOf) {
    const uint32_t unknown = _IOR('r', 200, uint8_t[300]);
    const uint8_t payload[300] = {};
    const Said said = Said().add(unknown, payload).add(BR_OK);
    CommandReader reader(said.bytes().data(), said.bytes().size());
    Command command;
    EXPECT_EQ(reader.next(command), Result::kCommand);
    EXPECT_EQ(command.code(), unknown);
    EXPECT_EQ(reader.next(command), Result::kCommand);
    EXPECT_EQ(command.code(), BR_OK);
}

TEST(CommandReader, DropsWhatIsCutOff) {
    const Said said = Said().add(BR_NOOP).add(BR_REPLY, binder_transaction_data{});
    for (size_t size = 5; size < said.bytes().size(); ++size) {
        // In memory of its own, so that a sanitizer sees what lies behind it.
        const std::vector<uint8_t> part(said.bytes().begin(), said.bytes().begin() + static_cast<std::ptrdiff_t>(size));
        CommandReader reader(part.data(), part.size());
        Command command;
        EXPECT_EQ(reader.next(command), Result::kCommand);
        EXPECT_EQ(reader.next(command), Result::kBroken) << size;
        EXPECT_EQ(reader.next(command), Result::kEnd);
    }
}

TEST(CommandReader, DropsWhatIsNoCommandOfTheDrivers) {
    const Said said = Said().add(BC_ENTER_LOOPER).add(BR_NOOP);
    CommandReader reader(said.bytes().data(), said.bytes().size());
    Command command;
    EXPECT_EQ(reader.next(command), Result::kBroken);
    EXPECT_TRUE(reader.atEnd());
}

TEST(CommandReader, SurvivesRandomBytes) {
    std::mt19937 random(7);
    for (int i = 0; i < 5000; ++i) {
        std::vector<uint8_t> bytes(random() % 80);
        for (uint8_t& byte : bytes) byte = static_cast<uint8_t>(random());
        // Mostly plausible numbers, or almost nothing would get past the first.
        for (size_t at = 0; at + 4 <= bytes.size() && random() % 4 != 0; at += 4) {
            const auto code = static_cast<uint32_t>(_IOC(_IOC_READ, 'r', random() % 24, random() % 40));
            memcpy(&bytes[at], &code, sizeof code);
        }
        LLVMFuzzerTestOneInput(bytes.data(), bytes.size());
    }
    LLVMFuzzerTestOneInput(nullptr, 0);
}

TEST(CommandQueue, KeepsWhatHasNotBeenSaid) {
    CommandQueue queue;
    EXPECT_TRUE(queue.empty());
    queue.add<BC_ENTER_LOOPER>();
    queue.add<BC_RELEASE>(uint32_t{5});
    EXPECT_EQ(queue.size(), 12U);
    queue.consume(4);
    uint32_t code = 0;
    memcpy(&code, queue.data(), sizeof code);
    EXPECT_EQ(code, BC_RELEASE);
    queue.consume(100);
    EXPECT_TRUE(queue.empty());
}

TEST(CommandQueue, TakesOneCommandBackUnlessItHasBeenSaid) {
    CommandQueue queue;
    queue.add<BC_ENTER_LOOPER>();
    const uint64_t first = queue.mark();
    queue.add<BC_RELEASE>(uint32_t{5});
    queue.add<BC_DECREFS>(uint32_t{6});
    queue.consume(4);
    queue.takeBack<BC_RELEASE>(first);
    ASSERT_EQ(queue.size(), 8U);
    uint32_t code = 0;
    memcpy(&code, queue.data(), sizeof code);
    EXPECT_EQ(code, BC_DECREFS);
    queue.consume(8);
    queue.add<BC_EXIT_LOOPER>();
    queue.takeBack<BC_RELEASE>(first);
    EXPECT_EQ(queue.size(), 4U) << "it is too late";
}

TEST(Handles, AreTheKernelsBusinessFirstAndLast) {
    Handles handles;
    EXPECT_FALSE(handles.isKnown(7));
    EXPECT_TRUE(handles.acquire(7));
    EXPECT_FALSE(handles.acquire(7));
    EXPECT_TRUE(handles.isKnown(7));
    EXPECT_FALSE(handles.release(7).isLast);
    EXPECT_TRUE(handles.release(7).isLast);
    EXPECT_FALSE(handles.isKnown(7));
    EXPECT_FALSE(handles.release(7).isLast) << "nobody has it";
}

TEST(Handles, AreMournedOnceEach) {
    Handles handles;
    uint64_t cookie = Handles::kNone, again = Handles::kNone;
    EXPECT_EQ(handles.mourn(7, nullptr, cookie), BAD_TYPE);
    handles.acquire(7);
    EXPECT_EQ(handles.mourn(7, nullptr, cookie), OK);
    EXPECT_NE(cookie, Handles::kNone);
    EXPECT_EQ(handles.mourn(7, nullptr, again), OK);
    EXPECT_EQ(again, Handles::kNone) << "the kernel knows";
    EXPECT_EQ(handles.forget(7), cookie);
    EXPECT_EQ(handles.forget(7), Handles::kNone);
    Handles::Death death;
    EXPECT_FALSE(handles.died(cookie, death)) << "which had been taken back";
    EXPECT_EQ(handles.mourn(7, nullptr, again), OK);
    EXPECT_NE(again, cookie);
    EXPECT_TRUE(handles.died(again, death));
    EXPECT_EQ(death.handle, 7);
    EXPECT_EQ(handles.mourn(7, nullptr, again), DEAD_OBJECT);
    EXPECT_EQ(handles.release(7).cookie, Handles::kNone);
}

TEST(Handles, LeaveNoNotificationBehind) {
    Handles handles;
    uint64_t cookie = Handles::kNone;
    handles.acquire(7);
    EXPECT_EQ(handles.mourn(7, nullptr, cookie), OK);
    EXPECT_EQ(handles.release(7).cookie, cookie);
    Handles::Death death;
    EXPECT_FALSE(handles.died(cookie, death));
    // The number may come to mean another object.
    handles.acquire(7);
    EXPECT_EQ(handles.forget(7), Handles::kNone);
}

}  // namespace
