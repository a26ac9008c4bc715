// Lookup as plainly as it can be said: from the root down, one record after the other as the binary
// search asks for them, with nothing remembered between two lookups but which nodes were read. The
// engine's own lookup takes short cuts; whatever the bytes, both must come to the same.
#pragma once

#include <map>
#include <memory>
#include <set>

#include "capture.h"
#include "keys.h"
#include "node_image.h"
#include "tree_image.h"

namespace VELK::test {

struct LiteralResult {
    int status = 0;
    bool found = false;
    std::map<u32, std::pair<u32, s32>> path;  // level: node number, index
    Events events;
};

class LiteralFind {
public:
    LiteralFind(const TreeImage& image, u32 mapBlockSize, CompareKeysFn compare);
    LiteralResult Find(const HostKey& key);

private:
    int Load(u32 level, u32 nodeNum, LiteralResult* result);
    int Search(u32 nodeNum, const HostKey& key, bool* found, s32* index);
    bool IsSound(const Bytes& key) const;
    int Fail(u32 reason, int site);
    int Pass(int status, int site);
    const LooseNode& NodeOf(u32 nodeNum);

    const TreeImage& image_;
    u32 mapBlockSize_;
    CompareKeysFn compare_;
    std::map<u32, std::unique_ptr<LooseNode>> nodes_;
    std::set<u32> read_;
    Events events_;
};

}  // namespace VELK::test
