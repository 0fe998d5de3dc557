# Language level, warnings, sanitizers and output places: the same for every target.

set(CMAKE_CXX_STANDARD 20)
set(CMAKE_CXX_STANDARD_REQUIRED ON)
set(CMAKE_CXX_EXTENSIONS OFF)
set(CMAKE_C_STANDARD 99) # the client library's C header, which the tests include
set(CMAKE_C_EXTENSIONS OFF)
set(CMAKE_EXPORT_COMPILE_COMMANDS ON)
set(CMAKE_POSITION_INDEPENDENT_CODE ON) # the folders' objects also make up the shared client library
set(CMAKE_RUNTIME_OUTPUT_DIRECTORY "${CMAKE_BINARY_DIR}/bin")
set(CMAKE_LIBRARY_OUTPUT_DIRECTORY "${CMAKE_BINARY_DIR}/lib")
set(CMAKE_ARCHIVE_OUTPUT_DIRECTORY "${CMAKE_BINARY_DIR}/lib")

if(NOT CMAKE_BUILD_TYPE)
    set(CMAKE_BUILD_TYPE RelWithDebInfo CACHE STRING "Debug, Release or RelWithDebInfo" FORCE)
endif()
set(CMAKE_CXX_FLAGS_RELWITHDEBINFO "-O2 -g") # assertions stay on, as nothing hot asserts
if(TAMBLO_SANITIZE)
    set(CMAKE_CXX_FLAGS_RELWITHDEBINFO "-O1 -g1") # compiles twice as fast; reports still name lines
endif()

add_compile_options(-Wall -Wextra -Wpedantic -Wconversion -Wshadow -Werror)
if(CMAKE_CXX_COMPILER_ID MATCHES "Clang")
    # Part of clang's -Wconversion but not of g++'s: both compilers shall ask for the same.
    add_compile_options(-Wno-sign-conversion)
    # C may have another compiler.
    add_compile_options("$<$<COMPILE_LANGUAGE:CXX>:-Wthread-safety;-Wreserved-identifier>")
    # The library of g++ 12 sorts stably through a function that it has itself deprecated, and says so to clang
    # only. g++ keeps watch over this project's own uses.
    add_compile_options(-Wno-deprecated-declarations)
elseif(CMAKE_CXX_COMPILER_VERSION VERSION_LESS 13)
    # At -O3, g++ 12 takes the joining of any two strings for overlapping copies.
    add_compile_options(-Wno-restrict)
endif()

# The client library's calls within itself need no detour through its symbol table, and the service's idle
# memory is mostly code that was never reached: the linker drops it.
add_compile_options(-fno-semantic-interposition -ffunction-sections -fdata-sections)
add_link_options(-Wl,--gc-sections)
# Log lines and assertions name files as the checkout does, wherever it was built.
add_compile_options("-fmacro-prefix-map=${CMAKE_SOURCE_DIR}/=")

# Hardened as Debian hardens what it builds. Not the marked targets of jumps and calls (-fcf-protection): they cost an
# instruction in each function, and protect nothing where the C library is built without. Sanitizers look for more than
# all this finds, and get in its way.
if(NOT TAMBLO_SANITIZE AND NOT TAMBLO_FUZZ)
    include(CheckPIESupported)
    check_pie_supported()
    add_compile_options(-fstack-protector-strong -fstack-clash-protection -Wformat -Werror=format-security)
    # The C library's checks need the optimiser.
    add_compile_options("$<$<NOT:$<CONFIG:Debug>>:-U_FORTIFY_SOURCE;-D_FORTIFY_SOURCE=2>")
    add_link_options(-Wl,-z,relro,-z,now)
endif()

if(TAMBLO_SANITIZE)
    add_compile_options(-fsanitize=${TAMBLO_SANITIZE} -fno-sanitize-recover=all -fno-omit-frame-pointer)
    add_link_options(-fsanitize=${TAMBLO_SANITIZE})
    if(TAMBLO_SANITIZE MATCHES "undefined")
        # This check probes memory through a pipe, and calls any object broken once a process has no file
        # descriptors left, which is a state that the service is tested in.
        add_compile_options(-fno-sanitize=vptr)
    endif()
endif()

if(TAMBLO_FUZZ)
    if(NOT CMAKE_CXX_COMPILER_ID MATCHES "Clang")
        message(FATAL_ERROR "TAMBLO_FUZZ needs clang: configure with -DCMAKE_CXX_COMPILER=clang++-19")
    endif()
    set(tamblo_fuzz_sanitizers address,undefined)
    add_compile_options(-fsanitize=fuzzer-no-link,${tamblo_fuzz_sanitizers} -fno-sanitize-recover=all)
    add_link_options(-fsanitize=${tamblo_fuzz_sanitizers})
endif()
