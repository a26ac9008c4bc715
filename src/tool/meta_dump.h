// Writes a volume's metadata onto another device, where everything else is zero: headers, trees and
// allocation file, with all names replaced (name_mask.h) and the bytes of attributes taken out.
// Nothing is copied that no tree needs: not the gaps and free nodes, not the bits behind the last
// node or block, not the journal.
#pragma once

#include "tool/name_mask.h"
#include "tool/node_reader.h"
#include "tool/progress.h"
#include "tool/tree_survey.h"

namespace VELK::tool {

class MetaDump {
public:
    MetaDump(Session* session, const Invocation& call, BlockDevice* target);

    // Throws ToolError.
    void Run();

    u64 Names() const { return catalogNames_.Names() + attributeNames_.Names(); }
    u64 Nodes() const { return nodes_; }
    u64 Bytes() const { return bytes_; }
    // Size of the volume, and so of the device.
    static u64 VolumeBytes(Session* session);

private:
    std::vector<bool> UsedNodes(u32 fileId);
    void CollectNames(u32 fileId, const std::vector<bool>& used);
    bool StaysAsItIs(u32 parent, const u8* unitsBe, u32 count) const;
    void AddNames(u32 fileId, const NodeRecord& record, bool isLeaf);
    NameMask* MaskOf(u32 fileId);

    void WriteTree(u32 fileId, const std::vector<bool>& used);
    void CleanNode(u32 fileId, const HeldNode& node, u8* bytes);
    void CleanRecord(u32 fileId, bool isLeaf, const NodeRecord& record, u8* bytes);
    void CleanData(u32 fileId, u8* data, u32 size);
    void WriteFork(u32 fileId, u64 forkOffset, const u8* bytes, u32 size);
    void WriteBitmap();
    void WriteHeaders();
    void Write(u64 offset, const u8* bytes, u32 size);
    void Damaged(u32 fileId, u32 node, int status, u32 record);

    Session* session_;
    const Invocation& call_;
    BlockDevice* target_;
    NameMask catalogNames_;
    NameMask attributeNames_;
    std::vector<u32> privateFolders_;
    u64 nodes_ = 0;
    u64 bytes_ = 0;
};

}  // namespace VELK::tool
