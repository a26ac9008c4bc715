// Pairs of node size and map block size, and a fixture that runs its tests on each.
#pragma once

#include <gtest/gtest.h>

#include <ostream>
#include <string>
#include <vector>

#include "platform/types.h"

namespace VELK::test {

struct Geometry {
    u32 nodeSize;
    u32 mapBlock;
    bool inOnePiece = false;  // the blocks of a node lie one behind the other in memory

    u32 Blocks() const { return nodeSize / mapBlock; }
};

inline std::ostream& operator<<(std::ostream& out, const Geometry& geometry) {
    return out << geometry.nodeSize << " in blocks of " << geometry.mapBlock
               << (geometry.inOnePiece ? ", in one piece" : "");
}

// Every pair a volume can have.
inline std::vector<Geometry> AllGeometries() {
    std::vector<Geometry> all;
    for (u32 nodeSize = 512; nodeSize <= 32768; nodeSize *= 2) {
        for (u32 mapBlock = 512; mapBlock <= nodeSize; mapBlock *= 2) {
            all.push_back({nodeSize, mapBlock});
        }
    }
    return all;
}

// One block, two, many, many in one piece, and the two extremes.
inline std::vector<Geometry> FewGeometries() {
    return {{512, 512},   {1024, 512},  {4096, 512}, {4096, 512, true},
            {4096, 4096}, {8192, 2048}, {32768, 512}};
}

class GeometryTest : public ::testing::TestWithParam<Geometry> {
protected:
    u32 NodeSize() const { return GetParam().nodeSize; }
    u32 MapBlock() const { return GetParam().mapBlock; }
};

inline std::string GeometryName(const ::testing::TestParamInfo<Geometry>& info) {
    return std::to_string(info.param.nodeSize) + "by" + std::to_string(info.param.mapBlock) +
           (info.param.inOnePiece ? "inOnePiece" : "");
}

#define INSTANTIATE_GEOMETRIES(suite, geometries)                                \
    INSTANTIATE_TEST_SUITE_P(Geometry, suite, ::testing::ValuesIn(geometries()), \
                             ::VELK::test::GeometryName)

}  // namespace VELK::test
