// Lines of a form the user chooses: --format '{id}\t{path}\n'.
#pragma once

#include <string>
#include <vector>

#include "tool/catalog_list.h"

namespace VELK::tool {

class ItemFormat {
public:
    // \n \t \0 \\ are what they are in C, {{ and }} are braces. Throws ToolError for a field nobody
    // knows; `command` is named in it.
    ItemFormat(const std::string& command, const std::string& pattern);

    // NUL in the pattern: names are given as they are, as with -0.
    bool WantsRawNames() const { return wantsRaw_; }
    // `path` is the item's whole path, in the form the list has.
    void Append(const ListedItem& listed, const std::string& path, std::string* out) const;

private:
    enum class Field {
        kLiteral,
        kPath,
        kName,
        kId,
        kParent,
        kType,
        kSize,
        kResourceSize,
        kModified,
        kCreated,
        kMode,
        kFlags,
        kNode,
        kRecord,
    };
    struct FieldName {
        const char* name;
        Field field;
    };
    struct Piece {
        Field field;
        std::string text;  // of a literal
    };
    static const FieldName kFields[];

    static Field FieldOf(const std::string& command, const std::string& name);
    static void AppendField(Field field, const ListedItem& listed, const std::string& path,
                            std::string* out);

    std::vector<Piece> pieces_;
    bool wantsRaw_ = false;
};

}  // namespace VELK::tool
