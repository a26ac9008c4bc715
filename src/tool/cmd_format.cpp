// format: a new volume in a file, its trees made by the engine.
#include <sys/stat.h>
#include <unistd.h>

#include "hfs/records/text_format.h"
#include "hfs/volume/make_volume.h"
#include "tool/command.h"
#include "tool/errors.h"
#include "tool/format_args.h"
#include "tool/wrap_volume.h"

namespace VELK::tool {

namespace {

constexpr u64 kSmallestVolume = 64u << 10;

struct FormatArguments {
    std::optional<u64> size;
    std::optional<u64> blockSize;
    std::optional<u64> catalogSize;
    std::optional<u64> clump;
    std::optional<u64> journal;
    std::string nodeSizes;
    std::optional<std::string> name;
    std::string date;
    std::string uuid;
    std::string wrap = "none";
    bool caseSensitive = false;
    bool withAttributes = false;
    bool empty = false;

    void Declare(Invocation* call) {
        OptionSet& options = call->options;
        options.Size("--size", &size, "BYTES",
                     "of the volume: 64M; not for a device, which it fills");
        options.Text("--name", &name, "NAME", "of the volume (Untitled)");
        options.Size("--block-size", &blockSize, "BYTES", "allocation block, 512 to 65536 (4096)");
        options.Text("--node-size", &nodeSizes, "BYTES",
                     "of all trees, or by tree: c=8192,e=4096,a=8192");
        options.Size("--catalog-size", &catalogSize, "BYTES", "first size of the catalog file");
        options.Size("--clump", &clump, "BYTES", "growth step of the tree files");
        options.Size("--journal", &journal, "BYTES", "with a journal of this size, 32K to 1G");
        options.Flag("--case-sensitive", &caseSensitive, "HFSX, names compared binary");
        options.Flag("--with-attributes", &withAttributes, "make the attributes tree as well");
        options.Flag("--empty", &empty, "no records at all: for import");
        options.Text("--date", &date, "ISO", "written to every date: 2026-11-21T00:00:00Z (now)");
        options.Text("--uuid", &uuid, "HEX", "volume identifier of 16 digits (random)");
        options.Choice("--wrap", &wrap, {"none", "apm", "gpt"},
                       "a partition map around the volume, which makes the file a little larger");
        options.Flag("--force", &call->force, "replace a file that exists, or what a device holds");
    }
};

u32 Size32(const char* option, const std::optional<u64>& value, u32 otherwise) {
    if (!value) {
        return otherwise;
    }
    if (*value > 0xFFFFFFFF) {
        ThrowUsage("format", fmt::format("{} {} is too large", option, Grouped(*value)), "");
    }
    return static_cast<u32>(*value);
}

FormatOptions OptionsOf(const FormatArguments& arguments) {
    FormatOptions options;
    options.caseSensitive = arguments.caseSensitive;
    options.blockSize = Size32("--block-size", arguments.blockSize, options.blockSize);
    options.clumpSize = Size32("--clump", arguments.clump, 0);
    options.catalogSize = arguments.catalogSize.value_or(0);
    options.withAttributes = arguments.withAttributes;
    options.withRoot = !arguments.empty;
    options.journalSize = arguments.journal.value_or(0);
    ReadNodeSizes(arguments.nodeSizes, &options);
    options.date = arguments.date.empty() ? HfsNow() : ReadDate(arguments.date);
    options.uuid = arguments.uuid.empty() ? RandomUuid() : ReadUuid(arguments.uuid);
    if (arguments.name) {
        options.name = StoredName(*arguments.name);
    }
    return options;
}

std::string TreeSentence(ImageVolume* volume, u32 fileId) {
    if (!volume->HasTree(fileId)) {
        return fmt::format("{} none", ForkName(fileId));
    }
    CBTreeHfs* tree = volume->Tree(fileId, nullptr);
    return fmt::format("{} {} ({} of {} B)", ForkName(fileId),
                       BinarySize(volume->Fs()->ForkOf(fileId)->logicalSize),
                       Counted(tree->header.totalNodes, "node", "nodes"),
                       Grouped(tree->header.nodeSize));
}

bool IsBlockDevice(const std::string& path) {
    struct stat info;
    return stat(path.c_str(), &info) == 0 && S_ISBLK(info.st_mode);
}

// Opens the device, or makes the file: one that is there loses what it holds only for a volume that
// can be made.
std::unique_ptr<FileDevice> OpenPlace(const Invocation& call, WrapScheme scheme,
                                      const std::optional<u64>& size,
                                      const FormatOptions& options) {
    Problem problem;
    const bool exists = access(call.image.c_str(), F_OK) == 0;
    if (!IsBlockDevice(call.image) && !size) {
        ThrowUsage("format", "how large is the volume to be?", "give --size, for example 64M");
    }
    if (size && *size < kSmallestVolume) {
        ThrowUsage("format", fmt::format("--size {} is too small", Grouped(*size)),
                   "a volume takes 64K at least");
    }
    problem = size ? CheckFormat(*size, options) : Problem{};
    if (problem) {
        ThrowProblem(call.image, problem);
    }
    std::unique_ptr<FileDevice> device = FileDevice::Open(
        call.image, FileDevice::Mode::kCreate, size ? WrappedSize(scheme, *size) : 0, &problem);
    if (!device) {
        if (!exists) {
            std::remove(call.image.c_str());
        }
        ThrowProblem(call.image, problem);
    }
    if (size && device->Size() != WrappedSize(scheme, *size)) {
        ThrowUsage("format",
                   fmt::format("--size {}: the device {} has {} bytes", Grouped(*size), call.image,
                               Grouped(device->Size())),
                   "leave it out: the volume takes all of a device");
    }
    return device;
}

int RunFormat(Invocation* call) {
    FormatArguments arguments;
    call->options.Argument("IMAGE", &call->image, "file to make, or block device");
    arguments.Declare(call);
    call->Parse();
    const bool exists = access(call->image.c_str(), F_OK) == 0;
    const bool isDevice = IsBlockDevice(call->image);
    if (exists && !call->force) {
        ThrowFailed("", call->image + (isDevice ? " is a device" : " exists"),
                    isDevice ? "--force replaces what it holds" : "--force replaces it");
    }
    FormatOptions options = OptionsOf(arguments);
    options.deviceIsZero = !isDevice;
    Problem problem;
    const WrapScheme scheme = arguments.wrap == "apm"   ? WrapScheme::kApm
                              : arguments.wrap == "gpt" ? WrapScheme::kGpt
                                                        : WrapScheme::kNone;
    if (isDevice && scheme != WrapScheme::kNone) {
        ThrowUsage("format", "--wrap makes a map in a file, not on a device",
                   "name a partition of the device");
    }
    std::unique_ptr<BlockDevice> device = OpenPlace(*call, scheme, arguments.size, options);
    if (!isDevice) {
        const IoResult mapped =
            WriteMap(scheme, device.get(), {*arguments.size, options.caseSensitive, options.uuid});
        if (!mapped.Ok()) {
            ThrowFailed(call->image, "cannot write: " + IoErrorText(mapped.error), "");
        }
        device = VolumeWithin(scheme, std::move(device), *arguments.size);
    }
    const std::unique_ptr<ImageVolume> volume = MakeVolume(std::move(device), options, &problem);
    if (!volume) {
        if (!exists) {
            std::remove(call->image.c_str());
        }
        ThrowProblem(call->image, problem);
    }
    call->out.Print("{}: {}, {} blocks of {} B; {}, {}, {}\n", call->image,
                    options.caseSensitive ? "HFSX" : "HFS Plus", Grouped(volume->Fs()->totalBlocks),
                    Grouped(options.blockSize), TreeSentence(volume.get(), kCatalogFileId),
                    TreeSentence(volume.get(), kExtentsFileId),
                    TreeSentence(volume.get(), kAttributesFileId));
    return kExitDone;
}

}  // namespace

extern const Command kFormatCommand;
const Command kFormatCommand = {
    "format",
    "IMAGE --size BYTES",
    "a new volume whose trees the engine makes",
    "IMAGE is a file to make, or a block device. With --date and --uuid two runs give identical "
    "bytes.",
    {"format new.img --size 64M --name Test",
     "format new.img --size 1G --node-size c=8192,e=4096,a=8192 --with-attributes",
     "format new.img --size 16M --case-sensitive --date 2026-11-21T00:00:00Z --uuid 1"},
    RunFormat,
};

}  // namespace VELK::tool
