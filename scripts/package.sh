#!/usr/bin/env bash
# Builds the Debian packages (libfileindex0, libfileindex-dev, fileindex-tools) from the working
# tree, tests included, and checks them with lintian. The packages land in build-deb/.
#
# usage: scripts/package.sh [dpkg-buildpackage options]   (e.g. -Pnocheck to skip the tests)
set -euo pipefail
cd "$(dirname "$0")/.."
./scripts/install-deps.sh --packaging

out=$PWD/build-deb
work=$(mktemp -d)
trap 'rm -rf "$work"' EXIT

# dpkg-buildpackage writes its results beside the source tree, so it builds a copy of the
# working tree (without build trees or git metadata) in a folder of its own.
version=$(dpkg-parsechangelog -S Version)
src=$work/libfileindex-$version
mkdir "$src"
tar -c --exclude=./.git --exclude='./build' --exclude='./build-*' --exclude=./compile_commands.json . |
  tar -x -C "$src"

(cd "$src" && DEB_BUILD_OPTIONS="parallel=$(nproc) ${DEB_BUILD_OPTIONS:-}" \
  dpkg-buildpackage -us -uc -b "$@")

rm -rf "$out"
mkdir -p "$out"
cp "$work"/*.deb "$work"/*.changes "$work"/*.buildinfo "$out"/
ls -l "$out"

# Errors fail the build; warnings and notes are shown.
lintian --fail-on error --info "$out"/*.changes
