// Transactions that are on the medium when they return, of this project's volume and of two other
// stores, on the same disk and in one run; and changes in bulk against the rate at which the disk
// takes bytes in a row.
//
// usage: commit_bench FOLDER [--transactions N] [--bulk MIB] [--rounds N] [--order ORDER]
//   N transactions, or 0 for changes in bulk alone; ORDER of the latter: rising, none or both
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
    std::string order = "both";
};

struct Figures {
    std::vector<double> seconds;  // for one transaction, a value for each round
    double syncs = 0;             // for one transaction
    double syncedWrites = 0;
    double bytes = 0;
};

bool IsOrder(const std::string& word) {
    return word == "rising" || word == "none" || word == "both";
}

using Clock = std::chrono::steady_clock;

double SecondsSince(Clock::time_point start) {
    return std::chrono::duration<double>(Clock::now() - start).count();
}

double Median(std::vector<double> values) {
    std::sort(values.begin(), values.end());
    return values[values.size() / 2];
}

void Must(bool done, const char* what) {
    if (!done) {
        std::fprintf(stderr, "commit_bench: %s failed\n", what);
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
        Must(store->Put(numbers[i], data), contestant.name.c_str());
        if (store->IsCommitDue()) {
            Must(store->Commit(), contestant.name.c_str());
        }
    }
    Must(store->Commit(), contestant.name.c_str());
    const HostTally before = Tally();
    const auto start = Clock::now();
    for (std::uint32_t i = 0; i < arguments.transactions; ++i) {
        Must(store->Put(numbers[kStartRecords + i], data) && store->Commit(),
             contestant.name.c_str());
    }
    const double count = arguments.transactions;
    figures->seconds.push_back(SecondsSince(start) / count);
    const HostTally after = Tally();
    figures->syncs = static_cast<double>(after.syncs - before.syncs) / count;
    figures->syncedWrites = static_cast<double>(after.syncedWrites - before.syncedWrites) / count;
    figures->bytes = static_cast<double>(after.bytes - before.bytes) / count;
    Must(store->Count() == kStartRecords + arguments.transactions, "counting what was put in");
}

// Seconds, and bytes handed to the host in them.
struct BulkFigures {
    double seconds = 0;        // from the first record to the end of the last commit
    double commitSeconds = 0;  // of these: inside commits
    double diskSeconds = 0;    // for as many bytes in a row into a plain file, right after
    double bytes = 0;
    std::uint32_t commits = 0;
};

using Tracked = double BulkFigures::*;

// Of the disk's rate in a row, as bytes written over the seconds of `part`.
double Share(const BulkFigures& figures, Tracked part) {
    return figures.diskSeconds / (figures.*part);
}

// Records put in, and every one of them put in again, committed in batches. `numbers`: the order.
BulkFigures MeasureBulk(const Arguments& arguments, const std::vector<std::uint32_t>& numbers) {
    const auto store = MakeTreehfs(EmptyFolder(arguments), kBulkJournalBytes);
    BulkFigures figures;
    const auto commit = [&] {
        const auto start = Clock::now();
        Must(store->Commit(), "bulk");
        figures.commitSeconds += SecondsSince(start);
        figures.commits += 1;
    };
    std::uint8_t data[kRecordSize] = {};
    const HostTally before = Tally();
    const auto start = Clock::now();
    for (std::uint8_t pass = 1; pass <= 2; ++pass) {
        std::memset(data, pass, sizeof data);
        for (const std::uint32_t number : numbers) {
            Must(store->Put(number, data), "bulk");
            if (store->IsCommitDue()) {
                commit();
            }
        }
    }
    commit();
    figures.seconds = SecondsSince(start);
    figures.bytes = static_cast<double>(Tally().bytes - before.bytes);
    figures.diskSeconds =
        SecondsToWrite(arguments.folder + "/row", static_cast<std::uint64_t>(figures.bytes));
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

// Medians. The rates are of bytes written, as shares of the disk's for the same bytes in a row:
// while a commit is under way, and over everything, the work on the tree among it.
void PrintBulk(const char* order, const std::vector<BulkFigures>& rounds) {
    const auto median = [&](const std::function<double(const BulkFigures&)>& figure) {
        std::vector<double> values;
        for (const BulkFigures& round : rounds) {
            values.push_back(figure(round));
        }
        return Median(values);
    };
    const auto seconds = [&](Tracked part) {
        return median([&](const BulkFigures& round) { return round.*part; });
    };
    const auto share = [&](Tracked part) {
        return 100 * median([&](const BulkFigures& round) { return Share(round, part); });
    };
    std::printf("%-18s %10.0f %8u %9.2f %9.2f %9.2f %13.0f%% %13.0f%%\n", order,
                rounds.back().bytes / 1e6, rounds.back().commits,
                seconds(&BulkFigures::diskSeconds), seconds(&BulkFigures::commitSeconds),
                seconds(&BulkFigures::seconds), share(&BulkFigures::commitSeconds),
                share(&BulkFigures::seconds));
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
    std::printf("%-18s %10s %8s %9s %9s %9s %14s %14s\n", "", "MB written", "commits", "disk s",
                "commits s", "all s", "commits' rate", "rate of all");
    for (const bool inOrder : {true, false}) {
        if (arguments.order == (inOrder ? "none" : "rising")) {
            continue;
        }
        std::vector<BulkFigures> rounds;
        for (std::uint32_t round = 0; round < arguments.rounds; ++round) {
            rounds.push_back(MeasureBulk(arguments, inOrder ? rising : Shuffled(count)));
        }
        PrintBulk(inOrder ? "in order" : "in no order", rounds);
    }
}

}  // namespace

}  // namespace bench

int main(int count, char** words) {
    bench::Arguments arguments;
    for (int i = 1; i < count; ++i) {
        const std::string word = words[i];
        const bool hasValue = i + 1 < count;
        const unsigned long value = hasValue ? std::strtoul(words[i + 1], nullptr, 10) : 0;
        if (word == "--transactions" && hasValue) {
            arguments.transactions = static_cast<std::uint32_t>(value);
            ++i;
        } else if (word == "--bulk" && value != 0) {
            arguments.bulkMib = value;
            ++i;
        } else if (word == "--rounds" && value != 0) {
            arguments.rounds = static_cast<std::uint32_t>(value);
            ++i;
        } else if (word == "--order" && hasValue && bench::IsOrder(words[i + 1])) {
            arguments.order = words[++i];
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
                     "[--rounds N] [--order rising|none|both]\n");
        return 16;
    }
    std::filesystem::create_directories(arguments.folder);
    if (arguments.transactions != 0) {
        bench::CompareTransactions(arguments);
    }
    bench::MeasureBulks(arguments);
    std::filesystem::remove_all(arguments.folder + "/store");
    return 0;
}
