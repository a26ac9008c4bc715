// Runs all operations of the yardstick once on one store and prints one JSON line: seconds and
// count of each operation, peak memory, bytes of the store. A wrong answer ends the run with 1.
//
//   run_store STORE RECORDS SEED FOLDER [read]
//
// read: nothing but the load in random order and what reads, for numbers of records with which the
// rest would take an hour.
#include <sys/resource.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <numeric>

#include "store.h"

namespace {

using bench::Store;
using bench::Workload;

struct Result {
    const char* operation;
    double seconds;
    std::uint32_t count;
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
        : load_(load), name_(std::move(name)), folder_(std::move(folder)), half_(load.count / 2) {
        // Records at odd places of a shuffle stay absent until the last operations.
        order_ = bench::Shuffled(load.count, 7);
    }

    void Run(bool onlyReads) {
        if (!onlyReads) {
            LoadInOrder();
            store_.reset();
        }
        LoadAtRandom();
        Read();
        if (!onlyReads) {
            Change();
        }
    }

    void Print() const {
        rusage usage;
        getrusage(RUSAGE_SELF, &usage);
        std::printf(
            "{\"store\":\"%s\",\"records\":%u,\"peakKiB\":%ld,\"bytes\":%llu,\"operations\":{",
            name_.c_str(), load_.count, usage.ru_maxrss, static_cast<unsigned long long>(bytes_));
        for (std::size_t i = 0; i < results_.size(); ++i) {
            std::printf("%s\"%s\":{\"seconds\":%.6f,\"count\":%u}", i == 0 ? "" : ",",
                        results_[i].operation, results_[i].seconds, results_[i].count);
        }
        std::printf("}}\n");
    }

private:
    template <typename Body>
    void Time(const char* operation, bool writing, std::uint32_t count, Body body) {
        const double start = Seconds();
        store_->BeginPhase(writing);
        body();
        store_->EndPhase();
        results_.push_back({operation, Seconds() - start, count});
    }

    void Open(const char* part) {
        const std::string folder = folder_ + "/" + part;
        store_ = bench::MakeStore(name_, load_, folder);
        if (store_ == nullptr) {
            std::fprintf(stderr, "no such store: %s\n", name_.c_str());
            std::exit(16);
        }
    }

    void Insert(std::uint32_t i, bool ascending) {
        bench::MakeData(i, 0, load_.dataSize[i], data_);
        if (!store_->Insert(i, data_, load_.dataSize[i], ascending)) {
            Wrong("insert");
        }
    }

    void LoadInOrder() {
        Open("ordered");
        std::vector<std::uint32_t> sorted(load_.count);
        std::iota(sorted.begin(), sorted.end(), 0u);
        std::sort(sorted.begin(), sorted.end(),
                  [this](std::uint32_t a, std::uint32_t b) { return store_->Less(a, b); });
        Time("load in key order", true, load_.count, [&] {
            for (const std::uint32_t i : sorted) {
                Insert(i, true);
            }
        });
        bytesOrdered_ = store_->Bytes();
    }

    // Half of the records are loaded first, so that the absent keys lie among the present ones.
    void LoadAtRandom() {
        Open("random");
        Time("half load", true, half_, [&] {
            for (std::uint32_t k = 0; k < half_; ++k) {
                Insert(order_[k], false);
            }
        });
        const double firstHalf = results_.back().seconds;
        results_.pop_back();
        Time("lookup, absent", false, load_.count - half_, [&] {
            for (std::uint32_t k = half_; k < load_.count; ++k) {
                if (store_->Lookup(order_[k], data_) != -1) {
                    Wrong("lookup, absent");
                }
            }
        });
        Time("load in random order", true, load_.count, [&] {
            for (std::uint32_t k = half_; k < load_.count; ++k) {
                Insert(order_[k], false);
            }
        });
        results_.back().seconds += firstHalf;
        bytes_ = store_->Bytes();
    }

    void CheckData(std::uint32_t i, std::uint32_t version, int size) {
        std::uint8_t wanted[bench::kLargestData];
        bench::MakeData(i, version, load_.dataSize[i], wanted);
        if (size != load_.dataSize[i] || bench::Digest(data_, static_cast<std::size_t>(size)) !=
                                             bench::Digest(wanted, load_.dataSize[i])) {
            Wrong("lookup");
        }
    }

    void Read() {
        const std::vector<std::uint32_t> order = bench::Shuffled(load_.count, 11);
        std::uint64_t wanted = 0;
        for (std::uint32_t i = 0; i < load_.count; ++i) {
            bench::MakeData(i, 0, load_.dataSize[i], data_);
            wanted += bench::Digest(data_, load_.dataSize[i]);
        }
        store_->BeginPhase(false);  // warm
        for (std::uint32_t k = 0; k < load_.count; ++k) {
            CheckData(order[k], 0, store_->Lookup(order[k], data_));
        }
        store_->EndPhase();
        Time("lookup, existing", false, load_.count, [&] {
            for (const std::uint32_t i : order) {
                if (store_->Lookup(i, data_) != load_.dataSize[i]) {
                    Wrong("lookup, existing");
                }
            }
        });
        std::uint64_t sum = 0;
        Time("full scan", false, load_.count, [&] {
            if (store_->Scan(&sum) != load_.count || sum != wanted) {
                Wrong("full scan");
            }
        });
        const std::vector<std::uint32_t> folders = bench::Shuffled(load_.folders, 13);
        sum = 0;
        Time("folder listing", false, load_.folders, [&] {
            for (const std::uint32_t folder : folders) {
                if (store_->List(16 + folder, &sum) != load_.folderSize[folder]) {
                    Wrong("folder listing");
                }
            }
        });
        if (sum != wanted) {
            Wrong("folder listing");
        }
    }

    void Change() {
        const std::vector<std::uint32_t> order = bench::Shuffled(load_.count, 17);
        Time("update in place", true, load_.count, [&] {
            for (const std::uint32_t i : order) {
                bench::MakeData(i, 1, load_.dataSize[i], data_);
                if (!store_->Update(i, data_, load_.dataSize[i])) {
                    Wrong("update in place");
                }
            }
        });
        store_->BeginPhase(false);
        for (const std::uint32_t i : order) {
            CheckData(i, 1, store_->Lookup(i, data_));
        }
        store_->EndPhase();
        const auto removeRange = [&](std::uint32_t from, std::uint32_t to) {
            for (std::uint32_t k = from; k < to; ++k) {
                if (!store_->Delete(order[k])) {
                    Wrong("delete");
                }
            }
        };
        Time("delete half", true, half_, [&] { removeRange(0, half_); });
        std::uint64_t sum = 0;
        store_->BeginPhase(false);
        if (store_->Scan(&sum) != load_.count - half_ || store_->Lookup(order[0], data_) != -1) {
            Wrong("delete half");
        }
        store_->EndPhase();
        Time("delete all", true, load_.count - half_, [&] { removeRange(half_, load_.count); });
        store_->BeginPhase(false);
        if (store_->Scan(&sum) != 0) {
            Wrong("delete all");
        }
        store_->EndPhase();
    }

    const Workload& load_;
    std::string name_;
    std::string folder_;
    std::uint32_t half_;
    std::unique_ptr<Store> store_;
    std::vector<std::uint32_t> order_;
    std::vector<Result> results_;
    std::uint64_t bytes_ = 0;
    std::uint64_t bytesOrdered_ = 0;
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
