#include "fuzz/Seeds.h"
#include "tools/makers/Img4Maker.h"

int main(int argc, char** argv) {
    using namespace img4maker;
    Payload large;
    large.data = filler(70000);
    const Bytes whole = container(payload(large), {}, {});
    const Bytes beginning(whole.begin(), whole.begin() + 16);
    return writeSeeds(argc, argv, {beginning, container(payload({}), {}, {}), payload({})});
}
