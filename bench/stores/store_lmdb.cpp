// LMDB: one transaction a phase, writable mapping without syncs, insertion through a cursor.
#include <lmdb.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "store_plain.h"

namespace bench {

namespace {

constexpr std::uint64_t kBytesPerRecord = 640;  // that the file takes, about
// Addresses, not memory: a transaction that changes every page needs as many besides.
constexpr std::size_t kMapSize = std::size_t{64} << 30;

void Must(int status) {
    if (status != 0) {
        std::fprintf(stderr, "lmdb: %s\n", mdb_strerror(status));
        std::abort();
    }
}

class LmdbStore : public PlainStore {
public:
    LmdbStore(const Workload& load, const std::string& folder, bool appends)
        : PlainStore(load), appends_(appends) {
        Must(mdb_env_create(&env_));
        Must(mdb_env_set_mapsize(env_, kMapSize));
        Must(mdb_env_open(env_, folder.c_str(), MDB_WRITEMAP | MDB_NOSYNC, 0644));
        MDB_envinfo info;
        Must(mdb_env_info(env_, &info));
        if (info.me_last_txnid == 0) {
            SupplyFile(load.count * kBytesPerRecord);
        }
    }
    ~LmdbStore() override { mdb_env_close(env_); }

    void BeginPhase(bool writing) override {
        Must(mdb_txn_begin(env_, nullptr, writing ? 0 : MDB_RDONLY, &txn_));
        Must(mdb_dbi_open(txn_, nullptr, 0, &dbi_));
        Must(mdb_cursor_open(txn_, dbi_, &cursor_));
    }
    void EndPhase() override {
        mdb_cursor_close(cursor_);
        Must(mdb_txn_commit(txn_));
    }
    bool Insert(const Record& record, bool ascending) override {
        return Put(record, appends_ && ascending ? MDB_APPEND : MDB_NOOVERWRITE);
    }
    int Lookup(const Record& record, std::uint8_t* out) override {
        MDB_val key = Key(record);
        MDB_val value;
        if (mdb_get(txn_, dbi_, &key, &value) != 0) {
            return -1;
        }
        std::memcpy(out, value.mv_data, value.mv_size);
        return static_cast<int>(value.mv_size);
    }
    bool Update(const Record& record) override { return Put(record, 0); }
    bool Delete(const Record& record) override {
        MDB_val key = Key(record);
        return mdb_del(txn_, dbi_, &key, nullptr) == 0;
    }
    std::uint64_t Bytes() override {
        MDB_envinfo info;
        Must(mdb_env_info(env_, &info));
        return (std::uint64_t{info.me_last_pgno} + 1) * 4096;
    }

private:
    // Lets the page cache take in the file's pages now, as the other volume in memory does: what
    // the system needs to supply memory is not measured.
    void SupplyFile(std::uint64_t bytes) {
        int file = -1;
        Must(mdb_env_get_fd(env_, &file));
        static const char kZeros[std::size_t{1} << 16] = {};
        constexpr std::uint64_t kMetaPages = 8192;
        for (std::uint64_t at = kMetaPages; at < bytes; at += sizeof kZeros) {
            if (pwrite(file, kZeros, sizeof kZeros, static_cast<off_t>(at)) != sizeof kZeros) {
                std::perror("lmdb: supplying the file");
                std::abort();
            }
        }
    }
    static MDB_val Key(const Record& record) {
        return {record.plain.size(), const_cast<std::uint8_t*>(record.plain.data())};
    }
    bool Put(const Record& record, unsigned flags) {
        MDB_val key = Key(record);
        MDB_val value = {record.size, const_cast<std::uint8_t*>(record.data)};
        return mdb_cursor_put(cursor_, &key, &value, flags) == 0;
    }
    std::uint32_t Walk(std::uint32_t parent, Digest* sum, bool oneFolder) override {
        const Prefix prefix(parent);
        MDB_val key = {sizeof prefix.bytes, const_cast<std::uint8_t*>(prefix.bytes)};
        MDB_val value;
        std::uint8_t data[kLargestData];
        std::uint8_t keyCopy[kLargestKey];
        std::uint32_t count = 0;
        int status = mdb_cursor_get(cursor_, &key, &value, MDB_SET_RANGE);
        while (status == 0 && !(oneFolder && !prefix.Starts(key.mv_data))) {
            std::memcpy(keyCopy, key.mv_data, key.mv_size);
            UseKey(keyCopy);
            std::memcpy(data, value.mv_data, value.mv_size);
            sum->Add(data, value.mv_size);
            count += 1;
            status = mdb_cursor_get(cursor_, &key, &value, MDB_NEXT);
        }
        return count;
    }

    const bool appends_;
    MDB_env* env_ = nullptr;
    MDB_txn* txn_ = nullptr;
    MDB_dbi dbi_ = 0;
    MDB_cursor* cursor_ = nullptr;
};

}  // namespace

std::unique_ptr<Store> MakeLmdb(const Workload& load, const std::string& folder, bool appends) {
    return std::make_unique<LmdbStore>(load, folder, appends);
}

}  // namespace bench
