# kivvcs_add_static_program(NAME OBJECTS SOURCE...)
# Adds an executable of the sources and of an object library that stands on the archive, with all that it needs in it, so that
# nothing is linked when it starts; where the system has no static libraries for that, one that is linked as usual.

include(CheckCXXSourceCompiles)
include(CheckLinkerFlag)

function(kivvcs_add_static_program name objects)
    check_linker_flag(CXX -Wl,--no-warnings KIVVCS_LINKS_QUIETLY)
    set(libraries sqlite3 ${KIVARCHIVE_ZSTD_LIBRARY} m)
    list(TRANSFORM libraries REPLACE "[.]so$" ".a")
    set(CMAKE_REQUIRED_FLAGS -static)
    set(CMAKE_REQUIRED_LIBRARIES ${libraries})
    check_cxx_source_compiles("extern \"C\" int sqlite3_libversion_number(); extern \"C\" unsigned ZSTD_versionNumber();
        int main() { return sqlite3_libversion_number() > 0 && ZSTD_versionNumber() > 0; }" KIVVCS_LINKS_STATICALLY)
    add_executable(${name} ${ARGN})
    if(NOT KIVVCS_LINKS_STATICALLY)
        target_link_libraries(${name} PRIVATE ${objects})
        return()
    endif()
    target_sources(${name} PRIVATE $<TARGET_OBJECTS:${objects}> $<TARGET_OBJECTS:KivArchive> $<TARGET_OBJECTS:KivVcs>)
    foreach(library IN ITEMS KivVcs KivArchive)
        target_include_directories(${name} PRIVATE $<TARGET_PROPERTY:${library},INTERFACE_INCLUDE_DIRECTORIES>)
    endforeach()
    target_compile_features(${name} PRIVATE cxx_std_20)
    target_link_libraries(${name} PRIVATE ${libraries})
    # It would warn that what SQLite and the names of users may load is not linked with it.
    target_link_options(${name} PRIVATE -static -Wl,--gc-sections $<$<BOOL:${KIVVCS_LINKS_QUIETLY}>:-Wl,--no-warnings>)
endfunction()
