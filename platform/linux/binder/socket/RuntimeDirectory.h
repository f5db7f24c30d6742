// Where services are published: one Unix-domain socket per service, named after it, in one directory.
#pragma once

#include <utils/Errors.h>

#include <string>
#include <vector>

#include "../UniqueFd.h"

namespace android::socket_driver {

// A file's identity, as long as somebody keeps the file in use.
struct FileId {
    unsigned long long device = 0;
    unsigned long long inode = 0;
    bool operator==(const FileId& other) const { return device == other.device && inode == other.inode; }
};

class RuntimeDirectory {
public:
    // $BINDER_RUNTIME_DIR, else $XDG_RUNTIME_DIR/binder, else a directory of this user under /tmp; made with mode 0700
    // when it is missing. Who may enter the directory may reach the services in it. PERMISSION_DENIED when the
    // directory under /tmp is not this user's alone.
    static status_t open(RuntimeDirectory& directory);

    // A service name is a file name: not empty, no more than 127 characters, no '/', no '.' in front.
    static bool isValidName(const std::string& name);

    // Binds and listens, and only then gives the socket its name, in one step: whoever held the name before,
    // alive or dead, is replaced, and nobody meets a socket that does not listen yet.
    status_t publish(const std::string& name, UniqueFd& listener, FileId& id) const;
    // NAME_NOT_FOUND when nobody listens under the name.
    status_t connect(const std::string& name, UniqueFd& connection) const;
    // False when there is no socket of that name.
    bool identify(const std::string& name, FileId& id) const;
    std::vector<std::string> list() const;

private:
    UniqueFd directory_;
};

}  // namespace android::socket_driver
