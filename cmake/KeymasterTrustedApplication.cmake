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

# For the processor that the TA ships on, which is what its budgets are kept for: small, and without an access to memory
# that is not aligned, as a device may trap it.
string(COMPARE EQUAL "${CMAKE_SYSTEM_PROCESSOR}" armv7-a KEYMASTER_FOR_ARM)
if(KEYMASTER_FOR_ARM)
  # The last three of what -Os turns on cost GCC 12 half a kilobyte here.
  target_compile_options(keymaster_ta_options INTERFACE -Os -mno-unaligned-access
    -fno-expensive-optimizations -fno-move-loop-invariants -fno-schedule-insns2)
endif()

# Where the images of a build stand, and where installed ones stand below the folder of the hosted TEE's library.
set(KEYMASTER_TA_FOLDER "${PROJECT_BINARY_DIR}/ta")
set(KEYMASTER_TA_INSTALL_FOLDER keymaster/ta)

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
  endif()
  if(KEYMASTER_FOR_ARM)
    # The compiler's arithmetic helpers are the platform's: those of this tool chain raise a signal, which is Linux's.
    set(script "${PROJECT_SOURCE_DIR}/cmake/trusted_application_arm.ld")
    # The calls of the platform lie before the code: out of reach for the short form of the jumps to them.
    target_link_options(${name} PRIVATE "-Wl,-T,${script}" -Wl,-z,max-page-size=4096 -Wl,--long-plt)
    set_target_properties(${name} PROPERTIES LINK_DEPENDS "${script}")
  elseif(NOT KEYMASTER_SANITIZE)
    target_link_libraries(${name} PRIVATE gcc)
  endif()
endfunction()

# add_trusted_application_object(NAME UUID LIBRARY): joins `LIBRARY` whole into the relocatable `<UUID>.o`, for a device
# whose own SDK links its images. The sections stay apart, so that that link can drop what it does not need.
function(add_trusted_application_object name uuid library)
  set(object "${KEYMASTER_TA_FOLDER}/${uuid}.o")
  add_custom_command(OUTPUT "${object}"
    COMMAND "${CMAKE_COMMAND}" -E make_directory "${KEYMASTER_TA_FOLDER}"
    COMMAND "${CMAKE_CXX_COMPILER}" -r -nostdlib -o "${object}"
            -Wl,--whole-archive "$<TARGET_FILE:${library}>" -Wl,--no-whole-archive
    DEPENDS ${library}
    COMMENT "Joining ${uuid}.o"
    VERBATIM)
  add_custom_target(${name} ALL DEPENDS "${object}")
  set_target_properties(${name} PROPERTIES TRUSTED_APPLICATION_OBJECT "${object}")
endfunction()
