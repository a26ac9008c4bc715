// The checker's view of a volume on a device. By itself: the checker's names and the engine's do
// not go together in one file.
#include <gtest/gtest.h>

#include <string>

#include "hfs/check/check.h"
#include "hfs/volume/block_device.h"

namespace VELK::test {

std::string CheckAll(BlockDevice* device);

namespace {

int ReadForCheck(void* self, u64 offset, void* target, std::size_t size) {
    return static_cast<BlockDevice*>(self)->Read(offset, target, size).error;
}

void TakeFinding(void* self, const CheckFinding& finding) {
    if (finding.severity != CheckSeverity::kInfo) {
        *static_cast<std::string*>(self) += CheckFindingLine(finding) + "\n";
    }
}

}  // namespace

std::string CheckAll(BlockDevice* device) {
    std::string lines;
    CheckOptions options;
    options.full = true;
    CheckSink sink;
    sink.self = &lines;
    sink.finding = TakeFinding;
    // Records of the tests are no catalog items: their types are unknown on purpose.
    options.skip = CheckIdBit(CheckId::R01) | CheckIdBit(CheckId::R03) | CheckIdBit(CheckId::R04);
    const CheckSummary summary =
        CheckVolume({device, ReadForCheck, device->Size(), 0}, options, sink);
    EXPECT_GT(summary.nodes, 0u);
    EXPECT_EQ(0u, summary.unreadable);
    return lines;
}

}  // namespace VELK::test
