// Map from file-relative blocks (vcn) to volume blocks (lcn) as a sorted list of runs.
// Memory comes from heap.h only.
#pragma once

#include "platform/heap.h"
#include "platform/types.h"

namespace VELK {

// The map of one file. `Block` is an unsigned integer type; instantiated for unsigned int.
//
//     CRunMapperT<unsigned int> runs;
//     runs.AddEntry(0, 500, 8);         // file blocks 0 .. 7 are volume blocks 500 .. 507
//     runs.Lookup(3, &lcn, &length);    // true: 503, and 5 blocks from there on
template <typename Block>
class CRunMapperT {
public:
    // Blocks that lie together, in the file and on the volume.
    struct Run {
        Block vcn;     // first block, counted in the file
        Block lcn;     // first block on the volume; kHole: nothing lies there
        Block length;  // blocks
    };
    static constexpr Block kHole = static_cast<Block>(-1);  // an lcn that is no block

    CRunMapperT() = default;
    CRunMapperT(const CRunMapperT&) = delete;
    CRunMapperT& operator=(const CRunMapperT&) = delete;
    // A move exchanges the two maps and allocates nothing.
    CRunMapperT(CRunMapperT&& other) noexcept { Swap(&other); }
    CRunMapperT& operator=(CRunMapperT&& other) noexcept {
        Swap(&other);
        return *this;
    }

    ~CRunMapperT() { velk_heap_free(runs_); }

    // Maps [vcn, vcn + length) to [lcn, lcn + length). What an earlier entry said of these blocks
    // is replaced; neighbours that continue each other are merged. False: out of memory, a length
    // of 0 or a range past the largest block number; the map is then unchanged.
    bool AddEntry(Block vcn, Block lcn, Block length);

    // Finds where block `vcn` lies and how many blocks from it on lie together. False: not mapped.
    bool Lookup(Block vcn, Block* lcn, Block* length) const;

    // Forgets every block at or past `vcn`.
    void Truncate(Block vcn);

    void Clear() { count_ = 0; }  // forgets every run and keeps the memory
    // The runs by number, from the lowest vcn up; At wants an index below Count().
    u32 Count() const { return count_; }
    const Run& At(u32 index) const { return runs_[index]; }

    // Exchanges two maps; allocates nothing.
    void Swap(CRunMapperT* other) noexcept;

private:
    bool Reserve(u32 count);
    u32 FirstEndingAfter(Block vcn) const;

    Run* runs_ = nullptr;
    u32 count_ = 0;
    u32 capacity_ = 0;
};

extern template class CRunMapperT<unsigned int>;

}  // namespace VELK
