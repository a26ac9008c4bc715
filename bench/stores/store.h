// One ordered store under test. Every operation that reads delivers the data into the caller's
// buffer. An operation that did not do what it should returns false: no store may answer wrongly.
#pragma once

#include <memory>
#include <string>

#include "workload.h"

namespace bench {

class Store {
public:
    virtual ~Store() = default;

    // A phase is one transaction where the store knows transactions.
    virtual void BeginPhase(bool /*writing*/) {}
    virtual void EndPhase() {}
    // Leaves everything in the store's files, for another process to open.
    virtual void Keep() {}

    // `ascending`: records come in the store's own order.
    virtual bool Insert(const Record& record, bool ascending) = 0;
    // Size of the data delivered, -1: absent.
    virtual int Lookup(const Record& record, std::uint8_t* out) = 0;
    virtual bool Update(const Record& record) = 0;
    virtual bool Delete(const Record& record) = 0;
    // Delivers every record, or those of one parent, in order; adds them to `*sum` and returns how
    // many there were.
    virtual std::uint32_t Scan(Digest* sum) = 0;
    virtual std::uint32_t List(std::uint32_t parent, Digest* sum) = 0;
    // Bytes the records take in the store's file or memory.
    virtual std::uint64_t Bytes() = 0;
    // Numbers of records in the store's own order.
    virtual bool Less(std::uint32_t a, std::uint32_t b) const = 0;
};

// How the volume lends the map blocks of a node: one behind the other in memory, or not.
enum class Lending { kInOnePiece, kApart };

// Known names: treehfs, treehfs-2blocks, treehfs-8blocks (map blocks per node), treehfs-2apart,
// treehfs-8apart (the same where these lie apart in memory), treehfs-image, lmdb, lmdb-append (told
// when records ascend), bdb, sqlite, leveldb, absl. Null: none of them. `folder` is emptied for the
// store to keep files in.
std::unique_ptr<Store> MakeStore(const std::string& name, const Workload& load,
                                 const std::string& folder);
// The same on what the folder holds, of those that keep files.
std::unique_ptr<Store> OpenStore(const std::string& name, const Workload& load,
                                 const std::string& folder);

std::unique_ptr<Store> MakeTreehfs(const Workload& load, std::uint32_t blocksPerNode,
                                   Lending lending);
std::unique_ptr<Store> MakeImage(const Workload& load, const std::string& folder);
std::unique_ptr<Store> MakeLmdb(const Workload& load, const std::string& folder, bool appends);
std::unique_ptr<Store> MakeBdb(const Workload& load, const std::string& folder);
std::unique_ptr<Store> MakeSqlite(const Workload& load, const std::string& folder);
std::unique_ptr<Store> MakeLevelDb(const Workload& load, const std::string& folder);
std::unique_ptr<Store> MakeAbsl(const Workload& load);

}  // namespace bench
