#include "fuzz/SeedFile.h"
#include "tests/support/Img4Maker.h"

int main(int argc, char** argv) {
    using namespace img4maker;
    if (argc != 2)
        return 2;
    Payload large;
    large.data = filler(70000);
    const Bytes whole = container(payload(large), {}, {});
    const Bytes beginning(whole.begin(), whole.begin() + 16);
    const bool good = writeSeed(argv[1], "beginning", beginning) &&
                      writeSeed(argv[1], "small", container(payload({}), {}, {})) &&
                      writeSeed(argv[1], "payload", payload({}));
    return good ? 0 : 1;
}
