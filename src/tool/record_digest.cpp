// 128-bit digest of records.
#include "tool/record_digest.h"

#define XXH_INLINE_ALL
#include <xxhash.h>

#include "hfs/treehfs/bytes.h"
#include "hfs/volume/problem.h"

namespace VELK::tool {

struct RecordDigest::State {
    XXH3_state_t hash;
};

RecordDigest::RecordDigest() : state_(std::make_unique<State>()) {
    XXH3_128bits_reset(&state_->hash);
}

RecordDigest::~RecordDigest() = default;

void RecordDigest::Add(const u8* key, u32 keySize, const u8* data, u32 dataSize) {
    u8 sizes[8];
    PutBe32(sizes, keySize);
    PutBe32(sizes + 4, dataSize);
    XXH3_128bits_update(&state_->hash, sizes, sizeof sizes);
    XXH3_128bits_update(&state_->hash, key, keySize);
    XXH3_128bits_update(&state_->hash, data, dataSize);
    ++records_;
}

std::string RecordDigest::Text() const {
    const XXH128_hash_t hash = XXH3_128bits_digest(&state_->hash);
    return Format("xxh3:%016llx%016llx", static_cast<unsigned long long>(hash.high64),
                  static_cast<unsigned long long>(hash.low64));
}

}  // namespace VELK::tool
