#include "fuzz/Seeds.h"

int main(int count, char** arguments) {
    return writeSeeds<std::string>(count, arguments,
                                   {"\x01[%@:%d] %@\n", "\x07%s %i %u", "\x20%02x %5d %08lX", "\x40%p%%%zu",
                                    "\x05%lld%llu%llx", "\x63%n %.2f %-5d %l%d 100%"});
}
