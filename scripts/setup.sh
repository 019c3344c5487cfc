#!/usr/bin/env bash
# Installs the Debian packages that lumo needs to build, test and run.
set -euo pipefail

PACKAGES=(
  build-essential cmake pkg-config git
  clang clang-format clang-tidy libclang-rt-dev
  libproj-dev proj-data proj-bin
  libeigen3-dev nlohmann-json3-dev libcli11-dev
  libopenblas-dev liblapack-dev liblapacke-dev
  liberfa-dev
  libgtest-dev libgmock-dev googletest libbenchmark-dev
  libgdal-dev gdal-bin
)

missing=()
for pkg in "${PACKAGES[@]}"; do
  dpkg-query -W -f='${Status}' "$pkg" 2>/dev/null | grep -q "install ok installed" || missing+=("$pkg")
done

if ((${#missing[@]})); then
  echo "setup: installing ${missing[*]}"
  SUDO=""
  if [[ $(id -u) -ne 0 ]]; then SUDO="sudo"; fi
  export DEBIAN_FRONTEND=noninteractive
  $SUDO apt-get update -qq
  $SUDO apt-get install -y -qq --no-install-recommends "${missing[@]}"
else
  echo "setup: all packages present"
fi
