#!/usr/bin/env bash
# Installs what the library needs to build and test, from Debian's packages.
# Safe to run again: it asks apt only for packages that are not installed yet.
# With --packaging it also installs what the Debian packages, the manual page and the API
# reference need (scripts/package.sh).
set -euo pipefail

packages=(
  cmake
  g++
  make
  pkg-config
  libjsoncpp-dev
  libgtest-dev
  libgmock-dev
  libbenchmark-dev
  libicu-dev
  libcli11-dev
  # testparm, to check the Samba configuration the platform writes; brings no daemon with it
  samba-common-bin
  # the fuzz targets (scripts/fuzz.sh): clang with libFuzzer and the sanitizers' runtimes
  clang
  libclang-rt-14-dev
  # scripts/bench.sh reads the benchmarks' JSON with it; a minimal Debian has no Python
  python3
)

if [ "${1:-}" = "--packaging" ]; then
  packages+=(debhelper dpkg-dev fakeroot lintian help2man doxygen)
fi

missing=()
for p in "${packages[@]}"; do
  if ! dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed'; then
    missing+=("$p")
  fi
done

if [ "${#missing[@]}" -eq 0 ]; then
  exit 0
fi

SUDO=""
if [ "$(id -u)" -ne 0 ]; then
  SUDO="sudo"
fi
export DEBIAN_FRONTEND=noninteractive
$SUDO apt-get update -q
$SUDO apt-get install -y -q --no-install-recommends "${missing[@]}"
