# Warnings, sanitizers and the shape of our targets, in one place.

find_program(HALVOX_CCACHE ccache)
if(HALVOX_CCACHE)
  set(CMAKE_C_COMPILER_LAUNCHER ${HALVOX_CCACHE})
  set(CMAKE_CXX_COMPILER_LAUNCHER ${HALVOX_CCACHE})
endif()

add_library(halvox_flags INTERFACE)
target_compile_options(halvox_flags INTERFACE
  -Werror -Wall -Wextra -Wshadow
  $<$<COMPILE_LANGUAGE:CXX>:-Wconversion -Wnon-virtual-dtor>
  $<$<AND:$<COMPILE_LANGUAGE:CXX>,$<CXX_COMPILER_ID:Clang>>:-Wthread-safety>)
target_include_directories(halvox_flags INTERFACE ${CMAKE_SOURCE_DIR})

if(HALVOX_SANITIZE)
  add_compile_options(-fsanitize=${HALVOX_SANITIZE} -fno-sanitize-recover=all -fno-omit-frame-pointer)
  add_link_options(-fsanitize=${HALVOX_SANITIZE})
  if(HALVOX_SANITIZE MATCHES "thread")
    add_compile_options(-Wno-tsan)
  endif()
endif()
if(HALVOX_FUZZ)
  add_compile_options(-fsanitize=fuzzer-no-link)
endif()

# halvox_library(<name> SOURCES <files> [DEPENDS <targets>])
function(halvox_library name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPENDS" ${ARGN})
  add_library(${name} STATIC ${ARG_SOURCES})
  target_link_libraries(${name} PUBLIC ${ARG_DEPENDS} PRIVATE halvox_flags)
  target_include_directories(${name} PUBLIC ${CMAKE_SOURCE_DIR})
endfunction()

# halvox_program(<name> SOURCES <files> [DEPENDS <targets>])
function(halvox_program name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPENDS" ${ARGN})
  add_executable(${name} ${ARG_SOURCES})
  target_link_libraries(${name} PRIVATE ${ARG_DEPENDS} halvox_flags)
endfunction()

# halvox_test(<name> SOURCES <files> [DEPENDS <targets>] [LABELS <labels>])
# A GoogleTest program whose tests CTest lists one by one. Its tests have the label `unit` unless
# others are given; tests with the label `concurrent` are run under ThreadSanitizer too.
function(halvox_test name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPENDS;LABELS" ${ARGN})
  if(HALVOX_FUZZ)
    return()
  endif()
  if(NOT ARG_LABELS)
    set(ARG_LABELS unit)
  endif()
  add_executable(${name} ${ARG_SOURCES})
  target_link_libraries(${name} PRIVATE ${ARG_DEPENDS} halvox_flags GTest::gmock GTest::gtest_main)
  include(GoogleTest)
  gtest_discover_tests(${name} DISCOVERY_MODE PRE_TEST
    PROPERTIES LABELS "${ARG_LABELS}" TIMEOUT 120)
endfunction()

# halvox_fuzzer(<name> SOURCES <files> [DEPENDS <targets>])
# A libFuzzer program with the `fuzz` preset; elsewhere the same entry point is linked with a driver
# that runs the files of the seed folder of that name as one ordinary test.
function(halvox_fuzzer name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPENDS" ${ARGN})
  set(seeds ${CMAKE_SOURCE_DIR}/tests/fuzz/seeds/${name})
  if(HALVOX_FUZZ)
    add_executable(${name} ${ARG_SOURCES})
    target_link_options(${name} PRIVATE -fsanitize=fuzzer)
  else()
    add_executable(${name} ${ARG_SOURCES} ${CMAKE_SOURCE_DIR}/tests/fuzz/SeedDriver.cpp)
    add_test(NAME fuzz_seeds.${name} COMMAND ${name} ${seeds})
    set_tests_properties(fuzz_seeds.${name} PROPERTIES LABELS unit TIMEOUT 120)
  endif()
  target_link_libraries(${name} PRIVATE ${ARG_DEPENDS} halvox_flags)
endfunction()
