// Search in a node. Nearly every probe meets a sound record whose key lies in one piece; that case
// is decided here, without a call and with the memory of the next probes already asked for. Any
// doubt goes the careful way of FetchKey, which also reports what is wrong.
#include "hfs/treehfs/node_search.h"

#include "hfs/names.h"
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/key_shape.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/plain_record.h"
#include "hfs/treehfs/report.h"

namespace VELK {

namespace {

// Folds an ASCII unit; 0 for NUL and for every other unit, which need the folding table.
u16 FoldPlain(u32 unit) {
    if (unit - 1 >= 0x7F) {
        return 0;
    }
    return static_cast<u16>(unit - 'A' < 26 ? unit + ('a' - 'A') : unit);
}

// How keys of known shape compare: those of a catalog in folded order without a call.
struct FoldedKeys : CatalogShape {
    explicit FoldedKeys(const SoughtKey&) {}
    static int Compare(const SoughtKey& key, const BTreeKey* nodeKey) {
        return key.CompareFolded(nodeKey);
    }
};
struct OtherKeys : AnyShape {
    explicit OtherKeys(const SoughtKey& key) : AnyShape(key.Fixed(), key.NameLengthAt()) {}
    static int Compare(const SoughtKey& key, const BTreeKey* nodeKey) {
        return key.Compare(nodeKey);
    }
};

// Asks for the keys that the first probes can meet, all at once: waiting for one after the other is
// what a search in a cold node consists of.
template <int kRounds, typename Keys>
[[gnu::always_inline]] inline void PrefetchProbes(const Keys& keys, s32 low, s32 high) {
    if (low > high) {
        return;
    }
    const s32 middle = (low + high) >> 1;
    keys.Prefetch(static_cast<u32>(middle));
    if constexpr (kRounds > 1) {
        PrefetchProbes<kRounds - 1>(keys, low, middle - 1);
        PrefetchProbes<kRounds - 1>(keys, middle + 1, high);
    }
}

// Folds a unit, ASCII without the table.
u16 Fold(u16 unit) {
    const u16 plain = FoldPlain(unit);
    return plain != 0 ? plain : FoldHfsUnit(unit);
}

// Parent and first two units of a name, folded, as one number. A missing unit counts 0, as a name
// sorts before those that go on. False: a unit that folding ignores, so that a later one decides.
template <typename Unit>
bool MakeOrder(u32 parent, u32 length, Unit unit, u64* order) {
    const u16 first = length > 0 ? Fold(unit(0)) : u16{0};
    const u16 second = length > 1 ? Fold(unit(1)) : u16{0};
    *order = u64{parent} << 32 | u32{first} << 16 | second;
    return (length == 0 || first != 0) && (length <= 1 || second != 0);
}

// What a search makes of the records it meets for the searches after it: nothing in a leaf, which
// holds few.
class NothingKnown {
public:
    static bool Decide(u32, const SoughtKey&, int*) { return false; }
    static void Learn(u32, const PlainRecord&) {}
};

// In an index node of folded keys: their order in one number.
class KnownSeparators {
public:
    KnownSeparators(const BTHeaderMem* hdr, const Hints& hints) : hdr_(hdr), hints_(hints) {}

