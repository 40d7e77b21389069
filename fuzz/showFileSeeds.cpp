#include "fuzz/SeedFile.h"
#include "tests/support/Img4Maker.h"

int main(int argc, char** argv) {
    using namespace img4maker;
    if (argc != 2)
        return 2;
    Manifest second;
    second.version = 2;
    second.properties = {property("brdI", integer(12)), property("proC", boolean(false))};
    second.objects = {object("sepi", {property("eksp", boolean(true)), property("osvr", ia5("1.2"))})};
    Payload packed;
    packed.compression = compression(0, 512);
    packed.properties = payloadProperties({property("entP", integer(1)), property("uuiD", octets(filler(4)))});
    const bool good =
        writeSeed(argv[1], "container", exampleContainer()) && writeSeed(argv[1], "ticket", exampleTicket()) &&
        writeSeed(argv[1], "second-version", manifest(second)) &&
        writeSeed(argv[1], "unsigned", unsignedManifest(second)) && writeSeed(argv[1], "payload", payload(packed)) &&
        writeSeed(argv[1], "small-container",
                  container(payload({}), manifest(second), restoreInfo({property("rcnt", integer(3))}))) &&
        writeSeed(argv[1], "many-objects", largeManifest(5));
    return good ? 0 : 1;
}
