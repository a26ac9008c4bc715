// The accessors on the bytes of one node, whatever they are: every answer lies inside the node, and
// a node of many blocks gives the same answers as the same node in one block.
//
// Input: geometry, node number, then the node.
#include "fuzz.h"
#include "node_image.h"

namespace {

using namespace VELK;

constexpr u32 kSizes[] = {512, 1024, 4096, 8192};

struct Answers {
    int keyStatus = 0;
    NodeKey key = {};
    int sizeStatus = 0;
    unsigned size = 0;
    int childStatus = 0;
    unsigned child = 0;
};

Answers Ask(const test::LooseNode& node, int index) {
    Answers answers;
    answers.keyStatus = node->GetKey(node.Hdr(), index, &answers.key);
    answers.sizeStatus = node->GetRecordSize(node.Hdr(), index, &answers.size);
    answers.childStatus = node->GetChildNodeNum(node.Hdr(), index, &answers.child);
    return answers;
}

// What a record that was delivered promises, looked up without the engine.
void CheckInside(const test::LooseNode& node, const NodeKey& key) {
    const u32 nodeSize = node.Hdr()->nodeSize;
    FUZZ_CHECK(key.size > 0 && key.offset < nodeSize && key.size <= nodeSize - key.offset);
    FUZZ_CHECK(key.ptr == node.At(key.offset));
    FUZZ_CHECK(key.firstBytes <= node.Hdr()->blockSize);
    FUZZ_CHECK(key.entry == node.At(key.entryPos));
    if (key.data != nullptr) {
        FUZZ_CHECK(key.keySize + key.dataSize <= key.size && key.dataSize > 0);
        FUZZ_CHECK(key.data == node.At(key.offset + key.size - key.dataSize));
    }
}

void CheckAlike(const Answers& one, const Answers& many) {
    // A record that reaches over four blocks is refused where blocks are small.
    if (one.keyStatus == kOk && many.keyStatus == kOk) {
        FUZZ_CHECK(one.key.offset == many.key.offset && one.key.size == many.key.size);
        FUZZ_CHECK(one.key.keySize == many.key.keySize && one.key.dataSize == many.key.dataSize);
        FUZZ_CHECK(one.childStatus == many.childStatus && one.child == many.child);
    }
    FUZZ_CHECK(one.keyStatus == kOk || many.keyStatus != kOk);
    FUZZ_CHECK(one.sizeStatus == many.sizeStatus && one.size == many.size);
}

void Look(const test::Bytes& bytes, u32 mapBlock, u32 nodeNum) {
    const test::LooseNode one(bytes, static_cast<u32>(bytes.size()), nodeNum);
    const test::LooseNode many(bytes, mapBlock, nodeNum);
    const int slots = static_cast<int>(bytes.size() / kSlotSize);
    for (int index = -1; index <= slots; ++index) {
        const Answers alone = Ask(one, index);
        const Answers split = Ask(many, index);
        if (alone.keyStatus == kOk) {
            CheckInside(one, alone.key);
        }
        if (split.keyStatus == kOk) {
            CheckInside(many, split.key);
        }
        CheckAlike(alone, split);
    }
    for (u32 offset = 0; offset <= bytes.size() + 1; ++offset) {
        NodePtr place = {};
        const int status = many->GetPtr(many.Hdr(), offset, &place);
        FUZZ_CHECK(status != kOk || offset == bytes.size() || place.ptr == many.At(offset));
    }
    unsigned freeOne = 0;
    unsigned freeMany = 0;
    const int status = one->GetNodeFreeSize(one.Hdr(), &freeOne);
    FUZZ_CHECK(status == many->GetNodeFreeSize(many.Hdr(), &freeMany) && freeOne == freeMany);
    FUZZ_CHECK(status != kOk || freeOne <= bytes.size());
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const u8* data, std::size_t size) {
    fuzz::Input input(data, size);
    const u8 geometry = input.U8();
    const u32 nodeSize = kSizes[geometry & 3];
    const u32 mapBlock = 512u << ((geometry >> 2) & 3);
    const u32 nodeNum = input.U8() & 1;
    test::Bytes bytes = input.Rest(nodeSize);
    bytes.resize(nodeSize);
    {
        const fuzz::Quiet quiet;
        Look(bytes, mapBlock < nodeSize ? mapBlock : nodeSize, nodeNum);
    }
    fuzz::CheckNothingFailed();
    return 0;
}
