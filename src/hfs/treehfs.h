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

// The header record in host order and the node geometry every accessor needs.
struct BTHeaderMem {
    u32 rootNode;
    u32 leafRecords;
    u32 firstLeafNode;
    u32 lastLeafNode;
    u32 totalNodes;
    u32 freeNodes;
    u32 clumpSize;  // bytes
    u32 attributes;
    u32 nodeSize;  // bytes
    u16 treeDepth;
    u16 maxKeyLength;
    HfsBufferCache* cache;
    u32 blockSize;  // map block, bytes
    u32 blockMask;
    u32 blocksPerNode;
    u8 blockShift;
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
    u32 offset;
    u32 firstBytes;
    u8* ptr;
    u8* next1;  // the following block, null past the node
    u8* next2;  // always null
};

// Shortcut from an index node to a cached child: the child, and where its first block lies. Beside
// the red-black tree of cached nodes, never instead of it.
struct HfsNode;

struct HfsNodeHint {
    HfsNode* node;  // null: none
    const u8* data;
    u32 nodeNum;
};

// A cached node. Its bytes are the blocks of `bufs` one after the other; they are not contiguous in
// memory. Allocated with room for blocksPerNode blocks and one zero entry behind them.
struct HfsNode {
    rb_node link;  // by nodeNum; first member
    u32 nodeNum;
    list_head modifiedLink;  // linked to itself when no block is dirty
    s32 refCount;            // -1: discarded by Clear
    u32 hintMask;            // entries of `hints` less one
    HfsNodeHint* hints;      // of an index node, in the node's own heap block; null: none
    HfsNodeHint* hintedBy;   // the one hint that leads to this node; null: none
    HfsBcbBuf bufs[1];

    // Accessors (node_access.cpp). They change nothing and return 0 or kErrCorrupt, reported with
    // reason 15; a failed one may leave its output partly filled.
    int GetKey(const BTHeaderMem* hdr, int index, NodeKey* out) const;
    int GetFreeKey(const BTHeaderMem* hdr, unsigned index, NodeKey* out) const;
    int GetPtr(const BTHeaderMem* hdr, unsigned offset, NodePtr* out) const;
    int GetChildNodeNum(const BTHeaderMem* hdr, int index, unsigned* child) const;
    int GetNodeFreeSize(const BTHeaderMem* hdr, unsigned* freeBytes) const;
    int GetRecordSize(const BTHeaderMem* hdr, int index, unsigned* size) const;
};

// Length of a key in a node (big-endian), or of one in host order: its own length field for leaves
// and for trees with variable index keys, else the header's maxKeyLength.
unsigned GetKeyLength(const BTHeaderMem* hdr, const BTreeKey* key, bool leaf);
unsigned GetKeyLengthLe(const BTHeaderMem* hdr, const BTreeKey* key, bool leaf);

// Comparators (keys_compare.cpp): search key in host order, 4-byte aligned, its parent or file ID
// passed as `id` and not read from the key; node key as stored, big-endian. Positive: the search
// key sorts after the node key.
using CompareKeysFn = int (*)(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey);
int CompareCatKeysCaseIns(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey);
int CompareCatKeysCaseBin(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey);
int CompareExtentKeysPlus(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey);
int CompareAttrKeys(const BTreeKey* searchKey, unsigned id, const BTreeKey* nodeKey);

struct HfsFindLevel {
    HfsNode* node;  // counted reference, or null
    s32 index;      // record; in a leaf also the insertion point
};

// A search path: where a lookup, iteration or change stands. path[1] is the leaf.
struct HfsFindData {
    u32 level = 0;        // level of the position: 1, or 0 for none
    u32 searchCount = 0;  // raised each time the path is positioned
    bool valid = false;
    HfsFindLevel path[kMaxPathDepth + 1] = {};
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
    void (*KeyToDisk)(void* target, const void* source);  // length field included
    void (*KeyToMemory)(void* target, const void* source, unsigned size);
    void (*DataToDisk)(void* target, const void* source, unsigned size);
    void (*DataToMemory)(void* target, const void* source, unsigned size);
};

