// Berkeley DB: one btree in a file with a cache that holds all of it; no transactions, no logs.
#include <db.h>

#include <cstdio>
#include <cstdlib>

#include "store_plain.h"

namespace bench {

namespace {

// Of its cache: as much as all records take, in a process that opens a few of them as much as
// these.
constexpr std::uint64_t kSmallestCache = std::uint64_t{32} << 20;
constexpr std::uint64_t kCachePerRecord = 800;

void Must(int status) {
    if (status != 0) {
        std::fprintf(stderr, "bdb: %s\n", db_strerror(status));
        std::abort();
    }
}

class BdbStore : public PlainStore {
public:
    BdbStore(const Workload& load, const std::string& folder) : PlainStore(load) {
        Must(db_create(&db_, nullptr, 0));
        const std::uint64_t cache = std::max(kSmallestCache, load.count * kCachePerRecord);
        Must(db_->set_cachesize(db_, static_cast<u_int32_t>(cache >> 30),
                                static_cast<u_int32_t>(cache & 0x3FFFFFFF), 1));
        Must(db_->set_pagesize(db_, 4096));
        Must(db_->open(db_, nullptr, (folder + "/store.db").c_str(), nullptr, DB_BTREE, DB_CREATE,
                       0644));
    }
    ~BdbStore() override { db_->close(db_, DB_NOSYNC); }

    bool Insert(const Record& record, bool) override {
        DBT key = Key(record);
        DBT value = Value(record.data, record.size);
        return db_->put(db_, nullptr, &key, &value, DB_NOOVERWRITE) == 0;
    }
    int Lookup(const Record& record, std::uint8_t* out) override {
        DBT key = Key(record);
        DBT value = Room(out, kLargestData);
        return db_->get(db_, nullptr, &key, &value, 0) == 0 ? static_cast<int>(value.size) : -1;
    }
    bool Update(const Record& record) override {
        DBT key = Key(record);
        DBT value = Value(record.data, record.size);
        return db_->put(db_, nullptr, &key, &value, 0) == 0;
    }
    bool Delete(const Record& record) override {
        DBT key = Key(record);
        return db_->del(db_, nullptr, &key, 0) == 0;
    }
    void Keep() override { Must(db_->sync(db_, 0)); }
    std::uint64_t Bytes() override {
        DB_BTREE_STAT* stat = nullptr;
        Must(db_->stat(db_, nullptr, &stat, DB_FAST_STAT));
        const std::uint64_t bytes = std::uint64_t{stat->bt_pagecnt} * stat->bt_pagesize;
        std::free(stat);
        return bytes;
    }

private:
    static DBT Value(const void* data, std::size_t size) {
        DBT value{};
        value.data = const_cast<void*>(data);
        value.size = static_cast<u_int32_t>(size);
        return value;
    }
    static DBT Room(void* out, std::size_t size) {
        DBT value{};
        value.data = out;
        value.ulen = static_cast<u_int32_t>(size);
        value.flags = DB_DBT_USERMEM;
        return value;
    }
    static DBT Key(const Record& record) { return Value(record.plain.data(), record.plain.size()); }
    std::uint32_t Walk(std::uint32_t parent, Digest* sum, bool oneFolder) override {
        const Prefix prefix(parent);
        std::uint8_t keyBytes[kLargestKey] = {};
        std::uint8_t data[kLargestData];
        std::memcpy(keyBytes, prefix.bytes, sizeof prefix.bytes);
        DBT key = Room(keyBytes, sizeof keyBytes);
        key.size = sizeof prefix.bytes;
        DBT value = Room(data, sizeof data);
        DBC* cursor = nullptr;
        Must(db_->cursor(db_, nullptr, &cursor, 0));
        std::uint32_t count = 0;
        int status = cursor->get(cursor, &key, &value, DB_SET_RANGE);
        while (status == 0 && !(oneFolder && !prefix.Starts(key.data))) {
            UseKey(keyBytes);
            sum->Add(data, value.size);
            count += 1;
            status = cursor->get(cursor, &key, &value, DB_NEXT);
        }
        Must(cursor->close(cursor));
        return count;
    }

    DB* db_ = nullptr;
};

}  // namespace

std::unique_ptr<Store> MakeBdb(const Workload& load, const std::string& folder) {
    return std::make_unique<BdbStore>(load, folder);
}

}  // namespace bench
