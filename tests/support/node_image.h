// Builds the bytes of one node from a readable list of records, and an HfsNode around such bytes.
// Written without the engine.
#pragma once

#include <memory>

#include "hfs/treehfs.h"
#include "image_bytes.h"

namespace VELK::test {

struct NodeImage {
    s8 kind = kBTLeafNode;
    u8 height = 1;
    u32 fLink = 0;
    u32 bLink = 0;
    std::vector<Bytes> records = {};

    // The node; what lies between the records and their offset table is 0. Throws when the records
    // do not fit.
    Bytes Build(u32 nodeSize) const;
};

// A record as a node holds it: key (length field included), pad byte if odd, data.
Bytes Record(const Bytes& key, const Bytes& data);
// An index record.
Bytes Record(const Bytes& key, u32 child);

// Bytes records take in a node with their slots and that of the free space.
u32 UsedBytes(const std::vector<Bytes>& records);

// A node that belongs to no tree: every map block is a heap block of its own, so that an access one
// byte past it is seen, unless the node is to lie in one piece. Blocks are marked dirty as wanted,
// so that writers accept them.
class LooseNode {
public:
    LooseNode(const Bytes& bytes, u32 mapBlockSize, u32 nodeNum = 1, bool dirty = false,
              bool inOnePiece = false);
    ~LooseNode();
    LooseNode(const LooseNode&) = delete;
    LooseNode& operator=(const LooseNode&) = delete;

    HfsNode* operator->() const { return node_; }
    HfsNode* Get() const { return node_; }
    const BTHeaderMem* Hdr() const { return &header; }
    Bytes Content() const;
    u8* At(u32 offset) const;  // address of a byte, computed without the engine

    BTHeaderMem header{};

private:
    std::unique_ptr<u8[]> memory_;
    std::vector<std::unique_ptr<u8[]>> pieces_;
    std::vector<u8*> blocks_;
    HfsNode* node_;
};

// Header of a tree of the given geometry: big and variable index keys, longest key 516.
BTHeaderMem GeometryHeader(u32 nodeSize, u32 mapBlockSize);

}  // namespace VELK::test
