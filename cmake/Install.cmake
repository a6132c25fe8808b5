# The installed library: headers, the CMake package KivVcs and the pkg-config module KivVcs. All paths in them are relative, so
# that the installed tree can be moved.

include(GNUInstallDirs)
include(CMakePackageConfigHelpers)

set(kivvcs_package_directory ${CMAKE_INSTALL_LIBDIR}/cmake/KivVcs)
install(TARGETS KivVcs EXPORT KivVcsTargets
        RUNTIME DESTINATION ${CMAKE_INSTALL_BINDIR}
        LIBRARY DESTINATION ${CMAKE_INSTALL_LIBDIR}
        ARCHIVE DESTINATION ${CMAKE_INSTALL_LIBDIR}
        INCLUDES DESTINATION ${CMAKE_INSTALL_INCLUDEDIR})
install(DIRECTORY ${CMAKE_CURRENT_SOURCE_DIR}/include/ DESTINATION ${CMAKE_INSTALL_INCLUDEDIR} FILES_MATCHING PATTERN "*.h"
        PATTERN KivArchive EXCLUDE)

install(EXPORT KivVcsTargets NAMESPACE KivVcs:: FILE KivVcsTargets.cmake DESTINATION ${kivvcs_package_directory})
configure_package_config_file(${CMAKE_CURRENT_LIST_DIR}/KivVcsConfig.cmake.in ${CMAKE_CURRENT_BINARY_DIR}/KivVcsConfig.cmake
                              INSTALL_DESTINATION ${kivvcs_package_directory})
write_basic_package_version_file(${CMAKE_CURRENT_BINARY_DIR}/KivVcsConfigVersion.cmake COMPATIBILITY SameMinorVersion)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/KivVcsConfig.cmake ${CMAKE_CURRENT_BINARY_DIR}/KivVcsConfigVersion.cmake
        DESTINATION ${kivvcs_package_directory})

file(RELATIVE_PATH kivvcs_headers_from_pkgconfig ${CMAKE_INSTALL_FULL_LIBDIR}/pkgconfig ${CMAKE_INSTALL_FULL_INCLUDEDIR})
if(BUILD_SHARED_LIBS)
    set(kivvcs_pkgconfig_cflags "")
    set(kivvcs_pkgconfig_libs "")
else()
    set(kivvcs_pkgconfig_cflags " -DKIVVCS_STATIC")
    set(kivvcs_pkgconfig_libs " -lstdc++")
endif()
configure_file(${CMAKE_CURRENT_LIST_DIR}/KivVcs.pc.in ${CMAKE_CURRENT_BINARY_DIR}/KivVcs.pc @ONLY)
install(FILES ${CMAKE_CURRENT_BINARY_DIR}/KivVcs.pc DESTINATION ${CMAKE_INSTALL_LIBDIR}/pkgconfig)
