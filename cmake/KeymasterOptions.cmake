# Compiler settings that every target of the project shares. Targets link keymaster_options.
set(CMAKE_CXX_STANDARD 20)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_C_STANDARD 11)
set(CMAKE_C_STANDARD_REQUIRED ON)
set(CMAKE_POSITION_INDEPENDENT_CODE ON)
set(CMAKE_CXX_SCAN_FOR_MODULES OFF)

add_library(keymaster_options INTERFACE)
target_compile_options(keymaster_options INTERFACE
  -Wall -Wextra -Wpedantic -Wshadow -Wconversion -Wcast-align -Wundef -Wvla -Werror
  $<$<COMPILE_LANGUAGE:CXX>:-Wnon-virtual-dtor -Woverloaded-virtual -Wold-style-cast>
  $<$<COMPILE_LANGUAGE:C>:-Wstrict-prototypes>
  # libcrypto's macros note the file of their caller; what is installed does not tell where it was built.
  -fmacro-prefix-map=${PROJECT_SOURCE_DIR}/=)

if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU" AND CMAKE_CXX_COMPILER_VERSION VERSION_LESS 13)
  # GCC 12 sees overlapping copies in every `"text" + std::string` that it inlines (GCC bug 105651).
  target_compile_options(keymaster_options INTERFACE $<$<COMPILE_LANGUAGE:CXX>:-Wno-restrict>)
endif()

# For all directories, and not a target's property: TA code, which has no run time to report a smashed stack to, turns it
# off again.
add_compile_options(-fstack-protector-strong)

if(KEYMASTER_SANITIZE)
  # A finding ends the program: a test that stumbles over undefined behaviour must not pass.
  target_compile_options(keymaster_options INTERFACE
    -fsanitize=${KEYMASTER_SANITIZE} -fno-sanitize-recover=all -fno-omit-frame-pointer -fno-sanitize=vptr)
  target_link_options(keymaster_options INTERFACE -fsanitize=${KEYMASTER_SANITIZE} -fno-sanitize=vptr)
  if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
    # The TA images take the sanitizer's run time from the program that loads them.
    target_link_options(keymaster_options INTERFACE $<$<STREQUAL:$<TARGET_PROPERTY:TYPE>,EXECUTABLE>:-rdynamic>)
  endif()
endif()
