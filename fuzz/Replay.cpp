#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <vector>

#include "fuzz/Check.h"

/// Runs the fuzz target over every file of the folders given. Names each file first, so that the last name before a
/// crash is the culprit's.
int main(int argc, char** argv)
{
    std::vector<std::filesystem::path> files;
    for (int i = 1; i < argc; ++i)
        for (const auto& entry : std::filesystem::directory_iterator(argv[i])) files.push_back(entry.path());
    std::ranges::sort(files);
    for (const auto& file : files) {
        std::printf("%s\n", file.c_str());
        std::fflush(stdout);
        std::ifstream stream(file, std::ios::binary);
        check(stream.is_open(), file.string());
        const std::string contents(std::istreambuf_iterator<char>(stream), {});
        LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t*>(contents.data()), contents.size());
    }
    if (files.empty()) std::fprintf(stderr, "no files to replay\n");
    return files.empty() ? 1 : 0;
}
