#!/usr/bin/env bash
# Installs a build into an empty prefix, moves it, builds the example projects against it with CMake and with
# pkg-config, and runs them.
#
#   check_install.sh SOURCE_DIR BUILD_DIR WORK_DIR CC CXX
set -euo pipefail

source=$1 build=$2 work=$3 cc=$4 cxx=$5
sandbox=$source/tests/support/sandbox.sh
rm -rf "$work" && mkdir -p "$work"

fail() { echo "FAILED: $*" >&2; exit 1; }

cmake --install "$build" --prefix "$work/first place" >"$work/install.log" || { cat "$work/install.log"; fail "installing"; }
# Nothing may depend on where it was installed first; blanks in paths are the exception, for pkg-config's users.
mv "$work/first place" "$work/prefix"
prefix=$work/prefix
libdir=$(dirname "$(find "$prefix" -name libtavoosal.so)")

if grep -rlIF -e "$build" -e "$source" -e "first place" "$prefix" --include='*.cmake' --include='*.pc' --include='*.h*' \
    --exclude-dir=include --include=tavo-private-storage; then
    fail "the files above name the folders of the build"
fi
while read -r file; do
    runpath=$(readelf -d "$file" 2>/dev/null | sed -n 's/.*R\(UN\)\?PATH.*\[\(.*\)\]/\2/p' || true)
    [[ $runpath != *"$build"* && $runpath != *"$work"* && $runpath != *::* ]] || fail "$file has the RUNPATH $runpath"
done < <(find "$prefix" -type f \( -name '*.so*' -o -path '*/bin/*' \))

if [[ -e $prefix/bin/tavo ]]; then
    cmp "$source/tools/tavo.bash" "$prefix/share/bash-completion/completions/tavo" || fail "completion for bash"
fi

run() { # NAME PROGRAM EXPECTED_LINE ...: in the sandbox, with these lines in its output, in this order
    local name=$1 program=$2 output
    shift 2
    output=$("$sandbox" "$program" 2>"$work/$name.log") || { cat "$work/$name.log"; fail "$name: exit status $?"; }
    [[ $(grep -xF -f <(printf '%s\n' "$@") <<<"$output") == "$(printf '%s\n' "$@")" ]] || fail "$name printed: $output"
}
run_c() { run "$1" "$2" 'got hello' 'the block holds shared'; }
run_cpp() {
    run "$1" "$2" 'before there is a service: the service is not reachable' 'the thread handed over 42' \
        'the timer fired three times' 'got hello' 'mapped 4096 bytes' \
        'as expected: tavo::MessageQueue::put: the message is larger than a queue carries'
}
run_testing() {
    "$sandbox" "$2" >"$work/$1.out" 2>&1 || { cat "$work/$1.out"; fail "$1 in the sandbox"; }
    # The kit's own storage is all they need.
    "$2" >"$work/$1.out" 2>&1 || { cat "$work/$1.out"; fail "$1 outside of the sandbox"; }
    grep -q 'PASSED  . 5 tests' "$work/$1.out" || { cat "$work/$1.out"; fail "$1 did not run its tests"; }
}

for example in c cpp testing; do
    {
        cmake -G Ninja -S "$source/examples/$example" -B "$work/$example" -DCMAKE_PREFIX_PATH="$prefix" \
            -DCMAKE_C_COMPILER="$cc" -DCMAKE_CXX_COMPILER="$cxx" && cmake --build "$work/$example" -j 1
    } >"$work/$example.build" 2>&1 || { cat "$work/$example.build"; fail "building examples/$example with CMake"; }
done
run_c cmake-c "$work/c/c_example"
run_cpp cmake-cpp "$work/cpp/cpp_example"
run_testing cmake-testing "$work/testing/heartbeat_test"

# Wrong versions and components are refused, and the binder's headers are found.
mkdir "$work/find"
cat >"$work/find/CMakeLists.txt" <<'END'
cmake_minimum_required(VERSION 3.16)
project(find LANGUAGES CXX)
find_package(tavoosal 99 CONFIG QUIET)
if(tavoosal_FOUND)
    message(FATAL_ERROR "version 99 was found")
endif()
find_package(tavoosal CONFIG QUIET COMPONENTS nonsense)
if(tavoosal_FOUND)
    message(FATAL_ERROR "the component nonsense was found")
endif()
find_package(tavoosal 0.1 CONFIG REQUIRED COMPONENTS testing binder)
file(WRITE "${CMAKE_BINARY_DIR}/names.cpp" "#include <binder/IServiceManager.h>
int main() { return android::String16(\"x\").size() == 1 ? 0 : 1; }")
add_executable(names "${CMAKE_BINARY_DIR}/names.cpp")
target_link_libraries(names PRIVATE tavoosal::binder)
END
{
    cmake -G Ninja -S "$work/find" -B "$work/find/build" -DCMAKE_PREFIX_PATH="$prefix" \
        -DCMAKE_CXX_COMPILER="$cxx" && cmake --build "$work/find/build"
} >"$work/find.log" 2>&1 || { cat "$work/find.log"; fail "finding the package"; }
"$work/find/build/names" || fail "the program that uses libbinder"

export PKG_CONFIG_PATH=$libdir/pkgconfig
flags() { pkg-config --cflags --libs "$1"; }
# shellcheck disable=SC2046 # the flags are words
{
    "$cc" -o "$work/pc_c" "$source/examples/c/main.c" $(flags tavoosal) -Wl,-rpath,"$libdir"
    "$cxx" -std=c++17 -o "$work/pc_cpp" "$source/examples/cpp/main.cpp" $(flags tavoosal) -Wl,-rpath,"$libdir"
    "$cxx" -std=c++17 -o "$work/pc_testing" "$source"/examples/testing/*.cpp $(flags tavoosal-testing) \
        $(flags gtest_main) -Wl,-rpath,"$libdir"
    "$cxx" -std=c++17 -o "$work/pc_binder" "$work/find/build/names.cpp" $(flags tavoosal-binder)
} || fail "building with pkg-config"
run_c pkg-config-c "$work/pc_c"
run_cpp pkg-config-cpp "$work/pc_cpp"
run_testing pkg-config-testing "$work/pc_testing"
"$work/pc_binder" || fail "the program that uses libbinder"

# Without the tests' sandbox: the program's storage is the one the command makes.
[[ $("$prefix/bin/tavo-private-storage" "$work/pc_c" 2>/dev/null | grep -c -e 'got hello' -e 'holds shared') == 2 ]] ||
    fail "tavo-private-storage"
rm -rf "$work"
