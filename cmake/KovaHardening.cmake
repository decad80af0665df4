# Flags that make a memory error end the process instead of letting an attacker exploit it. They are
# set here and not only in Debian's packaging, because a build for an appliance does not use that.
option(KOVA_HARDENING "Build with stack protector, immediate binding and the like" ON)

include(CheckCXXCompilerFlag)
include(CheckPIESupported)
check_pie_supported(LANGUAGES CXX)

# Uses the flags that the compiler supports; each of the last two is for one kind of processor. A
# warning counts as "not supported": clang only warns about a flag for another processor, and that
# warning would make the build fail.
set(kova_hardening_flags)
set(CMAKE_REQUIRED_FLAGS -Werror)
foreach(flag IN ITEMS -fstack-protector-strong -fstack-clash-protection -fcf-protection
                      -mbranch-protection=standard)
  string(MAKE_C_IDENTIFIER "KOVA_HAS${flag}" known)
  check_cxx_compiler_flag(${flag} ${known})
  if(${known})
    list(APPEND kova_hardening_flags ${flag})
  endif()
endforeach()
unset(CMAKE_REQUIRED_FLAGS)

# kova_harden(<target>): for every target that is installed. Checked calls of libc functions
# (_FORTIFY_SOURCE) require an optimised build. They are not used when tests are built, because tests
# replace libc functions, and a checked call would bypass the replacement.
function(kova_harden target)
  if(NOT KOVA_HARDENING OR KOVA_SANITIZE)
    return()
  endif()
  set_target_properties(${target} PROPERTIES POSITION_INDEPENDENT_CODE ON)
  target_compile_options(${target} PRIVATE ${kova_hardening_flags})
  if(NOT KOVA_BUILD_TESTS)
    target_compile_options(${target} PRIVATE
      $<$<CONFIG:Release,RelWithDebInfo,MinSizeRel>:-U_FORTIFY_SOURCE$<SEMICOLON>-D_FORTIFY_SOURCE=2>)
  endif()
  get_target_property(type ${target} TYPE)
  if(NOT type STREQUAL OBJECT_LIBRARY)
    target_link_options(${target} PRIVATE LINKER:-z,relro LINKER:-z,now)
  endif()
endfunction()
