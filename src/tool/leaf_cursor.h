// Walks the leaf records of a tree in key order without copying them: the leaves are entered by
// lookup and iteration of the engine, and within a leaf records are described by its accessors.
//
// It believes nothing: a key that is no key of the tree, or not greater than the one before, ends
// the walk with a message (and with it every ring of leaves); --keep-going passes it over.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "hfs/records/key_text.h"
#include "tool/node_reader.h"
#include "tool/session.h"

namespace VELK::tool {

using LeafRecord = NodeRecord;

class LeafCursor {
public:
    LeafCursor(Session* session, u32 fileId, bool keepGoing);
    LeafCursor(const LeafCursor&) = delete;
    LeafCursor& operator=(const LeafCursor&) = delete;
    ~LeafCursor() { path_.ClearPath(); }

    // Places the cursor before the first record, or before the first one not below `key`.
    // Throws ToolError. `*found` (optional): the key is there.
    void SeekFirst();
    void Seek(const SearchKey& key, bool* found);
    // The second where there is a key, else the first.
    void SeekFrom(const std::optional<SearchKey>& from);

    // Delivers the next record; false at the end. Throws ToolError.
    bool Next(LeafRecord* record);

private:
    enum class KeyState { kSound, kUnsound, kNotAbove };

    bool EnterNextLeaf();
    bool OpenLeaf(u32 nodeNum);
    void StandOnLeaf();
    u32 DamagedChild() const;
    u32 SiblingInIndex(u32 damaged);
    bool IsOverdue() const;
    bool PassOver(u32 damaged);
    KeyState TakeKey(const LeafRecord& record);
    void Damaged(u32 node, int status, const std::string& detail);
    SearchKey& Last() { return keys_[last_]; }

    Session* session_;
    CBTreeHfs* tree_;
    u32 fileId_;
    bool keepGoing_;
    bool isSound_ = false;  // the path stands on a leaf
    bool hasLast_ = false;  // Last() is a key that was delivered, not the one sought
    u32 last_ = 0;
    u32 count_ = 0;  // records of the current leaf
    u32 index_ = 0;  // next one to deliver
    u64 leaves_ = 0;
    u64 requests_ = 0;  // nodes asked for on the way from leaf to leaf
    HfsFindData path_;
    SearchKey keys_[2];  // the last one, and the next one while it is compared
    RecordReader reader_;
    std::vector<u8> record_;  // iteration delivers a record whenever it enters a leaf
};

}  // namespace VELK::tool
