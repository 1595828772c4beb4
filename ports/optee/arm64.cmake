# 64-bit ARM as OP-TEE's trusted applications are compiled for it.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR aarch64)
set(CMAKE_C_COMPILER aarch64-linux-gnu-gcc)
set(CMAKE_CXX_COMPILER aarch64-linux-gnu-g++)
# The core sets no floating point up before a trusted application first traps for it, checks
# alignment, and has no helpers for atomics.
set(CMAKE_CXX_FLAGS_INIT "-mstrict-align -mno-outline-atomics")
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
