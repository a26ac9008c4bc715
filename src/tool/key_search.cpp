// One lookup by key.
#include "tool/key_search.h"

#include "hfs/records/name_text.h"
#include "hfs/records/record_view.h"
#include "tool/errors.h"
#include "tool/key_argument.h"
#include "tool/leaf_cursor.h"

namespace VELK::tool {

namespace {

struct Step {
    u32 level = 0;
    u32 node = 0;
    u32 index = 0;
    u32 count = 0;
    u32 child = 0;
    std::string key;
    std::string record;
};

struct Way {
    bool found = false;
    u32 leaf = 0;
    u32 index = 0;
    u32 nodesRead = 0;
    std::vector<Step> steps;  // from the root down
};

Step DescribeStep(CBTreeHfs* tree, u32 level, const HfsFindLevel& at) {
    Step step;
    step.level = level;
    step.node = at.node->nodeNum;
    step.index = static_cast<u32>(at.index);
    step.count = GetBe16(at.node->bufs[0].data + kDescNumRecords);
    RecordReader reader(tree);
    NodeRecord record;
    if (step.index >= step.count || reader.Describe(at.node, step.index, &record) != 0) {
        step.key = "behind the last record";
        return step;
    }
    step.key = KeyText(tree->fileId, record.key, record.keySize, Blanks::kPlain);
    if (level == 1) {
        step.record = RecordSummary(tree->fileId, record.data, record.dataSize);
    } else {
        unsigned child = 0;
        at.node->GetChildNodeNum(&tree->header, at.index, &child);
        step.child = child;
    }
    return step;
}

Way LookUp(Session* session, u32 fileId, const SearchKey& key) {
    CBTreeHfs* tree = session->Tree(fileId);
    Way way;
    HfsFindData path;
    const u32 before = tree->readCount + tree->hitCount;
    const int status =
        tree->FindEntry(key.Key(), key.id, &path, &way.found, nullptr, nullptr, nullptr, nullptr);
    way.nodesRead = tree->readCount + tree->hitCount - before;
    u32 last = tree->header.rootNode;
    for (u32 level = kMaxPathDepth; level >= 1; --level) {
        if (path.path[level].node != nullptr) {
            way.steps.push_back(DescribeStep(tree, level, path.path[level]));
            last = path.path[level].node->nodeNum;
        }
    }
    if (status == 0 && !way.steps.empty()) {
        way.leaf = way.steps.back().node;
        way.index = way.steps.back().index;
    }
    path.ClearPath();
    if (status != 0) {
        ThrowProblem(session->Image(), session->ProblemOf(fileId, last, status, ""));
    }
    return way;
}

void PrintWay(Output* out, const CBTreeHfs& tree, const Way& way) {
    for (const Step& step : way.steps) {
        std::string line = fmt::format("level {}  node {}  record {} of {}   {}", step.level,
                                       step.node, step.index, step.count, step.key);
        if (step.level > 1) {
            line += fmt::format(" -> node {}", step.child);
        } else if (!step.record.empty()) {
            line += "    " + step.record;
        }
        out->Print("{}\n", EscapedText(line));
    }
    out->Print("position {}, depth {}, {} read\n", (u64{way.leaf} << tree.nodeShift) + way.index,
               tree.header.treeDepth,
               way.nodesRead == 1 ? "1 node" : fmt::format("{} nodes", way.nodesRead));
}

void PrintJson(Output* out, const CBTreeHfs& tree, const Way& way) {
    std::string text;
    JsonWriter json(&text);
    json.BeginObject();
    json.Member("schema", "treehfs.find.key/1");
    json.Member("tree", ForkName(tree.fileId));
    json.Member("found", way.found);
    json.Member("position", (u64{way.leaf} << tree.nodeShift) + way.index);
    json.Member("nodes_read", way.nodesRead);
    json.Key("path");
    json.BeginArray();
    for (const Step& step : way.steps) {
        json.BeginObject();
        json.Member("level", step.level);
        json.Member("node", step.node);
        json.Member("record", step.index);
        json.Member("records", step.count);
        json.Member("key", step.key);
        if (step.level > 1) {
            json.Member("child", step.child);
        } else if (!step.record.empty()) {
            json.Member("summary", step.record);
        }
        json.EndObject();
    }
    json.EndArray();
    json.EndObject();
    out->Write(text + "\n");
}

void PrintNearest(Output* out, const Way& way) {
    if (way.steps.empty()) {
        out->Write("the tree is empty: the key would be its first\n");
        return;
    }
    const Step& leaf = way.steps.back();
    out->Print("{}: node {} record {} of {}   {}{}\n", way.found ? "is there" : "would be inserted",
               leaf.node, leaf.index, leaf.count,
               way.found || leaf.index >= leaf.count ? "" : "before ",
               EscapedText(leaf.key + (leaf.record.empty() ? "" : "  " + leaf.record)));
}

}  // namespace

int SearchByKey(Session* session, Invocation* call, const KeySearch& search) {
    const u32 fileId = call->trees[0];
    const CBTreeHfs* tree = session->Tree(fileId);
    const SearchKey key = KeyArgument(session, fileId, search.text);
    const Way way = LookUp(session, fileId, key);
    if (call->json) {
        PrintJson(&call->out, *tree, way);
        return way.found || search.nearest ? kExitDone : kExitNo;
    }
    if (search.tracePath) {
        PrintWay(&call->out, *tree, way);
    } else if (search.nearest) {
        PrintNearest(&call->out, way);
    } else if (way.found) {
        const Step& leaf = way.steps.back();
        call->out.Print("{}  {}\n", EscapedText(leaf.key), EscapedText(leaf.record));
    }
    if (!way.found && !search.nearest) {
        call->out.Flush();
        ThrowNo(session->Image(),
                "no record with key " + search.text + " in the " + std::string(ForkName(fileId)) +
                    " tree",
                "--nearest shows where it would be");
    }
    return kExitDone;
}

}  // namespace VELK::tool
