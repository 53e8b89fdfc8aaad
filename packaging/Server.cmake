# The server: the program, how systemd starts it, and what is written about it.
install_program(teed)
add_dependencies(installables teed)
install(FILES "${pages}/teed.8" DESTINATION "${CMAKE_INSTALL_MANDIR}/man8" COMPONENT runtime)
install(FILES completions/teed.bash DESTINATION "${bash_folder}" RENAME teed COMPONENT runtime)
install(FILES completions/_teed DESTINATION "${KEYMASTER_ZSH_FOLDER}" COMPONENT runtime)
install(FILES completions/teed.fish DESTINATION "${fish_folder}" COMPONENT runtime)

configure_file(systemd/teed.service.in teed.service @ONLY)
install(FILES "${CMAKE_CURRENT_BINARY_DIR}/teed.service" systemd/teed.socket
  DESTINATION lib/systemd/system COMPONENT runtime)
install(FILES systemd/keymaster-ta.conf DESTINATION lib/sysusers.d COMPONENT runtime)
