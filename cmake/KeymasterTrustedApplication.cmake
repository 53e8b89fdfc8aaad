# keymaster_ta_options: how code that runs inside the TEE is compiled. No exceptions, no run-time type information, no
# guards, nothing that needs more than the platform's calls.
add_library(keymaster_ta_options INTERFACE)
target_link_libraries(keymaster_ta_options INTERFACE keymaster_options)
# keymaster_ta_headers: the seam, for the TA's code and for whoever links against it.
add_library(keymaster_ta_headers INTERFACE)
target_include_directories(keymaster_ta_headers INTERFACE "${PROJECT_SOURCE_DIR}/tee/include")
target_link_libraries(keymaster_ta_options INTERFACE keymaster_ta_headers)
# -Wformat=2: a trace format is a literal at its place, so that no client's bytes can ever become one.
target_compile_options(keymaster_ta_options INTERFACE
  -Wformat=2 -fno-exceptions -fno-rtti -fno-threadsafe-statics -fno-use-cxa-atexit
  -fvisibility=hidden -fvisibility-inlines-hidden -ffunction-sections -fdata-sections
  -fno-stack-protector -U_FORTIFY_SOURCE -fmacro-prefix-map=${PROJECT_SOURCE_DIR}/=)

if(NOT KEYMASTER_SANITIZE)
  # A device gives a TA a stack of 8 KiB, and the platform's calls want half of it.
  target_compile_options(keymaster_ta_options INTERFACE -Wframe-larger-than=1024)
endif()

set(KEYMASTER_TA_FOLDER "${PROJECT_BINARY_DIR}/ta")

# trusted_applications: the images of all TAs. What one TA finds beside it decides what it answers, so programs that run
# TAs depend on them all.
add_custom_target(trusted_applications)

# add_trusted_application(NAME UUID LIBRARY): links `LIBRARY` whole into `<UUID>.ta`, an image that imports the
# platform's calls and nothing else and that the hosted TEE finds in KEYMASTER_TA_FOLDER.
function(add_trusted_application name uuid library)
  add_library(${name} MODULE "${PROJECT_SOURCE_DIR}/cmake/empty.cpp")
  target_link_libraries(${name} PRIVATE keymaster_ta_options $<LINK_LIBRARY:WHOLE_ARCHIVE,${library}>)
  set_target_properties(${name} PROPERTIES
    PREFIX "" OUTPUT_NAME "${uuid}" SUFFIX ".ta" LIBRARY_OUTPUT_DIRECTORY "${KEYMASTER_TA_FOLDER}")
  add_dependencies(trusted_applications ${name})
  target_link_options(${name} PRIVATE -Wl,--gc-sections -Wl,-Bsymbolic -Wl,-z,now -Wl,-z,relro -Wl,--build-id=none)
  if(NOT KEYMASTER_SANITIZE)
    target_link_options(${name} PRIVATE -nostdlib)
    target_link_libraries(${name} PRIVATE gcc)
  endif()
endfunction()
