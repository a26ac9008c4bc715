// Records of a volume's trees in the form they have on disk: big-endian bytes, key and data apart.
// Walks in key order and changes by key, for programs that keep no search path of their own.
#pragma once

#include <string>
#include <vector>

#include "hfs/records/key_text.h"
#include "hfs/treehfs.h"
#include "hfs/volume/image_volume.h"

namespace VELK {

// A record copied out of its leaf.
struct StoredRecord {
    u32 id = 0;            // parent ID of a catalog key, else the file ID
    std::vector<u8> key;   // length field included
    std::vector<u8> data;  // without the pad byte between key and data
    u32 node = 0;          // number of the leaf it lies in
    u32 index = 0;         // which record of that leaf
};

// Copies the record that a path stands on: kErrNotFound when it stands on none.
int ReadStored(const CBTreeHfs& tree, const HfsFindData& path, StoredRecord* record);
// Data as the engine takes it, in host order. The engine pads odd data, and one byte more lets it
// read a whole word.
std::vector<u8> HostData(const CBTreeHfs& tree, const std::vector<u8>& data);
// Keeps the volume's counts of files and folders in step with a record that was put in (`change` 1)
// or taken out (-1).
void CountStored(ImageVolume* volume, u32 fileId, const std::vector<u8>& data, int change);
// The key as text, as in `2:"alpha"`.
std::string KeyText(u32 fileId, const StoredRecord& record);

// By key, on tree `fileId` of a volume, which is opened when it is not yet. kErrVolumeNoTree: there
// is no such tree. kErrNotFound: no such key.
int FindStored(ImageVolume* volume, u32 fileId, const SearchKey& key, StoredRecord* record);
// The three that change records want every cursor of the volume released. They keep the volume's
// counts of files and folders in step. Every failure but kErrNotFound, kErrExists and kErrTooLarge
// has taken the volume back to its last commit.
int InsertStored(ImageVolume* volume, u32 fileId, const SearchKey& key,
                 const std::vector<u8>& data);
// The new data may have another size; the record is then taken out and put in again.
int UpdateStored(ImageVolume* volume, u32 fileId, const SearchKey& key,
                 const std::vector<u8>& data);
// Takes the record with this key out.
int DeleteStored(ImageVolume* volume, u32 fileId, const SearchKey& key);

// Walks the records of a tree in key order. Believes nothing: a key that is not greater than the
// one before ends the walk with kErrCorrupt, and with it every ring of leaves.
//
//   RecordCursor cursor(volume, kCatalogFileId);
//   StoredRecord record;
//   while (cursor.Next(&record) == kOk) ... record.key, record.data ...
class RecordCursor {
public:
    // Stands before the first record. The volume has to outlive the cursor; a tree that cannot be
    // opened shows in Next.
    RecordCursor(ImageVolume* volume, u32 fileId) : volume_(volume), fileId_(fileId) {}

    RecordCursor(const RecordCursor&) = delete;
    RecordCursor& operator=(const RecordCursor&) = delete;
    ~RecordCursor() { path_.ClearPath(); }

    // Stands before the first record whose key is not below `key`.
    void Seek(const SearchKey& key);
    // Delivers the next record; kErrNotFound at the end, any other status for a damaged tree.
    int Next(StoredRecord* record);
    // Holds no node of the tree any more, so that the tree may be changed, restored or closed. The
    // walk goes on behind the record delivered last.
    void Release();

private:
    int Step(int count);
    int Stand();
    bool TakeKey(const StoredRecord& record);

    ImageVolume* volume_;
    u32 fileId_;
    CBTreeHfs* tree_ = nullptr;  // once opened
    HfsFindData path_;
    SearchKey from_;            // stands at or behind this key
    bool isSought_ = false;     // from_ is set
    bool isDelivered_ = false;  // from_ is the key of a record that was delivered
    bool stands_ = false;       // path_ stands on the record delivered last
    std::vector<u8> room_;      // iteration delivers a host form, which nobody wants here
};

}  // namespace VELK
