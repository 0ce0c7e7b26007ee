# Helpers that register tests. In a TSan build only tests marked THREADED are
# built and registered, which keeps that build short.

# alertmod_unit_tests(<library> TESTS ... [THREADED] [LIBS ...])
# Builds the TESTS sources (beside the caller) into <library>_test, linked with
# <library> and GoogleMock, and registers each test case with CTest.
function(alertmod_unit_tests library)
  cmake_parse_arguments(ARG "THREADED" "" "TESTS;LIBS" ${ARGN})
  if(ALERTMOD_SANITIZE STREQUAL "thread" AND NOT ARG_THREADED)
    return()
  endif()
  # Test sources named *_windows_test.cpp check Windows behaviour and are
  # built for Windows only.
  if(WIN32)
    list(REMOVE_ITEM ARG_TESTS ${ALERTMOD_WINDOWS_SKIPPED_TESTS})
  else()
    list(FILTER ARG_TESTS EXCLUDE REGEX "_windows_test\\.cpp$")
  endif()
  if(NOT ARG_TESTS)
    return()
  endif()
  set(target ${library}_test)
  add_executable(${target} ${ARG_TESTS})
  target_link_libraries(${target} PRIVATE ${library} ${ARG_LIBS} alertmod_test_support_unit
                        GTest::gmock GTest::gtest_main Threads::Threads)
  set(labels unit)
  if(ARG_THREADED)
    list(APPEND labels threaded)
  endif()
  # One CTest test per case, as on Linux: the cases of a program rely on
  # running in a process of their own. Under Wine the first listing also
  # creates the Wine prefix.
  set(discovery_timeout 5)
  set(filter "*")
  if(WIN32)
    set(discovery_timeout 60)
    list(JOIN ALERTMOD_WINDOWS_SKIPPED_CASES ":" skipped)
    set(filter "*-${skipped}")
  endif()
  gtest_discover_tests(${target} DISCOVERY_MODE PRE_TEST DISCOVERY_TIMEOUT ${discovery_timeout}
                       TEST_FILTER ${filter} PROPERTIES LABELS "${labels}" TIMEOUT 120)
endfunction()

# alertmod_integration_test(<name> SOURCES ... [THREADED] [LABELS ...])
# A test program that drives the module through the reference host.
function(alertmod_integration_test name)
  cmake_parse_arguments(ARG "THREADED" "" "SOURCES;LABELS;LIBS" ${ARGN})
  if(ALERTMOD_SANITIZE STREQUAL "thread" AND NOT ARG_THREADED)
    return()
  endif()
  add_executable(${name} ${ARG_SOURCES})
  target_link_libraries(${name} PRIVATE alertmod_test_support ${ARG_LIBS}
                        GTest::gmock GTest::gtest_main Threads::Threads)
  add_dependencies(${name} alertmod_testing alertmod)
  set(labels integration ${ARG_LABELS})
  if(ARG_THREADED)
    list(APPEND labels threaded)
  endif()
  gtest_discover_tests(${name} DISCOVERY_MODE PRE_TEST
                       PROPERTIES LABELS "${labels}" TIMEOUT 300)
endfunction()

# alertmod_header_root(<library> <folder>)
# Sources name headers from the project root ("alertmod/<subsystem>/x.h",
# "host/x.h"). Each library gets an include directory of its own holding one
# link to its folder under that folder's path from the root, so that a
# library finds the headers of itself and of the libraries it links, and no
# others: an include against the layers fails to compile.
function(alertmod_header_root library folder)
  file(RELATIVE_PATH path ${PROJECT_SOURCE_DIR} ${folder})
  get_filename_component(parent ${path} DIRECTORY)
  set(root ${CMAKE_BINARY_DIR}/include/${library})
  file(MAKE_DIRECTORY ${root}/${parent})
  file(CREATE_LINK ${folder} ${root}/${path} SYMBOLIC)
  target_include_directories(${library} PUBLIC ${root})
endfunction()

# alertmod_subsystem(<library> SOURCES ... [TESTS ...] [TEST_LIBS ...]
#                    [DEPS ...] [THREADED])
# A subsystem's static library from its SOURCES, and its unit tests from its
# TESTS, linked also with TEST_LIBS. DEPS names exactly the libraries whose headers the sources include;
# scripts/check-layering keeps those includes pointing down the layers.
function(alertmod_subsystem library)
  cmake_parse_arguments(ARG "THREADED" "" "SOURCES;TESTS;TEST_LIBS;DEPS" ${ARGN})
  add_library(${library} STATIC ${ARG_SOURCES})
  alertmod_header_root(${library} ${CMAKE_CURRENT_SOURCE_DIR})
  target_link_libraries(${library} PUBLIC alertmod_records ${ARG_DEPS})
  if(ALERTMOD_FUZZ)
    # Coverage feedback for the fuzz targets that link this library.
    target_compile_options(${library} PRIVATE -fsanitize=fuzzer-no-link)
  endif()
  if(ARG_THREADED)
    alertmod_unit_tests(${library} THREADED TESTS ${ARG_TESTS} LIBS ${ARG_TEST_LIBS})
  else()
    alertmod_unit_tests(${library} TESTS ${ARG_TESTS} LIBS ${ARG_TEST_LIBS})
  endif()
endfunction()

# alertmod_fuzz_target(<name> SOURCES ... LIBS ... [CORPUS <dir>])
# A libFuzzer target, built only in the clang ASan+UBSan build. scripts/fuzz
# runs every target for a bounded time with its seed corpus (a directory of
# files, relative to the caller's source directory).
function(alertmod_fuzz_target name)
  cmake_parse_arguments(ARG "" "CORPUS" "SOURCES;LIBS" ${ARGN})
  if(NOT ALERTMOD_FUZZ)
    return()
  endif()
  add_executable(${name} ${ARG_SOURCES})
  # Fuzz targets use the tests' support, named from the project root.
  target_include_directories(${name} PRIVATE ${PROJECT_SOURCE_DIR})
  target_compile_options(${name} PRIVATE -fsanitize=fuzzer)
  target_link_options(${name} PRIVATE -fsanitize=fuzzer)
  target_link_libraries(${name} PRIVATE ${ARG_LIBS})
  set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/fuzz)
  if(ARG_CORPUS)
    file(APPEND ${CMAKE_BINARY_DIR}/fuzz/targets.txt.new
         "${name} ${CMAKE_CURRENT_SOURCE_DIR}/${ARG_CORPUS}\n")
  else()
    file(APPEND ${CMAKE_BINARY_DIR}/fuzz/targets.txt.new "${name} -\n")
  endif()
endfunction()
