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

using bench::Batch;
using bench::Digest;
using bench::Record;
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
          store_(bench::MakeTreehfs(load_, 1, bench::Lending::kInOnePiece)),
          order_(bench::Shuffled(records, 7)),
          calls_(std::min(calls, records)) {}

    void Run(const std::string& operation) {
        if (operation == "load-ordered") {
            std::iota(order_.begin(), order_.end(), 0u);
            std::sort(order_.begin(), order_.end(),
                      [this](std::uint32_t a, std::uint32_t b) { return store_->Less(a, b); });
        }
        const bool absent = operation.starts_with("load-") || operation == "absent";
        const Numbers order(order_);
        Insert(absent ? order.first(order.size() - calls_) : order);
        // Calls go to records in another order than they came in.
        const std::vector<std::uint32_t> again = bench::Shuffled(load_.count, 11);
        const Numbers numbers = absent ? order.last(calls_) : Numbers(again).first(calls_);
        batch_.Fill(load_, numbers, 0);
        CALLGRIND_START_INSTRUMENTATION;
        const bool right = Call(operation, numbers);
        CALLGRIND_STOP_INSTRUMENTATION;
        if (!right) {
            Stop("a wrong answer, or no such operation");
        }
    }

private:
    using Numbers = std::span<const std::uint32_t>;

    void Insert(Numbers numbers) {
        Batch batch;
        batch.Fill(load_, numbers, 0);
        for (const Record& record : batch.Records()) {
            if (!store_->Insert(record, false)) {
                Stop("an insertion failed");
            }
        }
    }

    template <typename One>
    bool Each(One one) {
        const auto records = batch_.Records();
        return std::all_of(records.begin(), records.end(), one);
    }

    bool Call(const std::string& operation, Numbers numbers) {
        if (operation.starts_with("load-")) {
            return Each([this](const Record& record) { return store_->Insert(record, false); });
        }
        if (operation == "lookup") {
            return Each([this](const Record& record) {
                return store_->Lookup(record, data_) == static_cast<int>(record.size);
            });
        }
        if (operation == "absent") {
            return Each(
                [this](const Record& record) { return store_->Lookup(record, data_) == -1; });
        }
        if (operation == "update") {
            return Each([this](const Record& record) { return store_->Update(record); });
        }
        if (operation == "delete") {
            return Each([this](const Record& record) { return store_->Delete(record); });
        }
        Digest sum(Digest::kBrief);
        if (operation == "scan") {
            return store_->Scan(&sum) == load_.count;
        }
        return operation == "list" &&
               std::all_of(numbers.begin(), numbers.end(), [this, &sum](std::uint32_t number) {
                   return store_->List(bench::kFirstParent + number % load_.folders, &sum) > 0;
               });
    }

    const Workload load_;
    std::unique_ptr<Store> store_;
    std::vector<std::uint32_t> order_;
    std::uint32_t calls_;
    Batch batch_;
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
