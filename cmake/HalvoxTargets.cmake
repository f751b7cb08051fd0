# Warnings, sanitizers and the functions that define our targets, in one place.

find_program(HALVOX_CCACHE ccache)
if(HALVOX_CCACHE)
  set(CMAKE_C_COMPILER_LAUNCHER ${HALVOX_CCACHE})
  set(CMAKE_CXX_COMPILER_LAUNCHER ${HALVOX_CCACHE})
endif()

# Package builds turn this off: other compilers and hardening options cause warnings that we have not
# seen.
option(HALVOX_WERROR "Treat warnings as errors" ON)
add_library(halvox_flags INTERFACE)
target_compile_options(halvox_flags INTERFACE
  $<$<BOOL:${HALVOX_WERROR}>:-Werror> -Wall -Wextra -Wshadow
  $<$<COMPILE_LANGUAGE:CXX>:-Wconversion -Wnon-virtual-dtor>
  $<$<AND:$<COMPILE_LANGUAGE:CXX>,$<CXX_COMPILER_ID:Clang>>:-Wthread-safety>)
# GCC 12 reports overruns inside its own std::string when it optimises. clang and the sanitizers
# check for real overruns.
target_compile_options(halvox_flags INTERFACE
  $<$<CXX_COMPILER_ID:GNU>:-Wno-array-bounds -Wno-restrict -Wno-stringop-overflow -Wno-stringop-overread>)
target_include_directories(halvox_flags INTERFACE ${CMAKE_SOURCE_DIR})

if(HALVOX_SANITIZE)
  add_compile_options(-fsanitize=${HALVOX_SANITIZE} -fno-sanitize-recover=all -fno-omit-frame-pointer)
  if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
    add_compile_options(-fsanitize-ignorelist=${CMAKE_SOURCE_DIR}/cmake/sanitizer-ignorelist.txt)
  endif()
  add_link_options(-fsanitize=${HALVOX_SANITIZE})
endif()
# A test that runs longer counts as one that hangs. Sanitized programs are several times slower.
if(HALVOX_SANITIZE)
  set(HALVOX_UNIT_TEST_SECONDS 480)
  set(HALVOX_SYSTEM_TEST_SECONDS 900)
else()
  set(HALVOX_UNIT_TEST_SECONDS 120)
  set(HALVOX_SYSTEM_TEST_SECONDS 300)
endif()

# `ctest --parallel N` fills N slots. A system test mostly waits for other programs and takes one slot;
# a test that computes takes three. Six slots keep two processors busy: with four, system tests alone
# left more than half of them idle.
set(HALVOX_BUSY_TEST_SLOTS 3)

# What guides the fuzzers: code in the libraries and in the fuzzers that records where it has been.
# Tests are built without this, because it would only slow down their compilation and their runs.
add_library(halvox_fuzzed INTERFACE)
if(HALVOX_FUZZ)
  target_compile_options(halvox_fuzzed INTERFACE -fsanitize=fuzzer-no-link)
endif()

# The headers that nearly every source includes, compiled once: one set for libraries, one for
# tests. The clang preset does not use them, so that it finds sources with a missing include.
set(halvox_common_headers
  <algorithm> <atomic> <chrono> <cstdint> <filesystem> <functional> <map> <memory> <mutex> <optional>
  <span> <string> <string_view> <thread> <unordered_map> <utility> <variant> <vector>)
file(GENERATE OUTPUT ${CMAKE_BINARY_DIR}/precompiled/main.cpp CONTENT "int main() {}\n")
add_library(halvox_precompiled STATIC EXCLUDE_FROM_ALL ${CMAKE_BINARY_DIR}/precompiled/main.cpp)
target_precompile_headers(halvox_precompiled PRIVATE ${halvox_common_headers})
target_link_libraries(halvox_precompiled PRIVATE halvox_flags halvox_fuzzed)
add_executable(halvox_precompiled_test EXCLUDE_FROM_ALL ${CMAKE_BINARY_DIR}/precompiled/main.cpp)
target_precompile_headers(halvox_precompiled_test PRIVATE
  ${halvox_common_headers} <gmock/gmock.h> <gtest/gtest.h>)
target_link_libraries(halvox_precompiled_test PRIVATE halvox_flags GTest::gmock)

