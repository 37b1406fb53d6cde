# Shared by the scripts: install what is missing, configure and build.
# shellcheck shell=bash

KOLVRAND_ROOT=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)

# Debian packages the build and the tests need.
KOLVRAND_PACKAGES=(cmake ninja-build g++ clang pkg-config libssl-dev nlohmann-json3-dev
  libsystemd-dev libgtest-dev libgmock-dev protobuf-compiler libprotobuf-dev mandoc man-db)

install_missing() {
  local missing=()
  for p in "$@"; do
    dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
  done
  [ ${#missing[@]} -eq 0 ] && return 0
  echo "Installing: ${missing[*]}"
  local sudo=""
  [ "$(id -u)" -ne 0 ] && sudo="sudo"
  $sudo apt-get update -qq
  DEBIAN_FRONTEND=noninteractive $sudo apt-get install -y -qq --no-install-recommends "${missing[@]}"
}

# build DIR [cmake options...]: configure once, then build everything.
build() {
  local dir=$1
  shift
  cmake -S "$KOLVRAND_ROOT" -B "$dir" -G Ninja "$@" >/dev/null
  cmake --build "$dir" -j "$(nproc)"
}
