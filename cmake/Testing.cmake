# GoogleTest set-up shared by the per-area test binaries.
find_package(GTest REQUIRED)
include(GoogleTest)

# sorvel_add_test(<name> SOURCES <files...> [LIBS <targets...>])
# One test binary per area; every test case becomes a CTest test.
function(sorvel_add_test name)
  cmake_parse_arguments(ARG "" "" "SOURCES;LIBS" ${ARGN})
  add_executable(${name} ${ARG_SOURCES})
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR})
  target_link_libraries(${name} PRIVATE ${ARG_LIBS} GTest::gtest
                        GTest::gmock GTest::gtest_main)
  gtest_discover_tests(${name} DISCOVERY_MODE PRE_TEST
                       PROPERTIES LABELS unit)
endfunction()
