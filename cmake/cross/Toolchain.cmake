# SPDX-License-Identifier: MIT
# Cross-building for a Debian architecture: the compilers of Debian's
# g++-TRIPLET package, a sysroot of that architecture's own Debian packages
# (libc, libcrypto, libsystemd, GoogleTest, ...; ./scripts/cross makes it) and
# qemu-user to run what is built, the tests included.
#
# Included by cmake/cross/ARCH.cmake, which sets KOLVRAND_CROSS_ARCH (the
# Debian name), KOLVRAND_CROSS_TRIPLET, KOLVRAND_CROSS_PROCESSOR and
# KOLVRAND_CROSS_QEMU. The sysroot is build/cross-ARCH/sysroot unless
# -DKOLVRAND_CROSS_SYSROOT=DIR names another.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR ${KOLVRAND_CROSS_PROCESSOR})
set(CMAKE_C_COMPILER ${KOLVRAND_CROSS_TRIPLET}-gcc)
set(CMAKE_CXX_COMPILER ${KOLVRAND_CROSS_TRIPLET}-g++)

if(NOT KOLVRAND_CROSS_SYSROOT)
  get_filename_component(KOLVRAND_CROSS_SYSROOT
                         "${CMAKE_CURRENT_LIST_DIR}/../../build/cross-${KOLVRAND_CROSS_ARCH}/sysroot"
                         ABSOLUTE)
endif()
# try_compile projects read this file again and need the same sysroot.
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES KOLVRAND_CROSS_SYSROOT)
set(CMAKE_SYSROOT ${KOLVRAND_CROSS_SYSROOT})

# Libraries, headers and packages only from the sysroot; programs (protoc)
# from the host.
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
set(ENV{PKG_CONFIG_LIBDIR}
    "${CMAKE_SYSROOT}/usr/lib/${KOLVRAND_CROSS_TRIPLET}/pkgconfig:${CMAKE_SYSROOT}/usr/share/pkgconfig")
set(ENV{PKG_CONFIG_SYSROOT_DIR} ${CMAKE_SYSROOT})

# CTest runs every test (and gtest_discover_tests every listing) through the
# emulator, which loads the program's interpreter and libraries from the
# sysroot.
find_program(KOLVRAND_CROSS_EMULATOR ${KOLVRAND_CROSS_QEMU} REQUIRED NO_CMAKE_FIND_ROOT_PATH)
set(CMAKE_CROSSCOMPILING_EMULATOR ${KOLVRAND_CROSS_EMULATOR} -L ${CMAKE_SYSROOT})
