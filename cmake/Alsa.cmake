# The bridge to ALSA where there is no sound server, bridge/alsa/: of the kernel it needs headers that the C library
# needs as well.

include(CMakeDependentOption)
cmake_dependent_option(TAMBLO_ALSA "Build tamblo-alsa" ON "CMAKE_SYSTEM_NAME STREQUAL Linux" OFF)

if(TAMBLO_ALSA)
    tamblo_folder(bridge/alsa/kernel PUBLIC bridge/common client os base)
    tamblo_folder(bridge/alsa/report PUBLIC bridge/alsa/kernel bridge/common client os base)
    tamblo_folder(bridge/alsa EXCLUDE bridge/alsa/main.cpp
        PUBLIC bridge/alsa/report bridge/alsa/kernel bridge/common client wire os base)
    tamblo_program(tamblo-alsa SOURCES bridge/alsa/main.cpp
        LIBRARIES bridge/alsa bridge/alsa/report bridge/alsa/kernel bridge/common client wire os base SELF_CONTAINED)
    target_compile_definitions(tamblo-alsa PRIVATE "TAMBLO_VERSION=\"${PROJECT_VERSION}\"")
endif()