// A key with its data on the way into a node.
struct InsertKey {
    HfsConvert* convert;  // null: key and data are in disk form (all separators)
    const BTreeKey* key;
    u32 keyLength;  // recorded in the stored key's length field
    const void* data;
    u32 dataSize;            // bytes; 4 for index records
    bool replacesSeparator;  // new separator of a child whose first key changed
    bool secondKeyFollows;   // a second key goes into the same node right after this one
};

// A reservation of nodes (space_reserve.cpp).
struct BTReserve {
    u32 nodes;
    u32 used;
    bool owner;  // this reservation opened the tree's; otherwise it joined an open one
};

// Default clump size in bytes of a tree file (space_clump.cpp). Sizes in bytes; blockSize and
// nodeSize powers of two.
unsigned GetHfsClumpSize(unsigned blockSize, unsigned nodeSize,
                         const unsigned long long& volumeSize, unsigned fileId);

class CBTreeHfs {
public:
    CBTreeHfs();
    CBTreeHfs(const CBTreeHfs&) = delete;
    CBTreeHfs& operator=(const CBTreeHfs&) = delete;

    // tree_open.cpp
    int Init();
    bool IsDirty() const { return isDirty; }
    u64 GetMemSize(bool withObject) const;

    // cache.cpp
    int GetINode(unsigned nodeNum, HfsNode** out, bool makeEmpty);
    void PutINode(HfsNode* node, bool ignored);

    // cache_dirty.cpp
    int SetDirty(HfsNode* node, unsigned offset, unsigned length);
    int SetDirty(HfsNode* node, unsigned offset);
    int Zero(HfsNode* node);
    int FlushINode(HfsNode* node);
    int Clear();

    // tree_flush.cpp
    int Flush(unsigned long mode);
    void Dtor();
    void RestoreModifiedNodes();

    // path_find.cpp
    int ReadLevel(int level, unsigned nodeNum, HfsFindData* fd);
    int FindEntry(const BTreeKey* key, unsigned keyArg, HfsFindData* fd, bool* found, void* record,
                  unsigned* recordSize, void* keyOut, unsigned* keyOutSize);
    int FindRecord(const void* key, unsigned keyArg, void* record, unsigned recordCapacity,
                   unsigned* recordSize, HfsFindData* fd);

    // path_iterate.cpp
    int IncPos(int count, void* record, unsigned recordCapacity, unsigned* recordSize, void* keyOut,
               unsigned keyCapacity, unsigned* keySize, HfsFindData* fd);
    u64 GetPos(const HfsFindData* fd, const CatalogKey* key, CatalogKey* keyCopy) const;
    int SetPos(const unsigned long long& pos, void* record, unsigned recordCapacity,
               unsigned* recordSize, void* keyOut, unsigned keyCapacity, unsigned* keySize,
               HfsFindData* fd);

    // badblocks.cpp
    int LoadBadBlocks(HfsRuns* runs);

    // record_insert.cpp
    int _InsertRecord(HfsNode* node, int index, unsigned size, NodeKey* key, bool* inserted);
    int _InsertKeyRecord(HfsNode* node, int index, const BTreeKey* key, unsigned keyLen,
                         const void* data, unsigned dataSize, HfsConvert* convert, bool* inserted);
    int _InsertKeyRecord(HfsNode* node, int index, const BTreeKey* key, unsigned keyLen,
                         const void* data, unsigned dataSize, HfsConvert* convert);

    // record_delete.cpp, record_move.cpp, record_update.cpp
    int _DeleteRecord(HfsNode* node, int index);
    int _RotateRecordLeft(HfsNode* left, HfsNode* right);
    int _RotateRecordRight(HfsNode* right, HfsNode* left);
    int UpdateKeyAndRecord(const void* key, const void* data);

