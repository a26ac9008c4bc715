// demo: what the engine does, shown on a volume made in memory.
#include <unistd.h>

#include <array>
#include <cstdio>

#include "hfs/check/check.h"
#include "hfs/records/text_format.h"
#include "tool/command.h"
#include "tool/demo_volume.h"
#include "tool/errors.h"
#include "tool/plot.h"
#include "tool/progress.h"
#include "tool/session.h"
#include "tool/tree_stats.h"

namespace VELK::tool {

namespace {

class HostFile {
public:
    explicit HostFile(std::string path)
        : path_(std::move(path)), file_(std::fopen(path_.c_str(), "wb")) {
        if (file_ == nullptr) {
            ThrowFailed(path_, "cannot be written", "choose another folder with --folder");
        }
    }
    HostFile(const HostFile&) = delete;
    HostFile& operator=(const HostFile&) = delete;
    ~HostFile() {
        if (file_ != nullptr) {
            std::fclose(file_);
        }
    }
    std::FILE* Get() { return file_; }
    void Close() {
        std::FILE* file = file_;
        file_ = nullptr;
        if (std::fclose(file) != 0) {
            ThrowFailed(path_, "cannot be written", "");
        }
    }

private:
    std::string path_;
    std::FILE* file_;
};

int ReadSession(void* self, u64 offset, void* target, std::size_t size) {
    return static_cast<Session*>(self)->Volume().ReadVolume(offset, target, size);
}

// Checks the volume in full and returns how many invariants were broken.
u32 Check(Session* session, Invocation* call) {
    CheckSource source = {session, ReadSession, session->ReadableBytes(), 0};
    CheckOptions options;
    options.full = true;
    CheckSink sink;
    sink.self = call;
    sink.finding = [](void* self, const CheckFinding& finding) {
        static_cast<Invocation*>(self)->out.Print("{}\n", CheckFindingLine(finding));
    };
    const CheckSummary summary = CheckVolume(source, options, sink);
    return summary.errors + summary.warnings + (summary.isStopped ? 1 : 0);
}

void Draw(Session* session, const std::string& path) {
    const TreeSurvey survey =
        SurveyTree(session->Tree(kCatalogFileId), [session] { session->Volume().TrimCache(); });
    const std::string svg = PlotMap(survey);
    HostFile file(path);
    if (std::fwrite(svg.data(), 1, svg.size(), file.Get()) != svg.size()) {
        ThrowFailed(path, "cannot be written", "");
    }
    file.Close();
}

// Whether the file is the volume of an earlier run: its volume header is the one of `made`.
bool IsOfEarlierRun(const std::string& path, ImageVolume* made) {
    std::array<u8, kHeaderSize> here{};
    std::array<u8, kHeaderSize> wanted{};
    std::FILE* file = std::fopen(path.c_str(), "rb");
    const bool isRead = file != nullptr &&
                        std::fseek(file, static_cast<long>(kHeaderOffset), SEEK_SET) == 0 &&
                        std::fread(here.data(), 1, here.size(), file) == here.size();
    if (file != nullptr) {
        std::fclose(file);
    }
    return isRead && made->ReadVolume(kHeaderOffset, wanted.data(), wanted.size()) == kOk &&
           here == wanted;
}

// Files of the same names that nobody made here are somebody's.
void CheckReplaces(const std::string& image, const std::string& picture, ImageVolume* made) {
    const bool isThere = access(image.c_str(), F_OK) == 0;
    if (isThere && !IsOfEarlierRun(image, made)) {
        ThrowFailed("", image + " exists", "--force replaces it");
    }
    if (!isThere && access(picture.c_str(), F_OK) == 0) {
        ThrowFailed("", picture + " exists", "--force replaces it");
    }
}

int RunDemo(Invocation* call) {
    std::string folder = ".";
    call->options.Text("--folder", &folder, "DIR", "where demo.img and demo.svg go (here)");
    call->options.Flag("--force", &call->force, "replace files that no earlier run has made");
    call->Parse();
    const std::string imagePath = folder + "/demo.img";
    const std::string picturePath = folder + "/demo.svg";

    DemoFigures figures;
    const std::unique_ptr<ImageVolume> made = MakeDemoVolume(&figures);
    if (!call->force) {
        CheckReplaces(imagePath, picturePath, made.get());
    }
    call->out.Print("a volume of {} in memory: {} and {} inserted, {} deleted\n\n", "64 MiB",
                    Counted(figures.folders, "folder", "folders"),
                    Counted(figures.inserted, "file", "files"), Grouped(figures.deleted));
    HostFile image(imagePath);
    if (const Problem problem = made->SaveTo(image.Get())) {
        ThrowProblem(imagePath, problem);
    }
    image.Close();

    call->image = imagePath;
    Session session(*call, Session::Truncated::kRefuse);
    Progress progress(*call, "demo", "nodes", 0, 0);
    call->out.Print("{}\n", StatsText(CollectStats(&session, kCatalogFileId, false, &progress)));
    Draw(&session, picturePath);
    const u32 broken = Check(&session, call);
    call->out.Print("{}: the volume; {}: its catalog, one square per node\n", imagePath,
                    picturePath);
    if (broken != 0) {
        call->out.Print("{} of {} invariants do not hold\n", broken, kCheckIdCount);
        return kExitFindings;
    }
    call->out.Print("all {} invariants hold\n", kCheckIdCount);
    return kExitDone;
}

}  // namespace

extern const Command kDemoCommand;
const Command kDemoCommand = {
    "demo",
    "",
    "makes, fills, thins, checks and draws a volume; needs no input",
    "The same output every time.",
    {"demo", "demo --folder build", "info demo.img"},
    RunDemo,
};

}  // namespace VELK::tool
