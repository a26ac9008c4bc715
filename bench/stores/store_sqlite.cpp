// SQLite: a table without row IDs, prepared statements, one transaction a phase, no journal.
#include <sqlite3.h>

#include <cstdio>
#include <cstdlib>

#include "store_plain.h"

namespace bench {

namespace {

class SqliteStore : public PlainStore {
public:
    SqliteStore(const Workload& load, const std::string& folder) : PlainStore(load) {
        Must(sqlite3_open((folder + "/store.db").c_str(), &db_));
        Run("PRAGMA page_size=4096");
        Run("PRAGMA journal_mode=OFF");
        Run("PRAGMA synchronous=OFF");
        Run("PRAGMA locking_mode=EXCLUSIVE");
        Run("PRAGMA cache_size=-4000000");
        Run("CREATE TABLE IF NOT EXISTS records(key BLOB PRIMARY KEY, data BLOB) WITHOUT ROWID");
        insert_ = Prepare("INSERT INTO records VALUES(?1,?2)");
        lookup_ = Prepare("SELECT data FROM records WHERE key=?1");
        update_ = Prepare("UPDATE records SET data=?2 WHERE key=?1");
        remove_ = Prepare("DELETE FROM records WHERE key=?1");
        walk_ = Prepare("SELECT key,data FROM records WHERE key>=?1 ORDER BY key");
    }
    ~SqliteStore() override {
        for (sqlite3_stmt* statement : {insert_, lookup_, update_, remove_, walk_}) {
            sqlite3_finalize(statement);
        }
        sqlite3_close(db_);
    }

    void BeginPhase(bool) override { Run("BEGIN"); }
    void EndPhase() override { Run("COMMIT"); }
    bool Insert(const Record& record, bool) override { return Change(insert_, record); }
    int Lookup(const Record& record, std::uint8_t* out) override {
        BindKey(lookup_, record);
        int size = -1;
        if (sqlite3_step(lookup_) == SQLITE_ROW) {
            size = sqlite3_column_bytes(lookup_, 0);
            std::memcpy(out, sqlite3_column_blob(lookup_, 0), static_cast<std::size_t>(size));
        }
        sqlite3_reset(lookup_);
        return size;
    }
    bool Update(const Record& record) override {
        return Change(update_, record) && sqlite3_changes(db_) == 1;
    }
    bool Delete(const Record& record) override {
        BindKey(remove_, record);
        const bool done = sqlite3_step(remove_) == SQLITE_DONE && sqlite3_changes(db_) == 1;
        sqlite3_reset(remove_);
        return done;
    }
    std::uint64_t Bytes() override {
        sqlite3_stmt* statement = Prepare("PRAGMA page_count");
        sqlite3_step(statement);
        const std::int64_t pages = sqlite3_column_int64(statement, 0);
        sqlite3_finalize(statement);
        return static_cast<std::uint64_t>(pages) * 4096;
    }

private:
    void Must(int status) {
        if (status != SQLITE_OK) {
            std::fprintf(stderr, "sqlite: %s\n", sqlite3_errmsg(db_));
            std::abort();
        }
    }
    void Run(const char* text) { Must(sqlite3_exec(db_, text, nullptr, nullptr, nullptr)); }
    sqlite3_stmt* Prepare(const char* text) {
        sqlite3_stmt* statement = nullptr;
        Must(sqlite3_prepare_v3(db_, text, -1, SQLITE_PREPARE_PERSISTENT, &statement, nullptr));
        return statement;
    }
    void BindKey(sqlite3_stmt* statement, const Record& record) {
        Must(sqlite3_bind_blob(statement, 1, record.plain.data(),
                               static_cast<int>(record.plain.size()), SQLITE_STATIC));
    }
    bool Change(sqlite3_stmt* statement, const Record& record) {
        BindKey(statement, record);
        Must(sqlite3_bind_blob(statement, 2, record.data, static_cast<int>(record.size),
                               SQLITE_STATIC));
        const bool done = sqlite3_step(statement) == SQLITE_DONE;
        sqlite3_reset(statement);
        return done;
    }
    std::uint32_t Walk(std::uint32_t parent, Digest* sum, bool oneFolder) override {
        const Prefix prefix(parent);
        Must(sqlite3_bind_blob(walk_, 1, prefix.bytes, sizeof prefix.bytes, SQLITE_STATIC));
        std::uint8_t data[kLargestData];
        std::uint8_t keyCopy[kLargestKey];
        std::uint32_t count = 0;
        while (sqlite3_step(walk_) == SQLITE_ROW) {
            const void* key = sqlite3_column_blob(walk_, 0);
            if (oneFolder && !prefix.Starts(key)) {
                break;
            }
            std::memcpy(keyCopy, key, static_cast<std::size_t>(sqlite3_column_bytes(walk_, 0)));
            UseKey(keyCopy);
            const std::size_t size = static_cast<std::size_t>(sqlite3_column_bytes(walk_, 1));
            std::memcpy(data, sqlite3_column_blob(walk_, 1), size);
            sum->Add(data, size);
            count += 1;
        }
        sqlite3_reset(walk_);
        return count;
    }

    sqlite3* db_ = nullptr;
    sqlite3_stmt* insert_ = nullptr;
    sqlite3_stmt* lookup_ = nullptr;
    sqlite3_stmt* update_ = nullptr;
    sqlite3_stmt* remove_ = nullptr;
    sqlite3_stmt* walk_ = nullptr;
};

}  // namespace

std::unique_ptr<Store> MakeSqlite(const Workload& load, const std::string& folder) {
    return std::make_unique<SqliteStore>(load, folder);
}

}  // namespace bench
