# What only those who work on the library itself need. Included at top level only, so that a project that adds the library as
# a subdirectory sees none of it.

option(BUILD_SHARED_LIBS "Build libKivVcs as a shared library" ON)
# AUTO builds a part if what it needs is installed, and says so in one line if not; ON makes that an error.
set(KIVVCS_TESTS AUTO CACHE STRING "Build the tests (ON, OFF, AUTO)")
set(KIVVCS_PACKAGE_TESTS AUTO CACHE STRING "Among them, those that install the library and build consumers of it (ON, OFF, AUTO)")
set(KIVVCS_EXAMPLES AUTO CACHE STRING "Build the examples (ON, OFF, AUTO)")
set(KIVVCS_FUZZ AUTO CACHE STRING "Build the fuzz targets (ON, OFF, AUTO: with the tests)")
option(KIVVCS_BENCH "Build the benchmarks" OFF)
option(KIVVCS_LIBFUZZER "Build the fuzz targets for libFuzzer, instead of as tests that replay their inputs" OFF)
option(KIVVCS_WARNINGS_AS_ERRORS "Compile with many warnings, each of them an error" OFF)
set(KIVVCS_GOOGLETEST_SOURCE "" CACHE PATH
    "Sources of GoogleTest to build with the flags of this build, for flags that its installed library does not agree with")

if(NOT CMAKE_BUILD_TYPE AND NOT CMAKE_CONFIGURATION_TYPES)
    set(CMAKE_BUILD_TYPE Release)
endif()
set(CMAKE_EXPORT_COMPILE_COMMANDS ON)
set(CMAKE_CXX_EXTENSIONS OFF)

if(KIVVCS_WARNINGS_AS_ERRORS)
    add_compile_options(-Wall -Wextra -Wpedantic -Wconversion -Wshadow -Werror)
    # GCC 12 takes the inlined joining of standard strings for a copy between overlapping regions.
    add_compile_options($<$<CXX_COMPILER_ID:GNU>:-Wno-restrict>)
endif()

# Looks for the packages that a part of the build needs: kivvcs_find_for("the vault" KIVVCS_EXAMPLES found SQLite3 CLI11).
# Sets `found`. Where a package is missing, the part is left out with a status line, or is an error if its option is ON.
macro(kivvcs_find_for part option result)
    set(${result} TRUE)
    foreach(kivvcs_package IN ITEMS ${ARGN})
        if(${option} STREQUAL "AUTO")
            find_package(${kivvcs_package} QUIET)
        else()
            find_package(${kivvcs_package} REQUIRED)
        endif()
        if(${result} AND NOT ${kivvcs_package}_FOUND)
            message(STATUS "Without ${part}: ${kivvcs_package} is not installed")
            set(${result} FALSE)
        endif()
    endforeach()
endmacro()

# A directory takes part when its option is not OFF and it is there.
macro(kivvcs_add_developer_directory option directory)
    if(${option} AND EXISTS ${CMAKE_CURRENT_SOURCE_DIR}/${directory}/CMakeLists.txt)
        add_subdirectory(${directory})
    endif()
endmacro()

macro(kivvcs_add_developer_directories)
    set(kivvcs_test_framework TRUE)
    if(KIVVCS_TESTS AND NOT KIVVCS_GOOGLETEST_SOURCE)
        kivvcs_find_for("the tests" KIVVCS_TESTS kivvcs_test_framework GTest)
    endif()
    if(NOT kivvcs_test_framework)
        set(KIVVCS_TESTS OFF)
    endif()
    if(KIVVCS_FUZZ STREQUAL "AUTO")
        set(KIVVCS_FUZZ ${KIVVCS_TESTS})
    endif()
    if(KIVVCS_TESTS)
        enable_testing()
    endif()
    kivvcs_add_developer_directory(KIVVCS_TESTS tests)
    kivvcs_add_developer_directory(KIVVCS_EXAMPLES examples)
    if(KIVVCS_TESTS)
        kivvcs_add_developer_directory(KIVVCS_EXAMPLES docs/snippets)
    endif()
    kivvcs_add_developer_directory(KIVVCS_BENCH bench)
    kivvcs_add_developer_directory(KIVVCS_FUZZ fuzz)
endmacro()
