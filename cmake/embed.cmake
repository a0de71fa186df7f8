# Files built into a binary: mokuto_embed_files(OUTPUT file.cpp NAMESPACE ns FILES a.js ...)
# generates a source that defines, for each file, `const std::string_view ns::<name>` with
# its bytes, where <name> is "k" followed by the file's name in camel case
# ("viewer.js" -> kViewerJs). Regenerated whenever one of the files changes.
set(MOKUTO_EMBED_SCRIPT "${CMAKE_CURRENT_LIST_DIR}/embedfiles.cmake")

function(mokuto_embed_files)
  cmake_parse_arguments(E "" "OUTPUT;NAMESPACE" "FILES" ${ARGN})
  add_custom_command(
    OUTPUT "${E_OUTPUT}"
    COMMAND ${CMAKE_COMMAND} "-DOUTPUT=${E_OUTPUT}" "-DNAMESPACE=${E_NAMESPACE}"
            "-DFILES=${E_FILES}" -P "${MOKUTO_EMBED_SCRIPT}"
    DEPENDS ${E_FILES} "${MOKUTO_EMBED_SCRIPT}"
    COMMENT "Embedding ${E_NAMESPACE} files"
    VERBATIM)
endfunction()
