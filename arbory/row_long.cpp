#include "arbory/row_long.h"

#include <sys/stat.h>

#include <ctime>

#include "arbory/terminal.h"

namespace arbory {
namespace {

char LetterOf(mode_t mode) {
  switch (mode & S_IFMT) {
    case S_IFDIR:
      return 'd';
    case S_IFLNK:
      return 'l';
    case S_IFIFO:
      return 'p';
    case S_IFSOCK:
      return 's';
    case S_IFCHR:
      return 'c';
    case S_IFBLK:
      return 'b';
    default:
      return '-';
  }
}

// "drwxr-sr-t", as ls shows it.
void AppendMode(mode_t mode, std::string* out) {
  *out += LetterOf(mode);
  constexpr char kLetters[] = "rwx";
  constexpr int kBits = 9;
  const size_t begin = out->size();
  for (int bit = 0; bit < kBits; ++bit) {
    const bool set = (mode >> (kBits - 1 - bit) & 1) != 0;
    *out += set ? kLetters[bit % 3] : '-';
  }
  const struct {
    mode_t bit;
    size_t place;
    char with, without;  // the right to execute
  } specials[] = {{S_ISUID, 2, 's', 'S'}, {S_ISGID, 5, 's', 'S'}, {S_ISVTX, 8, 't', 'T'}};
  for (const auto& special : specials) {
    if ((mode & special.bit) == 0) continue;
    char& letter = (*out)[begin + special.place];
    letter = letter == 'x' ? special.with : special.without;
  }
}

std::string LocalTime(std::time_t seconds) {
  std::tm local = {};
  localtime_r(&seconds, &local);
  char text[sizeof("-2147483648-12-31 23:59")];
  return {text, std::strftime(text, sizeof text, "%Y-%m-%d %H:%M", &local)};
}

void AppendPadded(const std::string& text, size_t width, std::string* out) {
  *out += text;
  if (text.size() < width) out->append(width - text.size(), ' ');
  *out += ' ';
}

}  // namespace

void LongColumns::Append(const nas::FileAttributes& file, std::string* out) {
  constexpr size_t kNameWidth = 8;
  constexpr size_t kSizeWidth = 12;
  AppendMode(file.mode, out);
  *out += ' ';
  AppendPadded(Escaped(owners_.User(file.uid)), kNameWidth, out);
  AppendPadded(Escaped(owners_.Group(file.gid)), kNameWidth, out);
  const std::string size = std::to_string(file.size);
  if (size.size() < kSizeWidth) out->append(kSizeWidth - size.size(), ' ');
  *out += size + " " + LocalTime(file.mtime) + " ";
}

}  // namespace arbory
