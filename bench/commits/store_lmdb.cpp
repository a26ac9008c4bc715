// LMDB as it comes: every commit is synced.
#include <lmdb.h>

#include <cstdio>
#include <cstdlib>

#include "store.h"

namespace bench {

namespace {

class LmdbStore : public CommitStore {
public:
    explicit LmdbStore(const std::string& folder) {
        Must(mdb_env_create(&env_));
        Must(mdb_env_set_mapsize(env_, std::size_t{1} << 30));
        Must(mdb_env_open(env_, folder.c_str(), 0, 0644));
        Begin();
        Must(mdb_dbi_open(open_, nullptr, MDB_INTEGERKEY, &records_));
    }
    ~LmdbStore() override {
        if (open_ != nullptr) {
            mdb_txn_abort(open_);
        }
        mdb_env_close(env_);
    }

    bool Put(std::uint32_t number, const std::uint8_t* data) override {
        Begin();
        MDB_val key = {sizeof number, &number};
        MDB_val value = {kRecordSize, const_cast<std::uint8_t*>(data)};
        return mdb_put(open_, records_, &key, &value, 0) == 0;
    }
    bool Commit() override {
        MDB_txn* done = open_;
        open_ = nullptr;
        return mdb_txn_commit(done) == 0;
    }
    std::uint64_t Count() override {
        MDB_stat stat;
        Begin();
        Must(mdb_stat(open_, records_, &stat));
        return stat.ms_entries;
    }

private:
    static void Must(int status) {
        if (status != 0) {
            std::fprintf(stderr, "lmdb: %s\n", mdb_strerror(status));
            std::exit(1);
        }
    }
    void Begin() {
        if (open_ == nullptr) {
            Must(mdb_txn_begin(env_, nullptr, 0, &open_));
        }
    }

    MDB_env* env_ = nullptr;
    MDB_txn* open_ = nullptr;
    MDB_dbi records_ = 0;
};

}  // namespace

std::unique_ptr<CommitStore> MakeLmdb(const std::string& folder) {
    return std::make_unique<LmdbStore>(folder);
}

}  // namespace bench
