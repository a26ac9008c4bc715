// Options on top of the parsing library: what it lacks is one-line errors with suggestions, the
// refusal of contradicting repetitions, and help texts that end with examples.
#include "tool/options.h"

#include <fmt/format.h>

#include <CLI/CLI.hpp>
#include <cstdio>

#include "tool/command.h"
#include "tool/errors.h"

namespace VELK::tool {

namespace {

using Apply = std::function<void(const std::vector<std::string>&)>;

struct Entry {
    CLI::Option* option = nullptr;
    std::string names;  // as declared; the meta name for arguments
    std::string meta;
    std::string help;
    bool isFlag = false;
    bool isList = false;
    bool isArgument = false;
    bool isRequired = false;
    bool isGeneral = false;
    std::vector<std::string> values;
    Apply apply;
};

std::string LongName(const std::string& names) {
    const std::size_t comma = names.rfind(',');
    return comma == std::string::npos ? names : names.substr(comma + 1);
}

// "-l, --long", or "    --long" so that long names stand below each other.
std::string ShownNames(const Entry& entry) {
    const std::size_t comma = entry.names.find(',');
    std::string shown;
    if (entry.isArgument) {
        return entry.names;
    }
    if (comma != std::string::npos) {
        shown = entry.names.substr(0, comma) + ", " + entry.names.substr(comma + 1);
    } else {
        shown = entry.names.starts_with("--") ? "    " + entry.names : entry.names;
    }
    return entry.meta.empty() ? shown : shown + " " + entry.meta;
}

// The words of `text` in lines of a help text, of which all but the first begin with `indent`
// blanks.
std::string Filled(const std::string& text, std::size_t indent) {
    constexpr std::size_t kWidth = 80;
    std::string filled;
    std::size_t column = indent;
    for (std::size_t at = 0; at < text.size();) {
        const std::size_t end = std::min(text.find_first_of(" \n", at), text.size());
        const std::size_t size = end - at;
        if (column + 1 + size > kWidth) {
            filled += "\n" + std::string(indent, ' ');
            column = indent;
        } else if (!filled.empty()) {
            filled.push_back(' ');
            column += 1;
        }
        filled.append(text, at, size);
        column += size;
        at = end + 1;
    }
    return filled;
}

bool ParseWithUnits(const std::string& text, const char* units, const u64* factors, u64* value) {
    std::size_t used = 0;
    const bool hex = text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X');
    try {
        if (text.empty() || text[0] < '0' || text[0] > '9') {
            return false;
        }
        *value = std::stoull(text, &used, hex ? 16 : 10);
    } catch (const std::exception&) {
        return false;
    }
    if (used == text.size()) {
        return true;
    }
    const char* unit = std::strchr(units, text[used]);
    if (used + 1 != text.size() || unit == nullptr) {
        return false;
    }
    const u64 factor = factors[unit - units];
    if (*value > ~u64{0} / factor) {
        return false;
    }
    *value *= factor;
    return true;
}

}  // namespace

bool ParseCount(const std::string& text, u64* value) {
    constexpr u64 kFactors[] = {1000, 1000, 1000000, 1000000000};
    return ParseWithUnits(text, "kKMG", kFactors, value);
}

bool ParseSize(const std::string& text, u64* value) {
    constexpr u64 kFactors[] = {512, 1u << 10, 1u << 10, 1u << 20, 1u << 30, u64{1} << 40};
    return ParseWithUnits(text, "skKMGT", kFactors, value);
}

struct OptionSet::Impl {
    Impl(const Command& theCommand, std::vector<std::string> theArguments)
        : command(theCommand), arguments(std::move(theArguments)) {
        app.set_help_flag();
        app.allow_extras();
    }

    Entry* Add(const char* names, const char* meta, const char* help, Apply apply) {
        entries.push_back(std::make_unique<Entry>());
        Entry* entry = entries.back().get();
        entry->names = names;
        entry->meta = meta;
        entry->help = help;
        entry->isGeneral = inGeneral;
        entry->apply = std::move(apply);
        return entry;
    }
    Entry* AddValue(const char* names, const char* meta, const char* help, Apply apply) {
        Entry* entry = Add(names, meta, help, std::move(apply));
        entry->option = app.add_option(names, entry->values)->expected(1)->allow_extra_args(false);
        entry->option->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
        return entry;
    }
    Entry* AddArgument(const char* meta, const char* help, Apply apply) {
        Entry* entry = Add(meta, "", help, std::move(apply));
        entry->isArgument = true;
        return entry;
    }
    std::vector<std::string> Names() const {
        std::vector<std::string> names = {"-h", "--help"};
        for (const auto& entry : entries) {
            const std::size_t comma = entry->names.find(',');
            if (entry->isArgument) {
                continue;
            }
            if (comma != std::string::npos) {
                names.push_back(entry->names.substr(0, comma));
            }
            names.push_back(LongName(entry->names));
        }
        return names;
    }
    void Run();
    void Distribute(const std::vector<std::string>& extras);
    void CheckAndApply();
    void PrintEntries(const char* title, bool general, bool argument, std::string* text) const;
    std::string Help() const;

