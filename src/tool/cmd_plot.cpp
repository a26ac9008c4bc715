// plot: a picture of a tree.
#include "hfs/records/text_format.h"
#include "tool/command.h"
#include "tool/errors.h"
#include "tool/plot.h"
#include "tool/progress.h"
#include "tool/session.h"

namespace VELK::tool {

namespace {

constexpr u64 kDefaultLevels = 3;

bool EndsWith(const std::string& text, const std::string& end) {
    return text.size() >= end.size() &&
           text.compare(text.size() - end.size(), end.size(), end) == 0;
}

std::string Draw(const std::string& kind, const TreeSurvey& survey, CBTreeHfs* tree, u32 levels) {
    if (kind == "tree") {
        return PlotTree(survey, tree, levels);
    }
    if (kind == "fill") {
        return PlotFill(survey);
    }
    return kind == "keys" ? PlotKeys(survey) : PlotMap(survey);
}

int RunPlot(Invocation* call) {
    std::string kind = "map";
    std::optional<u64> levels;
    call->DeclareImage();
    call->DeclareTrees(TreeDefault::kCatalog);
    call->DeclareOutputFile();
    call->options.Choice("--kind", &kind, {"map", "tree", "fill", "keys"},
                         "map: a square per node; tree: the index as boxes; fill: how full; keys: "
                         "order of the leaves");
    call->options.Count("--depth", &levels, "N", "most levels that --kind tree draws (3)");
    call->Parse();
    const bool html = EndsWith(call->outputFile, ".html");
    if (!html && !EndsWith(call->outputFile, ".svg")) {
        ThrowUsage("plot",
                   call->outputFile.empty()
                       ? "no file to draw into"
                       : call->outputFile + " ends neither in .svg nor in .html",
                   "give -o FILE.svg or -o FILE.html");
    }
    Session session(*call, Session::Truncated::kReadOn);
    const u32 fileId = call->trees.front();
    CBTreeHfs* tree = session.Tree(fileId);
    Progress progress(*call, std::string("plot ") + ForkName(fileId), "nodes",
                      tree->header.totalNodes, tree->header.nodeSize);
    u64 done = 0;
    const TreeSurvey survey = SurveyTree(tree, [&] {
        session.Volume().TrimCache();
        progress.Show(done);
        done += kSurveyStride;
    });
    const std::string svg =
        Draw(kind, survey, tree, static_cast<u32>(levels.value_or(kDefaultLevels)));
    const std::string picture =
        html ? HtmlPage(fmt::format("{}: {} tree", call->image, ForkName(fileId)), svg) : svg;
    progress.Erase();
    call->out.Write(picture);
    if (!call->quiet) {
        std::fprintf(stderr, "%s: %s, %s, %s, %s KiB\n", call->outputFile.c_str(), ForkName(fileId),
                     Counted(survey.nodes.size(), "node", "nodes").c_str(),
                     Counted(survey.depth, "level", "levels").c_str(),
                     Grouped((picture.size() + 1023) / 1024).c_str());
    }
    return kExitDone;
}

}  // namespace

extern const Command kPlotCommand;
const Command kPlotCommand = {
    "plot",
    "IMAGE -o FILE",
    "a picture of a tree: node map, index, fill, order of the leaves",
    "The file is SVG or a self-contained HTML page, by its suffix.",
    {"plot disk.img -o tree.svg", "plot disk.img --kind keys -o order.svg",
     "plot disk.img -t attributes --kind fill -o fill.html"},
    RunPlot,
};

}  // namespace VELK::tool
