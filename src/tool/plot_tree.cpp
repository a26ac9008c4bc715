// Plot of the index: every node of the upper levels as a box above those it leads to, the levels
// below as bars of squares. A box is as wide as what hangs under it.
#include <algorithm>

#include "hfs/records/text_format.h"
#include "tool/node_reader.h"
#include "tool/plot.h"
#include "tool/plot_svg.h"

namespace VELK::tool {

namespace {

constexpr double kRowHeight = 64;
constexpr double kBoxHeight = 26;
constexpr double kWidth = 1100;
constexpr u32 kMostBoxes = 4000;

struct Branch {
    u32 node;
    double x;
    double width;
};

class TreePicture {
public:
    TreePicture(const TreeSurvey& survey, CBTreeHfs* tree, u32 levels)
        : survey_(survey),
          tree_(tree),
          lowest_(survey.depth > levels ? survey.depth - levels + 1 : 1),
          picture_(kWidth,
                   SvgPicture::kTitleHeight + 50 +
                       kRowHeight * std::max(1u, std::min(levels, survey.depth)),
                   fmt::format("Index of the {} tree", ForkName(survey.fileId)),
                   Subtitle(survey, levels)) {}

    std::string Draw() {
        double x = SvgPicture::kMargin;
        const double legend = SvgPicture::kTitleHeight + 20;
        picture_.LegendItem(&x, legend, "index i9", "index node");
        picture_.FillLegend(&x, legend);
        picture_.LegendItem(&x, legend, "bad", "unreadable");
        if (survey_.rootNode != 0) {
            std::vector<Branch> row = {
                {survey_.rootNode, SvgPicture::kMargin, kWidth - 2 * SvgPicture::kMargin}};
            double y = SvgPicture::kTitleHeight + 40;
            for (u32 level = survey_.depth; level >= lowest_ && !row.empty(); --level) {
                row = DrawRow(row, y, level);
                y += kRowHeight;
            }
        }
        return picture_.Finish();
    }

private:
    static std::string Subtitle(const TreeSurvey& survey, u32 levels) {
        std::string text = SubtitleOf(survey);
        if (levels < survey.depth) {
            text += fmt::format("; the upper {} drawn", Counted(levels, "level", "levels"));
        }
        return text;
    }

    // Draws one level and returns the boxes of the next.
    std::vector<Branch> DrawRow(const std::vector<Branch>& row, double y, u32 level) {
        std::vector<Branch> next;
        for (const Branch& branch : row) {
            const bool known = branch.node < survey_.nodes.size();
            const NodeFacts facts = known ? survey_.nodes[branch.node] : NodeFacts{};
            const double width = std::max(0.6, branch.width - (branch.width > 4 ? 2 : 0));
            picture_.Box(branch.x, y, width, kBoxHeight, known ? StyleOf(facts) : "bad",
                         TooltipOf(branch.node, facts));
            const std::string label = std::to_string(branch.node);
            if (width > 8.0 * static_cast<double>(label.size()) + 6) {
                picture_.Text(branch.x + 3, y + kBoxHeight + 12, "soft small", label);
            }
            if (level > lowest_ && facts.state == NodeState::kIndex && facts.height == level) {
                AddChildren(branch, y, &next);
            }
        }
        return next;
    }

    void AddChildren(const Branch& parent, double y, std::vector<Branch>* next) {
        HeldNode node(tree_);
        if (node.Open(parent.node) != 0) {
            return;
        }
        const u32 count = node.RecordCount();
        const double share = parent.width / std::max(1u, count);
        for (u32 i = 0; i < count && next->size() < kMostBoxes; ++i) {
            unsigned child = 0;
            if (node.Get()->GetChildNodeNum(&tree_->header, static_cast<int>(i), &child) != 0) {
                return;
            }
            const double x = parent.x + share * i;
            next->push_back({child, x, share});
            // Where the lines would run together, those to the first and last child stand for all.
            if (share > 3 || i == 0 || i + 1 == count) {
                picture_.Line(parent.x + parent.width / 2, y + kBoxHeight, x + share / 2,
                              y + kRowHeight, "rule");
            }
        }
    }

    const TreeSurvey& survey_;
    CBTreeHfs* tree_;
    u32 lowest_;
    SvgPicture picture_;
};

}  // namespace

std::string PlotTree(const TreeSurvey& survey, CBTreeHfs* tree, u32 levels) {
    return TreePicture(survey, tree, levels).Draw();
}

}  // namespace VELK::tool
