#include "CommandLine.h"

#include <cstring>

// Completion scripts, made from the table of verbs. The files in completions/ are what this prints.

namespace KernelTool {

namespace {

/// The words of every option of a verb, separated by spaces.
std::string OptionWords(VerbInfo const& verb)
{
    std::string words = "--help";
    for (Option option : verb.options) words += std::string(" ") + CommandLine::GetOption(option).name;
    return words;
}

std::string ChoiceWords(OptionInfo const& info)
{
    std::string words;
    for (std::string const& choice : CommandLine::GetChoices(info)) words += (words.empty() ? "" : " ") + choice;
    return words;
}

std::string VerbWords(GroupInfo const& group)
{
    std::string words;
    for (VerbInfo const& verb : CommandLine::GetVerbs())
        if (std::strcmp(verb.group, group.name) == 0) words += (words.empty() ? "" : " ") + std::string(verb.name);
    return words;
}

std::string MakeBash()
{
    std::string groups;
    std::string verbs;
    std::string choices;
    std::string options;
    for (GroupInfo const& group : CommandLine::GetGroups()) {
        groups += std::string(group.name) + " ";
        verbs += std::string("            ") + group.name + ") words=\"" + VerbWords(group) + " --help\" ;;\n";
    }
    for (size_t i = 0; i < static_cast<size_t>(Option::Count); ++i) {
        OptionInfo const& info = CommandLine::GetOption(static_cast<Option>(i));
        if (info.choices)
            choices += std::string("        ") + info.name + ") COMPREPLY=($(compgen -W \"" + ChoiceWords(info) +
                       "\" -- \"$cur\")); return ;;\n";
    }
    for (VerbInfo const& verb : CommandLine::GetVerbs())
        options +=
            std::string("            ") + verb.group + "/" + verb.name + ") words=\"" + OptionWords(verb) + "\" ;;\n";
    return "# Completion of kerneltool for bash.\n_kerneltool()\n{\n"
           "    local cur=\"${COMP_WORDS[COMP_CWORD]}\" prev=\"${COMP_WORDS[COMP_CWORD-1]}\" words=\"\"\n"
           "    COMPREPLY=()\n    case \"$prev\" in\n" +
           choices + "    esac\n    if [ \"$COMP_CWORD\" -eq 1 ]; then\n        words=\"" + groups +
           "--help --version\"\n    elif [ \"$COMP_CWORD\" -eq 2 ]; then\n        case \"$prev\" in\n" + verbs +
           "        esac\n    elif [[ \"$cur\" == -* ]]; then\n"
           "        case \"${COMP_WORDS[1]}/${COMP_WORDS[2]}\" in\n" +
           options +
           "        esac\n    else\n        compopt -o filenames 2>/dev/null\n"
           "        COMPREPLY=($(compgen -f -- \"$cur\"))\n        return\n    fi\n"
           "    COMPREPLY=($(compgen -W \"$words\" -- \"$cur\"))\n}\ncomplete -F _kerneltool kerneltool\n";
}

/// A text inside single quotes and brackets of an option description.
std::string ZshText(char const* text)
{
    std::string result;
    for (char const* p = text; *p; ++p) {
        if (*p == '\'')
            result += "'\\''";
        else if (*p == '[' || *p == ']' || *p == ':')
            result += std::string("\\") + *p;
        else
            result += *p;
    }
    return result;
}

std::string MakeZsh()
{
    std::string groups;
    std::string verbs;
    std::string options;
    for (GroupInfo const& group : CommandLine::GetGroups()) {
        groups += std::string(" '") + group.name + ":" + ZshText(group.summary) + "'";
        verbs += std::string("        ") + group.name + ") verbs=(";
        for (VerbInfo const& verb : CommandLine::GetVerbs())
            if (std::strcmp(verb.group, group.name) == 0)
                verbs += std::string(" '") + verb.name + ":" + ZshText(verb.summary) + "'";
        verbs += ") ;;\n";
    }
    for (VerbInfo const& verb : CommandLine::GetVerbs()) {
        options += std::string("        ") + verb.group + "/" + verb.name + ") _arguments";
        for (Option option : verb.options) {
            OptionInfo const& info = CommandLine::GetOption(option);
            options += std::string(" '") + info.name + "[" + ZshText(info.help) + "]";
            if (info.value) {
                options += std::string(":") + info.value + ":";
                options += info.choices ? "(" + ChoiceWords(info) + ")" : "_files";
            }
            options += "'";
        }
        options += " '*:file:_files' ;;\n";
    }
    return "#compdef kerneltool\n# Completion of kerneltool for zsh.\nlocal -a groups verbs\ngroups=(" + groups +
           ")\nif (( CURRENT == 2 )); then\n    _describe group groups\nelif (( CURRENT == 3 )); then\n"
           "    case $words[2] in\n" +
           verbs +
           "    esac\n    _describe verb verbs\nelse\n    local call=\"$words[2]/$words[3]\"\n"
           "    shift 2 words\n    (( CURRENT -= 2 ))\n    case $call in\n" +
           options + "    esac\nfi\n";
}

} // namespace

std::string CommandLine::MakeCompletions(std::string const& shell)
{
    if (shell == "bash") return MakeBash();
    if (shell == "zsh") return MakeZsh();
    return {};
}

} // namespace KernelTool
