// A tree from its header to its counts, and the second look at its leaves.
#include "hfs/check/check_tree.h"

#include "hfs/check/check_records.h"

namespace VELK {

bool CheckTree::CannotRead(u32 nodeNum, int status) {
    const u64 size = nodeSize == 0 ? u64{1} << kMinNodeShift : nodeSize;
    run->Unreadable({FileId(), nodeNum, -1, file->SourceOffset(nodeNum * size), {}}, size, status);
    isWhole = false;
    CheckStage* stage = run->Stage();
    if (!run->Options().keepGoing) {
        stage->verdict = CheckVerdict::kStopped;
        stage->why = "a node cannot be read";
        return false;
    }
    return true;
}

void CheckCounts(CheckTree* tree) {
    if (!tree->isWhole || tree->leafRecords == tree->header.leafRecords) {
        return;
    }
    tree->run->Warn(CheckId::H11, tree->HeaderPlace(kHeadLeafRecords),
                    CheckPrint("leafRecords is %u, counted %llu", tree->header.leafRecords,
                               static_cast<unsigned long long>(tree->leafRecords)),
                    tree->leafRecords, tree->header.leafRecords);
}

void CheckWholeTree(CheckTree* tree) {
    CheckStage* stage = tree->run->Stage();
    if (CheckHeaderNode(tree, tree->run->Options().mapBlock)) {
        CheckMap(tree);
        const bool goesOn = stage->verdict != CheckVerdict::kStopped;
        if (goesOn && tree->run->IsQuick()) {
            WalkLeafChain(tree);
        } else if (goesOn) {
            WalkTree(tree);
        }
        if (!tree->run->IsStopped()) {
            CheckCounts(tree);
            CheckMapAgainstNodes(tree);
        }
    } else {
        tree->isUsable = false;
        tree->isWhole = false;
    }
    stage->records += tree->leafRecords;
    CloseStage(tree->run, stage);
}

void CloseStage(CheckRun* run, CheckStage* stage) {
    if (run->IsStopped()) {
        stage->verdict = CheckVerdict::kStopped;
        stage->why =
            run->Options().maxErrors != 0 && run->Summary()->errors >= run->Options().maxErrors
                ? "too many errors"
                : "interrupted";
    } else if (stage->verdict != CheckVerdict::kStopped) {
        stage->verdict =
            stage->errors + stage->warnings != 0 ? CheckVerdict::kFindings : CheckVerdict::kSound;
    }
}

bool ForEachLeafRecord(CheckTree* tree, const CheckLeafVisitor& visitor) {
    CheckNodeWindow window(tree->file, tree->nodeSize);
    u64 done = 0;
    for (u32 nodeNum : tree->leaves) {
        tree->run->Step("cross", ++done, tree->leaves.size());
        int status = 0;
        CheckNode node;
        node.bytes = window.Get(nodeNum, &status);
        if (node.bytes == nullptr) {
            return false;
        }
        node.nodeNum = nodeNum;
        node.nodeSize = tree->nodeSize;
        if (node.Kind() != kBTLeafNode) {
            continue;
        }
        node.usable = CountUsableRecords(node.bytes, tree->nodeSize);
        for (u32 i = 0; i < node.usable; ++i) {
            CheckRecord record;
            if (TakeRecord(*tree, node, i, true, true, &record) && IsDataUsable(*tree, record)) {
                visitor.record(visitor.self, *tree, node, i, record);
            }
        }
        if (tree->run->IsStopped()) {
            return false;
        }
    }
    return true;
}

}  // namespace VELK
