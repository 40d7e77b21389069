#include "fuzz/Img4Seeds.h"

int main(int argc, char** argv) {
    return writeImg4Seeds(argc, argv);
}
