// Delivery of keys and records. See path_deliver.h. Pieces are gathered in the tree's scratch
// buffer; the key is always delivered before the data, so data may use the whole of it.
#include "hfs/treehfs/path_deliver.h"

#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/key_shape.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/scratch.h"

namespace VELK {

namespace {

RecordView ViewOf(const NodeKey& record, const BTreeKey* key) {
    return {key,
            record.data,
            record.keySize,
            record.dataSize,
            record.offset + record.size - record.dataSize,
            record.dataFirstBytes};
}

}  // namespace

int FetchKey(CBTreeHfs* tree, const HfsNode* node, int index, RecordView* record) {
    NodeKey located;
    int status = node->GetKey(&tree->header, index, &located);
    if (HFS_UNLIKELY(status != kOk)) {
        return status;
    }
    const BTreeKey* key = nullptr;
    status = GatherKey(tree, node, located, &key);
    if (HFS_UNLIKELY(status == kErrNoMemory)) {
        return status;
    }
    if (HFS_UNLIKELY(status != kOk || !NodeKeyIsSound(tree, key, located.keySize))) {
        return Fail(kErrCorrupt, kReasonNode, 9020);
    }
    *record = ViewOf(located, key);
    return kOk;
}

int FetchData(const CBTreeHfs* tree, const HfsNode* node, int index, RecordView* record) {
    NodeKey located;
    const int status = node->GetKey(&tree->header, index, &located);
    if (status == kOk) {
        *record = ViewOf(located, nullptr);
    }
    return status;
}

const u8* GatherData(CBTreeHfs* tree, const HfsNode* node, const RecordView& record, u32 size) {
    u8* gathered = DataScratch(tree, size);
    if (gathered != nullptr) {
        NodeBytes(&tree->header, node).CopyOut(gathered, record.dataOffset, size);
    }
    return gathered;
}

[[gnu::noinline]] void CopyData(void* target, const u8* source, u32 size) {
    if (size > 0) {
        std::memcpy(target, source, size);
    }
}

}  // namespace VELK
