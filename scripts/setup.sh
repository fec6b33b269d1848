#!/usr/bin/env bash
# Installs what building and testing the library need, only when missing.
#
#   scripts/setup.sh          compiler, cmake, GoogleTest, libjpeg-turbo, libpng
#   scripts/setup.sh armhf    the same, plus the armhf cross toolchain, qemu and
#                             the armhf libjpeg/libpng (optional: without them
#                             the cross-built tests that compare with libjpeg
#                             are compiled out)
set -euo pipefail

SUDO=()
if [ "$(id -u)" -ne 0 ] && command -v sudo >/dev/null; then SUDO=(sudo); fi
export DEBIAN_FRONTEND=noninteractive

# True when package $1 (name or name:arch; the build machine's architecture
# by default, or architecture-independent) is installed.
native=$(dpkg --print-architecture)
installed() {
  local name=${1%%:*} arch=$native
  [ "$name" != "$1" ] && arch=${1#*:}
  dpkg-query -W -f='${Architecture} ${db:Status-Status}\n' "$name" 2>/dev/null \
    | grep -Eqx "($arch|all) installed"
}

updated=0
apt_update() {
  if [ "$updated" -eq 0 ]; then
    "${SUDO[@]}" apt-get update -qq
    updated=1
  fi
}

# Installs the packages among "$@" that are not installed yet.
install_missing() {
  local missing=() p
  for p in "$@"; do installed "$p" || missing+=("$p"); done
  [ "${#missing[@]}" -eq 0 ] && return 0
  echo "setup: installing ${missing[*]}"
  apt_update
  "${SUDO[@]}" apt-get install -y -qq --no-install-recommends "${missing[@]}"
}

install_missing cmake make g++ googletest libgtest-dev libjpeg62-turbo-dev libpng-dev

if [ "${1:-}" = armhf ]; then
  install_missing crossbuild-essential-armhf qemu-user
  if ! dpkg --print-foreign-architectures | grep -qx armhf; then
    "${SUDO[@]}" dpkg --add-architecture armhf
    updated=0
  fi
  if ! install_missing libjpeg62-turbo-dev:armhf libpng-dev:armhf; then
    echo "setup: armhf libjpeg/libpng not installable; the libjpeg comparison" \
         "tests are left out of the armhf build" >&2
  fi
fi
