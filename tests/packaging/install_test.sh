#!/usr/bin/env bash
# Installs a build and uses what was installed:
#   install_test.sh BUILD CMAKE CXX [FLAG...]    the flags are those a sanitized library needs
set -euo pipefail
here=$(cd "$(dirname "${BASH_SOURCE[0]}")" && pwd)
build=$1 cmake=$2 cxx=$3
flags=("${@:4}")

scratch=$(mktemp -d)
supervisor=
clean_up() {
  if [ -n "$supervisor" ]; then
    kill "$supervisor" || true
    wait "$supervisor" || true
  fi
  rm -rf "$scratch"
}
trap clean_up EXIT
export QUARRY_ROOT=$scratch/root
mkdir -p "$QUARRY_ROOT/var/packages/Quarry/etc" "$QUARRY_ROOT/tmp"

fail() {
  echo "FAILED: $*" >&2
  exit 1
}

# Where the first file of that name lies below a directory.
place_of() {
  local file
  file=$(find "$1" -name "$2" -print -quit)
  [ -n "$file" ] || fail "$2 is not installed"
  dirname "$file"
}

check_libraries() {
  local libraries=$1 core platform strangers
  readelf -d "$libraries/libfileindex.so" | grep 'SONAME.*\[libfileindex\.so\.0\]' >/dev/null ||
    fail "libfileindex.so has no versioned SONAME"
  [ "$(readlink "$libraries/libfileindex.so")" = libfileindex.so.0 ] ||
    fail "libfileindex.so is no link to the versioned name"
  core=$(nm -D --defined-only "$libraries/libfileindex.so" | awk '{print $3}')
  platform=$(nm -D --defined-only "$libraries/libquarry_platform.so" | awk '{print $3}')
  strangers=$(grep -vE '^_Z(NK?|T.N)6quarry' <<<"$core" || true)
  [ -z "$strangers" ] || fail "libfileindex.so shows $strangers"
  grep -q '^_ZN6quarry9fileindex9FolderAdd' <<<"$core" || fail "libfileindex.so hides FolderAdd"
  grep -q '^TARNShareGet$' <<<"$platform" || fail "libquarry_platform.so hides TARNShareGet"
  ! grep -E '^_ZN6quarry([0-79]|8[^p])' <<<"$platform" || fail "libquarry_platform.so shows the core's"
}

# As with pkg-config, from a tree that was put aside with DESTDIR.
build_with_pkg_config() {
  local libraries=$1
  local words
  read -ra words <<<"$(PKG_CONFIG_PATH=$libraries/pkgconfig pkg-config --cflags --libs fileindex)"
  "$cxx" -std=c++17 -Wall -Wextra -Wpedantic -Werror "${flags[@]}" "$here/consumer/main.cpp" \
    "${words[@]}" -o "$scratch/consumer-pc"
  LD_LIBRARY_PATH=$libraries "$scratch/consumer-pc" || fail "the program built with pkg-config"
}

# As with find_package, from a prefix of its own.
build_with_cmake() {
  local prefix=$1
  "$cmake" -S "$here/consumer" -B "$scratch/consumer" -DCMAKE_PREFIX_PATH="$prefix" \
    -DCMAKE_CXX_COMPILER="$cxx" -DCMAKE_CXX_FLAGS="${flags[*]}" -DCMAKE_CXX_EXTENSIONS=OFF \
    >"$scratch/log" || fail "find_package: $(cat "$scratch/log")"
  "$cmake" --build "$scratch/consumer" >"$scratch/log" || fail "cmake: $(cat "$scratch/log")"
  "$scratch/consumer/consumer" || fail "the program built with find_package"
}

check_documents() {
  [[ $(place_of "$1" quarry.1) == */man/man1 ]] || fail "quarry.1 is in the wrong section"
  [[ $(place_of "$1" fileindexd.8) == */man/man8 ]] || fail "fileindexd.8 is in the wrong section"
  place_of "$1" state-files.md >/dev/null
}

# The installed supervisor brings up the installed engine, in a private system.
run_system() {
  local programs=$1 name
  for name in quarry tarnelasticd tarncontentextractd fileindexd tarnotifyd; do
    [ -x "$programs/$name" ] || fail "$name is not installed beside quarry"
  done
  grep -qx "ExecStart=$programs/fileindexd" "$(place_of "$prefix" fileindexd.service)/fileindexd.service" ||
    fail "the unit does not start the installed daemon"
  "$programs/quarry" run 2>"$scratch/log" &
  supervisor=$!
  timeout 60 bash -c "until '$programs/quarry' status --json | grep -q '\"state\" : \"running\"'; do
                        kill -0 $supervisor || exit 1; done" || fail "quarry: $(cat "$scratch/log")"
  kill "$supervisor"
  wait "$supervisor" || fail "quarry run: $(cat "$scratch/log")"
  supervisor=
}

staged=$scratch/staged
DESTDIR=$staged "$cmake" --install "$build" >"$scratch/log" || fail "$(cat "$scratch/log")"
libraries=$(place_of "$staged" libfileindex.so)
check_libraries "$libraries"
check_documents "$staged"
build_with_pkg_config "$libraries"

prefix=$scratch/prefix
"$cmake" --install "$build" --prefix "$prefix" >"$scratch/log" || fail "$(cat "$scratch/log")"
build_with_cmake "$prefix"
run_system "$(place_of "$prefix" tarnelasticd)"
