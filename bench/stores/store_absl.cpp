// absl::btree_map of strings: what an ordered store in memory costs that keeps nothing.
#include <absl/container/btree_map.h>

#include "store_plain.h"

namespace bench {

namespace {

class AbslStore : public PlainStore {
public:
    using PlainStore::PlainStore;

    bool Insert(const Record& record, bool ascending) override {
        bytes_ += record.plain.size() + record.size;
        if (ascending) {
            map_.emplace_hint(map_.end(), Key(record), Data(record));
            return true;
        }
        return map_.emplace(Key(record), Data(record)).second;
    }
    int Lookup(const Record& record, std::uint8_t* out) override {
        const auto at = map_.find(Key(record));
        if (at == map_.end()) {
            return -1;
        }
        std::memcpy(out, at->second.data(), at->second.size());
        return static_cast<int>(at->second.size());
    }
    bool Update(const Record& record) override {
        const auto at = map_.find(Key(record));
        if (at == map_.end()) {
            return false;
        }
        at->second.assign(Data(record));
        return true;
    }
    bool Delete(const Record& record) override {
        const auto at = map_.find(Key(record));
        if (at == map_.end()) {
            return false;
        }
        map_.erase(at);
        return true;
    }
    std::uint64_t Bytes() override { return bytes_; }

private:
    static std::string_view Key(const Record& record) {
        return {reinterpret_cast<const char*>(record.plain.data()), record.plain.size()};
    }
    static std::string_view Data(const Record& record) {
        return {reinterpret_cast<const char*>(record.data), record.size};
    }
    std::uint32_t Walk(std::uint32_t parent, Digest* sum, bool oneFolder) override {
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
            sum->Add(data, at->second.size());
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
