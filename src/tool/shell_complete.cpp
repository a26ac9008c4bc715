// Completion: fixed words from tables, keys and paths from the tree itself.
#include "tool/shell_complete.h"

#include "hfs/records/key_text.h"
#include "hfs/records/record_fields.h"
#include "hfs/treehfs/bytes.h"
#include "tool/script.h"

namespace VELK::tool {
namespace {

constexpr std::size_t kMostCandidates = 100;

std::vector<std::string> Matching(const std::vector<std::string>& words, std::string_view word) {
    std::vector<std::string> matches;
    for (const std::string& candidate : words) {
        if (candidate.starts_with(word)) {
            matches.push_back(candidate);
        }
    }
    return matches;
}

bool StartsWithFolding(std::string_view text, std::string_view start) {
    if (text.size() < start.size()) {
        return false;
    }
    const auto lower = [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c; };
    for (std::size_t i = 0; i < start.size(); ++i) {
        if (lower(text[i]) != lower(start[i])) {
            return false;
        }
    }
    return true;
}

struct StoredRecord {
    std::vector<u8> key;
    std::vector<u8> data;  // as stored
};

// Calls `take` for the records from `key` on until it returns false.
template <typename Take>
void ForRecordsFrom(CBTreeHfs* tree, u32 fileId, const SearchKey& key, Take take) {
    HfsFindData path;
    bool found = false;
    int status =
        tree->FindEntry(key.Key(), key.id, &path, &found, nullptr, nullptr, nullptr, nullptr);
    std::vector<u8> record(65536);
    alignas(8) u8 bytes[kKeyLengthSize + kMaxKeyLength + 6] = {};
    for (int step = 0; status == kOk; step = 1) {
        unsigned recordSize = 0;
        unsigned keySize = 0;
        status = tree->IncPos(step, record.data(), static_cast<unsigned>(record.size()),
                              &recordSize, bytes, sizeof bytes, &keySize, &path);
        if (status != kOk) {
            break;
        }
        StoredRecord stored{StoredFromDelivered(fileId, bytes, keySize),
                            std::vector<u8>(recordSize)};
        tree->convert.DataToDisk(stored.data.data(), record.data(), recordSize);
        if (!take(stored)) {
            break;
        }
    }
    path.ClearPath();
}

// A key as a word without quotes where that can be typed, else in its full form.
std::string KeyWord(u32 fileId, const std::vector<u8>& key) {
    const std::string text =
        KeyText(fileId, key.data(), static_cast<u32>(key.size()), Blanks::kPlain);
    const std::size_t quote = text.find('"');
    const std::size_t end = text.rfind('"');
    if (quote == std::string::npos || end <= quote + 1) {
        return text;
    }
    const std::string name = text.substr(quote + 1, end - quote - 1);
    const bool isWord = name.find_first_of(" \t\"\\:#{}[]$") == std::string::npos;
    return isWord ? text.substr(0, quote) + name + text.substr(end + 1) : text;
}

// Keys PARENT:NAME or FILE:NAME whose name begins as typed.
std::vector<std::string> KeyCandidates(CBTreeHfs* tree, u32 fileId, std::string_view word) {
    std::vector<std::string> matches;
    const std::size_t colon = word.find(':');
    u64 id = 0;
    if (fileId == kExtentsFileId || colon == std::string_view::npos ||
        !ParseNumber(word.substr(0, colon), 0xFFFFFFFF, &id)) {
        return matches;
    }
    const bool isQuoted = word.size() > colon + 1 && word[colon + 1] == '"';
    SearchKey key;
    if (ParseKey(std::to_string(id) + ":\"\"", fileId, &key)) {
        return matches;
    }
    ForRecordsFrom(tree, fileId, key, [&](const StoredRecord& record) {
        SearchKey here;
        if (!SearchKeyFromStored(fileId, record.key.data(), static_cast<u32>(record.key.size()),
                                 &here) ||
            here.id != id) {
            return false;
        }
        const std::string text = isQuoted
                                     ? KeyText(fileId, record.key.data(),
                                               static_cast<u32>(record.key.size()), Blanks::kPlain)
                                     : KeyWord(fileId, record.key);
        if (StartsWithFolding(text, word)) {
            matches.push_back(text);
        }
        return matches.size() < kMostCandidates;
    });
    return matches;
}

// The folder a path names; 0 when it names none. Names are compared by the tree.
u32 FolderOf(CBTreeHfs* catalog, std::string_view path) {
    u32 folder = 2;
    for (std::size_t at = 1; at < path.size();) {
        const std::size_t end = std::min(path.find('/', at), path.size());
        NameUnits units;
        if (!VELK::UnitsFromUtf8(path.substr(at, end - at), &units)) {
            return 0;
        }
        const std::string text = std::to_string(folder) + ":" +
                                 QuotedUnits(DecomposedUnits(NameUnitsFromPosix(units)),
                                             Typed::kDecomposed, Blanks::kPlain);
        SearchKey key;
        u32 next = 0;
        if (!ParseKey(text, kCatalogFileId, &key)) {
            ForRecordsFrom(catalog, kCatalogFileId, key, [&](const StoredRecord& record) {
                const bool isThere =
                    catalog->compareKeys(key.Key(), key.id,
                                         reinterpret_cast<const BTreeKey*>(record.key.data())) == 0;
                if (isThere && record.data.size() >= kFolderSize &&
                    GetBe16(record.data.data()) == kFolderRecord) {
                    next = GetBe32(record.data.data() + 8);
                }
                return false;
            });
        }
        if (next == 0) {
            return 0;
        }
        folder = next;
        at = end + 1;
    }
    return folder;
}

std::vector<std::string> PathCandidates(CBTreeHfs* catalog, std::string_view word) {
    std::vector<std::string> matches;
    const std::size_t slash = word.rfind('/');
    const u32 folder = FolderOf(catalog, word.substr(0, slash));
    SearchKey key;
    if (folder == 0 || ParseKey(std::to_string(folder) + ":\"\"", kCatalogFileId, &key)) {
        return matches;
    }
    ForRecordsFrom(catalog, kCatalogFileId, key, [&](const StoredRecord& record) {
        if (record.key.size() < kCatKeyName ||
            GetBe32(record.key.data() + kCatKeyParentId) != folder) {
            return false;
        }
        const u32 units = static_cast<u32>(record.key.size() - kCatKeyName) / 2;
        const std::string name = Utf8FromUnits(
            PosixUnitsFromName(UnitsFromStored(record.key.data() + kCatKeyName, units)));
        const std::string path = std::string(word.substr(0, slash + 1)) + name;
        if (units != 0 && StartsWithFolding(path, word)) {
            matches.push_back(path);
        }
        return matches.size() < kMostCandidates;
    });
    return matches;
}

}  // namespace

const std::vector<std::string>& ShellCommandNames() {
    static const std::vector<std::string> names = {"info", "check", "ls",   "find",  "dump",
                                                   "node", "stats", "plot", "export"};
    return names;
}

std::vector<std::string> ShellCandidates(ImageVolume* volume, u32 fileId, std::string_view before,
                                         std::string_view word) {
    const std::size_t first = before.find_first_not_of(" \t");
    if (first == std::string_view::npos) {
        std::vector<std::string> words = ScriptOpNames();
        words.insert(words.end(), {"info", "ls", "dump", "plot", "export", "help", "exit"});
        return Matching(words, word);
    }
    const std::string_view op = before.substr(first, before.find_first_of(" \t", first) - first);
    if (op == "use") {
        return Matching({"catalog", "extents", "attributes"}, word);
    }
    if (op == "expect") {
        return Matching({"ok", "invalid", "bad-record", "no-memory", "not-found", "exists",
                         "too-large", "corrupt", "no-space"},
                        word);
    }
    if (op == "help") {
        return Matching(ScriptOpNames(), word);
    }
    if (word.starts_with("/")) {
        CBTreeHfs* catalog = volume->Tree(kCatalogFileId, nullptr);
        return catalog == nullptr ? std::vector<std::string>() : PathCandidates(catalog, word);
    }
    CBTreeHfs* tree = volume->Tree(fileId, nullptr);
    return tree == nullptr ? std::vector<std::string>() : KeyCandidates(tree, fileId, word);
}

}  // namespace VELK::tool
