# Coverage: counts which lines and branches of the product the tests run. See scripts/coverage.
option(KOVA_COVERAGE "Instrument for coverage (g++ only)" OFF)

set(kova_counters_dir ${PROJECT_BINARY_DIR}/counters)

if(KOVA_COVERAGE)
  file(MAKE_DIRECTORY ${kova_counters_dir})
  add_library(kova_counters OBJECT ${PROJECT_SOURCE_DIR}/tests/coverage/counters.cpp)
  set_target_properties(kova_counters PROPERTIES POSITION_INDEPENDENT_CODE ON
                        CXX_VISIBILITY_PRESET hidden)
  target_compile_features(kova_counters PRIVATE cxx_std_17)
  target_compile_definitions(kova_counters PRIVATE KOVA_COUNTERS_DIR="${kova_counters_dir}")
  target_link_libraries(kova_counters INTERFACE gcov)
endif()

# The units go into a list instead of constructors that would write the counters at exit. Each
# counter is a section of its own, so that the linker can collect them.
set(kova_cover_options --coverage -fprofile-update=atomic -fprofile-info-section=kova_units
                       -fdata-sections)

# kova_cover(<target>): for every target of the product. Tests are not instrumented, so a compiler
# cache has them from other builds.
function(kova_cover target)
  if(KOVA_COVERAGE)
    target_compile_options(${target} PRIVATE ${kova_cover_options})
  endif()
endfunction()

# kova_cover_sources(<target> <source>...): for a test that compiles sources of the product.
function(kova_cover_sources target)
  if(NOT KOVA_COVERAGE)
    return()
  endif()
  foreach(source IN LISTS ARGN)
    if(IS_ABSOLUTE ${source} AND NOT source MATCHES "^${PROJECT_SOURCE_DIR}/(tests|fuzz)/")
      set_source_files_properties(${source} PROPERTIES COMPILE_OPTIONS "${kova_cover_options}")
    endif()
  endforeach()
endfunction()

# kova_share_counters(<target>): links what shares the counters between processes into a program or
# a shared object. The folder counters/ of the build has a file <target>, and <target>.path names
# what was built.
function(kova_share_counters target)
  get_target_property(type ${target} TYPE)
  if(NOT KOVA_COVERAGE OR NOT type MATCHES "^(EXECUTABLE|SHARED_LIBRARY|MODULE_LIBRARY)$")
    return()
  endif()
  string(HEX "${target}" hex)
  string(REGEX REPLACE "(..)" "BYTE(0x\\1) " bytes "${hex}00")
  set(script ${PROJECT_BINARY_DIR}/CMakeFiles/counters/${target}.ld)
  configure_file(${PROJECT_SOURCE_DIR}/tests/coverage/counters.ld.in ${script} @ONLY)
  target_link_libraries(${target} PRIVATE kova_counters)
  target_link_options(${target} PRIVATE LINKER:-T,${script})
  set_property(TARGET ${target} APPEND PROPERTY LINK_DEPENDS ${script})
  file(GENERATE OUTPUT ${kova_counters_dir}/${target}.path CONTENT "$<TARGET_FILE:${target}>\n")
endfunction()
