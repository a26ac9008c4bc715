// create-tree: adds a tree the volume lacks, usually the attributes tree.
#include "hfs/records/text_format.h"
#include "tool/command.h"
#include "tool/errors.h"
#include "tool/format_args.h"
#include "tool/script_volume.h"

namespace VELK::tool {

namespace {

constexpr u64 kDefaultNodeSize = 8192;

int RunCreateTree(Invocation* call) {
    TargetOptions target;
    std::optional<u64> nodeSize;
    std::optional<u64> size;
    call->options.Argument("IMAGE", &call->image, "disk image");
    call->DeclareTrees(TreeDefault::kAttributes);
    target.DeclareForImage(call);
    call->options.Size("--node-size", &nodeSize, "BYTES", "512 to 32768 (8192)");
    call->options.Size("--tree-size", &size, "BYTES", "first size of the file (one clump)");
    call->Parse();
    const u32 fileId = call->trees.front();
    const u32 nodeShift = NodeShiftOf(nodeSize.value_or(kDefaultNodeSize));
    const std::unique_ptr<ImageVolume> volume = OpenTarget(*call, target);
    const u64 before = volume->HandedOverBlocks();
    if (volume->HasTree(fileId)) {
        ThrowFailed(call->image,
                    fmt::format("the volume has a tree of {} already", ForkName(fileId)),
                    "nothing was changed");
    }
    const int status = volume->CreateTree(fileId, nodeShift, size ? &*size : nullptr);
    if (status != kOk) {
        volume->RestoreAfter(status);
        ThrowFailed(call->image,
                    fmt::format("{} tree: {}", ForkName(fileId), StatusWithCode(status)),
                    "nothing was changed");
    }
    const CBTreeHfs* tree = volume->Tree(fileId, nullptr);
    call->out.Print("{}: {} tree of {} of {} B, {}\n", call->image, ForkName(fileId),
                    Counted(tree->header.totalNodes, "node", "nodes"),
                    Grouped(tree->header.nodeSize),
                    BinarySize(volume->Fs()->ForkOf(fileId)->logicalSize));
    call->out.Flush();
    FinishTarget(*call, target, volume.get(), before);
    return kExitDone;
}

}  // namespace

extern const Command kCreateTreeCommand;
const Command kCreateTreeCommand = {
    "create-tree",
    "IMAGE",
    "add a tree the volume lacks, usually the attributes tree",
    "Without --write the change stays in memory and is gone at the end.",
    {"create-tree -t attributes disk.img --write",
     "create-tree -t attributes disk.img --node-size 4096 --write",
     "create-tree -t a disk.img --save with-attributes.img"},
    RunCreateTree,
};

}  // namespace VELK::tool
