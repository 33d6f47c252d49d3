# SPDX-License-Identifier: Apache-2.0
# The common settings of all targets: the language, the warnings, the sanitizers, and two functions so that a folder's
# CMakeLists.txt names only its files and its neighbours.

set(CMAKE_CXX_STANDARD 23)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_C_STANDARD 11)
set(CMAKE_EXPORT_COMPILE_COMMANDS ON)
set(CMAKE_POSITION_INDEPENDENT_CODE ON)

# ccache hashes a precompiled header's bytes; only with these settings does it cache objects that use one.
find_program(KESTO_CCACHE ccache)
if(KESTO_CCACHE)
  set(overlooked CCACHE_SLOPPINESS=pch_defines,time_macros,include_file_mtime,include_file_ctime)
  set(CMAKE_CXX_COMPILER_LAUNCHER ${CMAKE_COMMAND} -E env ${overlooked} ${KESTO_CCACHE})
  set(CMAKE_C_COMPILER_LAUNCHER ${CMAKE_CXX_COMPILER_LAUNCHER})
endif()

# In debug builds the standard library checks its callers, too, such as an index within bounds.
add_compile_definitions($<$<CONFIG:Debug>:_GLIBCXX_ASSERTIONS>)

# On processors of 32 bits, too, times go beyond 2038 and files beyond 2 GiB.
if(CMAKE_SIZEOF_VOID_P EQUAL 4)
  add_compile_definitions(_TIME_BITS=64 _FILE_OFFSET_BITS=64)
endif()

# Locks are annotated; clang proves that guarded data is used only while the lock is held. g++'s own <algorithm> uses
# deprecated functions, for which only clang warns; g++ itself warns of the project's uses.
add_compile_options(-Wall -Wextra -Wpedantic -Wshadow -Wimplicit-fallthrough $<$<BOOL:${KESTO_WERROR}>:-Werror>
                    $<$<COMPILE_LANGUAGE:CXX>:-Wnon-virtual-dtor> $<$<COMPILE_LANGUAGE:CXX>:-Wold-style-cast>
                    $<$<CXX_COMPILER_ID:Clang>:-Wthread-safety> $<$<CXX_COMPILER_ID:Clang>:-Wno-deprecated-declarations>)

# A build from another place gives the same files. Debug builds keep the places, so that a debugger finds the sources.
set(CMAKE_BUILD_RPATH_USE_ORIGIN ON)
add_compile_options("$<$<NOT:$<CONFIG:Debug>>:-ffile-prefix-map=${PROJECT_SOURCE_DIR}=.>"
                    "$<$<NOT:$<CONFIG:Debug>>:-ffile-prefix-map=${PROJECT_BINARY_DIR}=./build>")

# A program is linked only with those libraries of its layers that it uses.
add_link_options(-Wl,--as-needed)

# By default g++ collects garbage, often for little: without it compiling takes 7 % less time and at most 1 GiB.
add_compile_options($<$<CXX_COMPILER_ID:GNU>:--param=ggc-min-heapsize=1000000>)

# A sanitizer's report names functions and lines but no variables, so debug information leaves out variables.
if(KESTO_SANITIZE)
  add_compile_options(-fsanitize=${KESTO_SANITIZE} -fno-sanitize-recover=all -fno-omit-frame-pointer -g1
    $<$<CXX_COMPILER_ID:Clang>:-fsanitize-ignorelist=${PROJECT_SOURCE_DIR}/cmake/sanitizers-ignorelist.txt>)
  add_link_options(-fsanitize=${KESTO_SANITIZE})
endif()
if(KESTO_FUZZ)
  if(NOT CMAKE_CXX_COMPILER_ID STREQUAL Clang)
    message(FATAL_ERROR "KESTO_FUZZ needs clang, which brings the fuzzer: cmake --preset fuzz, or ./dev fuzz")
  endif()
  add_compile_options(-fsanitize=fuzzer-no-link)
endif()

# RapidJSON has an assignment that nothing uses and that assigns to constants. g++ overlooks it, clang does not: it
# gets a copy of that header in which the assignment is deleted.
if(CMAKE_CXX_COMPILER_ID STREQUAL Clang)
  find_path(KESTO_RAPIDJSON rapidjson/document.h REQUIRED)
  file(READ ${KESTO_RAPIDJSON}/rapidjson/document.h text)
  string(REPLACE "{ s = rhs.s; length = rhs.length; }" "= delete;" text "${text}")
  file(CONFIGURE OUTPUT for-clang/rapidjson/document.h CONTENT "${text}" @ONLY)
  include_directories(SYSTEM ${CMAKE_CURRENT_BINARY_DIR}/for-clang)
  add_compile_options("SHELL:-idirafter ${KESTO_RAPIDJSON}/rapidjson") # where its neighbours are
