// Opening a tree: geometry from the volume, header record from node 0, checks against fixed limits,
// comparator by tree kind.
#include "hfs/treehfs/tree_open.h"

#include "hfs/treehfs/cache.h"
#include "hfs/treehfs/header_record.h"
#include "hfs/treehfs/report.h"
#include "hfs/treehfs/scratch.h"
#include "platform/heap.h"

namespace VELK {

namespace {

constexpr u32 kNodeCharge = 80;     // bookkeeping bytes accounted per cached node
constexpr u32 kObjectCharge = 520;  // bytes accounted for the tree object

int BadHeader(int site) {
    return Fail(kErrCorrupt, kReasonHeader, site);
}

// Node 0 can be read before the node size is known: as one map block.
void SetProvisionalGeometry(CBTreeHfs* tree) {
    CFileSystemHfs* volume = tree->volume;
    BTHeaderMem* header = &tree->header;
    header->cache = &volume->cache;
    header->blockShift = volume->mapBlockShift;
    header->blockSize = volume->mapBlockSize;
    header->blockMask = header->blockSize - 1;
    header->blocksPerNode = 1;
    header->nodeSize = header->blockSize;
    tree->nodeShift = header->blockShift;
    tree->validNodes = 1;
}

// Reads the header record. Two references are dropped for the one taken, so that node 0, mapped
// with the provisional geometry, never stays cached.
int LoadHeader(CBTreeHfs* tree) {
    HfsNode* node0 = nullptr;
    HFS_TRY(FetchNode(tree, 0, NodeUse::kRead, &node0), 2231);
    ReadHeaderRecord(tree, node0);
    node0->refCount -= 1;
    DropNode(tree, node0);
    return kOk;
}

// log2 of a power of two from 1024 to 2^25; anything else counts as 9, also sizes that are no power
// of two: such trees open.
u32 NodeShiftOf(u32 nodeSize) {
    for (u32 shift = 10; shift <= 25; ++shift) {
        if (nodeSize == 1u << shift) {
            return shift;
        }
    }
    return kMinNodeShift;
}

int SetNodeGeometry(CBTreeHfs* tree) {
    BTHeaderMem* header = &tree->header;
    if (header->nodeSize != header->blockSize) {
        tree->nodeShift = NodeShiftOf(header->nodeSize);
        header->blocksPerNode = header->nodeSize >> header->blockShift;
        if (header->blocksPerNode == 0) {
            HFS_TRACE("r=%x: node size %x < map block %x\n", tree->fileId, header->nodeSize,
                      header->blockSize);
            return Fail(kErrInvalid, kReasonInvalid, 2272);
        }
    }
    HFS_ASSERT(header->nodeSize == 1u << tree->nodeShift, 2278);
    if (tree->nodeShift < kMinNodeShift || tree->nodeShift > kMaxNodeShift) {
        HFS_TRACE("Unsupported node size %u\n", header->nodeSize);
        return BadHeader(2283);
    }
    return kOk;
}

int CheckHeader(const CBTreeHfs* tree) {
    const BTHeaderMem& header = tree->header;
    if ((header.attributes & kBTBigKeysMask) == 0) {
        HFS_TRACE("HFS+ tree must use big keys\n");
        return BadHeader(2290);
    }
    const u32 total = header.totalNodes;
    if (header.freeNodes >= total || header.rootNode >= total || header.firstLeafNode >= total ||
        header.lastLeafNode >= total) {
        HFS_TRACE("HFS+ tree header: (f=%x, r=%x, fL=%x, lL=%x) >= total %x\n", header.freeNodes,
                  header.rootNode, header.firstLeafNode, header.lastLeafNode, total);
        return BadHeader(2300);
    }
    if (header.treeDepth > kMaxOpenDepth) {
        HFS_TRACE("HFS+ tree depth %x is too big (max=%x)\n", header.treeDepth, kMaxOpenDepth);
        return BadHeader(2307);
    }
    if (tree->btreeType != 0x00 && tree->btreeType != 0x80 && tree->btreeType != 0xFF) {
        HFS_TRACE("Unknown HFS+ tree type %x\n", tree->btreeType);
        return BadHeader(2315);
    }
    return kOk;
}

int ChooseComparator(CBTreeHfs* tree) {
    switch (tree->fileId) {
        case kCatalogFileId: {
            const bool binary =
                tree->volume->version == kVersionHfsx && tree->keyCompareType == kKeyCompareBinary;
            tree->compareKeys = binary ? CompareCatKeysCaseBin : CompareCatKeysCaseIns;
            break;
        }
        case kAttributesFileId:
            tree->compareKeys = CompareAttrKeys;
            break;
        case kExtentsFileId:
            tree->compareKeys = CompareExtentKeysPlus;
            break;
        default:
            return Fail(kErrInvalid, kReasonUnknown, 2331);
    }
    RepairAttributes(tree);
    return kOk;
}

int CheckLogicalSize(const CBTreeHfs* tree) {
    const CFileSystemHfs* volume = tree->volume;
    const HfsFork* fork = tree->volume->ForkOf(tree->fileId);
    const u64 nodes =
        (static_cast<u64>(fork->totalBlocks) << volume->allocBlockShift) >> tree->nodeShift;
    if (tree->header.totalNodes > nodes) {
        HFS_TRACE("HFS+ tree total nodes %x is out of logical size %x nodes\n",
                  tree->header.totalNodes, static_cast<u32>(nodes));
        return BadHeader(2362);
    }
    return kOk;
}

}  // namespace

CBTreeHfs::CBTreeHfs() {
    modifiedList.Init();
}

void RepairAttributes(CBTreeHfs* tree) {
    constexpr u32 kNeeded = kBTBigKeysMask | kBTVariableIndexKeysMask;
    if (tree->fileId == kExtentsFileId) {
        return;
    }
    HFS_ASSERT((tree->header.attributes & kNeeded) == kNeeded, 2340);
    tree->header.attributes |= kNeeded;
}

int CBTreeHfs::Init() {
    SetProvisionalGeometry(this);
    // The steps report at their own sites; passing their status on here adds none.
    int status = LoadHeader(this);
    if (status == kOk) {
        status = SetNodeGeometry(this);
    }
    if (status == kOk) {
        status = CheckHeader(this);
    }
    if (status == kOk) {
        status = ChooseComparator(this);
    }
    if (status == kOk) {
        status = CheckLogicalSize(this);
    }
    if (status != kOk) {
        return status;
    }
    validNodes = header.totalNodes;
    velk_heap_free(scratch);
    scratch = nullptr;
    status = EnsureScratch(this);
    if (status != kOk) {
        return status;
    }
    HFS_TRACE("%s nodes: total %x, free %x, size %x\n", TreeName(fileId), header.totalNodes,
              header.freeNodes, header.nodeSize);
    return kOk;
}

u64 CBTreeHfs::GetMemSize(bool withObject) const {
    const u64 nodes = (static_cast<u64>(header.nodeSize) + kNodeCharge) * nodeCount;
    return withObject ? nodes + kObjectCharge : nodes;
}

}  // namespace VELK
