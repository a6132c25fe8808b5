# The installed libraries: headers, the CMake package KivVcs and the pkg-config module KivVcs. All paths in them are relative, so
# that the installed tree can be moved.

include(GNUInstallDirs)
include(CMakePackageConfigHelpers)

set(kivvcs_package_directory ${CMAKE_INSTALL_LIBDIR}/cmake/KivVcs)

# Installs a library with the directories of its headers, as the targets of EXPORTS.cmake; the parts of the installation, which
# become Debian packages, are RUNTIME and DEVELOPMENT:
#     kivvcs_install_library(KivVcs EXPORTS KivVcsTargets RUNTIME runtime DEVELOPMENT development HEADERS KivUtils KivVcs)
function(kivvcs_install_library target)
    cmake_parse_arguments(PARSE_ARGV 1 arg "" "EXPORTS;RUNTIME;DEVELOPMENT" "HEADERS")
    install(TARGETS ${target} EXPORT ${arg_EXPORTS}
            RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR} COMPONENT ${arg_RUNTIME}
            LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT ${arg_RUNTIME} NAMELINK_COMPONENT ${arg_DEVELOPMENT}
            ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR} COMPONENT ${arg_DEVELOPMENT}
            INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
    foreach(directory IN LISTS arg_HEADERS)
        install(DIRECTORY ${PROJECT_SOURCE_DIR}/include/${directory} DESTINATION ${CMAKE_INSTALL_INCLUDEDIR}
                COMPONENT ${arg_DEVELOPMENT} FILES_MATCHING PATTERN "*.h")
    endforeach()
    install(EXPORT ${arg_EXPORTS} NAMESPACE KivVcs:: FILE ${arg_EXPORTS}.cmake DESTINATION ${kivvcs_package_directory}
            COMPONENT ${arg_DEVELOPMENT})
endfunction()

kivvcs_install_library(KivVcs EXPORTS KivVcsTargets RUNTIME runtime DEVELOPMENT development
                       HEADERS KivPlatform KivUtils KivVcs)

configure_package_config_file(${CMAKE_CURRENT_LIST_DIR}/KivVcsConfig.cmake.in ${CMAKE_CURRENT_BINARY_DIR}/KivVcsConfig.cmake
                              INSTALL_DESTINATION ${kivvcs_package_directory} NO_CHECK_REQUIRED_COMPONENTS_MACRO)
write_basic_package_version_file(${CMAKE_CURRENT_BINARY_DIR}/KivVcsConfigVersion.cmake COMPATIBILITY SameMinorVersion)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/KivVcsConfig.cmake ${CMAKE_CURRENT_BINARY_DIR}/KivVcsConfigVersion.cmake
        DESTINATION ${kivvcs_package_directory} COMPONENT development)

file(RELATIVE_PATH kivvcs_headers_from_pkgconfig ${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig ${CMAKE_INSTALL_FULL_INCLUDEDIR})
if(BUILD_SHARED_LIBS)
    set(kivvcs_pkgconfig_cflags "")
    set(kivvcs_pkgconfig_libs "")
else()
    set(kivvcs_pkgconfig_cflags " -DKIVVCS_STATIC")
    set(kivvcs_pkgconfig_libs " -lstdc++")
endif()
configure_file(${CMAKE_CURRENT_LIST_DIR}/KivVcs.pc.in ${CMAKE_CURRENT_BINARY_DIR}/KivVcs.pc @ONLY)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/KivVcs.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig COMPONENT development)

# Where gdb looks for what belongs to a library: under the path that the library has when it is installed.
if(BUILD_SHARED_LIBS AND UNIX AND NOT APPLE)
    install(FILES ${PROJECT_SOURCE_DIR}/gdb/printers.py COMPONENT development
            DESTINATION ${CMAKE_INSTALL_DATADIR}/gdb/auto-load\${CMAKE_INSTALL_PREFIX}/${CMAKE_INSTALL_LIBDIR}
            RENAME $<TARGET_FILE_NAME:KivVcs>-gdb.py)
endif()
