# Flags under which a mistake ends the process instead of serving whoever provoked it. They are set
# here and not by Debian's packaging only: on an appliance nobody else would.
option(KOVA_HARDENING "Build with stack protector, immediate binding and the like" ON)

include(CheckCXXCompilerFlag)
include(CheckPIESupported)
check_pie_supported(LANGUAGES CXX)

# What the compiler knows of these; the last two are for one kind of processor each. A warning counts
# as a no: clang takes the flag of another processor with one, and the build would end by it.
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

# kova_harden(<target>): for what is installed. Checked calls of libc functions (_FORTIFY_SOURCE) need
# an optimised build; where tests are built they are left out, since tests put their own functions in
# the place of libc's, and a checked call goes past those.
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
