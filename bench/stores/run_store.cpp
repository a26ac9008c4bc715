// Runs all operations of the yardstick once on one store and prints one JSON line: seconds and
// count of each operation, peak memory, bytes of the store. A wrong answer ends the run with 1.
//
//   run_store STORE RECORDS SEED FOLDER [read]
//
// read: nothing but the load in random order and what reads, for numbers of records with which the
// rest would take an hour.
#include <sys/resource.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <numeric>

#include "store.h"

namespace {

using bench::Batch;
using bench::Digest;
using bench::Record;
using bench::Store;
using bench::Workload;

struct Result {
    const char* operation;
    double seconds;
    std::size_t count;
};

// Processor time of this process, all threads: nothing here waits for a device, and unlike the wall
// clock it does not count what other programs do meanwhile.
double Seconds() {
    timespec now;
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &now);
    return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

[[noreturn]] void Wrong(const char* operation) {
    std::fprintf(stderr, "wrong answer: %s\n", operation);
    std::exit(1);
}

class Yardstick {
public:
    Yardstick(const Workload& load, std::string name, std::string folder)
        : load_(load), name_(std::move(name)), folder_(std::move(folder)) {}

    void Run(bool onlyReads) {
        if (!onlyReads) {
            LoadInOrder();
            store_.reset();
        }
        LoadAtRandom();
        Read();
        if (!onlyReads) {
            Update();
            Delete();
        }
    }

    void Print() const {
        rusage usage;
        getrusage(RUSAGE_SELF, &usage);
        std::printf(
            "{\"store\":\"%s\",\"records\":%u,\"peakKiB\":%ld,\"bytes\":%llu,\"operations\":{",
            name_.c_str(), load_.count, usage.ru_maxrss, static_cast<unsigned long long>(bytes_));
        for (std::size_t i = 0; i < results_.size(); ++i) {
            std::printf("%s\"%s\":{\"seconds\":%.6f,\"count\":%zu}", i == 0 ? "" : ",",
                        results_[i].operation, results_[i].seconds, results_[i].count);
        }
        std::printf("}}\n");
    }

private:
    // Records gathered at once for the calls that take them: few enough for the processor's cache.
    static constexpr std::size_t kBatch = 256;

    using Numbers = std::span<const std::uint32_t>;

    template <typename Body>
    static void Time(Result* result, Body body) {
        const double start = Seconds();
        body();
        result->seconds += Seconds() - start;
    }

    // One phase of the store. `body` adds to the result what of it is to count.
    template <typename Body>
    Result Phase(const char* operation, bool writing, std::size_t count, Body body) {
        Result result = {operation, 0, count};
        Time(&result, [this, writing] { store_->BeginPhase(writing); });
        body(&result);
        Time(&result, [this] { store_->EndPhase(); });
        return result;
    }

    // A phase of one call for each of these records; one that returns false answered wrongly. Only
    // the calls count: who asks has the key at hand, and the data in the version it is to have.
    template <typename Call>
    Result Each(const char* operation, bool writing, Numbers numbers, std::uint32_t version,
                Call call) {
        return Phase(operation, writing, numbers.size(), [&](Result* result) {
            for (; !numbers.empty(); numbers = numbers.subspan(batch_.Records().size())) {
                batch_.Fill(load_, numbers.first(std::min(kBatch, numbers.size())), version);
                Time(result, [&] {
                    for (const Record& record : batch_.Records()) {
                        if (!call(record)) {
                            Wrong(operation);
                        }
                    }
                });
            }
        });
    }

    Result Insert(const char* operation, Numbers numbers, bool ascending) {
        return Each(operation, true, numbers, 0, [this, ascending](const Record& record) {
            return store_->Insert(record, ascending);
        });
    }

    Result Remove(const char* operation, Numbers numbers) {
        return Each(operation, true, numbers, Batch::kKeysOnly,
                    [this](const Record& record) { return store_->Delete(record); });
    }

    void Open(const char* part) {
        const std::string folder = folder_ + "/" + part;
        store_ = bench::MakeStore(name_, load_, folder);
        if (store_ == nullptr) {
            std::fprintf(stderr, "no such store: %s\n", name_.c_str());
            std::exit(16);
        }
    }

    void LoadInOrder() {
        Open("ordered");
        std::vector<std::uint32_t> sorted(load_.count);
        std::iota(sorted.begin(), sorted.end(), 0u);
        std::sort(sorted.begin(), sorted.end(),
                  [this](std::uint32_t a, std::uint32_t b) { return store_->Less(a, b); });
        results_.push_back(Insert("load in key order", sorted, true));
    }

