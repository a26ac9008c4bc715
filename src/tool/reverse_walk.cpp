// The walk from the last leaf to the first.
#include "tool/reverse_walk.h"

#include <fmt/format.h>

#include "tool/errors.h"

namespace VELK::tool {

namespace {

class BackwardWalk {
public:
    BackwardWalk(Session* session, u32 fileId, const KeyRange& range, bool keepGoing)
        : session_(session),
          tree_(session->Tree(fileId)),
          fileId_(fileId),
          range_(range),
          keepGoing_(keepGoing),
          reader_(tree_) {}

    void Run(const std::function<bool(const NodeRecord&)>& visit) {
        HeldNode node(tree_);
        u32 number = LastLeaf();
        for (u32 hops = 0; number != 0; ++hops) {
            if (hops >= tree_->header.totalNodes) {
                Damaged(number, kErrCorrupt, "more leaves than the tree has nodes");
                return;
            }
            const int status = node.Open(number);
            if (status != kOk || node.Kind() != kBTLeafNode) {
                Damaged(number, status != kOk ? status : kErrCorrupt, "not a leaf");
                return;
            }
            if (!Leaf(node, visit)) {
                return;
            }
            number = node.BLink();
        }
    }

private:
    void Damaged(u32 node, int status, const std::string& detail) {
        const Problem problem = session_->ProblemOf(fileId_, node, status, detail);
        if (!keepGoing_) {
            ThrowProblem(session_->Image(), problem);
        }
        session_->NotePassedOver(problem);
    }

    // The leaf in which the range ends.
    u32 LastLeaf() {
        if (!range_.to) {
            return tree_->header.lastLeafNode;
        }
        HfsFindData path;
        bool found = false;
        const int status = tree_->FindEntry(range_.to->Key(), range_.to->id, &path, &found, nullptr,
                                            nullptr, nullptr, nullptr);
        const HfsNode* leaf = path.path[1].node;
        const u32 number = leaf != nullptr ? leaf->nodeNum : 0;
        path.ClearPath();
        if (status != kOk) {
            Damaged(tree_->header.rootNode, status, "");
            return tree_->header.lastLeafNode;
        }
        return number;
    }

    // False: the walk is over.
    bool Leaf(const HeldNode& node, const std::function<bool(const NodeRecord&)>& visit) {
        NodeRecord record;
        SearchKey key;
        for (u32 i = node.RecordCount(); i-- > 0;) {
            const int status = reader_.Describe(node.Get(), i, &record);
            if (status != kOk || !SearchKeyFromStored(fileId_, record.key, record.keySize, &key)) {
                Damaged(node.Number(), status != kOk ? status : kErrCorrupt,
                        fmt::format("record {} cannot be read", i));
                continue;
            }
            const BTreeKey* stored = reinterpret_cast<const BTreeKey*>(record.key);
            if (hasLast_ && tree_->compareKeys(last_.Key(), last_.id, stored) <= 0) {
                Damaged(node.Number(), kErrCorrupt,
                        fmt::format("record {}: key {} is not below the one behind it", i,
                                    KeyText(fileId_, record.key, record.keySize, Blanks::kPlain)));
                continue;
            }
            last_ = key;
            hasLast_ = true;
            const int place = range_.Place(*tree_, record.key);
            if (place < 0 || (place == 0 && !visit(record))) {
                return false;
            }
        }
        return true;
    }

    Session* session_;
    CBTreeHfs* tree_;
    u32 fileId_;
    const KeyRange& range_;
    bool keepGoing_;
    RecordReader reader_;
    SearchKey last_;
    bool hasLast_ = false;
};

}  // namespace

void WalkBackwards(Session* session, u32 fileId, const KeyRange& range, bool keepGoing,
                   const std::function<bool(const NodeRecord&)>& visit) {
    BackwardWalk(session, fileId, range, keepGoing).Run(visit);
}

}  // namespace VELK::tool
