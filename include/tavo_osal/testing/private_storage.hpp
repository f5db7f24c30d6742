/**
 * @file
 * tavo::test::PrivateStorage: an empty shared storage for this process's library.
 */
#ifndef TAVO_OSAL_TESTING_PRIVATE_STORAGE_HPP
#define TAVO_OSAL_TESTING_PRIVATE_STORAGE_HPP

#include <memory>
#include <string>

namespace tavo::test {

/**
 * While it lives, the library's files are in an empty directory of their own instead of the storage it was built for,
 * which need not exist: marker, key and semaphore files, and what is opened through tavo_osal_fopen() by a path in
 * the storage. Messages in the log still name the storage. Files that the component opens with the C
 * library's functions are its own affair.
 *
 * Services are published in a directory of this process's own from the first PrivateStorage on, so a server, its queues
 * and its blocks can be had in the test itself with tavo_osal_init(), and nothing of it is seen outside; make the first
 * PrivateStorage before anything of the library's inter-process families is used. No right of any kind is needed.
 *
 * What tests of several processes share is set up by the command tavo-private-storage instead.
 *
 * One at a time. Both directories and what is in them go when it ends, or with the process.
 */
class PrivateStorage {
public:
    /** Makes the directories, in $TMPDIR or /tmp. Ends the program with a message when it cannot. */
    PrivateStorage();
    ~PrivateStorage();
    PrivateStorage(const PrivateStorage&) = delete;
    PrivateStorage& operator=(const PrivateStorage&) = delete;

    /** The directory that stands for the storage. */
    const std::string& path() const { return path_; }
    /** The storage that the library was built for. */
    static const char* storage_root();

private:
    std::string path_;
};

/** Redirects the library's files to a directory for as long as the process lives. What tavo-private-storage does. */
void redirect_storage(const std::string& directory);

}  // namespace tavo::test

#endif
