#!/usr/bin/env bash
# Installs a built tree into a temporary prefix and builds two programs against that tree alone:
# a C program through pkg-config and a C++ program through find_package(fileindex). Runs both.
#
# usage: scripts/check-install.sh [BUILD_DIR]     (default: build, already built)
set -euo pipefail
cd "$(dirname "$0")/.."

build=${1:-build}
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT
prefix=$work/prefix

cmake --install "$build" --prefix "$prefix" >/dev/null
echo "installed into $prefix:"
(cd "$prefix" && find . -type f -o -type l | sort | sed 's/^\./  /')

# The exported target must not name the build's internal targets.
targets=$(find "$prefix" -name fileindexTargets.cmake)
interface=$(sed -n 's/.*INTERFACE_LINK_LIBRARIES "\(.*\)".*/\1/p' "$targets")
if [ "$interface" != "JsonCpp::JsonCpp" ]; then
  echo "fileindex::fileindex links more than JsonCpp: $interface" >&2
  exit 1
fi

# C through pkg-config; jsoncpp's own .pc is found on the system's search path.
PKG_CONFIG_PATH=$(dirname "$(find "$prefix" -name fileindex.pc)")
export PKG_CONFIG_PATH
libdir=$(pkg-config --variable=libdir fileindex)
# shellcheck disable=SC2046  # pkg-config's output is a list of flags
cc -std=c99 -Wall -Wextra -Wpedantic -Werror tests/consumers/c/main.c \
  $(pkg-config --cflags --libs fileindex) -Wl,-rpath,"$libdir" -o "$work/c-consumer"
"$work/c-consumer"

# C++ through the CMake package.
cmake -S tests/consumers/cxx -B "$work/cxx" -DCMAKE_PREFIX_PATH="$prefix" \
  -DCMAKE_BUILD_RPATH="$libdir" >/dev/null
cmake --build "$work/cxx" >/dev/null
mkdir "$work/root"
"$work/cxx/consumer" "$work/root"
