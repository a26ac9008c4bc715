// Refusals of writing, and the order of writes on a volume without a journal.
#include "hfs/volume/write_checks.h"

#include "hfs/volume/volume_header.h"
#include "hfs/volume/wire.h"

namespace VELK {

namespace {

constexpr u32 kAttributesInHeader = 4;

}  // namespace

Problem CheckMayWrite(const VolumeHeader& header, const JournalState& journal, bool force) {
    if ((header.attributes & kVolSoftwareLock) != 0) {
        return Failure("the volume is locked against writing (attribute bit 15)",
                       "it can only be read");
    }
    if (force) {
        return {};
    }
    if (journal.present && !journal.readable) {
        return Failure(journal.text, "let the native system repair it, or --force");
    }
    if (journal.present && !journal.empty) {
        return FailureAt(journal.offset,
                         "the journal holds transactions (" + Grouped(journal.pendingBytes) + " B)",
                         "writing would lose them; let the native system replay it, or --force");
    }
    if ((header.attributes & kVolUnmounted) == 0 ||
        (header.attributes & kVolBootInconsistent) != 0) {
        return Failure("the volume was not unmounted cleanly", "run check, then --force");
    }
    return {};
}

IoResult HeaderLastSink::Carry(const OverlayDevice& staged, BlockDevice* home, u64* bytesWritten) {
    u8 header[kHeaderSize];
    IoResult result = home->Read(headerOffset_, header, sizeof header);
    if (!result.Ok()) {
        return result;
    }
    const u32 attributes = Be32(header + kAttributesInHeader);
    if ((attributes & kVolUnmounted) != 0) {
        StoreBe32(header + kAttributesInHeader, attributes & ~kVolUnmounted);
        result = home->Write(headerOffset_, header, sizeof header);
        *bytesWritten += sizeof header;
        if (result.Ok()) {
            result = home->Sync();
        }
    }
    if (result.Ok()) {
        result = CarryExcept(staged, home, headerOffset_, kHeaderSize, bytesWritten);
    }
    if (result.Ok()) {
        result = home->Sync();
    }
    // The staged device shows the header as it is to be, whatever of it was staged.
    if (result.Ok()) {
        result = staged.Peek(headerOffset_, header, sizeof header);
    }
    if (result.Ok()) {
        StoreBe32(
            header + kAttributesInHeader,
            (Be32(header + kAttributesInHeader) & ~kVolUnmounted) | (attributes & kVolUnmounted));
        result = home->Write(headerOffset_, header, sizeof header);
        *bytesWritten += sizeof header;
    }
    return result.Ok() ? home->Sync() : result;
}

}  // namespace VELK