# With the preset `tidy`, clang-tidy reads each source that is compiled. Tests and their helpers,
# fakes and benchmarks are skipped, as in scripts/check.
option(HALVOX_TIDY "Run clang-tidy on each source that is compiled (clang only)" OFF)
function(halvox_tidy name)
  file(RELATIVE_PATH folder ${CMAKE_SOURCE_DIR} ${CMAKE_CURRENT_SOURCE_DIR})
  if(HALVOX_TIDY AND NOT "${folder}/" MATCHES "^(bench|tests|platform/fake)/|testing/"
      AND NOT name MATCHES "_(testing|test_service|test_server)$")
    set_target_properties(${name} PROPERTIES CXX_CLANG_TIDY "clang-tidy;--quiet")
  endif()
endfunction()

# Compile several sources of a target as one. This halves the time of a whole build, and more than
# doubles the time of a build after one change. The presets for daily work leave it off.
option(HALVOX_UNITY "Compile several sources of a target as one" OFF)
# A unit includes its sources. GCC takes these for headers, in which a member of a type from an
# unnamed namespace would be an error.
if(HALVOX_UNITY)
  target_compile_options(halvox_flags INTERFACE
    $<$<COMPILE_LANG_AND_ID:CXX,GNU>:-Wno-subobject-linkage>)
endif()
function(halvox_unity name)
  set_property(GLOBAL APPEND PROPERTY HALVOX_UNITY_TARGETS ${name})
endfunction()

# Plans the units when all targets are known: sources that would collide stay apart.
function(halvox_plan_units)
  get_property(targets GLOBAL PROPERTY HALVOX_UNITY_TARGETS)
  if(NOT HALVOX_UNITY OR NOT targets)
    return()
  endif()
  find_program(HALVOX_PYTHON NAMES python3 PATHS /usr/bin NO_DEFAULT_PATH REQUIRED)
  set(lines "")
  foreach(target ${targets})
    set_target_properties(${target} PROPERTIES UNITY_BUILD ON UNITY_BUILD_MODE GROUP)
    get_target_property(folder ${target} SOURCE_DIR)
    get_target_property(sources ${target} SOURCES)
    foreach(source ${sources})
      cmake_path(ABSOLUTE_PATH source BASE_DIRECTORY ${folder} NORMALIZE)
      if(source MATCHES "\\.cpp$" AND EXISTS ${source})
        string(APPEND lines "${target}\t${source}\n")
      endif()
    endforeach()
  endforeach()
  file(WRITE ${CMAKE_BINARY_DIR}/units/sources.txt "${lines}")
  execute_process(COMMAND ${HALVOX_PYTHON} ${CMAKE_SOURCE_DIR}/scripts/lib/source_units.py
    WORKING_DIRECTORY ${CMAKE_SOURCE_DIR}
    INPUT_FILE ${CMAKE_BINARY_DIR}/units/sources.txt
    OUTPUT_FILE ${CMAKE_BINARY_DIR}/units/groups.cmake
    COMMAND_ERROR_IS_FATAL ANY)
  include(${CMAKE_BINARY_DIR}/units/groups.cmake)
endfunction()

