// The lines of ignore files, each row one file and one path below the folder that it lies in.

#include <gtest/gtest.h>

#include <string>

#include "nas/match/ignore_lines.h"

namespace nas {
namespace {

TEST(IgnoreLines, Table) {
  const std::string mark = "\xEF\xBB\xBF";
  const struct {
    const char* why;
    std::string lines;
    std::string path;  // of a folder it ends with "/"
    char verdict;      // 'i'gnored, 'k'ept, '-' nothing
  } rows[] = {
      {"a name", "a", "a", 'i'},
      {"anywhere below", "a", "x/y/a", 'i'},
      {"a whole one", "a", "ab", '-'},
      {"letter case counts", "a", "A", '-'},
      {"of a folder too", "a", "a/", 'i'},
      {"folders alone", "a/", "a", '-'},
      {"", "a/", "x/a/", 'i'},
      {"from the folder of the file", "/a", "a", 'i'},
      {"", "/a", "x/a", '-'},
      {"a slash inside says the same", "x/a", "x/a", 'i'},
      {"", "x/a", "y/x/a", '-'},
      {"a star is within a name", "x/*", "x/a", 'i'},
      {"", "x/*", "x/y/a", '-'},
      {"a star, a sign, a set", "*.[oa]", "x/b.o", 'i'},
      {"", "?.c", "ab.c", '-'},
      {"", "[!a]b", "ab", '-'},
      {"", "[!a]b", "cb", 'i'},
      {"any folders first", "**/a", "x/y/a", 'i'},
      {"or none", "**/a", "a", 'i'},
      {"in between", "x/**/a", "x/y/z/a", 'i'},
      {"or none", "x/**/a", "x/a", 'i'},
      {"at the end: what is below", "x/**", "x/y/a", 'i'},
      {"not the folder", "x/**", "x/", '-'},
      {"folders below", "x/**/", "x/y/", 'i'},
      {"the last that fits decides", "*.o\n!k.o", "k.o", 'k'},
      {"", "!k.o\n*.o", "k.o", 'i'},
      {"a remark, and none", "#a\n\\#b", "#a", '-'},
      {"", "#a\n\\#b", "#b", 'i'},
      {"a mark that is meant", "\\!a", "!a", 'i'},
      {"a star that is meant", "\\*a", "*a", 'i'},
      {"", "\\*a", "xa", '-'},
      {"a letter behind a backslash", "\\a*", "ab", 'i'},
      {"braces do not speak", "*.{a,b}", "x.a", '-'},
      {"", "*.{a,b}", "x.{a,b}", 'i'},
      {"spaces at the end", "a  ", "a", 'i'},
      {"but one that is meant", "a\\ ", "a ", 'i'},
      {"and those inside", "a b", "a b", 'i'},
      {"ends of lines of other systems", "a\r\nb\r\n", "a", 'i'},
      {"a mark before the text", mark + "a", "a", 'i'},
      {"nothing", "\n \n/\n", "a", '-'},
      {"bytes", "\xff*", "\xff\xfe", 'i'},
  };
  for (const auto& row : rows) {
    const bool is_folder = row.path.ends_with('/');
    const std::string path = row.path.substr(0, row.path.size() - (is_folder ? 1 : 0));
    const IgnoreLines::Verdict verdict = IgnoreLines(row.lines).Of(path, is_folder);
    EXPECT_EQ("-ik"[static_cast<int>(verdict)], row.verdict)
        << row.lines << " of " << row.path << ": " << row.why;
  }
}

}  // namespace
}  // namespace nas
