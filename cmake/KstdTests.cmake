# How a test program of the tree is made.

find_package(GTest REQUIRED)
find_package(Threads REQUIRED)
include(GoogleTest)

# What every test may use: GoogleTest's main, the helpers in tests/support.
add_library(kstd_test_base INTERFACE)
target_link_libraries(kstd_test_base INTERFACE kstd_options GTest::gmock GTest::gtest_main)
# What is tested is optimised; optimising the tests would cost most of the build's time.
target_compile_options(kstd_test_base INTERFACE -O0 -g0)

# kstd_test_code(TARGETS...): code that only tests. A sanitizer checks what it calls; to check the tests
# themselves as well doubles the time that they take to build, so that can be switched off.
function(kstd_test_code)
    if(NOT KSTD_INSTRUMENT_TESTS)
        set_target_properties(${ARGN} PROPERTIES KSTD_PLAIN ON)
    endif()
endfunction()

# GoogleTest's headers and those of the standard library, compiled once for all test programs. For C++
# alone: some test programs have sources in C.
add_executable(kstd_test_headers "${CMAKE_SOURCE_DIR}/tests/support/GoogleTestHeaders.cpp")
kstd_test_code(kstd_test_headers)
target_link_libraries(kstd_test_headers PRIVATE kstd_test_base)
set(headers gmock/gmock.h gtest/gtest.h
    algorithm array chrono functional map memory optional set span string string_view utility variant vector)
list(TRANSFORM headers REPLACE "(.+)" "$<$<COMPILE_LANGUAGE:CXX>:<\\1$<ANGLE-R>>")
target_precompile_headers(kstd_test_headers PRIVATE ${headers})
target_compile_options(kstd_test_headers PRIVATE
    $<$<COMPILE_LANG_AND_ID:CXX,Clang>:-fpch-instantiate-templates>)

# kstd_test(NAME SOURCES... [LINK targets...] [LABELS label] [TIMEOUT seconds]): a test program; each of
# its tests is a test of CTest, in a process of its own.
function(kstd_test name)
    cmake_parse_arguments(ARG "" "LABELS;TIMEOUT" "SOURCES;LINK" ${ARGN})
    if(NOT ARG_TIMEOUT)
        set(ARG_TIMEOUT 120)
    endif()
    add_executable(${name} ${ARG_SOURCES})
    kstd_test_code(${name})
    target_link_libraries(${name} PRIVATE kstd_test_base ${ARG_LINK})
    target_precompile_headers(${name} REUSE_FROM kstd_test_headers)
    set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY "${CMAKE_BINARY_DIR}/tests")
    # Two programs may hold the same tests; CTest tells tests apart by their names alone.
    set(prefix "")
    if(ARG_LABELS)
        set(prefix "${ARG_LABELS}.")
    endif()
    gtest_discover_tests(${name}
        TEST_PREFIX "${prefix}"
        DISCOVERY_MODE PRE_TEST
        NO_PRETTY_VALUES
        PROPERTIES TIMEOUT ${ARG_TIMEOUT} LABELS "${ARG_LABELS}")
endfunction()

# kstd_test_in_two_lengths(NAME DEFINITION SHORT LONG SOURCES... LINK...): a test in a short form with
# every run, and the whole of it under the label "long"; the definition says which it is.
function(kstd_test_in_two_lengths name definition short long)
    kstd_test(${name}_test ${ARGN})
    target_compile_definitions(${name}_test PRIVATE ${definition}=${short})
    kstd_test(${name}_long_test ${ARGN} LABELS long TIMEOUT 1800)
    target_compile_definitions(${name}_long_test PRIVATE ${definition}=${long})
endfunction()
