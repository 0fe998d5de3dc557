# What `cmake --install` (and `./dev install`) puts in place.

# Units and documents name the prefix that was configured: another one at installation would get half of it.
install(CODE "
    string(REGEX REPLACE \"/$\" \"\" configured \"${CMAKE_INSTALL_PREFIX}\")
    if(NOT CMAKE_INSTALL_PREFIX STREQUAL configured)
        message(FATAL_ERROR \"configured for \${configured}: for another place, configure with -DCMAKE_INSTALL_PREFIX\")
    endif()")

add_custom_target(tamblo_installed DEPENDS tamblo tamblo_static)
foreach(target tamblod tambloctl tamblo-pipewire tamblo-alsa)
    if(TARGET ${target})
        add_dependencies(tamblo_installed ${target})
        install(TARGETS ${target} RUNTIME DESTINATION "${CMAKE_INSTALL_BINDIR}")
    endif()
endforeach()

# The client library: shared and static, its headers, and what pkg-config and CMake's find_package know of it.
include(CMakePackageConfigHelpers)
set(tamblo_cmake_dir "${CMAKE_INSTALL_LIBDIR}/cmake/tamblo")
install(TARGETS tamblo tamblo_static EXPORT tambloTargets
    LIBRARY DESTINATION "${CMAKE_INSTALL_LIBDIR}"
    ARCHIVE DESTINATION "${CMAKE_INSTALL_LIBDIR}"
    INCLUDES DESTINATION "${CMAKE_INSTALL_INCLUDEDIR}")
install(EXPORT tambloTargets NAMESPACE tamblo:: DESTINATION "${tamblo_cmake_dir}")
configure_package_config_file(packaging/tambloConfig.cmake.in "${CMAKE_BINARY_DIR}/tambloConfig.cmake"
    INSTALL_DESTINATION "${tamblo_cmake_dir}")
write_basic_package_version_file("${CMAKE_BINARY_DIR}/tambloConfigVersion.cmake" COMPATIBILITY SameMajorVersion)
install(FILES "${CMAKE_BINARY_DIR}/tambloConfig.cmake" "${CMAKE_BINARY_DIR}/tambloConfigVersion.cmake"
    DESTINATION "${tamblo_cmake_dir}")
install(CODE "
    set(SOURCE \"${CMAKE_SOURCE_DIR}\")
    set(DESTINATION \"\$ENV{DESTDIR}${CMAKE_INSTALL_FULL_INCLUDEDIR}\")
    set(ENTRIES ${tamblo_public_headers})")
install(SCRIPT cmake/InstallHeaders.cmake)
configure_file(packaging/tamblo.pc.in tamblo.pc @ONLY)
install(FILES "${CMAKE_BINARY_DIR}/tamblo.pc" DESTINATION "${CMAKE_INSTALL_LIBDIR}/pkgconfig")

configure_file(packaging/tamblod.service.in tamblod.service @ONLY)
install(FILES "${CMAKE_BINARY_DIR}/tamblod.service" packaging/tamblod.socket
    DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/systemd/system")
configure_file(packaging/tamblod.user.service.in user/tamblod.service @ONLY)
install(FILES "${CMAKE_BINARY_DIR}/user/tamblod.service"
    DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/systemd/user")
# The unit's user, and its configuration directory, which that user owns.
install(FILES packaging/tamblod.sysusers DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/sysusers.d" RENAME tamblo.conf)
install(FILES packaging/tamblod.tmpfiles DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/tmpfiles.d" RENAME tamblo.conf)
# The bridge to the sound server: a unit for one server of the whole system, with a user for it, and one for users' own.
if(TARGET tamblo-pipewire)
    configure_file(packaging/tamblo-pipewire.service.in tamblo-pipewire.service @ONLY)
    install(FILES "${CMAKE_BINARY_DIR}/tamblo-pipewire.service" DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/systemd/system")
    configure_file(packaging/tamblo-pipewire.user.service.in user/tamblo-pipewire.service @ONLY)
    install(FILES "${CMAKE_BINARY_DIR}/user/tamblo-pipewire.service"
        DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/systemd/user")
    foreach(kind sysusers tmpfiles)
        install(FILES packaging/tamblo-pipewire.${kind} DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/${kind}.d"
            RENAME tamblo-pipewire.conf)
    endforeach()
endif()
# The bridge to ALSA, which is one for the whole system.
if(TARGET tamblo-alsa)
    configure_file(packaging/tamblo-alsa.service.in tamblo-alsa.service @ONLY)
    install(FILES "${CMAKE_BINARY_DIR}/tamblo-alsa.service" DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/systemd/system")
    install(FILES packaging/tamblo-alsa.sysusers DESTINATION "${CMAKE_INSTALL_PREFIX}/lib/sysusers.d"
        RENAME tamblo-alsa.conf)
endif()
# Manual pages and completion of command lines, made by the programs that are installed.
install(CODE "
    execute_process(COMMAND \"${CMAKE_SOURCE_DIR}/packaging/manual\" \"${CMAKE_RUNTIME_OUTPUT_DIRECTORY}\"
        \"\$ENV{DESTDIR}${CMAKE_INSTALL_FULL_DATADIR}\" COMMAND_ERROR_IS_FATAL ANY)")
# The documents lie as they do in the tree, so that their links hold.
install(DIRECTORY examples DESTINATION "${CMAKE_INSTALL_DOCDIR}" USE_SOURCE_PERMISSIONS
    PATTERN demo EXCLUDE PATTERN __pycache__ EXCLUDE)
# What the page of examples/fleet has of that of tambloctl report.
install(FILES tools/report/page.css tools/report/plots.js DESTINATION "${CMAKE_INSTALL_DOCDIR}/tools/report")
install(DIRECTORY docs DESTINATION "${CMAKE_INSTALL_DOCDIR}")
install(FILES README.md DESTINATION "${CMAKE_INSTALL_DOCDIR}")
install(FILES packaging/audio_issue_detected.proto packaging/exported_record.proto DESTINATION "${CMAKE_INSTALL_DATADIR}/tamblo")
