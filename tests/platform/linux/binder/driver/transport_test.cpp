// What parcels carry besides numbers: descriptors, and a great deal.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstring>
#include <thread>

#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;

// The kernel's driver carries as much as it has mapped.
size_t limit() {
    const size_t most = 1024 * 1024;
    return is_kernel_driver() ? most - 2 * static_cast<size_t>(sysconf(_SC_PAGESIZE)) : most;
}

bool same_file(int one, int other) {
    struct stat a {
    }, b{};
    return fstat(one, &a) == 0 && fstat(other, &b) == 0 && a.st_dev == b.st_dev && a.st_ino == b.st_ino;
}

class DriverTransport : public testing::Test {
protected:
    status_t echo(const Parcel& data, Parcel* reply) { return service_->transact(TestService::kEcho, data, reply); }
    status_t reply_descriptor(int descriptor, size_t size, Parcel* reply) {
        Parcel data;
        data.writeInt32(descriptor);
        data.writeInt32(static_cast<int32_t>(size));
        return service_->transact(TestService::kReplyDescriptor, data, reply);
    }
    // A descriptor number that is not open in the server.
    static constexpr int kClosed = 999;

    const Process server_ = start_server();
    const sp<IBinder> service_ = find_service();
};

TEST_F(DriverTransport, PassesDescriptors) {
    Parcel reply;
    ASSERT_EQ(service_->transact(TestService::kOpenPipe, Parcel(), &reply), OK);
    const int from = reply.readFileDescriptor(), to = reply.readFileDescriptor();
    ASSERT_GE(from, 0);
    ASSERT_GE(to, 0);
    char text[6] = "";
    EXPECT_EQ(write(to, "hello", 5), 5);
    EXPECT_EQ(read(from, text, 5), 5);
    EXPECT_STREQ(text, "hello");
    EXPECT_EQ(fcntl(from, F_GETFD), FD_CLOEXEC);
    EXPECT_EQ(fcntl(to, F_GETFD), FD_CLOEXEC);
}

TEST_F(DriverTransport, ClosesDescriptorsWithTheParcel) {
    EXPECT_EQ(service_->pingBinder(), OK);
    const size_t here = count_descriptors(), there = count_descriptors(server_.pid());
    {
        Parcel reply;
        ASSERT_EQ(service_->transact(TestService::kOpenPipe, Parcel(), &reply), OK);
        EXPECT_EQ(count_descriptors(), here + 2);
    }
    EXPECT_EQ(count_descriptors(), here);
    EXPECT_TRUE(comes_true([&] { return count_descriptors(server_.pid()) == there; }));
}

TEST_F(DriverTransport, PassesDescriptorsWithParcelsOfAnySize) {
    for (const size_t size : {0U, 100U, 3900U, 4000U, 4096U, 5000U, 20000U, 300000U, 1000000U}) {
        Parcel data, reply;
        data.setDataSize(size & ~3U);
        data.setDataPosition(data.dataSize());
        data.writeFileDescriptor(STDIN_FILENO);
        ASSERT_EQ(echo(data, &reply), OK) << size;
        reply.setDataPosition(size & ~3U);
        EXPECT_TRUE(same_file(reply.readFileDescriptor(), STDIN_FILENO)) << size;
    }
}

TEST_F(DriverTransport, RefusesDescriptorsThatAreNotOpen) {
    for (const size_t size : {0U, 100000U}) {
        for (const int descriptor : {-1, kClosed}) {
            Parcel data, reply;
            data.setDataSize(size);
            data.setDataPosition(size);
            data.writeFileDescriptor(descriptor);
            EXPECT_EQ(echo(data, &reply), FAILED_TRANSACTION) << descriptor << " sent with " << size;
            EXPECT_EQ(reply.dataSize(), 0U);
            EXPECT_EQ(reply_descriptor(descriptor, size, &reply), FAILED_TRANSACTION)
                << descriptor << " replied with " << size;
            EXPECT_EQ(reply.dataSize(), 0U);
        }
    }
    Parcel reply;
    EXPECT_EQ(reply_descriptor(STDIN_FILENO, 0, &reply), OK) << "and goes on";
}

TEST_F(DriverTransport, GivesBackTheObjectsOfRefusedParcels) {
    start_pool();
    for (const size_t size : {0U, 100000U}) {
        for (const int descriptor : {-1, kClosed}) {
            Parcel data, reply;
            data.setDataSize(size);
            data.setDataPosition(size);
            data.writeStrongBinder(new TestService);
            data.writeFileDescriptor(descriptor);
            EXPECT_EQ(echo(data, &reply), FAILED_TRANSACTION);
        }
    }
    EXPECT_TRUE(comes_true([] { return TestService::count() == 0; }));
}

TEST_F(DriverTransport, CarriesUpToALimitEitherWay) {
    Parcel data, reply;
    std::vector<uint8_t> bytes(limit());
    for (size_t i = 0; i < bytes.size(); ++i) bytes[i] = static_cast<uint8_t>(i * 7 + i / 256);
    data.write(bytes.data(), bytes.size());
    ASSERT_EQ(data.dataSize(), limit());
    ASSERT_EQ(echo(data, &reply), OK);
    ASSERT_EQ(reply.dataSize(), limit());
    EXPECT_EQ(memcmp(reply.data(), bytes.data(), limit()), 0);

    data.writeInt32(1);
    EXPECT_EQ(echo(data, &reply), FAILED_TRANSACTION);
    EXPECT_EQ(reply.dataSize(), 0U);
    Parcel size;
    size.writeInt32(static_cast<int32_t>(limit() + 4));
    EXPECT_EQ(service_->transact(TestService::kBytes, size, &reply), FAILED_TRANSACTION);
    EXPECT_EQ(reply.dataSize(), 0U);
    EXPECT_EQ(service_->pingBinder(), OK);
}

TEST_F(DriverTransport, CarriesSizesOfAllKinds) {
    for (int32_t size = 0; size < 10000; size += size < 300 ? 1 : 97) {
        Parcel data, reply;
        data.writeInt32(size);
        ASSERT_EQ(service_->transact(TestService::kBytes, data, &reply), OK);
        ASSERT_EQ(reply.dataSize(), static_cast<size_t>((size + 3) & ~3));
    }
}

TEST_F(DriverTransport, CarriesMuchForManyAtOnce) {
    std::vector<std::thread> threads;
    for (int i = 0; i < 8; ++i) {
        threads.emplace_back([&, i] {
            // The kernel's driver has room for so much altogether.
            std::vector<uint8_t> bytes(is_kernel_driver() ? 100000 : 500000, static_cast<uint8_t>(i));
            for (int n = 0; n < 5; ++n) {
                Parcel data, reply;
                data.write(bytes.data(), bytes.size());
                ASSERT_EQ(echo(data, &reply), OK);
                EXPECT_EQ(memcmp(reply.data(), bytes.data(), bytes.size()), 0);
            }
        });
    }
    for (std::thread& thread : threads) thread.join();
}

}  // namespace
