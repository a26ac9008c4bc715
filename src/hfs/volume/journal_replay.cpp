// The walk over the transactions of a journal, oldest first. Nothing in it is believed: every list
// consumes bytes of the ring, every target is bounded before anything of its transaction is
// written, and the journal itself is no target.
#include "hfs/volume/journal_replay.h"

#include <algorithm>

namespace VELK {

namespace {

constexpr u64 kPiece = 1u << 16;

// A block of the transaction that is being collected.
struct WaitingBlock {
    u64 target;    // volume byte
    u64 position;  // of its data in the ring
    u32 bytes;
};

class Walk {
public:
    Walk(BlockDevice* volume, const JournalPlace& place, BlockDevice* target)
        : volume_(volume),
          place_(place),
          target_(target),
          position_(place.header.start),
          left_(place.header.Used()),
          bytes_(place.header.listSize),
          piece_(kPiece) {}

    ReplayResult Run() {
        while (left_ > 0 && result_.io.Ok() && result_.isComplete) {
            TakeList();
        }
        if (result_.io.Ok() && result_.isComplete && !waiting_.empty()) {
            Stop("is missing: the last transaction has no end");
        }
        return result_;
    }

private:
    void Stop(const std::string& why) {
        result_.isComplete = false;
        result_.stoppedAt = place_.offset + position_;
        result_.text = "block list " + why;
    }

    void TakeList() {
        const JournalHeader& header = place_.header;
        if (left_ < header.listSize) {
            return Stop("reaches past the end of the journal");
        }
        result_.io = ReadRing(volume_, place_, position_, bytes_.data(), header.listSize);
        if (!result_.io.Ok()) {
            return;
        }
        JournalList list;
        const std::string wrong = DecodeJournalList(bytes_.data(), header, left_, &list);
        if (!wrong.empty()) {
            return Stop(wrong);
        }
        u64 data = header.Advance(position_, header.listSize);
        for (const JournalBlock& block : list.blocks) {
            if (block.sector != JournalBlock::kSkip && !Collect(block, data)) {
                return Stop("has a block that goes outside the volume or into the journal");
            }
            data = header.Advance(data, block.bytes);
        }
        position_ = header.Advance(position_, list.bytesUsed);
        left_ -= list.bytesUsed;
        if (list.isLast) {
            CarryOut();
        }
    }

    bool Collect(const JournalBlock& block, u64 position) {
        const u64 size = volume_->Size();
        if (block.sector > size / place_.header.sectorSize) {
            return false;
        }
        const u64 target = block.sector * place_.header.sectorSize;
        if (target > size || block.bytes > size - target || place_.Touches(target, block.bytes)) {
            return false;
        }
        if (block.bytes != 0) {
            waiting_.push_back({target, position, block.bytes});
        }
        return true;
    }

    void CarryOut() {
        for (const WaitingBlock& block : waiting_) {
            for (u64 done = 0; done < block.bytes && result_.io.Ok();) {
                const u64 size = std::min<u64>(block.bytes - done, kPiece);
                const u64 from = place_.header.Advance(block.position, done);
                result_.io = ReadRing(volume_, place_, from, piece_.data(), size);
                if (result_.io.Ok()) {
                    result_.io = target_->Write(block.target + done, piece_.data(),
                                                static_cast<std::size_t>(size));
                }
                done += size;
            }
        }
        result_.blocks += waiting_.size();
        result_.transactions += 1;
        waiting_.clear();
    }

    BlockDevice* volume_;
    const JournalPlace& place_;
    BlockDevice* target_;
    u64 position_;
    u64 left_;
    std::vector<u8> bytes_;
    std::vector<u8> piece_;
    std::vector<WaitingBlock> waiting_;
    ReplayResult result_;
};

}  // namespace

ReplayResult ReplayJournal(BlockDevice* volume, const JournalPlace& place, BlockDevice* target) {
    return Walk(volume, place, target).Run();
}

}  // namespace VELK
