# cmake -DMAKE_EXAMPLES=<program> -DEXAMPLES=<folder> -DWORK=<folder> -P <this file>
#
# Fails unless the program makes exactly the blobs that the folder holds.
file(REMOVE_RECURSE ${WORK})
file(MAKE_DIRECTORY ${WORK})
execute_process(COMMAND ${MAKE_EXAMPLES} ${WORK} COMMAND_ERROR_IS_FATAL ANY)
file(GLOB made RELATIVE ${WORK} ${WORK}/*)
file(GLOB kept RELATIVE ${EXAMPLES} ${EXAMPLES}/*.bin)
if(NOT made STREQUAL kept OR made STREQUAL "")
    message(FATAL_ERROR "made: ${made}\nkept: ${kept}")
endif()
foreach(name IN LISTS made)
    file(SHA256 ${WORK}/${name} madeDigest)
    file(SHA256 ${EXAMPLES}/${name} keptDigest)
    if(NOT madeDigest STREQUAL keptDigest)
        message(FATAL_ERROR "${EXAMPLES}/${name} is not what make-examples makes")
    endif()
endforeach()
