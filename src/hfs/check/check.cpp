// The stages of a run, in their order, and the single tree in memory.
#include "hfs/check/check.h"

#include <algorithm>
#include <cstring>

#include "hfs/check/check_records.h"
#include "hfs/check/check_volume.h"

namespace VELK {
namespace {

enum StageIndex : u32 {
    kStageHeader,
    kStageExtents,
    kStageCatalog,
    kStageAttributes,
    kStageBadBlocks,
    kStageCross
};

constexpr struct {
    const char* title;
    u32 tree;
} kStages[kCheckStages] = {{"volume header", 0},
                           {"extents tree", kExtentsFileId},
                           {"catalog tree", kCatalogFileId},
                           {"attributes tree", kAttributesFileId},
                           {"bad-block list", 0},
                           {"trees against each other", 0}};

// Leaf records of the extents tree: those of special files extend their forks, the others are kept
// for later.
void TakeOverflow(void* self, const CheckTree& tree, const CheckNode& node, u32 index,
                  const CheckRecord& record) {
    auto* state = static_cast<CheckVolumeState*>(self);
    const u32 fileId = Load32(record.key + kExtKeyFileId);
    const u8 forkType = record.key[kExtKeyForkType];
    const u32 startBlock = Load32(record.key + kExtKeyStartBlock);
    CheckFork* fork =
        forkType == kForkData && fileId != kExtentsFileId ? state->ForkOf(fileId) : nullptr;
    u64 blocks = 0;
    u8 runs = 0;
    const bool continues = fork != nullptr && startBlock == fork->blocks;
    for (u32 i = 0; i < kExtentCount; ++i) {
        const u8* extent = record.data + i * kExtentSize;
        const u32 count = Load32(extent + 4);
        if (count == 0) {
            break;
        }
        blocks += count;
        ++runs;
        if (continues) {
            fork->runs.push_back({Load32(extent), count});
            fork->blocks += count;
        }
    }
    if (fork != nullptr) {
        if (!continues) {
            state->run->Error(CheckId::V04, tree.Place(node.nodeNum, node.Start(index), index),
                              CheckPrint("extents of the %s file start at block %u, expected %llu",
                                         CheckFileName(fileId), startBlock,
                                         static_cast<unsigned long long>(fork->blocks)),
                              fork->blocks, startBlock);
        }
        return;
    }
    const CheckOverflow overflow = {fileId,
                                    startBlock,
                                    node.nodeNum,
                                    static_cast<u32>(std::min<u64>(blocks, 0xFFFFFFFFu)),
                                    static_cast<u16>(index),
                                    forkType,
                                    runs,
                                    false};
    if (fileId == kBadBlockFileId) {
        state->badBlocks.push_back(overflow);
    } else if (state->run->IsFull()) {
        state->overflow.push_back(overflow);
    }
}

CheckNameOrder NameOrderOf(const CheckVolumeState& state, const CheckFile& file) {
    u8 compare = 0;
    const bool isBinary = state.header.IsHfsx() &&
                          file.Read(kHeadKeyCompareType, &compare, 1) == 0 &&
                          compare == kKeyCompareBinary;
    return isBinary ? CheckNameOrder::kBinary : CheckNameOrder::kFolding;
}

// H09: what the compare byte says against what the volume's version lets it mean.
void CheckCompareType(const CheckVolumeState& state, const CheckTree& tree) {
    const u32 type = tree.header.keyCompareType;
    if (tree.nodeSize == 0) {
        return;
    }
    const bool isBinary = type == kKeyCompareBinary;
    const bool isKnown = type == 0 || type == kKeyCompareFolding || isBinary;
    const CheckPlace place = tree.HeaderPlace(kHeadKeyCompareType);
    if (tree.FileId() != kCatalogFileId) {
        if (type != 0) {
            state.run->Info(
                CheckId::H09, place,
                CheckPrint("keyCompareType is 0x%02x, it has no meaning in this tree", type));
        }
    } else if (!state.header.IsHfsx() && (isBinary || !isKnown)) {
        state.run->Info(CheckId::H09, place,
                        CheckPrint("keyCompareType is 0x%02x, on an H+ volume names are "
                                   "case-insensitive all the same",
                                   type));
    } else if (state.header.IsHfsx() && (type == 0 || !isKnown)) {
        state.run->Info(CheckId::H09, place,
                        CheckPrint("keyCompareType is 0x%02x, expected 0xbc or 0xcf; taken as "
                                   "case-insensitive",
                                   type));
    }
}

// Checks the tree in the fork of `fileId` as the present stage.
void CheckForkTree(CheckVolumeState* state, u32 fileId, std::unique_ptr<CheckFile>* file,
                   std::unique_ptr<CheckTree>* tree) {
    const CheckFork& fork = *state->ForkOf(fileId);
    *file = state->MakeFile(fork);
    CheckKeyKind kind = {fileId, CheckNameOrder::kBinary};
    if (fileId == kCatalogFileId) {
        kind.names = NameOrderOf(*state, **file);
    }
    *tree = std::make_unique<CheckTree>(state->run, file->get(), kind);
    (*tree)->logicalSize = fork.logicalSize;
    (*tree)->keepsLeaves = state->run->IsFull();
    if (fileId == kExtentsFileId) {
        (*tree)->visitor = {state, TakeOverflow};
    }
    CheckWholeTree(tree->get());
    CheckCompareType(*state, **tree);
}

bool IsTreeWanted(const CheckRun& run, u32 fileId) {
    return run.IsFull() || run.ReportsOn(fileId);
}

// Whether another tree's file may continue in the extents tree.
bool NeedsExtents(CheckVolumeState* state) {
    for (const CheckFork& fork : state->forks) {
        if (fork.blocks < fork.totalBlocks) {
            return true;
        }
    }
    return false;
}

void RunTreeStages(CheckVolumeState* state) {
    CheckRun* run = state->run;
    if (IsTreeWanted(*run, kExtentsFileId) || NeedsExtents(state) ||
        run->ReportsOn(kBadBlockFileId)) {
        run->UseStage(kStageExtents);
        CheckForkTree(state, kExtentsFileId, &state->extentsFile, &state->extents);
    }
    if (run->IsStopped()) {
        return;
    }
    CheckStage* header = run->UseStage(kStageHeader);
    CheckSpecialForks(state);
    CloseStage(run, header);
    if (IsTreeWanted(*run, kCatalogFileId) && !run->IsStopped()) {
        run->UseStage(kStageCatalog);
        CheckForkTree(state, kCatalogFileId, &state->catalogFile, &state->catalog);
    }
    CheckStage* attributes = run->UseStage(kStageAttributes);
    if (state->ForkOf(kAttributesFileId)->totalBlocks == 0 &&
        state->ForkOf(kAttributesFileId)->runs.empty()) {
        attributes->verdict = CheckVerdict::kNone;
    } else if (IsTreeWanted(*run, kAttributesFileId) && !run->IsStopped()) {
        CheckForkTree(state, kAttributesFileId, &state->attributesFile, &state->attributes);
    }
}

void RunBadBlocks(CheckVolumeState* state) {
    CheckStage* stage = state->run->UseStage(kStageBadBlocks);
    if (state->extents == nullptr || state->run->IsStopped()) {
        return;
    }
    if (!state->extents->isWhole) {
        stage->why = "the extents tree is damaged";
        return;
    }
    CheckBadBlocks(state);
    CloseStage(state->run, stage);
}

void RunCross(CheckVolumeState* state) {
    CheckRun* run = state->run;
    CheckStage* stage = run->UseStage(kStageCross);
    if (!run->IsFull()) {
        stage->why = "needs --full";
        return;
    }
    if (run->IsStopped()) {
        return;
    }
    const CheckTree* trees[] = {state->extents.get(), state->catalog.get(),
                                state->attributes.get()};
    for (const CheckTree* tree : trees) {
        if (tree != nullptr && (!tree->isWhole || tree->hasLostRecords)) {
            stage->why = "a tree is damaged";
            return;
        }
    }
    CheckItems(state);
    CheckSpace(state);
    for (CheckTree* tree : {state->extents.get(), state->catalog.get(), state->attributes.get()}) {
        if (tree != nullptr && !run->IsStopped()) {
            CheckDescents(tree);
        }
    }
    CloseStage(run, stage);
}

void NameStages(CheckSummary* summary) {
    summary->stageCount = kCheckStages;
    for (u32 i = 0; i < kCheckStages; ++i) {
        summary->stages[i].title = kStages[i].title;
        summary->stages[i].tree = kStages[i].tree;
    }
}

struct FlatBytes {
    const u8* bytes;
};

int ReadFlat(void* self, u64 offset, void* target, std::size_t size) {
    std::memcpy(target, static_cast<FlatBytes*>(self)->bytes + offset, size);
    return 0;
}

}  // namespace

void CheckBadBlocks(CheckVolumeState* state) {
    CheckRun* run = state->run;
    u64 expected = 0;
    for (const CheckOverflow& record : state->badBlocks) {
        const CheckPlace place = state->extents->Place(record.nodeNum, kDescSize, record.record);
        if (record.forkType != kForkData) {
            run->Error(CheckId::R07, place, "bad blocks under the resource fork");
            continue;
        }
        if (record.startBlock != expected) {
            run->Error(CheckId::R07, place,
                       CheckPrint("bad blocks start at %u, expected %llu", record.startBlock,
                                  static_cast<unsigned long long>(expected)),
                       expected, record.startBlock);
            expected = record.startBlock;
        }
        expected += record.blocks;
        run->Stage()->runs += record.runs;
    }
    if (!state->badBlocks.empty() && (state->header.attributes & kVolAttrSparedBlocks) == 0) {
        run->Warn(CheckId::R07, state->HeaderPlace(kVolAttributes),
                  "there are bad-block records, the volume header has no mark of them (0x200)");
    }
}

CheckSummary CheckVolume(const CheckSource& source, const CheckOptions& options,
                         const CheckSink& sink) {
    CheckRun run(source, options, sink);
    NameStages(run.Summary());
    CheckVolumeState state(&run);
    CheckStage* header = run.UseStage(kStageHeader);
    const bool goesOn = CheckVolumeHeaders(&state);
    CloseStage(&run, header);
    if (!goesOn) {
        for (u32 i = kStageExtents; i < kCheckStages; ++i) {
            run.Summary()->stages[i].why = "the volume header is damaged";
        }
        return *run.Summary();
    }
    if (!run.IsStopped()) {
        RunTreeStages(&state);
    }
    RunBadBlocks(&state);
    RunCross(&state);
    return *run.Summary();
}

CheckSummary CheckTreeBytes(const void* bytes, std::size_t size, const CheckTreeKind& kind,
                            const CheckOptions& options, const CheckSink& sink) {
    FlatBytes flat = {static_cast<const u8*>(bytes)};
    CheckRun run({&flat, ReadFlat, size, 0}, options, sink);
    run.Summary()->stageCount = 1;
    run.Stage()->title = CheckFileName(kind.fileId);
    run.Stage()->tree = kind.fileId;
    CheckFile file(&run, kind.fileId);
    file.AddRun(0, size);
    CheckTree tree(&run, &file, {kind.fileId, kind.names});
    tree.logicalSize = size;
    tree.anyData = kind.anyData;
    tree.keepsLeaves = run.IsFull();
    CheckWholeTree(&tree);
    if (run.IsFull() && tree.isWhole) {
        CheckDescents(&tree);
        CloseStage(&run, run.Stage());
    }
    return *run.Summary();
}

}  // namespace VELK
