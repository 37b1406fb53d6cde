# SPDX-License-Identifier: MIT
# Debian s390x (see Toolchain.cmake beside this file).
set(KOLVRAND_CROSS_ARCH s390x)
set(KOLVRAND_CROSS_TRIPLET s390x-linux-gnu)
set(KOLVRAND_CROSS_PROCESSOR s390x)
set(KOLVRAND_CROSS_QEMU qemu-s390x)
include(${CMAKE_CURRENT_LIST_DIR}/Toolchain.cmake)
