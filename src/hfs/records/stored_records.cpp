// Reading, changing and walking records in their stored form.
#include "hfs/records/stored_records.h"

#include "hfs/treehfs/bytes.h"

namespace VELK {

namespace {

int OpenTree(ImageVolume* volume, u32 fileId, CBTreeHfs** tree) {
    Problem problem;
    *tree = volume->Tree(fileId, &problem);
    if (*tree != nullptr) {
        return kOk;
    }
    return problem.status != kOk ? problem.status : kErrVolumeNoTree;
}

int Insert(ImageVolume* volume, CBTreeHfs* tree, const SearchKey& key,
           const std::vector<u8>& data) {
    const std::vector<u8> host = HostData(*tree, data);
    const int status =
        tree->InsertRecord(key.Key(), key.id, host.data(), static_cast<unsigned>(data.size()));
    if (status == kOk) {
        CountStored(volume, tree->fileId, data, 1);
    }
    return status;
}

// Takes the record out that holds `before`.
int Delete(ImageVolume* volume, CBTreeHfs* tree, const SearchKey& key,
           const std::vector<u8>& before) {
    const int status = tree->DeleteRecord(key.Key(), key.id, false);
    if (status == kOk) {
        CountStored(volume, tree->fileId, before, -1);
    }
    return status;
}

int FindHere(CBTreeHfs* tree, const SearchKey& key, HfsFindData* path, StoredRecord* record) {
    bool found = false;
    const int status =
        tree->FindEntry(key.Key(), key.id, path, &found, nullptr, nullptr, nullptr, nullptr);
    if (status != kOk) {
        return status;
    }
    return found ? ReadStored(*tree, *path, record) : kErrNotFound;
}

// The engine changes a record in place where its size stays.
int UpdateInPlace(CBTreeHfs* tree, const SearchKey& key, const std::vector<u8>& data) {
    StoredRecord present;
    const int status = FindHere(tree, key, &tree->findData, &present);
    return status == kOk ? tree->UpdateKeyAndRecord(nullptr, HostData(*tree, data).data()) : status;
}

int Replace(ImageVolume* volume, CBTreeHfs* tree, const SearchKey& key,
            const std::vector<u8>& before, const std::vector<u8>& data) {
    int status = Delete(volume, tree, key, before);
    if (status != kOk) {
        return status;
    }
    status = Insert(volume, tree, key, data);
    if (status == kErrTooLarge) {
        // The old record had its place a moment ago. Should it not fit again, that is the failure.
        const int back = Insert(volume, tree, key, before);
        return back == kOk ? status : back;
    }
    return status;
}

}  // namespace

int ReadStored(const CBTreeHfs& tree, const HfsFindData& path, StoredRecord* record) {
    const HfsFindLevel& leaf = path.path[1];
    if (path.level != 1 || leaf.node == nullptr || leaf.index < 0) {
        return kErrNotFound;
    }
    const NodeBytes bytes(&tree.header, leaf.node);
    if (static_cast<u32>(leaf.index) >= bytes.U16(kDescNumRecords)) {
        return kErrNotFound;
    }
    NodeKey place{};
    const int status = leaf.node->GetKey(&tree.header, leaf.index, &place);
    if (status != kOk) {
        return status;
    }
    if (place.data == nullptr || place.keySize > place.size || place.dataSize > place.size) {
        return kErrCorrupt;
    }
    record->node = leaf.node->nodeNum;
    record->index = static_cast<u32>(leaf.index);
    record->key.resize(place.keySize);
    bytes.CopyOut(record->key.data(), place.offset, place.keySize);
    record->data.resize(place.dataSize);
    bytes.CopyOut(record->data.data(), place.offset + place.size - place.dataSize, place.dataSize);
    SearchKey key;
    if (!SearchKeyFromStored(tree.fileId, record->key.data(), place.keySize, &key)) {
        return kErrCorrupt;
    }
    record->id = key.id;
    return kOk;
}

// Type and ID of a catalog record, as far as it has them.
void CountStored(ImageVolume* volume, u32 fileId, const std::vector<u8>& data, int change) {
    constexpr u32 kIdOffset = 8;
    if (fileId == kCatalogFileId && data.size() >= kIdOffset + 4) {
        volume->CountCatalogRecord(GetBe16(data.data()), GetBe32(data.data() + kIdOffset), change);
    }
}

std::vector<u8> HostData(const CBTreeHfs& tree, const std::vector<u8>& data) {
    std::vector<u8> host(data.size() + 2);
    if (!data.empty()) {
        tree.convert.DataToMemory(host.data(), data.data(), static_cast<unsigned>(data.size()));
    }
    return host;
}

std::string KeyText(u32 fileId, const StoredRecord& record) {
    return KeyText(fileId, record.key.data(), static_cast<u32>(record.key.size()), Blanks::kPlain);
}

int FindStored(ImageVolume* volume, u32 fileId, const SearchKey& key, StoredRecord* record) {
    CBTreeHfs* tree = nullptr;
    int status = OpenTree(volume, fileId, &tree);
    if (status == kOk) {
        HfsFindData path;
        status = FindHere(tree, key, &path, record);
        path.ClearPath();
    }
    return status;
}

int InsertStored(ImageVolume* volume, u32 fileId, const SearchKey& key,
                 const std::vector<u8>& data) {
    CBTreeHfs* tree = nullptr;
    int status = volume->IsWritable() ? OpenTree(volume, fileId, &tree) : kErrVolumeReadOnly;
    if (status == kOk) {
        status = Insert(volume, tree, key, data);
        volume->RestoreAfter(status);
    }
    return status;
}

int UpdateStored(ImageVolume* volume, u32 fileId, const SearchKey& key,
                 const std::vector<u8>& data) {
    CBTreeHfs* tree = nullptr;
    StoredRecord before;
    int status = volume->IsWritable() ? OpenTree(volume, fileId, &tree) : kErrVolumeReadOnly;
    if (status == kOk) {
        status = FindStored(volume, fileId, key, &before);
    }
    if (status == kOk) {
        status = before.data.size() == data.size() ? UpdateInPlace(tree, key, data)
                                                   : Replace(volume, tree, key, before.data, data);
        volume->RestoreAfter(status);
    }
    return status;
}

int DeleteStored(ImageVolume* volume, u32 fileId, const SearchKey& key) {
    CBTreeHfs* tree = nullptr;
    StoredRecord before;
    int status = volume->IsWritable() ? OpenTree(volume, fileId, &tree) : kErrVolumeReadOnly;
    if (status == kOk) {
        status = FindStored(volume, fileId, key, &before);
    }
    if (status == kOk) {
        status = Delete(volume, tree, key, before.data);
        volume->RestoreAfter(status);
    }
    return status;
}

void RecordCursor::Seek(const SearchKey& key) {
    path_.ClearPath();
    from_ = key;
    isSought_ = true;
    isDelivered_ = false;
    stands_ = false;
}

void RecordCursor::Release() {
    path_.ClearPath();
    path_.level = 0;
    stands_ = false;
}

// Moves the path on by `count` records, or out of a leaf's end with none.
int RecordCursor::Step(int count) {
    unsigned size = 0;
    return tree_->IncPos(count, room_.data(), static_cast<unsigned>(room_.size()), &size, nullptr,
                         0, nullptr, &path_);
}

// Brings the path to the record to deliver next.
int RecordCursor::Stand() {
    if (stands_) {
        return Step(1);
    }
    const int opened = OpenTree(volume_, fileId_, &tree_);
    if (opened != kOk) {
        return opened;
    }
    room_.resize(std::size_t{tree_->header.nodeSize} + tree_->convert.minDataBuffer);
    if (!isSought_) {
        Seek(LowestKey(fileId_, 0));
    }
    bool found = false;
    const int status =
        tree_->FindEntry(from_.Key(), from_.id, &path_, &found, nullptr, nullptr, nullptr, nullptr);
    if (status != kOk || path_.path[1].node == nullptr) {
        return status != kOk ? status : kErrNotFound;
    }
    return Step(found && isDelivered_ ? 1 : 0);
}

// Takes a delivered key as the one to go on from. False: it does not sort after the last one.
bool RecordCursor::TakeKey(const StoredRecord& record) {
    const BTreeKey* nodeKey = reinterpret_cast<const BTreeKey*>(record.key.data());
    if (isDelivered_ && tree_->compareKeys(from_.Key(), from_.id, nodeKey) >= 0) {
        return false;
    }
    isDelivered_ = true;
    return SearchKeyFromStored(fileId_, record.key.data(), static_cast<u32>(record.key.size()),
                               &from_);
}

int RecordCursor::Next(StoredRecord* record) {
    int status = Stand();
    if (status == kOk) {
        status = ReadStored(*tree_, path_, record);
    }
    if (status == kOk && !TakeKey(*record)) {
        status = kErrCorrupt;
    }
    stands_ = status == kOk;
    if (status != kOk) {
        path_.ClearPath();
    }
    return status;
}

}  // namespace VELK
