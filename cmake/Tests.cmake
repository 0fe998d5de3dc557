# tamblo_unit_tests (every folder, against the in-memory platform of tests/fakes), tamblo_service_tests (the
# real tamblod and tambloctl) and tamblo_hostile_tests (clients that mean harm). Left out, with a notice, on a
# machine without the test libraries.

find_package(GTest QUIET)
find_package(nlohmann_json QUIET)
if(NOT GTest_FOUND OR NOT nlohmann_json_FOUND)
    message(STATUS "GoogleTest or nlohmann-json not found: the tests are left out")
    return()
endif()

enable_testing()
include(GoogleTest)
add_custom_target(tamblo_all_tests)

# tamblo_tests(NAME LABEL label SOURCES files... LIBRARIES folders...)
function(tamblo_tests name)
    cmake_parse_arguments(PARSE_ARGV 1 arg "" "LABEL" "SOURCES;LIBRARIES")
    if(NOT arg_SOURCES)
        return()
    endif()
    add_executable(${name} ${arg_SOURCES})
    target_include_directories(${name} PRIVATE "${tamblo_tests_include}")
    target_link_libraries(${name} PRIVATE GTest::gmock GTest::gtest_main nlohmann_json::nlohmann_json)
    tamblo_link(${name} PRIVATE ${arg_LIBRARIES})
    # A test runs once for each time that it is built: to optimise it takes longer than it saves.
    target_compile_options(${name} PRIVATE -O0 -U_FORTIFY_SOURCE)
    target_compile_definitions(${name} PRIVATE "EXAMPLES_DIR=\"${CMAKE_SOURCE_DIR}/examples\"")
    set_target_properties(${name} PROPERTIES UNITY_BUILD ${TAMBLO_UNITY} UNITY_BUILD_BATCH_SIZE 6)
    add_dependencies(tamblo_all_tests ${name})
    gtest_discover_tests(${name} DISCOVERY_MODE PRE_TEST PROPERTIES LABELS ${arg_LABEL} TIMEOUT 120)
endfunction()

