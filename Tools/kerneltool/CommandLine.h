#pragma once

#include "libkernel/core/String.h"

#include <array>
#include <optional>
#include <string>
#include <vector>

namespace KernelTool {

/// Exit statuses, which scripts rely on.
enum ExitStatus
{
    ExitDone = 0,
    ExitFailed = 1,
    ExitUsage = 2,
    ExitDamaged = 3, ///< A check ran and found damage.
    ExitInterrupted = 130
};

enum class Option
{
    Json,
    Progress,
    At,
    Uid,
    Reference,
    Tree,
    Prefix,
    Session,
    Scratch,
    Level,
    Predictor,
    Striped,
    UserData,
    Verify,
    To,
    Overwrite,
    NoVerify,
    Set,
    Get,
    Zlib,
    Locale,
    Numeric,
    FromEncoding,
    ToEncoding,
    Count
};

/// One option with one meaning, wherever it is allowed. The parser, the help and the completions read the same row.
struct OptionInfo
{
    Option option;
    char const* name;    ///< With its dashes.
    char const* value;   ///< What its value is called; null for a flag.
    char const* choices; ///< The values allowed, separated by '|'; null for any.
    char const* help;
};

/// What the parser made of the words behind a verb.
class Arguments
{
public:
    bool Has(Option option) const { return m_values[static_cast<size_t>(option)].has_value(); }
    /// The value; @p fallback if the option wasn't given.
    std::string Get(Option option, char const* fallback = "") const;
    Kernel::String8 GetString(Option option) const { return Kernel::String8(std::string_view(Get(option))); }
    /// A positional argument, which the verb's row says is there.
    Kernel::String8 At(size_t index) const { return Kernel::String8(std::string_view(positional[index])); }

    std::vector<std::string> positional;

private:
    friend class CommandLine;
    std::array<std::optional<std::string>, static_cast<size_t>(Option::Count)> m_values;
};

/// One verb. Rows of one group stand together.
struct VerbInfo
{
    char const* group;
    char const* name;
    char const* arguments; ///< As the help shows them.
    char const* summary;
    char const* example;
    std::vector<Option> options;
    size_t minArguments;
    size_t maxArguments;
    int (*run)(Arguments const& arguments);
};

struct GroupInfo
{
    char const* name;
    char const* summary;
    char const* example;
};

/// The table of verbs and what is derived from it.
class CommandLine
{
public:
    static constexpr size_t c_unlimited = static_cast<size_t>(-1);

    static std::vector<VerbInfo> const& GetVerbs();
    static std::vector<GroupInfo> GetGroups();
    static OptionInfo const& GetOption(Option option);
    /// The values that the option allows; empty for any.
    static std::vector<std::string> GetChoices(OptionInfo const& option);

    /// Finds the verb and runs it, or answers a question for help or version. Gives the exit status; failures of the
    /// verb pass through.
    static int Run(std::vector<std::string> const& words);

    /// The completion script for "bash" or "zsh"; empty for another shell.
    static std::string MakeCompletions(std::string const& shell);

private:
    static bool Parse(VerbInfo const& verb, std::vector<std::string> const& words, Arguments& arguments, bool& help,
                      std::string& problem);
};

} // namespace KernelTool
