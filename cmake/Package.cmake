# What CPack makes of a build: the source archive, and a Debian package for each part of the installation that was built.
#     cpack -G DEB                               in the build directory
#     cpack --config CPackSourceConfig.cmake

set(CPACK_PACKAGE_NAME kivvcs)
set(CPACK_PACKAGE_VENDOR KivVcs)
set(CPACK_PACKAGE_CONTACT "The maintainers of KivVcs")
# Each package describes itself.
set(CPACK_PACKAGE_DESCRIPTION_SUMMARY "")
set(CPACK_STRIP_FILES ON)

set(CPACK_SOURCE_GENERATOR TGZ)
set(CPACK_SOURCE_PACKAGE_FILE_NAME kivvcs-${PROJECT_VERSION})
set(CPACK_SOURCE_IGNORE_FILES "${PROJECT_SOURCE_DIR}/build;${PROJECT_SOURCE_DIR}/\\\\.git$;${PROJECT_SOURCE_DIR}/\\\\.git/"
    "/node_modules/;/__pycache__/;/\\\\.cache/;\\\\.db$;\\\\.vault$")

set(CPACK_GENERATOR DEB)
set(CPACK_DEB_COMPONENT_INSTALL ON)
set(CPACK_DEBIAN_FILE_NAME DEB-DEFAULT)
set(CPACK_DEBIAN_ENABLE_COMPONENT_DEPENDS ON)
set(CPACK_DEBIAN_PACKAGE_SHLIBDEPS ON)
foreach(library IN ITEMS KivVcs KivArchive KivArchivePostgres)
    if(TARGET ${library})
        get_target_property(kivvcs_library_directory ${library} BINARY_DIR)
        list(APPEND CPACK_DEBIAN_PACKAGE_SHLIBDEPS_PRIVATE_DIRS ${kivvcs_library_directory})
    endif()
endforeach()
set(CPACK_DEBIAN_PACKAGE_GENERATE_SHLIBS ON)
set(CPACK_DEBIAN_PACKAGE_SECTION libs)

set(kivvcs_soname_version ${PROJECT_VERSION_MAJOR}.${PROJECT_VERSION_MINOR})
set(CPACK_DEBIAN_RUNTIME_PACKAGE_NAME libkivvcs${kivvcs_soname_version})
set(CPACK_DEBIAN_RUNTIME_DESCRIPTION "${PROJECT_DESCRIPTION}")

set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_NAME libkivvcs-dev)
set(CPACK_DEBIAN_DEVELOPMENT_PACKAGE_SECTION libdevel)
set(CPACK_COMPONENT_DEVELOPMENT_DEPENDS runtime)
set(CPACK_DEBIAN_DEVELOPMENT_DESCRIPTION "Headers of KivVcs, version control for host applications")

set(CPACK_DEBIAN_VAULT_PACKAGE_NAME kivvcs-vault)
set(CPACK_DEBIAN_VAULT_PACKAGE_SECTION vcs)
# The program itself stands alone where it could be linked so.
set(CPACK_COMPONENT_VAULT_DEPENDS runtime)
if(TARGET vault-database)
    list(APPEND CPACK_COMPONENT_VAULT_DEPENDS archive-runtime archive-postgres-runtime)
elseif(TARGET vault AND NOT VAULT_STATIC)
    list(APPEND CPACK_COMPONENT_VAULT_DEPENDS archive-runtime)
endif()
set(CPACK_DEBIAN_VAULT_DESCRIPTION "Versions of directories in one file, the example host of KivVcs")

set(CPACK_DEBIAN_ARCHIVE-RUNTIME_PACKAGE_NAME libkivvcs-archive${kivvcs_soname_version})
set(CPACK_COMPONENT_ARCHIVE-RUNTIME_DEPENDS runtime)
set(CPACK_DEBIAN_ARCHIVE-RUNTIME_DESCRIPTION "Archives that make versions of KivVcs last")

set(CPACK_DEBIAN_ARCHIVE-DEVELOPMENT_PACKAGE_NAME libkivvcs-archive-dev)
set(CPACK_DEBIAN_ARCHIVE-DEVELOPMENT_PACKAGE_SECTION libdevel)
set(CPACK_COMPONENT_ARCHIVE-DEVELOPMENT_DEPENDS archive-runtime development)
set(CPACK_DEBIAN_ARCHIVE-DEVELOPMENT_DESCRIPTION "Headers of KivArchive, which makes versions of KivVcs last")

set(CPACK_DEBIAN_ARCHIVE-POSTGRES-RUNTIME_PACKAGE_NAME libkivvcs-archive-postgres${kivvcs_soname_version})
set(CPACK_COMPONENT_ARCHIVE-POSTGRES-RUNTIME_DEPENDS archive-runtime)
set(CPACK_DEBIAN_ARCHIVE-POSTGRES-RUNTIME_DESCRIPTION "Archives of KivVcs in databases with the PostgreSQL protocol")

set(CPACK_DEBIAN_ARCHIVE-POSTGRES-DEVELOPMENT_PACKAGE_NAME libkivvcs-archive-postgres-dev)
set(CPACK_DEBIAN_ARCHIVE-POSTGRES-DEVELOPMENT_PACKAGE_SECTION libdevel)
set(CPACK_COMPONENT_ARCHIVE-POSTGRES-DEVELOPMENT_DEPENDS archive-postgres-runtime archive-development)
set(CPACK_DEBIAN_ARCHIVE-POSTGRES-DEVELOPMENT_DESCRIPTION "What programs are linked with that keep KivVcs archives in databases")

# Only what this build installs; nothing that other projects in the build may install.
get_cmake_property(CPACK_COMPONENTS_ALL COMPONENTS)
list(FILTER CPACK_COMPONENTS_ALL INCLUDE REGEX "^(archive-|archive-postgres-)?(runtime|development)$|^vault$")
include(CPack)
