// treehfs import: puts exported records into a tree.
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstring>

#include "hfs/records/json_writer.h"
#include "hfs/records/record_json.h"
#include "hfs/records/stored_records.h"
#include "tool/errors.h"
#include "tool/progress.h"
#include "tool/record_digest.h"
#include "tool/script_run.h"
#include "tool/script_volume.h"

namespace VELK::tool {
namespace {

constexpr u64 kDefaultBatch = 50000;
constexpr u64 kMostLine = u64{4} << 20;

struct ImportCounts {
    u64 inserted = 0;
    u64 replaced = 0;
    u64 refused = 0;
};

// Lines of a file or of standard input.
class LineReader {
public:
    explicit LineReader(const std::string& path) : path_(path) {
        file_ = path == "-" ? stdin : std::fopen(path.c_str(), "rb");
        if (file_ == nullptr) {
            ThrowFailed(path, "cannot open: no such file, or not readable", "");
        }
    }
    LineReader(const LineReader&) = delete;
    LineReader& operator=(const LineReader&) = delete;
    ~LineReader() {
        if (file_ != stdin) {
            std::fclose(file_);
        }
    }
    bool Next(std::string* line) {
        line->clear();
        // A line may hold zeros, at which calls for whole lines would end it.
        for (bool isWhole = false; !isWhole && (at_ < end_ || Fill());) {
            const char* from = piece_.data() + at_;
            const void* end = std::memchr(from, '\n', end_ - at_);
            isWhole = end != nullptr;
            const std::size_t count =
                isWhole ? static_cast<std::size_t>(static_cast<const char*>(end) - from) + 1
                        : end_ - at_;
            line->append(from, count);
            at_ += count;
            if (line->size() > kMostLine) {
                ThrowFailed(path_, "line " + std::to_string(number_ + 1) + " is too long", "");
            }
        }
        number_ += line->empty() ? 0u : 1u;
        return !line->empty();
    }
    u64 Number() const { return number_; }

private:
    // The next bytes as soon as there are any: whoever types lines sees each of them taken. False:
    // there are none.
    bool Fill() {
        ssize_t count = 0;
        do {
            count = read(fileno(file_), piece_.data(), piece_.size());
        } while (count < 0 && errno == EINTR);
        at_ = 0;
        end_ = count > 0 ? static_cast<std::size_t>(count) : 0;
        return end_ != 0;
    }

    std::string path_;
    std::FILE* file_;
    std::vector<char> piece_ = std::vector<char>(std::size_t{1} << 16);
    std::size_t at_ = 0;   // of piece_: what was not taken yet
    std::size_t end_ = 0;  // of piece_: what was read
    u64 number_ = 0;
};

class Importer {
public:
    // Reads the header line.
    Importer(const Invocation& call, const std::string& source, const std::string& onExists,
             u64 batch)
        : call_(call), reader_(source), source_(source), onExists_(onExists), batch_(batch) {
        std::string line;
        JsonValue header;
        std::string fault = "expected a header line";
        if (!reader_.Next(&line) || !ReadJson(line, &header, &fault)) {
            Wrong(fault);
        }
        TakeHeader(header);
    }

    u32 NodeSize() const { return nodeSize_; }

    // The tree that the header names, made where it is missing. `isWritten`: what is committed
    // reaches the image.
    void OpenTree(ImageVolume* volume, bool isWritten) {
        volume_ = volume;
        isWritten_ = isWritten;
        if (!volume_->HasTree(fileId_)) {
            const int status = volume_->CreateTree(fileId_, Log2Of(nodeSize_), nullptr);
            if (status != kOk) {
                volume_->RestoreAfter(status);
                ThrowFailed(call_.image,
                            std::string("cannot create the ") + ForkName(fileId_) +
                                " tree with nodes of " + Grouped(nodeSize_) +
                                " bytes: " + StatusWithCode(status),
                            status == kErrInvalid ? "try --map " + std::to_string(nodeSize_) : "");
            }
        }
        Problem problem;
        tree_ = volume_->Tree(fileId_, &problem);
        if (tree_ == nullptr) {
            ThrowProblem(call_.image, problem);
        }
        const bool isFolding = tree_->compareKeys == CompareCatKeysCaseIns;
        if (!call_.quiet && isFolding != isSourceFolding_) {
            PrintNote(call_.image.empty() ? "new volume" : call_.image,
                      Failure(isFolding ? "names fold case here and do not in the source"
                                        : "names fold case in the source and do not here",
                              "the order and the digest may differ"));
        }
    }

