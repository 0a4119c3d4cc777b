# Cross build for the device: 32-bit ARM, hard float (Debian's
# g++-arm-linux-gnueabihf). Libraries and packages are looked for in the
# cross compiler's own root and in the directories of the environment
# variable PLIMO_ARM_ROOTS (';'-separated), where scripts/test-arm puts the
# armhf zlib and the GoogleTest it builds from Debian's sources. Programs
# built here run under qemu-arm when it is installed (ctest uses it).
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR arm)
set(CMAKE_LIBRARY_ARCHITECTURE arm-linux-gnueabihf)

set(CMAKE_C_COMPILER arm-linux-gnueabihf-gcc)
set(CMAKE_CXX_COMPILER arm-linux-gnueabihf-g++)

set(PLIMO_ARM_SYSROOT /usr/arm-linux-gnueabihf)
set(CMAKE_FIND_ROOT_PATH ${PLIMO_ARM_SYSROOT})
if(DEFINED ENV{PLIMO_ARM_ROOTS})
  list(APPEND CMAKE_FIND_ROOT_PATH $ENV{PLIMO_ARM_ROOTS})
endif()
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)

# The reference host links zlib statically: nothing but the C and C++
# runtimes has to be found at run time under qemu.
set(ZLIB_USE_STATIC_LIBS ON)

find_program(PLIMO_QEMU_ARM qemu-arm)
if(PLIMO_QEMU_ARM)
  set(CMAKE_CROSSCOMPILING_EMULATOR ${PLIMO_QEMU_ARM} -L ${PLIMO_ARM_SYSROOT})
endif()
