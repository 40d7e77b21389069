# cmake -DLIBRARY=<shared library> -DMARK=<macro> -DHEADERS=<glob> -DNM=<nm> -DREADELF=<readelf> -P <this file>
#
# Fails unless the shared library exports exactly the names that the headers declare behind the export macro MARK, and
# unless it does without the C++ library.
file(GLOB headers ${HEADERS})
set(documented "")
foreach(header IN LISTS headers)
    file(READ ${header} text)
    # Semicolons and brackets would upset the list of matches.
    string(REPLACE ";" "!" text "${text}")
    string(REPLACE "[" "!" text "${text}")
    string(REGEX MATCHALL "\n${MARK} [^!(]*[!(]" declarations "${text}")
    foreach(declaration IN LISTS declarations)
        string(REGEX REPLACE "^.*[ *\n]([A-Za-z0-9_]+)[!(]$" "\\1" name "${declaration}")
        list(APPEND documented ${name})
    endforeach()
endforeach()
list(SORT documented)

execute_process(COMMAND ${NM} -D --defined-only --format=posix ${LIBRARY} OUTPUT_VARIABLE symbols
    COMMAND_ERROR_IS_FATAL ANY)
string(REGEX MATCHALL "[^\n]+" symbols "${symbols}")
list(TRANSFORM symbols REPLACE " .*" "")
list(SORT symbols)

if(documented STREQUAL "" OR NOT symbols STREQUAL documented)
    message(FATAL_ERROR "exported:   ${symbols}\ndocumented: ${documented}")
endif()

execute_process(COMMAND ${READELF} -d ${LIBRARY} OUTPUT_VARIABLE dynamic COMMAND_ERROR_IS_FATAL ANY)
if(dynamic MATCHES "libstdc\\+\\+")
    message(FATAL_ERROR "${LIBRARY} needs the C++ library")
endif()
