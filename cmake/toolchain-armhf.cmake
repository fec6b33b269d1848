# Cross-build for 32-bit ARM Linux (armhf) with the Debian cross toolchain.
# Target programs (the unit tests) run under qemu user-mode emulation.
#
#   cmake -S . -B build-armhf -DCMAKE_TOOLCHAIN_FILE=cmake/toolchain-armhf.cmake
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR arm)

set(VETAJ_CROSS_TRIPLE arm-linux-gnueabihf)
set(CMAKE_C_COMPILER ${VETAJ_CROSS_TRIPLE}-gcc)
set(CMAKE_CXX_COMPILER ${VETAJ_CROSS_TRIPLE}-g++)
find_program(CMAKE_NM NAMES ${VETAJ_CROSS_TRIPLE}-nm REQUIRED)
find_program(CMAKE_AR NAMES ${VETAJ_CROSS_TRIPLE}-ar REQUIRED)
find_program(CMAKE_RANLIB NAMES ${VETAJ_CROSS_TRIPLE}-ranlib REQUIRED)
find_program(CMAKE_STRIP NAMES ${VETAJ_CROSS_TRIPLE}-strip)

# The emulator takes the target's loader from the cross sysroot. The C and
# C++ runtime must come from the same place as that loader: when the armhf
# multiarch C library is installed too (it comes with libjpeg:armhf), the
# loader would otherwise pick it from /lib/<triple> and a loader and C
# library of different builds crash. So the sysroot's libraries are searched
# first, then the multiarch directory for libjpeg and libpng.
find_program(VETAJ_QEMU_ARM NAMES qemu-arm qemu-arm-static REQUIRED)
set(CMAKE_CROSSCOMPILING_EMULATOR
    ${VETAJ_QEMU_ARM} -L /usr/${VETAJ_CROSS_TRIPLE}
    -E LD_LIBRARY_PATH=/usr/${VETAJ_CROSS_TRIPLE}/lib:/usr/lib/${VETAJ_CROSS_TRIPLE})

# Libraries and headers come from the cross sysroot and the Debian multiarch
# directories (/usr/lib/<triple>, /usr/include/<triple>, searched first
# thanks to the library architecture); programs (nm, qemu) from the build
# machine.
set(CMAKE_FIND_ROOT_PATH /usr/${VETAJ_CROSS_TRIPLE} /)
set(CMAKE_LIBRARY_ARCHITECTURE ${VETAJ_CROSS_TRIPLE})
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