file(GLOB_RECURSE unit_sources CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}" tests/*.cpp tests/*.c)
file(GLOB_RECURSE core_sources CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}"
    tests/session/*.cpp tests/service_core/*.cpp)
file(GLOB_RECURSE service_sources CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}" tests/service/*.cpp)
file(GLOB_RECURSE hostile_sources CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}" tests/hostile/*.cpp)
list(FILTER unit_sources EXCLUDE REGEX "^tests/(service|service_core|session|fakes|hostile)/")

tamblo_tests(tamblo_unit_tests LABEL unit SOURCES ${unit_sources}
    LIBRARIES tests/fakes service workers system platform/linux tools/export tools/report tools client wire metrics)
# Sessions and the service with a list of worker classes of the tests' own.
tamblo_tests(tamblo_core_tests LABEL unit SOURCES ${core_sources} LIBRARIES tests/fakes service session)
tamblo_tests(tamblo_service_tests LABEL service SOURCES ${service_sources} LIBRARIES client wire base)

# What one client may cost the others, by the real tamblod.
tamblo_tests(tamblo_hostile_tests LABEL hostile SOURCES ${hostile_sources} LIBRARIES wire base)

# The examples in C and C++, built as against the installed library: with its headers alone.
set(tamblo_installed_headers "${CMAKE_BINARY_DIR}/installed")
string(JOIN " " entries ${tamblo_public_headers})
add_custom_target(tamblo_headers COMMAND "${CMAKE_COMMAND}" "-DSOURCE=${CMAKE_SOURCE_DIR}"
    "-DDESTINATION=${tamblo_installed_headers}" "-DENTRIES=${entries}"
    -P "${CMAKE_SOURCE_DIR}/cmake/InstallHeaders.cmake" VERBATIM)
foreach(language c cpp)
    add_executable(reporter_${language} examples/client/reporter.${language})
    target_include_directories(reporter_${language} PRIVATE "${tamblo_installed_headers}")
    target_link_libraries(reporter_${language} PRIVATE tamblo)
    add_dependencies(reporter_${language} tamblo_headers)
    add_dependencies(tamblo_service_tests reporter_${language})
endforeach()

foreach(tests tamblo_service_tests tamblo_hostile_tests)
    if(TARGET ${tests})
        target_compile_definitions(${tests} PRIVATE
            "TAMBLOD_PATH=\"${CMAKE_RUNTIME_OUTPUT_DIRECTORY}/tamblod\""
            "TAMBLOCTL_PATH=\"${CMAKE_RUNTIME_OUTPUT_DIRECTORY}/tambloctl\""
            "REPORTERS_DIR=\"${CMAKE_RUNTIME_OUTPUT_DIRECTORY}\"")
        foreach(program tamblod tambloctl)
            if(TARGET ${program})
                add_dependencies(${tests} ${program})
            endif()
        endforeach()
    endif()
endforeach()

# What the bridges share.
tamblo_link_headers(bridge/common/tests TRUE bridge_tests_include)
file(GLOB bridge_sources CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}" bridge/common/tests/*Test.cpp)
tamblo_tests(tamblo_bridge_tests LABEL unit SOURCES ${bridge_sources} LIBRARIES bridge/common client wire os base)
target_include_directories(tamblo_bridge_tests PRIVATE "${bridge_tests_include}")

# The bridge to PipeWire: its model without a server, and the program with a private one.
if(TARGET tamblo-pipewire)
    file(GLOB pipewire_sources CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}" bridge/pipewire/tests/*Test.cpp)
    tamblo_link_headers(bridge/pipewire/tests TRUE pipewire_tests_include)
    tamblo_tests(tamblo_pipewire_tests LABEL service SOURCES ${pipewire_sources}
        LIBRARIES bridge/pipewire/report bridge/pipewire/graph bridge/common client wire os base)
    target_include_directories(tamblo_pipewire_tests PRIVATE "${pipewire_tests_include}" "${bridge_tests_include}")
    tamblo_program(tamblo_pipewire_streams SOURCES bridge/pipewire/tests/streams.cpp)
    target_link_libraries(tamblo_pipewire_streams PRIVATE tamblo_pipewire_library)
    target_compile_definitions(tamblo_pipewire_tests PRIVATE
        "PROGRAMS_DIR=\"${CMAKE_RUNTIME_OUTPUT_DIRECTORY}\""
        "TAMBLOD_PATH=\"${CMAKE_RUNTIME_OUTPUT_DIRECTORY}/tamblod\""
        "TAMBLOCTL_PATH=\"${CMAKE_RUNTIME_OUTPUT_DIRECTORY}/tambloctl\"")
    add_dependencies(tamblo_pipewire_tests tamblo-pipewire tamblo_pipewire_streams tamblod)
endif()

# The bridge to ALSA: by files like the kernel's, and the program with the real service.
if(TARGET tamblo-alsa)
    file(GLOB alsa_sources CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}" bridge/alsa/tests/*Test.cpp)
    tamblo_link_headers(bridge/alsa/tests TRUE alsa_tests_include)
    tamblo_tests(tamblo_alsa_tests LABEL service SOURCES ${alsa_sources}
        LIBRARIES bridge/alsa/report bridge/alsa/kernel bridge/common client wire os base)
    target_include_directories(tamblo_alsa_tests PRIVATE "${alsa_tests_include}" "${bridge_tests_include}")
    target_compile_definitions(tamblo_alsa_tests PRIVATE
        "PROGRAMS_DIR=\"${CMAKE_RUNTIME_OUTPUT_DIRECTORY}\""
        "TAMBLOD_PATH=\"${CMAKE_RUNTIME_OUTPUT_DIRECTORY}/tamblod\""
        "TAMBLOCTL_PATH=\"${CMAKE_RUNTIME_OUTPUT_DIRECTORY}/tambloctl\"")
    add_dependencies(tamblo_alsa_tests tamblo-alsa tamblod)
endif()
