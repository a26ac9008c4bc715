// Speed and memory of the engine's operations on a catalog tree in memory: nodes and map blocks of
// 4,096 bytes (--node: another size), records of 88 to 248 bytes, keys in random order, one core.
//
// usage: engine_bench [--records N[,N...]] [--node N] [--seed N] [--json FILE]
//
// For each number of records: insert all, look all up, look absent keys up, walk, delete half,
// flush. Every answer is checked; a wrong one ends the run with exit status 1. Times are those of
// the processor, so that a busy machine disturbs them less; small runs are repeated and their
// median counts.
#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <string>
#include <vector>

#include "hfs/treehfs.h"
#include "hfs/volume/convert.h"
#include "memory_volume.h"
#include "platform/host/host.h"

namespace VELK::bench {

namespace {

constexpr u32 kUsualNodeShift = 12;
constexpr double kMostMemory = 1.15;  // by the bytes of the cached nodes, these included
constexpr u32 kFolders = 1000;        // parents the names are spread over
constexpr u32 kFolderRecord = 88;
constexpr u32 kFileRecord = 248;

struct Figure {
    const char* operation;
    u64 count;
    double seconds;
};

struct Result {
    u64 records = 0;
    u32 nodeShift = 0;
    std::vector<Figure> figures;
    u32 depth = 0;
    u32 nodesCached = 0;
    u64 engineBytes = 0;  // taken from the heap, at most
    u64 volumeBytes = 0;
};

constexpr u64 kMostBytesPerRecord = 400;  // of the tree file, its half-full nodes included

// What the engine takes from the heap, with the allocator's own rounding.
struct CountingHeap {
    u64 now = 0;
    u64 most = 0;

    static void* Alloc(void* self, std::size_t size) {
        void* memory = HostAlloc(size);
        auto* heap = static_cast<CountingHeap*>(self);
        heap->now += memory != nullptr ? HostSizeOf(memory) : 0;
        heap->most = heap->now > heap->most ? heap->now : heap->most;
        return memory;
    }
    static void Free(void* self, void* memory) {
        if (memory != nullptr) {
            static_cast<CountingHeap*>(self)->now -= HostSizeOf(memory);
        }
        HostFree(memory);
    }
};

[[noreturn]] void Stop(const char* operation, u64 item, int status) {
    std::fprintf(stderr, "engine_bench: %s of record %llu: unexpected status %08X\n", operation,
                 static_cast<unsigned long long>(item), static_cast<unsigned>(status));
    std::exit(1);
}

double ProcessorSeconds() {
    timespec now = {};
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &now);
    return static_cast<double>(now.tv_sec) + static_cast<double>(now.tv_nsec) * 1e-9;
}

u64 NextRandom(u64* state) {
    u64 z = (*state += 0x9E3779B97F4A7C15ull);
    z = (z ^ (z >> 30)) * 0xBF58476D1CE4E5B9ull;
    z = (z ^ (z >> 27)) * 0x94D049BB133111EBull;
    return z ^ (z >> 31);
}

std::vector<u32> Shuffled(u64 count, u64 seed) {
    std::vector<u32> order(count);
    for (u64 i = 0; i < count; ++i) {
        order[i] = static_cast<u32>(i);
    }
    for (u64 i = count; i > 1; --i) {
        std::swap(order[i - 1], order[NextRandom(&seed) % i]);
    }
    return order;
}

// Record `item`: a parent and a name of 5 to 20 units. `suffix` 0 for those that are inserted.
struct ItemKey {
    CatalogKey key;
    u32 parent;

