// See showing.h.
#include "showing.h"

#include <algorithm>
#include <cstdio>
#include <fstream>

#include <gtest/gtest.h>
#include <unistd.h>

#include "hfs/volume/image_volume.h"
#include "program_run.h"
#include "reading.h"

namespace VELK::test {

namespace {

struct CommandLine {
    const char* command;
    std::vector<std::string> arguments;
};

const CommandLine kLooks[] = {{"info", {"IMAGE"}},        {"check", {"--full", "IMAGE"}},
                              {"ls", {"-R", "IMAGE"}},    {"dump", {"IMAGE"}},
                              {"stats", {"IMAGE"}},       {"find", {"IMAGE", "--name", "*"}},
                              {"node", {"IMAGE", "root"}}};

// A failure must have been told, in lines that a terminal can show. `info` and `check` tell of
// damaged trees in their own output.
std::string FaultOf(const char* command, const Told& told) {
    const int known[] = {0, 1, 4, 8, 12, 16};
    const std::string name = std::string(" ") + command + ":";
    if (std::find(std::begin(known), std::end(known), told.exitCode) == std::end(known)) {
        return name + " exit code " + std::to_string(told.exitCode);
    }
    if (told.exitCode >= 8 && told.exitCode != 12 && told.err.rfind("treehfs: ", 0) != 0 &&
        told.out.find("unread ") == std::string::npos &&
        told.out.find("\ndamaged: ") == std::string::npos) {
        return name + " failed without a word: " + told.err;
    }
    for (const char c : told.err) {
        if (static_cast<u8>(c) < 0x20 && c != '\n') {
            return name + " control character in: " + told.err;
        }
    }
    return {};
}

// The volume inside the image, and what a full check of it says first.
std::string CheckText(const Told& told) {
    std::vector<std::string> ids;
    std::string first;
    std::size_t at = 0;
    while (at < told.out.size()) {
        const std::size_t end = std::min(told.out.find('\n', at), told.out.size());
        const std::string line = told.out.substr(at, end - at);
        at = end + 1;
        if (line.rfind("error ", 0) == 0 || line.rfind("warn", 0) == 0) {
            ids.push_back(line.substr(6, 3));
            first = first.empty() ? line : first;
        } else if (line.rfind("info ", 0) == 0 || line.rfind("unread ", 0) == 0) {
            first = first.empty() ? line : first;
        }
    }
    if (told.out.empty()) {
        return told.err.substr(0, told.err.find('\n'));
    }
    std::sort(ids.begin(), ids.end());
    ids.erase(std::unique(ids.begin(), ids.end()), ids.end());
    std::string text;
    for (const std::string& id : ids) {
        text += id + " ";
    }
    return text.empty() && first.empty() ? "" : text + "| " + first;
}

std::string ScriptFile() {
    const std::string path =
        ::testing::TempDir() + "treehfs_museum_" + std::to_string(getpid()) + ".tr";
    std::ofstream(path) << "state\n";
    return path;
}

// What --write is told, and that --force does what the refusal promised of it.
void TryToWrite(const Bytes& image, Shown* shown) {
    const std::string script = ScriptFile();
    ProgramRun run(image);
    const Told told = run.Run("apply", {"IMAGE", script, "--write"});
    shown->fault += FaultOf("apply --write", told);
    shown->refusal = told.exitCode == 8 ? told.err.substr(0, told.err.find('\n')) : "";
    if (!shown->refusal.empty()) {
        shown->fault += run.FileBytes() == image ? "" : " refused --write, and changed the image";
        const Told forced = run.Run("apply", {"IMAGE", script, "--write", "--force"});
        shown->fault += FaultOf("apply --write --force", forced);
        const bool isPromised = shown->refusal.find("--force") != std::string::npos;
        const bool isWarned = forced.err.find("written to all the same") != std::string::npos;
        if (isPromised ? !isWarned : forced.err != told.err) {
            shown->fault += " --force: " + forced.err;
        }
    }
    std::remove(script.c_str());
}

}  // namespace

Shown Show(const Exhibit& exhibit) {
    Specimen specimen;
    exhibit.make(specimen);
    const Bytes& image = specimen.bytes;
    Shown shown;
    const Reading reading = ReadEverything(image, specimen.volume);
    shown.engine = reading.text;
    shown.fault = reading.fault;
    {
        ProgramRun run(image);
        for (const CommandLine& look : kLooks) {
            const Told told = run.Run(look.command, look.arguments);
            shown.exits += (shown.exits.empty() ? "" : " ") + std::to_string(told.exitCode);
            shown.fault += FaultOf(look.command, told);
            if (std::string(look.command) == "check") {
                shown.check = CheckText(told);
            }
        }
        shown.fault += run.FileBytes() == image ? "" : " looking changed the image";
    }
    TryToWrite(image, &shown);
    return shown;
}

}  // namespace VELK::test
