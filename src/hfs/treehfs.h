// The B-tree engine: one CBTreeHfs serves one B-tree file of an HFS+ volume (extents 3, catalog 4,
// attributes 8). See src/hfs/format.h for the layout of nodes, src/hfs/fshfs.h for what a volume
// supplies, docs/porting.md for how to plug one in.
//
// Every operation returns a status (platform/error.h). Optional outputs come as a buffer, its
// capacity and the delivered size; a null buffer means the output is not wanted. A null
// HfsFindData* means the tree's own `findData`. One thread at a time per tree.
#pragma once

#include "hfs/format.h"
#include "hfs/fshfs.h"
#include "platform/error.h"
#include "platform/list.h"
#include "platform/rbtree.h"
#include "platform/types.h"

namespace VELK {

// The header record (HFS+ volume format, B-tree header record) in host order, and the node geometry
// every accessor needs. In an empty tree root, first and last leaf, records and depth are 0.
struct BTHeaderMem {
    u32 rootNode;           // node number
    u32 leafRecords;        // records in all leaves
    u32 firstLeafNode;      // node number of the leaf with the smallest keys
    u32 lastLeafNode;       // node number of the leaf with the greatest keys
    u32 totalNodes;         // nodes of the file, used or free; the header node counts
    u32 freeNodes;          // nodes whose bit in the map is clear
    u32 clumpSize;          // bytes
    u32 attributes;         // kBT...Mask
    u32 nodeSize;           // bytes
    u16 treeDepth;          // levels; height of the root
    u16 maxKeyLength;       // bytes, without the length field; the size of keys that do not vary
    HfsBufferCache* cache;  // the volume's, which lent the blocks
    u32 blockSize;          // map block, bytes
    u32 blockMask;          // blockSize - 1
    u32 blocksPerNode;      // map blocks a node lies in
    u8 blockShift;          // log2 of blockSize
};

// One record of a node: where its bytes lie, piece by piece.
struct NodeKey {
    u32 offset;          // node offset of the record's first byte, its key length field
    u32 firstBytes;      // bytes from `ptr` to the end of its block
    u8* ptr;             // address of the record's first byte
    u8* next1;           // the block after that one, null past the node
    u8* next2;           // the second block after it, null past the node
    u32 size;            // bytes of the record (GetFreeKey: free bytes)
    u32 entryPos;        // node offset of the record's slot in the offset table
    u8* entry;           // address of that slot
    u32 entryBytes;      // bytes from `entry` to the end of its block
    u32 keySize;         // key length field and key; 0 for keyless records
    u32 dataSize;        // `size` less the padded key; 0 for keyless records
    u32 dataFirstBytes;  // bytes from `data` to the end of its block
    u8* data;            // null for keyless records
    u8* dataNext1;       // the next block if the data reaches into it
    u8* dataNext2;       // the second next block if the data reaches into it
};

// One byte position of a node.
struct NodePtr {
    u32 offset;      // bytes from the node's start
    u32 firstBytes;  // bytes from `ptr` to the end of its block
    u8* ptr;         // its address
    u8* next1;       // the following block, null past the node
    u8* next2;       // always null
};

struct HfsNode;

// What an index node remembers of one of its records: the order of its key, and the cached child it
// leads to. It stands beside the red-black tree of cached nodes, never instead of it.
struct HfsHint {
    u64 order;       // parent and first two units of the key as one number; 0: not known
    HfsNode* child;  // not counted; null: not known to be cached
    const u8* data;  // the child's first block
};

// The hints of an index node, by record. Allocated with room for as many records as the tree's node
// size allows.
struct HfsHintTable {
    u32 used;          // hints from here on are empty
    HfsHint hints[1];  // as many as there is room for
};

// A cached node. Its bytes are the blocks of `bufs` one after the other, which may lie apart in
// memory. Allocated with room for blocksPerNode blocks.
struct HfsNode {
    rb_node link;            // by nodeNum; first member
    u32 nodeNum;             // its place in the file: byte nodeNum << nodeShift
    s32 refCount;            // references held; 0: cached all the same, -1: discarded
    list_head modifiedLink;  // linked to itself when no block is dirty
    HfsNode* hintedBy;       // the one node whose hints lead to this one; null: none
    HfsHintTable* hints;     // of an index node, in the node's own heap block; null: none
    u32 hintedAt;            // record of that hint, unless records came or left before it since
    bool isOnePiece;         // its blocks lie one behind the other in memory
    HfsBcbBuf bufs[1];       // the blocks, in order; blocksPerNode of them

