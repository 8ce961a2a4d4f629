# GoogleTest set-up shared by the per-area test binaries.
find_package(GTest REQUIRED)
include(GoogleTest)

# Cross builds run the tests under CMAKE_CROSSCOMPILING_EMULATOR; death tests
# re-run the binary through it (tests/test_main.cc), by absolute path.
set(SORVEL_TEST_PROPERTIES LABELS unit)
if(CMAKE_CROSSCOMPILING_EMULATOR)
  list(GET CMAKE_CROSSCOMPILING_EMULATOR 0 emulator_name)
  find_program(SORVEL_TEST_EMULATOR_PATH ${emulator_name} REQUIRED)
  set(emulator_command ${CMAKE_CROSSCOMPILING_EMULATOR})
  list(REMOVE_AT emulator_command 0)
  list(PREPEND emulator_command ${SORVEL_TEST_EMULATOR_PATH})
  list(JOIN emulator_command " " emulator_command)
  list(APPEND SORVEL_TEST_PROPERTIES ENVIRONMENT "SORVEL_TEST_EMULATOR=${emulator_command}")
endif()

# sorvel_add_test(<name> SOURCES <files...> [LIBS <targets...>])
# One test binary per area; every test case becomes a CTest test. All share
# tests/test_main.cc (threadsafe death tests).
function(sorvel_add_test name)
  cmake_parse_arguments(ARG "" "" "SOURCES;LIBS" ${ARGN})
  add_executable(${name} ${ARG_SOURCES} ${PROJECT_SOURCE_DIR}/tests/test_main.cc)
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR})
  target_link_libraries(${name} PRIVATE ${ARG_LIBS} GTest::gtest
                        GTest::gmock)
  gtest_discover_tests(${name} DISCOVERY_MODE PRE_TEST
                       PROPERTIES ${SORVEL_TEST_PROPERTIES})
endfunction()
