// The stores by name. See store.h.
#include "store.h"

#include <filesystem>

namespace bench {

namespace {

// The digit in the name of such a store.
std::uint32_t BlocksIn(const std::string& name) {
    return static_cast<std::uint32_t>(name[name.find('-') + 1] - '0');
}

}  // namespace

std::unique_ptr<Store> MakeStore(const std::string& name, const Workload& load,
                                 const std::string& folder) {
    std::filesystem::remove_all(folder);
    std::filesystem::create_directories(folder);
    return OpenStore(name, load, folder);
}

std::unique_ptr<Store> OpenStore(const std::string& name, const Workload& load,
                                 const std::string& folder) {
    if (name == "treehfs") {
        return MakeTreehfs(load, 1, Lending::kInOnePiece);
    }
    if (name == "treehfs-2blocks" || name == "treehfs-8blocks") {
        return MakeTreehfs(load, BlocksIn(name), Lending::kInOnePiece);
    }
    if (name == "treehfs-2apart" || name == "treehfs-8apart") {
        return MakeTreehfs(load, BlocksIn(name), Lending::kApart);
    }
    if (name == "treehfs-image") {
        return MakeImage(load, folder);
    }
    if (name == "lmdb" || name == "lmdb-append") {
        return MakeLmdb(load, folder, name == "lmdb-append");
    }
    if (name == "bdb") {
        return MakeBdb(load, folder);
    }
    if (name == "sqlite") {
        return MakeSqlite(load, folder);
    }
    if (name == "leveldb") {
        return MakeLevelDb(load, folder);
    }
    return name == "absl" ? MakeAbsl(load) : nullptr;
}

}  // namespace bench