    // balance.cpp
    int _RotateLeft(HfsNode* left, HfsNode* node, int index, const BTreeKey* key, const void* data,
                    unsigned dataSize, int* outIndex, unsigned* outNodeNum, bool* rotated,
                    unsigned* moved, HfsConvert* convert);
    int _RotateRight(HfsNode* node, HfsNode* right, int index, const BTreeKey* key,
                     const void* data, unsigned dataSize, int* outIndex, unsigned* outNodeNum,
                     unsigned* moved, HfsConvert* convert);

    // insert_entry.cpp, insert_level.cpp, insert_node.cpp
    // `keyLen` of InsertRecord and `keyLength` of DeleteRecord are the comparator's ID argument:
    // the parent ID of a catalog key, the file ID of an extents or attributes key.
    int InsertRecord(const void* key, unsigned keyLen, const void* data, unsigned dataSize);
    int InsertTree(const BTreeKey* key, const void* data, unsigned dataSize, HfsNode* node,
                   int index, int level, bool replacesSeparator, HfsFindData* path,
                   HfsConvert* convert);
    int InsertLevel(HfsFindData* path, InsertKey* first, const InsertKey* second, HfsNode* node,
                    int index, int level);
    int InsertNode(const InsertKey* insertKey, HfsNode* node, unsigned nodeNum, int index,
                   unsigned* outNodeNum, int* outIndex, HfsNode** newNode, bool* firstKeyChanged,
                   bool* enterNewNode, HfsNode** newRoot);

    // delete_tree.cpp
    int DeleteRecord(const void* key, unsigned keyLength, bool usePath);
    int DeleteTree(int level, HfsFindData* path);

    // map_walk.cpp, map_alloc.cpp
    u32 CalcMapBits() const;
    int GetMapNode(HfsNode** node);
    int AllocateNode(HfsNode** node);
    int FreeNode(unsigned nodeNumber);

    // space_extend.cpp, space_reserve.cpp
    int ExtendBTree(unsigned wantedNodes, const unsigned long long* newFileSize,
                    const unsigned* growBytes);
    int ReserveSpace(int request, BTReserve* reserve);
    // Ends the reservation that `reserve` opened: its nodes are no longer promised to anyone. A
    // reservation that only joined an open one ends with that one, so releasing it changes nothing.
    // Cannot fail; safe to repeat. Release before RestoreModifiedNodes and Dtor.
    void ReleaseSpace(BTReserve* reserve);

    // tree_create.cpp
    int Create(unsigned nodeShift, unsigned char ignored, const unsigned long long* initialSize);

    CFileSystemHfs* volume = nullptr;  // set before Init or Create
    rb_node* nodeRoot = nullptr;       // cached nodes by number
    list_head modifiedList;            // cached nodes with dirty blocks
    u32 nodeCount = 0;                 // nodes now cached
    u32 maxNodeCount = 0;
    u32 hitCount = 0;    // node requests served from the cache
    u32 readCount = 0;   // nodes mapped from the volume
    u32 writeCount = 0;  // for the volume's use; the engine only prints it
    u32 validNodes = 0;  // nodes below hold initialised data, others are new
    u32 fileId = 0;      // 3, 4 or 8; set before Init or Create
    u32 nodeShift = 0;   // log2 of the node size
    HfsRuns runs;        // extents of the tree file, passed to the volume
    BTHeaderMem header{};
    u8* scratch = nullptr;      // nodeSize bytes: keys that straddle blocks
    u8* scratchHalf = nullptr;  // its upper half: record data that straddles blocks
    u8 btreeType = 0;
    u8 keyCompareType = 0;
    HfsFindData findData;  // used when a caller passes no path
    CompareKeysFn compareKeys = nullptr;
    HfsConvert convert{};  // set by the volume
    u32 reservedNodes = 0;
    u32 reservationUsed = 0;
    bool reservationOpen = false;
    bool isDirty = false;  // header or map changed since the last flush
    u64 pathVersion = 1;  // raised when records move so that a stored path may no longer lead right
    bool isAllOwn = false;  // Create made the tree and no node was read from the volume since
};

}  // namespace VELK
