// Carries one operation of the yardstick out on the engine a fixed number of times, between two
// marks that callgrind understands: instructions do not depend on the machine's mood.
//
//   op_counts OPERATION RECORDS CALLS
#include <valgrind/callgrind.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <numeric>
#include <string>

#include "../stores/store.h"

namespace {

using bench::Store;
using bench::Workload;

[[noreturn]] void Stop(const char* what) {
    std::fprintf(stderr, "op_counts: %s\n", what);
    std::exit(1);
}

class Counted {
public:
    Counted(std::uint32_t records, std::uint32_t calls)
        : load_(bench::MakeWorkload(records, 1)),
          store_(bench::MakeTreehfs(load_, 1)),
          order_(bench::Shuffled(records, 7)),
          calls_(std::min(calls, records)) {}

    void Run(const std::string& operation) {
        if (operation == "load-ordered") {
            std::iota(order_.begin(), order_.end(), 0u);
            std::sort(order_.begin(), order_.end(),
                      [this](std::uint32_t a, std::uint32_t b) { return store_->Less(a, b); });
            InsertTail(true);
        } else if (operation == "load-random") {
            InsertTail(false);
        } else {
            // Calls go to records in another order than they came in.
            const std::uint32_t present =
                operation == "absent" ? load_.count - calls_ : load_.count;
            Insert(0, present, false);
            const std::vector<std::uint32_t> again = bench::Shuffled(load_.count, 11);
            Measure(operation, operation == "absent" ? &order_[present] : again.data());
        }
    }

private:
    void Insert(std::uint32_t from, std::uint32_t to, bool ascending) {
        for (std::uint32_t k = from; k < to; ++k) {
            bench::MakeData(order_[k], 0, load_.dataSize[order_[k]], data_);
            if (!store_->Insert(order_[k], data_, load_.dataSize[order_[k]], ascending)) {
                Stop("an insertion failed");
            }
        }
    }

    void InsertTail(bool ascending) {
        Insert(0, load_.count - calls_, ascending);
        CALLGRIND_START_INSTRUMENTATION;
        Insert(load_.count - calls_, load_.count, ascending);
        CALLGRIND_STOP_INSTRUMENTATION;
    }

    void Measure(const std::string& operation, const std::uint32_t* records) {
        std::uint64_t sum = 0;
        bool right = true;
        CALLGRIND_START_INSTRUMENTATION;
        if (operation == "scan") {
            right = store_->Scan(&sum) == load_.count;
        } else {
            for (std::uint32_t k = 0; k < calls_ && right; ++k) {
                right = Call(operation, records[k], &sum);
            }
        }
        CALLGRIND_STOP_INSTRUMENTATION;
        if (!right) {
            Stop("a wrong answer, or no such operation");
        }
    }

    bool Call(const std::string& operation, std::uint32_t record, std::uint64_t* sum) {
        switch (operation[0]) {
            case 'l':
                return operation == "lookup"
                           ? store_->Lookup(record, data_) == load_.dataSize[record]
                           : store_->List(16 + record % load_.folders, sum) > 0;
            case 'a':
                return store_->Lookup(record, data_) == -1;
            case 'u':
                return store_->Update(record, data_, load_.dataSize[record]);
            case 'd':
                return store_->Delete(record);
            default:
                return false;
        }
    }

    const Workload load_;
    std::unique_ptr<Store> store_;
    std::vector<std::uint32_t> order_;
    std::uint32_t calls_;
    std::uint8_t data_[bench::kLargestData] = {};
};

}  // namespace

int main(int count, char** words) {
    if (count != 4) {
        std::fprintf(stderr, "usage: op_counts OPERATION RECORDS CALLS\n");
        return 16;
    }
    const auto number = [](const char* text) {
        return static_cast<std::uint32_t>(std::strtoul(text, nullptr, 10));
    };
    Counted(number(words[2]), number(words[3])).Run(words[1]);
    return 0;
}
