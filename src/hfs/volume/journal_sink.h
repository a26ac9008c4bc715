// Carries changes to a volume by way of its journal: first all of them into the ring, then the
// journal header that makes them count, then each to its place.
//
// One commit costs two syncs. The first makes the ring's bytes durable, and with them whatever the
// commit before it wrote to its places, so the journal header written next can let go of that older
// transaction in the same sector in which it takes up the new one.
#pragma once

#include "hfs/volume/journal_state.h"
#include "hfs/volume/transaction.h"

namespace VELK {

class JournalSink : public CommitSink {
public:
    struct Options {
        u64 volumeOffset = 0;   // of the volume, bytes of the image
        u64 volumeBytes = 0;    // a multiple of the sector size
        bool mustInit = false;  // the journal holds nothing that counts: begin with an empty one
        bool endsClean = true;  // Finish sets the clean bit
    };

    JournalSink(const JournalPlace& place, const Options& options)
        : place_(place), options_(options) {}
    IoResult Carry(const OverlayDevice& staged, BlockDevice* home, u64* bytesWritten) override;
    IoResult Finish(BlockDevice* home) override;

    // Bytes of the ring that the last Carry needed, and that one transaction can have.
    u64 Needed() const { return needed_; }
    u64 Largest() const { return place_.header.Largest(); }

private:
    // Neighbouring changed sectors, in bytes of the volume.
    struct Stretch {
        u64 offset;
        u32 bytes;
    };

    u64 HeaderOffset() const { return options_.volumeOffset + kHeaderOffset; }
    std::vector<Stretch> Collect(const OverlayDevice& staged) const;
    IoResult Begin(BlockDevice* home, u64* bytesWritten);
    IoResult Initialise(BlockDevice* home);
    IoResult Empty(BlockDevice* home);
    IoResult MarkClean(BlockDevice* home);
    IoResult Log(const OverlayDevice& staged, const std::vector<Stretch>& stretches,
                 BlockDevice* home, u64* bytesWritten);
    IoResult WriteHome(const OverlayDevice& staged, const std::vector<Stretch>& stretches,
                       BlockDevice* home, u64* bytesWritten);
    IoResult ReadStaged(const OverlayDevice& staged, Stretch stretch, u8* target) const;
    IoResult CarryAll(const OverlayDevice& staged, BlockDevice* home, u64* bytesWritten);

    JournalPlace place_;
    Options options_;
    bool hasBegun_ = false;
    bool hasFailed_ = false;
    u64 needed_ = 0;
};

}  // namespace VELK
