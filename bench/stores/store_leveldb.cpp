// LevelDB, a log-structured contrast. Its compaction threads count: the clock is processor time.
#include <leveldb/cache.h>
#include <leveldb/db.h>

#include <cstdio>
#include <cstdlib>

#include "store_plain.h"

namespace bench {

namespace {

constexpr std::size_t kCacheBytes = std::size_t{4} << 30;

class LevelDbStore : public PlainStore {
public:
    LevelDbStore(const Workload& load, const std::string& folder) : PlainStore(load) {
        leveldb::Options options;
        options.create_if_missing = true;
        options.compression = leveldb::kNoCompression;
        options.write_buffer_size = std::size_t{64} << 20;
        cache_.reset(leveldb::NewLRUCache(kCacheBytes));
        options.block_cache = cache_.get();
        leveldb::DB* db = nullptr;
        if (!leveldb::DB::Open(options, folder, &db).ok()) {
            std::fprintf(stderr, "leveldb: cannot open %s\n", folder.c_str());
            std::abort();
        }
        db_.reset(db);
    }

    bool Insert(const Record& record, bool) override {
        return db_->Put({}, Key(record), Bytes(record.data, record.size)).ok();
    }
    int Lookup(const Record& record, std::uint8_t* out) override {
        if (!db_->Get({}, Key(record), &value_).ok()) {
            return -1;
        }
        std::memcpy(out, value_.data(), value_.size());
        return static_cast<int>(value_.size());
    }
    bool Update(const Record& record) override {
        return db_->Put({}, Key(record), Bytes(record.data, record.size)).ok();
    }
    bool Delete(const Record& record) override { return db_->Delete({}, Key(record)).ok(); }
    std::uint64_t Bytes() override {
        const leveldb::Range all("", "\xff\xff\xff\xff\xff");
        std::uint64_t size = 0;
        db_->GetApproximateSizes(&all, 1, &size);
        return size;
    }

private:
    static leveldb::Slice Bytes(const std::uint8_t* data, std::size_t size) {
        return {reinterpret_cast<const char*>(data), size};
    }
    static leveldb::Slice Key(const Record& record) {
        return Bytes(record.plain.data(), record.plain.size());
    }
    std::uint32_t Walk(std::uint32_t parent, Digest* sum, bool oneFolder) override {
        const Prefix prefix(parent);
        const std::unique_ptr<leveldb::Iterator> at(db_->NewIterator({}));
        std::uint8_t data[kLargestData];
        std::uint8_t keyCopy[kLargestKey];
        std::uint32_t count = 0;
        for (at->Seek(Bytes(prefix.bytes, sizeof prefix.bytes)); at->Valid(); at->Next()) {
            if (oneFolder && !prefix.Starts(at->key().data())) {
                break;
            }
            std::memcpy(keyCopy, at->key().data(), at->key().size());
            UseKey(keyCopy);
            std::memcpy(data, at->value().data(), at->value().size());
            sum->Add(data, at->value().size());
            count += 1;
        }
        return count;
    }

    std::unique_ptr<leveldb::Cache> cache_;
    std::unique_ptr<leveldb::DB> db_;
    std::string value_;
};

}  // namespace

std::unique_ptr<Store> MakeLevelDb(const Workload& load, const std::string& folder) {
    return std::make_unique<LevelDbStore>(load, folder);
}

}  // namespace bench
