// SPDX-License-Identifier: Apache-2.0
// Runs a fuzz target on the files of a folder, without a fuzzer: the seeds, which hold every input that once broke it,
// are a test like any other.
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

int main(int argumentCount, char** arguments)
{
    if (argumentCount != 2) {
        std::fputs("usage: fuzz_NAME FOLDER-OF-SEEDS\n", stderr);
        return 2;
    }
    unsigned count = 0;
    for (const auto& entry : std::filesystem::directory_iterator(arguments[1])) {
        std::printf("%s\n", entry.path().c_str());
        std::fflush(stdout); // the last line names the seed that crashed
        std::ifstream file(entry.path(), std::ios::binary);
        const std::string bytes{std::istreambuf_iterator(file), {}};
        LLVMFuzzerTestOneInput(reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size());
        ++count;
    }
    return count == 0 ? 1 : 0; // a folder without seeds tests nothing
}
