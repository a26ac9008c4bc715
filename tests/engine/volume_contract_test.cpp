// The volume under the tests: does it notice an engine that keeps to no contract with a journal?
#include <gtest/gtest.h>

#include "mem_volume.h"

namespace {

using namespace VELK;
using namespace VELK::test;

class VolumeContract : public ::testing::Test {
protected:
    VolumeContract() {
        volume_.LoadFile(kCatalogFileId, Bytes(512, 0x11));
        EXPECT_EQ(volume_.fs.Map(nullptr, nullptr, 0, kCatalogFileId, 0, 512, false, &block_), kOk);
    }
    ~VolumeContract() override { volume_.fs.cache.Release(block_.bh, 0); }

    void Ask() { volume_.fs.journal.ops->GetWriteAccess(volume_.fs.journal.self, block_.bh); }
    void HandOver() { volume_.fs.DirtyMeta(block_.bh); }
    std::vector<std::string> TakeBreaches() { return std::exchange(volume_.breaches, {}); }

    MemVolume volume_{{.mapBlockSize = 512, .allocBlockSize = 512, .hasJournal = true}};
    HfsBcbBuf block_;
};

TEST_F(VolumeContract, AskingBeforeEachChangeIsFine) {
    for (const u8 value : {u8{1}, u8{2}}) {
        Ask();
        block_.data[7] = value;
        HandOver();
    }
    EXPECT_EQ(TakeBreaches(), std::vector<std::string>{});
}

TEST_F(VolumeContract, AChangeBeforeAskingIsABreach) {
    block_.data[7] = 1;
    Ask();
    EXPECT_EQ(TakeBreaches(),
              std::vector<std::string>{"a block was changed before journal access"});
}

TEST_F(VolumeContract, HandingOverUnaskedIsABreach) {
    block_.data[7] = 1;
    HandOver();
    EXPECT_EQ(TakeBreaches(),
              std::vector<std::string>{"a block was handed over without journal access"});
}

TEST_F(VolumeContract, AskingOnceIsNotEnoughForTwoHandOvers) {
    Ask();
    HandOver();
    HandOver();
    EXPECT_EQ(TakeBreaches(),
              std::vector<std::string>{"a block was handed over without journal access"});
}

}  // namespace
