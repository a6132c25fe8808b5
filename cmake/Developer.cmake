# What only those who work on the library itself need. Included at top level only, so that a project that adds the library as
# a subdirectory sees none of it.

option(BUILD_SHARED_LIBS "Build libKivVcs as a shared library" ON)
option(KIVVCS_TESTS "Build the tests" ON)
option(KIVVCS_PACKAGE_TESTS "Among them, those that install the library and build consumers of it" ON)
option(KIVVCS_EXAMPLES "Build the examples" ON)
option(KIVVCS_BENCH "Build the benchmarks" OFF)
option(KIVVCS_FUZZ "Build the fuzz targets" ON)
option(KIVVCS_LIBFUZZER "Build them for libFuzzer, instead of as tests that replay their inputs" OFF)
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

# A directory takes part when its option is on and it is there.
macro(kivvcs_add_developer_directory option directory)
    if(${option} AND EXISTS ${CMAKE_CURRENT_SOURCE_DIR}/${directory}/CMakeLists.txt)
        add_subdirectory(${directory})
    endif()
endmacro()

macro(kivvcs_add_developer_directories)
    if(KIVVCS_TESTS)
        enable_testing()
    endif()
    kivvcs_add_developer_directory(KIVVCS_TESTS tests)
    kivvcs_add_developer_directory(KIVVCS_EXAMPLES examples)
    kivvcs_add_developer_directory(KIVVCS_BENCH bench)
    kivvcs_add_developer_directory(KIVVCS_FUZZ fuzz)
endmacro()