endif()

find_package(PkgConfig REQUIRED)
find_package(Threads REQUIRED)
find_package(fmt REQUIRED)

# kesto_headers: the headers of the standard library and of {fmt} that most sources use, compiled once for all layers.
# A precompiled header fits only sources with the same options, so a layer adds none of its own. Each source still names
# what it uses: clang-tidy reads all of them without precompiled headers.
# With optimization g++ warns of code in precompiled headers of the library as if it were the project's.
if(NOT CMAKE_BUILD_TYPE STREQUAL Debug)
  set(CMAKE_DISABLE_PRECOMPILE_HEADERS ON)
endif()
set(standard_headers
  <algorithm> <atomic> <chrono> <expected> <filesystem> <functional> <map> <memory> <optional> <span> <string>
  <string_view> <system_error> <thread> <utility> <vector> <fmt/format.h>)
add_library(kesto_headers STATIC ${CMAKE_CURRENT_BINARY_DIR}/headers.cpp)
file(CONFIGURE OUTPUT headers.cpp CONTENT "// A target needs a source: this one has only headers.\n")
target_link_libraries(kesto_headers PUBLIC fmt::fmt)
target_precompile_headers(kesto_headers PRIVATE ${standard_headers})

# kesto_layer(NAME SOURCES file... USES target...): the static library of one folder below src/.
function(kesto_layer name)
  cmake_parse_arguments(PARSE_ARGV 1 arg "" "" "SOURCES;USES;PRIVATE_USES")
  add_library(kesto_${name} STATIC ${arg_SOURCES})
  target_include_directories(kesto_${name} PUBLIC ${PROJECT_SOURCE_DIR}/src)
  target_link_libraries(kesto_${name} PUBLIC ${arg_USES} PRIVATE ${arg_PRIVATE_USES})
  target_precompile_headers(kesto_${name} REUSE_FROM kesto_headers)
endfunction()

# kesto_test_headers: the headers of the test libraries, compiled once for all test programs. A precompiled header only
# fits sources with the same options, so these are public: position-independent, with the same macros.
function(kesto_make_test_headers)
  file(CONFIGURE OUTPUT test_headers.cpp CONTENT "// A target needs a source: this one has only headers.\n")
  add_library(kesto_test_headers STATIC ${CMAKE_CURRENT_BINARY_DIR}/test_headers.cpp)
  target_link_libraries(kesto_test_headers PUBLIC GTest::gmock GTest::gtest rapidcheck_gtest fmt::fmt)
  target_compile_definitions(kesto_test_headers PUBLIC _REENTRANT)
  target_compile_options(kesto_test_headers PUBLIC -fPIC $<$<CXX_COMPILER_ID:GNU>:-fpch-preprocess>)
  target_precompile_headers(kesto_test_headers PRIVATE
    ${standard_headers} <gmock/gmock.h> <gtest/gtest.h> <rapidcheck/gtest.h>)
endfunction()

# kesto_test(NAME SOURCES file... [ALONE file...] USES target...): one GoogleTest program, each of its tests a ctest.
# With KESTO_TEST_BATCHES four sources are compiled at once, which takes half the time when all are compiled. Their names
# must then not collide; those of the sources that are ALONE may.
function(kesto_test name)
  cmake_parse_arguments(PARSE_ARGV 1 arg "" "" "SOURCES;ALONE;USES")
  list(APPEND arg_SOURCES ${arg_ALONE})
  add_executable(${name} ${arg_SOURCES})
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR}/tests)
  target_link_libraries(${name} PRIVATE ${arg_USES} kesto_test_headers GTest::gtest_main)
  target_precompile_headers(${name} REUSE_FROM kesto_test_headers)
  set_target_properties(${name} PROPERTIES UNITY_BUILD ${KESTO_TEST_BATCHES} UNITY_BUILD_BATCH_SIZE 4)
  set_source_files_properties(${arg_ALONE} PROPERTIES SKIP_UNITY_BUILD_INCLUSION ON)
  set(seconds 120)
  if(KESTO_SANITIZE OR CMAKE_CROSSCOMPILING) # a sanitizer or an emulator takes many times as long
    set(seconds 600)
  endif()
  set(left_out)
  if(NOT KESTO_SYSTEMD) # what only a build with it does, a test has in its name
    set(left_out TEST_FILTER -*ServiceManager*:*PassedSocket*)
  endif()
  gtest_discover_tests(${name} ${left_out} DISCOVERY_TIMEOUT 60 PROPERTIES TIMEOUT ${seconds})
endfunction()
