# Builds and runs a consumer of the library: with the sources as a subdirectory, and by find_package and pkg-config from the
# installed library. The subdirectory's library is static, and is installed for the other two as well. Every installed tree is
# moved first, so that an absolute path in it does not go unnoticed.

set(consumer ${CMAKE_CURRENT_LIST_DIR}/consumer)
file(REMOVE_RECURSE ${SCRATCH})

function(run)
    execute_process(COMMAND ${ARGN} RESULT_VARIABLE status OUTPUT_VARIABLE output ERROR_VARIABLE output)
    if(NOT status EQUAL 0)
        list(JOIN ARGN " " command)
        message(FATAL_ERROR "${command}\n${output}")
    endif()
endfunction()

function(build_and_run directory)
    run(${CMAKE_COMMAND} -S ${consumer} -B ${directory} -G ${GENERATOR} -D CMAKE_CXX_COMPILER=${CXX} ${ARGN})
    run(${CMAKE_COMMAND} --build ${directory} --parallel 2)
    run(${directory}/consumer)
endfunction()

function(check_installed build name)
    run(${CMAKE_COMMAND} --install ${build} --prefix ${SCRATCH}/unmoved)
    set(prefix ${SCRATCH}/${name})
    file(RENAME ${SCRATCH}/unmoved ${prefix})

    build_and_run(${SCRATCH}/${name}-package -D CMAKE_PREFIX_PATH=${prefix})

    file(GLOB_RECURSE modules ${prefix}/*/KivVcs.pc)
    cmake_path(GET modules PARENT_PATH module_directory)
    set(ENV{PKG_CONFIG_PATH} ${module_directory})
    execute_process(COMMAND pkg-config --cflags --libs KivVcs OUTPUT_VARIABLE flags COMMAND_ERROR_IS_FATAL ANY)
    separate_arguments(flags UNIX_COMMAND "${flags}")
    run(${CXX} -std=c++20 ${consumer}/main.cpp -o ${SCRATCH}/${name}-pkg-config ${flags})
    cmake_path(GET module_directory PARENT_PATH library_directory)
    run(${CMAKE_COMMAND} -E env LD_LIBRARY_PATH=${library_directory} ${SCRATCH}/${name}-pkg-config)
endfunction()

build_and_run(${SCRATCH}/subdirectory -D KIVVCS_SOURCE=${SOURCE} -D BUILD_SHARED_LIBS=OFF)
check_installed(${SCRATCH}/subdirectory static)
check_installed(${BUILD} installed)
