// Operations of scripts that change records.
#include <fmt/format.h>

#include "hfs/records/stored_records.h"
#include "hfs/records/text_format.h"
#include "tool/script_run.h"

namespace VELK::tool {
namespace {

// Data of the record the tree's own path stands on; false when it stands on none.
bool StoredHere(const CBTreeHfs* tree, std::vector<u8>* stored) {
    StoredRecord record;
    const bool isThere = tree->findData.valid && ReadStored(*tree, tree->findData, &record) == kOk;
    if (isThere) {
        *stored = std::move(record.data);
    }
    return isThere;
}

// The same of the record with this key; the tree goes on standing where it stands.
bool StoredAt(ImageVolume* volume, u32 fileId, const SearchKey& key, std::vector<u8>* stored) {
    StoredRecord record;
    const bool isThere = FindStored(volume, fileId, key, &record) == kOk;
    if (isThere) {
        *stored = std::move(record.data);
    }
    return isThere;
}

}  // namespace

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
        key != nullptr ? StoredAt(volume_, fileId_, *key, stored) : StoredHere(tree, stored);
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
    Outcome outcome;
    outcome.status = tree->InsertRecord(key.Key(), key.id, HostData(*tree, stored).data(), size);
    if (outcome.status != kOk) {
        ExplainInsert(tree, outcome.status, key.size + size);
        Settle(&outcome);
        return outcome;
    }
    CountStored(volume_, fileId_, stored, 1);
    // A split may have moved the record since the engine placed it, so look where it is.
    StoredRecord placed;
    if (FindStored(volume_, fileId_, key, &placed) == kOk) {
        outcome.fields = fmt::format(" at={}/{}", placed.node, placed.index);
    }
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
    const bool isThere = StoredHere(tree, &present);
    const int status = TakeData(tree, words[count - 1], nullptr, &stored);
    if (status != kOk) {
        return {status, {}};
    }
    if (isThere && present.size() != stored.size()) {
        Remark(fmt::format("record holds {} bytes, {} given: use replace", present.size(),
                           stored.size()));
        return {kErrInvalid, fmt::format(" holds={} given={}", present.size(), stored.size())};
    }
    Outcome outcome;
    // Without a position the engine is asked all the same: it is its answer that counts. It reads
    // no more than the record has, which is then nothing.
    outcome.status = tree->UpdateKeyAndRecord(nullptr, HostData(*tree, stored).data());
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
        isThere = count != 0 ? StoredAt(volume_, fileId_, key, &stored) : StoredHere(tree, &stored);
    }
    Outcome outcome;
    outcome.status = count != 0 ? tree->DeleteRecord(key.Key(), key.id, false)
                                : tree->DeleteRecord(nullptr, 0, true);
    if (outcome.status == kOk && isThere) {
        CountStored(volume_, fileId_, stored, -1);
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
