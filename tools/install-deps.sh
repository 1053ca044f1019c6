#!/usr/bin/env bash
# Installs the Debian packages the project builds, tests and runs its demo
# with. Idempotent: apt is asked only when a package is missing.
set -euo pipefail

packages=(
  cmake make g++ clang libclang-rt-14-dev
  libgtest-dev libgmock-dev libbenchmark-dev libboost-dev
  openjdk-17-jdk-headless junit5
  android-liblog-dev android-libnativehelper-dev android-libcutils-dev android-libbase-dev
  libc++-14-dev libc++abi-14-dev
  util-linux
  blueprint-tools clang-tidy
)

missing=()
for p in "${packages[@]}"; do
  status=$(dpkg-query -W -f='${Status}' "$p" 2>/dev/null || true)
  [[ "$status" == "install ok installed" ]] || missing+=("$p")
done
[[ ${#missing[@]} -eq 0 ]] && exit 0

sudo=""
[[ $(id -u) -eq 0 ]] || sudo="sudo"
echo "installing: ${missing[*]}"
$sudo apt-get update -qq
DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${missing[@]}"
