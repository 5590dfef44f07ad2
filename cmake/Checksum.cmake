# The library's build checksum: the SHA-256 of what `sha256sum` prints for the library's sources
# and headers, listed by their paths relative to the top of the tree in sorted order, so that
#   sha256sum $(sorted files) | sha256sum
# run from the top of the tree gives the same digits. It changes exactly when a source does.
#
# Run as a script: cmake -DSOURCE_DIR=... -DOUTPUT=... -P Checksum.cmake
# The output file is rewritten only when the checksum changed, so an unchanged tree does not
# rebuild the library.

set(VEROLUX_CHECKSUM_FOLDERS frames composition settings rate timing watchdogs diagnostics include)

function(verolux_checksum_inputs source_dir out_var)
    set(globs)
    foreach(folder ${VEROLUX_CHECKSUM_FOLDERS})
        list(APPEND globs ${source_dir}/${folder}/*.cpp ${source_dir}/${folder}/*.h)
    endforeach()
    file(GLOB files RELATIVE ${source_dir} ${globs})
    list(SORT files)
    set(${out_var} ${files} PARENT_SCOPE)
endfunction()

if(CMAKE_SCRIPT_MODE_FILE)
    verolux_checksum_inputs(${SOURCE_DIR} files)
    set(listing "")
    foreach(file ${files})
        file(SHA256 ${SOURCE_DIR}/${file} digest)
        string(APPEND listing "${digest}  ${file}\n")
    endforeach()
    string(SHA256 checksum "${listing}")
    set(content "// Generated at build time from the library's sources; do not edit.\n")
    string(APPEND content "namespace android {\n")
    string(APPEND content "extern const char* INTERPOLATION_CHECKSUM;\n")
    string(APPEND content "const char* INTERPOLATION_CHECKSUM = \"${checksum}\";\n")
    string(APPEND content "}  // namespace android\n")
    if(EXISTS ${OUTPUT})
        file(READ ${OUTPUT} previous)
    endif()
    if(NOT "${previous}" STREQUAL "${content}")
        file(WRITE ${OUTPUT} "${content}")
    endif()
endif()
