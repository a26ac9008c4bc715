// See fields.h.
#include "fields.h"

#include <algorithm>

#include "hfs/format.h"

namespace VELK::test {

namespace {

constexpr Field kDescriptor[] = {
    {kDescFLink, 4, "fLink"},
    {kDescBLink, 4, "bLink"},
    {kDescKind, 1, "kind"},
    {kDescHeight, 1, "height"},
    {kDescNumRecords, 2, "number of records"},
    {kDescReserved, 2, "reserved"},
};

constexpr Field kHeaderRecord[] = {
    {kHeadTreeDepth, 2, "tree depth"},
    {kHeadRootNode, 4, "root node"},
    {kHeadLeafRecords, 4, "leaf records"},
    {kHeadFirstLeafNode, 4, "first leaf"},
    {kHeadLastLeafNode, 4, "last leaf"},
    {kHeadNodeSize, 2, "node size"},
    {kHeadMaxKeyLength, 2, "longest key"},
    {kHeadTotalNodes, 4, "total nodes"},
    {kHeadFreeNodes, 4, "free nodes"},
    {kHeadReserved, 2, "reserved of the header"},
    {kHeadClumpSize, 4, "clump size"},
    {kHeadBtreeType, 1, "tree type"},
    {kHeadKeyCompareType, 1, "key order"},
    {kHeadAttributes, 4, "attributes"},
    {kHeadMapRecord, 2, "map of the header"},
    {kHeadMapRecord + 2, 2, "map of the header, second word"},
};

u32 Number16(const u8* at) {
    return static_cast<u32>(at[0] << 8 | at[1]);
}

class FieldList {
public:
    FieldList(u32 nodeSize, u32 fileId) : nodeSize_(nodeSize), fileId_(fileId) {}

    void Add(u32 offset, u8 width, const char* name) {
        if (u64{offset} + width <= nodeSize_) {
            fields.push_back({offset, width, name});
        }
    }

    // The numbers of the key of the record at `start`; they lie where the tree's kind says.
    void AddKey(u32 start) {
        Add(start, 2, "key length");
        switch (fileId_) {
            case kCatalogFileId:
                Add(start + kCatKeyParentId, 4, "parent");
                Add(start + kCatKeyNameLength, 2, "name length");
                break;
            case kAttributesFileId:
                Add(start + kAttrKeyFileId, 4, "file of the key");
                Add(start + kAttrKeyStartBlock, 4, "start block");
                Add(start + kAttrKeyNameLength, 2, "name length");
                break;
            default:
                Add(start + kExtKeyForkType, 2, "fork");
                Add(start + kExtKeyFileId, 4, "file of the key");
                Add(start + kExtKeyStartBlock, 4, "start block");
        }
    }

