// Runs a fuzz target over the files of a folder: replay FOLDER. A broken promise ends the program.

#include <filesystem>
#include <iostream>

#include "input.h"

int main(int argc, char **argv) {
    if (argc != 2) {
        std::cerr << "usage: replay FOLDER\n";
        return 2;
    }
    int files = 0;
    for (const auto &entry : std::filesystem::directory_iterator(argv[1])) {
        std::cout << entry.path() << std::endl;
        std::ifstream file(entry.path(), std::ios::binary);
        const std::string strInput{std::istreambuf_iterator<char>(file),
                                   std::istreambuf_iterator<char>()};
        LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t *>(strInput.data()),
                               strInput.size());
        ++files;
    }
    return files > 0 ? 0 : 1;
}
