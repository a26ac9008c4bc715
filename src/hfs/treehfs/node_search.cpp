// Search in a node. Nearly every probe meets a sound record whose key lies in one block; that case
// is decided here, without a call and with the memory of the next probes already asked for. Any
// doubt goes the careful way of FetchKey, which also reports what is wrong.
#include "hfs/treehfs/node_search.h"

#include "hfs/names.h"
#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/key_shape.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/path_deliver.h"
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

// Where the bytes of a node are. Nearly every node lies in one block, and is then searched without
// asking for each offset which block holds it.
class OneBlock {
public:
    OneBlock(const BTHeaderMem* hdr, const HfsNode* node)
        : data_(node->bufs[0].data), slots_(data_ + hdr->nodeSize) {}

    const u8* At(u32 offset) const { return data_ + offset; }
    // Slot of record `index` in the lower half, that of the next record in the upper one.
    u32 SlotPair(u32 index) const { return GetBe32(slots_ - kSlotSize * std::size_t{index + 2}); }
    // Whether the `size` bytes from `offset` on lie in one block, those from `start` to `end` in at
    // most two. REQUIRES of both: they lie inside the node.
    static bool IsWhole(u32, u32) { return true; }
    static bool IsShort(u32, u32) { return true; }
    static bool FitsBlock(u32) { return true; }

private:
    const u8* data_;
    const u8* slots_;  // end of the table
};

class ManyBlocks {
public:
    ManyBlocks(const BTHeaderMem* hdr, const HfsNode* node)
        : bufs_(node->bufs),
          nodeSize_(hdr->nodeSize),
          mask_(hdr->blockMask),
          shift_(hdr->blockShift) {}

    const u8* At(u32 offset) const { return bufs_[offset >> shift_].data + (offset & mask_); }
    u32 SlotPair(u32 index) const {
        const u32 slot = nodeSize_ - kSlotSize * (index + 1);
        return GetBe16(At(slot)) | u32{GetBe16(At(slot - kSlotSize))} << 16;
    }
    bool IsWhole(u32 offset, u32 size) const { return (offset & mask_) + size <= mask_ + 1; }
    bool IsShort(u32 start, u32 end) const {
        return ((end - 1) >> shift_) - (start >> shift_) <= 1;
    }
    bool FitsBlock(u32 size) const { return size <= mask_ + 1; }

private:
    const HfsBcbBuf* bufs_;
    u32 nodeSize_;
    u32 mask_;
    u32 shift_;
};

// Shape of the keys to search: that of a catalog in folded order, by far the most frequent, is
// known to the compiler.
struct FoldedKeys {
    FoldedKeys() = default;
    explicit FoldedKeys(const SoughtKey&) {}
    static constexpr u32 kFixed = kCatKeyFixed;
    static constexpr u32 kNameLengthAt = kCatKeyNameLength;
    static constexpr u32 Fixed() { return kFixed; }
    static constexpr u32 NameLengthAt() { return kNameLengthAt; }
    static int Compare(const SoughtKey& key, const BTreeKey* nodeKey) {
        return key.CompareFolded(nodeKey);
    }
};
struct OtherKeys {
    explicit OtherKeys(const SoughtKey& key)
        : fixed(key.Fixed()), nameLengthAt(key.NameLengthAt()) {}
    u32 Fixed() const { return fixed; }
    u32 NameLengthAt() const { return nameLengthAt; }
    static int Compare(const SoughtKey& key, const BTreeKey* nodeKey) {
        return key.Compare(nodeKey);
    }
    u32 fixed;
    u32 nameLengthAt;
};

// The key of record `index` where it lies, null when anything about the record is out of the
// ordinary: exactly the checks of GetKey, of contiguity and of soundness.
template <typename Blocks, typename Shape>
class QuickKeys {
public:
    QuickKeys(const BTHeaderMem* hdr, const HfsNode* node, Shape shape)
        : blocks_(hdr, node), shape_(shape), nodeSize_(hdr->nodeSize) {}

