#include "arbory/completions.h"

#include <algorithm>
#include <map>

namespace arbory {
namespace {

// What a value or an operand may be, by what it is called in the help.
enum class Kind { kText, kFile, kFolder, kUser, kGroup };

Kind KindOf(const std::string& value) {
  static const std::map<std::string, Kind> kinds = {
      {"FILE", Kind::kFile}, {"FOLDER", Kind::kFolder}, {"DIR", Kind::kFolder},
      {"USER", Kind::kUser}, {"GROUP", Kind::kGroup},
  };
  const auto found = kinds.find(value);
  return found == kinds.end() ? Kind::kText : found->second;
}

std::string Joined(const std::vector<std::string>& words, const std::string& between) {
  std::string text;
  for (const std::string& word : words) text += (text.empty() ? "" : between) + word;
  return text;
}

// For between single quotes; each of the shells reads '\'' there as the quote itself.
std::string Quoted(const std::string& text) {
  std::string quoted = "'";
  for (const char c : text) quoted += c == '\'' ? "'\\''" : std::string(1, c);
  return quoted + "'";
}

std::vector<std::string> AllNames(const CommandText& command) {
  std::vector<std::string> names;
  for (const OptionText& option : command.options) {
    names.insert(names.end(), option.names.begin(), option.names.end());
  }
  return names;
}

// --- bash ---

// What the script's function _arbory_complete is given.
std::string BashKind(const std::vector<std::string>& choices, Kind kind) {
  if (!choices.empty()) return "-W " + Quoted(Joined(choices, " "));
  switch (kind) {
    case Kind::kFile:
      return "-f";
    case Kind::kFolder:
      return "-d";
    case Kind::kUser:
      return "-u";
    case Kind::kGroup:
      return "-g";
    case Kind::kText:
      break;
  }
  return "-W ''";
}

// The branches of a case: what is completed, and the patterns that it holds for.
using BashCases = std::map<std::string, std::vector<std::string>>;

std::string BashBranches(const BashCases& cases) {
  std::string text;
  for (const auto& [kind, patterns] : cases) {
    text += "    " + Joined(patterns, " | \\\n      ") + ") kind=(" + kind + ") ;;\n";
  }
  return text;
}

// Over "COMMAND OPTION", for options with values.
BashCases BashValues(const ProgramText& program) {
  BashCases cases;
  for (const CommandText& command : program.commands) {
    for (const OptionText& option : command.options) {
      if (option.value.empty()) continue;
      for (const std::string& name : option.names) {
        cases[BashKind(option.choices, KindOf(option.value))].push_back("'" + command.name + " " +
                                                                        name + "'");
      }
    }
  }
  return cases;
}

// Over "COMMAND N", the Nth word that is no option.
std::string BashOperands(const ProgramText& program) {
  std::string text;
  for (const CommandText& command : program.commands) {
    size_t number = 0;
    for (const OptionText& operand : command.operands) {
      text += "    '" + command.name + " '" + (operand.many ? "*" : std::to_string(++number)) +
              ") kind=(" + BashKind(operand.choices, KindOf(operand.names.front())) + ") ;;\n";
    }
  }
  return text;
}

std::string BashNames(const ProgramText& program) {
  std::vector<std::string> first = AllNames(program.program);
  for (const CommandText& command : program.commands) first.push_back(command.name);
  std::string text = "    arbory) kind=(-W " + Quoted(Joined(first, " ")) + ") ;;\n";
  for (const CommandText& command : program.commands) {
    text +=
        "    " + command.name + ") kind=(-W " + Quoted(Joined(AllNames(command), " ")) + ") ;;\n";
  }
  return text;
}

constexpr char kBashHead[] =
    R"(# Completion of arbory for bash, made from the options of the program.

# Each puts the options for compgen into "kind": for the value of the option "COMMAND OPTION"; fails
# where it takes none.
_arbory_value() {
  case "$1" in
)";

constexpr char kBashOperands[] = R"(    *) return 1 ;;
  esac
}

# For the word "COMMAND N" that is no option.
_arbory_operand() {
  case "$1" in
)";

constexpr char kBashNames[] = R"(  esac
}

# For the names of options, and of commands.
_arbory_name() {
  case "$1" in
)";

constexpr char kBashBody[] = R"(  esac
}

