# Tests: one program for each topic. CTest runs each test of a program separately.
include(GoogleTest)

# kova_add_test(<name> SOURCES ... [INTERNAL] [LIBS ...] [LABELS ...] [RESOURCE_LOCK ...]
#               [TIMEOUT seconds])
# INTERNAL links the library's objects instead of the shared library, for tests of parts that it
# hides.
function(kova_add_test name)
  cmake_parse_arguments(arg "INTERNAL" "RESOURCE_LOCK;TIMEOUT" "SOURCES;LIBS;LABELS" ${ARGN})
  add_executable(${name} ${arg_SOURCES})
  kova_compile_settings(${name})
  kova_cover_sources(${name} ${arg_SOURCES})
  # The shared libraries must find the functions that a test program defines.
  set_target_properties(${name} PROPERTIES ENABLE_EXPORTS ON CXX_VISIBILITY_PRESET default)
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR})
  if(arg_INTERNAL)
    target_link_libraries(${name} PRIVATE kovabackup_util_objects ${KOVA_PLATFORM_LIBRARIES})
  else()
    target_link_libraries(${name} PRIVATE kovabackup-util)
  endif()
  target_link_libraries(${name} PRIVATE kova_test_support ${arg_LIBS} kova_platform_headers
                        GTest::gmock ${CMAKE_DL_LIBS})
  set(properties)
  foreach(property IN ITEMS LABELS RESOURCE_LOCK)
    if(arg_${property})
      list(APPEND properties ${property} "${arg_${property}}")
    endif()
  endforeach()
  if(NOT arg_TIMEOUT)
    set(arg_TIMEOUT 120)
  endif()
  gtest_discover_tests(${name} DISCOVERY_TIMEOUT 120 TEST_PREFIX "${name}."
    PROPERTIES TIMEOUT ${arg_TIMEOUT} ${properties})
endfunction()

# kova_add_test_helper(<name> SOURCES ...): a child program that tests start by its path.
function(kova_add_test_helper name)
  cmake_parse_arguments(arg "" "" "SOURCES;LIBS" ${ARGN})
  add_executable(${name} ${arg_SOURCES})
  kova_compile_settings(${name})
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR})
  target_link_libraries(${name} PRIVATE ${arg_LIBS})
endfunction()
