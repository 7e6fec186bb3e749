# What every target of the house shares: warnings, sanitizers, and the three kinds of target.

find_package(PkgConfig REQUIRED)
find_package(ICU REQUIRED COMPONENTS uc i18n)
find_package(fmt REQUIRED)
find_package(nlohmann_json REQUIRED)
find_package(leveldb REQUIRED)
find_package(SQLite3 REQUIRED)
find_package(Threads REQUIRED)
pkg_check_modules(SYSTEMD REQUIRED IMPORTED_TARGET libsystemd)
pkg_check_modules(URIPARSER REQUIRED IMPORTED_TARGET liburiparser)

add_library(tallow_flags INTERFACE)
target_include_directories(tallow_flags INTERFACE ${CMAKE_SOURCE_DIR})
target_compile_options(
  tallow_flags INTERFACE -Wall -Wextra -Wpedantic -Wshadow)
if(CMAKE_CXX_COMPILER_ID STREQUAL "Clang")
  target_compile_options(tallow_flags INTERFACE -Wthread-safety -Wthread-safety-beta)
endif()
if(TALLOW_SANITIZE)
  target_compile_options(tallow_flags INTERFACE -fsanitize=${TALLOW_SANITIZE} -fno-omit-frame-pointer
                                                -fno-sanitize-recover=all)
  target_link_options(tallow_flags INTERFACE -fsanitize=${TALLOW_SANITIZE})
  if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
    # g++ sees uses of what is not set in instrumented library code where there are none.
    target_compile_options(tallow_flags INTERFACE -Wno-maybe-uninitialized)
  endif()
endif()

# tallow_library(NAME SOURCES ... DEPS ...): one static library a folder. DEPS are public, so that the
# linker sees only what a folder declares.
function(tallow_library name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPS" ${ARGN})
  add_library(${name} STATIC ${ARG_SOURCES})
  target_link_libraries(${name} PUBLIC tallow_flags ${ARG_DEPS})
  target_compile_options(${name} PRIVATE -Wconversion -Wno-sign-conversion)
  tallow_note_folder(${name})
endfunction()

function(tallow_program name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPS" ${ARGN})
  add_executable(${name} ${ARG_SOURCES})
  target_link_libraries(${name} PRIVATE tallow_flags ${ARG_DEPS})
  tallow_note_folder(${name})
endfunction()

# tallow_test(NAME SOURCES ... DEPS ...): one GoogleTest program; every case is a ctest of its own, so
# that they run in parallel.
function(tallow_test name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPS" ${ARGN})
  tallow_program(${name} SOURCES ${ARG_SOURCES} DEPS tallow_test_support ${ARG_DEPS})
  gtest_discover_tests(${name} DISCOVERY_MODE PRE_TEST PROPERTIES TIMEOUT 300)
endfunction()

# tallow_test_library(NAME SOURCES ... DEPS ...): what tests of several folders share.
function(tallow_test_library name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPS" ${ARGN})
  add_library(${name} STATIC ${ARG_SOURCES})
  target_link_libraries(${name} PUBLIC tallow_flags ${ARG_DEPS})
  tallow_note_folder(${name})
endfunction()

# tallow_benchmark(NAME ...): a Google Benchmark program.
function(tallow_benchmark name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPS" ${ARGN})
  tallow_program(${name} SOURCES ${ARG_SOURCES} DEPS benchmark::benchmark ${ARG_DEPS})
endfunction()

# tallow_fuzzer(NAME ...): a libFuzzer program; its seed corpus stands in fuzz/corpus/NAME.
function(tallow_fuzzer name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPS" ${ARGN})
  tallow_program(${name} SOURCES ${ARG_SOURCES} DEPS ${ARG_DEPS})
  target_link_options(${name} PRIVATE -fsanitize=fuzzer)
endfunction()
