# Cross build for 32-bit ARM Linux (Debian armhf) with Debian's
# arm-linux-gnueabihf tool chain; libraries come from multiarch :armhf packages.
#   cmake -S . -B build-armhf -DCMAKE_TOOLCHAIN_FILE=cmake/toolchains/armhf.cmake
# Programs run under qemu-arm (binfmt, or CMAKE_CROSSCOMPILING_EMULATOR below).
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR arm)
set(CMAKE_C_COMPILER arm-linux-gnueabihf-gcc)
set(CMAKE_CXX_COMPILER arm-linux-gnueabihf-g++)
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
set(CMAKE_LIBRARY_ARCHITECTURE arm-linux-gnueabihf)
set(ENV{PKG_CONFIG_LIBDIR} "/usr/lib/arm-linux-gnueabihf/pkgconfig:/usr/share/pkgconfig")
find_program(TEKOJ_QEMU_ARM qemu-arm)
if(TEKOJ_QEMU_ARM)
  set(CMAKE_CROSSCOMPILING_EMULATOR ${TEKOJ_QEMU_ARM})
endif()
