# A shared library exports its public namespaces, without their `detail`, which parameters of virtual operations may come
# from: a host's class names those that it inherits. Besides these only weak instantiations of standard
# templates are let through: a compiler emits them wherever they are used, with the same content everywhere.

execute_process(COMMAND ${NM} --dynamic --defined-only --format=posix ${LIBRARY} OUTPUT_VARIABLE symbols COMMAND_ERROR_IS_FATAL ANY)
string(REGEX MATCHALL "[^\n]+" symbols "${symbols}")

set(exported 0)
set(strays "")
foreach(symbol IN LISTS symbols)
    if(symbol MATCHES "^_Z(T[VISTC]|GV)?N[KVRO]*(11KivPlatform|8KivUtils|6KivVcs|10KivArchive)" AND NOT symbol MATCHES "^[^IE ]*6detail")
        math(EXPR exported "${exported} + 1")
    elseif(NOT symbol MATCHES "^_Z(T[VIST]|GV|Z)?(N[KVRO]*)?(St|9__gnu_cxx)[^ ]* [WVu] ")
        list(APPEND strays ${symbol})
    endif()
endforeach()

list(JOIN strays "\n" strays)
if(strays)
    message(FATAL_ERROR "Exported by mistake:\n${strays}")
elseif(exported LESS LEAST)
    message(FATAL_ERROR "Only ${exported} symbols are exported")
endif()
