# Shared build settings: warnings, optimisation and sanitizers as INTERFACE targets, and the
# helpers that turn one folder into one static library and one test executable.

add_library(ox_warnings INTERFACE)
target_compile_options(ox_warnings INTERFACE -Wall -Wextra -Wpedantic
    -Wno-unused-parameter -Wnon-virtual-dtor
    # Clang's builds (sanitizers, fuzzers) have no -Wshadow=local.
    $<$<CXX_COMPILER_ID:GNU>:-Wshadow=local>)

add_library(ox_opt INTERFACE)
target_compile_options(ox_opt INTERFACE $<$<CONFIG:Release>:-O2> -fno-fast-math -g1)

if(OX_FUZZ)
    # Coverage for the fuzzers and the address and undefined-behaviour sanitizers in every
    # library; the fuzz targets add the fuzzer's own main when they link.
    if(NOT OX_SANITIZE STREQUAL "")
        message(FATAL_ERROR "OX_FUZZ brings its own sanitizers; leave OX_SANITIZE empty")
    endif()
    target_compile_options(ox_opt INTERFACE -fsanitize=fuzzer-no-link,address,undefined
        -fno-sanitize-recover=undefined -fno-omit-frame-pointer -gline-tables-only)
    target_link_options(ox_opt INTERFACE -fsanitize=address,undefined)
elseif(OX_SANITIZE STREQUAL "address")
    target_compile_options(ox_opt INTERFACE -fsanitize=address,undefined -fno-omit-frame-pointer
        -fno-sanitize-recover=undefined)
    target_link_options(ox_opt INTERFACE -fsanitize=address,undefined)
elseif(OX_SANITIZE STREQUAL "thread")
    target_compile_options(ox_opt INTERFACE -fsanitize=thread -fno-omit-frame-pointer)
    target_link_options(ox_opt INTERFACE -fsanitize=thread)
elseif(NOT OX_SANITIZE STREQUAL "")
    message(FATAL_ERROR "OX_SANITIZE must be empty, address or thread")
endif()

# ox_library(<folder> [PUBLIC deps...] [PRIVATE deps...])
# Builds every .cpp of the folder into the static library ox_<folder> (alias ox::<folder>).
# Headers are included from the source root: #include "core/types.h".
function(ox_library folder)
    cmake_parse_arguments(ARG "" "" "PUBLIC;PRIVATE" ${ARGN})
    file(GLOB sources CONFIGURE_DEPENDS "${CMAKE_CURRENT_SOURCE_DIR}/*.cpp")
    # Program entry files (main.cpp, <program>_main.cpp) belong to executables, not libraries.
    list(FILTER sources EXCLUDE REGEX ".*/([^/]*_)?main[^/]*\\.cpp$")
    if(NOT sources)
        # A folder whose first code has not arrived yet: a placeholder that passes on its
        # dependencies, so the chain of libraries stays whole.
        add_library(ox_${folder} INTERFACE)
        add_library(ox::${folder} ALIAS ox_${folder})
        target_include_directories(ox_${folder} INTERFACE "${PROJECT_SOURCE_DIR}")
        target_link_libraries(ox_${folder} INTERFACE ox_opt ${ARG_PUBLIC} ${ARG_PRIVATE})
        return()
    endif()
    add_library(ox_${folder} STATIC ${sources})
    add_library(ox::${folder} ALIAS ox_${folder})
    target_include_directories(ox_${folder} PUBLIC "${PROJECT_SOURCE_DIR}")
    target_link_libraries(ox_${folder} PUBLIC ox_opt ${ARG_PUBLIC} PRIVATE ox_warnings ${ARG_PRIVATE})
endfunction()

# ox_test(<folder> [deps...]): one GoogleTest executable of every *_test.cpp in the folder.
function(ox_test folder)
    file(GLOB sources CONFIGURE_DEPENDS "${CMAKE_CURRENT_SOURCE_DIR}/*_test.cpp")
    if(NOT sources)
        return()
    endif()
    add_executable(${folder}_tests ${sources})
    target_link_libraries(${folder}_tests PRIVATE ox_warnings ${ARGN} GTest::gtest GTest::gtest_main)
    target_compile_definitions(${folder}_tests PRIVATE
        OX_TEST_DATA_DIR="${PROJECT_SOURCE_DIR}/tests/data"
        OX_BINARY_DIR="${PROJECT_BINARY_DIR}")
    include(GoogleTest)
    gtest_discover_tests(${folder}_tests DISCOVERY_TIMEOUT 60
        PROPERTIES ENVIRONMENT "OX_BINARY_DIR=${PROJECT_BINARY_DIR}")
endfunction()
