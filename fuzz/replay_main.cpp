// Runs a fuzz target without libFuzzer: over the files given, those in folders given, and over
// variations of each, so that any compiler and the ordinary tests can use corpora.
//
// usage: TARGET [--variations N] [--seed N] FILE_OR_FOLDER...
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <random>
#include <string>
#include <vector>

#include "fuzz.h"
#include "mutate.h"

// Targets without a mutation of their own are varied byte by byte.
extern "C" __attribute__((weak)) std::size_t LLVMFuzzerCustomMutator(VELK::u8* data,
                                                                     std::size_t size,
                                                                     std::size_t most,
                                                                     unsigned seed);

namespace {

std::mt19937 randomBytes(1);

using Bytes = VELK::test::Bytes;

Bytes ReadAll(const std::filesystem::path& path) {
    std::ifstream file(path, std::ios::binary);
    return Bytes(std::istreambuf_iterator<char>(file), {});
}

// Leaves each input where a crash finds the one that led to it. The file stays open: where one is
// cut short and closed, some file systems write it to the disk at once, which takes longer than a
// run.
void Keep(const Bytes& input) {
    static std::FILE* const file = std::fopen("last-input", "wb");
    if (file == nullptr) {
        std::perror("last-input");
        std::exit(1);
    }
    std::rewind(file);
    std::fwrite(input.data(), 1, input.size(), file);
    std::fflush(file);
    if (ftruncate(fileno(file), static_cast<off_t>(input.size())) != 0) {
        std::perror("last-input");
        std::exit(1);
    }
}

void RunOne(const Bytes& input) {
    Keep(input);
    LLVMFuzzerTestOneInput(input.data(), input.size());
}

constexpr VELK::u8 kTelling[] = {0x00, 0x01, 0x02, 0x0E, 0x7F, 0x80, 0xF8, 0xFE, 0xFF};

// A few small changes in places near each other or far apart.
Bytes VaryBytes(Bytes input) {
    const auto below = [](std::size_t limit) { return randomBytes() % limit; };
    if (input.empty()) {
        return input;
    }
    std::size_t at = below(input.size());
    for (std::size_t changes = 1 + below(6); changes != 0; --changes) {
        at = below(3) == 0 ? below(input.size()) : std::min(at + below(9), input.size() - 1);
        switch (below(4)) {
            case 0:
                input[at] = static_cast<VELK::u8>(input[at] ^ (1u << below(8)));
                break;
            case 1:
                input[at] = static_cast<VELK::u8>(below(256));
                break;
            case 2:
                input[at] = kTelling[below(sizeof kTelling)];
                break;
            default: {
                const std::size_t from = below(input.size());
                const std::size_t size = std::min(1 + below(64), input.size() - std::max(at, from));
                std::memmove(input.data() + at, input.data() + from, size);
            }
        }
    }
    if (below(16) == 0) {
        input.resize(1 + below(input.size()));
    }
    return input;
}

// As libFuzzer does: the target's own mutation, where it has one.
Bytes Vary(Bytes input) {
    if (LLVMFuzzerCustomMutator == nullptr) {
        return VaryBytes(std::move(input));
    }
    constexpr std::size_t kGrowth = 64;
    const std::size_t size = input.size();
    input.resize(size + kGrowth);
    const unsigned seed = static_cast<unsigned>(randomBytes());
    input.resize(LLVMFuzzerCustomMutator(input.data(), size, input.size(), seed));
    return input;
}

}  // namespace

extern "C" std::size_t LLVMFuzzerMutate(VELK::u8* data, std::size_t size, std::size_t most) {
    const Bytes varied = VaryBytes(Bytes(data, data + size));
    const std::size_t kept = std::min(varied.size(), most);
    std::copy_n(varied.begin(), kept, data);
    return kept;
}

int main(int argc, char** argv) {
    unsigned long variations = 0;
    std::vector<std::filesystem::path> files;
    for (int i = 1; i < argc; ++i) {
        const std::string argument = argv[i];
        if (argument == "--variations" && i + 1 < argc) {
            variations = std::strtoul(argv[++i], nullptr, 10);
        } else if (argument == "--seed" && i + 1 < argc) {
            randomBytes.seed(static_cast<unsigned>(std::strtoul(argv[++i], nullptr, 10)));
        } else if (std::filesystem::is_directory(argument)) {
            for (const auto& entry : std::filesystem::directory_iterator(argument)) {
                files.push_back(entry.path());
            }
        } else {
            files.emplace_back(argument);
        }
    }
    std::sort(files.begin(), files.end());
    unsigned long runs = 0;
    for (const std::filesystem::path& file : files) {
        const Bytes input = ReadAll(file);
        RunOne(input);
        for (unsigned long i = 0; i < variations; ++i) {
            RunOne(Vary(input));
        }
        runs += 1 + variations;
    }
    std::printf("%zu files, %lu runs\n", files.size(), runs);
    return runs == 0 ? 1 : 0;
}