    bool Decide(u32 index, const SoughtKey& key, int* order) const {
        const u64 known = hints_.Order(index);
        if (known == 0 || known == key.Order()) {
            return false;
        }
        *order = key.Order() > known ? 1 : -1;
        return true;
    }
    // Only of a record that can move without coming to lie in three blocks: each search that meets
    // such data has something to say.
    void Learn(u32 index, const PlainRecord& record) const {
        if (HFS_UNLIKELY(!StaysInTwoBlocks(hdr_, record.DataSize()))) {
            return;
        }
        const u8* key = record.key;
        const auto unit = [key](u32 at) { return GetBe16(key + kCatKeyName + 2 * at); };
        u64 order = 0;
        if (MakeOrder(GetBe32(key + kCatKeyParentId), GetBe16(key + kCatKeyNameLength), unit,
                      &order)) {
            hints_.LearnOrder(index, order);
        }
    }

private:
    const BTHeaderMem* hdr_;
    Hints hints_;
};

// Few nodes stand above the lowest index nodes: they stay in the processor's caches.
template <typename Keys>
[[gnu::always_inline]] inline void PrefetchFor(const Keys& keys, u32 height, s32 high) {
    if (height == 1) {
        PrefetchProbes<2>(keys, 0, high);
    } else if (height == 2) {
        PrefetchProbes<3>(keys, 0, high);
    }
}

// Without a known shape, or with more slots than the node has room for, no key is quick.
bool HasQuickKeys(const BTHeaderMem& header, const SoughtKey& key, u32 count) {
    return key.Fixed() != 0 && TableFits(header, count);
}

}  // namespace

SoughtKey::SoughtKey(const CBTreeHfs* tree, const BTreeKey* key, unsigned id)
    : key_(key), compare_(tree->compareKeys), id_(id) {
    // A search key out of line is asserted by the comparator each time it is asked.
    KeyShape shape;
    if (reinterpret_cast<std::uintptr_t>(key) % 4 != 0 || !ShapeOf(compare_, &shape)) {
        return;
    }
    fixed_ = shape.fixed;
    nameLengthAt_ = shape.nameLength;
    isFolded_ = compare_ == CompareCatKeysCaseIns;
    // The whole key, not the two bytes of its length field.
    const u8* bytes = reinterpret_cast<const u8*>(key);
    if (!isFolded_) {
        return;
    }
    const u32 length = GetHost16(bytes + kCatKeyNameLength);
    const auto unit = [bytes](u32 at) { return GetHost16(bytes + kCatKeyName + 2 * at); };
    firstUnit_ = length > 0 ? FoldPlain(unit(0)) : u16{0};
}

void SoughtKey::LearnOrder() {
    if (!isFolded_) {
        return;
    }
    const u8* bytes = reinterpret_cast<const u8*>(key_);
    const auto unit = [bytes](u32 at) { return GetHost16(bytes + kCatKeyName + 2 * at); };
    hasOrder_ = MakeOrder(id_, GetHost16(bytes + kCatKeyNameLength), unit, &order_);
}

// Decides by parent and first unit of the name; 0 when these are equal or not plain.
inline int SoughtKey::CompareFirstUnits(const u8* nodeKey) const {
    const u32 parent = GetBe32(nodeKey + kCatKeyParentId);
    if (id_ != parent) {
        return id_ > parent ? 1 : -1;
    }
    if (firstUnit_ == 0 || GetBe16(nodeKey + kCatKeyNameLength) == 0) {
        return 0;
    }
    const u16 unit = FoldPlain(GetBe16(nodeKey + kCatKeyName));
    if (unit == 0 || unit == firstUnit_) {
        return 0;
    }
    return firstUnit_ > unit ? 1 : -1;
}

inline int SoughtKey::CompareFolded(const BTreeKey* nodeKey) const {
    const int order = CompareFirstUnits(reinterpret_cast<const u8*>(nodeKey));
    return order != 0 ? order : CompareCatKeysCaseIns(key_, id_, nodeKey);
}

inline int SoughtKey::Compare(const BTreeKey* nodeKey) const {
    return isFolded_ ? CompareFolded(nodeKey) : compare_(key_, id_, nodeKey);
}

namespace {

// What becomes of a search that meets a key which is not quick.
enum class Doubt {
    kSettle,  // FetchKey has to tell
    kGiveUp,  // it ends with kErrNotFound, before anything is said or allocated
};

// The same search with and without what the node remembers: it probes the same records.
template <typename Blocks, typename Shape, typename Known>
int Search(CBTreeHfs* tree, const HfsNode* node, const SoughtKey& key, Doubt doubt,
           const PlainRecords<Blocks, Shape>& keys, const Known& known, SearchResult* result) {
    const u32 count = NumRecords(node);
    s32 low = 0;
    s32 high = static_cast<s32>(count) - 1;
    const bool quick = HasQuickKeys(tree->header, key, count);
    while (low <= high) {
        const s32 middle = (low + high) >> 1;
        const u32 index = static_cast<u32>(middle);
        int order = 0;
        if (!known.Decide(index, key, &order)) {
            PlainRecord record;
            if (HFS_LIKELY(quick && keys.Find(index, &record))) {
                known.Learn(index, record);
                order = Shape::Compare(key, KeyOf(record));
                if (order == 0) {
                    result->record = keys.View(record);
                }
            } else {
                if (doubt == Doubt::kGiveUp) {
                    return kErrNotFound;
                }
                const int status = FetchKey(tree, node, middle, &result->record);
                if (status != kOk) {
                    if (status != kErrNoMemory) {
                        Report(status, 3005);
                    }
                    return status;
                }
                order = key.CompareAsAsked(result->record.key);
            }
            if (order == 0) {
                result->found = true;
                result->index = middle;
                return kOk;
            }
        }
        if (order < 0) {
            high = middle - 1;
        } else {
            low = middle + 1;
        }
    }
    result->found = false;
    result->index = low;
    return kOk;
}

template <typename Blocks, typename Shape>
[[gnu::always_inline]] inline int SearchPlain(CBTreeHfs* tree, const HfsNode* node, Blocks blocks,
                                              Shape shape, const SoughtKey& key, Doubt doubt,
                                              SearchResult* result) {
    const u32 count = NumRecords(node);
    const PlainRecords keys(&tree->header, blocks, shape);
    if (HasQuickKeys(tree->header, key, count)) {
        PrefetchFor(keys, Height(node), static_cast<s32>(count) - 1);
    }
    return Search(tree, node, key, doubt, keys, NothingKnown(), result);
}

template <typename Blocks>
[[gnu::always_inline]] inline int SearchKnown(CBTreeHfs* tree, const HfsNode* node, Blocks blocks,
                                              const SoughtKey& key, Doubt doubt,
                                              SearchResult* result) {
    const u32 count = NumRecords(node);
    const PlainRecords keys(&tree->header, blocks, FoldedKeys(key));
    const Hints hints(tree, node);
    if (hints.Order(count / 2) == 0 && HasQuickKeys(tree->header, key, count)) {
        PrefetchFor(keys, Height(node), static_cast<s32>(count) - 1);
    }
    return Search(tree, node, key, doubt, keys, KnownSeparators(&tree->header, hints), result);
}

// SearchInside without the search proper. True: the key lies between the first and the last.
template <typename Blocks>
bool LiesInside(const BTHeaderMem* hdr, Blocks blocks, const SoughtKey& key, u32 count,
                bool* isBehindAll) {
    const PlainRecords keys(hdr, blocks, OtherKeys(key));
    PlainRecord record;
    if (!keys.Find(count - 1, &record)) {
        return false;
    }
    if (key.Compare(KeyOf(record)) > 0) {
        *isBehindAll = true;
        return false;
    }
    return keys.Find(0, &record) && key.Compare(KeyOf(record)) >= 0;
}

template <typename Blocks>
int SearchByShape(CBTreeHfs* tree, const HfsNode* node, const SoughtKey& key, Doubt doubt,
                  SearchResult* result) {
    const Blocks blocks(tree, node);
    if (!key.IsFolded()) {
        return SearchPlain(tree, node, blocks, OtherKeys(key), key, doubt, result);
    }
    return node->hints != nullptr && key.HasOrder()
               ? SearchKnown(tree, node, blocks, key, doubt, result)
               : SearchPlain(tree, node, blocks, FoldedKeys(key), key, doubt, result);
}

}  // namespace

int SearchNode(CBTreeHfs* tree, const HfsNode* node, const SoughtKey& key, SearchResult* result) {
    return WithBlocks(tree, node, [&](auto blocks) {
        return SearchByShape<decltype(blocks)>(tree, node, key, Doubt::kSettle, result);
    });
}

bool SearchInside(CBTreeHfs* tree, const HfsNode* leaf, const SoughtKey& key,
                  SearchResult* result) {
    const u32 count = NumRecords(leaf);
    if (count == 0 || !HasQuickKeys(tree->header, key, count)) {
        return false;
    }
    return WithBlocks(tree, leaf, [&](auto blocks) {
        bool isBehindAll = false;
        const bool isInside = LiesInside(&tree->header, blocks, key, count, &isBehindAll);
        const bool isNew = isBehindAll && FLink(leaf) == 0;
        if (isNew && !tree->hasLongData) {
            result->found = false;
            result->index = static_cast<s32>(count);
            return true;
        }
        // On its way to the end a search may meet data in three blocks.
        return (isInside || isNew) &&
               SearchByShape<decltype(blocks)>(tree, leaf, key, Doubt::kGiveUp, result) == kOk;
    });
}

}  // namespace VELK
