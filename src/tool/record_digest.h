// Digest of the records of a tree in key order. It depends on keys and data alone, not on where
// the nodes lie: two trees with the same records have the same digest.
#pragma once

#include <memory>
#include <string>

#include "platform/types.h"

namespace VELK::tool {

class RecordDigest {
public:
    RecordDigest();
    RecordDigest(const RecordDigest&) = delete;
    RecordDigest& operator=(const RecordDigest&) = delete;
    ~RecordDigest();

    // Key with its length field and data, both as stored. The sizes count, so no two sequences of
    // records run together.
    void Add(const u8* key, u32 keySize, const u8* data, u32 dataSize);
    u64 Records() const { return records_; }
    // "xxh3:" and 32 hexadecimal digits.
    std::string Text() const;

private:
    struct State;
    std::unique_ptr<State> state_;
    u64 records_ = 0;
};

}  // namespace VELK::tool