    ItemKey(u32 item, char16_t suffix) : key{}, parent(16 + item % kFolders) {
        char digits[32];
        const int length = std::snprintf(digits, sizeof digits, "%.*s%u",
                                         static_cast<int>(item % 13), "photograph_of_", item);
        u16 units = 0;
        u8* name = key.bytes + kCatKeyName;
        for (int i = 0; i < length; ++i) {
            Put16(name + 2 * units++, static_cast<u16>(digits[i]));
        }
        if (suffix != 0) {
            Put16(name + 2 * units++, suffix);
        }
        Put16(key.bytes, static_cast<u16>(kCatKeyFixed + 2 * units));
        std::memcpy(key.bytes + kCatKeyParentId, &parent, sizeof parent);
        Put16(key.bytes + kCatKeyNameLength, units);
    }
    static void Put16(u8* bytes, u16 value) { std::memcpy(bytes, &value, sizeof value); }
};

u32 RecordSize(u32 item) {
    return item % 4 == 0 ? kFolderRecord : kFileRecord;
}

// Carries the item in its ID field (host order).
struct ItemRecord {
    u8 bytes[kFileRecord] = {};

    explicit ItemRecord(u32 item) {
        ItemKey::Put16(bytes, item % 4 == 0 ? 1 : 2);
        std::memcpy(bytes + 8, &item, sizeof item);
    }
};

class Run {
public:
    Run(u64 records, u64 seed, u32 nodeShift)
        : order_(Shuffled(records, seed)), again_(Shuffled(records, ~seed)), volume_(nodeShift) {
        result_.nodeShift = nodeShift;
        result_.records = records;
        tree_.volume = &volume_.fs;
        tree_.fileId = kCatalogFileId;
        tree_.convert = ConvertFor(kCatalogFileId);
        tree_.compareKeys = CompareCatKeysCaseIns;
        tree_.header.maxKeyLength = kCatMaxKeyLength;
        tree_.header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
        tree_.keyCompareType = kKeyCompareFolding;
    }
    ~Run() { tree_.Dtor(); }
    Run(const Run&) = delete;
    Run& operator=(const Run&) = delete;

    Result Measure(const CountingHeap& heap) {
        const int status = tree_.Create(result_.nodeShift, 0, nullptr);
        if (status != kOk) {
            Stop("create", 0, status);
        }
        if (!volume_.Supply(order_.size() * kMostBytesPerRecord)) {
            Stop("memory", 0, kErrNoMemory);
        }
        Time("insert", order_.size(), [this] { InsertAll(); });
        result_.depth = tree_.header.treeDepth;
        result_.nodesCached = tree_.nodeCount;
        result_.engineBytes = heap.most;
        result_.volumeBytes = volume_.BytesHeld();
        Time("find", order_.size(), [this] { FindAll(); });
        Time("find absent", order_.size(), [this] { FindAbsent(); });
        Time("iterate", order_.size(), [this] { Walk(); });
        Time("delete half", order_.size() / 2, [this] { DeleteHalf(); });
        Time("flush", 1, [this] { FlushAll(); });
        return result_;
    }

private:
    template <typename Work>
    void Time(const char* operation, u64 count, Work work) {
        const double start = ProcessorSeconds();
        work();
        result_.figures.push_back({operation, count, ProcessorSeconds() - start});
    }

    void InsertAll() {
        for (u32 item : order_) {
            const ItemKey key(item, 0);
            const ItemRecord record(item);
            const int status =
                tree_.InsertRecord(key.key.bytes, key.parent, record.bytes, RecordSize(item));
            if (status != kOk) {
                Stop("insert", item, status);
            }
        }
    }

    int Find(u32 item, char16_t suffix, u32* found) {
        const ItemKey key(item, suffix);
        u8 record[1024];
        unsigned size = 0;
        const int status =
            tree_.FindRecord(key.key.bytes, key.parent, record, sizeof record, &size, &path_);
        std::memcpy(found, record + 8, sizeof *found);
        path_.ClearPath();
        return status;
    }

    void FindAll() {
        for (u32 item : again_) {
            u32 found = 0;
            const int status = Find(item, 0, &found);
            if (status != kOk || found != item) {
                Stop("find", item, status);
            }
        }
    }

