// Operations of scripts that look at a tree as it stands, changes in memory included.
#include <fmt/format.h>

#include <cstddef>

#include "hfs/check/check.h"
#include "hfs/treehfs/bytes.h"
#include "tool/node_reader.h"
#include "tool/record_digest.h"
#include "tool/script_run.h"

namespace VELK::tool {
namespace {

void PutHeader(const CBTreeHfs& tree, u8* node) {
    const BTHeaderMem& header = tree.header;
    PutBe16(node + kHeadTreeDepth, header.treeDepth);
    PutBe32(node + kHeadRootNode, header.rootNode);
    PutBe32(node + kHeadLeafRecords, header.leafRecords);
    PutBe32(node + kHeadFirstLeafNode, header.firstLeafNode);
    PutBe32(node + kHeadLastLeafNode, header.lastLeafNode);
    PutBe32(node + kHeadTotalNodes, header.totalNodes);
    PutBe32(node + kHeadFreeNodes, header.freeNodes);
}

// The invariants that are broken, each once, in the order they were met.
struct Findings {
    std::string ids;
};

struct LevelWalk {
    u64 nodes = 0;
    u64 records = 0;
    u64 usedBytes = 0;
};

// Follows one level from its first node along the forward links; bounded by the nodes there are.
int WalkLevel(CBTreeHfs* tree, u32 number, LevelWalk* walk, u32* firstChild) {
    while (number != 0 && walk->nodes < tree->header.totalNodes) {
        HeldNode node(tree, HeldNode::AfterUse::kKeepCached);
        int status = node.Open(number);
        if (status != kOk) {
            return status;
        }
        const NodeBytes bytes = node.Bytes();
        unsigned freeBytes = 0;
        status = node.Get()->GetNodeFreeSize(&tree->header, &freeBytes);
        if (status != kOk) {
            return status;
        }
        if (walk->nodes == 0 && bytes.U8(kDescHeight) > 1) {
            unsigned child = 0;
            status = node.Get()->GetChildNodeNum(&tree->header, 0, &child);
            if (status != kOk) {
                return status;
            }
            *firstChild = child;
        }
        ++walk->nodes;
        walk->records += bytes.U16(kDescNumRecords);
        walk->usedBytes += tree->header.nodeSize - freeBytes;
        number = bytes.U32(kDescFLink);
    }
    return kOk;
}

}  // namespace

int FlatTree(ImageVolume* volume, CBTreeHfs* tree, std::vector<u8>* bytes) {
    const u32 nodeSize = tree->header.nodeSize;
    const u64 size = u64{tree->header.totalNodes} << tree->nodeShift;
    bytes->assign(static_cast<std::size_t>(size), 0);
    // Nodes from validNodes on were never written: what lies there is nothing of the tree.
    const u64 valid = u64{std::min(tree->validNodes, tree->header.totalNodes)} << tree->nodeShift;
    constexpr u64 kPiece = u64{1} << 20;
    for (u64 at = 0; at < valid; at += kPiece) {
        const u32 piece = static_cast<u32>(std::min(kPiece, valid - at));
        const int status = volume->ReadFork(tree->fileId, at, bytes->data() + at, piece);
        if (status != kOk) {
            return status;
        }
    }
    for (list_head* link = tree->modifiedList.next; link != &tree->modifiedList;
         link = link->next) {
        const HfsNode* node = reinterpret_cast<const HfsNode*>(reinterpret_cast<const u8*>(link) -
                                                               offsetof(HfsNode, modifiedLink));
        const u64 at = u64{node->nodeNum} << tree->nodeShift;
        if (at + nodeSize <= size) {
            NodeBytes(&tree->header, node).CopyOut(bytes->data() + at, 0, nodeSize);
        }
    }
    if (size >= nodeSize) {
        PutHeader(*tree, bytes->data());
    }
    return kOk;
}

int DigestTree(CBTreeHfs* tree, RecordDigest* digest, HeldNode::AfterUse afterUse) {
    int status = kOk;
    u32 number = tree->header.firstLeafNode;
    for (u32 hops = 0; number != 0 && hops < tree->header.totalNodes && status == kOk; ++hops) {
        HeldNode node(tree, afterUse);
        status = node.Open(number);
        if (status != kOk) {
            break;
        }
        const NodeBytes bytes = node.Bytes();
        std::vector<u8> copy;
        for (u32 i = 0; i < bytes.U16(kDescNumRecords) && status == kOk; ++i) {
            NodeKey record{};
            status = node.Get()->GetKey(&tree->header, static_cast<int>(i), &record);
            if (status == kOk) {
                copy.resize(record.size);
                bytes.CopyOut(copy.data(), record.offset, record.size);
                digest->Add(copy.data(), record.keySize,
                            copy.data() + record.size - record.dataSize, record.dataSize);
            }
        }
        number = bytes.U32(kDescFLink);
    }
    return status;
}

ScriptRunner::Outcome ScriptRunner::State() {
    return {kOk, StateFields(Tree())};
}

ScriptRunner::Outcome ScriptRunner::Header() {
    const CBTreeHfs* tree = Tree();
    const BTHeaderMem& header = tree->header;
    return {kOk,
            fmt::format(" node={} map={} maxkey={} clump={} type={:02X} compare={:02X} "
                        "attributes={} valid={} cached={} reserved={}",
                        header.nodeSize, header.blockSize, header.maxKeyLength, header.clumpSize,
                        tree->btreeType, tree->keyCompareType, header.attributes, tree->validNodes,
                        tree->nodeCount, tree->reservedNodes)};
}

ScriptRunner::Outcome ScriptRunner::Node(const std::string_view* words) {
    CBTreeHfs* tree = Tree();
    u64 number = 0;
    ParseNumber(words[0], 0xFFFFFFFF, &number);
    if (number >= tree->header.totalNodes) {
        Remark(fmt::format("the tree has nodes 0..{}", tree->header.totalNodes - 1));
    }
    if (number >= tree->validNodes && number < tree->header.totalNodes) {
        return {kOk, " unused=yes"};  // asking the engine for it would make it a fresh node
    }
    HeldNode node(tree, HeldNode::AfterUse::kKeepCached);
    int status = node.Open(static_cast<u32>(number));
    if (status != kOk) {
        return {status, {}};
    }
    const NodeBytes bytes = node.Bytes();
    std::vector<u8> copy(tree->header.nodeSize);
    bytes.CopyOut(copy.data(), 0, tree->header.nodeSize);
    RecordDigest digest;
    digest.Add(copy.data(), static_cast<u32>(copy.size()), nullptr, 0);
    unsigned freeBytes = 0;
    status = node.Get()->GetNodeFreeSize(&tree->header, &freeBytes);
    return {status, fmt::format(" kind={} height={} records={} flink={} blink={} free={} bytes={}",
                                NodeKindName(node.Kind()), node.Height(), node.RecordCount(),
                                node.FLink(), node.BLink(), freeBytes, digest.Text())};
}

ScriptRunner::Outcome ScriptRunner::Check(u32 count) {
    CBTreeHfs* tree = Tree();
    std::vector<u8> bytes;
    const int status = FlatTree(volume_, tree, &bytes);
    if (status != kOk) {
        return {status, {}};
    }
    CheckTreeKind kind;
    kind.fileId = fileId_;
    kind.names = tree->compareKeys == CompareCatKeysCaseBin ? CheckNameOrder::kBinary
                                                            : CheckNameOrder::kFolding;
    CheckOptions options;
    options.quick = count != 0;
    options.maxErrors = 0;
    Findings findings;
    CheckSink sink;
    sink.self = &findings;
    sink.finding = [](void* self, const CheckFinding& finding) {
        Findings* found = static_cast<Findings*>(self);
        const std::string id = CheckIdOf(finding.id).name;
        if (finding.severity == CheckSeverity::kError && found->ids.find(id) == std::string::npos) {
            found->ids += (found->ids.empty() ? "" : ",") + id;
        }
    };
    const CheckSummary summary = CheckTreeBytes(bytes.data(), bytes.size(), kind, options, sink);
    std::string fields = fmt::format(" errors={} warnings={} nodes={}", summary.errors,
                                     summary.warnings, summary.nodes);
    return {kOk, findings.ids.empty() ? fields : fields + " ids=" + findings.ids};
}

ScriptRunner::Outcome ScriptRunner::Stats() {
    CBTreeHfs* tree = Tree();
    const BTHeaderMem& header = tree->header;
    LevelWalk index;
    LevelWalk leaves;
    u32 number = header.rootNode;
    for (u32 level = header.treeDepth; level >= 1 && level <= kMaxPathDepth; --level) {
        LevelWalk walk;
        u32 child = 0;
        const int status = WalkLevel(tree, number, &walk, &child);
        if (status != kOk) {
            return {status, {}};
        }
        LevelWalk& sum = level == 1 ? leaves : index;
        sum.nodes += walk.nodes;
        sum.records += walk.records;
        sum.usedBytes += walk.usedBytes;
        number = child;
    }
    const u64 room = leaves.nodes * header.nodeSize;
    const u64 fill = room == 0 ? 0 : leaves.usedBytes * 1000 / room;
    return {kOk, fmt::format(" depth={} index={} leaf={} free={} records={} fill={}.{}%",
                             header.treeDepth, index.nodes, leaves.nodes, header.freeNodes,
                             leaves.records, fill / 10, fill % 10)};
}

ScriptRunner::Outcome ScriptRunner::Digest() {
    RecordDigest digest;
    const int status = DigestTree(Tree(), &digest, HeldNode::AfterUse::kKeepCached);
    return {status, fmt::format(" digest={} records={}", digest.Text(), digest.Records())};
}

}  // namespace VELK::tool
