// Nodes of a tree one by one, taken from the engine and given back, and their records in one piece.
#pragma once

#include <functional>
#include <vector>

#include "hfs/treehfs/bytes.h"
#include "tool/session.h"

namespace VELK::tool {

// A record as it lies in its node; valid until the reader describes the next one.
struct NodeRecord {
    const u8* key = nullptr;  // length field first; null for records without a key
    u32 keySize = 0;          // length field included
    const u8* data = nullptr;
    u32 dataSize = 0;
    u32 node = 0;
    u32 index = 0;
    u32 offset = 0;  // in the node
    u32 size = 0;    // key and data, padding included
};

// Puts records together that lie in several pieces.
class RecordReader {
public:
    explicit RecordReader(const CBTreeHfs* tree) : tree_(tree) {}
    // Describes record `index` of `node`; a status of the accessors, or corrupt.
    int Describe(const HfsNode* node, u32 index, NodeRecord* record);

private:
    const CBTreeHfs* tree_;
    std::vector<u8> key_;
    std::vector<u8> data_;
};

// One node, held while the object lives. Walks over a whole tree drop what they have seen, so that
// memory stays small; a node with changes that no flush has kept stays in any case.
class HeldNode {
public:
    enum class AfterUse { kDrop, kKeepCached };

    explicit HeldNode(CBTreeHfs* tree, AfterUse afterUse = AfterUse::kDrop)
        : tree_(tree), afterUse_(afterUse) {}
    HeldNode(const HeldNode&) = delete;
    HeldNode& operator=(const HeldNode&) = delete;
    ~HeldNode() { Release(); }

    // Takes node `number`, giving back the one held before.
    int Open(u32 number);
    void Release();

    const HfsNode* Get() const { return node_; }
    u32 Number() const { return node_->nodeNum; }
    u32 FLink() const { return GetBe32(Start() + kDescFLink); }
    u32 BLink() const { return GetBe32(Start() + kDescBLink); }
    s8 Kind() const { return static_cast<s8>(Start()[kDescKind]); }
    u32 Height() const { return Start()[kDescHeight]; }
    u32 RecordCount() const { return GetBe16(Start() + kDescNumRecords); }
    u32 Reserved() const { return GetBe16(Start() + kDescReserved); }
    // Bytes between the last record and the offset table; the node's size when that is nonsense.
    u32 FreeBytes() const;
    NodeBytes Bytes() const { return {&tree_->header, node_}; }

private:
    const u8* Start() const { return node_->bufs[0].data; }

    CBTreeHfs* tree_;
    AfterUse afterUse_;
    HfsNode* node_ = nullptr;
};

// "leaf", "index", "header", "map", else "unknown".
const char* NodeKindName(s8 kind);
// Part of the node's bytes that is in use.
double FillOf(const CBTreeHfs& tree, u32 freeBytes);

// Where the map says whether a node is in use.
struct MapBit {
    bool known = false;  // the map reaches so far
    bool isSet = false;
    u32 node = 0;    // that holds the bit
    u32 offset = 0;  // of its byte in that node
};
MapBit FindMapBit(CBTreeHfs* tree, u32 nodeNum);
// Numbers of the map nodes, in order; stops at one that is none.
std::vector<u32> MapNodes(CBTreeHfs* tree);

// Number of the first node of each level, from the root down to the leaves. Throws ToolError.
std::vector<u32> LevelStarts(Session* session, u32 fileId);

// Orders in which the nodes of a tree can be visited.
enum class NodeOrder {
    kLeaf,     // leaves along their chain
    kBreadth,  // level by level, from the root down
    kDepth,    // each node before its children
    kDisk,     // every node of the file, in use or not
};
// Calls `visit` for each node in that order; false from it ends the walk. No node is visited twice.
void VisitNodes(Session* session, u32 fileId, NodeOrder order, bool keepGoing,
                const std::function<bool(const HeldNode&)>& visit);

// Calls `visit` for each node of the level that begins with node `first`, along its links. A chain
// longer than the tree is a ring. Throws ToolError unless damage is passed over; false from `visit`
// ends the walk.
void WalkChain(Session* session, u32 fileId, u32 first, bool keepGoing,
               const std::function<bool(const HeldNode&)>& visit);

}  // namespace VELK::tool
