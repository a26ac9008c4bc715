// Pieces of the pictures: an SVG document with its colours, rectangles with tooltips, text.
#pragma once

#include <fmt/format.h>

#include <string>
#include <string_view>

#include "hfs/volume/problem.h"
#include "tool/tree_survey.h"

namespace VELK::tool {

class SvgPicture {
public:
    static constexpr double kMargin = 16;
    static constexpr double kTitleHeight = 44;  // title and the line under it

    SvgPicture(double width, double height, const std::string& title, const std::string& subtitle);

    // `style` names classes of the picture's style sheet.
    void Box(double x, double y, double width, double height, std::string_view style,
             std::string_view tooltip);
    void Line(double x1, double y1, double x2, double y2, std::string_view style);
    void Text(double x, double y, std::string_view style, std::string_view text);
    // A row of colour samples with their meaning; `x` is where the next one would go.
    void LegendItem(double* x, double y, std::string_view style, std::string_view text);
    // Classes of the ten steps of fill, and of a node of this kind and fill.
    void FillLegend(double* x, double y);

    std::string Finish();

private:
    std::string out_;
};

std::string StyleOf(const NodeFacts& facts);
// "leaf node 14: 22 records, 94.5% full".
std::string TooltipOf(u32 nodeNum, const NodeFacts& facts);
std::string Escaped(std::string_view text);
// "catalog, 1,839 nodes of 4,096 B, 3 levels, 40,042 records".
std::string SubtitleOf(const TreeSurvey& survey);

}  // namespace VELK::tool
