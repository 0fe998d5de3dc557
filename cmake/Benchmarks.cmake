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

find_package(benchmark QUIET)
if(benchmark_FOUND)
    if(NOT TARGET tamblo_tests_fakes)
        tamblo_folder(tests/fakes PUBLIC session util platform base)
    endif()
    tamblo_program(tamblo_microbench
        GLOB bench/micro/*.cpp SOURCES bench/Payloads.cpp bench/TemporaryDirectory.cpp
        LIBRARIES tests/fakes service workers system platform/linux client wire)
    if(TARGET tamblo_microbench)
        target_link_libraries(tamblo_microbench PRIVATE benchmark::benchmark benchmark::benchmark_main)
        target_compile_definitions(tamblo_microbench PRIVATE "BENCH_DIRECTORY=\"${CMAKE_BINARY_DIR}\"")
    endif()
endif()
