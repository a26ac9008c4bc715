// See plot_svg.h. Colours are classes of one style sheet in the picture, with a second set for dark
// pages; fill goes from pale to deep, kinds differ in hue and outline as well.
#include "tool/plot_svg.h"

#include "hfs/records/text_format.h"
#include "tool/plot.h"

namespace VELK::tool {

namespace {

constexpr std::string_view kStyle = R"(<style>
.page{fill:#ffffff}.ink{fill:#1c2330}.soft{fill:#5a6475}.rule{stroke:#b8c0cc;stroke-width:1}
.free{fill:#eef0f3;stroke:#d5dae1}.header{fill:#1c2330;stroke:#1c2330}
.map{fill:#8a4fbf;stroke:#5d2e87}
.index{stroke:#b3500a;stroke-width:1.5}.leaf{stroke:none}.bad{fill:#d4213d;stroke:#7d0d20}
.f0{fill:#deebf7}.f1{fill:#cfe1f2}.f2{fill:#b9d5ea}.f3{fill:#9dc6e0}.f4{fill:#7db4d6}
.f5{fill:#5c9fca}.f6{fill:#4089bd}.f7{fill:#2a72ad}.f8{fill:#175b97}.f9{fill:#08427a}
.i0,.i1,.i2,.i3,.i4{fill:#fdd9b5}.i5,.i6,.i7{fill:#f9a65a}.i8,.i9{fill:#e8761a}
.dot{fill:#175b97}.bar{fill:#4089bd}text{font-family:system-ui,sans-serif}
.title{font-size:16px;font-weight:600}.small{font-size:11px}.label{font-size:12px}
@media (prefers-color-scheme:dark){
.page{fill:#12161d}.ink{fill:#e6eaf0}.soft{fill:#9aa5b5}.rule{stroke:#3a4452}
.free{fill:#1d232d;stroke:#2c3542}.header{fill:#e6eaf0;stroke:#e6eaf0}
.map{fill:#b78be0;stroke:#e0c8f5}
.f0{fill:#1b3350}.f1{fill:#1e3f63}.f2{fill:#224c77}.f3{fill:#285a8b}.f4{fill:#30699f}
.f5{fill:#3c7ab2}.f6{fill:#4f8ec4}.f7{fill:#6aa5d6}.f8{fill:#8dbde5}.f9{fill:#b8d8f3}
.index{stroke:#f2a65e}.i0,.i1,.i2,.i3,.i4{fill:#4a2a0e}.i5,.i6,.i7{fill:#a85a17}
.i8,.i9{fill:#f2a65e}.dot{fill:#6aa5d6}.bar{fill:#4f8ec4}}
</style>
)";

constexpr double kSample = 12;

u32 FillStep(u32 permille) {
    return permille >= 1000 ? 9 : permille / 100;
}

const char* KindWord(NodeState state) {
    switch (state) {
        case NodeState::kFree:
            return "free";
        case NodeState::kHeader:
            return "header";
        case NodeState::kMap:
            return "map";
        case NodeState::kIndex:
            return "index";
        case NodeState::kLeaf:
            return "leaf";
        case NodeState::kUnreadable:
            break;
    }
    return "unreadable";
}

}  // namespace

SvgPicture::SvgPicture(double width, double height, const std::string& title,
                       const std::string& subtitle)
    : out_(fmt::format(
          "<svg xmlns=\"http://www.w3.org/2000/svg\" width=\"{0:.0f}\" height=\"{1:.0f}\" "
          "viewBox=\"0 0 {0:.0f} {1:.0f}\" role=\"img\">\n<title>{2}</title>\n",
          width, height, Escaped(title))) {
    out_ += kStyle;
    out_ +=
        fmt::format("<rect class=\"page\" width=\"{:.0f}\" height=\"{:.0f}\"/>\n", width, height);
    Text(kMargin, 24, "ink title", title);
    Text(kMargin, 40, "soft label", subtitle);
}

void SvgPicture::Box(double x, double y, double width, double height, std::string_view style,
                     std::string_view tooltip) {
    out_ += fmt::format(
        "<rect x=\"{:.1f}\" y=\"{:.1f}\" width=\"{:.1f}\" height=\"{:.1f}\" class=\"{}\"", x, y,
        width, height, style);
    if (tooltip.empty()) {
        out_ += "/>\n";
    } else {
        out_ += fmt::format("><title>{}</title></rect>\n", Escaped(tooltip));
    }
}

void SvgPicture::Line(double x1, double y1, double x2, double y2, std::string_view style) {
    out_ += fmt::format(
        "<line x1=\"{:.1f}\" y1=\"{:.1f}\" x2=\"{:.1f}\" y2=\"{:.1f}\" class=\"{}\"/>\n", x1, y1,
        x2, y2, style);
}

void SvgPicture::Text(double x, double y, std::string_view style, std::string_view text) {
    out_ += fmt::format("<text x=\"{:.1f}\" y=\"{:.1f}\" class=\"{}\">{}</text>\n", x, y, style,
                        Escaped(text));
}

void SvgPicture::LegendItem(double* x, double y, std::string_view style, std::string_view text) {
    constexpr double kLetter = 6.4;
    Box(*x, y - kSample + 2, kSample, kSample, style, "");
    Text(*x + kSample + 5, y, "soft label", text);
    *x += kSample + 22 + kLetter * static_cast<double>(text.size());
}

void SvgPicture::FillLegend(double* x, double y) {
    Text(*x, y, "soft label", "leaf, empty");
    *x += 74;
    for (u32 step = 0; step < 10; ++step) {
        Box(*x, y - kSample + 2, kSample, kSample, fmt::format("leaf f{}", step),
            fmt::format("{} to {}% full", 10 * step, 10 * step + 10));
        *x += kSample;
    }
    Text(*x + 5, y, "soft label", "full");
    *x += 46;
}

std::string SvgPicture::Finish() {
    return out_ + "</svg>\n";
}

std::string StyleOf(const NodeFacts& facts) {
    const std::string kind = KindWord(facts.state);
    const bool isIndex = facts.state == NodeState::kIndex;
    if (!isIndex && facts.state != NodeState::kLeaf) {
        return kind;
    }
    return fmt::format("{} {}{}", kind, isIndex ? 'i' : 'f', FillStep(facts.fillPermille));
}

std::string TooltipOf(u32 nodeNum, const NodeFacts& facts) {
    const std::string what = fmt::format("{} node {}", KindWord(facts.state), Grouped(nodeNum));
    if (facts.state != NodeState::kLeaf && facts.state != NodeState::kIndex) {
        return what;
    }
    return fmt::format("{}, level {}: {}, {:.1f}% full", what, facts.height,
                       Counted(facts.records, "record", "records"), facts.fillPermille / 10.0);
}

std::string Escaped(std::string_view text) {
    std::string out;
    for (const char c : text) {
        switch (c) {
            case '&':
                out += "&amp;";
                break;
            case '<':
                out += "&lt;";
                break;
            case '>':
                out += "&gt;";
                break;
            case '"':
                out += "&quot;";
                break;
            default:
                out += c;
        }
    }
    return out;
}

std::string SubtitleOf(const TreeSurvey& survey) {
    return fmt::format("{} of {} B, {}, {}", Counted(survey.nodes.size(), "node", "nodes"),
                       Grouped(survey.nodeSize), Counted(survey.depth, "level", "levels"),
                       Counted(survey.leafRecords, "record", "records"));
}

std::string HtmlPage(const std::string& title, const std::string& svg) {
    return fmt::format(
        "<!DOCTYPE html>\n<html lang=\"en\">\n<head>\n<meta charset=\"utf-8\">\n<title>{}</title>\n"
        "<meta name=\"color-scheme\" content=\"light dark\">\n"
        "<style>body{{margin:1.5rem;background:#fff}}svg{{max-width:100%;height:auto}}"
        "@media (prefers-color-scheme:dark){{body{{background:#12161d}}}}</style>\n"
        "</head>\n<body>\n{}</body>\n</html>\n",
        Escaped(title), svg);
}

}  // namespace VELK::tool
