// The merge of two trees.
#include "tool/tree_diff.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstring>
#include <memory>

#include "hfs/records/record_fields.h"
#include "hfs/records/record_view.h"
#include "hfs/records/text_format.h"
#include "tool/errors.h"

namespace VELK::tool {

namespace {

// One side of the merge: the record it stands on, with its key in the form keys are compared in.
class Side {
public:
    Side(Session* session, u32 fileId, bool keepGoing) : fileId_(fileId) {
        if (session->Volume().HasTree(fileId)) {
            tree_ = session->Tree(fileId);
            cursor_ = std::make_unique<LeafCursor>(session, fileId, keepGoing);
            cursor_->SeekFirst();
        }
        Step();
    }
    void Step() {
        hasRecord_ = cursor_ != nullptr && cursor_->Next(&record_) &&
                     SearchKeyFromStored(fileId_, record_.key, record_.keySize, &key_);
    }
    bool HasRecord() const { return hasRecord_; }
    const LeafRecord& Record() const { return record_; }
    const SearchKey& Key() const { return key_; }
    const CBTreeHfs* Tree() const { return tree_; }

private:
    u32 fileId_;
    CBTreeHfs* tree_ = nullptr;
    std::unique_ptr<LeafCursor> cursor_;
    LeafRecord record_;
    SearchKey key_;
    bool hasRecord_ = false;
};

int Order(const Side& a, const Side& b) {
    if (!a.HasRecord() || !b.HasRecord()) {
        return a.HasRecord() ? -1 : 1;
    }
    const auto* stored = reinterpret_cast<const BTreeKey*>(b.Record().key);
    return a.Tree()->compareKeys(a.Key().Key(), a.Key().id, stored);
}

bool SameBytes(const u8* a, u32 aSize, const u8* b, u32 bSize) {
    return aSize == bSize && std::memcmp(a, b, aSize) == 0;
}

bool IsIgnored(const std::vector<std::string>& ignored, const char* field) {
    return std::find(ignored.begin(), ignored.end(), field) != ignored.end();
}

std::string FieldText(const u8* record, const Field& field) {
    if (field.kind == FieldKind::kExtents) {
        std::string text;
        const u8* extents = record + field.offset;
        for (u32 i = 0; i < UsedExtents(extents); ++i) {
            text += fmt::format("{}[{},{}]", text.empty() ? "" : " ", GetBe32(extents + 8 * i),
                                GetBe32(extents + 8 * i + 4));
        }
        return text.empty() ? "none" : text;
    }
    const u64 value = GetField(record, field);
    switch (field.kind) {
        case FieldKind::kDate:
            return DateText(static_cast<u32>(value));
        case FieldKind::kHex:
        case FieldKind::kCode:
            return fmt::format("0x{:x}", value);
        case FieldKind::kOctal:
            return fmt::format("{:06o}", value);
        default:
            return std::to_string(value);
    }
}

u32 WidthOf(const Field& field) {
    return field.kind == FieldKind::kExtents ? kExtentRecordSize : field.width;
}

}  // namespace

bool IsFieldOfTree(u32 fileId, const std::string& name) {
    for (u32 i = 0; i < kRecordKindCount; ++i) {
        if (kRecordKinds[i].fileId == fileId && FieldByName(kRecordKinds[i], name) != nullptr) {
            return true;
        }
    }
    return false;
}

std::vector<FieldChange> FieldChanges(u32 fileId, const LeafRecord& before, const LeafRecord& after,
                                      const std::vector<std::string>& ignored) {
    std::vector<FieldChange> changes;
    const RecordKind* kind = KindOfRecord(fileId, before.data, before.dataSize);
    if (kind != KindOfRecord(fileId, after.data, after.dataSize)) {
        return {{"type", RecordTypeName(fileId, before.data, before.dataSize),
                 RecordTypeName(fileId, after.data, after.dataSize)}};
    }
    // What no field speaks for is compared as bytes at the end.
    std::vector<u8> a(before.data, before.data + before.dataSize);
    std::vector<u8> b(after.data, after.data + after.dataSize);
    for (u32 i = 0; kind != nullptr && i < kind->fieldCount; ++i) {
        const Field& field = kind->fields[i];
        const u32 width = WidthOf(field);
        if (!SameBytes(a.data() + field.offset, width, b.data() + field.offset, width) &&
            !IsIgnored(ignored, field.name)) {
            changes.push_back(
                {field.name, FieldText(before.data, field), FieldText(after.data, field)});
        }
        std::fill_n(a.begin() + field.offset, width, u8{0});
        std::fill_n(b.begin() + field.offset, width, u8{0});
    }
    if (a != b) {
        changes.push_back({"data", fmt::format("{} B", a.size()), fmt::format("{} B", b.size())});
    }
    return changes;
}

DiffCounts DiffTrees(Session* before, Session* after, u32 fileId, bool keepGoing,
                     const std::vector<std::string>& ignored, Progress* progress,
                     const DiffVisit& visit) {
    Side a(before, fileId, keepGoing);
    Side b(after, fileId, keepGoing);
    if (a.Tree() != nullptr && b.Tree() != nullptr &&
        a.Tree()->compareKeys != b.Tree()->compareKeys) {
        ThrowFailed("",
                    fmt::format("{} tree: one volume distinguishes case in names, the other does "
                                "not, so their records stand in different orders",
                                ForkName(fileId)),
                    "compare what export writes of each, sorted");
    }
    DiffCounts counts;
    u64 done = 0;
    while (a.HasRecord() || b.HasRecord()) {
        progress->Update(++done);
        const int order = Order(a, b);
        if (order < 0) {
            counts.removed += 1;
            visit(&a.Record(), nullptr);
        } else if (order > 0) {
            counts.added += 1;
            visit(nullptr, &b.Record());
        } else {
            const LeafRecord& left = a.Record();
            const LeafRecord& right = b.Record();
            // Keys that compare equal may be spelt differently: that is a change, too.
            const bool isEqual = SameBytes(left.key, left.keySize, right.key, right.keySize) &&
                                 (SameBytes(left.data, left.dataSize, right.data, right.dataSize) ||
                                  FieldChanges(fileId, left, right, ignored).empty());
            counts.equal += isEqual ? 1 : 0;
            counts.changed += isEqual ? 0 : 1;
            if (!isEqual) {
                visit(&left, &right);
            }
        }
        if (order <= 0) {
            a.Step();
        }
        if (order >= 0) {
            b.Step();
        }
    }
    return counts;
}

}  // namespace VELK::tool
