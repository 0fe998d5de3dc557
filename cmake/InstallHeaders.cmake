# Run at installation: puts the client library's headers, and those of this project that they include, below
# DESTINATION/tamblo, with `#include "client/Client.h"` written as `#include <tamblo/client/Client.h>`. So an
# application's own folders `base/` or `client/` are never taken for the library's, nor the library's for its.
# SOURCE, DESTINATION and ENTRIES (the headers that an application may include) are given.

cmake_minimum_required(VERSION 3.25) # it is a script of its own, without the project's policies

function(tamblo_install_header header)
    get_property(done GLOBAL PROPERTY tamblo_installed_headers)
    if(header IN_LIST done)
        return()
    endif()
    set_property(GLOBAL APPEND PROPERTY tamblo_installed_headers "${header}")

    file(READ "${SOURCE}/${header}" text)
    string(REGEX MATCHALL "#include \"[^\"]+\"" includes "${text}")
    string(REGEX REPLACE "#include \"([^\"]+)\"" "#include <tamblo/\\1>" text "${text}")
    set(place "${DESTINATION}/tamblo/${header}")
    set(before "")
    if(EXISTS "${place}")
        file(READ "${place}" before)
    endif()
    if(text STREQUAL before)
        message(STATUS "Up-to-date: ${place}")
    else()
        message(STATUS "Installing: ${place}")
        file(WRITE "${place}" "${text}")
    endif()
    foreach(include IN LISTS includes)
        string(REGEX REPLACE "#include \"([^\"]+)\"" "\\1" included "${include}")
        tamblo_install_header("${included}")
    endforeach()
endfunction()

separate_arguments(ENTRIES)
foreach(entry IN LISTS ENTRIES)
    tamblo_install_header("${entry}")
endforeach()
