// undo: puts back what a command with --undo FILE has overwritten.
#include "hfs/records/name_text.h"
#include "hfs/records/text_format.h"
#include "tool/command.h"
#include "tool/errors.h"
#include "tool/undo_file.h"

namespace VELK::tool {

namespace {

UndoLog ReadLog(const std::string& path) {
    UndoLog log;
    if (const Problem problem = ReadUndoLog(path, &log)) {
        ThrowProblem("", problem);
    }
    return log;
}

void MustFit(const Invocation& call, const std::string& path, const UndoLog& log,
             BlockDevice* image) {
    if (log.imageSize != image->Size()) {
        ThrowFailed(call.image,
                    fmt::format("has {} bytes, the image that {} belongs to had {}",
                                Grouped(image->Size()), path, Grouped(log.imageSize)),
                    "");
    }
    u64 sum = 0;
    const IoResult result = SumOfStretches(image, log, &sum);
    if (!result.Ok()) {
        ThrowFailed(call.image, "cannot be read: " + IoErrorText(result.error), "");
    }
    if (log.isComplete && sum != log.newBytesSum && !call.force) {
        ThrowFailed(call.image, "has changed since " + path + " was written",
                    "--force puts the old bytes back all the same");
    }
}

int RunUndo(Invocation* call) {
    std::string path;
    call->options.Argument("IMAGE", &call->image, "the image that was changed");
    call->options.Argument("FILE", &path, "what --undo has written");
    call->options.Flag("--force", &call->force, "even if the image has changed since");
    call->Parse();
    const UndoLog log = ReadLog(path);
    Problem problem;
    const std::unique_ptr<FileDevice> image =
        FileDevice::Open(call->image, FileDevice::Mode::kReadWrite, 0, &problem);
    if (!image) {
        ThrowProblem(call->image, problem);
    }
    MustFit(*call, path, log, image.get());
    u64 bytes = 0;
    for (const UndoStretch& stretch : log.stretches) {
        const IoResult result =
            image->Write(stretch.offset, stretch.bytes.data(), stretch.bytes.size());
        if (!result.Ok()) {
            ThrowFailed(call->image, "cannot write: " + IoErrorText(result.error),
                        "run the command again when the cause is mended");
        }
        bytes += stretch.bytes.size();
    }
    if (const IoResult result = image->Sync(); !result.Ok()) {
        ThrowFailed(call->image, "cannot write: " + IoErrorText(result.error), "");
    }
    call->out.Print("{}: {} put back{}\n", EscapedText(call->image),
                    Counted(bytes, "byte", "bytes"),
                    log.isComplete ? "" : "; the command that changed it did not end by itself");
    return kExitDone;
}

}  // namespace

extern const Command kUndoCommand;
const Command kUndoCommand = {
    "undo",
    "IMAGE FILE",
    "put back what a command with --undo FILE has overwritten",
    "Every command that takes --write takes --undo FILE as well. The file serves after a crash, "
    "too.",
    {"apply disk.img changes.tr --write --undo before.undo", "undo disk.img before.undo",
     "undo --force disk.img before.undo"},
    RunUndo,
};

}  // namespace VELK::tool