    std::vector<Field> fields;

private:
    u32 nodeSize_;
    u32 fileId_;
};

std::vector<Field> VolumeHeaderFields() {
    std::vector<Field> fields = {
        {0, 2, "signature"},       {2, 2, "version"},       {4, 4, "attributes"},
        {8, 4, "last mounted by"}, {12, 4, "journal info"}, {16, 4, "created"},
        {20, 4, "modified"},       {24, 4, "backed up"},    {28, 4, "checked"},
        {32, 4, "files"},          {36, 4, "folders"},      {40, 4, "block size"},
        {44, 4, "total blocks"},   {48, 4, "free blocks"},  {52, 4, "next allocation"},
        {56, 4, "resource clump"}, {60, 4, "data clump"},   {64, 4, "next catalog ID"},
        {68, 4, "write count"},    {72, 8, "encodings"},
    };
    for (u32 i = 0; i < 8; ++i) {
        fields.push_back({80 + 4 * i, 4, "finder info"});
    }
    for (u32 fork = 112; fork < 512; fork += 80) {
        fields.push_back({fork, 8, "fork size"});
        fields.push_back({fork + 8, 4, "fork clump"});
        fields.push_back({fork + 12, 4, "fork blocks"});
        for (u32 extent = 0; extent < kExtentCount; ++extent) {
            fields.push_back({fork + 16 + 8 * extent, 4, "extent start"});
            fields.push_back({fork + 20 + 8 * extent, 4, "extent length"});
        }
    }
    return fields;
}

void AddAround(std::vector<u64>* values, u64 value) {
    for (const u64 near : {value - 2, value - 1, value, value + 1, value + 2}) {
        values->push_back(near);
    }
}

}  // namespace

u64 GetField(const u8* bytes, const Field& field) {
    u64 value = 0;
    for (u32 i = 0; i < field.width; ++i) {
        value = value << 8 | bytes[field.offset + i];
    }
    return value;
}

void SetField(u8* bytes, const Field& field, u64 value) {
    for (u32 i = field.width; i-- > 0; value >>= 8) {
        bytes[field.offset + i] = static_cast<u8>(value);
    }
}

std::vector<Field> FieldsOfNode(const u8* node, u32 nodeSize, u32 fileId) {
    FieldList list(nodeSize, fileId);
    for (const Field& field : kDescriptor) {
        list.Add(field.offset, field.width, field.name);
    }
    const s8 kind = static_cast<s8>(node[kDescKind]);
    if (kind == kBTHeaderNode) {
        for (const Field& field : kHeaderRecord) {
            list.Add(field.offset, field.width, field.name);
        }
    }
    if (kind == kBTMapNode) {
        list.Add(kDescSize, 2, "map");
    }
    const u32 records =
        std::min(Number16(node + kDescNumRecords), (nodeSize - kDescSize) / kSlotSize - 1);
    for (u32 i = 0; i <= records; ++i) {
        const u32 slot = nodeSize - kSlotSize * (i + 1);
        list.Add(slot, 2, i == records ? "slot of the free space" : "slot");
        const u32 start = Number16(node + slot);
        const bool hasKey = kind == kBTLeafNode || kind == kBTIndexNode;
        if (i == records || !hasKey || start + kKeyLengthSize > nodeSize) {
            continue;
        }
        list.AddKey(start);
        if (kind == kBTIndexNode) {
            list.Add(start + ((Number16(node + start) + 3) & ~1u), 4, "child");
        }
    }
    return list.fields;
}

std::vector<Field> DataOfNode(const u8* node, u32 nodeSize) {
    std::vector<Field> fields;
    const u32 records =
        std::min(Number16(node + kDescNumRecords), (nodeSize - kDescSize) / kSlotSize - 1);
    for (u32 i = 0; i < records && static_cast<s8>(node[kDescKind]) == kBTLeafNode; ++i) {
        const u8* slot = node + nodeSize - kSlotSize * (i + 1);
        const u32 start = Number16(slot);
        const u32 end = std::min(Number16(slot - kSlotSize), nodeSize);
        if (start + kKeyLengthSize > nodeSize) {
            continue;
        }
        u32 at = start + ((kKeyLengthSize + Number16(node + start) + 1) & ~1u);
        if (at + 2 <= end) {
            fields.push_back({at, 2, "record type"});
        }
        for (; at + 4 <= end; at += 4) {
            fields.push_back({at, 4, "data"});
        }
    }
    return fields;
}

const std::vector<Field>& FieldsOfVolumeHeader() {
    static const std::vector<Field> fields = VolumeHeaderFields();
    return fields;
}

const std::vector<Field>& FieldsOfJournalInfo() {
    static const std::vector<Field> fields = {{0, 4, "flags"}, {36, 8, "offset"}, {44, 8, "size"}};
    return fields;
}

const std::vector<Field>& FieldsOfJournalHeader() {
    static const std::vector<Field> fields = {
        {0, 4, "magic"}, {4, 4, "byte order"}, {8, 8, "start"},     {16, 8, "end"},
        {24, 8, "size"}, {32, 4, "list size"}, {36, 4, "checksum"}, {40, 4, "sector size"},
    };
    return fields;
}

std::vector<Field> FieldsOfJournalList(u32 blocks) {
    std::vector<Field> fields = {
        {0, 2, "most blocks"},        {2, 2, "blocks"}, {4, 4, "bytes used"}, {8, 4, "checksum"},
        {28, 4, "more lists follow"},
    };
    for (u32 i = 1; i <= blocks; ++i) {
        fields.push_back({16 + 16 * i, 8, "target"});
        fields.push_back({24 + 16 * i, 4, "bytes"});
    }
    return fields;
}

std::vector<u64> BoundaryValues(const Field& field, u64 old, u32 nodeSize, u64 limit) {
    std::vector<u64> values = {0, 1, 2, 3, kDescSize - 1, kDescSize, kDescSize + 1, nodeSize};
    AddAround(&values, old);
    AddAround(&values, limit);
    values.push_back(nodeSize - kSlotSize);
    for (const u32 bit : {7u, 8u, 15u, 16u, 17u, 31u, 32u, 63u}) {
        AddAround(&values, u64{1} << bit);
    }
    const u64 all = field.width == 8 ? ~u64{0} : (u64{1} << (8 * field.width)) - 1;
    AddAround(&values, all / 2);
    AddAround(&values, all);
    for (u64& value : values) {
        value &= all;
    }
    std::sort(values.begin(), values.end());
    values.erase(std::unique(values.begin(), values.end()), values.end());
    return values;
}

u32 ClaimedNodeSize(const u8* tree, std::size_t size) {
    if (size < kHeadEnd) {
        return 1u << kMinNodeShift;
    }
    const u32 claimed = Number16(tree + kHeadNodeSize);
    const bool isSize = claimed >= 512 && (claimed & (claimed - 1)) == 0;
    return isSize ? claimed : 1u << kMinNodeShift;
}

}  // namespace VELK::test
