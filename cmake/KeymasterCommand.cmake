# keymaster_command(VARIABLE TARGET): the variable names what people and tests run in place of the target: a script that
# calls the emulator where the machine that builds cannot run the program itself.
function(keymaster_command variable target)
  set(command "$<TARGET_FILE:${target}>")
  if(CMAKE_CROSSCOMPILING_EMULATOR)
    set(command "${PROJECT_BINARY_DIR}/emulated/${target}")
    list(TRANSFORM CMAKE_CROSSCOMPILING_EMULATOR REPLACE ".+" "'\\0'" OUTPUT_VARIABLE emulator)
    list(JOIN emulator " " emulator)
    file(GENERATE OUTPUT "${command}" CONTENT "#!/bin/sh\nexec ${emulator} '$<TARGET_FILE:${target}>' \"$@\"\n"
      FILE_PERMISSIONS OWNER_READ OWNER_WRITE OWNER_EXECUTE GROUP_READ GROUP_EXECUTE WORLD_READ WORLD_EXECUTE)
  endif()
  set(${variable} "${command}" CACHE INTERNAL "The command that runs ${target}")
endfunction()
