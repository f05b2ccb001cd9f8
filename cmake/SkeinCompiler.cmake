# One set of flags for everything: C++20, every warning an error, a sanitizer on request.
set(CMAKE_CXX_STANDARD 20)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)

if(NOT CMAKE_BUILD_TYPE)
  set(CMAKE_BUILD_TYPE RelWithDebInfo)
endif()

set(SKEIN_SANITIZE "" CACHE STRING "Sanitizers, as -fsanitize= takes them")

option(SKEIN_WARNINGS_ARE_ERRORS "Stop at every warning" ON)
add_compile_options(-Wall -Wextra -Wpedantic)
if(SKEIN_WARNINGS_ARE_ERRORS)
  add_compile_options(-Werror)
endif()
if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
  add_compile_options(-Wthread-safety)
endif()
if(SKEIN_SANITIZE)
  # Line numbers are all that a sanitizer's report needs. Under clang, optimising these
  # builds doubles their compile time and saves no time overall.
  add_compile_options(-fsanitize=${SKEIN_SANITIZE} -fno-omit-frame-pointer -g1)
  if(NOT CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
    add_compile_options(-O1)
  endif()
  add_link_options(-fsanitize=${SKEIN_SANITIZE})
  if(SKEIN_SANITIZE MATCHES "undefined")
    add_compile_options(-fno-sanitize-recover=undefined)
  endif()
  if(SKEIN_SANITIZE MATCHES "thread")
    add_compile_options(-Wno-tsan)
  endif()
endif()

# skein_precompile(TARGET HEADERS...): reads the standard headers that nearly every file
# includes, and HEADERS, once for the target; this takes a third off a cold build. Files still
# include what they use: clang-tidy's preset reads them without.
option(SKEIN_PRECOMPILE "Read the most used headers once per target" ON)
function(skein_precompile target)
  if(NOT SKEIN_PRECOMPILE)
    return()
  endif()
  target_precompile_headers(${target} PRIVATE
    <algorithm> <array> <atomic> <cerrno> <chrono> <condition_variable> <cstdint> <cstring>
    <deque> <filesystem> <fstream> <functional> <map> <memory> <mutex> <optional> <set>
    <sstream> <string> <string_view> <thread> <tuple> <unordered_map> <unordered_set> <utility>
    <variant> <vector> ${ARGN})
  if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
    # So that ccache finds it again.
    target_compile_options(${target} PRIVATE "SHELL:-Xclang -fno-pch-timestamp")
  endif()
endfunction()

# skein_unity(TARGET SIZE): compiles SIZE files of the target as one where SKEIN_UNITY is on, so
# that the headers they share are read once. Names in unnamed namespaces must then differ within
# a target. Builds that start from nothing gain by it; a change to one file then costs its group.
option(SKEIN_UNITY "Compile files in groups" OFF)
function(skein_unity target size)
  set_target_properties(${target} PROPERTIES UNITY_BUILD ${SKEIN_UNITY} UNITY_BUILD_BATCH_SIZE ${size})
  if(SKEIN_UNITY AND CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
    # A class of one file may have members of that file's unnamed namespace: g++ takes a file in
    # a group for a header.
    target_compile_options(${target} PRIVATE -Wno-subobject-linkage)
  endif()
endfunction()
