// Seed files for the targets that read whole Img4 files.
#ifndef VELTRA_FUZZ_IMG4_SEEDS_H
#define VELTRA_FUZZ_IMG4_SEEDS_H

#include "fuzz/SeedFile.h"
#include "tests/support/Img4Maker.h"

#include <string>

inline bool writeImg4Seeds(const std::string& folder) {
    using namespace img4maker;
    Manifest second;
    second.version = 2;
    second.properties = {property("brdI", integer(12)), property("proC", boolean(false))};
    second.objects = {object("sepi", {property("eksp", boolean(true)), property("osvr", ia5("1.2"))})};
    Payload packed;
    packed.compression = compression(0, 512);
    packed.properties = payloadProperties({property("entP", integer(1)), property("uuiD", octets(filler(4)))});
    return writeSeed(folder, "container", exampleContainer()) && writeSeed(folder, "ticket", exampleTicket()) &&
           writeSeed(folder, "second-version", manifest(second)) &&
           writeSeed(folder, "unsigned", unsignedManifest(second)) && writeSeed(folder, "payload", payload(packed)) &&
           writeSeed(folder, "small-container",
                     container(payload({}), manifest(second), restoreInfo({property("rcnt", integer(3))}))) &&
           writeSeed(folder, "many-objects", largeManifest(5));
}

#endif
