// Shape of one node: descriptor, offset table, and the keys of its records.
#include "hfs/check/check_node.h"

#include "hfs/check/check_tree.h"

namespace VELK {
namespace {

const char* KindName(s8 kind) {
    switch (kind) {
        case kBTLeafNode:
            return "leaf";
        case kBTIndexNode:
            return "index";
        case kBTHeaderNode:
            return "header";
        case kBTMapNode:
            return "map";
        default:
            return "unknown";
    }
}

// Slots that can be in a node at all, without that of the free space.
u32 MostRecords(u32 nodeSize) {
    return (nodeSize - kDescSize) / kSlotSize - 1;
}

void CheckKindAndHeight(const CheckTree& tree, u32 level, const CheckNode& node) {
    const s8 wanted = level == 1 ? kBTLeafNode : kBTIndexNode;
    if (node.Kind() != wanted) {
        tree.run->Tell(
            CheckId::N01, CheckSeverity::kError, tree.Place(node.nodeNum, kDescKind),
            CheckPrint("kind is %s (%d), at level %u expected %s (%d)", KindName(node.Kind()),
                       node.Kind(), level, KindName(wanted), wanted),
            std::to_string(wanted), std::to_string(node.Kind()));
    }
    if (node.Height() != level) {
        tree.run->Error(CheckId::N02, tree.Place(node.nodeNum, kDescHeight),
                        CheckPrint("height is %u, at level %u", node.Height(), level), level,
                        node.Height());
    }
    if (const u32 reserved = Load16(node.bytes + kDescReserved); reserved != 0) {
        tree.run->Warn(CheckId::N06, tree.Place(node.nodeNum, kDescReserved),
                       CheckPrint("reserved field is 0x%04x, expected 0", reserved), 0, reserved);
    }
}

// Names what is wrong with slot `index`, the first that cannot be trusted.
void TellSlot(const CheckTree& tree, const CheckNode& node, u32 index) {
    const u32 slotOffset = node.nodeSize - kSlotSize * (index + 1);
    const u32 value = Load16(node.bytes + slotOffset);
    const u32 count = node.NumRecords();
    const u32 limit = node.nodeSize - kSlotSize * (count + 1);
    const CheckPlace place = tree.Place(node.nodeNum, slotOffset);
    const std::string what =
        index == count ? std::string("the free space") : CheckPrint("record %u", index);
    if (index == 0) {
        tree.run->Error(CheckId::N03, place,
                        CheckPrint("record 0 starts at %u, expected %u", value, kDescSize),
                        kDescSize, value);
    } else if (value % 2 != 0) {
        tree.run->Error(CheckId::N03, place,
                        CheckPrint("%s starts at %u, which is odd", what.c_str(), value));
    } else if (value > limit) {
        tree.run->Error(CheckId::N03, place,
                        CheckPrint("%s starts at %u, inside the offset table at %u", what.c_str(),
                                   value, limit));
    } else {
        tree.run->Error(CheckId::N03, place,
                        CheckPrint("%s starts at %u, not behind record %u at %u", what.c_str(),
                                   value, index - 1, node.Slot(index - 1)));
    }
}

}  // namespace

u32 CountUsableRecords(const u8* bytes, u32 nodeSize) {
    const u32 count = Load16(bytes + kDescNumRecords);
    if (count > MostRecords(nodeSize)) {
        return 0;
    }
    const u32 limit = nodeSize - kSlotSize * (count + 1);
    const u8* slot = bytes + nodeSize - kSlotSize;
    u32 before = Load16(slot);
    if (before != kDescSize) {
        return 0;
    }
    for (u32 i = 1; i <= count; ++i) {
        slot -= kSlotSize;
        const u32 value = Load16(slot);
        if (value <= before || value > limit || value % 2 != 0) {
            return i - 1;
        }
        before = value;
    }
    return count;
}

bool CheckNodeShape(const CheckTree& tree, u32 level, CheckNode* node) {
    CheckKindAndHeight(tree, level, *node);
    const s8 wanted = level == 1 ? kBTLeafNode : kBTIndexNode;
    if (node->Kind() != wanted) {
        node->usable = 0;
        return false;
    }
    const u32 count = node->NumRecords();
    if (count > MostRecords(node->nodeSize)) {
        tree.run->Error(CheckId::N03, tree.Place(node->nodeNum, kDescNumRecords),
                        CheckPrint("%u records, a node of %u bytes has room for the offsets of %u",
                                   count, node->nodeSize, MostRecords(node->nodeSize)));
        node->usable = 0;
        return false;
    }
    if (count == 0) {
        tree.run->Error(CheckId::N04, tree.Place(node->nodeNum, kDescNumRecords),
                        "the node holds no record");
    }
    node->usable = CountUsableRecords(node->bytes, node->nodeSize);
    const bool startsRight = Load16(node->bytes + node->nodeSize - kSlotSize) == kDescSize;
    if (node->usable == count && startsRight) {
        return true;
    }
    TellSlot(tree, *node, startsRight ? node->usable + 1 : 0);
    return false;
}

bool TakeRecord(const CheckTree& tree, const CheckNode& node, u32 index, bool isLeaf, bool isSilent,
                CheckRecord* record) {
    const u8* bytes = node.Record(index);
    const u32 size = node.Size(index);
    CheckKeyFault fault;
    const bool isSound = CheckKeySound(tree.kind, bytes, size, &fault);
    if (!fault.text.empty() && !isSilent) {
        tree.run->Tell(tree.kind.RangeId(), fault.severity,
                       tree.Place(node.nodeNum, node.Start(index), index), fault.text, "", "");
    }
    if (!isSound) {
        return false;
    }
    record->key = bytes;
    u32 keySize = kKeyLengthSize + Load16(bytes);
    if (!isLeaf && !tree.HasVariableIndexKeys() &&
        keySize < kKeyLengthSize + tree.header.maxKeyLength) {
        keySize = kKeyLengthSize + tree.header.maxKeyLength;
    }
    if (keySize % 2 != 0) {
        if (!isSilent && keySize < size && bytes[keySize] != 0) {
            tree.run->Warn(tree.kind.RangeId(),
                           tree.Place(node.nodeNum, node.Start(index) + keySize, index),
                           "the byte that pads the key is not 0", 0, bytes[keySize]);
        }
        ++keySize;
    }
    if (keySize > size) {
        keySize = size;
    }
    record->data = bytes + keySize;
    record->dataOffset = node.Start(index) + keySize;
    record->dataSize = size - keySize;
    return true;
}

}  // namespace VELK
