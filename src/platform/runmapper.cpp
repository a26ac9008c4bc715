// Sorted list of runs. A change first works out the few runs that will stand where the touched ones
// are, then finds room for them, and only then moves anything: without memory the map is unchanged.
#include "platform/runmapper.h"

#include <cstring>

namespace VELK {

namespace {

constexpr u32 kFirstCapacity = 8;

// What replaces the touched runs: a neighbour and a remainder on either side, the new run between.
template <typename Run>
struct Pieces {
    Run runs[5];
    u32 count = 0;
};

template <typename Run>
u64 EndOf(const Run& run) {
    return static_cast<u64>(run.vcn) + run.length;
}

// True when `right` goes on where `left` ends, in the file and on the volume, and the sum of their
// lengths is still a length.
template <typename Block>
bool Continues(const typename CRunMapperT<Block>::Run& left,
               const typename CRunMapperT<Block>::Run& right) {
    constexpr Block kHole = CRunMapperT<Block>::kHole;
    const u64 length = static_cast<u64>(left.length) + right.length;
    if (EndOf(left) != right.vcn || length > static_cast<Block>(-1)) {
        return false;
    }
    if (left.lcn == kHole || right.lcn == kHole) {
        return left.lcn == right.lcn;
    }
    return static_cast<u64>(left.lcn) + left.length == right.lcn;
}

template <typename Block>
void Append(Pieces<typename CRunMapperT<Block>::Run>* pieces,
            const typename CRunMapperT<Block>::Run& run) {
    if (pieces->count > 0 && Continues<Block>(pieces->runs[pieces->count - 1], run)) {
        pieces->runs[pieces->count - 1].length += run.length;
        return;
    }
    pieces->runs[pieces->count++] = run;
}

}  // namespace

template <typename Block>
bool CRunMapperT<Block>::AddEntry(Block vcn, Block lcn, Block length) {
    const u64 end = static_cast<u64>(vcn) + length;
    if (length == 0 || end - 1 > static_cast<Block>(-1) ||
        (lcn != kHole && static_cast<u64>(lcn) + length > kHole)) {
        return false;
    }
    const u32 overlap = FirstEndingAfter(vcn);  // first run that overlaps, if any does
    u32 last = overlap;                         // one past the runs that do
    while (last < count_ && runs_[last].vcn < end) {
        last += 1;
    }
    const bool splitsLeft = overlap < last && runs_[overlap].vcn < vcn;
    const bool splitsRight = overlap < last && EndOf(runs_[last - 1]) > end;

    Pieces<Run> pieces;
    u32 first = overlap;
    if (first > 0) {
        first -= 1;
        Append<Block>(&pieces, runs_[first]);
    }
    if (splitsLeft) {
        const Run& run = runs_[overlap];
        Append<Block>(&pieces, {run.vcn, run.lcn, vcn - run.vcn});
    }
    Append<Block>(&pieces, {vcn, lcn, length});
    if (splitsRight) {
        const Run& run = runs_[last - 1];
        const Block skip = static_cast<Block>(end - run.vcn);
        Append<Block>(&pieces, {static_cast<Block>(end), run.lcn == kHole ? kHole : run.lcn + skip,
                                run.length - skip});
    }
    if (last < count_) {
        Append<Block>(&pieces, runs_[last]);
        last += 1;
    }

    const u32 count = count_ - (last - first) + pieces.count;
    if (!Reserve(count)) {
        return false;
    }
    std::memmove(runs_ + first + pieces.count, runs_ + last, (count_ - last) * sizeof(Run));
    std::memcpy(runs_ + first, pieces.runs, pieces.count * sizeof(Run));
    count_ = count;
    return true;
}

template <typename Block>
bool CRunMapperT<Block>::Lookup(Block vcn, Block* lcn, Block* length) const {
    const u32 index = FirstEndingAfter(vcn);
    if (index == count_ || runs_[index].vcn > vcn) {
        return false;
    }
    const Run& run = runs_[index];
    const Block skip = vcn - run.vcn;
    *lcn = run.lcn == kHole ? kHole : run.lcn + skip;
    *length = run.length - skip;
    return true;
}

template <typename Block>
void CRunMapperT<Block>::Truncate(Block vcn) {
    const u32 index = FirstEndingAfter(vcn);
    if (index < count_ && runs_[index].vcn < vcn) {
        runs_[index].length = vcn - runs_[index].vcn;
        count_ = index + 1;
    } else {
        count_ = index;
    }
}

template <typename Block>
void CRunMapperT<Block>::Swap(CRunMapperT* other) noexcept {
    Run* runs = runs_;
    runs_ = other->runs_;
    other->runs_ = runs;
    u32 number = count_;
    count_ = other->count_;
    other->count_ = number;
    number = capacity_;
    capacity_ = other->capacity_;
    other->capacity_ = number;
}

template <typename Block>
bool CRunMapperT<Block>::Reserve(u32 count) {
    if (count <= capacity_) {
        return true;
    }
    u32 capacity = capacity_ == 0 ? kFirstCapacity : capacity_ * 2;
    if (capacity < count) {
        capacity = count;
    }
    Run* runs = static_cast<Run*>(velk_heap_alloc(sizeof(Run) * std::size_t{capacity}));
    if (runs == nullptr) {
        return false;
    }
    if (count_ > 0) {
        std::memcpy(runs, runs_, count_ * sizeof(Run));
    }
    velk_heap_free(runs_);
    runs_ = runs;
    capacity_ = capacity;
    return true;
}

// Index of the first run that does not end at or before `vcn`.
template <typename Block>
u32 CRunMapperT<Block>::FirstEndingAfter(Block vcn) const {
    u32 low = 0;
    u32 high = count_;
    while (low < high) {
        const u32 middle = low + (high - low) / 2;
        if (EndOf(runs_[middle]) > vcn) {
            high = middle;
        } else {
            low = middle + 1;
        }
    }
    return low;
}

template class CRunMapperT<unsigned int>;

}  // namespace VELK
