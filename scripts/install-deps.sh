#!/usr/bin/env bash
# Installs what building, running and testing ftcmd need on a Debian machine (as root).
set -euo pipefail
pkgs=(cmake make g++ pkg-config googletest libgtest-dev libgmock-dev
      android-liblog-dev android-libcutils-dev libssl-dev
      socat ppp picocom netcat-openbsd
      clang-14 libclang-rt-14-dev libbenchmark-dev)
missing=()
for p in "${pkgs[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed' || missing+=("$p")
done
if [ ${#missing[@]} -gt 0 ]; then
  echo "installing: ${missing[*]}"
  SUDO=""
  [ "$(id -u)" -ne 0 ] && SUDO="sudo"
  $SUDO apt-get update -qq
  DEBIAN_FRONTEND=noninteractive $SUDO apt-get install -y -qq --no-install-recommends "${missing[@]}" >/dev/null
fi
