# SPDX-License-Identifier: MIT
# Debian armhf (see Toolchain.cmake beside this file).
set(KOLVRAND_CROSS_ARCH armhf)
set(KOLVRAND_CROSS_TRIPLET arm-linux-gnueabihf)
set(KOLVRAND_CROSS_PROCESSOR arm)
set(KOLVRAND_CROSS_QEMU qemu-arm)
# GCC notes every function that passes a std::span by value that GCC 7.1
# changed how such an argument is passed on 32-bit ARM; nothing here is linked
# with code that old.
set(CMAKE_CXX_FLAGS_INIT -Wno-psabi)
include(${CMAKE_CURRENT_LIST_DIR}/Toolchain.cmake)
