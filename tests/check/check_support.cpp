// See check_support.h.
#include "check_support.h"

#include <algorithm>
#include <cstring>

#include "hfs/format.h"
#include "keys.h"

namespace VELK::test {

namespace {

CheckSink SinkInto(Outcome* outcome) {
    CheckSink sink;
    sink.self = outcome;
    sink.finding = [](void* self, const CheckFinding& finding) {
        static_cast<Outcome*>(self)->findings.push_back(finding);
    };
    sink.unreadable = [](void* self, const CheckUnreadable& unreadable) {
        static_cast<Outcome*>(self)->unreadable.push_back(unreadable);
    };
    return sink;
}

std::u16string FileName(u32 number) {
    std::u16string name = u"file_0000";
    for (std::size_t i = 8; number != 0; --i, number /= 10) {
        name[i] = static_cast<char16_t>(u'0' + number % 10);
    }
    return name;
}

}  // namespace

std::string Outcome::Ids(bool withInfos) const {
    std::vector<u32> seen;
    for (const CheckFinding& finding : findings) {
        if (withInfos || finding.severity != CheckSeverity::kInfo) {
            seen.push_back(static_cast<u32>(finding.id));
        }
    }
    std::sort(seen.begin(), seen.end());
    seen.erase(std::unique(seen.begin(), seen.end()), seen.end());
    std::string ids;
    for (u32 id : seen) {
        ids += (ids.empty() ? "" : " ") + std::string(CheckIdTable()[id].name);
    }
    return ids;
}

std::string Outcome::Lines() const {
    std::string lines;
    for (const CheckFinding& finding : findings) {
        lines += CheckFindingLine(finding) + "\n";
    }
    return lines;
}

CheckFinding Outcome::First(CheckId id) const {
    for (const CheckFinding& finding : findings) {
        if (finding.id == id) {
            return finding;
        }
    }
    return {};
}

Outcome CheckSourceBytes(const CheckSource& source, const CheckOptions& options) {
    Outcome outcome;
    outcome.summary = CheckVolume(source, options, SinkInto(&outcome));
    return outcome;
}

Outcome CheckBytes(const Bytes& volume, const CheckOptions& options) {
    CheckSource source = {};
    source.self = const_cast<Bytes*>(&volume);
    source.size = volume.size();
    source.read = [](void* self, u64 offset, void* target, std::size_t size) {
        std::memcpy(target, static_cast<const Bytes*>(self)->data() + offset, size);
        return 0;
    };
    return CheckSourceBytes(source, options);
}

Outcome CheckImage(const TreeImage& tree, const CheckOptions& options) {
    Outcome outcome;
    CheckTreeKind kind;
    kind.fileId = tree.shape.fileId;
    outcome.summary =
        CheckTreeBytes(tree.bytes.data(), tree.bytes.size(), kind, options, SinkInto(&outcome));
    return outcome;
}

CheckOptions Quick() {
    CheckOptions options;
    options.quick = true;
    return options;
}

CheckOptions Full() {
    CheckOptions options;
    options.full = true;
    return options;
}

Bytes FolderData(u32 id, u32 valence) {
    Bytes data(88);
    Put16(&data, 0, 1);
    Put32(&data, 4, valence);
    Put32(&data, 8, id);
    return data;
}

Bytes ThreadData(bool isFolder, u32 parent, std::u16string_view name) {
    Bytes data(10);
    Put16(&data, 0, isFolder ? 3 : 4);
    Put32(&data, 4, parent);
    Put16(&data, 8, static_cast<u32>(name.size()));
    for (char16_t unit : name) {
        Append16(&data, unit);
    }
    return data;
}

Bytes ExtentData(const Runs& runs) {
    Bytes data(64);
    for (std::size_t i = 0; i < runs.size(); ++i) {
        Put32(&data, 8 * i, runs[i].first);
        Put32(&data, 8 * i + 4, runs[i].second);
    }
    return data;
}

Bytes ForkData(const Runs& runs, u32 blockSize) {
    Bytes data(16);
    u32 blocks = 0;
    for (const auto& run : runs) {
        blocks += run.second;
    }
    Put32(&data, 4, blocks * blockSize);
    Put32(&data, 12, blocks);
    const std::size_t inlineRuns = std::min<std::size_t>(runs.size(), 8);
    AppendBytes(&data,
                ExtentData(Runs(runs.begin(), runs.begin() + static_cast<long>(inlineRuns))));
    return data;
}

Bytes FileData(u32 id, const Bytes& dataFork, const Bytes& rsrcFork) {
    Bytes data(88);
    Put16(&data, 0, 2);
    Put16(&data, 2, 2);
    Put32(&data, 8, id);
    AppendBytes(&data, dataFork);
    AppendBytes(&data, rsrcFork);
    return data;
}

Bytes InlineAttribute(u32 size) {
    Bytes data(16 + size + size % 2);
    Put32(&data, 0, 0x10);
    Put32(&data, 12, size);
    return data;
}

std::vector<TreeRecord> CatalogOf(u32 files) {
    std::vector<TreeRecord> records;
    records.push_back({DiskCatKey(1, u"root"), FolderData(2, files)});
    records.push_back({DiskCatKey(2, u""), ThreadData(true, 1, u"root")});
    const Bytes empty(80);
    for (u32 i = 0; i < files; ++i) {
        records.push_back({DiskCatKey(2, FileName(i)), FileData(16 + i, empty, empty)});
    }
    for (u32 i = 0; i < files; ++i) {
        records.push_back({DiskCatKey(16 + i, u""), ThreadData(false, 2, FileName(i))});
    }
    return records;
}

TreeImage CatalogTree(u32 files) {
    TreeShape shape;
    shape.nodeSize = 512;
    shape.keyCompareType = kKeyCompareFolding;
    return BuildTree(shape, CatalogOf(files));
}

TreeImage ExtentsTree(u32 records) {
    TreeShape shape;
    shape.fileId = kExtentsFileId;
    std::vector<TreeRecord> list;
    for (u32 i = 0; i < records; ++i) {
        list.push_back({DiskExtKey(kForkData, 20 + i, 8), ExtentData({{100 + i, 1}})});
    }
    return BuildTree(shape, list);
}

TreeImage AttributesTree(u32 records) {
    TreeShape shape;
    shape.fileId = kAttributesFileId;
    shape.nodeSize = 1024;
    std::vector<TreeRecord> list;
    for (u32 i = 0; i < records; ++i) {
        list.push_back({DiskAttrKey(16 + i, 0, u"tag"), InlineAttribute(21)});
    }
    return BuildTree(shape, list);
}

}  // namespace VELK::test
