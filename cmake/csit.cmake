# Helpers shared by the folder CMakeLists.

# csit_unit_test(NAME SOURCES... [LIBS libs...])
# One GoogleTest executable registered with CTest; links the internal
# gateway/command objects and the platform library.
find_package(GTest QUIET)
function(csit_unit_test name)
  cmake_parse_arguments(T "" "" "SOURCES;LIBS;LABELS" ${ARGN})
  if(NOT T_SOURCES)
    set(T_SOURCES ${T_UNPARSED_ARGUMENTS})
  endif()
  add_executable(${name} ${T_SOURCES})
  target_include_directories(${name} PRIVATE ${CMAKE_SOURCE_DIR}/tests/unit)
  target_link_libraries(${name} PRIVATE ${T_LIBS} GTest::gtest GTest::gmock GTest::gtest_main Threads::Threads)
  add_test(NAME ${name} COMMAND ${name})
  set_tests_properties(${name} PROPERTIES ENVIRONMENT "CSIT_SOURCE_DIR=${CMAKE_SOURCE_DIR};CSIT_BINARY_DIR=${CMAKE_BINARY_DIR}")
  if(T_LABELS)
    set_tests_properties(${name} PROPERTIES LABELS "${T_LABELS}")
  endif()
endfunction()

# csit_fuzzer(NAME SOURCES... LIBS ...): a libFuzzer target, built only with CSIT_FUZZ.
# Registered as a CTest test (label "fuzz") that runs for CSIT_FUZZ_SECONDS.
set(CSIT_FUZZ_SECONDS 30 CACHE STRING "seconds each fuzz target runs under ctest")
function(csit_fuzzer name)
  if(NOT CSIT_FUZZ)
    return()
  endif()
  cmake_parse_arguments(F "" "" "SOURCES;LIBS;CORPUS" ${ARGN})
  add_executable(${name} ${F_SOURCES})
  target_compile_options(${name} PRIVATE -fsanitize=fuzzer)
  target_link_options(${name} PRIVATE -fsanitize=fuzzer)
  target_link_libraries(${name} PRIVATE ${F_LIBS})
  set(corpus ${CMAKE_BINARY_DIR}/fuzz-corpus/${name})
  file(MAKE_DIRECTORY ${corpus})
  add_test(NAME ${name}
           COMMAND ${name} -max_total_time=${CSIT_FUZZ_SECONDS} -rss_limit_mb=4096 ${corpus} ${F_CORPUS})
  set_tests_properties(${name} PROPERTIES LABELS fuzz TIMEOUT 600)
endfunction()
