// See document.h.
#include "document.h"

#include <fstream>

namespace VELK::test {

namespace {

constexpr char kIntroduction[] = R"(# Damaged volumes

What engine, checker and program say of every way in which a volume can be hurt. Each entry is a
small volume with that one fault, made by a few lines of code in `tests/museum`; the tests read it
with everything there is and compare with what stands here. None of it crashes, none of it runs
for ever, and reading changes no byte. A change of texts that is meant is written down with
`build/asan/museum_guide document > docs/damage.md`; the difference is to be read.

An entry says, where there is something to say:

- **engine**: what the volume layer says at `mount` and `open`, and which reading calls fared
  otherwise than on a sound volume: `find` looks up every record of the sound volume, `walk` and
  `back` step through all leaves from either end, `badblocks` loads the bad-block list. Then the
  status, the reason of the first report `@` its site, `>` the sites at which callers passed it
  on, `!` assertions ([reports.md](reports.md)), and how much of the work it concerned.
- **check**: the invariants that `check --full` names ([check.md](check.md)), and its first line.
- **exits**: exit codes of `info`, `check --full`, `ls -R`, `dump`, `stats`, `find --name '*'` and
  `node root`.
- **write**: the line with which a command given `--write` refuses the volume. Where the line
  names `--force`, that lets the command through, with a warning in its place; otherwise nothing
  does.

The sound volume has blocks and nodes of 512 bytes, a catalog of three levels with a folder of
nine files, an extents tree of two levels with a bad-block list of 64 blocks, and an attributes
tree of two levels.
)";

void Append(std::string* text, const char* what, const std::string& said) {
    if (!said.empty()) {
        *text += std::string("- ") + what + ": `" + said + "`\n";
    }
}

}  // namespace

std::string LabelOf(const Exhibit& exhibit, const Shown& shown) {
    std::string text = std::string("\n") + exhibit.hurt + "\n\n";
    Append(&text, "engine", shown.engine);
    Append(&text, "check", shown.check);
    Append(&text, "exits", shown.exits);
    Append(&text, "write", shown.refusal);
    return text;
}

std::string Document() {
    std::string text = kIntroduction;
    for (const Hall& hall : Museum()) {
        text += std::string("\n## ") + hall.title + "\n";
        for (const Exhibit& exhibit : hall.exhibits) {
            text += std::string("\n### ") + exhibit.name + "\n" + LabelOf(exhibit, Show(exhibit));
        }
    }
    return text;
}

std::map<std::string, std::string> ReadLabels(const std::string& path) {
    std::map<std::string, std::string> labels;
    std::string* label = nullptr;
    std::ifstream file(path);
    for (std::string line; std::getline(file, line);) {
        if (line.rfind("### ", 0) == 0) {
            label = &labels[line.substr(4)];
        } else if (line.rfind("## ", 0) == 0) {
            label = nullptr;
        } else if (label != nullptr) {
            *label += line + "\n";
        }
    }
    // The empty line before the next heading belongs to that one.
    for (auto& entry : labels) {
        while (entry.second.ends_with("\n\n")) {
            entry.second.pop_back();
        }
    }
    return labels;
}

}  // namespace VELK::test
