// Catalog-like records from one seed: keys of a parent ID and a name, sizes and folders as a busy
// volume has them. Every store gets the same records; each in the order it keeps them in.
#pragma once

#include <cstdint>
#include <cstring>
#include <span>
#include <vector>

namespace bench {

constexpr std::uint32_t kFirstParent = 16;
constexpr std::uint32_t kLeastData = 10;
constexpr std::uint32_t kLargestData = 520;
constexpr std::uint32_t kLargestKey = 96;

struct Workload {
    std::uint32_t count = 0;
    std::uint32_t folders = 0;  // parents are kFirstParent and those that follow

    // Key i as the tree engine takes it (host order, length field first) and as a byte string whose
    // memcmp order is parent, then code units.
    std::vector<std::uint8_t> hostKeys;  // 8-byte aligned pieces
    std::vector<std::uint8_t> plainKeys;
    std::vector<std::uint32_t> hostAt;   // offset of key i in hostKeys
    std::vector<std::uint32_t> plainAt;  // offset of key i in plainKeys; one more entry at the end
    std::vector<std::uint32_t> parent;
    std::vector<std::uint16_t> dataSize;
    std::vector<std::uint32_t> folderSize;  // records of each folder

    std::span<const std::uint8_t> Plain(std::uint32_t i) const {
        return {plainKeys.data() + plainAt[i], plainAt[i + 1] - plainAt[i]};
    }
    std::span<const std::uint8_t> Host(std::uint32_t i) const {
        const std::size_t end = i + 1 < count ? hostAt[i + 1] : hostKeys.size();
        return {hostKeys.data() + hostAt[i], end - hostAt[i]};
    }
};

Workload MakeWorkload(std::uint32_t count, std::uint64_t seed);

// One record as a caller has it at hand who asks for something.
struct Record {
    const std::uint8_t* host;  // the key in both its forms, see Workload
    std::span<const std::uint8_t> plain;
    const std::uint8_t* data;  // null: only the key is handed over
    std::uint32_t size;        // of the data

    std::uint32_t Parent() const {
        std::uint32_t parent;
        std::memcpy(&parent, host + 2, sizeof parent);
        return parent;
    }
};

// Some records next to each other in memory, gathered before the clock starts: what it costs to
// find a key among the yardstick's own is no store's affair.
class Batch {
public:
    static constexpr std::uint32_t kKeysOnly = ~0u;

    // Replaces what was in the batch by these records in that version of their data.
    void Fill(const Workload& load, std::span<const std::uint32_t> numbers, std::uint32_t version);
    std::span<const Record> Records() const { return records_; }

private:
    std::vector<Record> records_;
    std::vector<std::uint64_t> room_;
};

// Data of record i in its nth version, made of 8-byte words.
void MakeData(std::uint32_t i, std::uint32_t version, std::uint32_t size, std::uint8_t* out);

// Adds up what a walk delivers.
class Digest {
public:
    // Whole: all bytes of the data count. Brief: its length, first and last word, which is next to
    // nothing beside a step of a walk.
    enum Kind { kBrief, kWhole };

    explicit Digest(Kind kind) : kind_(kind) {}

    void Add(const std::uint8_t* data, std::size_t size) {
        sum_ += kind_ == kBrief ? Ends(data, size) : All(data, size);
    }
    bool operator==(const Digest&) const = default;

private:
    static std::uint64_t Ends(const std::uint8_t* data, std::size_t size) {
        std::uint64_t words[2];
        std::memcpy(&words[0], data, sizeof words[0]);
        std::memcpy(&words[1], data + size - sizeof words[1], sizeof words[1]);
        return size + words[0] + words[1];
    }
    static std::uint64_t All(const std::uint8_t* data, std::size_t size);

    Kind kind_;
    std::uint64_t sum_ = 0;
};

// 0 .. count - 1 shuffled.
std::vector<std::uint32_t> Shuffled(std::uint32_t count, std::uint64_t seed);

}  // namespace bench
