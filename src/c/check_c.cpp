// The C interface: the checker.
#include "c/handles.h"
#include "hfs/check/check.h"

using namespace VELK;

namespace {

// Where findings go, and whether the caller has had enough.
struct Telling {
    treehfs_finding_fn told;
    void* self;
    bool wantsNoMore = false;
};

void Tell(void* self, const CheckFinding& finding) {
    Telling* telling = static_cast<Telling*>(self);
    if (telling->told == nullptr || telling->wantsNoMore) {
        return;
    }
    auto out = Sized<treehfs_finding>();
    out.severity = static_cast<u32>(finding.severity);
    out.id = CheckIdOf(finding.id).name;
    out.tree = finding.tree;
    out.record = finding.record;
    out.node = finding.node;
    out.offset = finding.offset;
    out.where = finding.where.c_str();
    out.text = finding.text.c_str();
    telling->wantsNoMore = telling->told(telling->self, &out) != 0;
}

bool GoOn(void* self, const CheckProgress&) {
    return !static_cast<const Telling*>(self)->wantsNoMore;
}

int Read(void* self, u64 offset, void* target, std::size_t size) {
    return static_cast<ImageVolume*>(self)->ReadVolume(offset, target, size);
}

// Bytes from the volume's start to its end, or to the image's if that comes first.
u64 ReadableBytes(const treehfs_volume& handle) {
    const VolumePlace& place = handle.volume->Place();
    const u64 behind = handle.imageBytes > place.offset ? handle.imageBytes - place.offset : 0;
    return place.size != 0 ? std::min(behind, place.size) : behind;
}

int Check(treehfs_volume* handle, const treehfs_check_options& from, Telling* telling,
          treehfs_check_summary* summary) {
    CheckOptions options;
    options.quick = (from.flags & TREEHFS_CHECK_QUICK) != 0;
    options.full = (from.flags & TREEHFS_CHECK_FULL) != 0;
    options.keepGoing = (from.flags & TREEHFS_CHECK_KEEP_GOING) != 0;
    options.maxErrors = from.max_errors;
    options.backupHeader = handle->volume->UsedBackupHeader();
    const CheckSource source = {handle->volume.get(), Read, ReadableBytes(*handle),
                                handle->volume->Place().offset};
    CheckSink sink;
    sink.self = telling;
    sink.finding = Tell;
    sink.progress = GoOn;
    const CheckSummary result = CheckVolume(source, options, sink);
    auto out = Sized<treehfs_check_summary>();
    out.errors = result.errors;
    out.warnings = result.warnings;
    out.infos = result.infos;
    out.unreadable = result.unreadable;
    out.stopped = result.isStopped ? 1 : 0;
    out.nodes = result.nodes;
    out.bytes = result.bytes;
    return summary == nullptr ? kOk : GiveStruct(out, summary);
}

}  // namespace

int treehfs_check(treehfs_volume* volume, const treehfs_check_options* options,
                  treehfs_finding_fn told, void* self, treehfs_check_summary* summary) {
    auto from = Sized<treehfs_check_options>();
    if (volume == nullptr || !TakeStruct(options, &from)) {
        return FailC(kErrInvalid, "no volume, or options without a size");
    }
    if (volume->hasChanges || volume->lost != kOk) {
        return FailC(kErrInvalid, "there are changes that wait: commit or roll back first");
    }
    return Guarded([&] {
        Telling telling = {told, self};
        return Check(volume, from, &telling, summary);
    });
}
