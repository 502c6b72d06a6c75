#!/usr/bin/env bash
# Installs the Debian packages that building and testing Torvale need, when missing.
set -euo pipefail

packages=(
  build-essential cmake ninja-build pkg-config git
  libpq-dev postgresql-15 postgresql-client-15
  libcli11-dev libjsoncpp-dev libxml2-dev
  libgtest-dev libgmock-dev libbenchmark-dev
  clang-format
)

missing=()
for p in "${packages[@]}"; do
  dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q 'install ok installed' || missing+=("$p")
done
if [ ${#missing[@]} -gt 0 ]; then
  echo "Installing: ${missing[*]}"
  SUDO=""
  [ "$(id -u)" -eq 0 ] || SUDO=sudo
  $SUDO apt-get update -qq
  DEBIAN_FRONTEND=noninteractive $SUDO apt-get install -y -qq --no-install-recommends "${missing[@]}"
fi
