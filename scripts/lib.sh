# SPDX-License-Identifier: MIT
#
# Shared by the scripts: install what is missing, configure and build.
# shellcheck shell=bash

KOLVRAND_ROOT=$(cd "$(dirname "${BASH_SOURCE[0]}")/.." && pwd)

# Downloads and builds worth keeping across checkouts (Debian's kernels, the
# roots debootstrap makes): outside the work tree, so a fresh clone reuses them.
KOLVRAND_CACHE=${KOLVRAND_CACHE:-${XDG_CACHE_HOME:-$HOME/.cache}/kolvrand}

# The Debian release this machine runs (bookworm, trixie), from os-release.
debian_suite() {
  (. /etc/os-release 2>/dev/null && echo "${VERSION_CODENAME:-}")
}
KOLVRAND_SUITE=$(debian_suite)

# Debian packages the build and the tests need (umockdev: its preload
# library, which the host-registry tests load; libzstd-dev: trixie's static
# libcrypto is linked with zstd).
# systemd: journalctl, whose own parser reads the message catalog in a test.
KOLVRAND_PACKAGES=(cmake ninja-build g++ clang pkg-config libssl-dev nlohmann-json3-dev libumockdev-dev
  umockdev libzstd-dev libsystemd-dev libgtest-dev libgmock-dev protobuf-compiler libprotobuf-dev
  mandoc man-db libxml2-utils systemd)

# release_package SUITE NAME...: each package's name in SUITE's archive, for
# the names that differ between the releases the scripts run on; every
# install_missing goes through it, so this is the one place they live.
#   systemd-dev: trixie's package of systemd.pc and udev.pc, which bookworm
#     ships in systemd and udev themselves;
#   libssl3, libelf1: trixie's are libssl3t64 and libelf1t64 (its 64-bit
#     time_t transition), as bookworm's kbuild packages name them.
release_package() {
  local suite=$1 p
  shift
  for p in "$@"; do
    case $suite:$p in
      bookworm:systemd-dev) echo systemd udev ;;
      bookworm:libssl3t64 | bookworm:libelf1t64) echo "${p%t64}" ;;
      trixie:libssl3 | trixie:libelf1) echo "${p}t64" ;;
      *) echo "$p" ;;
    esac
  done
}

install_missing() {
  local missing=() p
  for p in $(release_package "$KOLVRAND_SUITE" "$@"); do
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

# Debian's mirror, for the roots of a release that this machine does not run.
KOLVRAND_MIRROR=${KOLVRAND_MIRROR:-http://deb.debian.org/debian}
KOLVRAND_SECURITY_MIRROR=${KOLVRAND_SECURITY_MIRROR:-http://deb.debian.org/debian-security}

# suite_sources SUITE: apt's sources of a root of SUITE: the release, its
# updates and security archives, and backports (whose packages apt takes only
# when asked for by name, like the newer kernels).
suite_sources() {
  local suite=$1 key="[signed-by=/usr/share/keyrings/debian-archive-keyring.gpg]"
  echo "deb $key $KOLVRAND_MIRROR $suite main"
  echo "deb $key $KOLVRAND_MIRROR $suite-updates main"
  echo "deb $key $KOLVRAND_SECURITY_MIRROR $suite-security main"
  echo "deb $key $KOLVRAND_MIRROR $suite-backports main"
}

# suite_apt_state SUITE ARCH DIR [MORE ARCHES...]: as apt_state, but for
# SUITE's archives (suite_sources) instead of this machine's sources.
suite_apt_state() {
  local suite=$1
  shift
  apt_state "$@"
  suite_sources "$suite" >"$2/sources.list"
  rm -f "$2"/sources.list.d/*
}

# make_root SUITE DIR LOG [PACKAGE,...]: a new Debian SUITE in DIR, as
# debootstrap makes it (minbase, plus the packages named), its apt reading
# suite_sources. The downloaded packages are kept in $KOLVRAND_CACHE for the
# next root; the root itself is new. Needs root.
make_root() {
  local suite=$1 dir=$2 log=$3 include=${4:-}
  local debs=$KOLVRAND_CACHE/debootstrap/$suite
  mkdir -p "$debs"
  install_missing debootstrap util-linux >>"$log"
  # The mounts debootstrap makes vanish with its own mount namespace.
  unshare --mount --propagation private debootstrap --variant=minbase \
    ${include:+--include="$include"} --cache-dir="$debs" "$suite" "$dir" "$KOLVRAND_MIRROR" \
    >>"$log" 2>&1 || { tail -n 40 "$log" >&2; echo "debootstrap $suite failed (log: $log)" >&2; return 1; }
  suite_sources "$suite" >"$dir/etc/apt/sources.list"
  cp /etc/resolv.conf "$dir/etc/resolv.conf"
  # No service starts inside a root.
  printf '#!/bin/sh\nexit 101\n' >"$dir/usr/sbin/policy-rc.d"
  chmod +x "$dir/usr/sbin/policy-rc.d"
}

# run_in ROOT [--bind HOST:INSIDE]... [--] COMMAND...: COMMAND as root
# chrooted into ROOT, in a mount and PID namespace of its own that end with
# it: a /proc and /sys of its own, this machine's /dev, and the directories
# bound in. The environment is a plain one (DEBIAN_FRONTEND, CI and
# KOLVRAND_CACHE are passed on).
run_in() {
  local root=$1
  shift
  local binds=()
  while [ $# -gt 0 ]; do
    case $1 in
      --bind) binds+=("$2"); shift 2 ;;
      --) shift; break ;;
      *) break ;;
    esac
  done
  local script='set -e; root=$1; shift; n=$1; shift
    mount --rbind /dev "$root/dev"
    mount -t sysfs sysfs "$root/sys"
    for _ in $(seq "$n"); do
      mkdir -p "$1" "$root$2"; mount --bind "$1" "$root$2"; shift 2
    done
    exec chroot "$root" "$@"'
  local args=() b
  for b in "${binds[@]}"; do args+=("${b%%:*}" "${b#*:}"); done
  unshare --mount --pid --fork --kill-child --propagation private --mount-proc="$root/proc" \
    bash -c "$script" run_in "$root" "${#binds[@]}" "${args[@]}" \
    /usr/bin/env -i PATH=/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin HOME=/root \
    DEBIAN_FRONTEND=noninteractive LC_ALL=C.UTF-8 TERM="${TERM:-dumb}" ${CI:+CI="$CI"} \
    ${KOLVRAND_CACHE_IN:+KOLVRAND_CACHE="$KOLVRAND_CACHE_IN"} "$@"
}
