// How far the socket driver goes where the kernel's does not: sizes, numbers, and processes without a pool.
#include <linux/android/binder.h>
#include <sys/stat.h>
#include <unistd.h>

#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;

constexpr int kMostDescriptors = 253;

bool same_file(int one, int other) {
    struct stat a {
    }, b{};
    return fstat(one, &a) == 0 && fstat(other, &b) == 0 && a.st_dev == b.st_dev && a.st_ino == b.st_ino;
}

TEST(SocketObject, GoesAwayWithThePoollessProcessesNextCall) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    ASSERT_EQ(ask(service, TestService::kKeep, new TestService), 0);
    ASSERT_EQ(ask(service, TestService::kKeep, nullptr), 0);
    EXPECT_TRUE(comes_true([&] { return service->pingBinder() == OK && TestService::count() == 0; }));
}

TEST(SocketObject, OfATypeThatIsNotCarriedFailsTheCallAlone) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    flat_binder_object object{};
    object.hdr.type = BINDER_TYPE_WEAK_BINDER;
    const binder_size_t offset = 0;
    Parcel data, reply;
    data.ipcSetDataReference(reinterpret_cast<const uint8_t*>(&object), sizeof object, &offset, 1, nullptr, nullptr);
    EXPECT_EQ(service->transact(TestService::kEcho, data, &reply), FAILED_TRANSACTION);
    EXPECT_EQ(service->pingBinder(), OK);
}

TEST(SocketOneway, OfAnySizeIsAcceptedAlone) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    Parcel data;
    data.setDataSize(1024 * 1024);
    EXPECT_EQ(service->transact(TestService::kAppend, data, nullptr, IBinder::FLAG_ONEWAY), OK);
    EXPECT_TRUE(comes_true([&] { return ask(service, TestService::kAppended) == 1; }));
}

TEST(SocketTransport, PassesAsManyDescriptorsAsSockets) {
    const Process server = start_server();
    const sp<IBinder> service = find_service();
    Parcel data, reply;
    for (int i = 0; i < kMostDescriptors; ++i) data.writeFileDescriptor(STDIN_FILENO);
    ASSERT_EQ(service->transact(TestService::kEcho, data, &reply), OK);
    for (int i = 0; i < kMostDescriptors; ++i) EXPECT_TRUE(same_file(reply.readFileDescriptor(), STDIN_FILENO));
    data.writeFileDescriptor(STDIN_FILENO);
    EXPECT_EQ(service->transact(TestService::kEcho, data, &reply), FAILED_TRANSACTION);
    EXPECT_EQ(service->pingBinder(), OK);
}

}  // namespace
