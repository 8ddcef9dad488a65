# Compiler and linker hardening for everything that is installed, because the library runs as root on files that users
# own.
include(CheckCXXCompilerFlag)
include(CheckPIESupported)
check_pie_supported()

option(QZ_HARDENING "Compile with the checks of cmake/hardening.cmake" ON)
add_link_options(-Wl,-z,relro,-z,now,-z,noexecstack)
if(QZ_SANITIZE OR NOT QZ_HARDENING)
  return() # the sanitizers detect more, and some of these options hide what they look for
endif()

foreach(flag -fstack-protector-strong -fstack-clash-protection -fcf-protection=full -ftrivial-auto-var-init=zero)
  string(MAKE_C_IDENTIFIER has${flag} has)
  check_cxx_compiler_flag("${flag} -Werror" ${has})
  if(${has})
    add_compile_options(${flag})
  endif()
endforeach()
if(NOT has_ftrivial_auto_var_init_zero)
  # Older versions of Clang fill with a pattern.
  check_cxx_compiler_flag("-ftrivial-auto-var-init=pattern -Werror" has_pattern_init)
  if(has_pattern_init)
    add_compile_options(-ftrivial-auto-var-init=pattern)
  endif()
endif()

# Fortified calls need optimisation; where the third level is not known, the second is.
if(NOT CMAKE_BUILD_TYPE STREQUAL "Debug")
  if((CMAKE_CXX_COMPILER_ID STREQUAL "GNU" AND CMAKE_CXX_COMPILER_VERSION VERSION_GREATER_EQUAL 12)
      OR (CMAKE_CXX_COMPILER_ID STREQUAL "Clang" AND CMAKE_CXX_COMPILER_VERSION VERSION_GREATER_EQUAL 9))
    add_compile_options(-U_FORTIFY_SOURCE -D_FORTIFY_SOURCE=3)
  else()
    add_compile_options(-U_FORTIFY_SOURCE -D_FORTIFY_SOURCE=2)
  endif()
endif()
