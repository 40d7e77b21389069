#include "fuzz/Img4Seeds.h"

int main(int argc, char** argv) {
    return argc == 2 && writeImg4Seeds(argv[1]) ? 0 : 1;
}
