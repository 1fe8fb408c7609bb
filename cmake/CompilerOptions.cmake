# SPDX-License-Identifier: Apache-2.0
# How all code of the project is compiled.
set(CMAKE_CXX_STANDARD 17)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_C_STANDARD 11)
set(CMAKE_C_STANDARD_REQUIRED ON)
set(CMAKE_C_EXTENSIONS OFF)
set(CMAKE_POSITION_INDEPENDENT_CODE ON)
set(CMAKE_CXX_VISIBILITY_PRESET hidden)
set(CMAKE_C_VISIBILITY_PRESET hidden)
set(CMAKE_VISIBILITY_INLINES_HIDDEN ON)
set(CMAKE_EXPORT_COMPILE_COMMANDS ON)

add_compile_options(-Wall -Wextra -Wpedantic -Wshadow -Wconversion -Werror)
if(CMAKE_CXX_COMPILER_ID MATCHES Clang)
  add_compile_options(-Wno-sign-conversion)  # part of clang's -Wconversion, not of GCC's
endif()
add_compile_definitions(_GNU_SOURCE)

# Objects of an earlier build are used again where ccache is installed.
find_program(VELD_CCACHE ccache)
mark_as_advanced(VELD_CCACHE)
foreach(language C CXX)
  if(VELD_CCACHE AND NOT DEFINED CMAKE_${language}_COMPILER_LAUNCHER)
    set(CMAKE_${language}_COMPILER_LAUNCHER ${VELD_CCACHE})
  endif()
endforeach()

# An installed library finds its neighbours wherever the tree is put; in the system's own folders the loader looks
# anyway.
if(NOT CMAKE_INSTALL_PREFIX MATCHES "^/usr/?$" AND NOT DEFINED CMAKE_INSTALL_RPATH)
  set(CMAKE_INSTALL_RPATH $ORIGIN)
endif()

if(VELD_SANITIZE)
  add_compile_options(-fsanitize=${VELD_SANITIZE} -fno-omit-frame-pointer -fno-sanitize-recover=all)
  add_link_options(-fsanitize=${VELD_SANITIZE})
endif()
