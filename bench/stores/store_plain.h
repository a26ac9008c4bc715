// What the stores that order byte strings have in common.
#pragma once

#include <algorithm>
#include <cstring>

#include "store.h"

namespace bench {

class PlainStore : public Store {
public:
    explicit PlainStore(const Workload& load) : load_(load) {}

    bool Less(std::uint32_t a, std::uint32_t b) const override {
        const auto left = load_.Plain(a);
        const auto right = load_.Plain(b);
        return std::lexicographical_compare(left.begin(), left.end(), right.begin(), right.end());
    }
    std::uint32_t Scan(Digest* sum) override { return Walk(0, sum, false); }
    std::uint32_t List(std::uint32_t parent, Digest* sum) override {
        return Walk(parent, sum, true);
    }

protected:
    // Delivers records from the first of `parent` on, to the end or to the last one of it.
    virtual std::uint32_t Walk(std::uint32_t parent, Digest* sum, bool oneFolder) = 0;

    const Workload& load_;
};

// The first bytes of every key of `parent`.
struct Prefix {
    explicit Prefix(std::uint32_t parent) {
        for (int i = 0; i < 4; ++i) {
            bytes[i] = static_cast<std::uint8_t>(parent >> (24 - 8 * i));
        }
    }
    bool Starts(const void* key) const { return std::memcmp(key, bytes, sizeof bytes) == 0; }

    std::uint8_t bytes[4];
};

// Makes the compiler believe that a copied key is looked at.
inline void UseKey(const std::uint8_t* key) {
    asm volatile("" : : "r"(key) : "memory");
}

}  // namespace bench
