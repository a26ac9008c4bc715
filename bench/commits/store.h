// A store that keeps each transaction on the medium before it says so. Records have a number as
// their key and kRecordSize bytes of data.
#pragma once

#include <cstdint>
#include <memory>
#include <string>

namespace bench {

constexpr std::uint32_t kRecordSize = 200;

class CommitStore {
public:
    virtual ~CommitStore() = default;

    // Puts a record in, or in the place of the one that is there. False: it failed.
    virtual bool Put(std::uint32_t number, const std::uint8_t* data) = 0;
    // Returns when everything put in so far is on the medium.
    virtual bool Commit() = 0;
    // Whether a transaction should not grow much further.
    virtual bool IsCommitDue() const { return false; }
    virtual std::uint64_t Count() = 0;
};

// Each makes its files in `folder`, which is there and empty.
std::unique_ptr<CommitStore> MakeTreehfs(const std::string& folder, std::uint64_t journalBytes);
// `mode`: the journal mode, WAL or DELETE; synchronous=FULL.
std::unique_ptr<CommitStore> MakeSqlite(const std::string& folder, const std::string& mode);
std::unique_ptr<CommitStore> MakeLmdb(const std::string& folder);

}  // namespace bench
