# SPDX-License-Identifier: MIT
#
# Shared by the scripts: install what is missing, configure and build.
# shellcheck shell=bash

KOLVRAND_ROOT=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)

# Downloads and builds worth keeping across checkouts (Debian's kernels, the
# roots debootstrap makes): outside the work tree, so a fresh clone reuses them.
KOLVRAND_CACHE=${KOLVRAND_CACHE:-${XDG_CACHE_HOME:-$HOME/.cache}/kolvrand}

# Debian packages the build and the tests need.
KOLVRAND_PACKAGES=(cmake ninja-build g++ clang pkg-config libssl-dev nlohmann-json3-dev libumockdev-dev
  libsystemd-dev libgtest-dev libgmock-dev protobuf-compiler libprotobuf-dev mandoc man-db
  libxml2-utils)

install_missing() {
  local missing=()
  for p in "$@"; do
    dpkg-query -W -f='${Status}' "$p" 2>/dev/null | grep -q "install ok installed" || missing+=("$p")
  done
  [ ${#missing[@]} -eq 0 ] && return 0
  echo "Installing: ${missing[*]}"
  local sudo=""
  [ "$(id -u)" -ne 0 ] && sudo="sudo"
  # Another script may be installing at the same moment: wait for its lock.
  $sudo apt-get -o DPkg::Lock::Timeout=600 update -qq
  DEBIAN_FRONTEND=noninteractive $sudo apt-get -o DPkg::Lock::Timeout=600 install -y -qq \
    --no-install-recommends "${missing[@]}"
}

# build DIR [cmake options...]: configure once, then build everything.
build() {
  local dir=$1
  shift
  cmake -S "$KOLVRAND_ROOT" -B "$dir" -G Ninja "$@" >/dev/null
  cmake --build "$dir" -j "$(nproc)"
}

# cross_triplet ARCH: the GNU triplet of a Debian architecture the project
# cross-builds for.
cross_triplet() {
  case $1 in
    arm64) echo aarch64-linux-gnu ;;
    armhf) echo arm-linux-gnueabihf ;;
    s390x) echo s390x-linux-gnu ;;
    *) return 1 ;;
  esac
}

# apt_state ARCH DIR [MORE ARCHES...]: an apt state of its own in DIR that
# reads the host's package sources for ARCH's packages (and those of MORE
# ARCHES, named ARCH:PACKAGE), for downloading them without installing:
# apt_opts holds the options that select it, apt_update reads the indexes.
apt_state() {
  local arch=$1 apt=$2
  shift 2
  mkdir -p "$apt/lists/partial" "$apt/archives/partial" "$apt/sources.list.d" "$apt/preferences.d"
  : >"$apt/status"
  # The host's package sources, read for ARCH's indexes.
  : >"$apt/sources.list"
  [ -f /etc/apt/sources.list ] && cp /etc/apt/sources.list "$apt/sources.list"
  rm -f "$apt"/sources.list.d/*
  cp /etc/apt/sources.list.d/*.list /etc/apt/sources.list.d/*.sources "$apt/sources.list.d/" 2>/dev/null || true
  apt_opts=(-o "Dir::State=$apt" -o "Dir::State::status=$apt/status"
    -o "Dir::Cache=$apt/cache" -o "Dir::Cache::archives=$apt/archives"
    -o "Dir::Etc::sourcelist=$apt/sources.list" -o "Dir::Etc::sourceparts=$apt/sources.list.d"
    -o "Dir::Etc::preferencesparts=$apt/preferences.d"
    -o "APT::Architecture=$arch" -o "APT::Architectures::=$arch" -o Debug::NoLocking=1)
  local more
  for more in "$@"; do apt_opts+=(-o "APT::Architectures::=$more"); done
}
apt_update() {
  # A mirror caught mid-sync serves an index that does not match its Release
  # file: try again, and in the end go on with the indexes that did arrive
  # (what is downloaded only has to agree with itself, not with the host).
  local try
  for try in 1 2 3; do
    apt-get "${apt_opts[@]}" -qq update && return 0
    echo "apt-get update failed (try $try of 3)" >&2
    [ "$try" -lt 3 ] && sleep 20
  done
  return 0
}

# cross_sysroot ARCH DIR: installs Debian's cross compiler for ARCH and makes
# DIR/sysroot from ARCH's own Debian packages: the libraries and headers the
# build links against, and the C library and runtime the emulator loads the
# programs with. The packages are downloaded with an apt state of their own
# (DIR/apt) and unpacked with dpkg-deb -x, not installed through dpkg
# multiarch: a foreign -dev package installed beside the host's must be the
# very same version as the host's, which fails whenever one architecture's
# index lags another's, and it would change the host.
#
# DIR/sysroot/DEBIAN/symbols and shlibs gather the packages' own symbols and
# shlibs files, so that dpkg-shlibdeps -SDIR/sysroot derives a package's
# Depends from the sysroot's libraries as it would from installed ones. The
# sysroot is made again only when its package list changes.
cross_sysroot() {
  local arch=$1 dir=$2 triplet
  triplet=$(cross_triplet "$arch")
  install_missing "g++-$triplet"
  local sysroot=$dir/sysroot apt=$dir/apt
  # ARCH's packages the build and the tests need; apt adds their dependencies.
  local packages=(libc6-dev libstdc++6 libssl-dev libsystemd-dev libgtest-dev libgmock-dev
    nlohmann-json3-dev libprotobuf-dev)
  [ "$(cat "$sysroot/.packages" 2>/dev/null)" = "$(printf '%s\n' "${packages[@]}")" ] &&
    [ -f "$sysroot/DEBIAN/shlibs" ] && return 0

  apt_state "$arch" "$apt"
  echo "Downloading $arch packages for the sysroot: ${packages[*]} and their dependencies"
  apt_update
  rm -f "$apt"/archives/*.deb
  apt-get "${apt_opts[@]}" -qq -y --no-install-recommends install --download-only "${packages[@]}" >/dev/null
  rm -rf "$sysroot"
  mkdir -p "$sysroot/DEBIAN"
  local deb control=$dir/control
  for deb in "$apt"/archives/*.deb; do
    dpkg-deb -x "$deb" "$sysroot"
    rm -rf "$control"
    dpkg-deb -e "$deb" "$control"
    [ -f "$control/symbols" ] && cat "$control/symbols" >>"$sysroot/DEBIAN/symbols"
    [ -f "$control/shlibs" ] && cat "$control/shlibs" >>"$sysroot/DEBIAN/shlibs"
  done
  rm -rf "$control"
  printf '%s\n' "${packages[@]}" >"$sysroot/.packages"
}
