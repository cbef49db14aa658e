#include "arbory/manual.h"

#include <algorithm>
#include <cctype>
#include <set>
#include <sstream>
#include <string_view>

namespace arbory {
namespace {

constexpr char kAdministration = '8';
constexpr char kUsers = '1';
constexpr char kFiles = '5';
constexpr char kProgram[] = "arbory";
constexpr char kConfiguration[] = "arbory.toml";
// Of a heading at the beginning of a paragraph, such as "Exit status:".
constexpr size_t kLongestHeading = 20;

char SectionOf(const std::string& command) {
  return command == "serve" || command == "index" ? kAdministration : kUsers;
}

// Characters as typed: roff would make typographic ones of them, or read them as its own.
std::string Literal(const std::string& text) {
  std::string roff;
  for (const char c : text) {
    switch (c) {
      case '\\':
        roff += "\\e";
        break;
      case '-':
        roff += "\\-";
        break;
      case '\'':
        roff += "\\(aq";
        break;
      case '"':
        roff += "\\(dq";
        break;
      case '`':
        roff += "\\(ga";
        break;
      case '^':
        roff += "\\(ha";
        break;
      case '~':
        roff += "\\(ti";
        break;
      default:
        roff += c;
    }
  }
  return roff;
}

// A dot at the beginning of a line would make a request of it.
std::string Line(const std::string& roff) {
  return (roff.starts_with('.') ? "\\&" : "") + roff + "\n";
}

std::string Bold(const std::string& text) { return "\\fB" + Literal(text) + "\\fR"; }
std::string Italic(const std::string& text) { return "\\fI" + Literal(text) + "\\fR"; }

std::string Upper(std::string text) {
  std::transform(text.begin(), text.end(), text.begin(),
                 [](unsigned char c) { return std::toupper(c); });
  return text;
}

std::vector<std::string> LinesOf(const std::string& text) {
  std::vector<std::string> lines;
  std::istringstream stream(text);
  for (std::string line; std::getline(stream, line);) lines.push_back(line);
  return lines;
}

std::string Trimmed(const std::string& text) {
  const size_t first = text.find_first_not_of(' ');
  if (first == std::string::npos) return {};
  return text.substr(first, text.find_last_not_of(' ') + 1 - first);
}

std::string Title(const std::string& name, char section, const std::string& version,
                  const std::string& date) {
  return ".TH " + Upper(Literal(name)) + " " + section + " " + date + " \"arbory " + version +
         "\" \"Arbory Search\"\n"
         // Nothing is broken that one may want to type.
         ".nh\n.ad l\n";
}

// A text in which options and values of the command are set apart, as everywhere in manuals.
class Prose {
 public:
  explicit Prose(const CommandText& command) {
    for (const OptionText& option : command.options) {
      options_.insert(option.names.begin(), option.names.end());
      values_.insert(option.value);
    }
    for (const OptionText& operand : command.operands) values_.insert(operand.names.front());
  }

  std::string operator()(const std::string& line) const {
    constexpr char kInWords[] =
        "-ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789:=_";
    std::string roff;
    size_t at = 0;
    while (at < line.size()) {
      const size_t begin = line.find_first_of(kInWords, at);
      const size_t end = line.find_first_not_of(kInWords, begin);
      roff += Literal(line.substr(at, begin - at));
      if (begin == std::string::npos) break;
      const std::string word = line.substr(begin, end - begin);
      roff += options_.contains(word)  ? Bold(word)
              : values_.contains(word) ? Italic(word)
                                       : Literal(word);
      at = std::min(end, line.size());
    }
    return roff;
  }

