// Keys in arguments.
#include "tool/key_argument.h"

#include "tool/catalog_paths.h"
#include "tool/errors.h"

namespace VELK::tool {

namespace {

// Position of the two dots between two keys; dots inside quotes belong to a name.
std::size_t FindDots(const std::string& text) {
    bool quoted = false;
    for (std::size_t i = 0; i + 1 < text.size(); ++i) {
        if (text[i] == '\\' && quoted) {
            i += 1;
        } else if (text[i] == '"') {
            quoted = !quoted;
        } else if (!quoted && text[i] == '.' && text[i + 1] == '.') {
            return i;
        }
    }
    return std::string::npos;
}

const BTreeKey* StoredKeyOf(const u8* stored) {
    return reinterpret_cast<const BTreeKey*>(stored);
}

// False also when the tree cannot be opened: whoever walks it says so.
bool IsReversed(Session* session, u32 fileId, const KeyRange& range) {
    Problem problem;
    const CBTreeHfs* tree = session->TryTree(fileId, &problem);
    if (tree == nullptr || !range.from || !range.to) {
        return false;
    }
    const std::vector<u8> to = StoredKey(fileId, *range.to);
    return tree->compareKeys(range.from->Key(), range.from->id, StoredKeyOf(to.data())) > 0;
}

}  // namespace

SearchKey KeyArgument(Session* session, u32 fileId, const std::string& text) {
    u32 id = 0;
    if (ParseIdKey(text, &id)) {
        if (fileId != kCatalogFileId) {
            ThrowArgument("", "key '" + text + "': only the catalog has IDs", "leave out --tree");
        }
        FoundItem item;
        if (!FindItemById(session, id, &item)) {
            ThrowNo(session->Image(), "no file or folder has ID " + std::to_string(id), "");
        }
        return CatalogSearchKey(item.parent, UnitsFromStored(item.name.data(), item.NameLength()));
    }
    SearchKey key;
    const Problem problem = ParseKey(text, fileId, &key);
    if (problem) {
        ThrowProblem("", problem);
    }
    return key;
}

KeyRange RangeArgument(Session* session, u32 fileId, const std::string& text) {
    KeyRange range;
    if (text.empty()) {
        return range;
    }
    const std::size_t dots = FindDots(text);
    if (dots == std::string::npos) {
        ThrowArgument("", "range '" + text + "': expected FROM..TO",
                      "for example '2:a..2:b', '2:a..' or '..2:b'");
    }
    if (dots != 0) {
        range.from = KeyArgument(session, fileId, text.substr(0, dots));
    }
    if (dots + 2 < text.size()) {
        range.to = KeyArgument(session, fileId, text.substr(dots + 2));
    }
    if (IsReversed(session, fileId, range)) {
        ThrowArgument("", "range '" + text + "': the first key sorts behind the second",
                      "exchange them");
    }
    return range;
}

int KeyRange::Place(const CBTreeHfs& tree, const u8* stored) const {
    if (from && tree.compareKeys(from->Key(), from->id, StoredKeyOf(stored)) > 0) {
        return -1;
    }
    if (to && tree.compareKeys(to->Key(), to->id, StoredKeyOf(stored)) < 0) {
        return 1;
    }
    return 0;
}

}  // namespace VELK::tool
