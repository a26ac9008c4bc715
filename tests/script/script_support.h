// Runs scripts as `treehfs apply` does and collects what it prints.
#pragma once

#include <string>
#include <vector>

namespace VELK::tool {

struct Transcript {
    int exitCode = 0;
    std::string out;
    std::string err;
};

// treehfs COMMAND ARGUMENTS; failures become their line on `err` and their exit code.
Transcript RunTool(const std::string& command, const std::vector<std::string>& arguments);

// treehfs apply --new VOLUME [options] SCRIPT, the script given as text; its file is s.tr.
Transcript Apply(const std::string& volume, const std::string& script,
                 const std::vector<std::string>& options);
// treehfs shell ARGUMENTS with `input` as its standard input.
Transcript Shell(const std::string& input, const std::vector<std::string>& arguments);
// Apply on a volume of 1 MiB with 512-byte nodes; only the lines, without the summary.
std::string Lines(const std::string& script);

// A path in the folder of temporary files, and a file there.
std::string TempPath(const std::string& name);
std::string TempFile(const std::string& name, const std::string& text);

}  // namespace VELK::tool
