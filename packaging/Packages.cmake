# The Debian packages, made of the installed components: `cpack -G DEB` in the folder of the build.
set(CPACK_GENERATOR DEB)
set(CPACK_PACKAGE_NAME keymaster-ta)
set(CPACK_PACKAGE_VERSION "${PROJECT_VERSION}")
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "")  # each package has its own
set(CPACK_PACKAGE_CONTACT "The Keymaster TA developers <keymaster-ta@example.org>")
set(CPACK_PACKAGING_INSTALL_PREFIX /usr)
set(CPACK_STRIP_FILES TRUE)
set(CPACK_COMPONENTS_ALL runtime development)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_PACKAGE_RELEASE 1)
set(CPACK_DEBIAN_PACKAGE_CONTROL_STRICT_PERMISSION TRUE)

set(CPACK_DEBIAN_RUNTIME_PACKAGE_NAME keymaster-ta)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SECTION utils)
set(CPACK_DEBIAN_RUNTIME_DESCRIPTION "keys that exist outside a TEE only as sealed blobs
The Keymaster trusted application makes keys and uses them inside a trusted
execution environment (TEE). This package has the command kmctl, the TEE
Client API and the hosted TEE, which runs the trusted application on Linux.

The hosted TEE is for development and tests, and no security boundary.")
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SHLIBDEPS ON)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_SUGGESTS openssl)
# The package's own libraries are found where they were built.
foreach(library hosted_tee tee_client_api keymaster_client)
  get_target_property(folder ${library} BINARY_DIR)
  list(APPEND CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS "${folder}")
endforeach()

set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_NAME keymaster-ta-dev)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_SECTION libdevel)
set(CPACK_DEBIAN_DEVELOPMENT_DESCRIPTION "libraries for programs that use keys in a TEE
Headers, CMake package and pkg-config files of the TEE Client API and of the
C++ library that speaks with the Keymaster trusted application, and an
example of a first client.")
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_DEPENDS
  "keymaster-ta (= ${PROJECT_VERSION}-${CPACK_DEBIAN_PACKAGE_RELEASE}), libssl-dev (>= 3.0), libc6-dev")

# What Debian wants otherwise than an installation by hand.
set(debian "${CMAKE_CURRENT_BINARY_DIR}/debian")
configure_file(debian/changelog.in "${debian}/changelog" @ONLY)
configure_file(debian/finish.cmake.in "${debian}/finish.cmake" @ONLY)
set(CPACK_PRE_BUILD_SCRIPTS "${debian}/finish.cmake")
configure_file(debian/shlibs.in "${debian}/shlibs" @ONLY)
configure_file(debian/triggers "${debian}/triggers" COPYONLY)
set(CPACK_DEBIAN_RUNTIME_PACKAGE_CONTROL_EXTRA "${debian}/shlibs" "${debian}/triggers")
foreach(script postinst prerm postrm)
  configure_file(debian/${script} "${debian}/${script}" COPYONLY)
  list(APPEND CPACK_DEBIAN_RUNTIME_PACKAGE_CONTROL_EXTRA "${debian}/${script}")
endforeach()

include(CPack)
