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

    // A service name is a file name: not empty, no more than 255 bytes, no '/', no '.' in front.
    static bool isValidName(const std::string& name);

    // A socket that listens, but has no name yet that anybody knows.
    struct Unnamed {
        UniqueFd socket;
        FileId file;
        std::string temporary;
        UniqueFd presence;  // while it is open, nobody takes the temporary name for one that was left behind
    };
    status_t listen(Unnamed& unnamed) const;
    // In one step: whoever held the name before, alive or dead, is replaced.
    status_t give(const Unnamed& unnamed, const std::string& name) const;
    void discard(const Unnamed& unnamed) const;

    // Somebody who listens, or at least a file that tells who did.
    struct Found {
        UniqueFd connection;
        UniqueFd path;  // keeps the file's number from being used for another
        FileId file;
    };
    // NAME_NOT_FOUND when nobody listens under the name.
    status_t connect(const std::string& name, Found& found) const;
    // False when there is no socket of that name.
    bool identify(const std::string& name, FileId& id) const;
    // The names under which somebody listens.
    std::vector<std::string> list() const;

private:
    bool isListenedTo(const char* name) const;
    UniqueFd takePart() const;
    void removeAbandoned() const;

    UniqueFd directory_;
};

}  // namespace android::socket_driver