    void FindAbsent() {
        for (u32 item : again_) {
            u32 found = 0;
            const int status = Find(item, u'x', &found);
            if (status != kErrNotFound) {
                Stop("find absent", item, status);
            }
        }
    }

    void Walk() {
        HfsFindData walk;
        u8 record[1024];
        u8 key[kKeyLengthSize + kMaxKeyLength + 2];
        unsigned recordSize = 0;
        unsigned keySize = 0;
        const u64 first = u64{tree_.header.firstLeafNode} << tree_.nodeShift;
        int status = tree_.SetPos(first, record, sizeof record, &recordSize, key, sizeof key,
                                  &keySize, &walk);
        u64 count = 0;
        while (status == kOk) {
            count += 1;
            status = tree_.IncPos(1, record, sizeof record, &recordSize, key, sizeof key, &keySize,
                                  &walk);
        }
        walk.ClearPath();
        if (status != kErrNotFound || count != order_.size()) {
            Stop("iterate", count, status);
        }
    }

    void DeleteHalf() {
        for (u64 i = 0; i < order_.size() / 2; ++i) {
            const ItemKey key(again_[i], 0);
            const int status = tree_.DeleteRecord(key.key.bytes, key.parent, false);
            if (status != kOk) {
                Stop("delete", again_[i], status);
            }
        }
        if (tree_.header.leafRecords != order_.size() - order_.size() / 2) {
            Stop("delete", tree_.header.leafRecords, kErrCorrupt);
        }
    }

    void FlushAll() {
        const int status = tree_.Flush(0);
        if (status != kOk) {
            Stop("flush", 0, status);
        }
    }

    std::vector<u32> order_;
    std::vector<u32> again_;
    MemoryVolume volume_;
    CBTreeHfs tree_;
    HfsFindData path_;
    Result result_;
};

double NanosecondsOf(const Figure& figure) {
    return figure.seconds * 1e9 / static_cast<double>(figure.count);
}

double MemoryShare(const Result& result) {
    const double nodes = static_cast<double>(result.nodesCached) * (1u << result.nodeShift);
    return (static_cast<double>(result.engineBytes) + nodes) / nodes;
}

// A thousand records measure nothing in one go.
constexpr u64 kRecordsInAll = 300'000;
constexpr u64 kMostRepeats = 15;

Result MeasureOften(u64 count, u64 seed, u32 nodeShift) {
    const u64 repeats = std::clamp<u64>(kRecordsInAll / count, 1, kMostRepeats);
    std::vector<Result> results;
    for (u64 i = 0; i < repeats; ++i) {
        CountingHeap counter;
        const HostHeap heap = {CountingHeap::Alloc, CountingHeap::Free, &counter};
        SetHostHeap(&heap);
        results.push_back(Run(count, seed, nodeShift).Measure(counter));
        SetHostHeap(nullptr);
    }
    Result median = results.front();
    for (std::size_t f = 0; f < median.figures.size(); ++f) {
        std::sort(results.begin(), results.end(), [f](const Result& a, const Result& b) {
            return a.figures[f].seconds < b.figures[f].seconds;
        });
        median.figures[f] = results[results.size() / 2].figures[f];
    }
    return median;
}

void Print(const Result& result) {
    std::printf("%llu records: depth %u, %u nodes cached\n",
                static_cast<unsigned long long>(result.records), result.depth, result.nodesCached);
    for (const Figure& figure : result.figures) {
        std::printf("  %-12s %10llu %10.3f s %12.0f ns each\n", figure.operation,
                    static_cast<unsigned long long>(figure.count), figure.seconds,
                    NanosecondsOf(figure));
    }
    std::printf("  memory       %.3f times the cached nodes (engine %.1f MiB beside %.1f MiB)\n",
                MemoryShare(result), static_cast<double>(result.engineBytes) / (1 << 20),
                static_cast<double>(u64{result.nodesCached} << result.nodeShift) / (1 << 20));
}

// Whether the engine kept to what it may take beside the nodes; smaller nodes have a larger share.
bool IsMemoryBounded(const Result& result) {
    const bool isBounded = MemoryShare(result) <= kMostMemory || result.nodeShift < kUsualNodeShift;
    if (!isBounded) {
        std::fprintf(stderr, "engine_bench: more than %.2f times the cached nodes\n", kMostMemory);
    }
    return isBounded;
}

bool WriteJson(const char* name, const std::vector<Result>& results) {
    std::FILE* file = std::fopen(name, "w");
    if (file == nullptr) {
        return false;
    }
    std::fprintf(file, "[");
    for (const Result& result : results) {
        std::fprintf(
            file,
            "%s{\"records\":%llu,\"node\":%u,\"depth\":%u,\"nodes_cached\":%u,\"memory\":%.4f",
            &result == results.data() ? "" : ",\n", static_cast<unsigned long long>(result.records),
            1u << result.nodeShift, result.depth, result.nodesCached, MemoryShare(result));
        for (const Figure& figure : result.figures) {
            std::fprintf(file, ",\"%s\":%.1f", figure.operation, NanosecondsOf(figure));
        }
        std::fprintf(file, "}");
    }
    std::fprintf(file, "]\n");
    return std::fclose(file) == 0;
}

std::vector<u64> ParseCounts(const char* text) {
    std::vector<u64> counts;
    for (char* end = nullptr; *text != '\0'; text = *end == ',' ? end + 1 : end) {
        counts.push_back(std::strtoull(text, &end, 10));
        if (end == text || counts.back() == 0 || counts.back() > 20'000'000) {
            return {};
        }
    }
    return counts;
}

// log2 of a node size, 0 for one that no tree has.
u32 ShiftOf(unsigned long nodeSize) {
    u32 shift = 9;
    while (shift < 15 && (1ul << shift) < nodeSize) {
        ++shift;
    }
    return 1ul << shift == nodeSize ? shift : 0;
}

}  // namespace

