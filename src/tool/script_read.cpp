// Operations of scripts that look up records and move among them.
#include <fmt/format.h>

#include "hfs/treehfs/bytes.h"
#include "tool/record_digest.h"
#include "tool/script_run.h"
#include "tool/script_words.h"

namespace VELK::tool {
namespace {

constexpr u64 kNoPosition = ~u64{0};

std::string AtField(const HfsFindData& path) {
    const HfsFindLevel& leaf = path.path[1];
    return leaf.node == nullptr ? std::string(" at=none")
                                : fmt::format(" at={}/{}", leaf.node->nodeNum, leaf.index);
}

// A key above every key of any tree.
SearchKey GreatestKey(u32 fileId) {
    constexpr u32 kMost = 0xFFFFFFFF;
    constexpr NameView kName = u"\uffff\uffff";
    return fileId == kExtentsFileId      ? ExtentsSearchKey(kMost, kForkResource, kMost)
           : fileId == kAttributesFileId ? AttributesSearchKey(kMost, kName, kMost)
                                         : CatalogSearchKey(kMost, kName);
}

}  // namespace

// Moves `path` by `count` records and takes key and record there.
int ScriptRunner::Deliver(CBTreeHfs* tree, int count, HfsFindData* path) {
    unsigned recordSize = 0;
    unsigned keySize = 0;
    const int status = tree->IncPos(count, record_.data(), static_cast<unsigned>(record_.size()),
                                    &recordSize, key_, sizeof key_, &keySize, path);
    recordSize_ = recordSize;
    keySize_ = keySize;
    return status;
}

// " key=... size=... pos=... data=..." of the record just delivered.
void ScriptRunner::RecordFields(CBTreeHfs* tree, Outcome* outcome, bool withPosition) {
    const std::vector<u8> key = StoredFromDelivered(fileId_, key_, keySize_);
    outcome->fields += " key=" + KeyText(fileId_, key.data(), keySize_, Blanks::kEscaped);
    if (!withPosition) {
        return;
    }
    CatalogKey none{};
    CatalogKey copy{};
    outcome->fields +=
        fmt::format(" size={} pos={}", recordSize_, tree->GetPos(&tree->findData, &none, &copy));
    if (showData_) {
        std::vector<u8> stored(recordSize_);
        tree->convert.DataToDisk(stored.data(), record_.data(), recordSize_);
        outcome->fields +=
            " data=" + DataText(fileId_, stored.data(), recordSize_, Blanks::kEscaped);
    }
}

ScriptRunner::Outcome ScriptRunner::Find(const std::string_view* words) {
    CBTreeHfs* tree = Tree();
    SearchKey key;
    Outcome outcome;
    outcome.status = TakeKey(words[0], &key);
    if (outcome.status != kOk) {
        return outcome;
    }
    bool found = false;
    outcome.status = tree->FindEntry(key.Key(), key.id, &tree->findData, &found, nullptr, nullptr,
                                     nullptr, nullptr);
    if (outcome.status == kOk) {
        outcome.fields = found ? " found=yes" : " found=no";
        // An empty tree leaves the path as it was: there is no place to name.
        outcome.fields += tree->header.treeDepth == 0 ? " at=none" : AtField(tree->findData);
    }
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Get(const std::string_view* words) {
    CBTreeHfs* tree = Tree();
    SearchKey key;
    Outcome outcome;
    outcome.status = TakeKey(words[0], &key);
    if (outcome.status != kOk) {
        return outcome;
    }
    unsigned size = 0;
    outcome.status = tree->FindRecord(key.Key(), key.id, record_.data(),
                                      static_cast<unsigned>(record_.size()), &size, nullptr);
    if (outcome.status == kOk) {
        std::vector<u8> stored(size);
        tree->convert.DataToDisk(stored.data(), record_.data(), size);
        outcome.fields = fmt::format(" size={} data={}", size,
                                     DataText(fileId_, stored.data(), size, Blanks::kEscaped));
    }
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Seek(const std::string_view* words) {
    CBTreeHfs* tree = Tree();
    SearchKey key;
    Outcome outcome;
    const bool isLast = words[0] == "last";
    if (isLast) {
        key = GreatestKey(fileId_);
    } else if (words[0] == "first") {
        key = LowestKey(fileId_, 0);
    } else {
        outcome.status = TakeKey(words[0], &key);
    }
    bool found = false;
    if (outcome.status == kOk) {
        outcome.status = tree->FindEntry(key.Key(), key.id, &tree->findData, &found, nullptr,
                                         nullptr, nullptr, nullptr);
    }
    if (outcome.status == kOk) {
        // The greatest key leads behind the last record of the last leaf.
        outcome.status = Deliver(tree, isLast && !found ? -1 : 0, nullptr);
    }
    if (outcome.status == kOk) {
        RecordFields(tree, &outcome, false);
    }
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Step(s64 count) {
    CBTreeHfs* tree = Tree();
    Outcome outcome;
    outcome.status = Deliver(tree, static_cast<int>(count), nullptr);
    if (outcome.status == kOk) {
        RecordFields(tree, &outcome, true);
    }
    return outcome;
}

ScriptRunner::Outcome ScriptRunner::Position() {
    CBTreeHfs* tree = Tree();
    CatalogKey none{};
    CatalogKey copy{};
    const u64 position = tree->GetPos(&tree->findData, &none, &copy);
    return {kOk,
            position == kNoPosition ? std::string(" pos=none") : fmt::format(" pos={}", position)};
}

ScriptRunner::Outcome ScriptRunner::Goto(const std::string_view* words) {
    CBTreeHfs* tree = Tree();
    u64 number = 0;
    ParseNumber(words[0], kMostScriptNumber, &number);
    // The engine wants a path that was cleared and reset by its owner.
    tree->findData.ClearPath();
    tree->findData.level = 0;
    const unsigned long long position = number;
    unsigned recordSize = 0;
    unsigned keySize = 0;
    Outcome outcome;
    outcome.status = tree->SetPos(position, record_.data(), static_cast<unsigned>(record_.size()),
                                  &recordSize, key_, sizeof key_, &keySize, &tree->findData);
    recordSize_ = recordSize;
    keySize_ = keySize;
    if (outcome.status == kOk) {
        RecordFields(tree, &outcome, true);
    }
    return outcome;
}

// From the position, or from the first record when there is none, to the end or for N records.
ScriptRunner::Outcome ScriptRunner::Walk(const std::string_view* words, u32 count) {
    CBTreeHfs* tree = Tree();
    u64 most = ~u64{0};
    if (count != 0) {
        ParseNumber(words[0], kMostScriptNumber, &most);
    }
    HfsFindData& path = tree->findData;
    Outcome outcome;
    if (!path.valid || path.level != 1 || path.path[1].node == nullptr) {
        const SearchKey key = LowestKey(fileId_, 0);
        bool found = false;
        outcome.status =
            tree->FindEntry(key.Key(), key.id, &path, &found, nullptr, nullptr, nullptr, nullptr);
    }
    RecordDigest digest;
    std::vector<u8> before;
    // Keys that do not rise would let a ring of leaves go round for ever.
    while (outcome.status == kOk && digest.Records() < most) {
        outcome.status = Deliver(tree, digest.Records() == 0 ? 0 : 1, nullptr);
        if (outcome.status != kOk) {
            break;
        }
        const std::vector<u8> key = StoredFromDelivered(fileId_, key_, keySize_);
        SearchKey search;
        if (!before.empty() && SearchKeyFromStored(fileId_, key.data(), keySize_, &search) &&
            tree->compareKeys(search.Key(), search.id,
                              reinterpret_cast<const BTreeKey*>(before.data())) <= 0) {
            outcome.status = kErrCorrupt;
            break;
        }
        std::vector<u8> stored(recordSize_);
        tree->convert.DataToDisk(stored.data(), record_.data(), recordSize_);
        digest.Add(key.data(), keySize_, stored.data(), recordSize_);
        before = key;
    }
    if (outcome.status == kErrNotFound) {
        outcome.status = kOk;  // the end of the leaves ends the walk
    }
    outcome.fields = fmt::format(" count={} digest={}", digest.Records(), digest.Text());
    return outcome;
}

}  // namespace VELK::tool