    // Accessors (node_access.cpp). They change nothing and return 0 or kErrCorrupt, reported with
    // reason 15; a failed one may leave its output partly filled. `hdr` is the tree's header.

    // Where record `index` lies, and its key and data in it.
    int GetKey(const BTHeaderMem* hdr, int index, NodeKey* out) const;
    // Where the free space lies. REQUIRES: `index` is the number of records.
    int GetFreeKey(const BTHeaderMem* hdr, unsigned index, NodeKey* out) const;
    // Where node byte `offset` lies.
    int GetPtr(const BTHeaderMem* hdr, unsigned offset, NodePtr* out) const;
    // The child that record `index` of an index node leads to.
    int GetChildNodeNum(const BTHeaderMem* hdr, int index, unsigned* child) const;
    // Bytes between the last record and the offset table.
    int GetNodeFreeSize(const BTHeaderMem* hdr, unsigned* freeBytes) const;
    // Bytes of record `index`, key, padding and data.
    int GetRecordSize(const BTHeaderMem* hdr, int index, unsigned* size) const;
};

// Length of a key in a node (big-endian), or of one in host order: its own length field for leaves
// and for trees with variable index keys, else the header's maxKeyLength.
unsigned GetKeyLength(const BTHeaderMem* hdr, const BTreeKey* key, bool leaf);
unsigned GetKeyLengthLe(const BTHeaderMem* hdr, const BTreeKey* key, bool leaf);

// Comparators (keys_compare.cpp): search key in host order, 4-byte aligned, its parent or file ID
// passed as `id` and not read from the key; node key as stored, big-endian. Positive: the search
// key sorts after the node key. They trust the lengths in both keys.
using CompareKeysFn = int (*)(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey);
// Catalog keys by parent, then by name: regardless of case, or by code units. Extents keys by file,
// fork type and start block. Attributes keys by file, name (code units) and start block.
int CompareCatKeysCaseIns(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey);
int CompareCatKeysCaseBin(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey);
int CompareExtentKeysPlus(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey);
int CompareAttrKeys(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey);

// One level of a search path.
struct HfsFindLevel {
    HfsNode* node;  // counted reference, or null
    s32 index;      // record; in a leaf also the insertion point
};

// A search path: where a lookup, iteration or change stands. path[1] is the leaf.
struct HfsFindData {
    u32 level = 0;        // level of the position: 1, or 0 for none
    u32 searchCount = 0;  // raised each time the path is positioned
    bool valid = false;   // it stands on a record, or where one would be inserted
    HfsFindLevel path[kMaxPathDepth + 1] = {};  // by level, 1 the leaves; entry 0 is not used
    u64 leadsAsOf = 0;  // the tree's pathVersion when a lookup filled the path; 0: moved since

