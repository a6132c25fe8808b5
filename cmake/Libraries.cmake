# What the libraries have in common:
#     kivvcs_add_library(KivArchive ALIAS Archive STATIC_BY KIVARCHIVE_STATIC SOURCES ...)
# The target, which shows nothing but what its headers mark, its name in the package, and the definition by which the headers
# know a static library.
function(kivvcs_add_library target)
    cmake_parse_arguments(PARSE_ARGV 1 arg "" "ALIAS;STATIC_BY" "SOURCES")
    add_library(${target} ${arg_SOURCES})
    add_library(KivVcs::${arg_ALIAS} ALIAS ${target})
    target_compile_features(${target} PUBLIC cxx_std_20)
    # 32-bit platforms would not know the local time beyond 2038, nor large files, otherwise.
    target_compile_definitions(${target} PRIVATE _TIME_BITS=64 _FILE_OFFSET_BITS=64)
    if(NOT BUILD_SHARED_LIBS)
        target_compile_definitions(${target} PUBLIC ${arg_STATIC_BY})
    endif()
    set_target_properties(${target} PROPERTIES
        EXPORT_NAME ${arg_ALIAS}
        CXX_EXTENSIONS OFF
        CXX_VISIBILITY_PRESET hidden
        VISIBILITY_INLINES_HIDDEN ON
        POSITION_INDEPENDENT_CODE ON
        VERSION ${PROJECT_VERSION}
        # Before 1.0 every minor version may change the binary interface.
        SOVERSION ${PROJECT_VERSION_MAJOR}.${PROJECT_VERSION_MINOR})
    # What a library calls of its own is bound when it is built: nobody replaces a part of it, and its calls are too small for
    # the way through a table. Compilers but GCC take that for granted; linkers do not.
    if(CMAKE_CXX_COMPILER_ID STREQUAL "GNU")
        target_compile_options(${target} PRIVATE -fno-semantic-interposition)
    endif()
    if(BUILD_SHARED_LIBS AND UNIX AND NOT APPLE)
        target_link_options(${target} PRIVATE -Wl,-Bsymbolic-functions)
    endif()
    # Companions find what they stand on beside themselves, wherever they are installed: a program that calls nothing of it
    # does not say where it is.
    if(UNIX AND NOT APPLE AND NOT arg_ALIAS STREQUAL KivVcs)
        set_target_properties(${target} PROPERTIES INSTALL_RPATH "$ORIGIN")
    endif()
endfunction()
