// Delivery of keys and records. See path_deliver.h. Pieces are gathered in the tree's scratch
// buffer; the key is always delivered before the data, so data may use the whole of it.
#include "hfs/treehfs/path_deliver.h"

#include <cstring>

#include "hfs/treehfs/bytes.h"
#include "hfs/treehfs/key_shape.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/scratch.h"

namespace VELK {

namespace {

// Copies a key in steps of words, the last one over the end of the step before it. Keys are short:
// a compiler that knows so makes of memcpy an instruction that takes longer to begin than to copy.
void CopyKey(u8* target, const u8* source, u32 size) {
    constexpr u32 kStep = 16;
    u8 step[kStep];
    if (size < kStep) {
        std::memcpy(target, source, size);
        return;
    }
    for (u32 at = 0; at < size - kStep; at += kStep) {
        std::memcpy(step, source + at, kStep);
        std::memcpy(target + at, step, kStep);
    }
    std::memcpy(step, source + size - kStep, kStep);
    std::memcpy(target + size - kStep, step, kStep);
}

}  // namespace

int FetchKey(CBTreeHfs* tree, const HfsNode* node, int index, NodeKey* record,
             const BTreeKey** key) {
    int status = node->GetKey(&tree->header, index, record);
    if (HFS_UNLIKELY(status != kOk)) {
        return status;
    }
    status = GatherKey(tree, node, *record, key);
    if (HFS_UNLIKELY(status == kErrNoMemory)) {
        return status;
    }
    if (HFS_UNLIKELY(status != kOk || !NodeKeyIsSound(tree, *key, record->keySize))) {
        return Fail(kErrCorrupt, kReasonNode, 9020);
    }
    return kOk;
}

int DeliverData(CBTreeHfs* tree, const HfsNode* node, const NodeKey& record, void* target,
                u32 size) {
    const u8* source = record.data;
    if (size > record.dataFirstBytes) {
        u8* gathered = DataScratch(tree, size);
        if (gathered == nullptr) {
            return kErrNoMemory;
        }
        NodeBytes(&tree->header, node)
            .CopyOut(gathered, record.offset + record.size - record.dataSize, size);
        source = gathered;
    }
    if (tree->convert.DataToMemory != nullptr) {
        tree->convert.DataToMemory(target, source, size);
    } else if (size > 0) {
        std::memcpy(target, source, size);
    }
    return kOk;
}

void DeliverKey(const CBTreeHfs* tree, const BTreeKey* key, void* target, u32 size) {
    if (tree->convert.KeyToMemory != nullptr) {
        tree->convert.KeyToMemory(target, key, size);
    } else {
        CopyKey(static_cast<u8*>(target), reinterpret_cast<const u8*>(key), size);
    }
}

}  // namespace VELK
