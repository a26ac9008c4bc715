// Reading a pattern and filling it in.
#include "tool/item_format.h"

#include <fmt/format.h>

#include "hfs/records/text_format.h"
#include "tool/errors.h"

namespace VELK::tool {

const ItemFormat::FieldName ItemFormat::kFields[] = {
    {"path", Field::kPath},          {"name", Field::kName},         {"id", Field::kId},
    {"parent", Field::kParent},      {"type", Field::kType},         {"size", Field::kSize},
    {"rsize", Field::kResourceSize}, {"modified", Field::kModified}, {"created", Field::kCreated},
    {"mode", Field::kMode},          {"flags", Field::kFlags},       {"node", Field::kNode},
    {"record", Field::kRecord},
};

ItemFormat::Field ItemFormat::FieldOf(const std::string& command, const std::string& name) {
    std::vector<std::string> names;
    for (const FieldName& each : kFields) {
        if (name == each.name) {
            return each.field;
        }
        names.push_back(each.name);
    }
    ThrowUsage(command, "--format: no field is called '" + name + "'" + DidYouMean(name, names),
               fmt::format("{}", fmt::join(names, " ")));
}

ItemFormat::ItemFormat(const std::string& command, const std::string& pattern) {
    std::string literal;
    const auto endLiteral = [&] {
        if (!literal.empty()) {
            pieces_.push_back({Field::kLiteral, literal});
            literal.clear();
        }
    };
    for (std::size_t i = 0; i < pattern.size(); ++i) {
        const char next = i + 1 < pattern.size() ? pattern[i + 1] : '\0';
        if (pattern[i] == '\\' && next != '\0') {
            literal += next == 'n' ? '\n' : next == 't' ? '\t' : next == '0' ? '\0' : next;
            wantsRaw_ = wantsRaw_ || next == '0';
            ++i;
        } else if ((pattern[i] == '{' || pattern[i] == '}') && next == pattern[i]) {
            literal += pattern[i++];
        } else if (pattern[i] == '{') {
            const std::size_t end = pattern.find('}', i);
            if (end == std::string::npos) {
                ThrowUsage(command, "--format: '{' without '}'", "{{ stands for a brace");
            }
            endLiteral();
            pieces_.push_back({FieldOf(command, pattern.substr(i + 1, end - i - 1)), ""});
            i = end;
        } else {
            literal += pattern[i];
        }
    }
    endLiteral();
}

void ItemFormat::AppendField(Field field, const ListedItem& listed, const std::string& path,
                             std::string* out) {
    const CatalogItem& item = listed.item;
    switch (field) {
        case Field::kLiteral:
            break;
        case Field::kPath:
            *out += path;
            break;
        case Field::kName:
            *out += path.substr(path.rfind('/') + 1);
            break;
        case Field::kId:
            *out += std::to_string(item.Id());
            break;
        case Field::kParent:
            *out += std::to_string(listed.parent);
            break;
        case Field::kType:
            *out += ItemKindName(item.Kind());
            break;
        case Field::kSize:
            *out += std::to_string(item.Size());
            break;
        case Field::kResourceSize:
            *out += std::to_string(item.ResourceSize());
            break;
        case Field::kModified:
            *out += DateIso(item.ModifyDate());
            break;
        case Field::kCreated:
            *out += DateIso(item.CreateDate());
            break;
        case Field::kMode:
            *out += fmt::format("{:06o}", item.Mode());
            break;
        case Field::kFlags:
            *out += fmt::format("0x{:04x}", item.Flags());
            break;
        case Field::kNode:
            *out += std::to_string(listed.node);
            break;
        case Field::kRecord:
            *out += std::to_string(listed.index);
            break;
    }
}

void ItemFormat::Append(const ListedItem& listed, const std::string& path, std::string* out) const {
    for (const Piece& piece : pieces_) {
        *out += piece.text;
        AppendField(piece.field, listed, path, out);
    }
}

}  // namespace VELK::tool