_arbory() {
  local word=${COMP_WORDS[COMP_CWORD]} before=${COMP_WORDS[COMP_CWORD - 1]}
  local command=${COMP_WORDS[1]} at operands=1 ended= kind=()
  # "--option=value" is three words here.
  if [[ $word == = ]]; then
    word=
  elif [[ $before == = ]]; then
    before=${COMP_WORDS[COMP_CWORD - 2]}
  fi
  for ((at = 2; at < COMP_CWORD; ++at)); do
    case ${COMP_WORDS[at]} in
      =) ((++at)) ;;
      --) ended=1 && break ;;
      -*)
        if _arbory_value "$command ${COMP_WORDS[at]}" && [[ ${COMP_WORDS[at + 1]} != = ]]; then
          ((++at))
        fi
        ;;
      *) ((++operands)) ;;
    esac
  done
  kind=()
  if ((COMP_CWORD == 1)); then
    _arbory_name arbory
  elif [[ $ended ]]; then
    ((operands += COMP_CWORD - at - 1))
    _arbory_operand "$command $operands"
  elif ! _arbory_value "$command $before"; then
    if [[ $word == -* ]]; then
      _arbory_name "$command"
    else
      _arbory_operand "$command $operands"
    fi
  fi
  COMPREPLY=()
  if ((${#kind[@]} == 0)); then return; fi
  if [[ ${kind[0]} == -[df] ]]; then compopt -o filenames; fi
  mapfile -t COMPREPLY < <(compgen "${kind[@]}" -- "$word")
}

complete -F _arbory arbory
)";

// --- zsh ---

// In what _arguments is given, brackets and colons have a meaning.
std::string ZshEscaped(const std::string& text) {
  std::string escaped;
  for (const char c : text) {
    if (c == '[' || c == ']' || c == ':' || c == '\\') escaped += '\\';
    escaped += c;
  }
  return escaped;
}

std::string ZshKind(const OptionText& option, Kind kind) {
  if (!option.choices.empty()) return "(" + Joined(option.choices, " ") + ")";
  switch (kind) {
    case Kind::kFile:
      return "_files";
    case Kind::kFolder:
      return "_files -/";
    case Kind::kUser:
      return "_users";
    case Kind::kGroup:
      return "_groups";
    case Kind::kText:
      break;
  }
  return " ";
}

std::string ZshOptions(const CommandText& command, const std::string& indent) {
  std::string text;
  for (const OptionText& option : command.options) {
    const std::string value = option.value.empty() ? ""
                                                   : ":" + ZshEscaped(option.value) + ":" +
                                                         ZshKind(option, KindOf(option.value));
    for (const std::string& name : option.names) {
      // Options with values may stand several times; "*" lets them.
      const std::string once = value.empty() ? "(" + Joined(option.names, " ") + ")" : "*";
      const std::string joined = value.empty() ? "" : name.starts_with("--") ? "=" : "+";
      text += indent +
              Quoted(once + name + joined + "[" + ZshEscaped(option.description) + "]" + value) +
              " \\\n";
    }
  }
  return text;
}

std::string ZshOperands(const CommandText& command, const std::string& indent) {
  std::string text;
  for (size_t at = 0; at < command.operands.size(); ++at) {
    const OptionText& operand = command.operands[at];
    const std::string& name = operand.names.front();
    const std::string place =
        operand.many ? "*" : std::to_string(at + 1) + (operand.required ? "" : ":");
    text += indent + Quoted(place + ":" + name + ":" + ZshKind(operand, KindOf(name))) + " \\\n";
  }
  return text;
}

// --- fish ---

std::string FishKind(const OptionText& option, Kind kind) {
  if (!option.choices.empty()) return " -x -a " + Quoted(Joined(option.choices, " "));
  switch (kind) {
    case Kind::kFile:
      return " -r -F";
    case Kind::kFolder:
      return " -x -a '(__fish_complete_directories)'";
    case Kind::kUser:
      return " -x -a '(__fish_complete_users)'";
    case Kind::kGroup:
      return " -x -a '(__fish_complete_groups)'";
    case Kind::kText:
      break;
  }
  return " -x";
}

std::string FishOptions(const CommandText& command, const std::string& condition) {
  std::string text;
  for (const OptionText& option : command.options) {
    text += "complete -c arbory -n " + Quoted(condition);
    for (const std::string& name : option.names) {
      text += name.starts_with("--") ? " -l " + name.substr(2) : " -s " + name.substr(1);
    }
    if (!option.value.empty()) text += FishKind(option, KindOf(option.value));
    text += " -d " + Quoted(option.description) + "\n";
  }
  return text;
}

}  // namespace

std::string BashCompletion(const ProgramText& program) {
  return kBashHead + BashBranches(BashValues(program)) + kBashOperands + BashOperands(program) +
         kBashNames + BashNames(program) + kBashBody;
}

std::string ZshCompletion(const ProgramText& program) {
  const std::string indent = "        ";
  std::string text =
      "#compdef arbory\n# Completion of arbory for zsh, made from the options of the program.\n\n"
      "_arbory() {\n  local curcontext=\"$curcontext\" state line\n  typeset -A opt_args\n"
      "  _arguments -C \\\n" +
      ZshOptions(program.program, "    ") +
      "    '1: :->command' '*:: :->rest'\n  case $state in\n    command)\n      local -a commands\n"
      "      commands=(\n";
  for (const CommandText& command : program.commands) {
    text += indent + Quoted(command.name + ":" + ZshEscaped(command.summary)) + "\n";
  }
  text +=
      "      )\n      _describe command commands\n      ;;\n    rest)\n      case $line[1] in\n";
  for (const CommandText& command : program.commands) {
    text += "        " + command.name + ")\n          _arguments -s -S \\\n" +
            ZshOptions(command, "            ") + ZshOperands(command, "            ") +
            "            && return\n          ;;\n";
  }
  return text + "      esac\n      ;;\n  esac\n}\n\n_arbory \"$@\"\n";
}

std::string FishCompletion(const ProgramText& program) {
  std::string text =
      "# Completion of arbory for fish, made from the options of the program.\n"
      "complete -c arbory -f\n" +
      FishOptions(program.program, "__fish_use_subcommand");
  for (const CommandText& command : program.commands) {
    text += "complete -c arbory -n __fish_use_subcommand -a " + command.name + " -d " +
            Quoted(command.summary) + "\n";
  }
  for (const CommandText& command : program.commands) {
    const std::string condition = "__fish_seen_subcommand_from " + command.name;
    text += FishOptions(command, condition);
    for (const OptionText& operand : command.operands) {
      const Kind kind = KindOf(operand.names.front());
      if (kind == Kind::kText && operand.choices.empty()) continue;
      text += "complete -c arbory -n " + Quoted(condition) + FishKind(operand, kind) + "\n";
    }
  }
  return text;
}

}  // namespace arbory
