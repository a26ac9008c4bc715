// Catalog-like records from one seed: keys of a parent ID and a name, sizes and folders as a busy
// volume has them. Every store gets the same records; each in the order it keeps them in.
#pragma once

#include <cstdint>
#include <span>
#include <vector>

namespace bench {

constexpr std::uint32_t kLargestData = 520;
constexpr std::uint32_t kLargestKey = 96;

struct Workload {
    std::uint32_t count = 0;
    std::uint32_t folders = 0;  // parents are 16 .. 16 + folders - 1

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
    const std::uint8_t* Host(std::uint32_t i) const { return hostKeys.data() + hostAt[i]; }
};

Workload MakeWorkload(std::uint32_t count, std::uint64_t seed);

// Data of record i in its nth version, made of 8-byte words; `out` holds kLargestData bytes.
void MakeData(std::uint32_t i, std::uint32_t version, std::uint32_t size, std::uint8_t* out);
// A number that all bytes of the data go into.
std::uint64_t Digest(const std::uint8_t* data, std::size_t size);

// 0 .. count - 1 shuffled.
std::vector<std::uint32_t> Shuffled(std::uint32_t count, std::uint64_t seed);

}  // namespace bench
