// Names as files in the runtime directory.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utils/String8.h>

#include "test_service.h"

namespace {

using namespace android;
using namespace tavo::test;

status_t publish(const std::string& name, const sp<IBinder>& service) {
    return defaultServiceManager()->addService(String16(name.c_str()), service);
}

std::vector<std::string> listed() {
    std::vector<std::string> names;
    for (const String16& name : defaultServiceManager()->listServices()) names.push_back(String8(name).string());
    return names;
}

TEST(SocketName, OfAnythingElseInTheDirectoryIsNotListed) {
    close(open("/run/binder/file", O_CREAT | O_WRONLY | O_CLOEXEC, 0600));
    mkdir("/run/binder/directory", 0700);
    EXPECT_TRUE(listed().empty());
    EXPECT_EQ(find_service("file"), nullptr);
    EXPECT_EQ(find_service("directory"), nullptr);
    ASSERT_EQ(publish("file", new TestService), OK) << "a file gives way";
    EXPECT_NE(publish("directory", new TestService), OK);
    EXPECT_EQ(listed(), std::vector<std::string>{"file"});
}

TEST(SocketName, MustBeAFileName) {
    for (const char* name : {"", ".", "..", ".hidden", "a/b", "/a"}) {
        EXPECT_EQ(publish(name, new TestService), BAD_VALUE) << name;
        EXPECT_EQ(find_service(name), nullptr) << name;
    }
    const char16_t zero[] = {u'a', 0, u'b'};
    EXPECT_EQ(defaultServiceManager()->addService(String16(zero, 3), new TestService), BAD_VALUE);
    EXPECT_TRUE(listed().empty());
}

}  // namespace