    // False: it stopped at a record that exists.
    bool Run() {
        std::string line;
        Progress progress(call_, "import", "records", records_, 0);
        bool goesOn = true;
        while (goesOn && reader_.Next(&line)) {
            JsonValue value;
            std::string fault;
            if (!ReadJson(line, &value, &fault)) {
                Wrong(fault);
            }
            if (const JsonValue* summary = value.Find("summary")) {
                const JsonValue* digest = summary->Find("digest");
                sourceDigest_ = digest == nullptr ? std::string() : digest->Text();
            } else {
                goesOn = Put(value);
            }
            progress.Update(reader_.Number());
        }
        return goesOn;
    }

    const ImportCounts& Counts() const { return counts_; }
    const std::string& SourceDigest() const { return sourceDigest_; }
    CBTreeHfs* Tree() const { return tree_; }

private:
    // Says up to where the image has the records, where it has any of them.
    [[noreturn]] void Wrong(const std::string& what) const {
        ThrowFailed(source_, "line " + std::to_string(reader_.Number()) + ": " + what,
                    volume_ == nullptr              ? ""
                    : keptLine_ == 0 || !isWritten_ ? "nothing was kept"
                                                    : "kept up to line " + Grouped(keptLine_));
    }

    static u32 Log2Of(u32 size) {
        u32 shift = 0;
        while (size >> shift > 1) {
            ++shift;
        }
        return shift;
    }

    void TakeHeader(const JsonValue& header) {
        const JsonValue* schema = header.Find("schema");
        if (schema == nullptr || schema->Text() != "treehfs.records/1") {
            Wrong("expected a header line with schema treehfs.records/1");
        }
        const JsonValue* name = header.Find("tree");
        fileId_ = TreeIdFromText(name == nullptr ? std::string() : name->Text());
        if (fileId_ == 0) {
            Wrong("the header names no tree");
        }
        const JsonValue* nodeSize = header.Find("node_size");
        u64 size = 0;
        if (nodeSize == nullptr || !ParseNumber(nodeSize->number, 1u << kMaxNodeShift, &size) ||
            size < 1u << kMinNodeShift || (size & (size - 1)) != 0) {
            Wrong("the header names no node size");
        }
        nodeSize_ = static_cast<u32>(size);
        const JsonValue* compare = header.Find("compare");
        isSourceFolding_ = compare != nullptr && compare->Text() == "case-insensitive";
        const JsonValue* records = header.Find("records");
        if (records != nullptr) {
            ParseNumber(records->number, ~u64{0}, &records_);
        }
    }

    bool Put(const JsonValue& value) {
        SearchKey key;
        std::vector<u8> stored;
        const Problem problem = RecordFromJson(value, fileId_, &key, &stored);
        if (problem) {
            Wrong(problem.Text());
        }
        u64* counted = &counts_.inserted;
        int status = InsertStored(volume_, fileId_, key, stored);
        if (status == kErrExists && onExists_ == "replace") {
            counted = &counts_.replaced;
            status = UpdateStored(volume_, fileId_, key, stored);
        }
        if (status == kErrExists || status == kErrTooLarge) {
            ++counts_.refused;
            return onExists_ != "stop";
        }
        if (status != kOk) {
            Wrong(StatusWithCode(status));
        }
        ++*counted;
        ++sinceFlush_;
        volume_->TrimCache();
        if (sinceFlush_ >= batch_ || volume_->IsCommitDue()) {
            KeepBatch();
        }
        return true;
    }

    void KeepBatch() {
        const int status = volume_->Commit(0);
        if (status != kOk) {
            Wrong("the changes could not be kept: " + CommitProblem(volume_, status).Text());
        }
        sinceFlush_ = 0;
        keptLine_ = reader_.Number();
    }

