// node: single nodes, field by field, with the offset of everything.
#include "tool/errors.h"
#include "tool/node_printer.h"
#include "tool/options.h"

namespace VELK::tool {

namespace {

// Numbers that a word means; several for "map".
std::vector<u32> NumbersOf(Session* session, u32 fileId, const std::string& word) {
    CBTreeHfs* tree = session->Tree(fileId);
    const BTHeaderMem& header = tree->header;
    u64 number = 0;
    if (word == "header") {
        return {0};
    }
    if (word == "map") {
        const std::vector<u32> nodes = MapNodes(tree);
        if (nodes.empty()) {
            ThrowNo(session->Image(), std::string(ForkName(fileId)) + " tree has no map nodes",
                    "the header node holds the whole map");
        }
        return nodes;
    }
    if (word == "root" || word == "first" || word == "last") {
        const u32 node = word == "root"    ? header.rootNode
                         : word == "first" ? header.firstLeafNode
                                           : header.lastLeafNode;
        if (node == 0) {
            ThrowNo(session->Image(), std::string(ForkName(fileId)) + " tree is empty", "");
        }
        number = node;
    } else if (!ParseCount(word, &number)) {
        ThrowUsage("node",
                   "'" + word + "' is no node" +
                       DidYouMean(word, {"root", "first", "last", "header", "map"}),
                   "a number, 0x..., root, first, last, header or map");
    }
    if (number >= header.totalNodes) {
        ThrowArgument(session->Image(),
                      fmt::format("{} node {}: the tree has nodes 0..{}", ForkName(fileId), number,
                                  header.totalNodes - 1),
                      "");
    }
    return {static_cast<u32>(number)};
}

int RunNode(Invocation* call) {
    std::vector<std::string> words;
    NodeStyle style;
    bool follow = false;
    call->DeclareImage();
    call->options.Arguments("N...", &words,
                            "number, 0x..., root, first, last, header or map; default root");
    call->DeclareTrees(TreeDefault::kCatalog);
    call->options.Flag("--follow", &follow, "the children, too");
    call->options.Flag("--hex", &style.hex, "bytes of every piece, sixteen to a row");
    call->options.Flag("--raw", &style.raw, "the bytes themselves");
    call->DeclareKeepGoing();
    call->DeclareJson();
    call->DeclareOutputFile();
    call->Parse();
    style.json = call->json;
    if (call->json + style.hex + style.raw > 1) {
        ThrowUsage("node", "--json, --hex and --raw exclude each other", "");
    }
    if (style.raw && call->out.IsTerminal()) {
        ThrowUsage("node", "--raw would write bytes to the terminal", "add -o FILE, or use --hex");
    }
    Session session(*call, Session::Truncated::kReadOn);
    const u32 fileId = call->trees[0];
    std::vector<u32> numbers;
    for (const std::string& word : words.empty() ? std::vector<std::string>{"root"} : words) {
        const std::vector<u32> found = NumbersOf(&session, fileId, word);
        numbers.insert(numbers.end(), found.begin(), found.end());
    }
    NodePrinter printer(&session, &call->out, fileId, style);
    if (follow) {
        printer.AppendChildren(&numbers);
    }
    bool first = true;
    for (const u32 number : numbers) {
        if (!first && !style.json && !style.raw) {
            call->out.Write("\n");
        }
        first = false;
        printer.Print(number);
    }
    return kExitDone;
}

}  // namespace

extern const Command kNodeCommand;
const Command kNodeCommand = {
    "node",
    "IMAGE [N...]",
    "single nodes, field by field, with offsets",
    "",
    {"node disk.img 2", "node disk.img root --follow", "node -t extents disk.img header --hex"},
    RunNode,
};

}  // namespace VELK::tool
