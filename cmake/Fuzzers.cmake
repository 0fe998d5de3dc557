# Each fuzz/*Fuzzer.cpp is a program of its own, named after its file.

file(GLOB tamblo_fuzzers CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}" fuzz/*Fuzzer.cpp)
foreach(source IN LISTS tamblo_fuzzers)
    get_filename_component(name "${source}" NAME_WE)
    tamblo_program(${name} SOURCES ${source} LIBRARIES wire base)
    target_link_options(${name} PRIVATE -fsanitize=fuzzer)
    list(APPEND tamblo_fuzzer_targets ${name})
endforeach()
add_custom_target(tamblo_fuzzers DEPENDS ${tamblo_fuzzer_targets})
