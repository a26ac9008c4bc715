// Mutations that know the format: they pick a node and one of its fields and give it a telling
// number, or tie nodes into rings and exchange them. Targets build their LLVMFuzzerCustomMutator
// from these; libFuzzer and the replay both call it.
#pragma once

#include <cstddef>
#include <random>
#include <vector>

#include "fields.h"

// Byte-wise variation: libFuzzer's own, or that of replay_main.cpp.
extern "C" std::size_t LLVMFuzzerMutate(VELK::u8* data, std::size_t size, std::size_t most);
extern "C" std::size_t LLVMFuzzerCustomMutator(VELK::u8* data, std::size_t size, std::size_t most,
                                               unsigned seed);

namespace VELK::fuzz {

class Mutator {
public:
    explicit Mutator(unsigned seed) : random_(seed) {}

    u32 Below(u32 limit) { return static_cast<u32>(random_() % limit); }
    bool OneIn(u32 times) { return Below(times) == 0; }

    // Gives one of the fields a telling value, or any.
    void Field(u8* bytes, const std::vector<test::Field>& fields, u32 nodeSize, u64 limit);
    void Node(u8* node, u32 nodeSize, u32 fileId, u32 totalNodes);
    // A field of one node mostly; or a number in a record's data; or links two nodes, copies one
    // over another.
    void TreeFile(u8* tree, std::size_t size, u32 fileId);

private:
    void Data(u8* tree, u32 nodeSize, u32 nodes);
    void Link(u8* tree, u32 nodeSize, u32 nodes);
    void CopyNode(u8* tree, u32 nodeSize, u32 nodes);

    std::minstd_rand random_;
};

}  // namespace VELK::fuzz
