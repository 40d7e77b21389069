#include "fuzz/Seeds.h"
#include "tools/makers/CertificateMaker.h"

int main(int count, char** arguments) {
    using namespace certificatemaker;
    const Module first = module({0x01});
    const Module second = module({0xFF, 0x7F, 0x00, 0x00}, KeyKind::Ed25519);
    return writeSeeds(count, arguments,
                      {first.certificate, second.certificate, certsOnlyMessage({}),
                       certsOnlyMessage({first.certificate, second.certificate}), signedMessage(first), dataMessage()});
}
