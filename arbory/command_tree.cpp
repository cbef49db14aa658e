#include "arbory/command_tree.h"

#include <CLI/CLI.hpp>
#include <string_view>

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

}  // namespace

std::string ValueName(const CLI::Option* option) {
  const std::string type = option->get_type_name();
  return type.substr(0, type.find(kChoices));
}

ProgramText Describe(CLI::App* program) {
  ProgramText text;
  text.program = DescribeCommand(program);
  for (CLI::App* command :
       program->get_subcommands([](CLI::App* each) { return !each->get_group().empty(); })) {
    text.commands.push_back(DescribeCommand(command));
  }
  return text;
}

}  // namespace arbory
