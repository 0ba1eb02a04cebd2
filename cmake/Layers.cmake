# What every target of the house shares, and the one way to declare a layer.

find_package(PkgConfig REQUIRED)
find_package(Threads REQUIRED)
find_package(fmt REQUIRED)
find_package(spdlog REQUIRED)

add_library(house INTERFACE)
target_include_directories(house INTERFACE ${PROJECT_SOURCE_DIR})
target_compile_options(house INTERFACE -Wall -Wextra -Wno-missing-field-initializers -Wnon-virtual-dtor
                       -Wimplicit-fallthrough -Werror)
if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
  # g++ 12 reports false positives in optimised builds: of restrict where strings are put together, of uninitialised
  # members in moved optionals.
  target_compile_options(house INTERFACE -Wshadow=local -Wno-restrict -Wno-maybe-uninitialized)
else()
  # Daily work is done with g++, which doesn't have this warning.
  target_compile_options(house INTERFACE -Wno-unused-private-field)
endif()
target_link_libraries(house INTERFACE Threads::Threads)
if(TAVRIND_SANITIZE)
  target_compile_options(house INTERFACE -fsanitize=${TAVRIND_SANITIZE} -fno-omit-frame-pointer -fno-sanitize-recover=all)
  target_link_options(house INTERFACE -fsanitize=${TAVRIND_SANITIZE})
  if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
    # g++ 12 reports false positives in the standard library under instrumentation.
    target_compile_options(house INTERFACE -Wno-stringop-overflow -Wno-tsan)
  endif()
endif()
if(TAVRIND_FUZZ)
  target_compile_options(house INTERFACE -fsanitize=fuzzer-no-link)
  # clang 19 takes std::expected from libstdc++ 12 only with concepts at their final number.
  # libstdc++ 12 uses a function of its own that it calls deprecated, under std::stable_sort; g++ still warns of ours.
  target_compile_options(house INTERFACE -D__cpp_concepts=202002L -Wno-builtin-macro-redefined -Wno-deprecated-declarations)
endif()

# layer(<name> [layers below]): a static library of every .cpp in the calling folder.
function(layer name)
  file(GLOB sources CONFIGURE_DEPENDS ${CMAKE_CURRENT_SOURCE_DIR}/*.cpp)
  list(FILTER sources EXCLUDE REGEX "/main\\.cpp$")
  add_library(${name} STATIC ${sources})
  target_link_libraries(${name} PUBLIC house ${ARGN})
endfunction()
