// Conditions of --where.
#include "tool/record_filter.h"

#include <algorithm>

#include "hfs/records/key_layout.h"
#include "hfs/records/record_view.h"
#include "hfs/records/search_key.h"
#include "hfs/records/text_format.h"
#include "tool/errors.h"
#include "tool/options.h"

namespace VELK::tool {

namespace {

constexpr char kExample[] = "write it like size>=64K, type=folder or name=*.txt";

// Fields that every record of a tree has through its place and its key; the others are those of
// the tables in record_fields.
std::vector<std::string> CommonFields(u32 fileId) {
    switch (fileId) {
        case kCatalogFileId:
            return {"type", "node", "record", "bytes", "parent", "name"};
        case kExtentsFileId:
            return {"type", "node", "record", "bytes", "file", "fork", "block"};
        default:
            return {"type", "node", "record", "bytes", "file", "name", "block"};
    }
}

bool IsComparable(const Field& field) {
    return field.kind != FieldKind::kExtents;
}

std::vector<std::string> FieldNames(u32 fileId) {
    std::vector<std::string> names = CommonFields(fileId);
    for (u32 i = 0; i < kRecordKindCount; ++i) {
        const RecordKind& kind = kRecordKinds[i];
        for (u32 j = 0; kind.fileId == fileId && j < kind.fieldCount; ++j) {
            const std::string name = kind.fields[j].name;
            if (IsComparable(kind.fields[j]) &&
                std::find(names.begin(), names.end(), name) == names.end()) {
                names.push_back(name);
            }
        }
    }
    return names;
}

bool IsWord(const std::string& field) {
    return field == "type" || field == "fork";
}

// 1107, 0x1f, 64K; a date; four characters of a type or creator.
bool ParseValue(const std::string& text, u64* value) {
    u32 date = 0;
    if (ParseSize(text, value)) {
        return true;
    }
    if (text.size() > 4 && ParseDate(text, &date)) {
        *value = date;
        return true;
    }
    if (text.size() != 4) {
        return false;
    }
    *value = GetBe32(reinterpret_cast<const u8*>(text.data()));
    return true;
}

[[noreturn]] void ThrowCondition(const std::string& text, const std::string& what,
                                 const std::string& advice) {
    ThrowArgument("", "condition '" + text + "'" + what, advice);
}

}  // namespace

u32 RecordFilter::TakeTree(std::vector<std::string>* conditions) {
    u32 fileId = 0;
    for (auto each = conditions->begin(); each != conditions->end();) {
        if (!each->starts_with("tree=")) {
            ++each;
            continue;
        }
        const u32 named = TreeIdFromText(each->substr(5));
        if (named == 0 || (fileId != 0 && named != fileId)) {
            ThrowCondition(*each, named == 0 ? ": no such tree" : ": another tree is named, too",
                           "catalog, extents or attributes");
        }
        fileId = named;
        each = conditions->erase(each);
    }
    return fileId;
}

RecordFilter::RecordFilter(u32 fileId, const std::vector<std::string>& conditions)
    : fileId_(fileId) {
    for (const std::string& text : conditions) {
        conditions_.push_back(Read(text));
    }
}

RecordFilter::Condition RecordFilter::Read(const std::string& text) const {
    const std::size_t at = text.find_first_of("=!<>");
    if (at == 0 || at == std::string::npos) {
        ThrowCondition(text, ": expected FIELD=VALUE", kExample);
    }
    const bool isLong = at + 1 < text.size() && text[at + 1] == '=' && text[at] != '=';
    const std::string sign = text.substr(at, isLong ? 2 : 1);
    Condition condition;
    condition.field = text.substr(0, at);
    condition.text = text.substr(at + sign.size());
    const std::vector<std::string> names = FieldNames(fileId_);
    if (std::find(names.begin(), names.end(), condition.field) == names.end()) {
        ThrowCondition(text,
                       ": no record of the " + std::string(ForkName(fileId_)) + " tree has a '" +
                           condition.field + "'" + DidYouMean(condition.field, names),
                       "dump --values full shows the fields");
    }
    if (sign == "!") {
        ThrowCondition(text, ": expected one of = != < <= > >=", kExample);
    }
    condition.comparison = sign == "="    ? Comparison::kEqual
                           : sign == "!=" ? Comparison::kUnequal
                           : sign == "<"  ? Comparison::kBelow
                           : sign == "<=" ? Comparison::kAtMost
                           : sign == ">"  ? Comparison::kAbove
                                          : Comparison::kAtLeast;
    const bool isText = IsWord(condition.field) || condition.field == "name";
    if (isText && condition.comparison > Comparison::kUnequal) {
        ThrowCondition(text, ": texts are compared with = or != only", kExample);
    }
    if (condition.field == "name") {
        condition.globs.emplace_back(condition.text, false);
    } else if (!isText && !ParseValue(condition.text, &condition.number)) {
        ThrowCondition(text, ": '" + condition.text + "' is no number, size or date", kExample);
    }
    return condition;
}

bool RecordFilter::NumberOf(const Condition& condition, const NodeRecord& record, bool isLeaf,
                            u64* value) const {
    const std::string& field = condition.field;
    if (field == "node" || field == "record" || field == "bytes") {
        *value = field == "node" ? record.node : field == "record" ? record.index : record.dataSize;
        return true;
    }
    SearchKey key;
    const bool hasKey = SearchKeyFromStored(fileId_, record.key, record.keySize, &key);
    if (hasKey && fileId_ == kCatalogFileId && field == "parent") {
        *value = key.id;
        return true;
    }
    if (hasKey && fileId_ != kCatalogFileId && (field == "file" || field == "block")) {
        *value = field == "file" ? key.id : KeyView(fileId_, record.key).StartBlock();
        return true;
    }
    const RecordKind* kind = isLeaf ? KindOfRecord(fileId_, record.data, record.dataSize) : nullptr;
    const Field* found = kind == nullptr ? nullptr : FieldByName(*kind, field);
    if (found != nullptr) {
        *value = GetField(record.data, *found);
    }
    return found != nullptr;
}

bool RecordFilter::Holds(const Condition& condition, const NodeRecord& record, bool isLeaf) const {
    const bool wantsEqual = condition.comparison == Comparison::kEqual;
    if (condition.field == "type") {
        const char* type = isLeaf ? RecordTypeName(fileId_, record.data, record.dataSize) : "index";
        return (condition.text == type) == wantsEqual;
    }
    SearchKey key;
    if (condition.field == "fork" || condition.field == "name") {
        if (!SearchKeyFromStored(fileId_, record.key, record.keySize, &key)) {
            return false;
        }
        if (condition.field == "fork") {
            const bool isData = record.key[kExtKeyForkType] == kForkData;
            return (condition.text == (isData ? "data" : "rsrc")) == wantsEqual;
        }
        const KeyView view(fileId_, record.key);
        return condition.globs[0].Matches(view.Name(), view.NameLength()) == wantsEqual;
    }
    u64 value = 0;
    if (!NumberOf(condition, record, isLeaf, &value)) {
        return false;
    }
    switch (condition.comparison) {
        case Comparison::kEqual:
            return value == condition.number;
        case Comparison::kUnequal:
            return value != condition.number;
        case Comparison::kBelow:
            return value < condition.number;
        case Comparison::kAtMost:
            return value <= condition.number;
        case Comparison::kAbove:
            return value > condition.number;
        case Comparison::kAtLeast:
            return value >= condition.number;
    }
    return false;
}

bool RecordFilter::Holds(const NodeRecord& record, bool isLeaf) const {
    for (const Condition& condition : conditions_) {
        if (!Holds(condition, record, isLeaf)) {
            return false;
        }
    }
    return true;
}

}  // namespace VELK::tool
