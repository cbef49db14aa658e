#include "arbory/command_tree.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <string_view>
#include <utility>

namespace arbory {
namespace {

// The parser shows an option's value as "WHEN:{auto,never}" where a check knows what it may be, or
// "WHEN:{auto->0,never->1}" where it makes other values of them.
constexpr char kChoices[] = ":{";

std::vector<std::string> ChoicesOf(const CLI::Option* option) {
  const std::string type = option->get_type_name();
  const size_t begin = type.find(kChoices);
  if (begin == std::string::npos || !type.ends_with('}')) return {};
  const size_t first = begin + std::string_view(kChoices).size();
  std::vector<std::string> choices;
  for (const std::string& choice :
       CLI::detail::split(type.substr(first, type.size() - 1 - first), ',')) {
    choices.push_back(choice.substr(0, choice.find("->")));
  }
  return choices;
}

OptionText Describe(CLI::Option* option) {
  OptionText text;
  const bool operand = option->get_positional();
  if (operand) text.names.push_back(option->get_name(true));
  for (const std::string& name : option->get_snames()) text.names.push_back("-" + name);
  for (const std::string& name : option->get_lnames()) text.names.push_back("--" + name);
  if (!operand && option->get_items_expected_max() > 0) text.value = ValueName(option);
  text.choices = ChoicesOf(option);
  text.description = option->get_description();
  text.group = option->get_group();
  text.required = option->get_required();
  text.many = operand && option->get_items_expected_max() > 1;
  return text;
}

CommandText DescribeCommand(CLI::App* command) {
  CommandText text;
  text.name = command->get_name();
  text.summary = command->get_description();
  for (CLI::Option* option :
       command->get_options([](CLI::Option* each) { return !each->get_group().empty(); })) {
    (option->get_positional() ? text.operands : text.options).push_back(Describe(option));
  }
  text.prose = command->get_footer();
  return text;
}

// Adds what the commands of a command take to that: one word more, and what stands behind it. What
// not all of them take, or take as another thing, is told of with their names.
class Below {
 public:
  explicit Below(const std::vector<CommandText>& commands) : commands_(commands) {}

  void AddTo(CommandText* command) const {
    OptionText which;
    which.names = {"COMMAND"};
    which.required = true;
    for (const CommandText& below : commands_) {
      which.choices.push_back(below.name);
      which.description +=
          (which.description.empty() ? "" : "; ") + below.name + ": " + below.summary;
    }
    command->operands.push_back(which);
    for (const CommandText& below : commands_) {
      for (const OptionText& operand : below.operands) {
        Merge(operand, &CommandText::operands, &command->operands);
      }
      for (const OptionText& option : below.options) {
        Merge(option, &CommandText::options, &command->options);
      }
    }
  }

 private:
  using Options = std::vector<OptionText>;

  void Merge(OptionText option, Options CommandText::*list, Options* into) const {
    const auto is_same = [&](const OptionText& other) { return other.names == option.names; };
    if (std::ranges::any_of(*into, is_same)) return;
    std::vector<std::pair<std::string, std::string>> told;  // the names of those, and what
    for (const CommandText& command : commands_) {
      const auto found = std::ranges::find_if(command.*list, is_same);
      if (found == (command.*list).end()) continue;
      if (told.empty() || told.back().second != found->description) {
        told.emplace_back(command.name, found->description);
      } else {
        told.back().first += ", " + command.name;
      }
    }
    option.description.clear();
    for (const auto& [names, description] : told) {
      option.description += (option.description.empty() ? "" : "; ") + names + ": " + description;
    }
    into->push_back(std::move(option));
  }

  const std::vector<CommandText>& commands_;
};

std::vector<CommandText> CommandsOf(CLI::App* command) {
  std::vector<CommandText> commands;
  for (CLI::App* below :
       command->get_subcommands([](CLI::App* each) { return !each->get_group().empty(); })) {
    commands.push_back(DescribeCommand(below));
    const std::vector<CommandText> further = CommandsOf(below);
    if (!further.empty()) Below(further).AddTo(&commands.back());
  }
  return commands;
}

}  // namespace

std::string ValueName(const CLI::Option* option) {
  const std::string type = option->get_type_name();
  return type.substr(0, type.find(kChoices));
}

ProgramText Describe(CLI::App* program) {
  ProgramText text;
  text.program = DescribeCommand(program);
  text.commands = CommandsOf(program);
  return text;
}

}  // namespace arbory
