// Puts one record into one node: _InsertRecord opens a gap and counts the record, _InsertKeyRecord
// fills it with a key and its data, converted to disk form on the way. Neither looks at another
// node. That a record does not fit is an answer to callers that ask for it.
#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/hints.h"
#include "hfs/treehfs/node_desc.h"
#include "hfs/treehfs/one_piece.h"
#include "hfs/treehfs/own_change.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/scratch.h"
#include "hfs/treehfs/slots.h"

namespace VELK {

namespace {

// Gives every slot from the new free-space slot at `first` up to that of the record behind the new
// one the value of its upper neighbour, raised by the new record's size. Blocks are marked as the
// walk enters them; a failure leaves the slots before in place.
int OpenSlots(CBTreeHfs* tree, HfsNode* node, u32 first, u32 slotCount, u32 size) {
    const NodeBytes bytes(&tree->header, node);
    HFS_TRY(MarkDirty(tree, node, first), 1268);
    HFS_ASSERT(bytes.IsDirty(first), 1269);
    const u32 end = first + kSlotSize * slotCount;
    u32 position = first;
    while (position < end) {
        u32 piece = bytes.Room(position);
        const bool more = end - position > piece;
        if (!more) {
            piece = end - position;
        }
        u8* slot = bytes.At(position);
        u8* const last = slot + piece - kSlotSize;
        for (; slot < last; slot += kSlotSize) {
            PutBe16(slot, GetBe16(slot + kSlotSize) + size);
        }
        position += piece;
        if (more) {
            HFS_TRY(MarkDirty(tree, node, position), 1284);
            HFS_ASSERT(bytes.IsDirty(position), 1285);
        }
        PutBe16(last, bytes.U16(position) + size);
    }
    return kOk;
}

// Moves the records from `index` on up by `size` bytes. `key` holds where free space starts and
// comes back with the place of the gap.
int OpenGap(CBTreeHfs* tree, HfsNode* node, int index, u32 size, NodeKey* key) {
    const BTHeaderMem* hdr = &tree->header;
    const u32 free = key->offset;
    NodeKey record;
    HFS_TRY(node->GetKey(hdr, index, &record), 1203);
    if (!IsInsertPoint(record.offset, free) || !IsInsertPoint(record.offset + record.size, free)) {
        return Fail(kErrCorrupt, kReasonNode, 9200);
    }
    HFS_TRY(MarkDirty(tree, node, record.offset, free + size - record.offset), 1214);
    NodeBytes(hdr, node).Move(record.offset + size, record.offset, free - record.offset);

    key->offset = record.offset;
    key->firstBytes = record.firstBytes;
    key->ptr = record.ptr;
    key->next1 = record.next1;
    key->next2 = record.next2;
    return kOk;
}

// Copies or converts the key to the start of the new record. The source may lie in `scratch`: a
// key that is already in disk form goes straight into its blocks.
void StoreKey(CBTreeHfs* tree, const NodeBytes& bytes, u32 offset, const BTreeKey* key, u32 keySize,
              const HfsConvert* convert) {
    if (convert == nullptr || convert->KeyToDisk == nullptr) {
        bytes.CopyIn(offset, key, keySize);
    } else if (keySize <= bytes.Room(offset)) {
        convert->KeyToDisk(bytes.At(offset), key);
    } else {
        convert->KeyToDisk(tree->scratch, key);
        bytes.CopyIn(offset, tree->scratch, keySize);
    }
}

// Copies or converts the data behind the key, which has left the scratch buffer by now.
int StoreData(CBTreeHfs* tree, const NodeBytes& bytes, u32 offset, const void* data, u32 dataSize,
              const HfsConvert* convert) {
    if (convert == nullptr || convert->DataToDisk == nullptr) {
        bytes.CopyIn(offset, data, dataSize);
    } else if (dataSize <= bytes.Room(offset)) {
        convert->DataToDisk(bytes.At(offset), data, dataSize);
    } else {
        u8* piece = DataScratch(tree, dataSize);
        if (piece == nullptr) {
            return Fail(kErrCorrupt, kReasonNode, 9201);
        }
        convert->DataToDisk(piece, data, dataSize);
        bytes.CopyIn(offset, piece, dataSize);
    }
    if ((dataSize & 1) != 0) {
        bytes.SetU8(offset + dataSize, 0);
    }
    return kOk;
}

// Makes a record of `size` bytes at `index`. `key` holds where free space starts and comes back
// with the place of the record, whose bytes are not written.
int MakeRecord(CBTreeHfs* tree, HfsNode* node, u32 index, u32 count, u32 size, NodeKey* key) {
    const u32 limit = key->entryPos;
    if (index == count) {
        HFS_TRY(MarkDirty(tree, node, key->offset, size), 1257);
    } else {
        const int status = OpenGap(tree, node, static_cast<int>(index), size, key);
        if (status != 0) {
            return status;
        }
    }
    const int status = OpenSlots(tree, node, limit - kSlotSize, count - index + 1, size);
    if (status != 0) {
        return status;
    }
    HFS_TRY(MarkDirty(tree, node, 0), 1295);
    HFS_ASSERT(NodeBytes(&tree->header, node).IsDirty(0), 1296);
    SetNumRecords(&tree->header, node, count + 1);
    return kOk;
}

// How far a node went along with a change that nothing can refuse half-way.
enum class Plain {
    kDone,
    kFull,      // there is no room, and nothing has changed
    kDoubtful,  // the long way round has to tell, and nothing has changed
};

// Opens a gap of `size` bytes, an even number, for record `index` in a node that lies in one piece
// and was marked before, and counts the record.
Plain OpenPlainGap(CBTreeHfs* tree, HfsNode* node, u32 index, u32 size, u32* gap) {
    const BTHeaderMem* hdr = &tree->header;
    const PlainBytes bytes(hdr, node);
    const u32 nodeSize = bytes.Size();
    const u32 count = NumRecords(node);
    const u32 tableSize = kSlotSize * (count + 1);
    if (!IsMarkedPiece(hdr, node) || index > count || tableSize >= nodeSize) {
        return Plain::kDoubtful;
    }
    u8* const data = bytes.At(0);
    u8* const freeSlot = data + nodeSize - tableSize;
    const u32 free = GetBe16(freeSlot);
    const u32 limit = nodeSize - tableSize;
    if (!IsInsertPoint(free, limit)) {
        return Plain::kDoubtful;
    }
    if (u64{free} + size + kSlotSize > limit) {
        return Plain::kFull;
    }
    u8* const slot = freeSlot + kSlotSize * (count - index);
    const u32 start = GetBe16(slot);
    if (index < count) {
        const u32 end = GetBe16(slot - kSlotSize);
        if (!IsInsertPoint(start, free) || !IsInsertPoint(end, free) || Kind(node) > kBTIndexNode) {
            return Plain::kDoubtful;
        }
        const u32 dataStart = start + PaddedKeySize(GetBe16(data + start));
        if (!CanMoveData(hdr, dataStart, end)) {
            return Plain::kDoubtful;
        }
        bytes.Move(start + size, start, free - start);
    }
    for (u8* to = freeSlot - kSlotSize; to < slot; to += kSlotSize) {
        PutBe16(to, GetBe16(to + kSlotSize) + size);
    }
    PutBe16(data + kDescNumRecords, count + 1);
    node->modifiedLink.MoveTail(&tree->modifiedList);
    if (node->hints != nullptr) {
        Hints(tree, node).Insert(index, 1);
    }
    *gap = start;
    return Plain::kDone;
}

// A record as it is to be stored. The sizes of key and data are even in the node.
struct NewRecord {
    const BTreeKey* key;
    u32 keySize;  // even
    const void* data;
    u32 dataSize;
    const HfsConvert* convert;
};

// Puts a record into such a node.
Plain PutPlainRecord(CBTreeHfs* tree, HfsNode* node, u32 index, const NewRecord& record) {
    u32 at = 0;
    const u32 evenDataSize = (record.dataSize + 1) / 2 * 2;
    const Plain result = OpenPlainGap(tree, node, index, record.keySize + evenDataSize, &at);
    if (result != Plain::kDone) {
        return result;
    }
    const PlainBytes bytes(&tree->header, node);
    if (record.convert == nullptr || record.convert->KeyToDisk == nullptr) {
        bytes.CopyIn(at, record.key, record.keySize);
    } else {
        record.convert->KeyToDisk(bytes.At(at), record.key);
    }
    at += record.keySize;
    if (record.convert == nullptr || record.convert->DataToDisk == nullptr) {
        bytes.CopyIn(at, record.data, record.dataSize);
    } else {
        record.convert->DataToDisk(bytes.At(at), record.data, record.dataSize);
    }
    if ((record.dataSize & 1) != 0) {
        *bytes.At(at + record.dataSize) = 0;
    }
    return Plain::kDone;
}

}  // namespace

int CBTreeHfs::_InsertRecord(HfsNode* node, int index, unsigned size, NodeKey* key,
                             bool* inserted) {
    NoteChange(this);
    const u32 count = NumRecords(node);
    if (index == -1) {
        index = static_cast<int>(count);
    }
    HFS_ASSERT(static_cast<u32>(index) <= count, 1170);
    HFS_TRY(node->GetFreeKey(&header, count, key), 1174);
    const u32 free = key->offset;
    const u32 limit = key->entryPos;
    HFS_ASSERT(free <= limit, 1179);
    if (static_cast<u32>(index) > count || !IsInsertPoint(free, limit) || size == 0 ||
        (size & 1) != 0) {
        return Fail(kErrCorrupt, kReasonNode, 9202);
    }
    if (static_cast<u64>(free) + size + kSlotSize > limit) {
        if (inserted == nullptr) {
            return Fail(kErrInvalid, kReasonInvalid, 1183);
        }
        *inserted = false;
        return kOk;
    }

    const int status = MakeRecord(this, node, static_cast<u32>(index), count, size, key);
    if (status != kOk) {
        ForgetRecords(this, node);
        return status;
    }
    if (node->hints != nullptr) {
        Hints(this, node).Insert(static_cast<u32>(index), 1);
    }
    if (inserted != nullptr) {
        *inserted = true;
    }
    return kOk;
}

int CBTreeHfs::_InsertKeyRecord(HfsNode* node, int index, const BTreeKey* key, unsigned keyLen,
                                const void* data, unsigned dataSize, HfsConvert* hook,
                                bool* inserted) {
    const u32 keyLength = hook != nullptr ? GetHost16(key) : GetBe16(key->length);
    if (keyLen == 0) {
        keyLen = keyLength;
    } else {
        HFS_ASSERT(keyLen >= keyLength, 1359);
    }
    HFS_ASSERT(keyLen <= kMaxKeyLength, 1362);
    if (dataSize == 0) {
        return Fail(kErrInvalid, kReasonInvalid, 9203);  // no lookup could read it again
    }
    if (hook != nullptr && header.blocksPerNode > 1) {
        HFS_TRY(EnsureScratch(this), 9204);
    }

    const u32 keySize = keyLength + kKeyLengthSize;
    const u32 paddedKeySize = PaddedKeySize(keyLength);
    if (keyLen == keyLength && paddedKeySize == keySize && dataSize <= header.nodeSize) {
        NoteChange(this);
        const u32 place = index == -1 ? NumRecords(node) : static_cast<u32>(index);
        const Plain result =
            PutPlainRecord(this, node, place, {key, keySize, data, dataSize, hook});
        if (HFS_LIKELY(result == Plain::kDone) || (result == Plain::kFull && inserted != nullptr)) {
            if (inserted != nullptr) {
                *inserted = result == Plain::kDone;
            }
            return kOk;
        }
    }
    const u64 recordSize = (static_cast<u64>(dataSize) + 1) / 2 * 2 + paddedKeySize;
    // A size beyond 32 bits fits no node either.
    const u32 size = recordSize > UINT32_MAX ? UINT32_MAX - 1 : static_cast<u32>(recordSize);
    NodeKey record;
    HFS_TRY(_InsertRecord(node, index, size, &record, inserted), 1370);
    if (inserted != nullptr && !*inserted) {
        return kOk;
    }

    const NodeBytes bytes(&header, node);
    StoreKey(this, bytes, record.offset, key, keySize, hook);
    if (keyLen != keyLength) {
        bytes.SetU16(record.offset, keyLen);
        bytes.Fill(record.offset + keySize, 0, paddedKeySize - keySize);
    } else if ((keyLength & 1) != 0) {
        HFS_ASSERT(paddedKeySize == keySize + 1, 1471);
        bytes.SetU8(record.offset + keySize, 0);
    }
    return StoreData(this, bytes, record.offset + paddedKeySize, data, dataSize, hook);
}

int CBTreeHfs::_InsertKeyRecord(HfsNode* node, int index, const BTreeKey* key, unsigned keyLen,
                                const void* data, unsigned dataSize, HfsConvert* hook) {
    return _InsertKeyRecord(node, index, key, keyLen, data, dataSize, hook, nullptr);
}

}  // namespace VELK
