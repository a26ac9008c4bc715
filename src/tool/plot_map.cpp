// Plot of the node map: one square per node in file order. Colour tells how full a leaf is, hue and
// outline what a node is, so fragmentation and free space show at once.
#include <algorithm>
#include <cmath>

#include "hfs/records/text_format.h"
#include "tool/plot.h"
#include "tool/plot_svg.h"

namespace VELK::tool {

namespace {

constexpr u32 kMostSquares = 200000;

struct Grid {
    u32 perSquare;  // nodes one square stands for
    u32 squares;
    u32 columns;
    double size;
};

Grid GridFor(u32 nodes) {
    Grid grid;
    grid.perSquare = (nodes + kMostSquares - 1) / kMostSquares;
    grid.perSquare = std::max(1u, grid.perSquare);
    grid.squares = (nodes + grid.perSquare - 1) / grid.perSquare;
    // Wider than high, as screens are.
    grid.columns = std::max(16u, static_cast<u32>(std::ceil(std::sqrt(grid.squares * 1.8))));
    grid.size = std::clamp(900.0 / grid.columns, 3.0, 16.0);
    return grid;
}

// What several nodes have in common: the most telling kind, the mean fill of its members.
NodeFacts Summary(const TreeSurvey& survey, u32 from, u32 to) {
    NodeFacts facts;
    u64 fill = 0;
    u32 filled = 0;
    for (u32 i = from; i < to; ++i) {
        const NodeFacts& node = survey.nodes[i];
        if (node.state == NodeState::kUnreadable) {
            return node;
        }
        if (node.state == NodeState::kLeaf || node.state == NodeState::kIndex) {
            fill += node.fillPermille;
            filled += 1;
        }
        if (static_cast<u8>(node.state) > static_cast<u8>(facts.state)) {
            facts.state = node.state;
        }
    }
    facts.fillPermille = static_cast<u16>(filled == 0 ? 0 : fill / filled);
    return facts;
}

}  // namespace

std::string PlotMap(const TreeSurvey& survey) {
    const u32 nodes = static_cast<u32>(survey.nodes.size());
    const Grid grid = GridFor(nodes);
    const double width = std::max(640.0, grid.columns * grid.size + 2 * SvgPicture::kMargin);
    const u32 rows = (grid.squares + grid.columns - 1) / grid.columns;
    const double top = SvgPicture::kTitleHeight + 40;
    std::string subtitle = SubtitleOf(survey);
    if (grid.perSquare > 1) {
        subtitle += fmt::format("; a square stands for {} nodes", grid.perSquare);
    }
    SvgPicture picture(width, top + rows * grid.size + SvgPicture::kMargin,
                       fmt::format("Node map of the {} tree", ForkName(survey.fileId)), subtitle);
    double x = SvgPicture::kMargin;
    const double legend = SvgPicture::kTitleHeight + 20;
    picture.LegendItem(&x, legend, "header", "header");
    picture.LegendItem(&x, legend, "map", "map");
    picture.LegendItem(&x, legend, "index i9", "index");
    picture.FillLegend(&x, legend);
    picture.LegendItem(&x, legend, "free", "free");
    picture.LegendItem(&x, legend, "bad", "unreadable");
    const double gap = grid.size >= 6 ? 1 : 0;
    for (u32 square = 0; square < grid.squares; ++square) {
        const u32 from = square * grid.perSquare;
        const u32 to = std::min(nodes, from + grid.perSquare);
        const NodeFacts facts =
            grid.perSquare == 1 ? survey.nodes[from] : Summary(survey, from, to);
        const std::string tooltip =
            grid.perSquare == 1 ? TooltipOf(from, facts)
                                : fmt::format("nodes {} to {}", Grouped(from), Grouped(to - 1));
        const auto column = square % grid.columns;
        const auto row = square / grid.columns;
        picture.Box(SvgPicture::kMargin + column * grid.size, top + row * grid.size,
                    grid.size - gap, grid.size - gap, StyleOf(facts), tooltip);
    }
    return picture.Finish();
}

}  // namespace VELK::tool