# halvox_library(<name> SOURCES <files> [DEPENDS <targets>])
function(halvox_library name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPENDS" ${ARGN})
  add_library(${name} STATIC ${ARG_SOURCES})
  target_link_libraries(${name} PUBLIC ${ARG_DEPENDS} PRIVATE halvox_flags halvox_fuzzed)
  target_include_directories(${name} PUBLIC ${CMAKE_SOURCE_DIR})
  target_precompile_headers(${name} REUSE_FROM halvox_precompiled)
  halvox_unity(${name})
  halvox_tidy(${name})
endfunction()

# halvox_program(<name> SOURCES <files> [DEPENDS <targets>])
function(halvox_program name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPENDS" ${ARGN})
  add_executable(${name} ${ARG_SOURCES})
  target_link_libraries(${name} PRIVATE ${ARG_DEPENDS} halvox_flags)
  halvox_tidy(${name})
endfunction()

# halvox_module(<file> SOURCES <files> [PARTS <targets>] [DEPENDS <targets>]) A library of that file
# name which the programs load when they need it. In the build it is in the directory of the
# programs; when installed, in the library directory. It holds its sources and the objects of PARTS.
# What these use of our other libraries is not linked again: the module finds it in the program.
# State that must exist once in a process, such as the installed services, therefore exists once.
function(halvox_module file)
  cmake_parse_arguments(ARG "" "" "SOURCES;PARTS;DEPENDS" ${ARGN})
  list(TRANSFORM ARG_PARTS REPLACE "(.+)" "$<TARGET_OBJECTS:\\1>" OUTPUT_VARIABLE objects)
  add_library(${file} MODULE
    ${ARG_SOURCES} ${CMAKE_SOURCE_DIR}/platform/linux/modules/ModuleVersion.c ${objects})
  target_link_libraries(${file} PRIVATE ${ARG_DEPENDS} halvox_flags)
  target_compile_definitions(${file} PRIVATE HALVOX_VERSION="${PROJECT_VERSION}")
  set_target_properties(${file} PROPERTIES
    PREFIX "" LIBRARY_OUTPUT_DIRECTORY ${CMAKE_RUNTIME_OUTPUT_DIRECTORY})
  install(TARGETS ${file} LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}/halvox)
endfunction()

# halvox_loads_modules(<program>)
# Gives modules what they use of our libraries: links the whole of these libraries, also what the
# program itself does not use, and exports our own names, which are a small part of all names.
function(halvox_loads_modules program)
  target_link_options(${program} PRIVATE
    -Wl,--dynamic-list=${CMAKE_SOURCE_DIR}/platform/linux/modules/exported-names.txt)
  set_target_properties(${program} PROPERTIES
    LINK_DEPENDS ${CMAKE_SOURCE_DIR}/platform/linux/modules/exported-names.txt
    LINK_LIBRARY_OVERRIDE
      "WHOLE_ARCHIVE,halvox_platform,halvox_base,halvox_store,halvox_drivers")
endfunction()

# The tests that ThreadSanitizer runs too.
add_custom_target(halvox_concurrent_tests)

# halvox_test(<name> SOURCES <files> [DEPENDS <targets>] [LABELS <labels>])
# A GoogleTest program. CTest lists its tests one by one, or only the program in a build with a
# sanitizer. They have the label `unit` unless other labels are given; tests with the label
# `concurrent` also run under ThreadSanitizer.
function(halvox_test name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPENDS;LABELS" ${ARGN})
  if(NOT ARG_LABELS)
    set(ARG_LABELS unit)
  endif()
  add_executable(${name} ${ARG_SOURCES})
  target_link_libraries(${name} PRIVATE ${ARG_DEPENDS} halvox_flags GTest::gmock GTest::gtest_main)
  target_precompile_headers(${name} REUSE_FROM halvox_precompiled_test)
  halvox_unity(${name})
  if("concurrent" IN_LIST ARG_LABELS)
    add_dependencies(halvox_concurrent_tests ${name})
  endif()
  # Labels become one, because the discovery of tests keeps only the first of a list. `ctest -L`
  # finds it by any of its parts: unit-concurrent.
  string(REPLACE ";" "-" labels "${ARG_LABELS}")
  set(properties LABELS "${labels}" TIMEOUT ${HALVOX_UNIT_TEST_SECONDS}
    PROCESSORS ${HALVOX_BUSY_TEST_SLOTS})
  if(HALVOX_SANITIZE)
    # A sanitized program takes a tenth of a second to start, which is longer than most tests.
    add_test(NAME ${name} COMMAND ${name} --gtest_brief=1)
    set_tests_properties(${name} PROPERTIES ${properties})
  else()
    include(GoogleTest)
    gtest_discover_tests(${name} DISCOVERY_MODE PRE_TEST PROPERTIES ${properties})
  endif()
endfunction()

# halvox_fuzzer(<name> SOURCES <files> [DEPENDS <targets>])
# A libFuzzer program with the `asan` preset; elsewhere the same entry point is linked with a driver.
# Both run the files of the seed folder of that name as one ordinary test.
function(halvox_fuzzer name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPENDS" ${ARGN})
  set(seeds ${CMAKE_SOURCE_DIR}/tests/fuzz/seeds/${name})
  if(HALVOX_FUZZ)
    add_executable(${name} ${ARG_SOURCES})
    target_link_options(${name} PRIVATE -fsanitize=fuzzer)
    add_test(NAME fuzz_seeds.${name} COMMAND ${name} -runs=0 ${seeds})
  else()
    add_executable(${name} ${ARG_SOURCES} ${CMAKE_SOURCE_DIR}/tests/fuzz/SeedDriver.cpp)
    add_test(NAME fuzz_seeds.${name} COMMAND ${name} ${seeds})
  endif()
  set_tests_properties(fuzz_seeds.${name} PROPERTIES
    LABELS unit TIMEOUT ${HALVOX_UNIT_TEST_SECONDS} PROCESSORS ${HALVOX_BUSY_TEST_SLOTS})
  target_link_libraries(${name} PRIVATE ${ARG_DEPENDS} halvox_flags halvox_fuzzed)
endfunction()
