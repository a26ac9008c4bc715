// Operations of scripts that change records.
#include <fmt/format.h>

#include "hfs/records/record_fields.h"
#include "hfs/records/text_format.h"
#include "hfs/treehfs/bytes.h"
#include "tool/script_run.h"

namespace VELK::tool {
namespace {

// Bytes of the record the tree's own path stands on; false when it stands on none.
bool StoredHere(CBTreeHfs* tree, const HfsFindData& path, std::vector<u8>* stored) {
    const HfsFindLevel& leaf = path.path[1];
    if (!path.valid || path.level != 1 || leaf.node == nullptr || leaf.index < 0) {
        return false;
    }
    const NodeBytes bytes(&tree->header, leaf.node);
    if (static_cast<u32>(leaf.index) >= bytes.U16(kDescNumRecords)) {
        return false;
    }
    NodeKey record{};
    if (leaf.node->GetKey(&tree->header, leaf.index, &record) != kOk || record.data == nullptr) {
        return false;
    }
    stored->resize(record.dataSize);
    bytes.CopyOut(stored->data(), record.offset + record.size - record.dataSize, record.dataSize);
    return true;
}

// The data of the record with this key, by a path of its own.
bool StoredAt(CBTreeHfs* tree, const SearchKey& key, std::vector<u8>* stored) {
    HfsFindData path;
    bool found = false;
    const int status =
        tree->FindEntry(key.Key(), key.id, &path, &found, nullptr, nullptr, nullptr, nullptr);
    const bool isThere = status == kOk && found && StoredHere(tree, path, stored);
    path.ClearPath();
    return isThere;
}

}  // namespace

void CountRecord(ImageVolume* volume, const u8* stored, u32 size, int change) {
    const u32 idOffset = 8;
    if (size >= idOffset + 4) {
        volume->CountCatalogRecord(GetBe16(stored), GetBe32(stored + idOffset), change);
    }
}

// Data as it is to be stored; `same` is what the record holds now.
int ScriptRunner::TakeData(CBTreeHfs* tree, std::string_view word, const SearchKey* key,
                           std::vector<u8>* stored) {
    RecordData data;
    if (ParseData(word, fileId_, &data)) {
        return kErrInvalid;
    }
    if (!data.isSame) {
        *stored = std::move(data.stored);
        return kOk;
    }
    const bool isThere =
        key != nullptr ? StoredAt(tree, *key, stored) : StoredHere(tree, tree->findData, stored);
    return isThere ? kOk : kErrNotFound;
}

void ScriptRunner::ExplainInsert(CBTreeHfs* tree, int status, u32 size) {
    if (status == kErrTooLarge) {
        Remark(fmt::format("key and data take {} bytes, a node holds {} (too-large)", Grouped(size),
                           Grouped(tree->header.nodeSize)));
    } else if (status == kErrNoSpace) {
        Remark(fmt::format("{}: the volume has no free blocks to grow the {}",
                           StatusWithCode(status), ForkName(fileId_)));
    }
}

ScriptRunner::Outcome ScriptRunner::InsertRecord(CBTreeHfs* tree, const SearchKey& key,
                                                 const std::vector<u8>& stored) {
    const u32 size = static_cast<u32>(stored.size());
    // The engine pads odd data; one byte more lets it read a whole word.
    std::vector<u8> host(stored.size() + 2);
    if (size != 0) {
        tree->convert.DataToMemory(host.data(), stored.data(), size);
    }
    Outcome outcome;
    outcome.status = tree->InsertRecord(key.Key(), key.id, host.data(), size);
    if (outcome.status != kOk) {
        ExplainInsert(tree, outcome.status, key.size + size);
        Settle(&outcome);
        return outcome;
    }
    if (fileId_ == kCatalogFileId) {
        CountRecord(volume_, stored.data(), size, 1);
    }
    // A split may have moved the record since the engine placed it, so look where it is.
    HfsFindData path;
    bool found = false;
    if (tree->FindEntry(key.Key(), key.id, &path, &found, nullptr, nullptr, nullptr, nullptr) ==
            kOk &&
        found) {
        outcome.fields = fmt::format(" at={}/{}", path.path[1].node->nodeNum, path.path[1].index);
    }
    path.ClearPath();
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Insert(const std::string_view* words) {
    CBTreeHfs* tree = Tree();
    SearchKey key;
    std::vector<u8> stored;
    int status = TakeKey(words[0], &key);
    if (status == kOk) {
        status = TakeData(tree, words[1], nullptr, &stored);
    }
    return status == kOk ? InsertRecord(tree, key, stored) : Outcome{status, {}};
}

ScriptRunner::Outcome ScriptRunner::Update(const std::string_view* words, u32 count) {
    CBTreeHfs* tree = Tree();
    if (count == 2) {
        SearchKey key;
        int status = TakeKey(words[0], &key);
        bool found = false;
        if (status == kOk) {
            status = tree->FindEntry(key.Key(), key.id, &tree->findData, &found, nullptr, nullptr,
                                     nullptr, nullptr);
        }
        if (status != kOk || !found) {
            return {status != kOk ? status : kErrNotFound, {}};
        }
    }
    std::vector<u8> present;
    std::vector<u8> stored;
    const bool isThere = StoredHere(tree, tree->findData, &present);
    const int status = TakeData(tree, words[count - 1], nullptr, &stored);
    if (status != kOk) {
        return {status, {}};
    }
    if (isThere && present.size() != stored.size()) {
        Remark(fmt::format("record holds {} bytes, {} given: use replace", present.size(),
                           stored.size()));
        return {kErrInvalid, fmt::format(" holds={} given={}", present.size(), stored.size())};
    }
    std::vector<u8> host(stored.size() + 2);
    if (!stored.empty()) {
        tree->convert.DataToMemory(host.data(), stored.data(), static_cast<u32>(stored.size()));
    }
    Outcome outcome;
    // Without a position the engine is asked all the same: it is its answer that counts. It reads
    // no more than the record has, which is then nothing.
    outcome.status = tree->UpdateKeyAndRecord(nullptr, host.data());
    Settle(&outcome);
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Delete(const std::string_view* words, u32 count) {
    CBTreeHfs* tree = Tree();
    SearchKey key;
    std::vector<u8> stored;
    bool isThere = false;
    if (count != 0) {
        const int status = TakeKey(words[0], &key);
        if (status != kOk) {
            return {status, {}};
        }
    }
    if (fileId_ == kCatalogFileId) {
        isThere =
            count != 0 ? StoredAt(tree, key, &stored) : StoredHere(tree, tree->findData, &stored);
    }
    Outcome outcome;
    outcome.status = count != 0 ? tree->DeleteRecord(key.Key(), key.id, false)
                                : tree->DeleteRecord(nullptr, 0, true);
    if (outcome.status == kOk && isThere) {
        CountRecord(volume_, stored.data(), static_cast<u32>(stored.size()), -1);
    }
    Settle(&outcome);
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Replace(const std::string_view* words) {
    CBTreeHfs* tree = Tree();
    SearchKey key;
    std::vector<u8> stored;
    int status = TakeKey(words[0], &key);
    if (status == kOk) {
        status = TakeData(tree, words[1], &key, &stored);
    }
    if (status != kOk) {
        return {status, {}};
    }
    const Outcome gone = Delete(words, 1);
    if (gone.status != kOk) {
        return gone;
    }
    Outcome outcome = InsertRecord(Tree(), key, stored);
    // The record that was there is gone: a refusal that leaves the tree sound is still half a
    // replacement.
    if (outcome.status == kErrTooLarge) {
        EndReservations();
        volume_->Restore();
        NoteRestored(&outcome);
    }
    return outcome;
}

}  // namespace VELK::tool
