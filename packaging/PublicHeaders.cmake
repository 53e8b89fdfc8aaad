# The headers of the client libraries as they are installed. In the tree a header is named from the root of the project;
# installed, all stand below `keymaster/`, and name each other so. The table says what becomes of which.
set(client_headers
  attestation auth_token authenticator authorizations bytes capabilities connection device_information error
  factory_record fingerprint key_material keys names openssl_handles operation provisioning rsa_public_key session
  statement statement_refused ta_session wire)
set(header_table
  "tee/include/tee_client_api.h>keymaster/tee_client_api.h"
  "src/params/keymaster_defs.h>keymaster/keymaster_defs.h"
  "src/params/keymaster_protocol.h>keymaster/keymaster_protocol.h"
  "src/quil/quil_protocol.h>keymaster/quil_protocol.h"
  "tee/companions/authenticator/authenticator_protocol.h>keymaster/authenticator_protocol.h"
  "tee/companions/fingerprint/fingerprint_protocol.h>keymaster/fingerprint_protocol.h"
  "tee/companions/provisioning/provisioning_protocol.h>keymaster/provisioning_protocol.h")
foreach(name IN LISTS client_headers)
  list(APPEND header_table "client/lib/${name}.h>keymaster/client/${name}.h")
endforeach()

# installed_name(NAME OUT): how an installed header names what is NAME in the tree.
function(installed_name name out)
  foreach(row IN LISTS header_table)
    string(REPLACE ">" ";" row "${row}")
    list(GET row 0 source)
    if(source STREQUAL name OR source STREQUAL "tee/include/${name}")
      list(GET row 1 installed)
      set(${out} "${installed}" PARENT_SCOPE)
      return()
    endif()
  endforeach()
  message(FATAL_ERROR "An installed header includes ${name}, which is not installed")
endfunction()

# write_public_headers(FOLDER): writes the headers below FOLDER, again whenever one of them changes.
function(write_public_headers folder)
  foreach(row IN LISTS header_table)
    string(REPLACE ">" ";" row "${row}")
    list(GET row 0 source)
    list(GET row 1 installed)
    set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS "${PROJECT_SOURCE_DIR}/${source}")
    file(READ "${PROJECT_SOURCE_DIR}/${source}" text)
    string(REGEX MATCHALL "#include \"[^\"]+\"" includes "${text}")
    foreach(include IN LISTS includes)
      string(REGEX REPLACE "#include \"(.*)\"" "\\1" name "${include}")
      installed_name("${name}" new_name)
      string(REPLACE "${include}" "#include \"${new_name}\"" text "${text}")
    endforeach()
    file(CONFIGURE OUTPUT "${folder}/${installed}" CONTENT "${text}" @ONLY)
  endforeach()
endfunction()