    // Releases every node the path holds; leaves the other fields as they are.
    // REQUIRES: the tree the nodes belong to was neither torn down nor restored meanwhile.
    void ClearPath();
};

// Conversion between the host form of keys and records, which callers pass and receive, and the
// big-endian form in nodes. Sizes are bytes and may cut a record short: a hook converts no more
// than `size`. A null function pointer copies the bytes unchanged.
struct HfsConvert {
    u16 minKeyBuffer;   // smallest key buffer callers of lookup and iteration must offer
    u16 minDataBuffer;  // smallest record buffer
    void (*KeyToDisk)(void* target, const void* source);                   // length field included
    void (*KeyToMemory)(void* target, const void* source, unsigned size);  // `size` bytes of a key
    void (*DataToDisk)(void* target, const void* source, unsigned size);   // a record on its way in
    void (*DataToMemory)(void* target, const void* source, unsigned size);  // one on its way out
};

// A key with its data on the way into a node.
struct InsertKey {
    HfsConvert* convert;       // null: key and data are in disk form (all separators)
    const BTreeKey* key;       // the caller's, in the form `convert` takes
    u32 keyLength;             // recorded in the stored key's length field
    const void* data;          // the caller's; a child's number, big-endian, for index records
    u32 dataSize;              // bytes; 4 for index records
    bool replacesSeparator;    // new separator of a child whose first key changed
    bool secondKeyFollows;     // a second key goes into the same node right after this one
    HfsNode* child = nullptr;  // the cached child of an index record, if it is at hand
    bool wasRefused = false;   // the node has said already that it has no room
};

// A reservation of nodes (space_reserve.cpp).
struct BTReserve {
    u32 nodes;   // promised by this reservation
    u32 used;    // for the volume's use; ReserveSpace sets 0
    bool owner;  // this reservation opened the tree's; otherwise it joined an open one
};

// Default clump size in bytes of a tree file (space_clump.cpp). Sizes in bytes; blockSize and
// nodeSize powers of two.
unsigned GetHfsClumpSize(unsigned blockSize, unsigned nodeSize,
                         const unsigned long long& volumeSize, unsigned fileId);

// One B-tree file of a volume.
//
// An object is made empty, told its `volume`, `fileId`, `runs` and `convert`, and brought to life
// by Init (a tree that is there) or Create (a new one). Operations in the first groups are for
// drivers; those that take nodes and levels are the steps they are made of, public so that each can
// be tested and reused alone.
//
// Contracts that hold for all of them:
// - A status is 0 or a value of platform/error.h. Besides those named below, each operation may
//   return what the volume's services returned, kErrNoMemory, and kErrCorrupt for bytes that cannot
//   be right. A failure is reported step by step (VELKError) before it is returned; an answer such
//   as kErrNotFound is not.
// - Keys and records that callers give and get are in host form, as `convert` defines it.
// - Operations that change bytes ask SetDirty first. When one fails with anything but kErrNotFound,
//   kErrExists or kErrTooLarge, its nodes may be half-changed: the volume ends its transaction,
//   drops all paths and calls RestoreModifiedNodes on each of its trees.
// - Nothing here locks, and no service of the volume may call back into a tree.
//
// Example, an exact lookup:
//
//     VELK::HfsFindData path;
//     int status = tree.FindRecord(&key, parentId, &record, sizeof(record), &size, &path);
//     path.ClearPath();
class CBTreeHfs {
public:
    CBTreeHfs();
    CBTreeHfs(const CBTreeHfs&) = delete;
    CBTreeHfs& operator=(const CBTreeHfs&) = delete;

    // Opens the tree in its fork: geometry from the volume, header record from node 0, both checked
    // against the limits of the format (format.h). Nothing is written; no node stays cached.
    // REQUIRES: `volume` and `fileId` set, nothing cached.
    // kErrInvalid: a file ID other than 3, 4, 8; nodes smaller than the volume's map block.
    // kErrCorrupt: a header that cannot be right. After a failure only Dtor may follow.
    int Init();
    // True when the header or the map changed since the last Flush.
    bool IsDirty() const { return isDirty; }
    // Bytes that a volume accounts for the cached nodes, and with `withObject` for the object too.
    u64 GetMemSize(bool withObject) const;

    // Gives node `nodeNum` with a reference of the caller's, from the cache or mapped from the
    // volume. `makeEmpty` gives it zeroed and marked modified, with its first offset slot written.
    // kErrCorrupt: a number not below `totalNodes`, unless made empty. `*out` is null on failure.
    int GetINode(unsigned nodeNum, HfsNode** out, bool makeEmpty);
    // Gives a reference back. The node leaves the cache with its last one, and what was changed in
    // it is lost: for the volume, on nodes it knows to be clean. The flag is ignored.
    void PutINode(HfsNode* node, bool ignored);

    // Announces a change of `length` bytes at node offset `offset`: gets the journal's access for
    // each clean block they lie in and lists the node as modified. No byte may change before. A
    // change behind a search is announced anew, also in a block that is dirty: what searches
    // remember of the node is void with the announcement.
    int SetDirty(HfsNode* node, unsigned offset, unsigned length);
    // The same for the one block that holds `offset`.
    int SetDirty(HfsNode* node, unsigned offset);
    // Announces and zeroes the whole node.
    int Zero(HfsNode* node);
    // Hands the node's dirty blocks to the volume (DirtyMeta). A block that was refused stays
    // dirty.
    int FlushINode(HfsNode* node);
    // Hands over all dirty blocks and drops the modified nodes that nobody holds.
    int Clear();

    // Checkpoint: writes the header record into node 0 if it changed, and hands over all dirty
    // blocks. The tree's own path is released. `mode` 4 also zeroes the nodes of the file that
    // never held data, on the volume; 0 does not. Whether bytes are then on disk is the volume's
    // business.
    int Flush(unsigned long mode);
    // Drops all nodes, dirty or not, and the scratch memory. Init may follow.
    void Dtor();
    // Drops every change since the last Flush and reads the header again.
    // REQUIRES: no path but the tree's own holds nodes. If IsDirty() is still true afterwards the
    // header could not be read: the volume goes read-only.
    void RestoreModifiedNodes();

