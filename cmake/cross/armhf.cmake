# Debian armhf (see Toolchain.cmake beside this file).
set(KOLVRAND_CROSS_ARCH armhf)
set(KOLVRAND_CROSS_TRIPLET arm-linux-gnueabihf)
set(KOLVRAND_CROSS_PROCESSOR arm)
set(KOLVRAND_CROSS_QEMU qemu-arm)
include(${CMAKE_CURRENT_LIST_DIR}/Toolchain.cmake)
