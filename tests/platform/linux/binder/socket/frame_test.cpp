// Frames that a peer takes in parts.
#include "platform/linux/binder/socket/Frame.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstring>
#include <utility>

#include "support/process.h"

namespace {

using namespace android;
using namespace android::socket_driver;
using tavo::test::count_descriptors;

class SocketUnsentFrame : public testing::Test {
protected:
    SocketUnsentFrame() {
        int ends[2];
        EXPECT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
        sender_.reset(ends[0]);
        receiver_.reset(ends[1]);
        frame_.header.magic = kMagic;
        frame_.header.type = FrameType::kReply;
        frame_.header.dataSize = sizeof kData;
        frame_.data = kData;
    }

    // The data of what comes in after so many bytes of the frame, and its descriptors.
    std::pair<std::vector<uint8_t>, size_t> receive_rest(size_t sent) {
        std::vector<uint8_t> bytes(frame_.size());
        iovec buffer = {bytes.data(), bytes.size()};
        std::vector<UniqueFd> descriptors;
        bool lost = false;
        const ssize_t count = receive(receiver_.get(), &buffer, 1, 0, descriptors, lost);
        EXPECT_EQ(count, static_cast<ssize_t>(frame_.size() - sent));
        bytes.resize(count > 0 ? static_cast<size_t>(count) : 0);
        const size_t header = sizeof frame_.header - sent;
        return {{bytes.begin() + static_cast<ptrdiff_t>(header), bytes.end()}, descriptors.size()};
    }

    static constexpr uint8_t kData[8] = {1, 2, 3, 4, 5, 6, 7, 8};
    const std::vector<uint8_t> data_{std::begin(kData), std::end(kData)};
    UniqueFd sender_, receiver_;
    OutgoingFrame frame_;
};

TEST_F(SocketUnsentFrame, KeepsDescriptorsThatItsOwnerCloses) {
    const int descriptor = dup(STDIN_FILENO);
    frame_.descriptors = {descriptor, descriptor};
    const size_t before = count_descriptors();
    std::unique_ptr<UnsentFrame> unsent = UnsentFrame::copy(frame_, 0);
    ASSERT_NE(unsent, nullptr);
    close(descriptor);
    EXPECT_EQ(count_descriptors(), before + 1);
    EXPECT_EQ(unsent->send(sender_.get()), 0);
    EXPECT_EQ(receive_rest(0), std::make_pair(data_, size_t{2}));
    unsent = nullptr;
    EXPECT_EQ(count_descriptors(), before - 1);
}

TEST_F(SocketUnsentFrame, IsNoneWhenADescriptorCannotBeKept) {
    frame_.descriptors = {STDIN_FILENO, -1};
    const size_t before = count_descriptors();
    EXPECT_EQ(UnsentFrame::copy(frame_, 0), nullptr);
    EXPECT_EQ(count_descriptors(), before);
}

// The peer sees by the number in the header that they are lost.
TEST_F(SocketUnsentFrame, RatherLosesDescriptorsThanTheRestOfAFrame) {
    std::vector<uint8_t> large(1 << 20);
    frame_.header.dataSize = static_cast<uint32_t>(large.size());
    frame_.data = large.data();
    frame_.descriptors = {STDIN_FILENO, -1};
    frame_.header.descriptorCount = 2;
    ASSERT_GT(frame_.descriptorsAt(), 1U);
    const size_t before = count_descriptors();
    const std::unique_ptr<UnsentFrame> unsent = UnsentFrame::copy(frame_, 1);
    ASSERT_NE(unsent, nullptr);
    EXPECT_EQ(count_descriptors(), before + 1) << "of which none is sent";
    size_t received = 0;
    for (int error = EAGAIN; error == EAGAIN;) {
        error = unsent->send(sender_.get());
        EXPECT_TRUE(error == 0 || error == EAGAIN) << error;
        std::vector<UniqueFd> descriptors;
        for (ssize_t count = 1; count > 0;) {
            iovec buffer = {large.data(), large.size()};
            bool lost = false;
            count = receive(receiver_.get(), &buffer, 1, MSG_DONTWAIT, descriptors, lost);
            received += count > 0 ? static_cast<size_t>(count) : 0;
        }
        EXPECT_TRUE(descriptors.empty());
    }
    EXPECT_EQ(received, frame_.size() - 1);
}

}  // namespace
