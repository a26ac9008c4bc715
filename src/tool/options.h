// The options of one command. A command declares what it takes and where the values go; Parse fills
// them in, or ends with one line that names the mistake. An option given twice with different
// values is a mistake, not a matter of order.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/types.h"

namespace VELK::tool {

struct Command;

class OptionSet {
public:
    OptionSet(const Command& command, std::vector<std::string> arguments);
    OptionSet(const OptionSet&) = delete;
    OptionSet& operator=(const OptionSet&) = delete;
    ~OptionSet();

    // `names` as in "-l,--long"; `meta` names the value in the help text.
    void Flag(const char* names, bool* target, const char* help);
    void Text(const char* names, std::string* target, const char* meta, const char* help);
    void Text(const char* names, std::optional<std::string>* target, const char* meta,
              const char* help);
    void List(const char* names, std::vector<std::string>* target, const char* meta,
              const char* help);
    // 123, 0x7b, 100k, 1M: k, M, G are 1,000s for counts.
    void Count(const char* names, std::optional<u64>* target, const char* meta, const char* help);
    // 86016, 0x15000, 84K, 168s: K, M, G are 1,024s, s are sectors of 512.
    void Size(const char* names, std::optional<u64>* target, const char* meta, const char* help);
    // One of `words`.
    void Choice(const char* names, std::string* target, std::vector<std::string> words,
                const char* help);

    // Arguments without a name, in order. The last one may take any number.
    void Argument(const char* meta, std::string* target, const char* help);
    void OptionalArgument(const char* meta, std::optional<std::string>* target, const char* help);
    void Arguments(const char* meta, std::vector<std::string>* target, const char* help);

    // From here on, options are general ones: the help text lists them apart.
    void BeginGeneral();

    void Parse();
    // Prints the help text instead of running; throws HelpShown.
    [[noreturn]] void ShowHelp();
    // Every long and short name, for suggestions and completion.
    std::vector<std::string> Names() const;

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

// Number forms as the options take them. False: no such number, or too large.
bool ParseCount(const std::string& text, u64* value);
bool ParseSize(const std::string& text, u64* value);

}  // namespace VELK::tool