    // REQUIRES of all: the slots of record `index` and the next lie inside the node.
    [[gnu::always_inline]] const u8* KeyAt(u32 index) const {
        const u32 slots = blocks_.SlotPair(index);
        const u32 start = slots & 0xFFFF;
        const u32 end = slots >> 16;
        if (HFS_UNLIKELY(end >= nodeSize_ || start >= end) ||
            HFS_UNLIKELY(!blocks_.IsWhole(start, kKeyLengthSize))) {
            return nullptr;
        }
        const u8* key = blocks_.At(start);
        const u32 keyLength = GetBe16(key);
        const u32 padded = PaddedKeySize(keyLength);
        // A key at an odd address is asserted by the comparator each time it is asked.
        if (HFS_UNLIKELY((reinterpret_cast<std::uintptr_t>(key) & 1) != 0) ||
            HFS_UNLIKELY(keyLength - shape_.Fixed() > kMaxKeyLength - shape_.Fixed() ||
                         padded >= end - start) ||
            HFS_UNLIKELY(!blocks_.IsWhole(start, padded))) {
            return nullptr;
        }
        // Data in three blocks is asserted each time it is described.
        if (HFS_UNLIKELY(!blocks_.IsShort(start + padded, end))) {
            return nullptr;
        }
        if (shape_.NameLengthAt() != 0 &&
            HFS_UNLIKELY(shape_.Fixed() + 2u * GetBe16(key + shape_.NameLengthAt()) > keyLength)) {
            return nullptr;
        }
        return key;
    }

    // Describes record `index`, whose key KeyAt gave, as far as delivery needs it. False: its data
    // does not lie in one block.
    bool Describe(u32 index, const u8* key, NodeKey* out) const {
        const u32 slots = blocks_.SlotPair(index);
        const u32 start = slots & 0xFFFF;
        const u32 end = slots >> 16;
        const u32 padded = PaddedKeySize(GetBe16(key));
        out->offset = start;
        out->size = end - start;
        out->keySize = GetBe16(key) + kKeyLengthSize;
        out->dataSize = end - start - padded;
        out->dataFirstBytes = out->dataSize;
        if (!blocks_.IsWhole(start + padded, out->dataSize)) {
            return false;
        }
        out->data = const_cast<u8*>(blocks_.At(start + padded));
        return true;
    }

    // Whether the data of record `index`, whose key KeyAt gave, fits into one block.
    bool StaysShort(u32 index, const u8* key) const {
        const u32 slots = blocks_.SlotPair(index);
        const u32 padded = PaddedKeySize(GetBe16(key));
        return blocks_.FitsBlock((slots >> 16) - (slots & 0xFFFF) - padded);
    }

    void Prefetch(u32 index) const {
        const u32 start = blocks_.SlotPair(index) & 0xFFFF;
        if (start < nodeSize_) {
            __builtin_prefetch(blocks_.At(start));
        }
    }

private:
    Blocks blocks_;
    [[no_unique_address]] Shape shape_;
    u32 nodeSize_;
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
    template <typename Keys>
    static void Learn(u32, const u8*, const Keys&) {}
};

// In an index node of folded keys: their order in one number.
class KnownSeparators {
public:
    explicit KnownSeparators(const Hints& hints) : hints_(hints) {}

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
    template <typename Keys>
    void Learn(u32 index, const u8* key, const Keys& keys) const {
        if (HFS_UNLIKELY(!keys.StaysShort(index, key))) {
            return;
        }
        const auto unit = [key](u32 at) { return GetBe16(key + kCatKeyName + 2 * at); };
        u64 order = 0;
        if (MakeOrder(GetBe32(key + kCatKeyParentId), GetBe16(key + kCatKeyNameLength), unit,
                      &order)) {
            hints_.LearnOrder(index, order);
        }
    }

private:
    Hints hints_;
};

// Few nodes stand above the lowest index nodes: they stay in the processor's caches.
template <typename Keys>
void PrefetchFor(const Keys& keys, u32 height, s32 high) {
    if (height == 1) {
        PrefetchProbes<2>(keys, 0, high);
    } else if (height == 2) {
        PrefetchProbes<3>(keys, 0, high);
    }
}

