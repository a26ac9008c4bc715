// Prints catalog items for ls and find: bare paths, long lines, JSON.
#pragma once

#include <memory>
#include <string>

#include "tool/catalog_list.h"
#include "tool/item_format.h"

namespace VELK::tool {

struct PrintStyle {
    bool longForm = false;    // type, ID, size, date before the name
    bool wholePaths = false;  // not the bare name
    bool zeroEnds = false;    // items end in NUL and are not escaped
    bool composed = false;    // names in the form most people type
    bool json = false;
    bool attributes = false;                   // names of extended attributes below each item
    bool extents = false;                      // where the forks lie
    std::shared_ptr<const ItemFormat> format;  // instead of all of these but `composed`
};

class ItemPrinter {
public:
    ItemPrinter(Session* session, Output* out, const PrintStyle& style);

    // The form the paths of the listed items must have.
    NameForm Form() const;
    void Print(const ListedItem& listed);

private:
    void PutPath(const ListedItem& listed, std::string* text) const;
    void PrintBare(const ListedItem& listed);
    void PrintLong(const ListedItem& listed);
    void PrintJson(const ListedItem& listed);
    void PrintExtents(const CatalogItem& item);
    void PrintAttributes(const CatalogItem& item);

    Session* session_;
    Output* out_;
    PrintStyle style_;
    u32 idWidth_;
    std::string text_;
};

// Every run of a fork: the eight of its record, and those of the extents tree.
std::vector<HfsExtent> ForkRuns(Session* session, u32 fileId, u8 forkType, const u8* fork);

}  // namespace VELK::tool
