// metadump: a volume's metadata alone, names made unreadable, to be given away.
#include <unistd.h>

#include <cstdio>
#include <filesystem>

#include "hfs/records/name_text.h"
#include "hfs/records/text_format.h"
#include "tool/errors.h"
#include "tool/meta_dump.h"

namespace VELK::tool {

namespace {

// The file while it is written; it gets its name when all has gone well.
class PartFile {
public:
    PartFile(const std::string& path, u64 size, bool replace) : path_(path), part_(path + ".part") {
        if (!replace && access(path.c_str(), F_OK) == 0) {
            ThrowFailed("", path + " exists", "--force replaces it");
        }
        Problem problem;
        device_ = FileDevice::Open(part_, FileDevice::Mode::kCreate, size, &problem);
        if (!device_) {
            ThrowProblem(part_, problem);
        }
    }
    PartFile(const PartFile&) = delete;
    PartFile& operator=(const PartFile&) = delete;
    ~PartFile() {
        if (device_) {
            std::remove(part_.c_str());
        }
    }
    BlockDevice* Device() { return device_.get(); }
    void Keep() {
        if (std::rename(part_.c_str(), path_.c_str()) != 0) {
            ThrowFailed(path_, "cannot be written", "");
        }
        device_.reset();
    }

private:
    std::string path_;
    std::string part_;
    std::unique_ptr<FileDevice> device_;
};

int RunMetadump(Invocation* call) {
    std::string path;
    call->DeclareImage();
    call->options.Text("-o,--output", &path, "FILE", "the image to write; needed");
    call->options.Flag("--force", &call->force, "replace FILE if it exists");
    call->DeclareKeepGoing();
    call->DeclareJson();
    call->Parse();
    if (path.empty()) {
        ThrowUsage("metadump", "where is the image to go?", "give -o FILE");
    }
    Session session(*call, Session::Truncated::kRefuse);
    std::error_code none;
    if (std::filesystem::equivalent(path, session.Image(), none)) {
        ThrowFailed(path, "is the image itself", "choose another name");
    }
    const u64 size = MetaDump::VolumeBytes(&session);
    session.Tree(kCatalogFileId);
    PartFile file(path, size, call->force);
    call->outputFile = path;
    MetaDump dump(&session, *call, file.Device());
    dump.Run();
    file.Keep();
    if (call->json) {
        call->out.Print(
            "{{\"schema\":\"treehfs.metadump/1\",\"names\":{},\"nodes\":{},\"bytes\":{},"
            "\"volume_bytes\":{}}}\n",
            dump.Names(), dump.Nodes(), dump.Bytes(), size);
    } else {
        call->out.Print("{}: {} copied, {} replaced, {} B of metadata in a sparse file of {} B\n",
                        EscapedText(path), Counted(dump.Nodes(), "node", "nodes"),
                        Counted(dump.Names(), "name", "names"), Grouped(dump.Bytes()),
                        Grouped(size));
    }
    return session.PassedOver() != 0 ? kExitFailed : kExitDone;
}

}  // namespace

extern const Command kMetadumpCommand;
const Command kMetadumpCommand = {
    "metadump",
    "IMAGE -o FILE",
    "a sparse image of the metadata alone, with names replaced",
    "For giving a broken volume to others: the trees keep their shape to the byte, names keep "
    "their\n"
    "length and order but become unreadable. No file's contents, no attribute's value, no free\n"
    "node, gap or journal is copied. IDs, dates, sizes and permissions are. The result is the "
    "bare\n"
    "volume, without partition map and journal.",
    {"metadump disk.img -o meta.img", "metadump --partition 2 disk.img -o meta.img",
     "metadump --keep-going broken.img -o meta.img --force"},
    RunMetadump,
};

}  // namespace VELK::tool
