# Debian's hard-float 32-bit ARM cross compiler, with the libraries that scripts/arm_sysroot lays
# down; programs run under qemu-user.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR arm)
set(CMAKE_C_COMPILER arm-linux-gnueabihf-gcc)
set(CMAKE_CXX_COMPILER arm-linux-gnueabihf-g++)
get_filename_component(ARM32_SYSROOT ${CMAKE_CURRENT_LIST_DIR}/../build/arm32-sysroot ABSOLUTE)
set(CMAKE_FIND_ROOT_PATH /usr/arm-linux-gnueabihf ${ARM32_SYSROOT})
set(CMAKE_PREFIX_PATH /usr)
foreach(kind LIBRARY INCLUDE PACKAGE)
  set(CMAKE_FIND_ROOT_PATH_MODE_${kind} ONLY)
endforeach()
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_CXX_FLAGS_INIT "-isystem ${ARM32_SYSROOT}/usr/include/arm-linux-gnueabihf")
set(CMAKE_CROSSCOMPILING_EMULATOR qemu-arm -L /usr/arm-linux-gnueabihf
    -E LD_LIBRARY_PATH=${ARM32_SYSROOT}/usr/lib/arm-linux-gnueabihf)
