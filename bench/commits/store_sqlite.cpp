// SQLite with synchronous=FULL.
#include <sqlite3.h>

#include <cstdio>
#include <cstdlib>

#include "store.h"

namespace bench {

namespace {

class SqliteStore : public CommitStore {
public:
    SqliteStore(const std::string& folder, const std::string& mode) {
        Must(sqlite3_open((folder + "/store.db").c_str(), &db_));
        Run("PRAGMA page_size=4096");
        Run(("PRAGMA journal_mode=" + mode).c_str());
        Run("PRAGMA synchronous=FULL");
        Run("CREATE TABLE records(number INTEGER PRIMARY KEY, data BLOB)");
        Must(sqlite3_prepare_v2(db_, "INSERT OR REPLACE INTO records VALUES(?1,?2)", -1, &put_,
                                nullptr));
    }
    ~SqliteStore() override {
        sqlite3_finalize(put_);
        sqlite3_close(db_);
    }

    bool Put(std::uint32_t number, const std::uint8_t* data) override {
        if (!isOpen_) {
            Run("BEGIN");
            isOpen_ = true;
        }
        sqlite3_bind_int64(put_, 1, number);
        sqlite3_bind_blob(put_, 2, data, kRecordSize, SQLITE_STATIC);
        const bool done = sqlite3_step(put_) == SQLITE_DONE;
        sqlite3_reset(put_);
        return done;
    }
    bool Commit() override {
        isOpen_ = false;
        return sqlite3_exec(db_, "COMMIT", nullptr, nullptr, nullptr) == SQLITE_OK;
    }
    std::uint64_t Count() override {
        sqlite3_stmt* statement = nullptr;
        Must(sqlite3_prepare_v2(db_, "SELECT count(*) FROM records", -1, &statement, nullptr));
        sqlite3_step(statement);
        const std::uint64_t count = static_cast<std::uint64_t>(sqlite3_column_int64(statement, 0));
        sqlite3_finalize(statement);
        return count;
    }

private:
    void Must(int status) {
        if (status != SQLITE_OK) {
            std::fprintf(stderr, "sqlite: %s\n", sqlite3_errmsg(db_));
            std::exit(1);
        }
    }
    void Run(const char* text) { Must(sqlite3_exec(db_, text, nullptr, nullptr, nullptr)); }

    sqlite3* db_ = nullptr;
    sqlite3_stmt* put_ = nullptr;
    bool isOpen_ = false;
};

}  // namespace

std::unique_ptr<CommitStore> MakeSqlite(const std::string& folder, const std::string& mode) {
    return std::make_unique<SqliteStore>(folder, mode);
}

}  // namespace bench
