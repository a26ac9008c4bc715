// Runs commands of treehfs on an image within this process, as main would.
#pragma once

#include <string>
#include <vector>

#include "image_bytes.h"

namespace VELK::test {

struct Told {
    int exitCode = 0;
    std::string out;
    std::string err;
};

// The image lies in a file, whose name in what is told is replaced by "IMAGE".
class ProgramRun {
public:
    explicit ProgramRun(const Bytes& image);
    ~ProgramRun();
    ProgramRun(const ProgramRun&) = delete;
    ProgramRun& operator=(const ProgramRun&) = delete;

    // "IMAGE" among the arguments stands for the file.
    Told Run(const std::string& command, std::vector<std::string> arguments);
    Bytes FileBytes() const;

private:
    std::string path_;
};

}  // namespace VELK::test
