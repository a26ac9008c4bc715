// Conversion hooks: fields, cut-off sizes, unknown types, and the way back.
#include "hfs/volume/convert.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <bit>
#include <cstring>
#include <random>
#include <vector>

namespace VELK {
namespace {

using Bytes = std::vector<u8>;

template <typename Field>
Field At(const Bytes& bytes, std::size_t offset) {
    Field field;
    std::memcpy(&field, bytes.data() + offset, sizeof field);
    return field;
}

Bytes ToMemory(u32 fileId, const Bytes& stored) {
    Bytes host(stored.size());
    ConvertFor(fileId).DataToMemory(host.data(), stored.data(),
                                    static_cast<unsigned>(stored.size()));
    return host;
}
Bytes ToDisk(u32 fileId, const Bytes& host) {
    Bytes stored(host.size());
    ConvertFor(fileId).DataToDisk(stored.data(), host.data(), static_cast<unsigned>(host.size()));
    return stored;
}

// Bytes 00 01 02 ... with the type in front.
Bytes Counting(std::size_t size, std::initializer_list<u8> type) {
    Bytes bytes(size);
    for (std::size_t i = 0; i < size; ++i) {
        bytes[i] = static_cast<u8>(i);
    }
    std::copy_n(type.begin(), std::min(type.size(), size), bytes.begin());
    return bytes;
}

TEST(ConvertCatalog, FolderRecord) {
    const Bytes host = ToMemory(kCatalogFileId, Counting(88, {0, 1}));
    EXPECT_EQ(At<u16>(host, 0), 1);
    EXPECT_EQ(At<u16>(host, 2), 0x0203);
    EXPECT_EQ(At<u32>(host, 4), 0x04050607u);
    EXPECT_EQ(At<u32>(host, 8), 0x08090A0Bu);
    EXPECT_EQ(At<u32>(host, 36), 0x24252627u);
    EXPECT_EQ(host[40], 40);
    EXPECT_EQ(host[41], 41);
    EXPECT_EQ(At<u16>(host, 42), 0x2A2B);
    EXPECT_EQ(At<u32>(host, 44), 0x2C2D2E2Fu);
    EXPECT_EQ(At<u16>(host, 48), 0x3031);
    EXPECT_EQ(At<u16>(host, 62), 0x3E3F);
    EXPECT_EQ(At<u32>(host, 64), 0x40414243u);
    EXPECT_EQ(At<u16>(host, 72), 0x4849);
    EXPECT_EQ(At<u32>(host, 84), 0x54555657u);
}

TEST(ConvertCatalog, FileRecord) {
    const Bytes host = ToMemory(kCatalogFileId, Counting(248, {0, 2}));
    EXPECT_EQ(At<u16>(host, 0), 2);
    EXPECT_EQ(At<u32>(host, 48), 0x30313233u);
    EXPECT_EQ(At<u16>(host, 56), 0x3839);
    EXPECT_EQ(At<u32>(host, 64), 0x40414243u);
    EXPECT_EQ(At<u64>(host, 88), 0x58595A5B5C5D5E5Full);
    EXPECT_EQ(At<u32>(host, 96), 0x60616263u);
    EXPECT_EQ(At<u32>(host, 164), 0xA4A5A6A7u);
    EXPECT_EQ(At<u64>(host, 168), 0xA8A9AAABACADAEAFull);
    EXPECT_EQ(At<u32>(host, 244), 0xF4F5F6F7u);
}

TEST(ConvertCatalog, ThreadRecord) {
    const Bytes host = ToMemory(kCatalogFileId, {0, 4, 0, 0, 0, 0, 0, 2, 0, 2, 0, 'a', 0x20, 0xAC});
    EXPECT_EQ(At<u16>(host, 0), 4);
    EXPECT_EQ(At<u32>(host, 4), 2u);
    EXPECT_EQ(At<u16>(host, 8), 2);
    EXPECT_EQ(At<u16>(host, 10), u16{'a'});
    EXPECT_EQ(At<u16>(host, 12), 0x20AC);
}

TEST(ConvertAttributes, InlineRecordLeavesTheValueAlone) {
    const Bytes host = ToMemory(kAttributesFileId, Counting(21, {0, 0, 0, 0x10}));
    EXPECT_EQ(At<u32>(host, 0), 0x10u);
    EXPECT_EQ(At<u32>(host, 12), 0x0C0D0E0Fu);
    EXPECT_EQ(host[16], 16);
    EXPECT_EQ(host[20], 20);
}

TEST(ConvertAttributes, ForkAndExtentsRecords) {
    const Bytes fork = ToMemory(kAttributesFileId, Counting(88, {0, 0, 0, 0x20}));
    EXPECT_EQ(At<u64>(fork, 8), 0x08090A0B0C0D0E0Full);
    EXPECT_EQ(At<u32>(fork, 16), 0x10111213u);
    const Bytes extents = ToMemory(kAttributesFileId, Counting(72, {0, 0, 0, 0x30}));
    EXPECT_EQ(At<u32>(extents, 0), 0x30u);
    EXPECT_EQ(At<u32>(extents, 68), 0x44454647u);
}

TEST(ConvertExtents, RecordsStayAsTheyAreOnDisk) {
    const Bytes stored = Counting(64, {0, 0});
    EXPECT_EQ(ToMemory(kExtentsFileId, stored), stored);
    EXPECT_EQ(ToDisk(kExtentsFileId, stored), stored);
}

TEST(ConvertUnknown, BodyIsCopiedAndTheTypeComesBack) {
    for (const Bytes& type : {Bytes{1, 0}, Bytes{0, 5}, Bytes{0xFF, 0xFF}}) {
        Bytes stored = Counting(30, {});
        std::copy(type.begin(), type.end(), stored.begin());
        const Bytes host = ToMemory(kCatalogFileId, stored);
        EXPECT_TRUE(std::equal(host.begin() + 2, host.end(), stored.begin() + 2));
        EXPECT_EQ(ToDisk(kCatalogFileId, host), stored);
    }
}

// Every record type at every size, in a buffer of exactly that size: the sanitizer sees any step
// outside it.
TEST(ConvertRoundTrip, EveryRecordAtEverySize) {
    std::mt19937 random(3);
    const u32 fileIds[] = {kCatalogFileId, kExtentsFileId, kAttributesFileId, kStartupFileId};
    const Bytes types[] = {{0, 1}, {0, 2},        {0, 3},        {0, 4},        {1, 0},
                           {2, 0}, {0, 0, 0, 16}, {0, 0, 0, 32}, {0, 0, 0, 48}, {16, 0, 0, 0}};
    for (const u32 fileId : fileIds) {
        for (const Bytes& type : types) {
            for (std::size_t size = 0; size < 270; ++size) {
                Bytes stored(size);
                for (u8& byte : stored) {
                    byte = static_cast<u8>(random());
                }
                std::copy_n(type.begin(), std::min(type.size(), size), stored.begin());
                ASSERT_EQ(ToDisk(fileId, ToMemory(fileId, stored)), stored)
                    << fileId << ' ' << size;
            }
        }
    }
}

TEST(ConvertKeys, CatalogKey) {
    const Bytes stored = {0, 8, 0, 0, 0, 2, 0, 1, 0x20, 0xAC};
    Bytes host(stored.size());
    ConvertFor(kCatalogFileId).KeyToMemory(host.data(), stored.data(), 10);
    EXPECT_EQ(At<u16>(host, 0), 8);
    EXPECT_EQ(At<u32>(host, kCatKeyParentId), 2u);
    EXPECT_EQ(At<u16>(host, kCatKeyNameLength), 1);
    EXPECT_EQ(At<u16>(host, kCatKeyName), 0x20AC);
    Bytes back(stored.size());
    ConvertFor(kCatalogFileId).KeyToDisk(back.data(), host.data());
    EXPECT_EQ(back, stored);
}

TEST(ConvertKeys, AttributesKey) {
    const Bytes stored = {0, 14, 0, 0, 0, 0, 0, 20, 0, 0, 0, 8, 0, 1, 0, 'x'};
    Bytes host(stored.size());
    ConvertFor(kAttributesFileId).KeyToMemory(host.data(), stored.data(), 16);
    EXPECT_EQ(At<u32>(host, kAttrKeyFileId), 20u);
    EXPECT_EQ(At<u32>(host, kAttrKeyStartBlock), 8u);
    EXPECT_EQ(At<u16>(host, kAttrKeyName), u16{'x'});
    Bytes back(stored.size());
    ConvertFor(kAttributesFileId).KeyToDisk(back.data(), host.data());
    EXPECT_EQ(back, stored);
}

TEST(ConvertKeys, ExtentsKeyGoesInFromHostOrderAndComesOutAsStored) {
    Bytes host(kExtKeySize);
    const u16 length = kExtMaxKeyLength;
    const u32 file = 5;
    const u32 block = 0x01020304;
    std::memcpy(host.data(), &length, 2);
    host[kExtKeyForkType] = kForkResource;
    std::memcpy(host.data() + kExtKeyFileId, &file, 4);
    std::memcpy(host.data() + kExtKeyStartBlock, &block, 4);
    Bytes stored(kExtKeySize);
    ConvertFor(kExtentsFileId).KeyToDisk(stored.data(), host.data());
    const Bytes expected = {0, 10, 0xFF, 0, 0, 0, 0, 5, 1, 2, 3, 4};
    EXPECT_EQ(stored, expected);
    Bytes out(kExtKeySize);
    ConvertFor(kExtentsFileId).KeyToMemory(out.data(), stored.data(), kExtKeySize);
    EXPECT_EQ(out, stored);
}

// A field that the size cuts stays as it is stored, and nothing behind the size is written.
TEST(ConvertKeys, SizeCutsTheKeyShort) {
    if (std::endian::native != std::endian::little) {
        GTEST_SKIP() << "the host has the disk's byte order";
    }
    const Bytes stored = {0, 8, 0, 0, 0, 2, 0, 1, 0x20, 0xAC};
    const struct {
        u32 fileId;
        Bytes host;
        std::vector<std::size_t> fieldEnds;
    } keys[] = {
        {kCatalogFileId, {8, 0, 2, 0, 0, 0, 1, 0, 0xAC, 0x20}, {0, 2, 6, 8, 10}},
        {kAttributesFileId, {8, 0, 0, 0, 1, 0, 2, 0, 0x20, 0xAC}, {0, 2, 4, 8}},
    };
    for (const auto& key : keys) {
        for (unsigned size = 0; size <= stored.size(); ++size) {
            const Bytes source(stored.begin(), stored.begin() + size);
            Bytes host(size + 1, 0xEE);
            ConvertFor(key.fileId).KeyToMemory(host.data(), source.data(), size);
            const auto whole =
                *(std::upper_bound(key.fieldEnds.begin(), key.fieldEnds.end(), size) - 1);
            Bytes expected(key.host.begin(), key.host.begin() + static_cast<std::ptrdiff_t>(whole));
            expected.insert(expected.end(), source.begin() + static_cast<std::ptrdiff_t>(whole),
                            source.end());
            expected.push_back(0xEE);
            EXPECT_EQ(host, expected) << "file " << key.fileId << ", " << size << " bytes";
        }
    }
}

TEST(ConvertBuffers, LongestKeysAndRecords) {
    EXPECT_EQ(ConvertFor(kCatalogFileId).minKeyBuffer, 518);
    EXPECT_EQ(ConvertFor(kCatalogFileId).minDataBuffer, 520);
    EXPECT_EQ(ConvertFor(kExtentsFileId).minKeyBuffer, 12);
    EXPECT_EQ(ConvertFor(kExtentsFileId).minDataBuffer, 64);
    EXPECT_EQ(ConvertFor(kAttributesFileId).minKeyBuffer, 268);
}

}  // namespace
}  // namespace VELK
