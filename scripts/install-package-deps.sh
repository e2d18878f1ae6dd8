#!/usr/bin/env bash
# Installs what building the Debian packages, the manual page and the API reference needs, on top
# of scripts/install-deps.sh. Safe to run again: it asks apt only for what is not installed yet.
set -euo pipefail
cd "$(dirname "$0")/.."
./scripts/install-deps.sh

packages=(debhelper dpkg-dev fakeroot lintian help2man doxygen)

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
