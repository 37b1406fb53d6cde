# SPDX-License-Identifier: MIT
# Debian arm64 (see Toolchain.cmake beside this file).
set(KOLVRAND_CROSS_ARCH arm64)
set(KOLVRAND_CROSS_TRIPLET aarch64-linux-gnu)
set(KOLVRAND_CROSS_PROCESSOR aarch64)
set(KOLVRAND_CROSS_QEMU qemu-aarch64)
include(${CMAKE_CURRENT_LIST_DIR}/Toolchain.cmake)
