# The options that all targets share, and the functions that declare a layer and a program.

find_package(PkgConfig REQUIRED)
find_package(Threads REQUIRED)
find_package(fmt REQUIRED)
find_package(spdlog REQUIRED)

add_library(house INTERFACE)
target_include_directories(house INTERFACE ${PROJECT_SOURCE_DIR})
# Warnings are errors in every build but the release build, which users make, perhaps with another compiler.
target_compile_options(house INTERFACE -Wall -Wextra -Wno-missing-field-initializers -Wnon-virtual-dtor
                       -Wimplicit-fallthrough $<$<NOT:$<CONFIG:Release>>:-Werror>)
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  # g++ 12 reports false positives of these in optimised and instrumented builds, most of them in the standard library, and
  # takes unnamed namespaces of sources that are compiled as one for those of a header.
  target_compile_options(house INTERFACE -Wshadow=local -Wno-restrict -Wno-array-bounds -Wno-stringop-overflow
                         -Wno-maybe-uninitialized -Wno-tsan -Wno-subobject-linkage)
else()
  # Checks the attributes of platform/base/Mutex.h. Daily work is done with g++, which doesn't have the other warning.
  target_compile_options(house INTERFACE -Wthread-safety -Wno-unused-private-field)
endif()
target_link_libraries(house INTERFACE Threads::Threads fmt::fmt)
find_program(MOLD mold)
if(MOLD)
  target_link_options(house INTERFACE -fuse-ld=mold)
endif()
if(NOT TAVRIND_SANITIZE)
  # As in Debian's packages. Symbols are still bound when they are first used: the daemon starts on demand.
  target_compile_options(house INTERFACE $<$<NOT:$<CONFIG:Debug>>:-D_FORTIFY_SOURCE=2> -fstack-protector-strong)
endif()
if(TAVRIND_SANITIZE)
  target_compile_options(house INTERFACE -fsanitize=${TAVRIND_SANITIZE} -fno-omit-frame-pointer -fno-sanitize-recover=all)
  target_link_options(house INTERFACE -fsanitize=${TAVRIND_SANITIZE})
endif()
if(TAVRIND_FUZZ)
  add_compile_options(-fsanitize=fuzzer-no-link) # per folder: compile_quickly() takes it back
endif()
if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
  # Without a timestamp the precompiled header is the same in every tree, so that ccache can cache the sources that use it.
  target_compile_options(house INTERFACE "SHELL:-Xclang -fno-pch-timestamp")
  # clang 19 accepts libstdc++ 12's std::expected only with the final value of __cpp_concepts.
  # libstdc++ 12 uses a function in std::stable_sort that it declares deprecated; g++ still warns about deprecated functions.
  target_compile_options(house INTERFACE -D__cpp_concepts=202002L -Wno-builtin-macro-redefined -Wno-deprecated-declarations)
endif()

# precompile(<name> [headers…]): the standard headers that most sources include, and the given ones, compiled once for all targets of
# this folder and those below: parsing them takes half of the time to compile a source. They contain no header of the project, so
# that a changed header recompiles only the sources that include it.
function(precompile name)
  add_library(${name} OBJECT ${PROJECT_SOURCE_DIR}/cmake/precompiled.cpp)
  target_link_libraries(${name} PRIVATE house)
  target_precompile_headers(${name} PRIVATE
    <algorithm> <array> <atomic> <chrono> <cstdint> <deque> <expected> <filesystem> <functional> <map> <memory> <mutex>
    <optional> <set> <span> <string> <string_view> <tuple> <unordered_map> <utility> <variant> <vector> <fmt/format.h> ${ARGN})
  set(PRECOMPILED ${name} PARENT_SCOPE)
endfunction()
precompile(house_headers)

# compile_quickly(<name> [headers…]): precompiles headers for the targets of this folder and those below, none of which is the code
# under test of a fuzz target. With sanitizers they are built without optimisation and without the fuzzer's coverage counters:
# compiling them takes a third of the time.
macro(compile_quickly)
  if(TAVRIND_SANITIZE)
    add_compile_options(-O0 $<$<BOOL:${TAVRIND_FUZZ}>:-fno-sanitize=fuzzer-no-link>)
  endif()
  precompile(${ARGV})
endmacro()

# house_library(<name> <sources>…) and house_program(<name> <sources>…): a target with the options of the project.
function(house_library name)
  add_library(${name} STATIC ${ARGN})
  target_link_libraries(${name} PUBLIC house)
  target_precompile_headers(${name} REUSE_FROM ${PRECOMPILED})
endfunction()
function(house_program name)
  add_executable(${name} ${ARGN})
  target_link_libraries(${name} PRIVATE house)
  target_precompile_headers(${name} REUSE_FROM ${PRECOMPILED})
endfunction()

# layer(<name> [layers below]): a static library of every .cpp in the calling folder.
function(layer name)
  file(GLOB sources CONFIGURE_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/*.cpp)
  list(FILTER sources EXCLUDE REGEX "/main\\.cpp$")
  house_library(${name} ${sources})
  target_link_libraries(${name} PUBLIC ${ARGN})
endfunction()
