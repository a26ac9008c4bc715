// One tree: what its header says, what was seen of it, and the parts it is checked in.
#pragma once

#include <memory>
#include <vector>

#include "hfs/check/check_file.h"
#include "hfs/check/check_keys.h"
#include "hfs/check/check_node.h"

namespace VELK {

// A set of node numbers. Takes memory for the stretches that hold any.
class CheckNodeSet {
public:
    void Reset(u32 count) {
        count_ = count;
        chunks_.clear();
        chunks_.resize((static_cast<std::size_t>(count) + kChunkBits - 1) / kChunkBits);
    }
    // Eight nodes from `nodeNum` on, the first in the highest bit. REQUIRES: a multiple of 8.
    u8 EightFrom(u32 nodeNum) const {
        const u8* chunk = chunks_[nodeNum / kChunkBits].get();
        return chunk == nullptr ? u8{0} : chunk[nodeNum % kChunkBits / 8];
    }
    // REQUIRES: below the count. False: it was in the set.
    bool Add(u32 nodeNum) {
        std::unique_ptr<u8[]>& chunk = chunks_[nodeNum / kChunkBits];
        if (chunk == nullptr) {
            chunk = std::make_unique<u8[]>(kChunkBits / 8);
        }
        u8& byte = chunk[nodeNum % kChunkBits / 8];
        const bool isNew = (byte & Bit(nodeNum)) == 0;
        byte = static_cast<u8>(byte | Bit(nodeNum));
        return isNew;
    }
    u32 Count() const { return count_; }

private:
    static constexpr u32 kChunkBits = 4096;

    static u32 Bit(u32 nodeNum) { return 0x80u >> (nodeNum % 8); }

    u32 count_ = 0;
    std::vector<std::unique_ptr<u8[]>> chunks_;
};

struct CheckTreeHeader {
    u32 treeDepth = 0;
    u32 rootNode = 0;
    u32 leafRecords = 0;
    u32 firstLeafNode = 0;
    u32 lastLeafNode = 0;
    u32 nodeSize = 0;
    u32 maxKeyLength = 0;
    u32 totalNodes = 0;
    u32 freeNodes = 0;
    u32 btreeType = 0;
    u32 keyCompareType = 0;
    u32 attributes = 0;
};

// What a caller wants of the leaf records as they are visited: only those of sound key and with
// data that passed are shown.
struct CheckLeafVisitor {
    void* self = nullptr;
    void (*record)(void* self, const CheckTree& tree, const CheckNode& node, u32 index,
                   const CheckRecord& record) = nullptr;
};

struct CheckTree {
    CheckTree(CheckRun* owner, CheckFile* bytes, CheckKeyKind keyKind)
        : run(owner), file(bytes), kind(keyKind) {}

    CheckRun* run;
    CheckFile* file;
    CheckKeyKind kind;
    bool anyData = false;      // leaf data is nobody's business
    bool keepsLeaves = false;  // gather `leaves`
    u64 logicalSize = 0;       // of the fork; at least what the runs hold, unless damaged
    CheckLeafVisitor visitor;

    CheckTreeHeader header;
    u32 nodeSize = 0;  // 0: not usable
    u32 nodes = 0;     // nodes there are: of the header's total those the file has room for
    CheckNodeSet seen;
    std::vector<u8> map;        // bits of the map records, up to `nodes`
    std::vector<u32> mapNodes;  // in the order of their chain
    u64 mapBits = 0;            // bits the chain holds
    bool isMapWhole = false;
    u64 leafRecords = 0;          // counted
    bool isWhole = true;          // every node that should be there was visited
    bool hasLostRecords = false;  // leaf records nobody can make use of
    bool isUsable = false;        // header and root allow walks
    std::vector<u32> leaves;

    u32 FileId() const { return kind.fileId; }
    const char* Name() const { return CheckFileName(kind.fileId); }
    bool HasVariableIndexKeys() const {
        return (header.attributes & kBTVariableIndexKeysMask) != 0;
    }
    u64 NodeOffset(u32 nodeNum) const { return static_cast<u64>(nodeNum) * nodeSize; }
    // A byte of a node, for findings.
    CheckPlace Place(u32 nodeNum, u32 offset) const {
        return {FileId(), nodeNum, -1, file->SourceOffset(NodeOffset(nodeNum) + offset), {}};
    }
    CheckPlace Place(u32 nodeNum, u32 offset, u32 record) const {
        return {FileId(),
                nodeNum,
                static_cast<s32>(record),
                file->SourceOffset(NodeOffset(nodeNum) + offset),
                {}};
    }
    CheckPlace HeaderPlace(u32 offset) const {
        return {FileId(), 0, -1, file->SourceOffset(offset), "header"};
    }
    // A node could not be read: says so; false if the tree is to be left now.
    bool CannotRead(u32 nodeNum, int status);
};

// Everything that concerns the tree alone. Sets the verdict of the current stage.
void CheckWholeTree(CheckTree* tree);

// Its parts, in their order. False: the rest would be guesswork.
bool CheckHeaderNode(CheckTree* tree, u32 mapBlock);
bool CheckMap(CheckTree* tree);
void WalkTree(CheckTree* tree);
void WalkLeafChain(CheckTree* tree);
void CheckCounts(CheckTree* tree);
void CheckMapAgainstNodes(CheckTree* tree);
// Looks up every key of `leaves` from the root (D01).
void CheckDescents(CheckTree* tree);

// Shows the visitor every sound record of the leaves gathered before, without a word of their
// faults. False: a leaf could not be read.
bool ForEachLeafRecord(CheckTree* tree, const CheckLeafVisitor& visitor);

// Sets the verdict of the stage from what it counted.
void CloseStage(CheckRun* run, CheckStage* stage);

}  // namespace VELK