    const Command& command;
    std::vector<std::string> arguments;
    CLI::App app;
    std::vector<std::unique_ptr<Entry>> entries;
    bool inGeneral = false;
    bool wantsHelp = false;
};

OptionSet::OptionSet(const Command& command, std::vector<std::string> arguments)
    : impl_(std::make_unique<Impl>(command, std::move(arguments))) {}

OptionSet::~OptionSet() = default;

void OptionSet::Flag(const char* names, bool* target, const char* help) {
    Entry* entry = impl_->Add(names, "", help, nullptr);
    entry->isFlag = true;
    entry->option = impl_->app.add_flag(names, *target)->disable_flag_override();
    entry->option->multi_option_policy(CLI::MultiOptionPolicy::TakeLast);
}

void OptionSet::Text(const char* names, std::string* target, const char* meta, const char* help) {
    impl_->AddValue(names, meta, help, [target](const auto& values) { *target = values[0]; });
}

void OptionSet::Text(const char* names, std::optional<std::string>* target, const char* meta,
                     const char* help) {
    impl_->AddValue(names, meta, help, [target](const auto& values) { *target = values[0]; });
}

void OptionSet::List(const char* names, std::vector<std::string>* target, const char* meta,
                     const char* help) {
    Entry* entry =
        impl_->AddValue(names, meta, help, [target](const auto& values) { *target = values; });
    entry->isList = true;
}

void OptionSet::Count(const char* names, std::optional<u64>* target, const char* meta,
                      const char* help) {
    const std::string command = impl_->command.name;
    const std::string name = LongName(names);
    impl_->AddValue(names, meta, help, [=](const auto& values) {
        u64 value = 0;
        if (!ParseCount(values[0], &value)) {
            ThrowUsage(command, fmt::format("{}: '{}' is no number", name, values[0]), "");
        }
        *target = value;
    });
}

void OptionSet::Size(const char* names, std::optional<u64>* target, const char* meta,
                     const char* help) {
    const std::string command = impl_->command.name;
    const std::string name = LongName(names);
    impl_->AddValue(names, meta, help, [=](const auto& values) {
        u64 value = 0;
        if (!ParseSize(values[0], &value)) {
            ThrowUsage(command, fmt::format("{}: '{}' is no size", name, values[0]),
                       "write it like 86016, 84K or 168s");
        }
        *target = value;
    });
}

void OptionSet::Choice(const char* names, std::string* target, std::vector<std::string> words,
                       const char* help) {
    const std::string command = impl_->command.name;
    const std::string name = LongName(names);
    const std::string meta = fmt::format("{}", fmt::join(words, "|"));
    impl_->AddValue(names, meta.c_str(), help, [=](const auto& values) {
        if (std::find(words.begin(), words.end(), values[0]) == words.end()) {
            ThrowUsage(command,
                       fmt::format("{}: '{}' is none of {}{}", name, values[0], meta,
                                   DidYouMean(values[0], words)),
                       "");
        }
        *target = values[0];
    });
}

void OptionSet::Argument(const char* meta, std::string* target, const char* help) {
    Entry* entry =
        impl_->AddArgument(meta, help, [target](const auto& values) { *target = values[0]; });
    entry->isRequired = true;
}

void OptionSet::OptionalArgument(const char* meta, std::optional<std::string>* target,
                                 const char* help) {
    impl_->AddArgument(meta, help, [target](const auto& values) { *target = values[0]; });
}

void OptionSet::Arguments(const char* meta, std::vector<std::string>* target, const char* help) {
    Entry* entry =
        impl_->AddArgument(meta, help, [target](const auto& values) { *target = values; });
    entry->isList = true;
}

void OptionSet::BeginGeneral() {
    impl_->app.add_flag("-h,--help", impl_->wantsHelp);
    impl_->inGeneral = true;
}

std::vector<std::string> OptionSet::Names() const {
    return impl_->Names();
}

void OptionSet::ShowHelp() {
    Output out;
    out.Write(impl_->Help());
    out.Commit();
    throw HelpShown{};
}

void OptionSet::Parse() {
    impl_->Run();
    if (impl_->wantsHelp) {
        ShowHelp();
    }
    impl_->CheckAndApply();
}

void OptionSet::Impl::Run() {
    try {
        std::vector<std::string> reversed(arguments.rbegin(), arguments.rend());
        app.parse(reversed);
    } catch (const CLI::ArgumentMismatch& error) {
        const std::string text = error.what();
        const std::size_t colon = text.find(':');
        if (colon == std::string::npos) {
            ThrowUsage(command.name, "--" + text.substr(0, text.find(' ')) + " takes no value", "");
        }
        ThrowUsage(command.name, text.substr(0, colon) + " needs a value", "");
    } catch (const CLI::ParseError& error) {
        const std::string text = error.what();
        ThrowUsage(command.name, text.substr(0, text.find('\n')), "");
    }
    if (!wantsHelp) {
        Distribute(app.remaining());
    }
}

// Hands the words that belong to no option to the arguments, in order.
void OptionSet::Impl::Distribute(const std::vector<std::string>& extras) {
    bool optionsEnded = false;
    auto entry = entries.begin();
    const auto isFull = [&] {
        return !(*entry)->isArgument || (!(*entry)->isList && !(*entry)->values.empty());
    };
    for (const std::string& word : extras) {
        if (!optionsEnded && word == "--") {
            optionsEnded = true;
            continue;
        }
        if (!optionsEnded && word.size() > 1 && word[0] == '-') {
            const std::string name = word.substr(0, word.find('='));
            // Of one letter all others are as near.
            const bool isLetter = name.size() == 2;
            ThrowUsage(command.name,
                       "unknown option " + name + (isLetter ? "" : DidYouMean(name, Names())), "");
        }
        while (entry != entries.end() && isFull()) {
            ++entry;
        }
        if (entry == entries.end()) {
            ThrowUsage(command.name, fmt::format("'{}' is one argument too many", word),
                       fmt::format("treehfs {} {}", command.name, command.arguments));
        }
        (*entry)->values.push_back(word);
    }
}

void OptionSet::Impl::CheckAndApply() {
    for (const auto& entry : entries) {
        // An empty word is what a shell makes of a variable that is not set.
        if (entry->isRequired && (entry->values.empty() || entry->values[0].empty())) {
            ThrowUsage(command.name,
                       entry->names + (entry->values.empty() ? " is missing" : " is empty"),
                       fmt::format("treehfs {} {}", command.name, command.arguments));
        }
        if (entry->isFlag || entry->values.empty()) {
            continue;
        }
        for (const std::string& value : entry->values) {
            if (!entry->isList && value != entry->values[0]) {
                ThrowUsage(command.name,
                           fmt::format("{} is given twice, as '{}' and as '{}'",
                                       LongName(entry->names), entry->values[0], value),
                           "give it once");
            }
        }
        entry->apply(entry->values);
    }
}

void OptionSet::Impl::PrintEntries(const char* title, bool general, bool argument,
                                   std::string* text) const {
    constexpr std::size_t kColumn = 30;
    std::string block;
    for (const auto& entry : entries) {
        if (entry->isGeneral != general || entry->isArgument != argument) {
            continue;
        }
        std::string left = "  " + ShownNames(*entry);
        if (left.size() + 2 > kColumn) {
            block += left + "\n";
            left.clear();
        }
        left.resize(kColumn, ' ');
        block += left + Filled(entry->help, kColumn) + "\n";
    }
    if (general && !argument) {
        block += fmt::format("{:<{}}this text\n", "  -h, --help", kColumn);
    }
    if (!block.empty()) {
        *text += fmt::format("\n{}:\n{}", title, block);
    }
}

std::string OptionSet::Impl::Help() const {
    std::string text =
        fmt::format("treehfs {} [options]{}{}\n{}\n", command.name,
                    command.arguments[0] != 0 ? " " : "", command.arguments, command.summary);
    if (command.details[0] != 0) {
        text += fmt::format("\n{}\n", Filled(command.details, 0));
    }
    PrintEntries("Arguments", false, true, &text);
    PrintEntries("Options", false, false, &text);
    PrintEntries("General options", true, false, &text);
    text += "\nExamples:\n";
    for (const char* example : command.examples) {
        text += fmt::format("  treehfs {}\n", example);
    }
    return text;
}

}  // namespace VELK::tool
