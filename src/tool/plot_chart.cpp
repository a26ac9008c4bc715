// Plots of numbers: how full the nodes of each level are, and where in the file the leaves lie in
// key order (a straight line is a compact tree).
#include <algorithm>

#include "hfs/records/text_format.h"
#include "tool/plot.h"
#include "tool/plot_svg.h"

namespace VELK::tool {

namespace {

constexpr double kWidth = 720;
constexpr double kPlotWidth = kWidth - 2 * SvgPicture::kMargin - 40;
constexpr u32 kMostDots = 20000;

void DrawHistogram(SvgPicture* picture, double top, u32 level, const u64 (&counts)[10]) {
    constexpr double kHeight = 120;
    constexpr double kBar = kPlotWidth / 10;
    const u64 most = std::max<u64>(1, *std::max_element(counts, counts + 10));
    u64 sum = 0;
    for (const u64 count : counts) {
        sum += count;
    }
    picture->Text(SvgPicture::kMargin, top, "ink label",
                  fmt::format("level {}{}: {}", level, level == 1 ? " (leaves)" : "",
                              Counted(sum, "node", "nodes")));
    const double base = top + 20 + kHeight;
    for (u32 step = 0; step < 10; ++step) {
        const double height =
            kHeight * static_cast<double>(counts[step]) / static_cast<double>(most);
        const double x = SvgPicture::kMargin + step * kBar;
        picture->Box(x + 2, base - height, kBar - 4, height, "bar",
                     fmt::format("{} to {}% full: {}", 10 * step, 10 * step + 10,
                                 Counted(counts[step], "node", "nodes")));
        picture->Text(x + 4, base + 14, "soft small",
                      fmt::format("{}-{}%", 10 * step, 10 * step + 10));
        if (counts[step] != 0) {
            picture->Text(x + 4, base - height - 3, "soft small", Grouped(counts[step]));
        }
    }
    picture->Line(SvgPicture::kMargin, base, SvgPicture::kMargin + kPlotWidth, base, "rule");
}

}  // namespace

std::string PlotFill(const TreeSurvey& survey) {
    constexpr double kRow = 180;
    u64 counts[kMaxOpenDepth + 1][10] = {};
    for (const NodeFacts& node : survey.nodes) {
        if (node.state == NodeState::kLeaf || node.state == NodeState::kIndex) {
            counts[node.height][std::min(9, node.fillPermille / 100)] += 1;
        }
    }
    const u32 levels = std::min(survey.depth, kMaxOpenDepth);
    SvgPicture picture(kWidth, SvgPicture::kTitleHeight + 30 + kRow * std::max(1u, levels),
                       fmt::format("Fill of the {} tree", ForkName(survey.fileId)),
                       SubtitleOf(survey));
    double top = SvgPicture::kTitleHeight + 30;
    for (u32 level = levels; level >= 1; --level) {
        DrawHistogram(&picture, top, level, counts[level]);
        top += kRow;
    }
    return picture.Finish();
}

std::string PlotKeys(const TreeSurvey& survey) {
    constexpr double kHeight = 420;
    const double top = SvgPicture::kTitleHeight + 24;
    SvgPicture picture(kWidth, top + kHeight + 44,
                       fmt::format("Order of the leaves of the {} tree", ForkName(survey.fileId)),
                       SubtitleOf(survey) + "; across: key order, up: place in the file");
    const double left = SvgPicture::kMargin + 30;
    picture.Line(left, top, left, top + kHeight, "rule");
    picture.Line(left, top + kHeight, left + kPlotWidth, top + kHeight, "rule");
    const std::size_t count = survey.leaves.size();
    const std::size_t step = count / kMostDots + 1;
    const double nodes = std::max<double>(1, static_cast<double>(survey.nodes.size()));
    // A leaf is as wide as its part of the key order, so that the last one ends at the last key.
    const double share = kPlotWidth / std::max<double>(1, static_cast<double>(count));
    for (std::size_t i = 0; i < count; i += step) {
        const double x = left + share * static_cast<double>(i);
        const double y = top + kHeight * (1 - survey.leaves[i] / nodes);
        picture.Box(x, y - 1.5, std::max(3.0, share), 3, "dot",
                    fmt::format("leaf {} of {}: node {}", Grouped(i + 1), Grouped(count),
                                Grouped(survey.leaves[i])));
    }
    picture.Text(left, top + kHeight + 18, "soft small", "first key");
    picture.Text(left + kPlotWidth - 44, top + kHeight + 18, "soft small", "last key");
    picture.Text(SvgPicture::kMargin, top - 6, "soft small", Grouped(survey.nodes.size()));
    picture.Text(SvgPicture::kMargin + 18, top + kHeight, "soft small", "0");
    if (step > 1) {
        picture.Text(left, top + kHeight + 34, "soft small",
                     fmt::format("every {}th leaf is drawn", step));
    }
    return picture.Finish();
}

}  // namespace VELK::tool
