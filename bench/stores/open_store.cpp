// What a program pays that opens a store and looks a few records up: one process fills the store,
// any number of others open it.
//
//   open_store fill STORE RECORDS SEED FOLDER
//   open_store look STORE FOLDER
//
// `look` prints one JSON line: seconds of processor time and of the clock from before the store is
// opened until the last of 1,000 records is in the caller's buffer. A wrong answer ends it with 1.
#include <sys/resource.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <numeric>

#include "sample.h"
#include "store.h"

namespace {

constexpr std::uint32_t kLookups = 1000;

double Seconds(clockid_t clock) {
    timespec now;
    clock_gettime(clock, &now);
    return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

[[noreturn]] void Fail(const char* what, const std::string& where) {
    std::fprintf(stderr, "open_store: %s: %s\n", what, where.c_str());
    std::exit(1);
}

std::string SamplePath(const std::string& folder) {
    return folder + "/keys";
}

void Fill(const std::string& name, std::uint32_t records, std::uint64_t seed,
          const std::string& folder) {
    const bench::Workload load = bench::MakeWorkload(records, seed);
    const auto store = bench::MakeStore(name, load, folder);
    if (store == nullptr) {
        Fail("no such store", name);
    }
    bench::Batch one;
    store->BeginPhase(true);
    for (const std::uint32_t i : bench::Shuffled(load.count, 7)) {
        one.Fill(load, {&i, 1}, 0);
        if (!store->Insert(one.Records()[0], false)) {
            Fail("inserting", name);
        }
    }
    store->EndPhase();
    store->Keep();
    if (!bench::WriteSample(bench::TakeSample(load, kLookups), SamplePath(folder))) {
        Fail("writing the keys", folder);
    }
}

void Look(const std::string& name, const std::string& folder) {
    bench::Sample sample;
    if (!bench::ReadSample(SamplePath(folder), &sample)) {
        Fail("reading the keys", folder);
    }
    const std::uint32_t count = sample.load.count;
    std::vector<std::uint8_t> data(std::size_t{count} * bench::kLargestData);
    std::vector<int> sizes(count);
    std::vector<std::uint32_t> numbers(count);
    std::iota(numbers.begin(), numbers.end(), 0u);
    bench::Batch keys;
    keys.Fill(sample.load, numbers, bench::Batch::kKeysOnly);
    const double wall = Seconds(CLOCK_MONOTONIC);
    const double busy = Seconds(CLOCK_PROCESS_CPUTIME_ID);
    const auto store = bench::OpenStore(name, sample.load, folder);
    if (store == nullptr) {
        Fail("no such store", name);
    }
    store->BeginPhase(false);
    const double opened = Seconds(CLOCK_PROCESS_CPUTIME_ID);
    for (std::uint32_t k = 0; k < count; ++k) {
        sizes[k] =
            store->Lookup(keys.Records()[k], data.data() + std::size_t{k} * bench::kLargestData);
    }
    const double end = Seconds(CLOCK_PROCESS_CPUTIME_ID);
    const double wallEnd = Seconds(CLOCK_MONOTONIC);
    store->EndPhase();
    for (std::uint32_t k = 0; k < count; ++k) {
        const std::uint32_t size = sample.load.dataSize[k];
        std::uint8_t wanted[bench::kLargestData];
        bench::MakeData(sample.origin[k], 0, size, wanted);
        if (sizes[k] != static_cast<int>(size) ||
            std::memcmp(data.data() + std::size_t{k} * bench::kLargestData, wanted, size) != 0) {
            Fail("wrong answer", name);
        }
    }
    rusage usage;
    getrusage(RUSAGE_SELF, &usage);
    std::printf(
        "{\"store\":\"%s\",\"open\":%.6f,\"lookups\":%.6f,\"seconds\":%.6f,\"wall\":%.6f,"
        "\"peakKiB\":%ld}\n",
        name.c_str(), opened - busy, end - opened, end - busy, wallEnd - wall, usage.ru_maxrss);
}

}  // namespace

int main(int count, char** words) {
    const std::string verb = count > 1 ? words[1] : "";
    if (verb == "fill" && count == 6) {
        Fill(words[2], static_cast<std::uint32_t>(std::strtoul(words[3], nullptr, 0)),
             std::strtoull(words[4], nullptr, 0), words[5]);
    } else if (verb == "look" && count == 4) {
        Look(words[2], words[3]);
    } else {
        std::fprintf(stderr,
                     "usage: open_store fill STORE RECORDS SEED FOLDER\n"
                     "       open_store look STORE FOLDER\n");
        return 16;
    }
    return 0;
}
