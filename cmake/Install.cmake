# What `cmake --install` (and `./dev install`) puts in place.

foreach(target tamblod tambloctl tamblo)
    if(TARGET ${target})
        install(TARGETS ${target}
            RUNTIME DESTINATION "${CMAKE_INSTALL_BINDIR}"
            LIBRARY DESTINATION "${CMAKE_INSTALL_LIBDIR}")
    endif()
endforeach()

# Adds to the list `headers` the given header and those of this project that it includes, directly or not.
function(tamblo_add_header_with_includes header)
    if(header IN_LIST headers OR NOT EXISTS "${CMAKE_SOURCE_DIR}/${header}")
        return()
    endif()
    list(APPEND headers ${header})
    file(STRINGS "${CMAKE_SOURCE_DIR}/${header}" includes REGEX "^#include \"")
    foreach(include IN LISTS includes)
        string(REGEX REPLACE "^#include \"([^\"]+)\".*" "\\1" included "${include}")
        tamblo_add_header_with_includes("${included}")
    endforeach()
    set(headers "${headers}" PARENT_SCOPE)
endfunction()

# The client library's headers are included as they are in this tree: "client/Client.h" below
# include/tamblo, which the pkg-config file names. What only its own sources include stays here.
foreach(entry client/Client.h wire/Directories.h client/tamblo.h)
    tamblo_add_header_with_includes(${entry})
endforeach()
foreach(header IN LISTS headers)
    get_filename_component(directory "${header}" DIRECTORY)
    install(FILES ${header} DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}/tamblo/${directory}")
endforeach()
configure_file(packaging/tamblo.pc.in tamblo.pc @ONLY)
install(FILES "${CMAKE_BINARY_DIR}/tamblo.pc" DESTINATION "${CMAKE_INSTALL_LIBDIR}/pkgconfig")

configure_file(packaging/tamblod.service.in tamblod.service @ONLY)
install(FILES "${CMAKE_BINARY_DIR}/tamblod.service" packaging/tamblod.socket
    DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/systemd/system")
# The unit's user, and its configuration directory, which that user owns.
install(FILES packaging/tamblod.sysusers DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/sysusers.d" RENAME tamblo.conf)
install(FILES packaging/tamblod.tmpfiles DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/tmpfiles.d" RENAME tamblo.conf)
install(DIRECTORY examples/ DESTINATION "${CMAKE_INSTALL_DOCDIR}/examples" FILES_MATCHING PATTERN "*.jsonl")
install(DIRECTORY docs/ DESTINATION "${CMAKE_INSTALL_DOCDIR}" FILES_MATCHING PATTERN "*.md")
install(FILES packaging/audio_issue_detected.proto DESTINATION "${CMAKE_INSTALL_DATADIR}/tamblo")
install(FILES README.md DESTINATION "${CMAKE_INSTALL_DOCDIR}" OPTIONAL)
