// Repeats the opening checks on the bytes of a header record, in the order opening makes them, and
// names the first field that fails.
#include "hfs/volume/tree_diagnosis.h"

#include "hfs/volume/wire.h"

namespace VELK {

namespace {

struct Finding {
    std::string text;
    u32 offset = 0;  // of the field in node 0
    const char* check = "";
};

Finding NodeNumberFinding(const char* name, u32 offset, u32 value, u32 total) {
    return {std::string(name) + " " + std::to_string(value) + " is not below totalNodes " +
                std::to_string(total),
            offset, "H04"};
}

Finding FirstFinding(const TreeDiagnosis& tree) {
    const u8* header = tree.header;
    const u32 nodeSize = Be16(header + kHeadNodeSize);
    const u32 total = Be32(header + kHeadTotalNodes);
    if (nodeSize < tree.mapBlockSize) {
        return {"node size " + std::to_string(nodeSize) + " is below the map block of " +
                    std::to_string(tree.mapBlockSize),
                kHeadNodeSize, "H02"};
    }
    if ((Be32(header + kHeadAttributes) & kBTBigKeysMask) == 0) {
        return {"attributes lack the bit for 16-bit key lengths", kHeadAttributes, "H07"};
    }
    struct NodeNumber {
        const char* name;
        u32 offset;
    };
    constexpr NodeNumber kNumbers[] = {{"freeNodes", kHeadFreeNodes},
                                       {"rootNode", kHeadRootNode},
                                       {"firstLeafNode", kHeadFirstLeafNode},
                                       {"lastLeafNode", kHeadLastLeafNode}};
    for (const NodeNumber& number : kNumbers) {
        const u32 value = Be32(header + number.offset);
        if (value >= total) {
            return NodeNumberFinding(number.name, number.offset, value, total);
        }
    }
    const u32 depth = Be16(header + kHeadTreeDepth);
    if (depth > kMaxOpenDepth) {
        return {Format("treeDepth %u is above %u", depth, kMaxOpenDepth), kHeadTreeDepth, "H03"};
    }
    const u32 type = header[kHeadBtreeType];
    if (type != 0x00 && type != 0x80 && type != 0xFF) {
        return {Format("btreeType 0x%02X is not known", type), kHeadBtreeType, "H06"};
    }
    // A size that is no power of two counts nodes in units of the smallest node.
    const u32 shift = IsPowerOfTwo(nodeSize) ? Log2(nodeSize) : kMinNodeShift;
    if (total > tree.forkBlockBytes >> shift) {
        return {"totalNodes " + Grouped(total) + " does not fit the file of " +
                    Grouped(tree.forkBlockBytes) + " bytes",
                kHeadTotalNodes, "H05"};
    }
    return {};
}

}  // namespace

Problem DiagnoseTree(const TreeDiagnosis& tree) {
    const std::string name = std::string(ForkName(tree.fileId)) + " tree: ";
    const Finding finding = tree.header != nullptr ? FirstFinding(tree) : Finding{};
    std::string text = name + StatusWithCode(tree.status);
    Problem problem;
    if (finding.text.empty()) {
        problem = Failure(text, "run check");
    } else {
        const u64 at = tree.imageOffset + finding.offset;
        problem = FailureAt(at,
                            text + ": " + finding.text + " (image offset " + HexOffset(at) +
                                ", check " + finding.check + ")",
                            "");
        problem.check = finding.check;
    }
    problem.status = tree.status;
    problem.fileId = tree.fileId;
    problem.node = 0;
    return problem;
}

}  // namespace VELK
