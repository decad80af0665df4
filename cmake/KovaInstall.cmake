# Installation: headers, libraries, stand-ins, CMake packages, pkg-config files, tmpfiles.d entry.

# Named after the soname, so that two versions can be installed side by side.
install(FILES packaging/tmpfiles.d/kovabackup.conf DESTINATION lib/tmpfiles.d
        RENAME libkovabackup-util${PROJECT_VERSION_MAJOR}.conf)

install(DIRECTORY include/kovabackup TYPE INCLUDE)
install(DIRECTORY platform/include/kovaplatform TYPE INCLUDE)

# The files derive the prefix from their own location, so an installed tree can be moved.
file(RELATIVE_PATH kova_pc_prefix "/${CMAKE_INSTALL_LIBDIR}/pkgconfig" "/")
string(REGEX REPLACE "/$" "" kova_pc_prefix "${kova_pc_prefix}")

# kova_install_library(<name> DESCRIPTION <text> REQUIRES <pkg-config module>
#                      FIND <code> [WITH <target>...] [STATIC_LIBS <library>...]
#                      [DEFINITIONS <name>=<value>...])
# Installs libkovabackup-<name> with its CMake package and its pkg-config file. The package runs
# the code after FIND, which finds what the library depends on, and also has the targets after WITH.
# Only static linking requires the libraries after STATIC_LIBS. The pkg-config file gives callers the
# definitions; in the CMake package the target does.
function(kova_install_library name)
  cmake_parse_arguments(arg "" "DESCRIPTION;REQUIRES;FIND" "WITH;STATIC_LIBS;DEFINITIONS" ${ARGN})
  set(kova_package kovabackup-${name})
  set(folder ${CMAKE_INSTALL_LIBDIR}/cmake/${kova_package})
  install(TARGETS ${kova_package} ${arg_WITH} EXPORT ${kova_package}-targets)
  install(EXPORT ${kova_package}-targets NAMESPACE kovabackup:: DESTINATION ${folder})

  configure_package_config_file(cmake/kovabackup-config.cmake.in
    ${PROJECT_BINARY_DIR}/${kova_package}-config.cmake INSTALL_DESTINATION ${folder})
  write_basic_package_version_file(${PROJECT_BINARY_DIR}/${kova_package}-config-version.cmake
    COMPATIBILITY SameMajorVersion)
  install(FILES ${PROJECT_BINARY_DIR}/${kova_package}-config.cmake
                ${PROJECT_BINARY_DIR}/${kova_package}-config-version.cmake
          DESTINATION ${folder})

  list(TRANSFORM arg_STATIC_LIBS PREPEND " -l")
  list(JOIN arg_STATIC_LIBS "" kova_pc_private)
  list(TRANSFORM arg_DEFINITIONS PREPEND " -D")
  list(JOIN arg_DEFINITIONS "" kova_pc_definitions)
  configure_file(cmake/kovabackup.pc.in ${PROJECT_BINARY_DIR}/${kova_package}.pc @ONLY)
  install(FILES ${PROJECT_BINARY_DIR}/${kova_package}.pc
          DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
endfunction()

set(kova_standins)
if(KOVA_PLATFORM STREQUAL standin)
  set(kova_standins kovacore kovasdk kovanetsdk kova_platform_headers)
endif()
if(NOT CMAKE_INSTALL_PREFIX STREQUAL "/usr")
  # Outside the system's folders the dynamic linker does not search the folder of a library, where
  # the libraries that it needs are.
  set_target_properties(kovabackup-service PROPERTIES INSTALL_RPATH "$ORIGIN")
  if(KOVA_PLATFORM STREQUAL standin)
    set_target_properties(kovabackup-util kovasdk kovanetsdk PROPERTIES INSTALL_RPATH "$ORIGIN")
  endif()
endif()

kova_install_library(util
  DESCRIPTION "${PROJECT_DESCRIPTION}"
  REQUIRES jsoncpp STATIC_LIBS kovasdk kovanetsdk kovacore
  FIND "find_dependency(Boost 1.70)
if(NOT TARGET jsoncpp_lib) # jsoncpp cannot be found twice
  find_dependency(jsoncpp CONFIG)
endif()"
  WITH ${kova_standins})
# The first library is looked for beside the second.
kova_install_library(service
  DESCRIPTION "Service library of the backup services (requires C++17)"
  REQUIRES kovabackup-util
  FIND "find_dependency(kovabackup-util ${PROJECT_VERSION} CONFIG HINTS \"\${PACKAGE_PREFIX_DIR}\")"
  DEFINITIONS ${kova_wide_types})
