// Runs a fuzz target without a fuzzer: on every seed in the named folders, and on changed seeds,
// the same in every run.
#include "support/effort.h"
#include "support/files.h"
#include "support/random.h"

#include <fstream>
#include <iterator>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size);

int main(int count, char **arguments)
{
    std::vector<bytes> seeds;
    for (int i = 1; i < count; ++i)
        for (const auto &entry : std::filesystem::directory_iterator(arguments[i])) {
            std::ifstream file(entry.path(), std::ios::binary);
            seeds.emplace_back(std::istreambuf_iterator<char>(file),
                               std::istreambuf_iterator<char>());
            LLVMFuzzerTestOneInput(seeds.back().data(), seeds.back().size());
        }
    if (seeds.empty()) {
        std::fprintf(stderr, "no seeds\n");
        return 1;
    }
    random_numbers random(1);
    for (int left = rounds(5000); left > 0; --left) {
        bytes input = seeds[random.below(static_cast<std::uint32_t>(seeds.size()))];
        for (std::uint32_t changes = random.below(8) + 1; changes > 0 && !input.empty(); --changes)
            input[random.below(static_cast<std::uint32_t>(input.size()))] =
                static_cast<std::uint8_t>(random.below(256));
        LLVMFuzzerTestOneInput(input.data(), input.size());
    }
    std::printf("%zu seeds\n", seeds.size());
    return 0;
}
