# keymaster_shared_library(TARGET SOVERSION): what every shared library of the project has in common. The version script
# TARGET.exports.in beside the caller names its symbols; whatever it does not name stays inside. Libraries and programs
# find each other by where they lie, so that an installed tree can be moved as a whole.
function(keymaster_shared_library target soversion)
  set(script "${CMAKE_CURRENT_BINARY_DIR}/${target}.exports")
  configure_file("${target}.exports.in" "${script}" @ONLY)
  target_link_options(${target} PRIVATE "LINKER:--version-script=${script}" LINKER:-z,now LINKER:-z,relro)
  set_target_properties(${target} PROPERTIES
    LINK_DEPENDS "${script}" VERSION "${PROJECT_VERSION}" SOVERSION "${soversion}")
  if(KEYMASTER_RELOCATABLE)
    set_target_properties(${target} PROPERTIES INSTALL_RPATH "$ORIGIN")
  endif()
endfunction()