    ImageVolume* volume_ = nullptr;
    bool isWritten_ = false;
    const Invocation& call_;
    LineReader reader_;
    std::string source_;
    std::string onExists_;
    u64 batch_;
    u32 fileId_ = 0;
    u32 nodeSize_ = 0;
    bool isSourceFolding_ = false;
    u64 records_ = 0;
    CBTreeHfs* tree_ = nullptr;
    ImportCounts counts_;
    std::string sourceDigest_;
    u64 sinceFlush_ = 0;
    u64 keptLine_ = 0;  // the last one whose record a commit has kept
};

int Report(Invocation* call, const Importer& importer, bool isComplete) {
    const ImportCounts& counts = importer.Counts();
    std::string digestText;
    bool isEqual = true;
    std::string own;
    if (importer.Tree() != nullptr && !importer.SourceDigest().empty()) {
        RecordDigest digest;
        const int status = DigestTree(importer.Tree(), &digest);
        own = status == kOk ? digest.Text() : std::string();
        isEqual = own == importer.SourceDigest();
        digestText = isEqual ? "; digest equals the source" : "; digest differs from the source";
    }
    if (call->json) {
        std::string line;
        JsonWriter json(&line);
        json.BeginObject();
        json.Member("schema", "treehfs.import/1");
        json.Member("inserted", counts.inserted);
        json.Member("replaced", counts.replaced);
        json.Member("refused", counts.refused);
        json.Member("complete", isComplete);
        json.Member("digest", own);
        json.Member("source_digest", importer.SourceDigest());
        json.EndObject();
        call->out.Print("{}\n", line);
    } else {
        call->out.Print("{} inserted, {}{} refused{}{}\n", Grouped(counts.inserted),
                        counts.replaced != 0 ? Grouped(counts.replaced) + " replaced, " : "",
                        Grouped(counts.refused), digestText,
                        isComplete ? "" : "; stopped at a record that exists");
    }
    return counts.refused != 0 || !isEqual ? kExitNo : kExitDone;
}

// A volume without trees is mapped in pieces no larger than the nodes that are to come.
std::unique_ptr<ImageVolume> OpenForNodes(Invocation* call, TargetOptions* target, u32 nodeSize) {
    if (target->newVolume.find(",empty") != std::string::npos &&
        target->newVolume.find(",map=") == std::string::npos) {
        target->newVolume += ",map=" + std::to_string(nodeSize);
    }
    std::unique_ptr<ImageVolume> volume = OpenTarget(*call, *target);
    const bool hasTree = volume->HasTree(kCatalogFileId) || volume->HasTree(kExtentsFileId) ||
                         volume->HasTree(kAttributesFileId);
    if (!hasTree && target->newVolume.empty() && call->mapBlockSize == 0) {
        volume.reset();
        call->mapBlockSize = nodeSize;
        volume = OpenTarget(*call, *target);
    }
    return volume;
}

int Run(Invocation* call) {
    TargetOptions target;
    std::vector<std::string> names;
    std::string onExists = "skip";
    std::optional<u64> batch;
    call->options.Arguments("[IMAGE] FILE", &names,
                            "disk image (none with --new), then the records; - is standard input");
    target.Declare(call);
    call->options.Choice("--on-exists", &onExists, {"skip", "replace", "stop"},
                         "what to do with a record whose key is there; default skip");
    call->options.Count("--batch", &batch, "N", "keep the changes every N records");
    call->DeclareJson();
    call->Parse();
    const std::size_t wanted = target.newVolume.empty() ? 2 : 1;
    if (names.size() != wanted) {
        ThrowUsage("import", wanted == 2 ? "expected IMAGE and FILE" : "expected FILE and no IMAGE",
                   "treehfs help import shows both ways");
    }
    call->image = wanted == 2 ? names[0] : std::string();
    Importer importer(*call, names.back(), onExists,
                      std::max<u64>(1, batch.value_or(kDefaultBatch)));
    const std::unique_ptr<ImageVolume> volume = OpenForNodes(call, &target, importer.NodeSize());
    const u64 before = volume->HandedOverBlocks();
    importer.OpenTree(volume.get(), target.write);
    const bool isComplete = importer.Run();
    const int exitCode = Report(call, importer, isComplete);
    call->out.Flush();
    FinishTarget(*call, target, volume.get(), before);
    return exitCode;
}

}  // namespace

extern const Command kImportCommand;
const Command kImportCommand = {
    "import",
    "IMAGE FILE, --new SIZE[,...] FILE",
    "put exported records into a tree",
    "Reads what export writes. A tree that is missing is made with the node size of the source. "
    "Changes stay in memory unless --write or --save keeps them.",
    {"import copy.img records.jsonl --write", "export a.img | treehfs import b.img - --write",
     "import --new 64M,empty records.jsonl --save copy.img"},
    Run,
};

}  // namespace VELK::tool
