# Installation: headers, library, stand-ins, CMake package, pkg-config file, tmpfiles.d entry.
set(kova_cmake_dir ${CMAKE_INSTALL_LIBDIR}/cmake/kovabackup-util)

# Named after the soname, so that two versions can be installed side by side.
install(FILES packaging/tmpfiles.d/kovabackup.conf DESTINATION lib/tmpfiles.d
        RENAME libkovabackup-util${PROJECT_VERSION_MAJOR}.conf)

# The second library is not complete yet: neither it nor its headers are installed.
install(DIRECTORY include/kovabackup TYPE INCLUDE PATTERN service EXCLUDE)
install(DIRECTORY platform/include/kovaplatform TYPE INCLUDE)

set(kova_installed_targets kovabackup-util)
if(KOVA_PLATFORM STREQUAL standin)
  list(APPEND kova_installed_targets kovacore kovasdk kovanetsdk kova_platform_headers)
endif()
if(KOVA_PLATFORM STREQUAL standin AND NOT CMAKE_INSTALL_PREFIX STREQUAL "/usr")
  # Outside the system's folders the dynamic linker does not search the folder of the library, where
  # the stand-ins are.
  set_target_properties(kovabackup-util kovasdk kovanetsdk PROPERTIES INSTALL_RPATH "$ORIGIN")
endif()
install(TARGETS ${kova_installed_targets} EXPORT kovabackup-util-targets)
install(EXPORT kovabackup-util-targets NAMESPACE kovabackup:: DESTINATION ${kova_cmake_dir})

configure_package_config_file(cmake/kovabackup-util-config.cmake.in
  ${PROJECT_BINARY_DIR}/kovabackup-util-config.cmake
  INSTALL_DESTINATION ${kova_cmake_dir})
write_basic_package_version_file(${PROJECT_BINARY_DIR}/kovabackup-util-config-version.cmake
  COMPATIBILITY SameMajorVersion)
install(FILES ${PROJECT_BINARY_DIR}/kovabackup-util-config.cmake
              ${PROJECT_BINARY_DIR}/kovabackup-util-config-version.cmake
        DESTINATION ${kova_cmake_dir})

# The file derives the prefix from its own location, so an installed tree can be moved.
file(RELATIVE_PATH kova_pc_prefix "/${CMAKE_INSTALL_LIBDIR}/pkgconfig" "/")
string(REGEX REPLACE "/$" "" kova_pc_prefix "${kova_pc_prefix}")
configure_file(cmake/kovabackup-util.pc.in ${PROJECT_BINARY_DIR}/kovabackup-util.pc @ONLY)
install(FILES ${PROJECT_BINARY_DIR}/kovabackup-util.pc
        DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
