#!/usr/bin/env bash
# Unpacks Debian packages of another architecture, with all they depend on, into a folder to build and run
# against. The machine's own package database stays as it is, and root is not needed.
#
#   sysroot.sh ARCHITECTURE FOLDER PACKAGE ...
#
# Nothing is done where the folder holds these packages already. Exit status 77: the packages cannot be had,
# because fetching them failed; every other failure is 1.
set -euo pipefail

architecture=$1 folder=$(readlink -m "$2")
shift 2
wanted="$architecture $*"

die() {
    printf 'sysroot.sh: %s\n' "$2" >&2
    exit "$1"
}

mkdir -p "$folder"
exec {lock}>"$folder.lock"
flock "$lock"
[[ -e $folder/.packages && $(<"$folder/.packages") == "$wanted" ]] && exit

# apt as the machine has it configured (sources, keys, proxies), with a state of its own and for the other architecture.
work=$(mktemp -d "$folder.XXXXXX")
trap 'rm -rf "$work"' EXIT
mkdir -p "$work"/{lists,cache/archives,root/usr/lib}/ "$work"/{lists,cache/archives}/partial
: >"$work/status"
apt-config dump | grep -vE '^(APT::Architecture|APT::Update::|Dir::(State|Cache|Log|Etc::(main|parts)))' >"$work/apt.conf"
cat >>"$work/apt.conf" <<END
APT::Architecture "$architecture";
APT::Architectures { "$architecture"; };
APT::Sandbox::User "root";
Acquire::Retries "3";
Dir::State "$work";
Dir::State::lists "$work/lists";
Dir::State::status "$work/status";
Dir::Cache "$work/cache";
Dir::Cache::archives "archives";
Dir::Log "$work";
Dir::Etc::main "/dev/null";
Dir::Etc::parts "/dev/null";
END
apt() { APT_CONFIG=$work/apt.conf apt-get -q -y --no-install-recommends "$@"; }

echo "sysroot.sh: fetching for $architecture: $*"
# Some of the indexes may be enough. Only when all were had, a package that cannot be found is a wrong name.
indexes=0
apt -o APT::Update::Error-Mode=any update >"$work/log" 2>&1 || indexes=77
apt install --print-uris "$@" >>"$work/log" 2>&1 || {
    cat "$work/log" >&2
    [[ $indexes -ne 0 ]] || die 1 "there is no way to install: $*"
    die 77 "the package indexes could not be fetched: see above"
}
apt install --download-only "$@" >>"$work/log" 2>&1 || {
    cat "$work/log" >&2
    die 77 "the packages could not be fetched: see above"
}

# The layout of a system with one /usr, so that links between packages lead to where the files are.
ln -s usr/lib "$work/root/lib"
for package in "$work"/cache/archives/*.deb; do
    dpkg-deb --fsys-tarfile "$package" | tar -x --keep-directory-symlink --no-same-owner -C "$work/root"
done
# Links are made relative: outside the folder an absolute one would lead to the machine's own files.
find "$work/root" -type l -lname '/*' -printf '%P\t%l\n' | while IFS=$'\t' read -r link target; do
    ln -snfr "$work/root$target" "$work/root/$link"
done
dangling=$(find "$work/root/usr/lib" -xtype l -name '*.so*')
[[ -z $dangling ]] || die 1 "links to libraries that no package brings: $dangling"

printf '%s\n' "$wanted" >"$work/root/.packages"
rm -rf "$folder"
mv "$work/root" "$folder"