    // Lets the path hold node `nodeNum` at `level` (1 the leaves, at most 15), index 0, instead of
    // the node it holds there. kErrCorrupt: a node of another level or kind.
    int ReadLevel(int level, unsigned nodeNum, HfsFindData* fd);
    // Looks `key` up; `keyArg` is the ID the comparator takes: parent ID of a catalog key, file ID
    // of an extents or attributes key. An absent key is status 0 and `*found` false; the path then
    // stands where it would be inserted. `record` and `keyOut` (each may be null) take as many
    // bytes as their sizes say on entry; on return these say how many were delivered.
    int FindEntry(const BTreeKey* key, unsigned keyArg, HfsFindData* fd, bool* found, void* record,
                  unsigned* recordSize, void* keyOut, unsigned* keyOutSize);
    // Exact lookup of a record. kErrNotFound: no such key, or an empty tree.
    // REQUIRES: recordCapacity >= convert.minDataBuffer when `record` is given.
    int FindRecord(const void* key, unsigned keyArg, void* record, unsigned recordCapacity,
                   unsigned* recordSize, HfsFindData* fd);

    // Steps `count` records along the leaves and delivers the record there. 0 delivers the one at
    // the position, or the next leaf's first when a lookup ended behind a leaf's last record.
    // A step back over the start of a leaf lands on the first record of the leaf before.
    // kErrNotFound: over either end of the chain, or an empty tree. A record that is longer than
    // its buffer is cut. `record` must be given, `keyOut` may be null. REQUIRES: a valid path;
    // keyCapacity and recordCapacity not below the minima of `convert`.
    int IncPos(int count, void* record, unsigned recordCapacity, unsigned* recordSize, void* keyOut,
               unsigned keyCapacity, unsigned* keySize, HfsFindData* fd);
    // The position as a number that SetPos takes while the tree is unchanged: node number shifted
    // by `nodeShift`, plus the record's index; all bits set when the path holds no leaf. Also
    // converts `key` to disk form into `keyCopy`.
    u64 GetPos(const HfsFindData* fd, const CatalogKey* key, CatalogKey* keyCopy) const;
    // Goes to a position and delivers its record as IncPos does. REQUIRES: a cleared path, level 0.
    // kErrNotFound: no such node in the tree; kErrCorrupt: a node that is no leaf.
    int SetPos(const unsigned long long& pos, void* record, unsigned recordCapacity,
               unsigned* recordSize, void* keyOut, unsigned keyCapacity, unsigned* keySize,
               HfsFindData* fd);

    // Adds the extents of the bad-block file to `runs`; of the extents tree only. A volume without
    // such a file adds nothing. kErrBadRecord: its first record has not 64 bytes; kErrNoMemory: a
    // run was refused. What was added stays. Uses the tree's own path.
    int LoadBadBlocks(HfsRuns* runs);

    // Inserts a record; `keyLen` is the ID the comparator takes. Splits, grows the file and adds
    // levels as needed. An odd `dataSize` is padded with a zero.
    // kErrExists: the key is there; kErrTooLarge: longer than a node; kErrInvalid, when `dataSize`
    // is 0: no data. With these nothing changed. kErrInvalid otherwise: no room in a node of its
    // own, as only a split shows.
    int InsertRecord(const void* key, unsigned keyLen, const void* data, unsigned dataSize);
    // Removes the record of `key` or, with a null key or `usePath` and a valid path of the tree's
    // own, the one that path stands on; `keyLength` is the ID the comparator takes.
    // kErrNotFound: no such key; kErrInvalid: no position to delete at. With these nothing changed.
    int DeleteRecord(const void* key, unsigned keyLength, bool usePath);
    // Overwrites the data of the record at the tree's own position, as many bytes as it has. `key`
    // is null; a key is never written. When it fails nothing was written.
    // REQUIRES: `data` holds as many bytes as the record's data.
    int UpdateKeyAndRecord(const void* key, const void* data);