    // Half of the records are loaded first, so that the absent keys lie among the present ones.
    void LoadAtRandom() {
        Open("random");
        const char* const operation = "load in random order";
        const std::vector<std::uint32_t> order = bench::Shuffled(load_.count, 7);
        const Numbers first = Numbers(order).first(order.size() / 2);
        const Numbers others = Numbers(order).subspan(first.size());
        const Result half = Insert(operation, first, false);
        results_.push_back(
            Each("lookup, absent", false, others, Batch::kKeysOnly,
                 [this](const Record& record) { return store_->Lookup(record, data_) == -1; }));
        results_.push_back(Sum(operation, half, Insert(operation, others, false)));
        bytes_ = store_->Bytes();
    }

    // Every record has the data of that version, byte for byte.
    void Check(Numbers numbers, std::uint32_t version) {
        Each("lookup", false, numbers, version, [this](const Record& record) {
            return store_->Lookup(record, data_) == static_cast<int>(record.size) &&
                   std::memcmp(data_, record.data, record.size) == 0;
        });
    }

    // Both walks; what they deliver is looked at from end to end, or only by its ends, which costs
    // next to nothing beside a step.
    std::array<Result, 2> Walk(Digest::Kind kind) {
        Digest wanted(kind);
        for (std::uint32_t i = 0; i < load_.count; ++i) {
            bench::MakeData(i, 0, load_.dataSize[i], data_);
            wanted.Add(data_, load_.dataSize[i]);
        }
        Digest seen(kind);
        const Result scan = Phase("full scan", false, load_.count, [&](Result* result) {
            Time(result, [&] {
                if (store_->Scan(&seen) != load_.count) {
                    Wrong("full scan");
                }
            });
        });
        if (seen != wanted) {
            Wrong("full scan");
        }
        seen = Digest(kind);
        const std::vector<std::uint32_t> folders = bench::Shuffled(load_.folders, 13);
        const Result list = Phase("folder listing", false, load_.folders, [&](Result* result) {
            Time(result, [&] {
                for (const std::uint32_t folder : folders) {
                    if (store_->List(bench::kFirstParent + folder, &seen) !=
                        load_.folderSize[folder]) {
                        Wrong("folder listing");
                    }
                }
            });
        });
        if (seen != wanted) {
            Wrong("folder listing");
        }
        return {scan, list};
    }

    void Read() {
        const std::vector<std::uint32_t> order = bench::Shuffled(load_.count, 11);
        Check(order, 0);  // warms, too
        results_.push_back(
            Each("lookup, existing", false, order, Batch::kKeysOnly, [this](const Record& record) {
                return store_->Lookup(record, data_) == static_cast<int>(record.size);
            }));
        Walk(Digest::kWhole);
        for (const Result& result : Walk(Digest::kBrief)) {
            results_.push_back(result);
        }
    }

    void Update() {
        const std::vector<std::uint32_t> order = bench::Shuffled(load_.count, 17);
        results_.push_back(Each("update in place", true, order, 1,
                                [this](const Record& record) { return store_->Update(record); }));
        Check(order, 1);
    }

    // Whether a walk meets as many records as that.
    void CheckCount(const char* operation, std::size_t count) {
        Digest sum(Digest::kBrief);
        store_->BeginPhase(false);
        if (store_->Scan(&sum) != count) {
            Wrong(operation);
        }
        store_->EndPhase();
    }

    void Delete() {
        const std::vector<std::uint32_t> order = bench::Shuffled(load_.count, 17);
        const Numbers first = Numbers(order).first(order.size() / 2);
        const Numbers others = Numbers(order).subspan(first.size());
        const Result half = Remove("delete half", first);
        CheckCount("delete half", others.size());
        Check(others, 1);
        const Result rest = Remove("delete the rest", others);
        CheckCount("delete the rest", 0);
        results_.insert(results_.end(), {half, rest, Sum("delete all", half, rest)});
    }

    static Result Sum(const char* operation, const Result& a, const Result& b) {
        return {operation, a.seconds + b.seconds, a.count + b.count};
    }

    const Workload& load_;
    std::string name_;
    std::string folder_;
    std::unique_ptr<Store> store_;
    Batch batch_;
    std::vector<Result> results_;
    std::uint64_t bytes_ = 0;
    std::uint8_t data_[bench::kLargestData] = {};
};

}  // namespace

int main(int count, char** words) {
    const bool onlyReads = count == 6 && std::string(words[5]) == "read";
    if (count != 5 && !onlyReads) {
        std::fprintf(stderr, "usage: run_store STORE RECORDS SEED FOLDER [read]\n");
        return 16;
    }
    const Workload load =
        bench::MakeWorkload(static_cast<std::uint32_t>(std::strtoul(words[2], nullptr, 0)),
                            std::strtoull(words[3], nullptr, 0));
    Yardstick yardstick(load, words[1], words[4]);
    yardstick.Run(onlyReads);
    yardstick.Print();
    return 0;
}
