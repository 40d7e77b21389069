// One seed for each type at the top of a request, and some that nest.
#include <fstream>
#include <string>

int main(int, char** arguments) {
    const std::string folder = arguments[1];
    for (int type = 0; type < 21; ++type) {
        std::ofstream file(folder + "/type-" + std::to_string(type), std::ios::binary);
        for (int depth = 0; depth < 6; ++depth)
            file << '\1' << static_cast<char>(depth) << static_cast<char>(type) << "\1\2\3\4\5\6\7\10" << '\2';
    }
    return 0;
}
