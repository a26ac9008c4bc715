// The accessors on the bytes of one node, whatever they are: every answer lies inside the node, and
// a node of many blocks gives the same answers as the same node in one block.
//
// Input: geometry, node number, two pairs of a record and an offset to ask for, then the node.
#include "fuzz.h"
#include "mutate.h"
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

// What one input asks for: records and offsets of its own, beside those at the ends.
struct Questions {
    int index[2];
    u32 offset[2];
};

void CheckOffset(const test::LooseNode& node, u32 nodeSize, u32 offset) {
    NodePtr place = {};
    const int status = node->GetPtr(node.Hdr(), offset, &place);
    FUZZ_CHECK(status == kOk || offset >= nodeSize);
    FUZZ_CHECK(status != kOk || offset == nodeSize || place.ptr == node.At(offset));
}

void Look(const test::Bytes& bytes, u32 mapBlock, u32 nodeNum, const Questions& questions) {
    const u32 nodeSize = static_cast<u32>(bytes.size());
    const test::LooseNode one(bytes, nodeSize, nodeNum);
    const test::LooseNode many(bytes, mapBlock, nodeNum);
    const int last = static_cast<int>(test::Get16(bytes, kDescNumRecords));
    for (const int index :
         {-1, 0, 1, last - 1, last, last + 1, questions.index[0], questions.index[1]}) {
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
    for (const u32 offset :
         {nodeSize - 1, nodeSize, nodeSize + 1, questions.offset[0], questions.offset[1]}) {
        CheckOffset(many, nodeSize, offset);
    }
    unsigned freeOne = 0;
    unsigned freeMany = 0;
    const int status = one->GetNodeFreeSize(one.Hdr(), &freeOne);
    FUZZ_CHECK(status == many->GetNodeFreeSize(many.Hdr(), &freeMany) && freeOne == freeMany);
    FUZZ_CHECK(status != kOk || freeOne <= bytes.size());
}

void Run(fuzz::Input* input) {
    const u8 geometry = input->U8();
    const u32 nodeSize = kSizes[geometry & 3];
    const u32 mapBlock = 512u << ((geometry >> 2) & 3);
    const u32 nodeNum = input->U8() & 1;
    Questions questions = {};
    for (u32 i = 0; i < 2; ++i) {
        questions.index[i] = static_cast<int>(input->U16()) - 0x4000;
        questions.offset[i] = input->U16();
    }
    test::Bytes bytes = input->Rest(nodeSize);
    bytes.resize(nodeSize);
    Look(bytes, mapBlock < nodeSize ? mapBlock : nodeSize, nodeNum, questions);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const u8* data, std::size_t size) {
    fuzz::RunQuietly(data, size, Run);
    return 0;
}

extern "C" std::size_t LLVMFuzzerCustomMutator(u8* data, std::size_t size, std::size_t most,
                                               unsigned seed) {
    fuzz::Mutator mutator(seed);
    constexpr std::size_t kControl = 10;
    const u32 nodeSize = size > 0 ? kSizes[data[0] & 3] : 0;
    if (size < kControl + nodeSize || nodeSize == 0 || mutator.OneIn(3)) {
        return LLVMFuzzerMutate(data, size, most);
    }
    mutator.Node(data + kControl, nodeSize, kCatalogFileId, nodeSize);
    return size;
}
