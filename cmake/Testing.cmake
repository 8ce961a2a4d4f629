# GoogleTest set-up shared by the per-area test binaries.
find_package(GTest REQUIRED)
include(GoogleTest)

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
                       PROPERTIES LABELS unit)
endfunction()
