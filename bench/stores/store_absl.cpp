// absl::btree_map of strings: what an ordered store in memory costs that keeps nothing.
#include <absl/container/btree_map.h>

#include "store_plain.h"

namespace bench {

namespace {

class AbslStore : public PlainStore {
public:
    using PlainStore::PlainStore;

    bool Insert(std::uint32_t i, const std::uint8_t* data, std::uint32_t size,
                bool ascending) override {
        bytes_ += load_.Plain(i).size() + size;
        const std::string_view value(reinterpret_cast<const char*>(data), size);
        if (ascending) {
            map_.emplace_hint(map_.end(), Key(i), value);
            return true;
        }
        return map_.emplace(Key(i), value).second;
    }
    int Lookup(std::uint32_t i, std::uint8_t* out) override {
        const auto at = map_.find(Key(i));
        if (at == map_.end()) {
            return -1;
        }
        std::memcpy(out, at->second.data(), at->second.size());
        return static_cast<int>(at->second.size());
    }
    bool Update(std::uint32_t i, const std::uint8_t* data, std::uint32_t size) override {
        const auto at = map_.find(Key(i));
        if (at == map_.end()) {
            return false;
        }
        at->second.assign(reinterpret_cast<const char*>(data), size);
        return true;
    }
    bool Delete(std::uint32_t i) override {
        const auto at = map_.find(Key(i));
        if (at == map_.end()) {
            return false;
        }
        map_.erase(at);
        return true;
    }
    std::uint64_t Bytes() override { return bytes_; }

private:
    std::string_view Key(std::uint32_t i) const {
        const auto key = load_.Plain(i);
        return {reinterpret_cast<const char*>(key.data()), key.size()};
    }
    std::uint32_t Walk(std::uint32_t parent, std::uint64_t* sum, bool oneFolder) override {
        const Prefix prefix(parent);
        const std::string_view start(reinterpret_cast<const char*>(prefix.bytes),
                                     sizeof prefix.bytes);
        std::uint8_t data[kLargestData];
        std::uint8_t keyCopy[kLargestKey];
        std::uint32_t count = 0;
        for (auto at = map_.lower_bound(start); at != map_.end(); ++at) {
            if (oneFolder && !prefix.Starts(at->first.data())) {
                break;
            }
            std::memcpy(keyCopy, at->first.data(), at->first.size());
            UseKey(keyCopy);
            std::memcpy(data, at->second.data(), at->second.size());
            *sum += Digest(data, at->second.size());
            count += 1;
        }
        return count;
    }

    absl::btree_map<std::string, std::string, std::less<>> map_;
    std::uint64_t bytes_ = 0;
};

}  // namespace

std::unique_ptr<Store> MakeAbsl(const Workload& load) {
    return std::make_unique<AbslStore>(load);
}

}  // namespace bench
