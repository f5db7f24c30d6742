// Loaded in front of programs by tavo-private-storage: redirects the library's files, if the program uses the library.
#include <link.h>

#include <cstdlib>
#include <cstring>

#include "tavo_osal/testing/private_storage.hpp"

namespace {

[[gnu::constructor]] void redirect() {
    const char* directory = getenv("TAVO_PRIVATE_STORAGE");
    if (directory != nullptr && *directory != '\0') tavo::test::redirect_storage(directory);
}

}  // namespace