int Main(int argc, char** argv) {
    std::vector<u64> counts = {10'000, 100'000, 1'000'000};
    u64 seed = 1;
    u32 nodeShift = kUsualNodeShift;
    const char* json = nullptr;
    for (int i = 1; i + 1 < argc; i += 2) {
        const std::string option = argv[i];
        if (option == "--records") {
            counts = ParseCounts(argv[i + 1]);
        } else if (option == "--seed") {
            seed = std::strtoull(argv[i + 1], nullptr, 10);
        } else if (option == "--node") {
            nodeShift = ShiftOf(std::strtoul(argv[i + 1], nullptr, 10));
        } else if (option == "--json") {
            json = argv[i + 1];
        } else {
            counts.clear();
        }
    }
    if (counts.empty() || nodeShift == 0 || argc % 2 == 0) {
        std::fprintf(
            stderr,
            "usage: engine_bench [--records N[,N...]] [--node N] [--seed N] [--json FILE]\n");
        return 16;
    }
    std::vector<Result> results;
    bool isBounded = true;
    for (u64 count : counts) {
        results.push_back(MeasureOften(count, seed, nodeShift));
        Print(results.back());
        isBounded = IsMemoryBounded(results.back()) && isBounded;
    }
    if (results.size() > 1) {
        std::printf(
            "an insertion among %llu takes %.2f times one among %llu\n",
            static_cast<unsigned long long>(results.back().records),
            NanosecondsOf(results.back().figures[0]) / NanosecondsOf(results.front().figures[0]),
            static_cast<unsigned long long>(results.front().records));
    }
    const bool isKept = json == nullptr || WriteJson(json, results);
    return isKept && isBounded ? 0 : 8;
}

}  // namespace VELK::bench

int main(int argc, char** argv) {
    return VELK::bench::Main(argc, argv);
}
