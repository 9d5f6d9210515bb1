# Builds for an AArch64 Android device with the workstation's Clang and lld.
# FENNICK_SYSROOT names the device's sysroot; docs/client-library.md says what
# it holds. Who has the NDK uses the NDK's own toolchain file instead.

# Not Android, by which CMake means a build with the NDK.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR aarch64)

set(FENNICK_SYSROOT "" CACHE PATH "The device's headers and libraries")
set(FENNICK_API_LEVEL 30 CACHE STRING "The device's Android API level")
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES
     FENNICK_SYSROOT FENNICK_API_LEVEL)
if(NOT IS_DIRECTORY "${FENNICK_SYSROOT}")
  message(FATAL_ERROR "FENNICK_SYSROOT is no folder: '${FENNICK_SYSROOT}'")
endif()

set(CMAKE_SYSROOT ${FENNICK_SYSROOT})
set(CMAKE_CXX_COMPILER clang++)
set(CMAKE_CXX_COMPILER_TARGET aarch64-linux-android${FENNICK_API_LEVEL})
set(CMAKE_CXX_FLAGS_INIT -stdlib=libc++)
foreach(kind EXE SHARED)
  set(CMAKE_${kind}_LINKER_FLAGS_INIT -fuse-ld=lld)
endforeach()

# The workstation's folders mean nothing to the device's loader.
set(CMAKE_SKIP_RPATH ON)

# Programs, protoc among them, are the workstation's, all else the device's.
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
