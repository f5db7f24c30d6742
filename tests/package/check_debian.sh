#!/usr/bin/env bash
# Builds the Debian packages, and checks what is in them.
#
#   check_debian.sh SOURCE_DIR WORK_DIR CC CXX
set -euo pipefail
export LC_ALL=C

source=$1 work=$2 cc=$3 cxx=$4
rm -rf "$work/root" && mkdir -p "$work/root"

fail() { echo "FAILED: $*" >&2; exit 1; }

{
    (cd "$source" && cmake --preset package -B "$work/build" -DCMAKE_C_COMPILER="$cc" -DCMAKE_CXX_COMPILER="$cxx") &&
        nice cmake --build "$work/build" -j 2 && rm -f "$work/build"/*.deb && (cd "$work/build" && cpack)
} >"$work/log" 2>&1 || { tail -n 60 "$work/log"; fail "building the packages"; }

triplet=$(dpkg-architecture -qDEB_HOST_MULTIARCH)
architecture=$(dpkg-architecture -qDEB_HOST_ARCH)
lib=usr/lib/$triplet

for deb in "$work/build"/*.deb; do
    package=$(dpkg-deb -f "$deb" Package)
    [[ $(basename "$deb") == "$package"_*_"$architecture".deb ]] || fail "$deb is named differently from its contents"
    dpkg-deb -c "$deb" >"$work/$package.list"
    dpkg-deb -x "$deb" "$work/root"
    [[ $(dpkg-deb -f "$deb" Maintainer) == *@* ]] || fail "$package has no maintainer"
    [[ $(dpkg-deb -f "$deb" Description | wc -l) -gt 2 ]] || fail "$package has no description"
    if grep -vE '^(drwxr-xr-x|-rwxr-xr-x|-rw-r--r--|lrwxrwxrwx) root/root ' "$work/$package.list"; then
        fail "$package: modes or owners as above"
    fi
    grep -q "./usr/share/doc/$package/copyright$" "$work/$package.list" || fail "$package has no copyright file"
    grep -q "./usr/share/doc/$package/changelog.Debian.gz$" "$work/$package.list" || fail "$package has no changelog"
    if grep -E ' \./(usr/local|opt|home|root|tmp|build|work)' "$work/$package.list"; then
        fail "$package: files that belong elsewhere"
    fi
done

has() { # PACKAGE PATTERN ...: a file for every pattern
    local package=$1 pattern
    shift
    for pattern in "$@"; do
        grep -qE " \./$pattern( -> .*)?$" "$work/$package.list" || fail "$package has no $pattern"
    done
}
has libtavoosal0 "$lib/libtavoosal\.so\.0" "$lib/libtavoosal\.so\.0\.[0-9.]+" "$lib/tavoosal/libbinder\.so"
has libtavoosal-dev "$lib/libtavoosal\.so" "$lib/libtavoosal-testing\.a" "$lib/cmake/tavoosal/tavoosal-config\.cmake" \
    "$lib/pkgconfig/tavoosal\.pc" "$lib/tavoosal/tavo-private-storage\.so" usr/bin/tavo-private-storage \
    usr/include/tavo_osal/testing/log_capture\.hpp usr/include/tavoosal-binder/binder/Parcel\.h \
    usr/share/man/man1/tavo-private-storage\.1\.gz
for header in $(cd "$source/include" && find . -name '*.h*' -printf '%P\n'); do
    has libtavoosal-dev "usr/include/${header//./\\.}"
done
if grep -E '/include/|\.so$|\.a$|/man3/' "$work/libtavoosal0.list" | grep -v libbinder; then
    fail "libtavoosal0: development files as above"
fi
if [[ -f $work/tavo-tools.list ]]; then
    has tavo-tools usr/bin/tavo usr/share/bash-completion/completions/tavo
    while read -r page; do has tavo-tools "usr/share/man/.*/$(basename "$page" | sed 's/[.]/\\./g')\.gz"; done < <(
        find "$source/docs/man" -name '*.[158]' ! -name tavo-private-storage.1)
fi

# Dependencies come from what the files need.
depends=$(dpkg-deb -f "$work/build"/libtavoosal0_*.deb Depends)
for needed in android-liblog android-libutils libc6 libstdc++6; do
    [[ ", $depends" == *", $needed "* ]] || fail "libtavoosal0 does not depend on $needed: $depends"
done
version=$(dpkg-deb -f "$work/build"/libtavoosal0_*.deb Version)
[[ $(dpkg-deb -f "$work/build"/libtavoosal-dev_*.deb Depends) == *"libtavoosal0 (= $version)"* ]] ||
    fail "libtavoosal-dev does not depend on its library"
[[ $(dpkg-deb -I "$work/build"/libtavoosal0_*.deb shlibs) == "libtavoosal 0 libtavoosal0 (>= "* ]] ||
    fail "the shlibs file: $(dpkg-deb -I "$work/build"/libtavoosal0_*.deb shlibs)"
dpkg-deb -I "$work/build"/libtavoosal0_*.deb triggers | grep -q ldconfig || fail "ldconfig would not be run"

# Names and places in the libraries: absolute, the packages' own and the platform's only.
dynamic() { readelf -d "$work/root/$1" | sed -n "s/.*($2).*\[\(.*\)\]/\1/p"; }
expect() { [[ $2 == "$3" ]] || fail "$1 is '$2' and not '$3'"; }
expect "the soname" "$(dynamic "$lib/libtavoosal.so.0" SONAME)" libtavoosal.so.0
expect "libtavoosal's RUNPATH" "$(dynamic "$lib/libtavoosal.so.0" RUNPATH)" "/$lib/tavoosal:/$lib/android"
expect "libbinder's RUNPATH" "$(dynamic "$lib/tavoosal/libbinder.so" RUNPATH)" "/$lib/android"
while read -r file; do
    if [[ $file != *.a ]] && readelf -h "$file" >/dev/null 2>&1; then
        if readelf -d "$file" | grep -E '(RPATH|RUNPATH)' | grep -E "ORIGIN|$work|$source"; then fail "$file: RUNPATH as above"; fi
        if readelf -S "$file" | grep -q '\.debug_info'; then fail "$file is not stripped"; fi
    fi
done < <(find "$work/root" -type f)
LD_LIBRARY_PATH=$work/root/$lib:$work/root/$lib/tavoosal ldd -r "$work/root/$lib/libtavoosal.so.0" >"$work/ldd" 2>&1
if grep -E 'not found|undefined' "$work/ldd"; then fail "libtavoosal.so.0: unresolved as above"; fi
gzip -t "$work/root"/usr/share/doc/*/changelog.Debian.gz "$work/root"/usr/share/man/man*/*.gz

if command -v lintian >/dev/null; then
    lintian --fail-on error "$work/build"/*.deb || fail "lintian's errors are above"
fi
rm -rf "$work/root"
