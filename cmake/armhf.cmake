# 32-bit ARM, built with Debian's cross compiler (g++-arm-linux-gnueabihf) against the packages that cmake/sysroot.sh
# unpacks, and run by QEMU's user emulator.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR armv7l)
set(CMAKE_C_COMPILER arm-linux-gnueabihf-gcc)
set(CMAKE_CXX_COMPILER arm-linux-gnueabihf-g++)

set(TAVO_SYSROOT "${CMAKE_CURRENT_LIST_DIR}/../build/sysroot/armhf" CACHE PATH
    "The folder with Android's libraries and GoogleTest for 32-bit ARM")
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES TAVO_SYSROOT)
get_filename_component(CMAKE_FIND_ROOT_PATH "${TAVO_SYSROOT}" ABSOLUTE)
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
foreach(kind IN ITEMS LIBRARY INCLUDE PACKAGE)
    set(CMAKE_FIND_ROOT_PATH_MODE_${kind} ONLY)
endforeach()

# The compiler brings its own C library. Where the sysroot is the root, the libraries are where Debian has them.
set(CMAKE_BUILD_RPATH /usr/lib/arm-linux-gnueabihf/android)
# What those libraries need in turn: neither the linker nor the emulated loader finds it below the sysroot by itself.
set(library_folders "${CMAKE_FIND_ROOT_PATH}${CMAKE_BUILD_RPATH}" "${CMAKE_FIND_ROOT_PATH}/usr/lib/p7zip")
list(JOIN library_folders ":" library_path)
string(APPEND CMAKE_EXE_LINKER_FLAGS_INIT " -Wl,-rpath-link,${library_path}")
string(APPEND CMAKE_SHARED_LINKER_FLAGS_INIT " -Wl,-rpath-link,${library_path}")

set(CMAKE_CROSSCOMPILING_EMULATOR qemu-arm -L "${CMAKE_FIND_ROOT_PATH}" -E "LD_LIBRARY_PATH=${library_path}")
