# How every target of the tree is made: one include root, warnings as errors, the sanitizers of the
# chosen preset.

set(KSTD_SANITIZE "" CACHE STRING "Value for -fsanitize=, empty for none")

add_library(kstd_options INTERFACE)
target_include_directories(kstd_options INTERFACE "${CMAKE_SOURCE_DIR}")
target_compile_options(kstd_options INTERFACE
    -Wall -Wextra -Wpedantic -Werror
    -Wshadow -Wconversion -Wsign-conversion -Wformat=2 -Wcast-align -Wundef
    # Sources call themselves by their names in the tree, in log lines too.
    "-fmacro-prefix-map=${CMAKE_SOURCE_DIR}/="
    $<$<COMPILE_LANGUAGE:CXX>:-Wold-style-cast -Woverloaded-virtual -Wnon-virtual-dtor>
    # What is unique to the process cannot be hidden in the static library.
    $<$<COMPILE_LANG_AND_ID:CXX,GNU>:-fno-gnu-unique>)
# A function that is bound at its first call has all registers saved on the stack, also those through
# which a credential has just been copied.
target_link_options(kstd_options INTERFACE LINKER:-z,relro,-z,now)
if(KSTD_SANITIZE)
    # A target with the property KSTD_PLAIN is linked with the sanitizer, but its own code goes unchecked.
    set(plain "$<BOOL:$<TARGET_PROPERTY:KSTD_PLAIN>>")
    target_compile_options(kstd_options INTERFACE
        "$<$<NOT:${plain}>:-fsanitize=${KSTD_SANITIZE};-fno-sanitize-recover=all>"
        -fno-omit-frame-pointer)
    target_compile_definitions(kstd_options INTERFACE KSTD_SANITIZED)
    target_link_options(kstd_options INTERFACE -fsanitize=${KSTD_SANITIZE})
endif()

# What a fuzz target runs through tells it where it went.
if(KSTD_FUZZ)
    target_compile_options(kstd_options INTERFACE -fsanitize=fuzzer-no-link)
    target_link_options(kstd_options INTERFACE -fsanitize=fuzzer-no-link)
endif()

# The standard headers that most sources include, compiled once. A source still includes what it uses:
# the clang preset builds without them, which shows where one is missing.
file(WRITE "${CMAKE_BINARY_DIR}/StandardHeaders.cpp" "")
add_library(kstd_headers OBJECT "${CMAKE_BINARY_DIR}/StandardHeaders.cpp")
target_link_libraries(kstd_headers PRIVATE kstd_options)
target_precompile_headers(kstd_headers PRIVATE
    <algorithm> <array> <chrono> <functional> <map> <memory> <optional> <set> <span> <string> <string_view>
    <utility> <variant> <vector>)
# What the headers instantiate is instantiated once, too.
target_compile_options(kstd_headers PRIVATE $<$<CXX_COMPILER_ID:Clang>:-fpch-instantiate-templates>)

# kstd_unoptimised(SOURCES...): sources that are full of CLI11's templates. Optimising them, and having
# a sanitizer check them, costs minutes and gains nothing.
function(kstd_unoptimised)
    set(options -O0)
    if(KSTD_SANITIZE)
        list(APPEND options -fno-sanitize=all)
    endif()
    set_source_files_properties(${ARGN} PROPERTIES
        COMPILE_OPTIONS "${options}" SKIP_PRECOMPILE_HEADERS ON)
endfunction()

# kstd_library(NAME SOURCES... [LINK targets...] [TOGETHER]): a static library of the tree. The sources of
# a library with TOGETHER are compiled as one where KSTD_TOGETHER is on, as it is in ./test: their headers
# are read once, not fifty times. Their inner names must differ then.
function(kstd_library name)
    cmake_parse_arguments(ARG "TOGETHER" "" "SOURCES;LINK" ${ARGN})
    add_library(${name} STATIC ${ARG_SOURCES})
    target_link_libraries(${name} PUBLIC kstd_options ${ARG_LINK})
    target_precompile_headers(${name} REUSE_FROM kstd_headers)
    if(ARG_TOGETHER AND KSTD_TOGETHER)
        set_target_properties(${name} PROPERTIES UNITY_BUILD ON UNITY_BUILD_BATCH_SIZE 0)
    endif()
endfunction()

# kstd_program(NAME SOURCES... [LINK targets...]): an executable, placed in <build>/bin.
function(kstd_program name)
    cmake_parse_arguments(ARG "" "" "SOURCES;LINK" ${ARGN})
    add_executable(${name} ${ARG_SOURCES})
    target_link_libraries(${name} PRIVATE kstd_options ${ARG_LINK})
    set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY "${CMAKE_BINARY_DIR}/bin")
endfunction()

# kstd_quick_start(NAME...): programs that events launch have the C++ library in them. To map it and to bind
# its 5,000 names takes a third of a small program's start.
function(kstd_quick_start)
    if(NOT KSTD_SANITIZE)
        foreach(name IN LISTS ARGN)
            target_link_options(${name} PRIVATE -static-libstdc++ -static-libgcc)
        endforeach()
    endif()
endfunction()
