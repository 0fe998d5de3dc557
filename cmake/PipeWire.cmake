# The bridge to the sound server PipeWire, bridge/pipewire/: built where its library is found, or as TAMBLO_PIPEWIRE
# says. Nothing else depends on that library.

set(TAMBLO_PIPEWIRE AUTO CACHE STRING "Build tamblo-pipewire (needs libpipewire-0.3-dev): AUTO, ON or OFF")
set_property(CACHE TAMBLO_PIPEWIRE PROPERTY STRINGS AUTO ON OFF)

set(tamblo_pipewire_found FALSE)
if(TAMBLO_PIPEWIRE)
    find_package(PkgConfig QUIET)
    if(PkgConfig_FOUND)
        pkg_check_modules(PIPEWIRE QUIET IMPORTED_TARGET libpipewire-0.3>=0.3.65)
    endif()
    if(TARGET PkgConfig::PIPEWIRE)
        set(tamblo_pipewire_found TRUE)
        message(STATUS "PipeWire ${PIPEWIRE_VERSION} found: tamblo-pipewire is built")
    elseif(TAMBLO_PIPEWIRE STREQUAL "AUTO")
        message(STATUS "PipeWire (libpipewire-0.3-dev) not found: tamblo-pipewire is left out")
    else()
        message(FATAL_ERROR "TAMBLO_PIPEWIRE is ON, but PipeWire (libpipewire-0.3-dev, 0.3.65 or later) was not found")
    endif()
else()
    message(STATUS "TAMBLO_PIPEWIRE is OFF: tamblo-pipewire is left out")
endif()

if(tamblo_pipewire_found)
    # What is decided from the server's world, and what is said of it, knows no header of PipeWire's.
    tamblo_folder(bridge/pipewire/graph PUBLIC bridge/common base)
    tamblo_folder(bridge/pipewire/report PUBLIC bridge/pipewire/graph bridge/common client os base)
    tamblo_folder(bridge/pipewire/server PUBLIC bridge/pipewire/report bridge/pipewire/graph bridge/common client wire os base)
    # The macros by which the server is called are statements that have a value, an extension that clang would warn of
    # where they are used.
    add_library(tamblo_pipewire_library INTERFACE)
    target_link_libraries(tamblo_pipewire_library INTERFACE PkgConfig::PIPEWIRE)
    target_compile_options(tamblo_pipewire_library INTERFACE
        "$<$<CXX_COMPILER_ID:Clang>:-Wno-gnu-statement-expression-from-macro-expansion>")
    target_link_libraries(tamblo_bridge_pipewire_server PUBLIC tamblo_pipewire_library)
    tamblo_folder(bridge/pipewire EXCLUDE bridge/pipewire/main.cpp
        PUBLIC bridge/pipewire/server bridge/pipewire/report bridge/pipewire/graph bridge/common client wire os base)
    tamblo_program(tamblo-pipewire SOURCES bridge/pipewire/main.cpp
        LIBRARIES bridge/pipewire bridge/pipewire/server bridge/pipewire/report bridge/pipewire/graph bridge/common
            client wire os base
        SELF_CONTAINED)
    target_compile_definitions(tamblo-pipewire PRIVATE "TAMBLO_VERSION=\"${PROJECT_VERSION}\"")
endif()
