// Records and keys between the disk's byte order and the host's: each kind field by field, pieces
// that are cut short, kinds nobody knows; there and back gives the same bytes.
#include "hfs/volume/convert.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <bit>
#include <cstring>

#include "hfs/format.h"
#include "image_bytes.h"

namespace VELK {
namespace {

using test::Bytes;

// What a record of fields of these widths becomes on a little-endian host: each field reversed,
// the rest as it is.
Bytes Reversed(Bytes bytes, const std::vector<u32>& widths) {
    std::size_t at = 0;
    for (const u32 width : widths) {
        if (at + width > bytes.size()) {
            break;
        }
        std::reverse(bytes.begin() + static_cast<std::ptrdiff_t>(at),
                     bytes.begin() + static_cast<std::ptrdiff_t>(at + width));
        at += width;
    }
    return bytes;
}

struct RecordKind {
    const char* name;
    u32 fileId;
    Bytes type;  // first bytes on disk
    std::vector<u32> widths;
};

std::vector<u32> Fields(std::initializer_list<std::pair<u32, u32>> runs) {
    std::vector<u32> widths;
    for (const auto& [width, count] : runs) {
        widths.insert(widths.end(), count, width);
    }
    return widths;
}

std::vector<RecordKind> Kinds() {
    return {
        {"thread of a folder", kCatalogFileId, {0, 3}, Fields({{2, 2}, {4, 1}, {2, 100}})},
        {"thread of a file", kCatalogFileId, {0, 4}, Fields({{2, 2}, {4, 1}, {2, 100}})},
        {"folder",
         kCatalogFileId,
         {0, 1},
         Fields({{2, 2}, {4, 9}, {1, 2}, {2, 1}, {4, 1}, {2, 8}, {4, 2}, {2, 2}, {4, 3}})},
        {"unknown catalog record", kCatalogFileId, {0, 9}, Fields({{2, 1}})},
        {"small attribute", kAttributesFileId, {0, 0, 0, 0x10}, Fields({{4, 4}})},
        {"attribute's fork", kAttributesFileId, {0, 0, 0, 0x20}, Fields({{4, 2}, {8, 1}, {4, 18}})},
        {"attribute's extents", kAttributesFileId, {0, 0, 0, 0x30}, Fields({{4, 18}})},
        {"unknown attribute", kAttributesFileId, {0, 0, 0, 0x77}, Fields({{4, 1}})},
    };
}

TEST(Convert, EachKindOfRecordFieldByField) {
    if (std::endian::native != std::endian::little) {
        GTEST_SKIP() << "the host has the disk's byte order";
    }
    for (const RecordKind& kind : Kinds()) {
        const HfsConvert& convert = ConvertFor(kind.fileId);
        // Every length, so that each field is cut in turn.
        for (std::size_t size = 0; size <= 100; ++size) {
            Bytes disk = test::Pattern(size, 3);
            std::copy_n(kind.type.begin(), std::min(size, kind.type.size()), disk.begin());
            const bool isTyped = size >= kind.type.size();
            const Bytes expected = isTyped                         ? Reversed(disk, kind.widths)
                                   : kind.fileId == kCatalogFileId ? disk  // no room for a type
                                                                   : Reversed(disk, {4});
            Bytes memory(size);
            convert.DataToMemory(memory.data(), disk.data(), static_cast<unsigned>(size));
            ASSERT_EQ(expected, memory) << kind.name << " " << size;
            Bytes back(size);
            convert.DataToDisk(back.data(), memory.data(), static_cast<unsigned>(size));
            ASSERT_EQ(disk, back) << kind.name << " " << size;
        }
    }
}

TEST(Convert, AnOverflowRecordStaysAsItIsOnDisk) {
    const HfsConvert& convert = ConvertFor(kExtentsFileId);
    const Bytes disk = test::Pattern(64, 5);
    Bytes memory(64);
    convert.DataToMemory(memory.data(), disk.data(), 64);
    EXPECT_EQ(disk, memory);
}

// A file that is no tree is copied, key and all.
TEST(Convert, FilesThatAreNoTreesAreCopied) {
    const HfsConvert& convert = ConvertFor(kStartupFileId);
    const u16 length = 6;
    Bytes key(8, 0x5A);
    std::memcpy(key.data(), &length, sizeof length);
    Bytes copy(8);
    convert.KeyToDisk(copy.data(), key.data());
    EXPECT_EQ(key, copy);
    convert.KeyToMemory(copy.data(), Bytes(8, 1).data(), 8);
    EXPECT_EQ(Bytes(8, 1), copy);
}

}  // namespace
}  // namespace VELK
