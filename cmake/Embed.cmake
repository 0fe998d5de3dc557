# Files as parts of a program. tamblo_embed(TARGET HEADER NAMESPACE files...) compiles them into the target as
# constants of this namespace, which the header declares as `std::string_view`; a/page.css becomes page_css.
# They are made anew when a file changes. Run as a script, this makes the source file of one of them.

if(CMAKE_SCRIPT_MODE_FILE)
    file(READ "${FILE}" content)
    # A literal has a longest length that compilers must accept, so that it comes in pieces; none of the
    # files has the delimiter.
    string(LENGTH "${content}" length)
    set(pieces "\n    \"\"")
    set(at 0)
    while(at LESS length)
        string(SUBSTRING "${content}" ${at} 8000 piece)
        string(APPEND pieces "\n    R\"embedded(${piece})embedded\"")
        math(EXPR at "${at} + 8000")
    endwhile()
    file(WRITE "${OUTPUT}" "#include \"${HEADER}\"\n\nnamespace ${NAMESPACE} {\n\n"
        "constexpr char kContent[] =${pieces};\n"
        "const std::string_view ${NAME}{kContent, sizeof kContent - 1};\n\n} // namespace ${NAMESPACE}\n")
    return()
endif()

set(tamblo_embed_script "${CMAKE_CURRENT_LIST_FILE}")
function(tamblo_embed target header namespace)
    foreach(file IN LISTS ARGN)
        get_filename_component(name "${file}" NAME)
        string(MAKE_C_IDENTIFIER "${name}" name)
        set(source "${CMAKE_BINARY_DIR}/embedded/${target}/${name}.cpp")
        add_custom_command(OUTPUT "${source}" DEPENDS "${CMAKE_SOURCE_DIR}/${file}" "${tamblo_embed_script}"
            COMMAND "${CMAKE_COMMAND}" "-DFILE=${CMAKE_SOURCE_DIR}/${file}" "-DOUTPUT=${source}"
                "-DHEADER=${header}" "-DNAMESPACE=${namespace}" "-DNAME=${name}" -P "${tamblo_embed_script}"
            VERBATIM)
        target_sources(${target} PRIVATE "${source}")
    endforeach()
endfunction()
