// bench: how fast the engine's operations are here.
#include <algorithm>

#include "hfs/check/check.h"
#include "hfs/records/json_writer.h"
#include "hfs/records/name_text.h"
#include "hfs/records/text_format.h"
#include "tool/bench_run.h"
#include "tool/errors.h"
#include "tool/format_args.h"
#include "tool/leaf_cursor.h"
#include "tool/script_run.h"
#include "tool/tree_survey.h"

namespace VELK::tool {

namespace {

constexpr u64 kMostRecords = 5000000;
constexpr u64 kMostRepeats = 1000;
constexpr double kNs = 1e9;

struct BenchOptions {
    std::optional<std::string> image;
    std::optional<u64> records;
    std::optional<u64> seed;
    std::optional<u64> repeat;
    std::optional<u64> nodeSize;
    std::string ops;
    std::string order = "random";

    u64 Records() const { return records.value_or(200000); }
    u64 Seed() const { return seed.value_or(1); }
    u64 Repeat() const { return repeat.value_or(1); }
};

const std::vector<std::string> kWritingOps = {"insert", "find",   "absent", "iterate",
                                              "update", "delete", "reopen"};
const std::vector<std::string> kReadingOps = {"find", "iterate"};

// Times of one operation, one of each round.
struct Row {
    std::string title;
    u64 count = 0;
    std::vector<double> seconds;

    double Median() const {
        std::vector<double> sorted = seconds;
        std::sort(sorted.begin(), sorted.end());
        return std::max(1e-9, sorted[sorted.size() / 2]);
    }
    double Spread() const {
        const auto [least, most] = std::minmax_element(seconds.begin(), seconds.end());
        return (*most - *least) / Median();
    }
};

// What the tree looks like when the last round is over.
struct TreeAfter {
    u32 depth = 0;
    u64 nodes = 0;
    double fill = 0;
    bool isSound = false;
};

class Bench {
public:
    Bench(Invocation* call, const BenchOptions& options) : call_(call), options_(options) {
        const std::vector<std::string>& known = options.image ? kReadingOps : kWritingOps;
        for (std::size_t at = 0; at < options.ops.size();) {
            const std::size_t end = std::min(options.ops.find(',', at), options.ops.size());
            const std::string op = options.ops.substr(at, end - at);
            if (std::find(known.begin(), known.end(), op) == known.end()) {
                ThrowUsage("bench",
                           "--ops: no operation is called '" + op + "'" + DidYouMean(op, known),
                           fmt::format("{}", fmt::join(known, ",")));
            }
            chosen_.push_back(op);
            at = end + 1;
        }
    }

    void RunInMemory() {
        const BenchOrder order = options_.order == "rising"    ? BenchOrder::kRising
                                 : options_.order == "falling" ? BenchOrder::kFalling
                                 : options_.order == "zipf"    ? BenchOrder::kZipf
                                                               : BenchOrder::kRandom;
        const u32 nodeSize = 1u << NodeShiftOf(options_.nodeSize.value_or(4096));
        for (u64 round = 0; round < options_.Repeat(); ++round) {
            BenchTree tree(options_.Records(), nodeSize, order, options_.Seed());
            const std::string suffix = " " + options_.order;
            Add("insert", "insert" + suffix, tree.Insert());
            if (Wants("find")) {
                Add("find", "find hit", tree.FindHit());
            }
            if (Wants("absent")) {
                Add("absent", "find absent", tree.FindMiss());
            }
            if (Wants("iterate")) {
                Add("iterate", "iterate", tree.Iterate());
            }
            if (Wants("update")) {
                Add("update", "find + update", tree.Update());
            }
            if (Wants("delete")) {
                Add("delete", "delete half", tree.DeleteHalf());
            }
            if (Wants("reopen")) {
                Add("reopen", "flush + reopen", tree.FlushAndReopen());
            }
            after_ = Look(&tree);
        }
    }

    void RunOnImage() {
        Session session(*call_, Session::Truncated::kRefuse);
        std::vector<SearchKey> keys;
        LeafCursor cursor(&session, call_->trees[0], false);
        LeafRecord record;
        cursor.SeekFirst();
        while (keys.size() < options_.Records() && cursor.Next(&record)) {
            SearchKey key;
            SearchKeyFromStored(call_->trees[0], record.key, record.keySize, &key);
            keys.push_back(key);
        }
        if (keys.empty()) {
            ThrowNo(session.Image(),
                    std::string("the ") + ForkName(call_->trees[0]) +
                        " tree is empty: nothing to look up",
                    "");
        }
        BenchReader reader(session.Tree(call_->trees[0]), std::move(keys), options_.Seed());
        for (u64 round = 0; round < options_.Repeat(); ++round) {
            if (Wants("find")) {
                Add("find", "find hit", reader.FindHit());
            }
            if (Wants("iterate")) {
                Add("iterate", "iterate", reader.Iterate());
            }
        }
    }

    void Print() { call_->json ? PrintJson() : PrintTable(); }

private:
    bool Wants(const std::string& op) const {
        return chosen_.empty() || std::find(chosen_.begin(), chosen_.end(), op) != chosen_.end();
    }

    void Add(const std::string& op, const std::string& title, const BenchTime& time) {
        if (!Wants(op)) {
            return;
        }
        auto row = std::find_if(rows_.begin(), rows_.end(),
                                [&](const Row& each) { return each.title == title; });
        if (row == rows_.end()) {
            rows_.push_back({title, time.count, {}});
            row = rows_.end() - 1;
        }
        row->seconds.push_back(time.seconds);
    }

