// Seed files for the targets that read whole Img4 files.
#ifndef VELTRA_FUZZ_IMG4_SEEDS_H
#define VELTRA_FUZZ_IMG4_SEEDS_H

#include "fuzz/Seeds.h"
#include "tools/makers/Img4Maker.h"

inline int writeImg4Seeds(int argc, char** argv) {
    using namespace img4maker;
    Manifest second;
    second.version = 2;
    second.properties = {property("brdI", integer(12)), property("proC", boolean(false))};
    second.objects = {object("sepi", {property("eksp", boolean(true)), property("osvr", ia5("1.2"))})};
    Payload packed;
    packed.compression = compression(0, 512);
    packed.properties = payloadProperties({property("entP", integer(1)), property("uuiD", octets(filler(4)))});
    return writeSeeds(argc, argv,
                      {exampleContainer(), exampleTicket(), manifest(second), unsignedManifest(second), payload(packed),
                       largeManifest(5),
                       container(payload({}), manifest(second), restoreInfo({property("rcnt", integer(3))}))});
}

#endif
