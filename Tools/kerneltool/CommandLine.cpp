#include "CommandLine.h"

#include "Output.h"
#include "Verbs.h"
#include "libkernel/core/BuildNumber.h"

#include <cstdio>
#include <cstring>

namespace KernelTool {

namespace {

constexpr OptionInfo c_options[] = {
    {Option::Json, "--json", nullptr, nullptr, "print one JSON value and nothing else"},
    {Option::Progress, "--progress", "WHEN", "auto|always|never", "when to show a progress bar (default auto)"},
    {Option::At, "--at", "N", nullptr, "step back N revisions first"},
    {Option::Uid, "--uid", "ABCD", nullptr, "kind of document, four characters (default Docu)"},
    {Option::Reference, "--reference", "PATH", nullptr, "path of the file that this one stands for"},
    {Option::Tree, "--tree", "DIR", nullptr, "every regular file below DIR, under its relative path"},
    {Option::Prefix, "--prefix", "P", nullptr, "folder of the document that the tree goes into"},
    {Option::Session, "--session", "TYPE", "full|incremental|rewrite|export", "kind of save (default full)"},
    {Option::Scratch, "--scratch", nullptr, nullptr, "save to the scratch file"},
    {Option::Level, "--level", "LEVEL", "store|default|min|max", "compression (default default)"},
    {Option::Predictor, "--predictor", "BITS", "none|8|16|32", "store differences of numbers (default none)"},
    {Option::Striped, "--striped", nullptr, nullptr, "split the numbers into planes of their bytes"},
    {Option::UserData, "--user-data", "FILE", nullptr, "a block that the revision carries"},
    {Option::Verify, "--verify", nullptr, nullptr, "check the saved tables after the commit"},
    {Option::To, "--to", "NEW", nullptr, "write a compact copy to this new file"},
    {Option::Overwrite, "--overwrite", nullptr, nullptr, "write over the file instead of replacing it"},
    {Option::NoVerify, "--no-verify", nullptr, nullptr, "trust what was written"},
    {Option::Set, "--set", "IMAGE", nullptr, "replace the thumbnails by this file"},
    {Option::Get, "--get", "IMAGE", nullptr, "write the first thumbnail to this file"},
    {Option::Zlib, "--zlib", nullptr, nullptr, "the file is compressed, as settings files are"},
    {Option::Locale, "--locale", "L", nullptr, "language and country, such as sv-SE (default: your own)"},
    {Option::Numeric, "--numeric", nullptr, nullptr, "order runs of digits by their value"},
    {Option::FromEncoding, "--from", "ENC", nullptr, "a charset's name, page:NUMBER, mac:SCRIPT,LANGUAGE or pdfdoc"},
    {Option::ToEncoding, "--to", "ENC", nullptr, "the same for what is written (default UTF-8, for both)"},
};
static_assert(std::size(c_options) == static_cast<size_t>(Option::Count));

#define KERNELTOOL_WRITE_OPTIONS                                                                                       \
    Option::Session, Option::Scratch, Option::Level, Option::Predictor, Option::Striped, Option::UserData,             \
        Option::Verify, Option::Json, Option::Progress

constexpr GroupInfo c_groups[] = {
    {"archive", "inspect, make and check documents", "kerneltool archive ls drawing.doc"},
    {"stream", "look into property streams", "kerneltool stream dump settings.dat --zlib"},
    {"text", "convert, sort and look into text", "kerneltool text convert --from mac:0 old.txt"},
};

std::string Quoted(std::string const& word)
{
    return "'" + Printable(word) + "'";
}

int WrongUsage(std::string const& problem, std::string const& help)
{
    std::fprintf(stderr, "kerneltool: wrong usage: %s\nSee '%s --help'.\n", problem.c_str(), help.c_str());
    return ExitUsage;
}

std::string Pad(std::string text, size_t width)
{
    if (text.size() < width) text.append(width - text.size(), ' ');
    return text;
}

std::string UsageOf(VerbInfo const& verb)
{
    return std::string("kerneltool ") + verb.group + " " + verb.name + " [options] " + verb.arguments;
}

std::string ShortOption(OptionInfo const& info)
{
    std::string text = info.name;
    if (info.value) text += std::string(" ") + (info.choices ? info.choices : info.value);
    return text;
}

int ShowVerbHelp(VerbInfo const& verb)
{
    std::string text = "Usage: " + UsageOf(verb) + "\n\n" + verb.summary + "\n\nOptions:\n";
    for (Option option : verb.options) {
        OptionInfo const& info = CommandLine::GetOption(option);
        std::string const shown = ShortOption(info);
        text +=
            "  " + (shown.size() > 24 ? shown + "\n" + std::string(26, ' ') : Pad(shown, 24)) + "  " + info.help + "\n";
    }
    Print(text + "  " + Pad("--help", 24) + "  show this\n\nExample:\n  " + verb.example + "\n");
    return ExitDone;
}

int ShowGroupHelp(GroupInfo const& group)
{
    std::string text = std::string("Usage: kerneltool ") + group.name + " VERB [options] ARGS\n\nVerbs:\n";
    for (VerbInfo const& verb : CommandLine::GetVerbs())
        if (std::strcmp(verb.group, group.name) == 0) text += "  " + Pad(verb.name, 12) + verb.summary + "\n";
    Print(text + "\nExample:\n  " + group.example + "\n");
    return ExitDone;
}

int ShowHelp()
{
    std::string text = "Usage: kerneltool GROUP VERB [options] ARGS\n\nGroups:\n";
    for (GroupInfo const& group : c_groups) text += "  " + Pad(group.name, 12) + group.summary + "\n";
    Print(text + "\nExit status: 0 done, 1 failed, 2 wrong usage, 3 damage found, 130 stopped by Ctrl-C.\n"
                 "'kerneltool GROUP --help' and 'kerneltool GROUP VERB --help' say more.\n\nExample:\n"
                 "  kerneltool archive create drawing.doc\n");
    return ExitDone;
}

int ShowVersion()
{
    Print(std::string("kerneltool ") + KERNELTOOL_VERSION + " (build index " +
          std::to_string(Kernel::BuildNumber::ProductionIndex()) + ")\n");
    return ExitDone;
}

} // namespace

std::vector<VerbInfo> const& CommandLine::GetVerbs()
{
    static std::vector<VerbInfo> const s_verbs = {
        {"archive",
         "create",
         "FILE",
         "Make a new empty document; an existing file is refused.",
         "kerneltool archive create drawing.doc --uid Draw",
         {Option::Uid, Option::Reference, Option::Json, Option::Progress},
         1,
         1,
         RunCreate},
        {"archive",
         "put",
         "FILE [ITEM=SOURCE...]",
         "Add or replace items from files; '-' is standard input.",
         "kerneltool archive put drawing.doc notes/today.txt=today.txt --tree pictures --prefix pictures",
         {Option::Tree, Option::Prefix, KERNELTOOL_WRITE_OPTIONS},
         1,
         c_unlimited,
         RunPut},
        {"archive",
         "rm",
         "FILE ITEM...",
         "Delete items; earlier revisions keep them.",
         "kerneltool archive rm drawing.doc notes/today.txt",
         {KERNELTOOL_WRITE_OPTIONS},
         2,
         c_unlimited,
         RunRemove},
        {"archive",
         "ls",
         "FILE",
         "List the items of the working revision.",
         "kerneltool archive ls drawing.doc --at 1",
         {Option::At, Option::Json, Option::Progress},
         1,
         1,
         RunList},
        {"archive",
         "cat",
         "FILE ITEM",
         "Write an item's bytes to standard output.",
         "kerneltool archive cat drawing.doc notes/today.txt | wc -l",
         {Option::At, Option::Progress},
         2,
         2,
         RunCat},
        {"archive",
         "extract",
         "FILE DIR [ITEM...]",
         "Write items as files below DIR.",
         "kerneltool archive extract drawing.doc out pictures/a.png",
         {Option::At, Option::Json, Option::Progress},
         2,
         c_unlimited,
         RunExtract},
        {"archive",
         "info",
         "FILE",
         "Show the fields of a document's files.",
         "kerneltool archive info drawing.doc --json",
         {Option::At, Option::Json, Option::Progress},
         1,
         1,
         RunInfo},
        {"archive",
         "history",
         "FILE",
         "List the revisions, oldest first, with what each changed.",
         "kerneltool archive history drawing.doc",
         {Option::At, Option::Json, Option::Progress},
         1,
         1,
         RunHistory},
        {"archive",
         "verify",
         "FILE",
         "Read every item of every revision back and check its checksums.",
         "kerneltool archive verify drawing.doc && echo sound",
         {Option::At, Option::Json, Option::Progress},
         1,
         1,
         RunVerify},
        {"archive",
         "test",
         "FILE",
         "Walk headers and tables only.",
         "kerneltool archive test drawing.doc",
         {Option::Json, Option::Progress},
         1,
         1,
         RunTest},
        {"archive",
         "scratch",
         "FILE SCRATCH",
         "Add a scratch file to a document.",
         "kerneltool archive scratch drawing.doc drawing.scratch",
         {Option::Json, Option::Progress},
         2,
         2,
         RunScratch},
        {"archive",
         "recover",
         "FILE",
         "Open a damaged document at the newest state that a search finds, and check its items.",
         "kerneltool archive recover broken.doc --to saved.doc",
         {Option::To, Option::Json, Option::Progress},
         1,
         1,
         RunRecover},
        {"archive",
         "streamline",
         "FILE",
         "Make the document compact: the newest version of each item, and no history.",
         "kerneltool archive streamline drawing.doc --to drawing-small.doc",
         {Option::To, Option::Overwrite, Option::NoVerify, Option::Json, Option::Progress},
         1,
         1,
         RunStreamline},
        {"archive",
         "thumbnail",
         "FILE",
         "Show, set or get a document's thumbnail.",
         "kerneltool archive thumbnail drawing.doc --set small.png",
         {Option::Set, Option::Get, Option::Json, Option::Progress},
         1,
         1,
         RunThumbnail},
        {"stream",
         "dump",
         "FILE",
         "Show a property stream's header and properties.",
         "kerneltool stream dump settings.dat --zlib",
         {Option::Zlib, Option::Json, Option::Progress},
         1,
         1,
         RunStreamDump},
        {"stream",
         "check",
         "FILE",
         "Say whether a property stream is sound, and if not where and why.",
         "kerneltool stream check graph.dat",
         {Option::Zlib, Option::Json, Option::Progress},
         1,
         1,
         RunStreamCheck},
        {"text",
         "sort",
         "FILE",
         "Print the lines of a UTF-8 text in the order of a language; '-' is standard input.",
         "kerneltool text sort names.txt --locale sv-SE --numeric",
         {Option::Locale, Option::Numeric, Option::Json},
         1,
         1,
         RunTextSort},
        {"text",
         "convert",
         "[FILE]",
         "Convert a file, or standard input, from one encoding to another.",
         "kerneltool text convert --from page:1252 --to UTF-16LE letter.txt > letter.utf16",
         {Option::FromEncoding, Option::ToEncoding, Option::Json},
         0,
         1,
         RunTextConvert},
        {"text",
         "detect",
         "FILE",
         "Tell a file's encoding by its mark or its form, or guess it.",
         "kerneltool text detect letter.txt",
         {Option::Json},
         1,
         1,
         RunTextDetect},
        {"text",
         "chars",
         "TEXT",
         "List the code points of a text with class, bytes and name.",
         "kerneltool text chars 'naïve'",
         {Option::Json},
         1,
         1,
         RunTextChars},
    };
    return s_verbs;
}

std::vector<GroupInfo> CommandLine::GetGroups()
{
    return {std::begin(c_groups), std::end(c_groups)};
}

std::vector<std::string> CommandLine::GetChoices(OptionInfo const& option)
{
    std::vector<std::string> result;
    for (char const* p = option.choices; p && *p; ++p) {
        if (result.empty() || *p == '|') result.emplace_back();
        if (*p != '|') result.back() += *p;
    }
    return result;
}

OptionInfo const& CommandLine::GetOption(Option option)
{
    return c_options[static_cast<size_t>(option)];
}

std::string Arguments::Get(Option option, char const* fallback) const
{
    std::optional<std::string> const& value = m_values[static_cast<size_t>(option)];
    return value ? *value : fallback;
}

bool CommandLine::Parse(VerbInfo const& verb, std::vector<std::string> const& words, Arguments& arguments, bool& help,
                        std::string& problem)
{
    for (size_t i = 0; i < words.size(); ++i) {
        std::string const& word = words[i];
        if (word == "--") {
            arguments.positional.insert(arguments.positional.end(), words.begin() + static_cast<std::ptrdiff_t>(i) + 1,
                                        words.end());
            break;
        }
        if (word.size() < 2 || word[0] != '-') {
            arguments.positional.push_back(word);
            continue;
        }
        if (word == "--help" || word == "-h") {
            help = true;
            return true;
        }
        size_t const equals = word.find('=');
        std::string const name = word.substr(0, equals);
        OptionInfo const* info = nullptr;
        for (Option option : verb.options)
            if (name == GetOption(option).name) info = &GetOption(option);
        if (!info) {
            problem = "unknown option " + Quoted(name);
            return false;
        }
        std::string value;
        if (info->value) {
            if (equals != std::string::npos)
                value = word.substr(equals + 1);
            else if (++i < words.size())
                value = words[i];
            else {
                problem = std::string("no value behind ") + info->name;
                return false;
            }
        } else if (equals != std::string::npos) {
            problem = std::string(info->name) + " takes no value";
            return false;
        }
        if (info->choices) {
            bool known = false;
            for (std::string const& choice : GetChoices(*info)) known = known || choice == value;
            if (!known) {
                problem = std::string(info->name) + " is one of " + info->choices + ", not " + Quoted(value);
                return false;
            }
        }
        arguments.m_values[static_cast<size_t>(info->option)] = value;
    }
    if (arguments.positional.size() < verb.minArguments) problem = "an argument is missing";
    if (arguments.positional.size() > verb.maxArguments)
        problem = "unexpected argument " + Quoted(arguments.positional[verb.maxArguments]);
    return problem.empty();
}

int CommandLine::Run(std::vector<std::string> const& words)
{
    if (words.empty()) return WrongUsage("no group", "kerneltool");
    if (words[0] == "--help" || words[0] == "-h" || words[0] == "help") return ShowHelp();
    if (words[0] == "--version") return ShowVersion();
    if (words[0] == "--completions" && words.size() == 2) {
        std::string const script = MakeCompletions(words[1]);
        if (script.empty()) return WrongUsage("completions are for bash and zsh", "kerneltool");
        Print(script);
        return ExitDone;
    }
    GroupInfo const* group = nullptr;
    for (GroupInfo const& known : c_groups)
        if (words[0] == known.name) group = &known;
    if (!group) return WrongUsage("unknown group " + Quoted(words[0]), "kerneltool");
    std::string const groupHelp = std::string("kerneltool ") + group->name;
    if (words.size() < 2) return WrongUsage("no verb", groupHelp);
    if (words[1] == "--help" || words[1] == "-h") return ShowGroupHelp(*group);

    for (VerbInfo const& verb : GetVerbs()) {
        if (words[0] != verb.group || words[1] != verb.name) continue;
        Arguments arguments;
        bool help = false;
        std::string problem;
        if (!Parse(verb, {words.begin() + 2, words.end()}, arguments, help, problem))
            return WrongUsage(problem, groupHelp + " " + verb.name);
        if (help) return ShowVerbHelp(verb);
        try {
            return verb.run(arguments);
        } catch (UsageProblem const& usage) {
            return WrongUsage(usage.problem, groupHelp + " " + verb.name);
        }
    }
    return WrongUsage("unknown verb " + Quoted(words[1]), groupHelp);
}

} // namespace KernelTool
