# How every target of the tree is made: one include root, warnings as errors, the sanitizers of the
# chosen preset.

set(KSTD_SANITIZE "" CACHE STRING "Value for -fsanitize=, empty for none")

add_library(kstd_options INTERFACE)
target_include_directories(kstd_options INTERFACE "${CMAKE_SOURCE_DIR}")
target_compile_options(kstd_options INTERFACE
    -Wall -Wextra -Wpedantic -Werror
    -Wshadow -Wconversion -Wsign-conversion -Wformat=2 -Wcast-align -Wundef
    $<$<COMPILE_LANGUAGE:CXX>:-Wold-style-cast -Woverloaded-virtual -Wnon-virtual-dtor>)
if(KSTD_SANITIZE)
    target_compile_options(kstd_options INTERFACE
        -fsanitize=${KSTD_SANITIZE} -fno-sanitize-recover=all -fno-omit-frame-pointer)
    target_link_options(kstd_options INTERFACE -fsanitize=${KSTD_SANITIZE})
endif()

# kstd_library(NAME SOURCES... [LINK targets...]): a static library of the tree.
function(kstd_library name)
    cmake_parse_arguments(ARG "" "" "SOURCES;LINK" ${ARGN})
    add_library(${name} STATIC ${ARG_SOURCES})
    target_link_libraries(${name} PUBLIC kstd_options ${ARG_LINK})
endfunction()

# kstd_program(NAME SOURCES... [LINK targets...]): an executable, placed in <build>/bin.
function(kstd_program name)
    cmake_parse_arguments(ARG "" "" "SOURCES;LINK" ${ARGN})
    add_executable(${name} ${ARG_SOURCES})
    target_link_libraries(${name} PRIVATE kstd_options ${ARG_LINK})
    set_target_properties(${name} PROPERTIES RUNTIME_OUTPUT_DIRECTORY "${CMAKE_BINARY_DIR}/bin")
endfunction()