    // Makes sure that nodes for the insertions to come are there, by growing the file now.
    // `request`: the splits to be ready for, in two classes: plain ones in the low 16 bits, in the
    // high 16 bits those that may use the part of the volume kept back from others. `reserve`
    // (null: only grow) notes what was promised. kErrNoSpace: the volume has only that part left.
    int ReserveSpace(int request, BTReserve* reserve);
    // Ends the reservation that `reserve` opened: its nodes are no longer promised to anyone. A
    // reservation that only joined an open one ends with that one, so releasing it changes nothing.
    // Cannot fail; safe to repeat. Release before RestoreModifiedNodes and Dtor.
    void ReleaseSpace(BTReserve* reserve);
    // Grows the file by whole clumps until it holds `wantedNodes` nodes, or to `newFileSize` bytes
    // when given; `growBytes` replaces the fork's clump size. Never shrinks. A failure after the
    // fork was resized leaves `totalNodes` new, `freeNodes` old and the header unsaved.
    int ExtendBTree(unsigned wantedNodes, const unsigned long long* newFileSize,
                    const unsigned* growBytes);
    // Makes an empty tree in an empty fork: nodes of 1 << `nodeShift` bytes (9 to 15), the file of
    // `initialSize` bytes or one clump. The flag is ignored.
    // REQUIRES: `volume`, `fileId`, `runs` set; for a catalog or extents tree also `compareKeys`
    // and the header's `attributes` and `maxKeyLength`. kErrInvalid: a node size out of range or
    // below the map block, or no comparator. When it cannot be finished the fork is empty again,
    // unless all that was refused is memory for the object itself.
    int Create(unsigned nodeShift, unsigned char ignored, const unsigned long long* initialSize);

    // One node: opens a gap of `size` bytes at record `index` (-1: behind the last record). `key`
    // then describes its place; its `size` and slot fields are those of the free space before.
    // `*inserted` false: it does not fit, nothing changed. A failure leaves what was moved.
    int _InsertRecord(HfsNode* node, int index, unsigned size, NodeKey* key, bool* inserted);
    // One node: inserts a record. `keyLen`, when not 0, is the length its stored key claims; the
    // space follows the key's own length all the same. Exactly `dataSize` bytes are read. A null
    // `convert` takes key and data as they are. A failure after the gap was opened leaves a record
    // whose bytes are not all written.
    int _InsertKeyRecord(HfsNode* node, int index, const BTreeKey* key, unsigned keyLen,
                         const void* data, unsigned dataSize, HfsConvert* convert, bool* inserted);
    // The same where it has to fit: kErrInvalid when it does not.
    int _InsertKeyRecord(HfsNode* node, int index, const BTreeKey* key, unsigned keyLen,
                         const void* data, unsigned dataSize, HfsConvert* convert);
    // One node: removes record `index` (-1: the last one). Bytes that become free space are not
    // cleared. A failure part way leaves what was moved so far in place.
    int _DeleteRecord(HfsNode* node, int index);

    // Two nodes: moves record 0 of `right` behind the records of `left`. A failure of the deletion
    // leaves the record in both.
    int _RotateRecordLeft(HfsNode* left, HfsNode* right);
    // Two nodes: moves the last record of `left` in front of the records of `right`, likewise.
    int _RotateRecordRight(HfsNode* right, HfsNode* left);
    // Shares the records of a full `node` and one new record, to stand at `index`, with its left
    // sibling. `*outNodeNum` and `*outIndex` say where the new record went, `*moved` how many
    // records went over. `*rotated` false: the two cannot hold it together, nothing changed. A
    // failure leaves the records moved so far in the left sibling.
    int _RotateLeft(HfsNode* left, HfsNode* node, int index, const BTreeKey* key, const void* data,
                    unsigned dataSize, int* outIndex, unsigned* outNodeNum, bool* rotated,
                    unsigned* moved, HfsConvert* convert);
    // The same with an empty right sibling; places the record or fails.
    int _RotateRight(HfsNode* node, HfsNode* right, int index, const BTreeKey* key,
                     const void* data, unsigned dataSize, int* outIndex, unsigned* outNodeNum,
                     unsigned* moved, HfsConvert* convert);

