# Language, warnings, hardening and sanitizers, once for every target of the project.

option(REMVOL_TESTS "Build the tests and the benchmarks" OFF)
option(REMVOL_SHARED_RUNTIME "Have every program load the system's C++ runtime, with its updates" OFF)
set(REMVOL_SANITIZE "" CACHE STRING "Sanitizers to build with, such as address,undefined")
set(REMVOL_LIMITS "" CACHE STRING "Most targets, and LUNs of each, other than include/tree_layout.h has, to see what they cost: 64;16")

if(NOT CMAKE_BUILD_TYPE)
  set(CMAKE_BUILD_TYPE Release)
endif()

set(CMAKE_CXX_STANDARD 20)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_C_STANDARD 11)
set(CMAKE_POSITION_INDEPENDENT_CODE ON)
include(CheckCXXCompilerFlag)
include(CheckLinkerFlag)
include(CheckPIESupported)
check_pie_supported(LANGUAGES C CXX)
set(CMAKE_CXX_VISIBILITY_PRESET hidden)
set(CMAKE_C_VISIBILITY_PRESET hidden)
set(CMAKE_VISIBILITY_INLINES_HIDDEN ON)
# Installed programs find the private libraries beside them, wherever the prefix is.
file(RELATIVE_PATH bin_to_lib "/${CMAKE_INSTALL_BINDIR}" "/${CMAKE_INSTALL_LIBDIR}")
set(CMAKE_INSTALL_RPATH "$ORIGIN/${bin_to_lib}")

# For what needs no library of this project: a search path would only be walked in vain for every one of the system's.
function(without_search_path)
  set_target_properties(${ARGV} PROPERTIES SKIP_BUILD_RPATH ON INSTALL_RPATH "")
endfunction()

# A small program that carries the little of the C++ runtime that it uses: less memory, and less to do at every start.
function(with_own_runtime target)
  if(NOT REMVOL_SANITIZE AND NOT REMVOL_SHARED_RUNTIME)
    target_link_options(${target} PRIVATE -static-libstdc++ -static-libgcc -Wl,--gc-sections)
  endif()
endfunction()

add_compile_definitions(_GNU_SOURCE)
if(REMVOL_LIMITS)
  list(GET REMVOL_LIMITS 0 targets)
  list(GET REMVOL_LIMITS 1 luns)
  math(EXPR all_luns "${targets} * ${luns}")
  add_compile_definitions(REMVOL_MAX_TARGETS=${targets} REMVOL_MAX_LUNS_PER_TARGET=${luns} REMVOL_MAX_LUNS=${all_luns})
endif()
# Sizes of files and times have 64 bits on 32-bit processors too.
if(CMAKE_SIZEOF_VOID_P EQUAL 4)
  add_compile_definitions(_FILE_OFFSET_BITS=64 _TIME_BITS=64)
endif()
add_compile_options(
  -Wall -Wextra -Wpedantic -Wshadow -Wconversion -Wformat=2
  -fstack-protector-strong -fstack-clash-protection)
# Each kind of processor has its own way to see to it that a jump ends where one may.
foreach(protection IN ITEMS -fcf-protection -mbranch-protection=standard)
  string(MAKE_C_IDENTIFIER "has${protection}" known)
  set(CMAKE_REQUIRED_FLAGS -Werror)  # clang takes another processor's with a warning
  check_cxx_compiler_flag(${protection} ${known})
  if(${known})
    add_compile_options(${protection})
  endif()
endforeach()
unset(CMAKE_REQUIRED_FLAGS)
add_link_options(-Wl,-z,relro,-z,now -Wl,--as-needed)
# Addresses that the loader adjusts, in a tenth of the room: glibc since 2.36, and linkers that know the processor.
check_linker_flag(CXX "LINKER:-z,pack-relative-relocs,--fatal-warnings" has_packed_relocations)
if(has_packed_relocations)
  add_link_options(LINKER:-z,pack-relative-relocs)
endif()
if(REMVOL_SANITIZE)
  add_compile_options(-fsanitize=${REMVOL_SANITIZE} -fno-sanitize-recover=all -fno-omit-frame-pointer)
  add_link_options(-fsanitize=${REMVOL_SANITIZE})
elseif(CMAKE_BUILD_TYPE STREQUAL "Debug")
  add_compile_definitions(_GLIBCXX_ASSERTIONS)
else()
  add_compile_definitions(_FORTIFY_SOURCE=2 _GLIBCXX_ASSERTIONS)
endif()