    static TreeAfter Look(BenchTree* bench) {
        TreeAfter after;
        CBTreeHfs* tree = bench->Tree();
        after.depth = tree->header.treeDepth;
        after.nodes = tree->header.totalNodes - tree->header.freeNodes;
        const TreeSurvey survey = SurveyTree(tree, [&] { bench->Volume()->TrimCache(); });
        u64 permille = 0;
        for (const u32 leaf : survey.leaves) {
            permille += survey.nodes[leaf].fillPermille;
        }
        after.fill = survey.leaves.empty() ? 0.0
                                           : static_cast<double>(permille) /
                                                 (10.0 * static_cast<double>(survey.leaves.size()));
        std::vector<u8> bytes;
        CheckTreeKind kind;
        kind.fileId = kCatalogFileId;
        kind.names = CheckNameOrder::kFolding;
        CheckSink sink;
        sink.finding = [](void*, const CheckFinding&) {};
        after.isSound =
            FlatTree(bench->Volume(), tree, &bytes) == kOk &&
            CheckTreeBytes(bytes.data(), bytes.size(), kind, CheckOptions{}, sink).errors == 0;
        return after;
    }

    void PrintTable() {
        const bool repeated = options_.Repeat() > 1;
        call_->out.Print("operation              count       time     per second     ns/op{}\n",
                         repeated ? "  spread" : "");
        for (const Row& row : rows_) {
            const double median = row.Median();
            call_->out.Print("{:<18}{:>10}{:>9.3f} s{:>15}{:>10}{}\n", row.title,
                             Grouped(row.count), median,
                             Grouped(static_cast<u64>(static_cast<double>(row.count) / median)),
                             Grouped(static_cast<u64>(
                                 median * kNs / static_cast<double>(std::max<u64>(1, row.count)))),
                             repeated ? fmt::format("{:>7.0f}%", row.Spread() * 100.0) : "");
        }
        if (!options_.image) {
            call_->out.Print("tree after: depth {}, {} nodes, fill {:.1f}%; {}\n", after_.depth,
                             Grouped(after_.nodes), after_.fill,
                             after_.isSound ? "check ok" : "check found errors");
        }
    }

    void PrintJson() {
        std::string text;
        JsonWriter json(&text);
        json.BeginObject();
        json.Member("schema", "treehfs.bench/1");
        json.Member("seed", options_.Seed());
        json.Member("repeat", options_.Repeat());
        json.Key("operations");
        json.BeginArray();
        for (const Row& row : rows_) {
            json.BeginObject();
            json.Member("operation", row.title);
            json.Member("count", row.count);
            json.Member("seconds", row.Median());
            json.Member("spread", row.Spread());
            json.EndObject();
        }
        json.EndArray();
        if (!options_.image) {
            json.Key("tree");
            json.BeginObject();
            json.Member("depth", after_.depth);
            json.Member("nodes", after_.nodes);
            json.Member("leaf_fill", after_.fill / 100.0);
            json.Member("sound", after_.isSound);
            json.EndObject();
        }
        json.EndObject();
        call_->out.Write(text + "\n");
    }

    Invocation* call_;
    const BenchOptions& options_;
    std::vector<std::string> chosen_;
    std::vector<Row> rows_;
    TreeAfter after_;
};

void MustBeBetween(const char* option, u64 value, u64 most) {
    if (value == 0 || value > most) {
        ThrowUsage("bench", fmt::format("{}: {} is not between 1 and {}", option, value, most), "");
    }
}

int RunBench(Invocation* call) {
    BenchOptions options;
    call->options.OptionalArgument("IMAGE", &options.image, "read the keys of this image's tree");
    call->DeclarePlace();
    call->DeclareTrees(TreeDefault::kCatalog);
    call->options.Count("--records", &options.records, "N", "records in the tree (200k)");
    call->options.Text("--ops", &options.ops, "OP,...",
                       "only these: insert find absent iterate update delete reopen");
    call->options.Size("--node-size", &options.nodeSize, "BYTES", "512 to 32768 (4096)");
    call->options.Choice("--order", &options.order, {"random", "rising", "falling", "zipf"},
                         "in which keys are taken; zipf: a few of them often");
    call->options.Count("--seed", &options.seed, "N", "of the random order (1)");
    call->options.Count("--repeat", &options.repeat, "N", "rounds: the median is shown (1)");
    call->DeclareJson();
    call->Parse();
    MustBeBetween("--records", options.Records(), kMostRecords);
    MustBeBetween("--repeat", options.Repeat(), kMostRepeats);
    Bench bench(call, options);
    if (options.image) {
        call->image = *options.image;
        bench.RunOnImage();
    } else {
        if (call->treesGiven && call->trees[0] != kCatalogFileId) {
            ThrowUsage("bench", "without an image only a catalog is made", "leave --tree out");
        }
        bench.RunInMemory();
    }
    bench.Print();
    return kExitDone;
}

}  // namespace

extern const Command kBenchCommand;
const Command kBenchCommand = {
    "bench",
    "[IMAGE]",
    "how fast the engine's operations are",
    "Without an image a catalog is made in memory; with one, lookups and iteration run on its own\n"
    "keys, and nothing is written.",
    {"bench --records 200k --seed 1", "bench --ops find,iterate --repeat 5 disk.img",
     "bench --order rising --node-size 8192 --json"},
    RunBench,
};

}  // namespace VELK::tool