    // Inserts a record at `index` of `node`, which the path holds at `level`, and carries the
    // consequences up the path.
    int InsertTree(const BTreeKey* key, const void* data, unsigned dataSize, HfsNode* node,
                   int index, int level, bool replacesSeparator, HfsFindData* path,
                   HfsConvert* convert);
    // One level of an insertion: puts one or two records (`second` may be null) into `node`, then
    // tells the parent by a call for the level above. A failure leaves the levels done so far.
    // REQUIRES: `node` is the one that the path holds at `level`; if the insertion reaches the
    // parent, the levels above are those that lead to it.
    int InsertLevel(HfsFindData* path, InsertKey* first, const InsertKey* second, HfsNode* node,
                    int index, int level);
    // Puts a record at `index` of `node`, or of `*newNode` when `nodeNum` names that one: as it is,
    // shared with the left sibling, or by a split; a root that splits gets a new root. The two
    // flags are set or left as they are. `*newNode` and `*newRoot` come back as references of the
    // caller, and so may the left sibling in `*newNode`; a failure releases them, also a node that
    // came in.
    int InsertNode(const InsertKey* insertKey, HfsNode* node, unsigned nodeNum, int index,
                   unsigned* outNodeNum, int* outIndex, HfsNode** newNode, bool* firstKeyChanged,
                   bool* enterNewNode, HfsNode** newRoot);
    // Removes the record at the path's position in `level` and what follows from it above: unlinks
    // an empty node, replaces a separator, collapses the root. A failure leaves the levels done so
    // far changed.
    int DeleteTree(int level, HfsFindData* path);

    // Bits that the map has to have for `totalNodes`: node 0's, and whole map nodes behind it.
    u32 CalcMapBits() const;
    // Steps along the map: from null to node 0, from a map node to the next. The node that comes in
    // is given back in any case; on failure none comes out. kErrCorrupt: the chain ended.
    int GetMapNode(HfsNode** node);
    // Marks the lowest free node used and gives it, empty, with a reference of the caller's.
    int AllocateNode(HfsNode** node);
    // Marks a node free. Its content is neither read nor changed.
    int FreeNode(unsigned nodeNumber);

    CFileSystemHfs* volume = nullptr;     // set before Init or Create
    rb_node* nodeRoot = nullptr;          // cached nodes by number
    list_head modifiedList;               // cached nodes with dirty blocks
    u32 nodeCount = 0;                    // nodes now cached
    u32 maxNodeCount = 0;                 // the most there have been
    u32 hitCount = 0;                     // node requests served from the cache
    u32 readCount = 0;                    // nodes mapped from the volume
    u32 writeCount = 0;                   // for the volume's use; the engine only prints it
    u32 validNodes = 0;                   // nodes below hold initialised data, others are new
    u32 fileId = 0;                       // 3, 4 or 8; set before Init or Create
    u32 nodeShift = 0;                    // log2 of the node size
    HfsRuns runs;                         // extents of the tree file, passed to the volume
    BTHeaderMem header{};                 // as node 0 holds it, or will after the next flush
    u8* scratch = nullptr;                // nodeSize bytes: keys that straddle blocks
    u8* scratchHalf = nullptr;            // its upper half: record data that straddles blocks
    u8 btreeType = 0;                     // byte kHeadBtreeType of the header record
    u8 keyCompareType = 0;                // kKeyCompare..., 0 where the header says nothing
    HfsFindData findData;                 // used when a caller passes no path
    CompareKeysFn compareKeys = nullptr;  // set by Init, before Create by the volume
    HfsConvert convert{};                 // set by the volume
    u32 reservedNodes = 0;         // promised by the open reservation and those that joined it
    u32 reservationUsed = 0;       // for the volume's use; set to 0 when one is opened
    bool reservationOpen = false;  // ReserveSpace was called with a BTReserve, and not released
    bool isDirty = false;          // header or map changed since the last flush
    u64 pathVersion = 1;  // raised when records move so that a stored path may no longer lead right
    HfsNode* rootHint = nullptr;  // the root when that is cached and was met; else null
    rb_node* lastLink = nullptr;  // of the cached node with the greatest number; null: none is
    // Cached nodes that were met again by their numbers, each where its number leads; or null.
    static constexpr u32 kLateShift = 5;
    HfsNode* lateNodes[1u << kLateShift] = {};
    // The node behind the initialised part of the file that was taken last: where it lies, how far
    // from the one before, and how many bytes of what lies as far behind it are still to be asked
    // for.
    std::uintptr_t newestNode = 0;
    std::uintptr_t newDistance = 0;
    u32 nextNodeLeft = 0;
    // Create made the tree, and since then no node was read from the volume and no record came in
    // whose key searches have something to say of.
    bool isAllOwn = false;
    // Data of more than a block came in since Create: where it lies in three, each search that
    // meets it has something to say.
    bool hasLongData = false;
    // While that is so, all nodes below are in use, and the search for the first free one, still
    // from map node to map node, looks at no bits before this one's.
    u32 noneFreeBelow = 0;
};

}  // namespace VELK