 private:
  std::set<std::string> options_;
  std::set<std::string> values_;
};

// "Exit status: 0 ..." begins a section of its own; empty where there is no such beginning.
std::string HeadingOf(const std::string& line) {
  const size_t colon = line.find(':');
  if (colon == std::string::npos || colon == 0 || colon > kLongestHeading) return {};
  const std::string words = line.substr(0, colon);
  const bool plain = std::all_of(words.begin(), words.end(),
                                 [](unsigned char c) { return std::isalpha(c) != 0 || c == ' '; });
  const bool sentence = std::isupper(static_cast<unsigned char>(words[0])) != 0 &&
                        words.size() > 1 && std::islower(static_cast<unsigned char>(words[1])) != 0;
  return plain && sentence && (colon + 1 == line.size() || line[colon + 1] == ' ') ? words
                                                                                   : std::string();
}

// The paragraphs of a help's prose: those before the first heading go to DESCRIPTION.
struct Sections {
  std::string description;
  std::string others;
};

Sections SectionsOf(const CommandText& command) {
  const Prose prose(command);
  Sections sections;
  std::string* into = &sections.description;
  bool example = false;
  bool first = true;
  const auto end_example = [&] {
    if (example) *into += ".EE\n";
    example = false;
  };
  for (std::string line : LinesOf(command.prose)) {
    if (line.empty()) {
      end_example();
      first = true;
      continue;
    }
    const std::string heading = first ? HeadingOf(line) : std::string();
    if (!heading.empty()) {
      into = &sections.others;
      const std::string name = heading == "Example" ? "Examples" : heading;
      *into += ".SH " + Upper(name) + "\n";
      line = Trimmed(line.substr(heading.size() + 1));
      if (!line.empty())
        line[0] = static_cast<char>(std::toupper(static_cast<unsigned char>(line[0])));
    } else if (first) {
      // What follows a section of its own belongs to the whole again.
      into = &sections.description;
      if (!into->empty()) *into += ".PP\n";
    }
    first = false;
    if (line.empty()) continue;
    if (line.starts_with("  ") && !example) {
      *into += ".EX\n";
      example = true;
    } else if (!line.starts_with("  ")) {
      end_example();
    }
    *into += Line(example ? Literal(line) : prose(line));
  }
  end_example();
  return sections;
}

std::string OperandsOf(const CommandText& command) {
  std::string line;
  for (const OptionText& operand : command.operands) {
    const std::string name = Italic(operand.names.front()) + (operand.many ? " ..." : "");
    line += " " + (operand.required ? name : "[" + name + "]");
  }
  return line;
}

std::string Item(const std::string& head, const std::string& text) {
  return ".TP\n" + Line(head) + Line(text);
}

std::string OptionItem(const OptionText& option, const Prose& prose) {
  std::string head;
  for (const std::string& name : option.names) head += (head.empty() ? "" : ", ") + Bold(name);
  if (!option.value.empty()) head += " " + Italic(option.value);
  return Item(head, prose(option.description));
}

std::string OptionsOf(const CommandText& command) {
  const Prose prose(command);
  std::vector<std::string> groups;
  for (const OptionText& option : command.options) {
    if (std::find(groups.begin(), groups.end(), option.group) == groups.end()) {
      groups.push_back(option.group);
    }
  }
  std::string roff = ".SH OPTIONS\n";
  for (const OptionText& operand : command.operands) {
    roff += Item(Italic(operand.names.front()), prose(operand.description));
  }
  for (const std::string& group : groups) {
    if (group != "Options") roff += ".SS " + Literal(group) + "\n";
    for (const OptionText& option : command.options) {
      if (option.group == group) roff += OptionItem(option, prose);
    }
  }
  return roff;
}

std::string PageName(const CommandText& command) {
  return command.name == kProgram ? command.name : std::string(kProgram) + "-" + command.name;
}

std::string Reference(const std::string& name, char section) {
  return ".BR " + Literal(name) + " (" + section + ")";
}

std::string SeeAlso(const ProgramText& program, const std::string& but) {
  std::vector<std::string> references;
  if (but != kProgram) references.push_back(Reference(kProgram, kUsers));
  for (const CommandText& command : program.commands) {
    const std::string name = PageName(command);
    if (name != but) references.push_back(Reference(name, SectionOf(command.name)));
  }
  references.push_back(Reference(kConfiguration, kFiles));
  std::string roff = ".SH SEE ALSO\n";
  for (const std::string& reference : references) {
    roff += reference + (reference == references.back() ? "" : " ,") + "\n";
  }
  return roff + ".PP\nThe documents in " + Italic("/usr/share/doc/arbory") + ".\n";
}

ManualPage CommandPage(const ProgramText& program, const CommandText& command,
                       const std::string& version, const std::string& date) {
  const std::string name = PageName(command);
  const char section = SectionOf(command.name);
  const Sections sections = SectionsOf(command);
  std::string roff = Title(name, section, version, date);
  roff += ".SH NAME\n" + Literal(name) + " \\- " + Literal(command.summary) + "\n";
  roff += ".SH SYNOPSIS\n" + Bold("arbory " + command.name) + " [" + Italic("option") + " ...]" +
          OperandsOf(command) + "\n";
  if (!sections.description.empty()) roff += ".SH DESCRIPTION\n" + sections.description;
  roff += OptionsOf(command) + sections.others + SeeAlso(program, name);
  return {name, section, roff};
}

ManualPage ProgramPage(const ProgramText& program, const std::string& version,
                       const std::string& date) {
  const CommandText& self = program.program;
  const Sections sections = SectionsOf(self);
  std::string roff = Title(kProgram, kUsers, version, date);
  std::string summary = self.summary;
  while (summary.ends_with('.')) summary.pop_back();
  roff += ".SH NAME\n" + Literal(kProgram) + " \\- " + Literal(summary) + "\n";
  roff += ".SH SYNOPSIS\n" + Bold(kProgram) + " " + Italic("command") + " [" + Italic("option") +
          " ...]\n.SH DESCRIPTION\n" + sections.description + ".SH COMMANDS\n";
  for (const CommandText& command : program.commands) {
    roff +=
        Item(Bold(command.name), Literal(command.summary) + "; see\n" +
                                     Reference(PageName(command), SectionOf(command.name)) + " .");
  }
  roff += OptionsOf(self) + sections.others + SeeAlso(program, kProgram);
  return {kProgram, kUsers, roff};
}

// One line of the sample without its comment sign.
struct SampleLine {
  std::string key;       // empty: a comment alone
  std::string value;     // as written
  std::string comment;   // what follows
  bool goes_on = false;  // the comment is the rest of that of the line before
};

SampleLine ReadSampleLine(const std::string& line) {
  const std::string text = line.substr(std::min(line.find_first_not_of('#'), line.size()));
  const size_t comment = text.find(" # ");
  const std::string code = Trimmed(text.substr(0, comment));
  SampleLine read;
  read.comment = comment == std::string::npos ? "" : Trimmed(text.substr(comment + 3));
  const size_t equals = code.find(" = ");
  const bool setting = equals != std::string::npos && code.find(' ') == equals;
  if (setting) {
    read.key = code.substr(0, equals);
    read.value = code.substr(equals + 3);
  } else if (code.empty()) {
    read.goes_on = true;
  } else {
    read.comment = Trimmed(text);
  }
  return read;
}

// "[server]", commented out or not; empty where the line is another.
std::string TableOf(const std::string& line) {
  const size_t begin = line.find_first_not_of("# ");
  if (begin == std::string::npos || line[begin] != '[' || !line.ends_with(']')) return {};
  return line.substr(begin);
}

}  // namespace

std::vector<ManualPage> ManualPages(const ProgramText& program, const std::string& version,
                                    const std::string& date) {
  std::vector<ManualPage> pages = {ProgramPage(program, version, date)};
  for (const CommandText& command : program.commands) {
    pages.push_back(CommandPage(program, command, version, date));
  }
  return pages;
}

ManualPage ConfigurationPage(const std::string& sample, const std::string& version,
                             const std::string& date) {
  std::string roff = Title(kConfiguration, kFiles, version, date);
  roff += ".SH NAME\n" + Literal(kConfiguration) + " \\- configuration of Arbory Search\n";
  roff += ".SH DESCRIPTION\n";
  bool paragraph = true;  // a heading begins one
  for (const std::string& line : LinesOf(sample)) {
    if (line.empty()) continue;
    if (const std::string table = TableOf(line); !table.empty()) {
      roff += ".SH " + Literal(table) + "\n";
      paragraph = true;
      continue;
    }
    const SampleLine read = ReadSampleLine(line);
    if (!read.key.empty()) {
      roff += Item(Bold(read.key) + " = " + Literal(read.value), Literal(read.comment));
      paragraph = false;
      continue;
    }
    if (!read.goes_on && !paragraph) roff += ".PP\n";
    if (!read.goes_on) paragraph = true;
    roff += Line(Literal(read.comment));
  }
  roff += ".SH FILES\n" + Italic("/etc/arbory/arbory.toml") + "\n";
  roff += ".SH SEE ALSO\n" + Reference(kProgram, kUsers) + " ,\n" +
          Reference("arbory-serve", kAdministration) + " ,\n" +
          Reference("arbory-index", kAdministration) + "\n";
  return {kConfiguration, kFiles, roff};
}

}  // namespace arbory
