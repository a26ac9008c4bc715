// Figures of one tree.
#include "tool/tree_stats.h"

#include <fmt/format.h>

#include <algorithm>

#include "hfs/records/record_view.h"
#include "hfs/records/text_format.h"
#include "tool/errors.h"

namespace VELK::tool {

namespace {

void CountRecords(u32 fileId, const HeldNode& node, RecordReader* reader,
                  std::map<std::string, u64>* kinds) {
    NodeRecord record;
    for (u32 i = 0; i < node.RecordCount(); ++i) {
        if (reader->Describe(node.Get(), i, &record) == 0) {
            (*kinds)[RecordTypeName(fileId, record.data, record.dataSize)] += 1;
        }
    }
}

std::string Percent(double part) {
    return fmt::format("{:.1f}%", part * 100.0);
}

std::string Sentence(const TreeStats& stats) {
    u64 leaves = 0;
    u64 index = 0;
    for (const LevelStats& level : stats.levels) {
        (level.level == 1 ? leaves : index) += level.nodes;
    }
    return fmt::format("{}  {} of {} B: 1 header, {} map, {} index, {} leaf, {} free\n",
                       ForkName(stats.fileId), Counted(stats.totalNodes, "node", "nodes"),
                       Grouped(stats.nodeSize), Grouped(stats.mapNodes), Grouped(index),
                       Grouped(leaves), Grouped(stats.freeNodes));
}

std::string LevelRows(const TreeStats& stats) {
    std::string text = "level    nodes     records  per node  fill mean    min    max\n";
    for (const LevelStats& level : stats.levels) {
        const double bytes = static_cast<double>(level.nodes) * stats.nodeSize;
        text += fmt::format("{:>5}{:>9}{:>12}{:>10.1f}{:>11}{:>7}{:>7}\n", level.level,
                            Grouped(level.nodes), Grouped(level.records),
                            static_cast<double>(level.records) / std::max(1u, level.nodes),
                            Percent(1.0 - static_cast<double>(level.freeBytes) / bytes),
                            Percent(level.least), Percent(level.most));
    }
    return text;
}

std::string FillRows(const TreeStats& stats) {
    std::string head = "fill of leaves ";
    std::string counts(head.size(), ' ');
    for (u32 i = 0; i < TreeStats::kBuckets; ++i) {
        const std::string count = Grouped(stats.fillBuckets[i]);
        const std::string title = fmt::format("{}-{}", 10 * i, 10 * i + 10);
        const std::size_t width = std::max(title.size(), count.size()) + 2;
        head += fmt::format("{:>{}}", title, width);
        counts += fmt::format("{:>{}}", count, width);
    }
    return head + "\n" + counts + "\n";
}

std::string RecordSentence(const TreeStats& stats) {
    std::string text = "records:";
    const char* separator = " ";
    for (const auto& [name, count] : stats.recordKinds) {
        text += separator + Grouped(count) + " " + name;
        separator = ", ";
    }
    const LevelStats& leaves = stats.levels.back();
    text += fmt::format("; {} of the leaf space unused\n",
                        Percent(static_cast<double>(leaves.freeBytes) /
                                (static_cast<double>(leaves.nodes) * stats.nodeSize)));
    return text;
}

}  // namespace

TreeStats CollectStats(Session* session, u32 fileId, bool keepGoing, Progress* progress) {
    CBTreeHfs* tree = session->Tree(fileId);
    TreeStats stats;
    stats.fileId = fileId;
    stats.nodeSize = tree->header.nodeSize;
    stats.totalNodes = tree->header.totalNodes;
    stats.freeNodes = tree->header.freeNodes;
    stats.mapNodes = static_cast<u32>(MapNodes(tree).size());
    stats.fileBytes = session->Volume().Fs()->ForkOf(fileId)->logicalSize;
    stats.extents = static_cast<u32>(session->Volume().ForkExtents(fileId).size());
    stats.clump = tree->header.clumpSize;
    RecordReader reader(tree);
    std::map<std::string, u64> kinds;
    u64 done = 0;
    u32 level = tree->header.treeDepth;
    for (const u32 first : LevelStarts(session, fileId)) {
        LevelStats row;
        row.level = level--;
        u32 last = 0;
        WalkChain(session, fileId, first, keepGoing, [&](const HeldNode& node) {
            const u32 freeBytes = node.FreeBytes();
            const double fill = FillOf(*tree, freeBytes);
            row.nodes += 1;
            row.records += node.RecordCount();
            row.freeBytes += freeBytes;
            row.least = std::min(row.least, fill);
            row.most = std::max(row.most, fill);
            if (row.level == 1) {
                const u32 bucket = static_cast<u32>(fill * TreeStats::kBuckets);
                stats.fillBuckets[std::min(bucket, TreeStats::kBuckets - 1)] += 1;
                stats.leafSteps += last != 0 ? 1 : 0;
                stats.adjacentSteps += last != 0 && node.Number() == last + 1 ? 1u : 0u;
                stats.forwardSteps += last != 0 && node.Number() > last + 1 ? 1u : 0u;
                last = node.Number();
                CountRecords(fileId, node, &reader, &kinds);
            }
            progress->Update(++done);
            return true;
        });
        stats.levels.push_back(row);
    }
    stats.recordKinds.assign(kinds.begin(), kinds.end());
    std::stable_sort(stats.recordKinds.begin(), stats.recordKinds.end(),
                     [](const auto& a, const auto& b) { return a.second > b.second; });
    return stats;
}

std::string StatsText(const TreeStats& stats) {
    std::string text = Sentence(stats);
    if (stats.levels.empty()) {
        text += "no records\n";
    } else {
        text += LevelRows(stats) + FillRows(stats);
        if (stats.leafSteps != 0) {
            const double steps = static_cast<double>(stats.leafSteps);
            text += fmt::format(
                "leaf order: {}, {} to the next node ({:.0f}%), {} further on, {} back\n",
                Counted(stats.leafSteps, "step", "steps"), Grouped(stats.adjacentSteps),
                static_cast<double>(stats.adjacentSteps) / steps * 100.0,
                Grouped(stats.forwardSteps),
                Grouped(stats.leafSteps - stats.adjacentSteps - stats.forwardSteps));
        }
    }
    text += fmt::format("tree file: {} B in {}; clump {} B\n", Grouped(stats.fileBytes),
                        Counted(stats.extents, "extent", "extents"), Grouped(stats.clump));
    return stats.levels.empty() ? text : text + RecordSentence(stats);
}

void StatsMembers(const TreeStats& stats, JsonWriter* json) {
    json->Member("tree", ForkName(stats.fileId));
    json->Member("node_size", stats.nodeSize);
    json->Member("nodes", stats.totalNodes);
    json->Member("free_nodes", stats.freeNodes);
    json->Member("map_nodes", stats.mapNodes);
    json->Member("file_bytes", stats.fileBytes);
    json->Member("extents", stats.extents);
    json->Member("clump", stats.clump);
    json->Key("levels");
    json->BeginArray();
    for (const LevelStats& level : stats.levels) {
        const double bytes = static_cast<double>(level.nodes) * stats.nodeSize;
        json->BeginObject();
        json->Member("level", level.level);
        json->Member("nodes", level.nodes);
        json->Member("records", level.records);
        json->Member("fill_mean", 1.0 - static_cast<double>(level.freeBytes) / bytes);
        json->Member("fill_min", level.least);
        json->Member("fill_max", level.most);
        json->EndObject();
    }
    json->EndArray();
    json->Key("leaf_fill_tenths");
    json->BeginArray();
    for (const u64 count : stats.fillBuckets) {
        json->Value(count);
    }
    json->EndArray();
    json->Member("leaf_steps", stats.leafSteps);
    json->Member("leaf_steps_adjacent", stats.adjacentSteps);
    json->Member("leaf_steps_forward", stats.forwardSteps);
    json->Key("records");
    json->BeginObject();
    for (const auto& [name, count] : stats.recordKinds) {
        json->Member(name, count);
    }
    json->EndObject();
}

}  // namespace VELK::tool
