// Items of one folder whose names would be one and the same on a volume that ignores case and
// spelling: what could not be copied there, or what a case-insensitive volume must not hold.
#pragma once

#include <functional>

#include "tool/catalog_list.h"

namespace VELK::tool {

// Calls `visit` for each item that shares its name with another of its folder, group by group;
// false from it ends the search. Items must be listed folder by folder.
class CollisionFinder {
public:
    explicit CollisionFinder(std::function<bool(const ListedItem&)> visit)
        : visit_(std::move(visit)) {}

    // False: the search is over.
    bool Add(const ListedItem& listed);
    // After the last item.
    void Finish() { EndFolder(); }

private:
    // An item kept until its folder is over.
    struct Kept {
        std::u16string folded;
        std::vector<u8> name;
        std::vector<u8> data;
        ListedItem listed;
    };

    bool EndFolder();

    std::function<bool(const ListedItem&)> visit_;
    std::vector<Kept> folder_;
    std::string folderPath_;
    u32 parent_ = 0;
};

}  // namespace VELK::tool
