# What `cmake --install` (and `./dev install`) puts in place.

foreach(target tamblod tambloctl tamblo)
    if(TARGET ${target})
        install(TARGETS ${target}
            RUNTIME DESTINATION "${CMAKE_INSTALL_BINDIR}"
            LIBRARY DESTINATION "${CMAKE_INSTALL_LIBDIR}")
    endif()
endforeach()

# The client library's headers are included as they are in this tree: "client/Client.h" below
# include/tamblo, which the pkg-config file names.
foreach(folder base client)
    install(DIRECTORY "${CMAKE_SOURCE_DIR}/${folder}/" DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}/tamblo/${folder}"
        FILES_MATCHING PATTERN "*.h")
endforeach()
configure_file(packaging/tamblo.pc.in tamblo.pc @ONLY)
install(FILES "${CMAKE_BINARY_DIR}/tamblo.pc" DESTINATION "${CMAKE_INSTALL_LIBDIR}/pkgconfig")

configure_file(packaging/tamblod.service.in tamblod.service @ONLY)
install(FILES "${CMAKE_BINARY_DIR}/tamblod.service" packaging/tamblod.socket
    DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/systemd/system")
install(DIRECTORY examples/ DESTINATION "${CMAKE_INSTALL_DOCDIR}/examples" FILES_MATCHING PATTERN "*.jsonl")
install(DIRECTORY docs/ DESTINATION "${CMAKE_INSTALL_DOCDIR}" FILES_MATCHING PATTERN "*.md")
install(FILES README.md DESTINATION "${CMAKE_INSTALL_DOCDIR}" OPTIONAL)
