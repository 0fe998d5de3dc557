# Targets from folders. Folder a/b becomes the static library tamblo_a_b (an interface library while it has
# headers only), whose include directory <build>/include/a_b holds links to the headers of that folder and
# of no other: "base/Value.h" is found by those that link tamblo_base, and by nobody else.

function(tamblo_target_name folder result)
    string(REPLACE "/" "_" name "tamblo_${folder}")
    set(${result} ${name} PARENT_SCOPE)
endfunction()

# Links `target` to folders. Accepts CMake's keyword as first argument.
function(tamblo_link target keyword)
    foreach(folder IN LISTS ARGN)
        tamblo_target_name(${folder} library)
        target_link_libraries(${target} ${keyword} ${library})
    endforeach()
endfunction()

# Fills <build>/include/<name> with links to the folder's headers, and takes away the links whose headers
# are gone, so that an include of a removed header fails here as it does in a fresh build.
function(tamblo_link_headers folder recurse result)
    string(REPLACE "/" "_" name "${folder}")
    set(include_dir "${CMAKE_BINARY_DIR}/include/${name}")
    if(recurse)
        file(GLOB_RECURSE headers CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}" "${folder}/*.h")
    else()
        file(GLOB headers CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}" "${folder}/*.h")
    endif()

    file(GLOB_RECURSE links RELATIVE "${include_dir}" "${include_dir}/*.h")
    foreach(link IN LISTS links)
        if(NOT link IN_LIST headers)
            file(REMOVE "${include_dir}/${link}")
        endif()
    endforeach()
    foreach(header IN LISTS headers)
        if(NOT IS_SYMLINK "${include_dir}/${header}")
            get_filename_component(directory "${include_dir}/${header}" DIRECTORY)
            file(MAKE_DIRECTORY "${directory}")
            file(CREATE_LINK "${CMAKE_SOURCE_DIR}/${header}" "${include_dir}/${header}" SYMBOLIC)
        endif()
    endforeach()
    file(MAKE_DIRECTORY "${include_dir}")
    set(${result} "${include_dir}" PARENT_SCOPE)
endfunction()

# tamblo_folder(FOLDER [RECURSE] [EXCLUDE files...] [PUBLIC folders...] [PRIVATE folders...])
function(tamblo_folder folder)
    cmake_parse_arguments(PARSE_ARGV 1 arg "RECURSE" "" "EXCLUDE;PUBLIC;PRIVATE")
    if(arg_RECURSE)
        file(GLOB_RECURSE sources CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}" "${folder}/*.cpp")
    else()
        file(GLOB sources CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}" "${folder}/*.cpp")
    endif()
    list(REMOVE_ITEM sources ${arg_EXCLUDE})
    tamblo_link_headers(${folder} "${arg_RECURSE}" include_dir)

    tamblo_target_name(${folder} target)
    if(sources)
        add_library(${target} STATIC ${sources})
        target_include_directories(${target} PUBLIC "${include_dir}")
        tamblo_link(${target} PUBLIC ${arg_PUBLIC})
        tamblo_link(${target} PRIVATE ${arg_PRIVATE})
    else()
        add_library(${target} INTERFACE)
        target_include_directories(${target} INTERFACE "${include_dir}")
        tamblo_link(${target} INTERFACE ${arg_PUBLIC})
    endif()
endfunction()

# tamblo_part(NAME SOURCES files... PRIVATE folders...): a library of its own for a few files of a folder
# that may include more than the rest of it.
function(tamblo_part name)
    cmake_parse_arguments(PARSE_ARGV 1 arg "" "" "SOURCES;PRIVATE")
    tamblo_existing("${arg_SOURCES}" sources)
    if(sources)
        add_library(tamblo_${name} STATIC ${sources})
        tamblo_link(tamblo_${name} PRIVATE ${arg_PRIVATE})
    endif()
endfunction()

# Has programs that link `lower` also link `upper`, which defines what `lower` declares, without giving
# `lower` sight of upper's headers. The linker resolves such a circle among static libraries.
function(tamblo_link_from_below lower upper)
    tamblo_target_name(${lower} lower_target)
    get_target_property(type ${lower_target} TYPE)
    if(TARGET tamblo_${upper} AND type STREQUAL "STATIC_LIBRARY")
        set_property(TARGET ${lower_target} APPEND PROPERTY
            INTERFACE_LINK_LIBRARIES "$<LINK_ONLY:tamblo_${upper}>")
    endif()
endfunction()

function(tamblo_link_threads)
    foreach(folder IN LISTS ARGN)
        tamblo_target_name(${folder} target)
        set_property(TARGET ${target} APPEND PROPERTY INTERFACE_LINK_LIBRARIES Threads::Threads)
    endforeach()
endfunction()

# Those of the named files that exist; the configuration is run again when one appears or goes.
function(tamblo_existing files result)
    set(found "")
    foreach(file IN LISTS files)
        file(GLOB match CONFIGURE_DEPENDS RELATIVE "${CMAKE_SOURCE_DIR}" "${file}")
        list(APPEND found ${match})
    endforeach()
    set(${result} "${found}" PARENT_SCOPE)
endfunction()

# tamblo_program(NAME [SELF_CONTAINED] [SOURCES files...] [GLOB patterns...] [LIBRARIES folders...])
# SELF_CONTAINED links the C++ runtime into the program: fewer pages at run time, and one file to ship.
# A program without sources is left out.
function(tamblo_program name)
    cmake_parse_arguments(PARSE_ARGV 1 arg "SELF_CONTAINED" "" "SOURCES;GLOB;LIBRARIES")
    tamblo_existing("${arg_SOURCES};${arg_GLOB}" sources)
    if(NOT sources)
        return()
    endif()
    add_executable(${name} ${sources})
    tamblo_link(${name} PRIVATE ${arg_LIBRARIES})
    if(arg_SELF_CONTAINED AND NOT TAMBLO_SANITIZE AND NOT TAMBLO_FUZZ)
        target_link_options(${name} PRIVATE -static-libstdc++ -static-libgcc)
    endif()
endfunction()

# tamblo_client_library(NAME MAP file FOLDERS folders...): lib<NAME>.so and lib<NAME>.a of everything in these
# folders. The map says which symbols the shared one shows; inline functions are in none of them, as every user
# compiles those itself.
function(tamblo_client_library name)
    cmake_parse_arguments(PARSE_ARGV 1 arg "" "MAP" "FOLDERS")
    set(objects "")
    foreach(folder IN LISTS arg_FOLDERS)
        tamblo_target_name(${folder} target)
        set_target_properties(${target} PROPERTIES VISIBILITY_INLINES_HIDDEN ON)
        list(APPEND objects "$<TARGET_OBJECTS:${target}>")
    endforeach()
    add_library(${name} SHARED ${objects})
    set_target_properties(${name} PROPERTIES LINKER_LANGUAGE CXX VERSION ${PROJECT_VERSION}
        SOVERSION ${PROJECT_VERSION_MAJOR} LINK_DEPENDS "${CMAKE_SOURCE_DIR}/${arg_MAP}")
    target_link_options(${name} PRIVATE "-Wl,--version-script=${CMAKE_SOURCE_DIR}/${arg_MAP}")
    target_link_libraries(${name} PRIVATE Threads::Threads)

    add_library(${name}_static STATIC ${objects})
    set_target_properties(${name}_static PROPERTIES LINKER_LANGUAGE CXX OUTPUT_NAME ${name})
    target_link_libraries(${name}_static PRIVATE Threads::Threads)
endfunction()
