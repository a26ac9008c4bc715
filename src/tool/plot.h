// Pictures of a tree as SVG: one square per node in file order, the index as boxes, a histogram of
// fill, and the order of the leaves. Each stands for itself, with a legend and tooltips, and is
// readable on a light and on a dark page.
#pragma once

#include <string>

#include "tool/tree_survey.h"

namespace VELK::tool {

// `levels`: most index levels drawn, from the root down.
std::string PlotMap(const TreeSurvey& survey);
std::string PlotTree(const TreeSurvey& survey, CBTreeHfs* tree, u32 levels);
std::string PlotFill(const TreeSurvey& survey);
std::string PlotKeys(const TreeSurvey& survey);

// An HTML page around a picture, with nothing to load from elsewhere.
std::string HtmlPage(const std::string& title, const std::string& svg);

}  // namespace VELK::tool