bool TableFits(const BTHeaderMem& header, u32 count) {
    return kSlotSize * (count + 1) < header.nodeSize;
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
           const QuickKeys<Blocks, Shape>& keys, const Known& known, SearchResult* result) {
    const u32 count = NumRecords(node);
    s32 low = 0;
    s32 high = static_cast<s32>(count) - 1;
    const bool quick = HasQuickKeys(tree->header, key, count);
    while (low <= high) {
        const s32 middle = (low + high) >> 1;
        const u32 index = static_cast<u32>(middle);
        int order = 0;
        if (!known.Decide(index, key, &order)) {
            const u8* bytes = quick ? keys.KeyAt(index) : nullptr;
            const BTreeKey* nodeKey = reinterpret_cast<const BTreeKey*>(bytes);
            if (HFS_UNLIKELY(nodeKey == nullptr)) {
                if (doubt == Doubt::kGiveUp) {
                    return kErrNotFound;
                }
                const int status = FetchKey(tree, node, middle, &result->record, &nodeKey);
                if (HFS_UNLIKELY(status != kOk)) {
                    if (status != kErrNoMemory) {
                        Report(status, 3005);
                    }
                    return status;
                }
                order = key.CompareAsAsked(nodeKey);
            } else {
                known.Learn(index, bytes, keys);
                order = Shape::Compare(key, nodeKey);
            }
            if (order == 0) {
                result->found = true;
                result->isLocated =
                    bytes == nullptr || keys.Describe(index, bytes, &result->record);
                result->index = middle;
                result->key = nodeKey;
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
int SearchPlain(CBTreeHfs* tree, const HfsNode* node, const SoughtKey& key, Doubt doubt,
                SearchResult* result) {
    const u32 count = NumRecords(node);
    const QuickKeys<Blocks, Shape> keys(&tree->header, node, Shape(key));
    if (HasQuickKeys(tree->header, key, count)) {
        PrefetchFor(keys, Height(node), static_cast<s32>(count) - 1);
    }
    return Search(tree, node, key, doubt, keys, NothingKnown(), result);
}

template <typename Blocks>
int SearchKnown(CBTreeHfs* tree, const HfsNode* node, const SoughtKey& key, Doubt doubt,
                SearchResult* result) {
    const u32 count = NumRecords(node);
    const QuickKeys<Blocks, FoldedKeys> keys(&tree->header, node, FoldedKeys());
    const Hints hints(tree, node);
    if (hints.Order(count / 2) == 0 && HasQuickKeys(tree->header, key, count)) {
        PrefetchFor(keys, Height(node), static_cast<s32>(count) - 1);
    }
    return Search(tree, node, key, doubt, keys, KnownSeparators(hints), result);
}

template <typename Blocks>
int SearchFolded(CBTreeHfs* tree, const HfsNode* node, const SoughtKey& key, Doubt doubt,
                 SearchResult* result) {
    return node->hints != nullptr && key.HasOrder()
               ? SearchKnown<Blocks>(tree, node, key, doubt, result)
               : SearchPlain<Blocks, FoldedKeys>(tree, node, key, doubt, result);
}

// SearchInside without the search proper. True: the key lies between the first and the last.
template <typename Blocks>
bool LiesInside(CBTreeHfs* tree, const HfsNode* leaf, const SoughtKey& key, u32 count,
                bool* isBehindAll) {
    const QuickKeys<Blocks, OtherKeys> keys(&tree->header, leaf, OtherKeys(key));
    const u8* last = keys.KeyAt(count - 1);
    if (last == nullptr) {
        return false;
    }
    if (key.Compare(reinterpret_cast<const BTreeKey*>(last)) > 0) {
        *isBehindAll = true;
        return false;
    }
    const u8* first = keys.KeyAt(0);
    return first != nullptr && key.Compare(reinterpret_cast<const BTreeKey*>(first)) >= 0;
}

int SearchByShape(CBTreeHfs* tree, const HfsNode* node, const SoughtKey& key, Doubt doubt,
                  SearchResult* result) {
    const bool isWhole = tree->header.blocksPerNode == 1;
    if (key.IsFolded()) {
        return isWhole ? SearchFolded<OneBlock>(tree, node, key, doubt, result)
                       : SearchFolded<ManyBlocks>(tree, node, key, doubt, result);
    }
    return isWhole ? SearchPlain<OneBlock, OtherKeys>(tree, node, key, doubt, result)
                   : SearchPlain<ManyBlocks, OtherKeys>(tree, node, key, doubt, result);
}

}  // namespace

int SearchNode(CBTreeHfs* tree, const HfsNode* node, const SoughtKey& key, SearchResult* result) {
    return SearchByShape(tree, node, key, Doubt::kSettle, result);
}

namespace {

template <typename Blocks>
bool DescribeIn(const BTHeaderMem* hdr, const HfsNode* leaf, u32 index, NodeKey* record,
                const BTreeKey** key) {
    const QuickKeys<Blocks, FoldedKeys> keys(hdr, leaf, FoldedKeys());
    const u8* bytes = keys.KeyAt(index);
    *key = reinterpret_cast<const BTreeKey*>(bytes);
    return bytes != nullptr && keys.Describe(index, bytes, record);
}

}  // namespace

bool DescribePlain(const CBTreeHfs* tree, const HfsNode* leaf, u32 index, NodeKey* record,
                   const BTreeKey** key) {
    const BTHeaderMem* hdr = &tree->header;
    const u32 count = NumRecords(leaf);
    if (tree->compareKeys != CompareCatKeysCaseIns || index >= count || !TableFits(*hdr, count) ||
        leaf->nodeNum == 0) {
        return false;
    }
    return hdr->blocksPerNode == 1 ? DescribeIn<OneBlock>(hdr, leaf, index, record, key)
                                   : DescribeIn<ManyBlocks>(hdr, leaf, index, record, key);
}

bool SearchInside(CBTreeHfs* tree, const HfsNode* leaf, const SoughtKey& key,
                  SearchResult* result) {
    const u32 count = NumRecords(leaf);
    if (count == 0 || !HasQuickKeys(tree->header, key, count)) {
        return false;
    }
    bool isBehindAll = false;
    const bool isInside = tree->header.blocksPerNode == 1
                              ? LiesInside<OneBlock>(tree, leaf, key, count, &isBehindAll)
                              : LiesInside<ManyBlocks>(tree, leaf, key, count, &isBehindAll);
    if (isBehindAll && FLink(leaf) == 0) {
        result->found = false;
        result->index = static_cast<s32>(count);
        return true;
    }
    return isInside && SearchByShape(tree, leaf, key, Doubt::kGiveUp, result) == kOk;
}

namespace {

// The child of a record of which length field and child lie in one block each; 0: the record is not
// so plain.
template <typename Blocks>
u32 PlainChildIn(const BTHeaderMem* hdr, const HfsNode* node, u32 index) {
    const Blocks blocks(hdr, node);
    const u32 slots = blocks.SlotPair(index);
    const u32 start = slots & 0xFFFF;
    const u32 end = slots >> 16;
    if (HFS_UNLIKELY(end >= hdr->nodeSize || start + kKeyLengthSize > end) ||
        HFS_UNLIKELY(Kind(node) != kBTIndexNode) ||
        HFS_UNLIKELY(!blocks.IsWhole(start, kKeyLengthSize)) ||
        HFS_UNLIKELY(PaddedKeySize(GetBe16(blocks.At(start))) + kChildSize != end - start) ||
        HFS_UNLIKELY(!blocks.IsWhole(end - kChildSize, kChildSize))) {
        return 0;
    }
    return GetBe32(blocks.At(end - kChildSize));
}

}  // namespace

u32 PlainChild(const BTHeaderMem* hdr, const HfsNode* node, s32 index) {
    const u32 count = NumRecords(node);
    if (index < 0 || static_cast<u32>(index) >= count || !TableFits(*hdr, count) ||
        node->nodeNum == 0) {
        return 0;
    }
    return hdr->blocksPerNode == 1 ? PlainChildIn<OneBlock>(hdr, node, static_cast<u32>(index))
                                   : PlainChildIn<ManyBlocks>(hdr, node, static_cast<u32>(index));
}

int ChildOf(const CBTreeHfs* tree, const HfsNode* node, s32 index, u32* child) {
    *child = PlainChild(&tree->header, node, index);
    return *child != 0 ? kOk : node->GetChildNodeNum(&tree->header, index, child);
}

}  // namespace VELK
