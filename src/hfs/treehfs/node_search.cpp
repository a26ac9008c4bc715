// Search in a node. Nearly every probe meets a sound record whose key lies in one block; that case
// is decided here, without a call and with the memory of the next probes already asked for. Any
// doubt goes the careful way of FetchKey, which also reports what is wrong.
#include "hfs/treehfs/node_search.h"

#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/path_deliver.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/scratch.h"

namespace VELK {

namespace {

// Folds an ASCII unit; 0 for NUL and for every other unit, which need the folding table.
u16 FoldPlain(u32 unit) {
    if (unit - 1 >= 0x7F) {
        return 0;
    }
    return static_cast<u16>(unit - 'A' < 26 ? unit + ('a' - 'A') : unit);
}

// The key of record `index` where it lies, null when anything about the record is out of the
// ordinary: exactly the checks of GetKey, of contiguity and of soundness.
class QuickKeys {
public:
    QuickKeys(const BTHeaderMem* hdr, const HfsNode* node, const SearchKey& key)
        : bufs_(node->bufs),
          nodeSize_(hdr->nodeSize),
          blockMask_(hdr->blockMask),
          blockShift_(hdr->blockShift),
          fixed_(key.Fixed()),
          nameLengthAt_(key.NameLengthAt()) {}

    // REQUIRES: the slots of record `index` and the next lie inside the node.
    u32 Slot(u32 index) const { return GetBe16(At(nodeSize_ - kSlotSize * (index + 1))); }

    const u8* KeyAt(u32 index) const {
        const u32 start = Slot(index);
        const u32 end = Slot(index + 1);
        if (end >= nodeSize_ || start >= end) {
            return nullptr;
        }
        const u32 room = blockMask_ + 1 - (start & blockMask_);
        const u8* key = At(start);
        if (room < kKeyLengthSize || (start & 1) != 0) {
            return nullptr;
        }
        const u32 keyLength = GetBe16(key);
        const u32 padded = PaddedKeySize(keyLength);
        if (keyLength < fixed_ || keyLength > kMaxKeyLength || padded > room ||
            padded >= end - start) {
            return nullptr;
        }
        // Data in three blocks is asserted each time it is described.
        if (((end - 1) >> blockShift_) - ((start + padded) >> blockShift_) > 1) {
            return nullptr;
        }
        if (nameLengthAt_ != 0 && fixed_ + 2u * GetBe16(key + nameLengthAt_) > keyLength) {
            return nullptr;
        }
        return key;
    }

    void Prefetch(u32 index) const {
        const u32 start = Slot(index);
        if (start < nodeSize_) {
            __builtin_prefetch(At(start));
        }
    }

private:
    const u8* At(u32 offset) const {
        return bufs_[offset >> blockShift_].data + (offset & blockMask_);
    }

