// Names as files in the runtime directory.
#include <fcntl.h>
#include <signal.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
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

TEST(SocketName, IsPublishedWithoutTheLeftoversOfWhoWasKilledWhilePublishing) {
    const auto bind_one = [](const std::string& name) {
        const int fd = socket(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        ("/run/binder/" + name).copy(address.sun_path, sizeof address.sun_path - 1);
        EXPECT_EQ(bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        close(fd);
    };
    const auto exists = [](const std::string& name) { return access(("/run/binder/" + name).c_str(), F_OK) == 0; };
    bind_one(".0123456789abcdef");
    bind_one(".0123456789abcdeF");  // somebody else's
    bind_one("0123456789abcdef0");
    const int other = open("/run/binder", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    ASSERT_EQ(flock(other, LOCK_SH), 0);  // somebody is publishing: it may be his
    const sp<IBinder> own = new TestService;
    ASSERT_EQ(publish("name", own), OK);
    EXPECT_TRUE(exists(".0123456789abcdef"));
    close(other);
    ASSERT_EQ(publish("name", own), OK);
    EXPECT_FALSE(exists(".0123456789abcdef"));
    EXPECT_TRUE(exists(".0123456789abcdeF"));
    EXPECT_TRUE(exists("0123456789abcdef0"));
    EXPECT_EQ(find_service("name"), own);
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
