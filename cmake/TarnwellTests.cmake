# tarnwell_add_tests(NAME SOURCES a_test.cc ... LIBS lib ...)
# One test program per layer; every GoogleTest case becomes its own ctest entry.
include(GoogleTest)
function(tarnwell_add_tests name)
  cmake_parse_arguments(ARG "" "" "SOURCES;LIBS" ${ARGN})
  add_executable(${name} ${ARG_SOURCES})
  target_link_libraries(${name} PRIVATE ${ARG_LIBS} GTest::gtest GTest::gtest_main Threads::Threads)
  target_compile_definitions(${name} PRIVATE
      TARNWELL_EXTERNAL_FIXTURES="${TARNWELL_EXTERNAL_FIXTURES}"
      TARNWELL_BINARY_DIR="${CMAKE_BINARY_DIR}"
      TARNWELL_SOURCE_DIR="${CMAKE_SOURCE_DIR}")
  gtest_discover_tests(${name} DISCOVERY_MODE PRE_TEST DISCOVERY_TIMEOUT 60
                       PROPERTIES TIMEOUT 600)
endfunction()