    const HfsBcbBuf* bufs_;
    u32 nodeSize_;
    u32 blockMask_;
    u32 blockShift_;
    u32 fixed_;
    u32 nameLengthAt_;
};

// Asks for the keys that the first four probes can meet, all at once: waiting for one after the
// other is what a search in a cold node consists of.
void PrefetchProbes(const QuickKeys& keys, s32 high) {
    constexpr u32 kRounds = 4;
    struct Interval {
        s32 low;
        s32 high;
    };
    Interval intervals[(1u << kRounds) - 1] = {{0, high}};
    for (u32 at = 0; at < (1u << kRounds) - 1; ++at) {
        const Interval here = intervals[at];
        if (here.low > here.high) {
            continue;
        }
        const s32 middle = (here.low + here.high) >> 1;
        keys.Prefetch(static_cast<u32>(middle));
        if (2 * at + 2 < (1u << kRounds) - 1) {
            intervals[2 * at + 1] = {here.low, middle - 1};
            intervals[2 * at + 2] = {middle + 1, here.high};
        }
    }
}

// Without a known shape, or with more slots than the node has room for, no key is quick.
bool HasQuickKeys(const BTHeaderMem& header, const SearchKey& key, u32 count) {
    return key.Fixed() != 0 && kSlotSize * (count + 1) < header.nodeSize;
}

}  // namespace

SearchKey::SearchKey(const CBTreeHfs* tree, const BTreeKey* key, unsigned id)
    : key_(key), compare_(tree->compareKeys), id_(id) {
    // A search key out of line is asserted by the comparator each time it is asked.
    KeyShape shape;
    if (reinterpret_cast<std::uintptr_t>(key) % 4 != 0 || !ShapeOf(compare_, &shape)) {
        return;
    }
    fixed_ = shape.fixed;
    nameLengthAt_ = shape.nameLength;
    byParentFirst_ = compare_ == CompareCatKeysCaseIns;
    // The whole key, not the two bytes of its length field.
    const u8* bytes = reinterpret_cast<const u8*>(key);
    if (byParentFirst_ && GetHost16(bytes + kCatKeyNameLength) != 0) {
        firstUnit_ = FoldPlain(GetHost16(bytes + kCatKeyName));
    }
}

// Decides by parent and first unit of the name; 0 when these are equal or not plain.
inline int SearchKey::CompareFirstUnits(const u8* nodeKey) const {
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

inline int SearchKey::Compare(const BTreeKey* nodeKey) const {
    if (byParentFirst_) {
        const int order = CompareFirstUnits(reinterpret_cast<const u8*>(nodeKey));
        if (order != 0) {
            return order;
        }
    }
    return compare_(key_, id_, nodeKey);
}

int SearchNode(CBTreeHfs* tree, const HfsNode* node, const SearchKey& key, SearchResult* result) {
    const u32 count = NumRecords(node);
    s32 low = 0;
    s32 high = static_cast<s32>(count) - 1;
    const QuickKeys keys(&tree->header, node, key);
    const bool quick = HasQuickKeys(tree->header, key, count);
    if (quick) {
        PrefetchProbes(keys, high);
    }
    while (low <= high) {
        const s32 middle = (low + high) >> 1;
        const u8* bytes = quick ? keys.KeyAt(static_cast<u32>(middle)) : nullptr;
        const BTreeKey* nodeKey = reinterpret_cast<const BTreeKey*>(bytes);
        if (HFS_UNLIKELY(nodeKey == nullptr)) {
            const int status = FetchKey(tree, node, middle, &result->record, &nodeKey);
            if (HFS_UNLIKELY(status != kOk)) {
                if (status != kErrNoMemory) {
                    Report(status, 3005);
                }
                return status;
            }
        }
        const int order = key.Compare(nodeKey);
        if (order == 0) {
            result->found = true;
            result->isLocated = bytes == nullptr;
            result->index = middle;
            result->key = nodeKey;
            return kOk;
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

bool SearchInside(CBTreeHfs* tree, const HfsNode* leaf, const SearchKey& key,
                  SearchResult* result) {
    const u32 count = NumRecords(leaf);
    if (count == 0 || !HasQuickKeys(tree->header, key, count)) {
        return false;
    }
    const QuickKeys keys(&tree->header, leaf, key);
    const u8* last = keys.KeyAt(count - 1);
    if (last == nullptr) {
        return false;
    }
    const int order = key.Compare(reinterpret_cast<const BTreeKey*>(last));
    if (order > 0 && FLink(leaf) == 0) {
        result->found = false;
        result->index = static_cast<s32>(count);
        return true;
    }
    const u8* first = order > 0 ? nullptr : keys.KeyAt(0);
    return first != nullptr && key.Compare(reinterpret_cast<const BTreeKey*>(first)) >= 0 &&
           SearchNode(tree, leaf, key, result) == kOk;
}

int ChildOf(const CBTreeHfs* tree, const HfsNode* node, s32 index, u32* child) {
    const BTHeaderMem* hdr = &tree->header;
    const u32 count = NumRecords(node);
    if (HFS_UNLIKELY(index < 0 || static_cast<u32>(index) >= count ||
                     kSlotSize * (count + 1) >= hdr->nodeSize)) {
        return node->GetChildNodeNum(hdr, index, child);
    }
    const NodeBytes bytes(hdr, node);
    const u32 start = bytes.U16(SlotOffset(hdr, static_cast<u32>(index)));
    const u32 end = bytes.U16(SlotOffset(hdr, static_cast<u32>(index) + 1));
    if (HFS_UNLIKELY(end >= hdr->nodeSize || start >= end || Kind(node) != kBTIndexNode ||
                     PaddedKeySize(bytes.U16(start)) + kChildSize != end - start)) {
        return node->GetChildNodeNum(hdr, index, child);
    }
    *child = bytes.U32(end - kChildSize);
    return kOk;
}

}  // namespace VELK
