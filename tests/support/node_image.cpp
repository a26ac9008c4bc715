// See node_image.h.
#include "node_image.h"

#include <cstring>
#include <new>
#include <stdexcept>

namespace VELK::test {

Bytes NodeImage::Build(u32 nodeSize) const {
    Bytes node(nodeSize);
    Put32(&node, 0, fLink);
    Put32(&node, 4, bLink);
    node[8] = static_cast<u8>(kind);
    node[9] = height;
    Put16(&node, 10, static_cast<u32>(records.size()));
    if (UsedBytes(records) + 14 > nodeSize) {
        throw std::length_error("records do not fit into the node");
    }
    std::size_t offset = 14;
    std::size_t slot = nodeSize - 2;
    for (const Bytes& record : records) {
        std::memcpy(node.data() + offset, record.data(), record.size());
        Put16(&node, slot, static_cast<u32>(offset));
        offset += record.size();
        slot -= 2;
    }
    Put16(&node, slot, static_cast<u32>(offset));
    return node;
}

Bytes Record(const Bytes& key, const Bytes& data) {
    Bytes record = key;
    if (record.size() % 2 != 0) {
        record.push_back(0);
    }
    AppendBytes(&record, data);
    return record;
}

Bytes Record(const Bytes& key, u32 child) {
    Bytes data;
    Append32(&data, child);
    return Record(key, data);
}

u32 UsedBytes(const std::vector<Bytes>& records) {
    std::size_t used = 2;
    for (const Bytes& record : records) {
        used += record.size() + 2;
    }
    return static_cast<u32>(used);
}

BTHeaderMem GeometryHeader(u32 nodeSize, u32 mapBlockSize) {
    BTHeaderMem header{};
    header.nodeSize = nodeSize;
    header.attributes = kBTBigKeysMask | kBTVariableIndexKeysMask;
    header.maxKeyLength = kCatMaxKeyLength;
    header.totalNodes = 1000;
    header.blockSize = mapBlockSize;
    header.blockMask = mapBlockSize - 1;
    header.blocksPerNode = nodeSize / mapBlockSize;
    while ((1u << header.blockShift) < mapBlockSize) {
        header.blockShift += 1;
    }
    return header;
}

LooseNode::LooseNode(const Bytes& bytes, u32 mapBlockSize, u32 nodeNum, bool dirty, bool inOnePiece)
    : header(GeometryHeader(static_cast<u32>(bytes.size()), mapBlockSize)) {
    const std::size_t blocks = bytes.size() / mapBlockSize;
    const std::size_t size = sizeof(HfsNode) + blocks * sizeof(HfsBcbBuf);
    memory_ = std::make_unique<u8[]>(size);
    node_ = new (memory_.get()) HfsNode{};
    node_->nodeNum = nodeNum;
    node_->refCount = 1;
    node_->link.MarkUnlinked();
    node_->modifiedLink.Init();
    node_->isOnePiece = inOnePiece;
    const std::size_t pieceSize = inOnePiece ? bytes.size() : mapBlockSize;
    for (std::size_t b = 0; b < blocks; ++b) {
        const std::size_t at = b * mapBlockSize;
        if (at % pieceSize == 0) {
            pieces_.push_back(std::make_unique<u8[]>(pieceSize));
        }
        blocks_.push_back(pieces_.back().get() + at % pieceSize);
        std::memcpy(blocks_[b], bytes.data() + at, mapBlockSize);
        node_->bufs[b].data = blocks_[b];
        node_->bufs[b].dirty = dirty;
    }
}

// A tree may have queued the node; it outlives it.
LooseNode::~LooseNode() {
    node_->modifiedLink.Unlink();
}

Bytes LooseNode::Content() const {
    Bytes content;
    for (const u8* block : blocks_) {
        content.insert(content.end(), block, block + header.blockSize);
    }
    return content;
}

u8* LooseNode::At(u32 offset) const {
    return blocks_.at(offset / header.blockSize) + offset % header.blockSize;
}

}  // namespace VELK::test
