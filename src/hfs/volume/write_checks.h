// What stands between a volume and being written to.
#pragma once

#include "hfs/volume/image_volume.h"
#include "hfs/volume/transaction.h"

namespace VELK {

// Whether a volume in this state may be changed on its medium. With `force` a journal that is not
// empty and a volume that was not unmounted cleanly are let pass.
Problem CheckMayWrite(const VolumeHeader& header, const JournalState& journal, bool force);

// Carries changes to a volume that has no journal: the clean bit is cleared on the medium before
// anything else is written, and the volume header, which sets it again, comes last. A cut in
// between leaves a volume that says it was not unmounted cleanly.
class HeaderLastSink : public CommitSink {
public:
    // `headerOffset`: image offset of the volume header.
    explicit HeaderLastSink(u64 headerOffset) : headerOffset_(headerOffset) {}
    IoResult Carry(const OverlayDevice& staged, BlockDevice* home, u64* bytesWritten) override;

private:
    u64 headerOffset_;
};

}  // namespace VELK
