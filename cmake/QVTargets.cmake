# Options that every target of the project shares, and the two functions that define targets.

find_package(PkgConfig REQUIRED)
find_package(Threads REQUIRED)

add_library(qv_options INTERFACE)
target_include_directories(qv_options INTERFACE ${PROJECT_SOURCE_DIR})
target_compile_options(qv_options INTERFACE
  -Wall -Wextra -Wpedantic -Wshadow -Wconversion $<$<BOOL:${QV_WARNINGS_END_BUILD}>:-Werror>
  # Log lines and diagnostics name files from the project's root, wherever it was built.
  -ffile-prefix-map=${PROJECT_SOURCE_DIR}/=)
if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
  target_compile_options(qv_options INTERFACE $<$<COMPILE_LANGUAGE:CXX>:-Wthread-safety>)
endif()
if(QV_SANITIZE)
  target_compile_options(qv_options INTERFACE
    -fsanitize=${QV_SANITIZE} -fno-sanitize-recover=all -fno-omit-frame-pointer)
  target_link_options(qv_options INTERFACE -fsanitize=${QV_SANITIZE})
  if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU" AND CMAKE_CXX_COMPILER_VERSION VERSION_LESS 13)
    # In instrumented code this compiler takes sums of texts for overflows, depending on a literal's
    # length (a build folder's name is one), and the standard library's regular expressions for
    # uninitialised; the same sources are checked without instrumentation.
    target_compile_options(qv_options INTERFACE
      -Wno-array-bounds -Wno-restrict -Wno-stringop-overflow -Wno-maybe-uninitialized)
  endif()
endif()

# Defines a static library of all sources directly in the calling folder.
function(qv_library name)
  file(GLOB sources CONFIGURE_DEPENDS *.cpp *.h)
  add_library(${name} STATIC ${sources})
  target_link_libraries(${name} PUBLIC qv_options ${ARGN})
endfunction()

# Defines a test program of all *Test.cpp (and helper) sources directly in the calling folder, and
# its tests, with that label: "unit" for tests that start no processes of the service, "e2e" for
# those that do, "soak" for all of it at once, "cli" for what is installed.
function(qv_test_program name label)
  file(GLOB sources CONFIGURE_DEPENDS *.cpp *.h)
  add_executable(${name} ${sources})
  target_link_libraries(${name} PRIVATE qv_options GTest::gmock_main ${ARGN})
  # What is tested is optimised, as ever; tests themselves are compiled in two thirds of the time so.
  target_compile_options(${name} PRIVATE $<$<CONFIG:Debug>:-O0>)
  target_precompile_headers(${name} PRIVATE <gmock/gmock.h> <gtest/gtest.h>)
  # Under a sanitizer, or on a busy machine, listing the tests takes its time too.
  gtest_discover_tests(${name} PROPERTIES LABELS ${label} TIMEOUT 300 DISCOVERY_TIMEOUT 120)
endfunction()
