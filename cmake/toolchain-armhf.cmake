# 32-bit ARM (hard float) with Debian's cross compiler; test binaries run
# under qemu-arm with the cross sysroot, so pointers are 4 bytes wide and
# 64-bit arithmetic goes through the target's runtime helpers.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR arm)
set(CMAKE_C_COMPILER arm-linux-gnueabihf-gcc)
set(CMAKE_CXX_COMPILER arm-linux-gnueabihf-g++)
# Debian's armhf zlib1g-dev, unpacked by scripts/install-deps.sh, for the tool's zlib.
set(CMAKE_FIND_ROOT_PATH /usr/arm-linux-gnueabihf /opt/kelvane-armhf-zlib)
set(CMAKE_LIBRARY_ARCHITECTURE arm-linux-gnueabihf)
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
set(CMAKE_CROSSCOMPILING_EMULATOR qemu-arm -L /usr/arm-linux-gnueabihf)
# GCC's note that std::vector iterators are passed differently since GCC 7.1
# concerns mixing objects built by old compilers; nothing here does.
set(CMAKE_CXX_FLAGS_INIT "-Wno-psabi")
