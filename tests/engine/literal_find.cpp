// See literal_find.h. Only the accessors of one node are the engine's; they have tests of their
// own.
#include "literal_find.h"

namespace VELK::test {

LiteralFind::LiteralFind(const TreeImage& image, u32 mapBlockSize, CompareKeysFn compare)
    : image_(image), mapBlockSize_(mapBlockSize), compare_(compare) {}

const LooseNode& LiteralFind::NodeOf(u32 nodeNum) {
    std::unique_ptr<LooseNode>& node = nodes_[nodeNum];
    if (node == nullptr) {
        node = std::make_unique<LooseNode>(image_.Node(nodeNum), mapBlockSize_, nodeNum);
    }
    return *node;
}

int LiteralFind::Fail(u32 reason, int site) {
    events_.push_back(Reported(reason, site));
    return kErrCorrupt;
}

int LiteralFind::Pass(int status, int site) {
    events_.push_back(Reported(status, site));
    return status;
}

int LiteralFind::Load(u32 level, u32 nodeNum, LiteralResult* result) {
    if (nodeNum >= image_.totalNodes) {
        events_.push_back(Asserted(2638));
        return Pass(kErrCorrupt, 2909);
    }
    const Bytes node = image_.Node(nodeNum);
    if (read_.insert(nodeNum).second && read_.size() > 1 && Get16(node, node.size() - 2) != 14) {
        events_.push_back(Asserted(2671));
    }
    result->path[level] = {nodeNum, 0};
    if (node[9] != level) {
        return Fail(kReasonTree, 2916);
    }
    if (level == 1 && node[8] != 0xFF) {
        return Fail(kReasonTree, 2925);
    }
    return level > 1 && node[8] != 0 ? Fail(kReasonTree, 2934) : kOk;
}

// A key that a comparator can read.
bool LiteralFind::IsSound(const Bytes& key) const {
    const u32 length = static_cast<u32>(key.size()) - 2;
    const u32 fixed = image_.shape.fileId == 3 ? 10 : image_.shape.fileId == 4 ? 6 : 12;
    if (length > 520 || length < fixed) {
        return false;
    }
    return image_.shape.fileId == 3 || fixed + 2 * Get16(key, fixed) <= length;
}

int LiteralFind::Search(u32 nodeNum, const HostKey& key, bool* found, s32* index) {
    const Bytes bytes = image_.Node(nodeNum);
    const LooseNode& node = NodeOf(nodeNum);
    s32 low = 0;
    s32 high = static_cast<s32>(Get16(bytes, 10)) - 1;
    *found = false;
    while (low <= high) {
        const s32 middle = (low + high) / 2;
        NodeKey record{};
        Capture capture;
        const int status = node->GetKey(node.Hdr(), middle, &record);
        for (const Event& event : capture.Take()) {
            events_.push_back(event);
        }
        if (status != kOk) {
            return Pass(status, 3005);
        }
        const auto start = bytes.begin() + record.offset;
        const Bytes nodeKey(start, start + record.keySize);
        if (!IsSound(nodeKey)) {
            Fail(kReasonNode, kAnySite);
            return Pass(kErrCorrupt, 3005);
        }
        const int order = compare_(key, key.id, reinterpret_cast<const BTreeKey*>(nodeKey.data()));
        // A key at an odd place is asserted by the comparator, in a copy it is not.
        if (record.offset % 2 != 0 && record.keySize <= record.firstBytes) {
            events_.push_back(Asserted(kAnySite));
        }
        if (order == 0) {
            *found = true;
            *index = middle;
            return kOk;
        }
        (order < 0 ? high : low) = middle + (order < 0 ? -1 : 1);
    }
    *index = low;
    return kOk;
}

LiteralResult LiteralFind::Find(const HostKey& key) {
    LiteralResult result;
    events_.clear();
    u32 level = image_.depth;
    u32 nodeNum = image_.rootNode;
    while (result.status == kOk) {
        if (nodeNum == 0) {
            result.status = Fail(kReasonTree, 2980);
            break;
        }
        result.status = Load(level, nodeNum, &result);
        if (result.status != kOk) {
            Pass(result.status, 2982);
            break;
        }
        s32* index = &result.path[level].second;
        result.status = Search(nodeNum, key, &result.found, index);
        if (result.status != kOk || level == 1) {
            break;
        }
        if (!result.found && *index > 0) {
            *index -= 1;
        }
        const LooseNode& node = NodeOf(nodeNum);
        Capture capture;
        result.status = node->GetChildNodeNum(node.Hdr(), *index, &nodeNum);
        for (const Event& event : capture.Take()) {
            events_.push_back(event);
        }
        if (result.status != kOk) {
            Pass(result.status, 3095);
        }
        level -= 1;
    }
    result.events = events_;
    return result;
}

}  // namespace VELK::test
