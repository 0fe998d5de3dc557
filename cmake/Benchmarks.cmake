# tamblo_bench drives the real tamblod end to end; tamblo_microbench measures single steps of a message's
# path in process, and is left out where Google Benchmark is missing.

tamblo_program(tamblo_bench GLOB bench/*.cpp bench/hostile/*.cpp LIBRARIES client wire os base)
if(TARGET tamblo_bench)
    target_compile_definitions(tamblo_bench PRIVATE
        "TAMBLOD_PATH=\"${CMAKE_RUNTIME_OUTPUT_DIRECTORY}/tamblod\""
        "BENCH_DIRECTORY=\"${CMAKE_BINARY_DIR}\"")
    if(TARGET tamblod)
        add_dependencies(tamblo_bench tamblod)
    endif()
endif()

# tamblo_crash kills the real tamblod, over and over.
tamblo_program(tamblo_crash
    GLOB bench/crash/*.cpp SOURCES bench/ResultRow.cpp bench/TemporaryDirectory.cpp LIBRARIES wire os base)
if(TARGET tamblo_crash)
    add_library(tamblo_shifted_clock MODULE bench/crash/ShiftedClock.c)
    target_link_libraries(tamblo_crash PRIVATE Threads::Threads)
    target_compile_definitions(tamblo_crash PRIVATE
        "TAMBLOD_PATH=\"${CMAKE_RUNTIME_OUTPUT_DIRECTORY}/tamblod\""
        "SHIFTED_CLOCK_PATH=\"$<TARGET_FILE:tamblo_shifted_clock>\""
        "BENCH_DIRECTORY=\"${CMAKE_BINARY_DIR}\"")
    add_dependencies(tamblo_crash tamblo_shifted_clock)
    if(TARGET tamblod)
        add_dependencies(tamblo_crash tamblod)
    endif()
endif()

if(NOT TARGET tamblo_tests_fakes)
    tamblo_folder(tests/fakes PUBLIC session util platform base)
endif()

# tamblo_fleet makes the sinks of a fleet, by the service's own code and a clock that it turns.
tamblo_program(tamblo_fleet
    GLOB bench/fleet/*.cpp LIBRARIES tests/fakes service workers system platform/linux wire base)

find_package(benchmark QUIET)
if(benchmark_FOUND)
    tamblo_program(tamblo_microbench
        GLOB bench/micro/*.cpp SOURCES bench/Payloads.cpp bench/TemporaryDirectory.cpp
        LIBRARIES tests/fakes service workers system platform/linux client wire)
    if(TARGET tamblo_microbench)
        target_link_libraries(tamblo_microbench PRIVATE benchmark::benchmark benchmark::benchmark_main)
        target_compile_definitions(tamblo_microbench PRIVATE "BENCH_DIRECTORY=\"${CMAKE_BINARY_DIR}\"")
    endif()
endif()
