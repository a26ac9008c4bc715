// Completion: fixed words from tables, keys and paths from the tree itself.
#include "tool/shell_complete.h"

#include "hfs/records/key_layout.h"
#include "hfs/records/stored_records.h"
#include "hfs/volume/volume_header.h"
#include "tool/catalog_item.h"
#include "tool/script.h"
#include "tool/script_words.h"

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

// A key as a word without quotes where that can be typed, else in its full form.
std::string KeyWord(const std::string& text) {
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
std::vector<std::string> KeyCandidates(ImageVolume* volume, u32 fileId, std::string_view word) {
    std::vector<std::string> matches;
    const std::size_t colon = word.find(':');
    u64 id = 0;
    if (fileId == kExtentsFileId || colon == std::string_view::npos ||
        !ParseNumber(word.substr(0, colon), 0xFFFFFFFF, &id)) {
        return matches;
    }
    const bool isQuoted = word.size() > colon + 1 && word[colon + 1] == '"';
    RecordCursor cursor(volume, fileId);
    cursor.Seek(LowestKey(fileId, static_cast<u32>(id)));
    StoredRecord record;
    while (matches.size() < kMostCandidates && cursor.Next(&record) == kOk && record.id == id) {
        const std::string full = KeyText(fileId, record);
        const std::string text = isQuoted ? full : KeyWord(full);
        if (StartsWithFolding(text, word)) {
            matches.push_back(text);
        }
    }
    return matches;
}

// The folder a path names; 0 when it names none. Names are compared by the tree.
u32 FolderOf(ImageVolume* volume, std::string_view path) {
    u32 folder = kRootFolderId;
    for (std::size_t at = 1; at < path.size();) {
        const std::size_t end = std::min(path.find('/', at), path.size());
        NameUnits units;
        if (!VELK::UnitsFromUtf8(path.substr(at, end - at), &units)) {
            return 0;
        }
        units = DecomposedUnits(NameUnitsFromPosix(units));
        StoredRecord record;
        if (units.size() > kCatalogKeys.longestName ||
            FindStored(volume, kCatalogFileId, CatalogSearchKey(folder, units), &record) != kOk) {
            return 0;
        }
        const CatalogItem item(record.data.data(), static_cast<u32>(record.data.size()));
        if (!item.IsValid() || !item.IsFolder()) {
            return 0;
        }
        folder = item.Id();
        at = end + 1;
    }
    return folder;
}

std::vector<std::string> PathCandidates(ImageVolume* volume, std::string_view word) {
    std::vector<std::string> matches;
    const std::size_t slash = word.rfind('/');
    const u32 folder = FolderOf(volume, word.substr(0, slash));
    if (folder == 0) {
        return matches;
    }
    RecordCursor cursor(volume, kCatalogFileId);
    cursor.Seek(LowestKey(kCatalogFileId, folder));
    StoredRecord record;
    while (matches.size() < kMostCandidates && cursor.Next(&record) == kOk && record.id == folder) {
        const KeyView key(kCatalogFileId, record.key.data());
        const std::string name =
            Utf8FromUnits(PosixUnitsFromName(UnitsFromStored(key.Name(), key.NameLength())));
        const std::string path = std::string(word.substr(0, slash + 1)) + name;
        if (key.NameLength() != 0 && StartsWithFolding(path, word)) {
            matches.push_back(path);
        }
    }
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
        return Matching(StatusNames(), word);
    }
    if (op == "help") {
        return Matching(ScriptOpNames(), word);
    }
    if (word.starts_with("/")) {
        return PathCandidates(volume, word);
    }
    return KeyCandidates(volume, fileId, word);
}

}  // namespace VELK::tool
