// Runs a libFuzzer target without libFuzzer: every file named on the command line,
// or found directly inside a directory named there, is passed once to
// LLVMFuzzerTestOneInput. Lets any compiler's build replay the seed corpus (and
// crash reproducers) as a plain test. Fails when it found nothing to run.
#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <vector>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size);
extern "C" __attribute__((weak)) int LLVMFuzzerInitialize(int* argc, char*** argv);

namespace {

void runFile(const std::filesystem::path& path) {
    // Exactly the file's size on the heap, so that a sanitizer build sees any read past
    // the end.
    std::vector<uint8_t> input(std::filesystem::file_size(path));
    std::ifstream(path, std::ios::binary)
        .read(reinterpret_cast<char*>(input.data()), static_cast<std::streamsize>(input.size()));
    LLVMFuzzerTestOneInput(input.empty() ? nullptr : input.data(), input.size());
}

}  // namespace

int main(int argc, char** argv) {
    if (LLVMFuzzerInitialize != nullptr)
        LLVMFuzzerInitialize(&argc, &argv);
    std::vector<std::filesystem::path> files;
    for (int i = 1; i < argc; ++i) {
        const std::filesystem::path path(argv[i]);
        if (std::filesystem::is_directory(path)) {
            for (const auto& entry : std::filesystem::directory_iterator(path)) {
                if (entry.is_regular_file())
                    files.push_back(entry.path());
            }
        } else if (std::filesystem::is_regular_file(path)) {
            files.push_back(path);
        } else {
            fprintf(stderr, "replay: no such file or directory: %s\n", argv[i]);
            return 1;
        }
    }
    // In name order, so that a failing run is repeated input for input.
    std::sort(files.begin(), files.end());
    for (const auto& file : files)
        runFile(file);
    printf("replay: %zu inputs\n", files.size());
    return files.empty() ? 1 : 0;
}
