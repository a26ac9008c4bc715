// Transactions that are on the medium when they return, of this project's volume and of two other
// stores, on the same disk and in one run; and changes in bulk against the rate at which the disk
// takes bytes in a row.
//
// usage: commit_bench FOLDER [--transactions N] [--bulk MIB] [--rounds N]
#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <functional>
#include <map>
#include <random>
#include <vector>

#include "bulk.h"
#include "host_syncs.h"
#include "store.h"

namespace bench {

namespace {

constexpr std::uint32_t kStartRecords = 20000;
constexpr std::uint64_t kJournalBytes = 8u << 20;
constexpr std::uint64_t kBulkJournalBytes = 64u << 20;

struct Arguments {
    std::string folder;
    std::uint32_t transactions = 300;
    std::uint64_t bulkMib = 64;
    std::uint32_t rounds = 3;
};

struct Figures {
    std::vector<double> seconds;  // for one transaction, a value for each round
    double syncs = 0;             // for one transaction
    double syncedWrites = 0;
    double bytes = 0;
};

using Clock = std::chrono::steady_clock;

double SecondsSince(Clock::time_point start) {
    return std::chrono::duration<double>(Clock::now() - start).count();
}

double Median(std::vector<double> values) {
    std::sort(values.begin(), values.end());
    return values[values.size() / 2];
}

void Must(bool done, const std::string& what) {
    if (!done) {
        std::fprintf(stderr, "commit_bench: %s failed\n", what.c_str());
        std::exit(1);
    }
}

// Every number below `count` once, in no order.
std::vector<std::uint32_t> Shuffled(std::uint32_t count) {
    std::vector<std::uint32_t> numbers(count);
    for (std::uint32_t i = 0; i < count; ++i) {
        numbers[i] = i;
    }
    std::shuffle(numbers.begin(), numbers.end(), std::mt19937(7));
    return numbers;
}

struct Contestant {
    std::string name;
    std::function<std::unique_ptr<CommitStore>(const std::string& folder)> make;
};

std::vector<Contestant> Contestants() {
    return {
        {"treehfs, journal", [](const std::string& f) { return MakeTreehfs(f, kJournalBytes); }},
        {"treehfs, none", [](const std::string& f) { return MakeTreehfs(f, 0); }},
        {"sqlite WAL", [](const std::string& f) { return MakeSqlite(f, "WAL"); }},
        {"sqlite rollback", [](const std::string& f) { return MakeSqlite(f, "DELETE"); }},
        {"lmdb", [](const std::string& f) { return MakeLmdb(f); }},
    };
}

std::string EmptyFolder(const Arguments& arguments) {
    const std::string folder = arguments.folder + "/store";
    std::filesystem::remove_all(folder);
    std::filesystem::create_directories(folder);
    return folder;
}

// Transactions of one record each, put at random places of a store with records in it.
void MeasureTransactions(const Arguments& arguments, const Contestant& contestant,
                         Figures* figures) {
    const auto store = contestant.make(EmptyFolder(arguments));
    const std::vector<std::uint32_t> numbers = Shuffled(kStartRecords + arguments.transactions);
    std::uint8_t data[kRecordSize] = {};
    for (std::uint32_t i = 0; i < kStartRecords; ++i) {
        Must(store->Put(numbers[i], data), contestant.name);
        if (store->IsCommitDue()) {
            Must(store->Commit(), contestant.name);
        }
    }
    Must(store->Commit(), contestant.name);
    const HostTally before = Tally();
    const auto start = Clock::now();
    for (std::uint32_t i = 0; i < arguments.transactions; ++i) {
        Must(store->Put(numbers[kStartRecords + i], data) && store->Commit(), contestant.name);
    }
    const double count = arguments.transactions;
    figures->seconds.push_back(SecondsSince(start) / count);
    const HostTally after = Tally();
    figures->syncs = static_cast<double>(after.syncs - before.syncs) / count;
    figures->syncedWrites = static_cast<double>(after.syncedWrites - before.syncedWrites) / count;
    figures->bytes = static_cast<double>(after.bytes - before.bytes) / count;
    Must(store->Count() == kStartRecords + arguments.transactions, contestant.name + ": count");
}

struct BulkFigures {
    double rate = 0;   // bytes a second
    double share = 0;  // of the disk's rate, measured right after
    double bytes = 0;
};

// Records put in, and every one of them put in again, committed in batches. `numbers`: the order.
BulkFigures MeasureBulk(const Arguments& arguments, const std::vector<std::uint32_t>& numbers) {
    const auto store = MakeTreehfs(EmptyFolder(arguments), kBulkJournalBytes);
    std::uint8_t data[kRecordSize] = {};
    const HostTally before = Tally();
    const auto start = Clock::now();
    for (std::uint8_t pass = 1; pass <= 2; ++pass) {
        std::memset(data, pass, sizeof data);
        for (const std::uint32_t number : numbers) {
            Must(store->Put(number, data), "bulk");
            if (store->IsCommitDue()) {
                Must(store->Commit(), "bulk");
            }
        }
    }
    Must(store->Commit(), "bulk");
    const double seconds = SecondsSince(start);
    BulkFigures figures;
    figures.bytes = static_cast<double>(Tally().bytes - before.bytes);
    figures.rate = figures.bytes / seconds;
    const std::uint64_t same = static_cast<std::uint64_t>(figures.bytes);
    const double alone = SecondsToWrite(arguments.folder + "/row", same);
    figures.share = figures.rate / (static_cast<double>(same) / alone);
    return figures;
}

void CompareTransactions(const Arguments& arguments) {
    const std::vector<Contestant> contestants = Contestants();
    std::map<std::string, Figures> figures;
    std::vector<double> plain;
    for (std::uint32_t round = 0; round < arguments.rounds; ++round) {
        plain.push_back(SecondsToSync(arguments.folder + "/block", arguments.transactions) /
                        arguments.transactions);
        for (const Contestant& contestant : contestants) {
            MeasureTransactions(arguments, contestant, &figures[contestant.name]);
        }
    }
    std::printf("one record, committed: %u transactions on %u records, median of %u rounds\n",
                arguments.transactions, kStartRecords, arguments.rounds);
    std::printf("%-18s %10s %8s %14s %12s\n", "", "us", "syncs", "synced writes", "bytes written");
    std::printf("%-18s %10.0f %8.2f %14.2f %12.0f\n", "one block, synced", Median(plain) * 1e6, 1.0,
                0.0, 4096.0);
    for (const Contestant& contestant : contestants) {
        const Figures& found = figures[contestant.name];
        std::printf("%-18s %10.0f %8.2f %14.2f %12.0f\n", contestant.name.c_str(),
                    Median(found.seconds) * 1e6, found.syncs, found.syncedWrites, found.bytes);
    }
}

void MeasureBulks(const Arguments& arguments) {
    const std::uint32_t count =
        static_cast<std::uint32_t>((arguments.bulkMib << 20) / (kRecordSize + 10));
    std::vector<std::uint32_t> rising(count);
    for (std::uint32_t i = 0; i < count; ++i) {
        rising[i] = i;
    }
    std::printf("\nin bulk: %u records put in and put in again, journal of %u MiB\n", count,
                static_cast<unsigned>(kBulkJournalBytes >> 20));
    for (const bool inOrder : {true, false}) {
        std::vector<double> shares;
        BulkFigures found;
        for (std::uint32_t round = 0; round < arguments.rounds; ++round) {
            found = MeasureBulk(arguments, inOrder ? rising : Shuffled(count));
            shares.push_back(found.share);
        }
        std::printf("%-18s %6.0f MB written, %6.0f MB/s, %3.0f%% of the disk's rate in a row\n",
                    inOrder ? "in order" : "in no order", found.bytes / 1e6, found.rate / 1e6,
                    Median(shares) * 100);
    }
}

}  // namespace

}  // namespace bench

int main(int count, char** words) {
    bench::Arguments arguments;
    for (int i = 1; i < count; ++i) {
        const std::string word = words[i];
        const unsigned long value = i + 1 < count ? std::strtoul(words[i + 1], nullptr, 10) : 0;
        if (word == "--transactions" && value != 0) {
            arguments.transactions = static_cast<std::uint32_t>(value);
            ++i;
        } else if (word == "--bulk" && value != 0) {
            arguments.bulkMib = value;
            ++i;
        } else if (word == "--rounds" && value != 0) {
            arguments.rounds = static_cast<std::uint32_t>(value);
            ++i;
        } else if (arguments.folder.empty() && word[0] != '-') {
            arguments.folder = word;
        } else {
            std::fprintf(stderr, "commit_bench: what is '%s'?\n", words[i]);
            return 16;
        }
    }
    if (arguments.folder.empty()) {
        std::fprintf(stderr,
                     "usage: commit_bench FOLDER [--transactions N] [--bulk MIB] "
                     "[--rounds N]\n");
        return 16;
    }
    std::filesystem::create_directories(arguments.folder);
    bench::CompareTransactions(arguments);
    bench::MeasureBulks(arguments);
    std::filesystem::remove_all(arguments.folder + "/store");
    return 0;
}
