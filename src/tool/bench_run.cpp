// The operations that are timed.
#include "tool/bench_run.h"

#include <fmt/format.h>

#include <algorithm>
#include <chrono>
#include <random>

#include "hfs/records/record_text.h"
#include "hfs/volume/make_volume.h"
#include "tool/catalog_paths.h"
#include "tool/errors.h"

namespace VELK::tool {

namespace {

constexpr u64 kBytesPerRecord = 1024;  // room for half-full nodes
constexpr u64 kLeastVolume = u64{16} << 20;
constexpr u32 kFilesPerFolder = 1000;
constexpr u32 kFirstFolder = 1000;
constexpr u32 kMostRecord = 1u << 16;

using Clock = std::chrono::steady_clock;

void Must(int status, const char* what) {
    if (status != kOk) {
        ThrowFailed("bench", fmt::format("{}: {}", what, StatusWithCode(status)), "");
    }
}

// Runs `each(i)` for 0..count-1 under the clock.
template <typename Each>
BenchTime Timed(u64 count, Each each) {
    ThrowIfInterrupted();
    const Clock::time_point start = Clock::now();
    for (u64 i = 0; i < count; ++i) {
        each(i);
    }
    return {count, std::chrono::duration<double>(Clock::now() - start).count()};
}

int Find(CBTreeHfs* tree, const SearchKey& key, std::vector<u8>* record) {
    unsigned size = 0;
    return tree->FindRecord(key.Key(), key.id, record->data(), kMostRecord - 1, &size, nullptr);
}

BenchTime WalkAll(CBTreeHfs* tree, std::vector<u8>* record) {
    HfsFindData path;
    const SearchKey least = LowestKey(kCatalogFileId, 0);
    u64 count = 0;
    BenchTime time = Timed(1, [&](u64) {
        bool found = false;
        unsigned size = 0;
        Must(tree->FindEntry(least.Key(), least.id, &path, &found, nullptr, nullptr, nullptr,
                             nullptr),
             "find");
        int step = 0;
        while (tree->IncPos(step, record->data(), static_cast<unsigned>(record->size()), &size,
                            nullptr, 0, nullptr, &path) == kOk) {
            step = 1;
            count += 1;
        }
    });
    path.ClearPath();
    time.count = count;
    return time;
}

}  // namespace

BenchTree::BenchTree(u64 records, u32 nodeSize, BenchOrder order, u64 seed)
    : records_(records), order_(order), shuffled_(records), record_(kMostRecord) {
    for (u64 i = 0; i < records; ++i) {
        shuffled_[i] = static_cast<u32>(i);
    }
    std::mt19937_64 random(seed);
    std::shuffle(shuffled_.begin(), shuffled_.end(), random);
    RecordData data;
    if (const Problem problem = ParseData("file{id:16,mode:0100644}", kCatalogFileId, &data)) {
        ThrowProblem("bench", problem);
    }
    record_.resize(std::max<std::size_t>(record_.size(), data.stored.size()));
    FormatOptions options;
    options.catalogNodeSize = nodeSize;
    options.catalogSize = std::max(records * kBytesPerRecord, u64{nodeSize} * 16);
    Problem problem;
    volume_ = MakeMemoryVolume(kLeastVolume + 2 * options.catalogSize, options, &problem);
    if (!volume_) {
        ThrowProblem("bench", problem);
    }
    Tree()->convert.DataToMemory(record_.data(), data.stored.data(),
                                 static_cast<unsigned>(data.stored.size()));
}

SearchKey BenchTree::KeyOf(u64 number, bool isThere) const {
    char16_t name[13] = u"file 0000000";
    u64 rest = number / kFilesPerFolder;
    const u32 folder = kFirstFolder + static_cast<u32>(rest);
    rest = number % kFilesPerFolder;
    for (u32 at = 11; at > 4; --at, rest /= 10) {
        name[at] = static_cast<char16_t>(u'0' + rest % 10);
    }
    name[0] = isThere ? u'f' : u'g';
    return CatalogSearchKey(folder, std::u16string_view(name, 12));
}

// The number of the i-th record an operation takes.
u64 BenchTree::Pick(u64 i) const {
    switch (order_) {
        case BenchOrder::kRising:
            return i;
        case BenchOrder::kFalling:
            return records_ - 1 - i;
        case BenchOrder::kZipf: {
            // A few records are taken often, most of them hardly ever.
            const u64 rank = static_cast<u64>(shuffled_[i]) + 1;
            return shuffled_[(records_ / rank) % records_];
        }
        case BenchOrder::kRandom:
            break;
    }
    return shuffled_[i];
}

BenchTime BenchTree::Insert() {
    CBTreeHfs* tree = Tree();
    return Timed(records_, [&](u64 i) {
        const SearchKey key = KeyOf(order_ == BenchOrder::kZipf ? shuffled_[i] : Pick(i), true);
        Must(tree->InsertRecord(key.Key(), key.id, record_.data(), kFileSize), "insert");
    });
}

BenchTime BenchTree::FindHit() {
    CBTreeHfs* tree = Tree();
    std::vector<u8> record(kMostRecord);
    return Timed(records_, [&](u64 i) { Must(Find(tree, KeyOf(Pick(i), true), &record), "find"); });
}

BenchTime BenchTree::FindMiss() {
    CBTreeHfs* tree = Tree();
    std::vector<u8> record(kMostRecord);
    return Timed(records_, [&](u64 i) {
        const int status = Find(tree, KeyOf(Pick(i), false), &record);
        Must(status == kErrNotFound ? kOk : kErrInvalid, "find absent");
    });
}

BenchTime BenchTree::Iterate() {
    std::vector<u8> record(kMostRecord);
    return WalkAll(Tree(), &record);
}

BenchTime BenchTree::Update() {
    CBTreeHfs* tree = Tree();
    std::vector<u8> record(kMostRecord);
    return Timed(records_, [&](u64 i) {
        Must(Find(tree, KeyOf(Pick(i), true), &record), "find");
        Must(tree->UpdateKeyAndRecord(nullptr, record.data()), "update");
    });
}

BenchTime BenchTree::DeleteHalf() {
    CBTreeHfs* tree = Tree();
    const bool sorted = order_ == BenchOrder::kRising || order_ == BenchOrder::kFalling;
    return Timed(records_ / 2, [&](u64 i) {
        const SearchKey key = KeyOf(sorted ? Pick(2 * i) : shuffled_[i], true);
        Must(tree->DeleteRecord(key.Key(), key.id, false), "delete");
    });
}

BenchTime BenchTree::FlushAndReopen() {
    return Timed(1, [&](u64) {
        Must(volume_->Commit(0), "flush");
        CBTreeHfs* tree = Tree();
        tree->Dtor();
        Must(tree->Init(), "open");
        const SearchKey key = KeyOf(0, true);
        HfsFindData path;
        bool found = false;
        Must(tree->FindEntry(key.Key(), key.id, &path, &found, nullptr, nullptr, nullptr, nullptr),
             "find");
        path.ClearPath();
    });
}

BenchReader::BenchReader(CBTreeHfs* tree, std::vector<SearchKey> keys, u64 seed)
    : tree_(tree), keys_(std::move(keys)), record_(kMostRecord) {
    std::mt19937_64 random(seed);
    std::shuffle(keys_.begin(), keys_.end(), random);
}

BenchTime BenchReader::FindHit() {
    return Timed(keys_.size(), [&](u64 i) { Must(Find(tree_, keys_[i], &record_), "find"); });
}

BenchTime BenchReader::Iterate() {
    return WalkAll(tree_, &record_);
}

}  // namespace VELK::tool
