# For the processor that the TA is made for: ARMv7-A, 32 bits, Thumb-2, hard floating point. The hosted TEE, the tests
# and kmctl are Linux programs for it; they find their libraries in the sysroot that tools/arm-sysroot makes, and run under
# user-mode emulation.
set(CMAKE_SYSTEM_NAME Linux)
set(CMAKE_SYSTEM_PROCESSOR armv7-a)
set(CMAKE_LIBRARY_ARCHITECTURE arm-linux-gnueabihf)

set(KEYMASTER_ARM_SYSROOT "${CMAKE_CURRENT_LIST_DIR}/../build/arm-sysroot" CACHE PATH "What tools/arm-sysroot made")
list(APPEND CMAKE_TRY_COMPILE_PLATFORM_VARIABLES KEYMASTER_ARM_SYSROOT)
get_filename_component(CMAKE_SYSROOT "${KEYMASTER_ARM_SYSROOT}" ABSOLUTE)
if(NOT EXISTS "${CMAKE_SYSROOT}/packages")
  message(FATAL_ERROR "There is no sysroot in ${CMAKE_SYSROOT}: run tools/arm-sysroot")
endif()

set(CMAKE_C_COMPILER arm-linux-gnueabihf-gcc)
set(CMAKE_CXX_COMPILER arm-linux-gnueabihf-g++)
# kmctl takes files of any size.
set(CMAKE_C_FLAGS_INIT "-march=armv7-a+fp -mfloat-abi=hard -mthumb -D_FILE_OFFSET_BITS=64")
# Nothing here meets code that an older compiler made.
set(CMAKE_CXX_FLAGS_INIT "${CMAKE_C_FLAGS_INIT} -Wno-psabi")

# Libraries and headers are the sysroot's; programs such as python3 and openssl are those of the machine that builds.
set(CMAKE_FIND_ROOT_PATH_MODE_PROGRAM NEVER)
set(CMAKE_FIND_ROOT_PATH_MODE_LIBRARY ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_INCLUDE ONLY)
set(CMAKE_FIND_ROOT_PATH_MODE_PACKAGE ONLY)
set(ENV{PKG_CONFIG_LIBDIR} "${CMAKE_SYSROOT}/usr/lib/${CMAKE_LIBRARY_ARCHITECTURE}/pkgconfig")
set(ENV{PKG_CONFIG_SYSROOT_DIR} "${CMAKE_SYSROOT}")

# A processor of this architecture and of no later one: like the code made here it has no instruction to divide.
find_program(KEYMASTER_ARM_EMULATOR qemu-arm-static REQUIRED)
set(CMAKE_CROSSCOMPILING_EMULATOR "${KEYMASTER_ARM_EMULATOR}" -cpu cortex-a9 -L "${CMAKE_SYSROOT}")
