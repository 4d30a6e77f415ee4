# Build options and helpers shared by every component.

option(SKYVANE_BUILD_TESTS "Build the unit and integration tests" ON)
option(SKYVANE_BUILD_BENCH "Build the benchmarks" ON)
set(SKYVANE_SANITIZE "" CACHE STRING "Sanitizer build: empty, 'address' (ASan+UBSan) or 'thread' (TSan)")

if(SKYVANE_SANITIZE STREQUAL "address")
  add_compile_options(-fsanitize=address,undefined -fno-omit-frame-pointer -fno-sanitize-recover=undefined)
  add_link_options(-fsanitize=address,undefined)
elseif(SKYVANE_SANITIZE STREQUAL "thread")
  add_compile_options(-fsanitize=thread -fno-omit-frame-pointer)
  add_link_options(-fsanitize=thread)
elseif(NOT SKYVANE_SANITIZE STREQUAL "")
  message(FATAL_ERROR "SKYVANE_SANITIZE must be empty, 'address' or 'thread'")
endif()

# Fuzz targets (fuzz/): clang only, everything instrumented for libFuzzer with ASan+UBSan.
option(SKYVANE_FUZZ "Build the libFuzzer targets (needs clang)" OFF)
if(SKYVANE_FUZZ)
  if(NOT CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
    message(FATAL_ERROR "SKYVANE_FUZZ needs clang: run fuzz/run.sh")
  endif()
  add_compile_options(-fsanitize=fuzzer-no-link,address,undefined -fno-omit-frame-pointer)
  add_link_options(-fsanitize=address,undefined)
endif()

# Warnings are errors in our own code; third-party headers come in as system headers.
function(skyvane_warnings target)
  target_compile_options(${target} PRIVATE -Wall -Wextra -Wpedantic -Werror)
endfunction()

# A shared library of ours with warnings. Its symbols stay visible: programs and
# the other libraries link it directly. The two libraries loaded at run time
# hide everything but their entry points in their own set-up (libCorvell.so by
# visibility, libSkyvane.so by a version script as well).
function(skyvane_library target)
  add_library(${target} SHARED ${ARGN})
  skyvane_warnings(${target})
  set_target_properties(${target} PROPERTIES CXX_VISIBILITY_PRESET default)
endfunction()

# A GoogleTest executable registered with CTest. The shared test main creates the
# Qt application object, so message windows and timers work in every test.
function(skyvane_test name)
  cmake_parse_arguments(T "" "" "SOURCES;LIBS" ${ARGN})
  add_executable(${name} ${T_SOURCES})
  skyvane_warnings(${name})
  target_link_libraries(${name} PRIVATE skytest_main ${T_LIBS})
  add_test(NAME ${name} COMMAND ${name})
  set_tests_properties(${name} PROPERTIES TIMEOUT 300
    ENVIRONMENT "QT_QPA_PLATFORM=offscreen;SKYVANE_SOURCE_DIR=${CMAKE_SOURCE_DIR}")
endfunction()
