#include "tools/kdd/BashCompletion.h"

#include "tools/kdd/HelpText.h"

#include <ostream>
#include <vector>

namespace Kdd
{

namespace
{

/// What is known of each command, under its name and, for the options of every command, under "kdd".
constexpr const char* kTables =
    "# Completion of kdd in bash, made from the descriptions that kdd --help shows.\n"
    "declare -A _kdd_options  # by command\n"
    "declare -A _kdd_kinds    # by command and option: what its value is\n"
    "declare -A _kdd_places   # by command: what the values without option are; the last may be repeated\n";

constexpr const char* kScript = R"script(
# _kdd_offer KINDS: what such a value may be
_kdd_offer() {
    local kind found
    for kind in ${1//|/ }; do
        found=
        case $kind in
            STUDY) found=$(compgen -W "$("${words[0]/#\~\//$HOME/}" "${archive[@]}" list 2>/dev/null |
                while read -r uid _; do [[ $uid == STUDY ]] || echo "$uid"; done)" -- "$current") ;;
            FILE | PATH) found=$(compgen -f -- "$current") ;;
            DIR) found=$(compgen -d -- "$current") ;;
            [[:lower:]]*) found=$(compgen -W "$kind" -- "$current") ;;
        esac
        [[ $kind == FILE || $kind == PATH || $kind == DIR ]] && compopt -o filenames 2>/dev/null
        [[ $found ]] && mapfile -t -O ${#COMPREPLY[@]} COMPREPLY <<<"$found"
    done
}

_kdd() {
    local words=() word glue= command= pending= option kind current archive=() place=0 places
    # What readline took apart at ":" and "=" belongs together.
    for word in "${COMP_WORDS[@]:0:COMP_CWORD+1}"; do
        if [[ $glue || $word == [:=]* ]] && ((${#words[@]} > 1)); then
            words[-1]+=$word
        else
            words+=("$word")
        fi
        glue=
        [[ $word == [:=] ]] && glue=1
    done
    current=${words[-1]}
    COMPREPLY=()
    for word in "${words[@]:1:${#words[@]}-2}"; do
        if [[ $pending ]]; then
            [[ $pending == --store || $pending == --database || $pending == --meta ]] &&
                archive+=("$pending" "${word/#\~\//$HOME/}")
            pending=
        elif [[ $word == --*=* ]]; then
            [[ $word == --store=* || $word == --database=* || $word == --meta=* ]] && archive+=("$word")
        elif [[ $word == -* ]]; then
            [[ ${_kdd_kinds["$command $word"]}${_kdd_kinds["kdd $word"]} ]] && pending=$word
        elif [[ ! $command ]]; then
            command=$word
        else
            ((place += 1))
        fi
    done
    if [[ $current == --*=* && ! $pending ]]; then
        pending=${current%%=*}
        current=${current#*=}
    fi
    if [[ $pending ]]; then
        kind=${_kdd_kinds["$command $pending"]}
        _kdd_offer "${kind:-${_kdd_kinds["kdd $pending"]}}"
    elif [[ $current == -* ]]; then
        mapfile -t COMPREPLY < <(compgen -W "${_kdd_options[${command:-kdd}]} ${_kdd_options[kdd]}" -- "$current" | sort -u)
    elif [[ ! $command ]]; then
        mapfile -t COMPREPLY < <(compgen -W "$_kdd_commands" -- "$current")
    else
        places=(${_kdd_places[$command]})
        ((place < ${#places[@]})) || place=-1
        ((${#places[@]})) && _kdd_offer "${places[place]}"
    fi
}

complete -F _kdd kdd
)script";

/// "-o" and "--output"
std::vector<std::string> namesOf(const CLI::Option& option)
{
    std::vector<std::string> names;
    for (const std::string& name : option.get_snames())
        names.push_back("-" + name);
    for (const std::string& name : option.get_lnames())
        names.push_back("--" + name);
    return names;
}

void writeTables(std::ostream& out, const CLI::App& app)
{
    // What values there are is kept by option, and for those without option by their place.
    std::string options;
    std::string kinds;
    std::string places;
    for (const CLI::Option* option : app.get_options()) {
        if (option->get_group().empty())
            continue;  // hidden
        const std::string kind = kindOf(*option);
        for (const std::string& name : namesOf(*option)) {
            options += name + ' ';
            if (!kind.empty())
                kinds += "_kdd_kinds[\"" + app.get_name() + ' ' + name + "\"]='" + kind + "'\n";
        }
        if (!option->nonpositional())
            places += kind + ' ';
    }
    out << "_kdd_options[" << app.get_name() << "]='" << options << "'\n"
        << "_kdd_places[" << app.get_name() << "]='" << places << "'\n"
        << kinds;
}

}  // namespace

void writeBashCompletion(std::ostream& out, const CLI::App& app)
{
    // The tables first, because the script reads them when the user asks for a completion.
    out << kTables << "_kdd_commands='";
    for (const CLI::App* command : app.get_subcommands({}))
        out << command->get_name() << ' ';
    out << "'\n";
    writeTables(out, app);
    for (const CLI::App* command : app.get_subcommands({}))
        writeTables(out, *command);
    out << kScript;
}

}  // namespace Kdd
