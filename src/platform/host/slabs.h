// Memory for many blocks of few sizes, as a cache of nodes takes them. Blocks of one size lie
// together in spans, spans in regions the size of a huge page: a node met after a long time then
// costs the memory it lies in, not a walk of the page tables besides.
#pragma once

#include <atomic>
#include <cstddef>
#include <mutex>

#include "platform/types.h"

namespace VELK {

// Takes address space at the first allocation and keeps it; memory comes in as it is touched and is
// used again for whatever size needs it. Threads may share one.
class Slabs {
public:
    static constexpr std::size_t kLargest = 16384 + 256;  // bytes; a node's block and its header

    // `space` bytes of addresses, whole regions: more than all blocks together will ever take.
    explicit constexpr Slabs(std::size_t space) : space_(space) {}
    ~Slabs();
    Slabs(const Slabs&) = delete;
    Slabs& operator=(const Slabs&) = delete;

    // `size` bytes aligned for any type; null: more than kLargest, or no memory.
    void* Alloc(std::size_t size);
    // Whether a block is one of these.
    bool Owns(const void* block) const;
    // Gives back a block. REQUIRES: Owns(block).
    void Free(void* block);
    // Bytes that a block takes, at least those asked for. REQUIRES: Owns(block).
    std::size_t SizeOf(const void* block) const;
    // Bytes of all spans that hold a block.
    std::size_t BytesInUse();

private:
    struct Span;
    static constexpr std::size_t kStep = 16;  // sizes are multiples of it, and so are addresses

    bool Reserve();
    Span* NewSpan(std::size_t blockSize);
    bool OpenRegion();
    Span* SpanOf(const void* block) const;
    void* BlocksOf(const Span* span) const;
    static void Link(Span** list, Span* span);
    static void Unlink(Span** list, Span* span);

    const std::size_t space_;
    std::mutex lock_;
    std::atomic<u8*> base_ = nullptr;  // first region; null: no address space yet
    Span* spans_ = nullptr;            // one for each span of the address space
    bool isRefused_ = false;           // there was no address space
    std::size_t opened_ = 0;           // bytes of regions that may be used
    std::size_t taken_ = 0;            // bytes of them that are or were spans
    Span* empty_ = nullptr;            // spans that hold no block
    std::size_t emptyCount_ = 0;
    Span* open_[(kLargest + kStep - 1) / kStep + 1] = {};  // by size: spans with a free block
};

}  // namespace VELK
