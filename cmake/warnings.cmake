# Warnings are errors in our own targets; third-party headers are included as
# system headers and stay quiet.
function(mokuto_warnings target)
  target_compile_options(${target} PRIVATE
    -Wall -Wextra -Wpedantic -Wconversion -Wsign-conversion -Wshadow
    -Wnon-virtual-dtor -Woverloaded-virtual -Werror)
  if(CMAKE_CXX_COMPILER_ID MATCHES "Clang")
    target_compile_options(${target} PRIVATE -Wnull-dereference)
  endif()
  # g++ 12 reports null dereferences inside libstdc++'s std::string at -O3; it is only
  # trusted from clang.
  if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
    # False positives of g++ 12 in std::variant, std::function and std::string internals.
    target_compile_options(${target} PRIVATE -Wno-maybe-uninitialized -Wno-dangling-reference -Wno-restrict)
  endif()
endfunction()

# A unit-test executable registered with CTest.
function(mokuto_test name)
  cmake_parse_arguments(T "" "" "SOURCES;LIBS;PROPERTIES" ${ARGN})
  add_executable(${name} ${T_SOURCES})
  mokuto_warnings(${name})
  target_link_libraries(${name} PRIVATE ${T_LIBS} GTest::gmock GTest::gtest_main)
  # The framework's threads keep normal scheduling in tests, unless a test asks.
  gtest_discover_tests(${name} NO_PRETTY_VALUES DISCOVERY_TIMEOUT 60
    PROPERTIES TIMEOUT 120 ENVIRONMENT KO_REALTIME_PRIORITY=0 ${T_PROPERTIES})
endfunction()
