# cmake -DFOLDER=<trust domain> -DSOURCE=<file> -P <this file>: writes the domain's DER files as C++.
file(READ ${CMAKE_CURRENT_LIST_DIR}/../img4/Img4TrustProfileList.h roots)
string(REGEX MATCHALL "[A-Z0-9_]*ROOT_CA_CERTIFICATE[A-Z0-9_]*" roots "${roots}")

# Appends the octets of <file>.der to the text as the array <name>.
function(append_array name file)
    if(NOT EXISTS ${FOLDER}/${file}.der)
        message(FATAL_ERROR "The trust domain in ${FOLDER} has no ${file}.der")
    endif()
    file(READ ${FOLDER}/${file}.der octets HEX)
    string(REGEX REPLACE "(..)" "0x\\1, " octets "${octets}")
    set(text "${text}constexpr uint8_t ${name}[] = {${octets}};\n" PARENT_SCOPE)
endfunction()

set(text "#include \"img4/Img4TrustInternal.h\"\n\nnamespace {\n\n")
set(items "")
foreach(root IN LISTS roots)
    append_array(${root}_octets ${root})
    string(APPEND items "const DERItem ${root} = {${root}_octets, sizeof ${root}_octets};\n")
endforeach()
append_array(authorityName authority-name)
append_array(oid manifest-cert-spec-oid)
string(APPEND text [[
static_assert(authorityName[0] == 0x13, "the authority's name is no PrintableString");
static_assert(oid[0] == DERTagObjectIdentifier && oid[1] == sizeof oid - 2, "no object identifier of the constraints");

} // namespace

]])
string(APPEND items [[
const DERItem oidTevariImg4ManifestCertSpec = {oid + 2, sizeof oid - 2};
const Img4TrustDomain Img4BuiltInTrustDomain = {{authorityName, sizeof authorityName}, {oid + 2, sizeof oid - 2}};
]])
file(WRITE ${SOURCE} "${text}${items}")
