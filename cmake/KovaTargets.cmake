# Functions that define the targets of this project: compiler settings, the library and the platform
# stand-ins. All settings are per target, so a parent project is not affected.

include(KovaHardening)

# Support large files and dates after 2038 where off_t and time_t would otherwise have 32 bits.
set(kova_wide_types)
if(CMAKE_SIZEOF_VOID_P EQUAL 4)
  set(kova_wide_types _FILE_OFFSET_BITS=64 _TIME_BITS=64)
endif()

# kova_modules(<variable>): lists the folders of the library's modules, from the bottom up.
function(kova_modules variable)
  set(list ${PROJECT_SOURCE_DIR}/layers.txt)
  set_property(DIRECTORY APPEND PROPERTY CMAKE_CONFIGURE_DEPENDS ${list})
  file(STRINGS ${list} rows REGEX "^module ")
  list(TRANSFORM rows REPLACE "^module *\\| *([^ |]+).*" "\\1")
  set(${variable} ${rows} PARENT_SCOPE)
endfunction()

# Settings for every target of this project. They are private, so they do not apply to callers.
function(kova_compile_settings target)
  target_compile_features(${target} PRIVATE cxx_std_17 c_std_11)
  set_target_properties(${target} PROPERTIES
    CXX_EXTENSIONS OFF C_EXTENSIONS OFF
    CXX_VISIBILITY_PRESET hidden C_VISIBILITY_PRESET hidden VISIBILITY_INLINES_HIDDEN ON)
  target_compile_definitions(${target} PRIVATE _GNU_SOURCE ${kova_wide_types})
  target_compile_options(${target} PRIVATE
    -Wall -Wextra -Wshadow -Wconversion -Wsign-conversion -Wcast-align -Wcast-qual
    -Wformat=2 -Wundef -Wvla -Wnull-dereference
    # With -Wpedantic g++ rejects %m in log lines. The option stays on for C, clang++, clang-tidy and
    # the checks of the public headers.
    $<$<NOT:$<AND:$<COMPILE_LANGUAGE:CXX>,$<CXX_COMPILER_ID:GNU>>>:-Wpedantic>
    $<$<COMPILE_LANGUAGE:CXX>:-Wold-style-cast -Wnon-virtual-dtor -Woverloaded-virtual -Wextra-semi>
    $<$<CXX_COMPILER_ID:GNU>:-Wduplicated-cond -Wlogical-op>)
  if(KOVA_WARNINGS_AS_ERRORS)
    target_compile_options(${target} PRIVATE -Werror)
  endif()
  if(KOVA_SANITIZE)
    target_compile_options(${target} PRIVATE
      -fsanitize=${KOVA_SANITIZE} -fno-sanitize-recover=all -fno-omit-frame-pointer)
    target_link_options(${target} PRIVATE -fsanitize=${KOVA_SANITIZE})
  endif()
  kova_share_counters(${target})
endfunction()

# Shared objects must list every library that they need. With a sanitizer they cannot, because its
# runtime is part of the program.
function(kova_shared_settings target)
  if(NOT KOVA_SANITIZE)
    target_link_options(${target} PRIVATE LINKER:-z,defs)
  endif()
endfunction()

# kova_add_platform_library(<core|sdk|netsdk> SOURCES ... [LIBS ...])
# Defines the stand-in libkova<name>.so and its alias kova::<name>.
function(kova_add_platform_library name)
  cmake_parse_arguments(arg "" "" "SOURCES;LIBS" ${ARGN})
  add_library(kova${name} SHARED ${arg_SOURCES})
  add_library(kova::${name} ALIAS kova${name})
  kova_compile_settings(kova${name})
  kova_harden(kova${name})
  kova_cover(kova${name})
  kova_shared_settings(kova${name})
  target_link_libraries(kova${name} PUBLIC kova_platform_headers PRIVATE ${arg_LIBS})
  target_include_directories(kova${name} PRIVATE ${PROJECT_SOURCE_DIR})
endfunction()

# kova_add_library(<name> MAP <version script> [PUBLIC <library>...])
# Defines libkovabackup-<name>.so and its alias kovabackup::<name>. Its sources are one object
# library, kovabackup_<name>_objects, so that a test can link the internal parts that the shared
# object hides. The folders of the library add their sources to that.
function(kova_add_library name)
  cmake_parse_arguments(arg "" "MAP" "PUBLIC" ${ARGN})
  set(library kovabackup-${name})
  set(objects kovabackup_${name}_objects)
  add_library(${objects} OBJECT)
  kova_compile_settings(${objects})
  kova_harden(${objects})
  kova_cover(${objects})
  set_target_properties(${objects} PROPERTIES POSITION_INDEPENDENT_CODE ON)
  target_include_directories(${objects} PUBLIC ${PROJECT_SOURCE_DIR} ${PROJECT_SOURCE_DIR}/include)
  target_link_libraries(${objects} PUBLIC kova_base kova_platform_headers ${arg_PUBLIC})

  add_library(${library} SHARED)
  add_library(kovabackup::${name} ALIAS ${library})
  set_target_properties(${library} PROPERTIES
    VERSION ${PROJECT_VERSION} SOVERSION ${PROJECT_VERSION_MAJOR} EXPORT_NAME ${name}
    LINKER_LANGUAGE CXX LINK_DEPENDS ${arg_MAP})
  kova_compile_settings(${library})
  kova_harden(${library})
  kova_shared_settings(${library})
  target_link_options(${library} PRIVATE LINKER:--version-script=${arg_MAP})
  target_include_directories(${library} PUBLIC
    $<BUILD_INTERFACE:${PROJECT_SOURCE_DIR}/include> $<INSTALL_INTERFACE:include>)
  target_sources(${library} PRIVATE $<TARGET_OBJECTS:${objects}>)
  target_link_libraries(${library} PUBLIC ${arg_PUBLIC}
                        PRIVATE kova_base ${KOVA_PLATFORM_LIBRARIES})
endfunction()

# kova_module_sources(<source>...): called in the CMakeLists.txt of each module.
function(kova_module_sources)
  list(TRANSFORM ARGN PREPEND ${CMAKE_CURRENT_SOURCE_DIR}/)
  target_sources(kovabackup_util_objects PRIVATE ${ARGN})
endfunction()
