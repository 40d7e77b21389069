# veltra_trust_domain(<name> <folder>): the object library <name> with the trust domain of the Img4 decoder, whose roots,
# authority name and object identifier are DER files in <folder>; scripts/make-trust-domain makes such folders. Exactly one
# such library goes into a program or library with the decoder.
function(veltra_trust_domain name folder)
    get_filename_component(folder ${folder} ABSOLUTE BASE_DIR ${PROJECT_SOURCE_DIR})
    file(GLOB files ${folder}/*.der)
    set(source ${CMAKE_CURRENT_BINARY_DIR}/${name}.cpp)
    set(script ${PROJECT_SOURCE_DIR}/cmake/WriteTrustDomain.cmake)
    add_custom_command(OUTPUT ${source}
        COMMAND ${CMAKE_COMMAND} -DFOLDER=${folder} -DSOURCE=${source} -P ${script}
        DEPENDS ${script} ${PROJECT_SOURCE_DIR}/img4/Img4TrustProfileList.h ${files}
        COMMENT "Taking the trust domain from ${folder}"
        VERBATIM)
    add_library(${name} OBJECT ${source})
    target_compile_options(${name} PRIVATE -fno-exceptions -fno-rtti)
endfunction()
