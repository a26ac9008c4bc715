// What a command of the program is, and what it is called with. A command is one file
// cmd_<verb>.cpp with one `const Command`, and one row of the table in main.cpp.
//
// `run` declares its options on the invocation, calls Parse, does its work through `out`, and
// returns an exit code. It reports failure by throwing a ToolError (errors.h); main prints it.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "tool/options.h"
#include "tool/output.h"
#include "tool/tree_name.h"

namespace VELK::tool {

class Invocation;

struct Command {
    const char* name;
    const char* arguments;    // as the usage line shows them
    const char* summary;      // one line for the list of commands
    const char* details;      // a few sentences for its help; may be empty
    const char* examples[3];  // command lines without the program's name
    int (*run)(Invocation* call);
};

// Every command, in the order of the help text; ends with null.
extern const Command* const kCommands[];
const Command* FindCommand(const std::string& name);

// How a command picks its trees.
enum class TreeDefault {
    kCatalog,     // one tree, the catalog unless told otherwise
    kAttributes,  // one tree, the attributes unless told otherwise
    kAll,         // any number, all of them unless told otherwise
};

// One call of a command: its options, and where its result goes.
class Invocation {
public:
    Invocation(const Command& command, std::vector<std::string> arguments);

    // --- before Parse: which options the command takes. The general ones are always there. -------
    void DeclareImage();  // IMAGE and what says where the volume lies in it
    void DeclarePlace();  // the latter alone
    void DeclareTrees(TreeDefault treeDefault);
    void DeclareRange();       // --range
    void DeclareLimits();      // --limit --offset-records
    void DeclareKeepGoing();   // --keep-going
    void DeclareJson();        // --json
    void DeclareOutputFile();  // -o FILE, --force
    // Ends with HelpShown after printing help, or with a ToolError for a wrong command line.
    void Parse();

    const Command& command;
    const std::vector<std::string> words;  // the command line behind the command's name
    OptionSet options;
    Output out;

    // --- after Parse -----------------------------------------------------------------------------
    std::string image;
    std::optional<u64> offset;
    u32 partition = 0;
    bool backupHeader = false;
    u32 mapBlockSize = 0;

    std::vector<u32> trees;   // file IDs, in the order catalog, extents, attributes for "all"
    bool treesGiven = false;  // chosen on the command line
    std::string range;        // FROM..TO, empty: everything
    u64 limit = ~u64{0};      // records
    u64 skipRecords = 0;
    bool keepGoing = false;
    bool json = false;
    std::string outputFile;
    bool force = false;

    bool quiet = false;
    bool verbose = false;
    bool trace = false;
    bool color = false;         // of standard output, decided
    bool showProgress = false;  // decided
    int progressFd = -1;

private:
    void DeclareGeneral();
    void ChooseTrees();
    void ChooseGeneral();

    TreeDefault treeDefault_ = TreeDefault::kCatalog;
    bool takesTrees_ = false;
    std::vector<std::string> treeNames_;
    std::optional<u64> partitionNumber_;
    std::optional<u64> mapNumber_;
    std::optional<u64> limitNumber_;
    std::optional<u64> skipNumber_;
    std::optional<u64> progressFdNumber_;
    std::string colorWord_ = "auto";
    std::string progressWord_ = "auto";
};

}  // namespace VELK::tool
